// The memory image and fixed-buffer procedures as the codec drives them.

#include <gtest/gtest.h>

#include <cstring>
#include <vector>

#include "frame/io_procs.h"
#include "support/test_host.h"

namespace {

using namespace zan;
using zantest::TestAllocator;
using zantest::TestHost;

class MemorySourceTest : public ::testing::Test {
protected:
    void SetUp() override {
        for (int i = 0; i < 10; ++i) data_[i] = static_cast<unsigned char>('a' + i);
        host_->memBase = host_->memPos = data_;
        host_->memCapacity = host_->memSize = sizeof data_;
    }
    uint32_t Position() { return MemSeekProc(host_.ctx(), 0, SEEK_CUR); }

    TestHost host_;
    unsigned char data_[10];
};

TEST_F(MemorySourceTest, ReadsStopAtTheEndOfTheData) {
    char out[16] = {};
    EXPECT_EQ(MemReadProc(host_.ctx(), out, 4), 4);
    EXPECT_EQ(std::string(out, 4), "abcd");
    MemSeekProc(host_.ctx(), 7, SEEK_SET);
    EXPECT_EQ(MemReadProc(host_.ctx(), out, 8), 3) << "a read crossing the end returns what is left";
    EXPECT_EQ(std::string(out, 3), "hij");
    EXPECT_EQ(MemReadProc(host_.ctx(), out, 8), 0);
    EXPECT_EQ(Position(), 10u) << "a read at the end does not move";
    EXPECT_EQ(MemReadProc(host_.ctx(), out, 0), 0);
    EXPECT_EQ(MemReadProc(host_.ctx(), out, -5), 0);
}

TEST_F(MemorySourceTest, SeeksUse32BitArithmetic) {
    EXPECT_EQ(MemSeekProc(host_.ctx(), 6, SEEK_SET), 6u);
    EXPECT_EQ(MemSeekProc(host_.ctx(), static_cast<uint32_t>(-4), SEEK_CUR), 2u)
        << "a backward move is a wrapped 32-bit offset";
    char c = 0;
    EXPECT_EQ(MemReadProc(host_.ctx(), &c, 1), 1);
    EXPECT_EQ(c, 'c');
    EXPECT_EQ(MemSeekProc(host_.ctx(), static_cast<uint32_t>(-1), SEEK_END), 9u);
    EXPECT_EQ(MemSeekProc(host_.ctx(), 100, SEEK_SET), 100u) << "no bound check";
    EXPECT_EQ(MemReadProc(host_.ctx(), &c, 1), 0);
    EXPECT_EQ(MemSeekProc(host_.ctx(), 3, 7), 100u) << "unknown whence leaves the position";
}

TEST_F(MemorySourceTest, SizeAndMapDescribeTheImageWithoutMapping) {
    EXPECT_EQ(MemSizeProc(host_.ctx()), 10u);
    void* base = nullptr;
    uint32_t size = 0;
    EXPECT_EQ(MemMapProc(host_.ctx(), &base, &size), 0);
    EXPECT_EQ(base, data_);
    EXPECT_EQ(size, 10u);
}

class GrowingImageTest : public ::testing::Test {
protected:
    void SetUp() override {
        TestAllocator::Reset();
        auto* block = static_cast<unsigned char*>(TestAllocator::Alloc(8));
        std::memset(block, 0xEE, 8);  // stale bytes a careless writer would leak
        host_->memBase = host_->memPos = block;
        host_->memCapacity = 8;
        host_->memSize = 0;
    }
    void TearDown() override { TestAllocator::Free(host_->memBase); }
    std::vector<unsigned char> Image() {
        return std::vector<unsigned char>(host_->memBase, host_->memBase + host_->memSize);
    }
    int32_t Write(const std::string& s) {
        return MemGrowWriteProc(host_.ctx(), const_cast<char*>(s.data()), static_cast<int32_t>(s.size()));
    }

