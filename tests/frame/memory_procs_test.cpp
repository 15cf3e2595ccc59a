// The memory image and fixed-buffer procedures as the codec drives them.

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "frame/io_procs.h"
#include "support/test_host.h"

namespace {

using namespace zan;
using zantest::TestAllocator;
using zantest::TestHost;

std::string Text(const void* bytes, size_t n) { return std::string(static_cast<const char*>(bytes), n); }
char* Chars(const char* s) { return const_cast<char*>(s); }
constexpr uint32_t Back(uint32_t n) { return 0u - n; }  // a backward move as a wrapped offset

// A memory source over the ten bytes "abcdefghij".
class MemorySourceTest : public ::testing::Test {
protected:
    void SetUp() override {
        host_->memBase = host_->memPos = data_;
        host_->memCapacity = host_->memSize = sizeof data_;
    }
    TestHost host_;
    ConversionContext* c_ = host_.ctx();
    unsigned char data_[10] = {'a', 'b', 'c', 'd', 'e', 'f', 'g', 'h', 'i', 'j'};
};

// Reads and the size stop at the end of the data; the image is never mapped.
TEST_F(MemorySourceTest, ReadsAndSizeStopAtTheEndOfTheData) {
    char out[16] = {};
    EXPECT_EQ(MemReadProc(c_, out, 4), 4);
    EXPECT_EQ(Text(out, 4), "abcd");
    MemSeekProc(c_, 7, SEEK_SET);
    EXPECT_EQ(MemReadProc(c_, out, 8), 3) << "a read crossing the end returns what is left";
    EXPECT_EQ(Text(out, 3), "hij");
    EXPECT_EQ(MemReadProc(c_, out, 8), 0);
    EXPECT_EQ(MemSeekProc(c_, 0, SEEK_CUR), 10u) << "a read at the end does not move";
    EXPECT_EQ(MemReadProc(c_, out, 0), 0);
    EXPECT_EQ(MemReadProc(c_, out, -5), 0);
    EXPECT_EQ(MemSizeProc(c_), 10u);
    void* base = nullptr;
    uint32_t size = 0;
    EXPECT_EQ(MemMapProc(c_, &base, &size), 0);
}

TEST_F(MemorySourceTest, SeeksUse32BitArithmetic) {
    EXPECT_EQ(MemSeekProc(c_, 6, SEEK_SET), 6u);
    EXPECT_EQ(MemSeekProc(c_, Back(4), SEEK_CUR), 2u);
    char c = 0;
    EXPECT_EQ(MemReadProc(c_, &c, 1), 1);
    EXPECT_EQ(c, 'c');
    EXPECT_EQ(MemSeekProc(c_, Back(1), SEEK_END), 9u);
    EXPECT_EQ(MemSeekProc(c_, 100, SEEK_SET), 100u) << "no bound check";
    EXPECT_EQ(MemReadProc(c_, &c, 1), 0);
    EXPECT_EQ(MemSeekProc(c_, 3, 7), 100u) << "unknown whence leaves the position";
}

// A growing image in an 8-byte block of stale bytes.
class GrowingImageTest : public ::testing::Test {
protected:
    void SetUp() override {
        TestAllocator::Reset();
        host_->memBase = host_->memPos = static_cast<unsigned char*>(TestAllocator::Alloc(8));
        std::memset(host_->memBase, 0xEE, 8);  // stale bytes a careless writer would leak
        host_->memCapacity = 8;
        host_->memSize = 0;
    }
    void TearDown() override {
        TestAllocator::Reset();
        TestAllocator::Free(host_->memBase);
    }
    std::string Data() { return Text(host_->memBase, host_->memSize); }
    int32_t Write(const std::string& s) {
        return MemGrowWriteProc(c_, Chars(s.c_str()), static_cast<int32_t>(s.size()));
    }

