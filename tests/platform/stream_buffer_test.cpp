// The stream buffer service: lazy reading, backward seeks within kept data,
// released ranges, the size on demand, and failures.

#include <gtest/gtest.h>

#include <numeric>
#include <vector>

#include "pivlo/pivlo.h"
#include "support/memory_stream.h"
#include "support/test_host.h"

namespace {

using zantest::CodecMessage;
using zantest::MemoryStream;
using zantest::TestAllocator;
using zantest::TestHost;

class StreamBufferTest : public ::testing::Test {
protected:
    void SetUp() override {
        source_.data.resize(1000);
        std::iota(source_.data.begin(), source_.data.end(), 0);  // byte i holds i & 0xFF
        Open(1, 64);
    }
    void TearDown() override { Close(); }

    void Open(int retain, uint32_t blockSize) {
        StreamDescriptor desc{PIVLO_STREAM_READ_CALLBACK, MemoryStream::Read, &source_, 7};
        sb_ = StreamBufferInit_(host_.ctx(), &desc, host_->errorProc, retain, 1, blockSize);
        ASSERT_NE(sb_, nullptr);
    }
    void Close() {
        StreamBufferClose(host_.ctx(), sb_);
        sb_ = nullptr;
    }
    std::vector<uint8_t> Read(int32_t n, int32_t* got = nullptr) {
        std::vector<uint8_t> out(static_cast<size_t>(n));
        const int32_t r = StreamBufferRead(host_.ctx(), sb_, out.data(), n);
        if (got) *got = r;
        out.resize(r > 0 ? static_cast<size_t>(r) : 0);
        return out;
    }
    static std::vector<uint8_t> Bytes(uint32_t from, uint32_t count) {
        std::vector<uint8_t> b(count);
        for (uint32_t i = 0; i < count; ++i) b[i] = static_cast<uint8_t>(from + i);
        return b;
    }

