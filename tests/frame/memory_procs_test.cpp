// The memory image and fixed-buffer procedures as the codec drives them.

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "frame/io_procs.h"
#include "frame_support.h"
#include "support/test_host.h"

namespace {

using namespace zan;
using namespace zantest;

char* Chars(const std::string& s) { return const_cast<char*>(s.c_str()); }
int32_t Size(const std::string& s) { return static_cast<int32_t>(s.size()); }

// Reads and the size of a memory source stop at the end of its data; seeks
// wrap in 32 bits without a bound check; the image is never mapped.
TEST(MemorySource, ReadsStopAtTheEndOfTheDataAndSeeksWrap) {
    TestHost host;
    ConversionContext* c = host.ctx();
    unsigned char data[] = {'a', 'b', 'c', 'd', 'e', 'f', 'g', 'h', 'i', 'j'};
    host->memBase = host->memPos = data;
    host->memCapacity = host->memSize = sizeof data;
    char out[16] = {};
    EXPECT_EQ(MemReadProc(c, out, 4), 4);
    EXPECT_EQ(Text(out, 4), "abcd");
    ExpectSeeks(MemSeekProc, c, {{6, SEEK_SET, 6}, {Back(4), SEEK_CUR, 2}});
    EXPECT_EQ(MemReadProc(c, out, 1), 1);
    EXPECT_EQ(out[0], 'c');
    MemSeekProc(c, 7, SEEK_SET);
    EXPECT_EQ(MemReadProc(c, out, 8), 3) << "a read crossing the end returns what is left";
    EXPECT_EQ(Text(out, 3), "hij");
    EXPECT_EQ(MemReadProc(c, out, 8), 0);
    EXPECT_EQ(MemReadProc(c, out, 0), 0);
    EXPECT_EQ(MemReadProc(c, out, -5), 0);
    EXPECT_EQ(MemSizeProc(c), 10u);
    ExpectSeeks(MemSeekProc, c, {{0, SEEK_CUR, 10}, {Back(1), SEEK_END, 9}, {100, SEEK_SET, 100}});
    EXPECT_EQ(MemReadProc(c, out, 1), 0);
    ExpectSeeks(MemSeekProc, c, {{3, 7, 100}});
    void* base = nullptr;
    uint32_t size = 0;
    EXPECT_EQ(MemMapProc(c, &base, &size), 0);
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
    int32_t Write(const std::string& s) { return MemGrowWriteProc(c_, Chars(s), Size(s)); }

    TestHost host_;
    ConversionContext* c_ = host_.ctx();
};

// Gaps a seek leaves read back as zero, inside the block or beyond it;
// overwriting keeps the size; the position survives the block's growth.
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

// A refused growth is a short write of what still fits, with a host error,
// even after a rewind; a size beyond 32 bits never reaches the host.
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
    EXPECT_EQ(host_.Errors(), Texts(3, "Memory allocation error"));
}

// The host's fixed buffer of 8 bytes and two guard bytes: seeks stay inside
// it and its end is the end of the data; a read needs the whole count to
// remain; skipped bytes are zeroed and writes cut at the capacity.
TEST(FixedBuffer, SeeksEndAtTheDataAndWritesAreCutAtTheCapacity) {
    TestHost host;
    ConversionContext* c = host.ctx();
    unsigned char buffer[10];
    std::memset(buffer, '#', sizeof buffer);
    host->destMemory = host->destMemPos = buffer;
    host->destMemoryCapacity = 8;
    auto write = [c](const std::string& s) { return FixedWriteProc(c, Chars(s), Size(s)); };
    EXPECT_EQ(write("abcdef"), 6);
    ExpectSeeks(FixedSeekProc, c,
                {{8, SEEK_SET, 8}, {9, SEEK_SET, kSeekFailed}, {2, SEEK_SET, 2}, {6, SEEK_CUR, 8},
                 {1, SEEK_CUR, kSeekFailed}, {0, 9, 0}, {3, SEEK_SET, 3}, {0, SEEK_END, 6},
                 {Back(1), SEEK_END, kSeekFailed}, {1, SEEK_END, kSeekFailed}, {4, SEEK_SET, 4}});
    char out[8] = {};
    EXPECT_EQ(FixedReadProc(c, out, 5), 0) << "more than remains: nothing";
    EXPECT_EQ(FixedReadProc(c, out, 4), 4);
    EXPECT_EQ(Text(out, 2), "ef");
    FixedSeekProc(c, 7, SEEK_SET);
    EXPECT_EQ(write("gh"), 1);
    EXPECT_EQ(write("k"), 0);
    EXPECT_EQ(host->memSize, 8u);
    EXPECT_EQ(Text(buffer, 10), Text("abcdef\0g##", 10));
}

}  // namespace