    TestHost host_;
};

TEST_F(GrowingImageTest, GrowsToWhatTheWriteNeedsPlus512) {
    EXPECT_EQ(Write("12345"), 5);
    EXPECT_EQ(host_->memCapacity, 8u) << "fits: no growth";
    EXPECT_EQ(Write("6789"), 4);
    EXPECT_EQ(host_->memCapacity, 9u + 512u);
    EXPECT_EQ(host_->memSize, 9u);
    EXPECT_EQ(MemSeekProc(host_.ctx(), 0, SEEK_CUR), 9u) << "the position keeps its distance";
    EXPECT_EQ(Image(), std::vector<unsigned char>({'1', '2', '3', '4', '5', '6', '7', '8', '9'}));
}

TEST_F(GrowingImageTest, BytesSkippedByASeekReadBackAsZero) {
    Write("ab");
    MemSeekProc(host_.ctx(), 5, SEEK_SET);  // inside the block, beyond the data
    Write("c");
    MemSeekProc(host_.ctx(), 20, SEEK_SET);  // beyond the block
    Write("d");
    const std::vector<unsigned char> expected = {'a', 'b', 0, 0, 0, 'c', 0, 0, 0, 0, 0,
                                                 0,   0,   0, 0, 0,   0, 0, 0, 0, 'd'};
    EXPECT_EQ(Image(), expected);
}

TEST_F(GrowingImageTest, OverwritingInsideTheDataKeepsItsSize) {
    Write("abcdef");
    MemSeekProc(host_.ctx(), 1, SEEK_SET);
    Write("XY");
    EXPECT_EQ(host_->memSize, 6u);
    EXPECT_EQ(Image(), std::vector<unsigned char>({'a', 'X', 'Y', 'd', 'e', 'f'}));
    char out[6];
    MemSeekProc(host_.ctx(), 0, SEEK_SET);
    EXPECT_EQ(MemReadProc(host_.ctx(), out, 6), 6) << "the image reads back what was written";
}

TEST_F(GrowingImageTest, RefusedGrowthIsAShortWriteOfWhatStillFits) {
    Write("abc");
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(Write("defghijk"), 5) << "five bytes fit before the old end";
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Memory allocation error"});
    EXPECT_EQ(host_->memSize, 8u);
    EXPECT_EQ(host_->memCapacity, 8u);
}

TEST_F(GrowingImageTest, ShortWriteAfterARewindDoesNotInflateTheSize) {
    Write("abcdefgh");
    MemSeekProc(host_.ctx(), 2, SEEK_SET);
    TestAllocator::FailAll();
    EXPECT_EQ(Write("0123456789"), 6);
    TestAllocator::Reset();
    EXPECT_EQ(host_->memSize, 8u) << "the data still end at the block's end";
    EXPECT_EQ(Image(), std::vector<unsigned char>({'a', 'b', '0', '1', '2', '3', '4', '5'}));
}

TEST_F(GrowingImageTest, CapacityBeyond32BitsIsAnAllocationFailure) {
    MemSeekProc(host_.ctx(), 0xFFFFFF00u, SEEK_SET);
    const int calls = TestAllocator::Calls();
    EXPECT_EQ(Write(std::string(0x100, 'z')), 0);
    EXPECT_EQ(TestAllocator::Calls(), calls) << "no 32-bit-wrapped request reaches the host";
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Memory allocation error"});
    EXPECT_EQ(host_->memCapacity, 8u);
}

class FixedBufferTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::memset(buffer_, '#', sizeof buffer_);
        host_->destMemory = buffer_;
        host_->destMemPos = buffer_;
        host_->destMemoryCapacity = 8;  // two guard bytes follow
    }
    int32_t Write(const std::string& s) {
        return FixedWriteProc(host_.ctx(), const_cast<char*>(s.data()), static_cast<int32_t>(s.size()));
    }

    TestHost host_;
    unsigned char buffer_[10];
};

TEST_F(FixedBufferTest, WritesAreCutAtTheCapacityAndNeverOverflow) {
    EXPECT_EQ(Write("abcdef"), 6);
    EXPECT_EQ(Write("ghij"), 2);
    EXPECT_EQ(Write("k"), 0);
    EXPECT_EQ(host_->memSize, 8u);
    EXPECT_EQ(std::string(reinterpret_cast<char*>(buffer_), 10), "abcdefgh##");
}

TEST_F(FixedBufferTest, ReadsNeedTheWholeCountToRemain) {
    Write("abcdef");
    FixedSeekProc(host_.ctx(), 4, SEEK_SET);
    char out[8] = {};
    EXPECT_EQ(FixedReadProc(host_.ctx(), out, 5), 0) << "more than remains: nothing";
    EXPECT_EQ(FixedReadProc(host_.ctx(), out, 4), 4);
    EXPECT_EQ(std::string(out, 2), "ef");
    EXPECT_EQ(FixedSizeProc(host_.ctx()), 8u);
}

TEST_F(FixedBufferTest, SeeksStayInsideTheBuffer) {
    EXPECT_EQ(FixedSeekProc(host_.ctx(), 8, SEEK_SET), 8u);
    EXPECT_EQ(FixedSeekProc(host_.ctx(), 9, SEEK_SET), kSeekFailed);
    EXPECT_EQ(FixedSeekProc(host_.ctx(), 2, SEEK_SET), 2u);
    EXPECT_EQ(FixedSeekProc(host_.ctx(), 6, SEEK_CUR), 8u);
    EXPECT_EQ(FixedSeekProc(host_.ctx(), 1, SEEK_CUR), kSeekFailed);
    EXPECT_EQ(FixedSeekProc(host_.ctx(), 0, 9), 0u);
}

TEST_F(FixedBufferTest, EndIsTheEndOfTheDataWritten) {
    Write("abcdef");
    FixedSeekProc(host_.ctx(), 3, SEEK_SET);
    EXPECT_EQ(FixedSeekProc(host_.ctx(), 0, SEEK_END), 6u)
        << "appending after a look back must not overwrite what follows";
    EXPECT_EQ(FixedSizeProc(host_.ctx()), 6u);
    EXPECT_EQ(FixedSeekProc(host_.ctx(), static_cast<uint32_t>(-1), SEEK_END), kSeekFailed);
    EXPECT_EQ(FixedSeekProc(host_.ctx(), 1, SEEK_END), kSeekFailed);
}

TEST_F(FixedBufferTest, BytesSkippedByASeekAreZeroed) {
    Write("ab");
    FixedSeekProc(host_.ctx(), 5, SEEK_SET);
    Write("c");
    EXPECT_EQ(std::string(reinterpret_cast<char*>(buffer_), 6), std::string("ab\0\0\0c", 6));
}

}  // namespace