    TestHost host_;
    MemoryStream source_;
    StreamBuffer* sb_ = nullptr;
};

TEST_F(StreamBufferTest, ReadsTheSourceOnlyAsFarAsAsked) {
    EXPECT_EQ(Read(10), Bytes(0, 10));
    EXPECT_EQ(source_.bytesRead, 10u);
    EXPECT_EQ(StreamBufferSeek(sb_, 500, 0), 500u);
    EXPECT_EQ(source_.bytesRead, 10u) << "a seek alone reads nothing";
    EXPECT_EQ(Read(4), Bytes(500, 4));
    EXPECT_EQ(source_.bytesRead, 504u);
}

TEST_F(StreamBufferTest, ServesBackwardSeeksFromKeptData) {
    StreamBufferSeek(sb_, 300, 0);
    Read(20);
    EXPECT_EQ(StreamBufferSeek(sb_, 100, 0), 100u);
    EXPECT_EQ(Read(50), Bytes(100, 50)) << "skipped data was kept";
    EXPECT_EQ(StreamBufferSeek(sb_, static_cast<uint32_t>(-30), 1), 120u);
    EXPECT_EQ(StreamBufferSeek(sb_, 0, 1), 120u);
    EXPECT_EQ(source_.bytesRead, 320u) << "no byte is read from the source twice";
}

TEST_F(StreamBufferTest, ReleasedDataCannotBeReadAgainAndItsBlocksAreFreed) {
    Read(256);
    const size_t blocksBefore = TestAllocator::LiveBlocks();
    EXPECT_EQ(StreamBufferDiscardData(host_.ctx(), sb_, 0, 127), 0);
    EXPECT_EQ(TestAllocator::LiveBlocks(), blocksBefore - 2) << "two whole 64-byte blocks";
    EXPECT_EQ(StreamBufferDiscardData(host_.ctx(), sb_, 128, 150), 0);
    EXPECT_EQ(TestAllocator::LiveBlocks(), blocksBefore - 2) << "a partly released block stays";
    StreamBufferSeek(sb_, 140, 0);
    int32_t got = 0;
    Read(4, &got);
    EXPECT_EQ(got, -1);
    ASSERT_FALSE(host_.codecErrors.empty());
    EXPECT_EQ(host_.codecErrors.back().code, PIVLO_STREAM_MESSAGE_CODE);
    StreamBufferSeek(sb_, 151, 0);
    EXPECT_EQ(Read(4), Bytes(151, 4)) << "the bytes after the range are still there";
    EXPECT_EQ(StreamBufferDiscardData(host_.ctx(), sb_, 10, 9), -1);
}

TEST_F(StreamBufferTest, OverlappingReleasesMergeIntoWholeBlocks) {
    Read(192);
    const size_t before = TestAllocator::LiveBlocks();
    StreamBufferDiscardData(host_.ctx(), sb_, 64, 100);
    StreamBufferDiscardData(host_.ctx(), sb_, 90, 127);
    EXPECT_EQ(TestAllocator::LiveBlocks(), before - 1);
}

TEST_F(StreamBufferTest, DataReleasedBeforeItArrivesIsNeverKept) {
    StreamBufferDiscardData(host_.ctx(), sb_, 0, 511);
    StreamBufferSeek(sb_, 600, 0);
    EXPECT_EQ(Read(4), Bytes(600, 4));
    EXPECT_LE(TestAllocator::LiveBlocks(), 4u) << "only blocks from 512 on are held";
}

TEST_F(StreamBufferTest, SizeIsLearntByReadingToTheEndOnlyWhenAsked) {
    Read(5);
    EXPECT_EQ(source_.bytesRead, 5u);
    EXPECT_EQ(StreamBufferSourceSize(sb_), 1000u);
    EXPECT_EQ(source_.bytesRead, 1000u);
    EXPECT_EQ(StreamBufferSeek(sb_, 0, 1), 5u) << "the position is kept";
    EXPECT_EQ(StreamBufferSeek(sb_, static_cast<uint32_t>(-10), 2), 990u);
    EXPECT_EQ(Read(20), Bytes(990, 10)) << "a read at the end returns what is left";
    int32_t got = -2;
    Read(1, &got);
    EXPECT_EQ(got, 0);
}

TEST_F(StreamBufferTest, SeeksBeforeTheStartFailAndKeepThePosition) {
    StreamBufferSeek(sb_, 10, 0);
    EXPECT_EQ(StreamBufferSeek(sb_, static_cast<uint32_t>(-11), 1), PIVLO_STREAM_FAILED);
    EXPECT_EQ(StreamBufferSeek(sb_, 0, 1), 10u);
    EXPECT_EQ(StreamBufferSeek(sb_, 0, 9), PIVLO_STREAM_FAILED);
}

TEST_F(StreamBufferTest, TricklingSourceIsReadUntilTheRequestIsMet) {
    source_.maxChunk = 3;
    EXPECT_EQ(Read(100), Bytes(0, 100));
}

TEST_F(StreamBufferTest, FailingSourceFailsTheReadWithAMessage) {
    source_.failReads = true;
    int32_t got = 0;
    Read(10, &got);
    EXPECT_EQ(got, -1);
    EXPECT_EQ(StreamBufferSourceSize(sb_), PIVLO_STREAM_FAILED);
    ASSERT_FALSE(host_.codecErrors.empty());
    EXPECT_EQ(host_.codecErrors[0],
              (CodecMessage{PIVLO_STREAM_MESSAGE_CODE, "Stream buffer: the source could not be read"}));
}

TEST_F(StreamBufferTest, MemoryShortageFailsTheRead) {
    TestAllocator::FailNthCall(1);
    int32_t got = 0;
    Read(10, &got);
    EXPECT_EQ(got, -1);
    EXPECT_EQ(host_.codecErrors.back().text, "Stream buffer: memory allocation failed");
    EXPECT_EQ(Read(10), Bytes(0, 10)) << "a later read can succeed";
}

TEST_F(StreamBufferTest, ForwardOnlyModeReleasesWhatLiesBehind) {
    Close();
    Open(0, 64);
    Read(300);
    EXPECT_LE(TestAllocator::LiveBlocks(), 3u) << "handle plus the block in use";
    StreamBufferSeek(sb_, 0, 0);
    int32_t got = 0;
    Read(4, &got);
    EXPECT_EQ(got, -1);
}

TEST_F(StreamBufferTest, CloseReleasesEverything) {
    StreamBufferSourceSize(sb_);
    Close();
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
    Open(1, 64);  // for TearDown
}

TEST(StreamBufferInit, UnusableDescriptorsAreRefusedWithAMessage) {
    TestHost host;
    host.UseExSinks();
    StreamDescriptor wrongKind{3, MemoryStream::Read, nullptr, 0};
    StreamDescriptor noRead{PIVLO_STREAM_READ_CALLBACK, nullptr, nullptr, 0};
    EXPECT_EQ(StreamBufferInit2_(host.ctx(), &wrongKind, host->errorProcEx, &host, 1, 1, 0), nullptr);
    EXPECT_EQ(StreamBufferInit2_(host.ctx(), &noRead, host->errorProcEx, &host, 1, 1, 0), nullptr);
    EXPECT_EQ(StreamBufferInit2_(host.ctx(), nullptr, host->errorProcEx, &host, 1, 1, 0), nullptr);
    EXPECT_EQ(host.codecErrors.size(), 3u);
    EXPECT_EQ(StreamBufferInit_(host.ctx(), &noRead, nullptr, 1, 0, 0), nullptr);
    EXPECT_EQ(host.codecErrors.size(), 3u) << "reportErrors 0 keeps quiet";
}

TEST(StreamBufferInit, DefaultBlockSizeServesLargeReads) {
    TestHost host;
    MemoryStream source;
    source.data.assign(200000, 0x5C);
    StreamDescriptor desc{PIVLO_STREAM_READ_CALLBACK, MemoryStream::Read, &source, 0};
    StreamBuffer* sb = StreamBufferInit_(host.ctx(), &desc, nullptr, 1, 1, 0);
    std::vector<uint8_t> out(150000);
    EXPECT_EQ(StreamBufferRead(host.ctx(), sb, out.data(), 150000), 150000);
    EXPECT_EQ(out[149999], 0x5C);
    EXPECT_EQ(StreamBufferSourceSize(sb), 200000u);
    StreamBufferClose(host.ctx(), sb);
}

}  // namespace