    TestHost host_;
    ConversionContext* c_ = host_.ctx();
};

// Bytes skipped by a seek, inside the block or beyond it, read back as zero;
// overwriting inside the data keeps its size; after the block grows the
// position keeps its distance; the image reads back whole.
TEST_F(GrowingImageTest, WritesLandAtThePositionAndGapsAreZero) {
    Write("ab");
    MemSeekProc(c_, 5, SEEK_SET);
    Write("c");
    MemSeekProc(c_, 1, SEEK_SET);
    Write("X");
    EXPECT_EQ(Data(), Text("aX\0\0\0c", 6));
    MemSeekProc(c_, 20, SEEK_SET);
    EXPECT_EQ(Write("d"), 1);
    EXPECT_EQ(MemSeekProc(c_, 0, SEEK_CUR), 21u);
    EXPECT_EQ(Write("e"), 1);
    EXPECT_EQ(Data(), Text("aX\0\0\0c", 6) + std::string(14, '\0') + "de");
    char out[22];
    MemSeekProc(c_, 0, SEEK_SET);
    EXPECT_EQ(MemReadProc(c_, out, 22), 22);
}

// A refused growth is a short write of what still fits in the block, with a
// host error; the data never end past the block, even after a rewind. A
// size beyond 32 bits is refused without a wrapped request to the host.
TEST_F(GrowingImageTest, RefusedGrowthIsAShortWriteOfWhatStillFits) {
    Write("abc");
    TestAllocator::FailAll();
    EXPECT_EQ(Write("defghijk"), 5);
    MemSeekProc(c_, 2, SEEK_SET);
    EXPECT_EQ(Write("0123456789"), 6);
    EXPECT_EQ(Data(), "ab012345");
    TestAllocator::Reset();
    MemSeekProc(c_, 0xFFFFFF00u, SEEK_SET);
    EXPECT_EQ(Write(std::string(0x100, 'z')), 0);
    EXPECT_EQ(TestAllocator::Calls(), 0);
    EXPECT_EQ(host_.Errors(), std::vector<std::string>(3, "Memory allocation error"));
}

// The host's fixed buffer of 8 bytes, followed by two guard bytes.
class FixedBufferTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::memset(buffer_, '#', sizeof buffer_);
        host_->destMemory = host_->destMemPos = buffer_;
        host_->destMemoryCapacity = 8;
    }
    int32_t Write(const char* s) { return FixedWriteProc(c_, Chars(s), static_cast<int32_t>(std::strlen(s))); }

    TestHost host_;
    ConversionContext* c_ = host_.ctx();
    unsigned char buffer_[10];
};

// Bytes skipped by a seek are zeroed; writes are cut at the capacity.
TEST_F(FixedBufferTest, WritesAreCutAtTheCapacityAndNeverOverflow) {
    EXPECT_EQ(Write("ab"), 2);
    FixedSeekProc(c_, 5, SEEK_SET);
    EXPECT_EQ(Write("cdefg"), 3);
    EXPECT_EQ(Write("k"), 0);
    EXPECT_EQ(host_->memSize, 8u);
    EXPECT_EQ(Text(buffer_, 10), Text("ab\0\0\0cde##", 10));
}

TEST_F(FixedBufferTest, ReadsNeedTheWholeCountToRemain) {
    Write("abcdef");
    FixedSeekProc(c_, 4, SEEK_SET);
    char out[8] = {};
    EXPECT_EQ(FixedReadProc(c_, out, 5), 0) << "more than remains: nothing";
    EXPECT_EQ(FixedReadProc(c_, out, 4), 4);
    EXPECT_EQ(Text(out, 2), "ef");
}

// Seeks stay inside the capacity. The end is the end of the data written, so
// appending after a look back does not overwrite what follows.
TEST_F(FixedBufferTest, SeeksStayInsideTheBufferAndEndAtTheData) {
    Write("abcdef");
    EXPECT_EQ(FixedSeekProc(c_, 8, SEEK_SET), 8u);
    EXPECT_EQ(FixedSeekProc(c_, 9, SEEK_SET), kSeekFailed);
    EXPECT_EQ(FixedSeekProc(c_, 2, SEEK_SET), 2u);
    EXPECT_EQ(FixedSeekProc(c_, 6, SEEK_CUR), 8u);
    EXPECT_EQ(FixedSeekProc(c_, 1, SEEK_CUR), kSeekFailed);
    EXPECT_EQ(FixedSeekProc(c_, 0, 9), 0u) << "unknown whence";
    FixedSeekProc(c_, 3, SEEK_SET);
    EXPECT_EQ(FixedSeekProc(c_, 0, SEEK_END), 6u);
    EXPECT_EQ(FixedSeekProc(c_, Back(1), SEEK_END), kSeekFailed);
    EXPECT_EQ(FixedSeekProc(c_, 1, SEEK_END), kSeekFailed);
}

}  // namespace
