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

constexpr uint32_t Back(uint32_t n) { return 0u - n; }  // a backward move as a wrapped offset

// A service over a 1000-byte source whose byte i holds i & 0xFF, in 64-byte
// blocks; closing it must release every block.
class StreamBufferTest : public ::testing::Test {
protected:
    void SetUp() override {
        source_.data.resize(1000);
        std::iota(source_.data.begin(), source_.data.end(), 0);
        Open(1);
    }
    void TearDown() override {
        StreamBufferClose(host_.ctx(), sb_);
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << "closing releases everything";
    }

    void Open(int retain) {
        StreamDescriptor desc{PIVLO_STREAM_READ_CALLBACK, MemoryStream::Read, &source_, 7};
        sb_ = StreamBufferInit_(host_.ctx(), &desc, host_->errorProc, retain, 1, 64);
        ASSERT_NE(sb_, nullptr);
    }
    // What a read of `n` bytes delivers; `got` receives its result.
    std::vector<uint8_t> Read(int32_t n, int32_t* got = nullptr) {
        std::vector<uint8_t> out(static_cast<size_t>(n));
        const int32_t r = StreamBufferRead(host_.ctx(), sb_, out.data(), n);
        if (got) *got = r;
        out.resize(r > 0 ? static_cast<size_t>(r) : 0);
        return out;
    }
    int32_t ReadResult(int32_t n) {
        int32_t got = 0;
        Read(n, &got);
        return got;
    }
    static std::vector<uint8_t> Bytes(uint32_t from, uint32_t count) {
        std::vector<uint8_t> b(count);
        std::iota(b.begin(), b.end(), static_cast<uint8_t>(from));
        return b;
    }

    TestHost host_;
    MemoryStream source_;
    StreamBuffer* sb_ = nullptr;
};

// The source, here trickling three bytes at a time, is read only as far as
// a read needs and never twice: skipped data serve backward seeks; a seek
// before the start or with an unknown whence fails and keeps the position.
// Asking for the size reads to the end; a read there returns what is left.
TEST_F(StreamBufferTest, ReadsTheSourceOnlyAsFarAsAskedAndKeepsWhatItRead) {
    source_.maxChunk = 3;
    EXPECT_EQ(Read(10), Bytes(0, 10));
    EXPECT_EQ(StreamBufferSeek(sb_, 300, 0), 300u);
    EXPECT_EQ(source_.bytesRead, 10u) << "a seek alone reads nothing";
    EXPECT_EQ(Read(20), Bytes(300, 20));
    EXPECT_EQ(StreamBufferSeek(sb_, 100, 0), 100u);
    EXPECT_EQ(Read(50), Bytes(100, 50));
    EXPECT_EQ(StreamBufferSeek(sb_, Back(30), 1), 120u);
    EXPECT_EQ(StreamBufferSeek(sb_, Back(121), 1), PIVLO_STREAM_FAILED);
    EXPECT_EQ(StreamBufferSeek(sb_, 0, 9), PIVLO_STREAM_FAILED);
    EXPECT_EQ(StreamBufferSeek(sb_, 0, 1), 120u);
    EXPECT_EQ(source_.bytesRead, 320u);
    EXPECT_EQ(StreamBufferSourceSize(sb_), 1000u);
    EXPECT_EQ(source_.bytesRead, 1000u);
    EXPECT_EQ(StreamBufferSeek(sb_, 0, 1), 120u);
    EXPECT_EQ(StreamBufferSeek(sb_, Back(10), 2), 990u);
    EXPECT_EQ(Read(20), Bytes(990, 10));
    EXPECT_EQ(ReadResult(1), 0);
}

// Released bytes cannot be read again (a failure with a message); a block
// goes once released whole, also by overlapping ranges; the bytes after a
// range stay. An inverted range is refused. Data released before they
// arrive are never kept.
TEST_F(StreamBufferTest, ReleasedDataCannotBeReadAgainAndItsBlocksAreFreed) {
    Read(256);
    const size_t before = TestAllocator::LiveBlocks();
    EXPECT_EQ(StreamBufferDiscardData(host_.ctx(), sb_, 0, 127), 0);
    EXPECT_EQ(TestAllocator::LiveBlocks(), before - 2) << "two whole 64-byte blocks";
    EXPECT_EQ(StreamBufferDiscardData(host_.ctx(), sb_, 128, 150), 0);
    EXPECT_EQ(TestAllocator::LiveBlocks(), before - 2) << "a partly released block stays";
    StreamBufferSeek(sb_, 140, 0);
    EXPECT_EQ(ReadResult(4), -1);
    ASSERT_FALSE(host_.codecErrors.empty());
    EXPECT_EQ(host_.codecErrors.back().code, PIVLO_STREAM_MESSAGE_CODE);
    StreamBufferSeek(sb_, 151, 0);
    EXPECT_EQ(Read(4), Bytes(151, 4));
    StreamBufferDiscardData(host_.ctx(), sb_, 140, 170);
    StreamBufferDiscardData(host_.ctx(), sb_, 165, 191);
    EXPECT_EQ(TestAllocator::LiveBlocks(), before - 3) << "overlapping ranges merge";
    EXPECT_EQ(StreamBufferDiscardData(host_.ctx(), sb_, 10, 9), -1);
    StreamBufferDiscardData(host_.ctx(), sb_, 0, 511);
    StreamBufferSeek(sb_, 600, 0);
    EXPECT_EQ(Read(4), Bytes(600, 4));
    EXPECT_LE(TestAllocator::LiveBlocks(), 3u) << "the handle and the blocks from 512 on";
}

// Memory refused, then a source that fails: each fails the read with its
// message; after the first a later read can succeed, after the second the
// size cannot be learnt.
TEST_F(StreamBufferTest, FailuresFailTheReadWithAMessage) {
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(ReadResult(10), -1);
    EXPECT_EQ(host_.codecErrors.back(),
              (CodecMessage{PIVLO_STREAM_MESSAGE_CODE, "Stream buffer: memory allocation failed"}));
    EXPECT_EQ(Read(10), Bytes(0, 10));
    source_.failReads = true;
    EXPECT_EQ(ReadResult(100), -1);
    EXPECT_EQ(host_.codecErrors.back(),
              (CodecMessage{PIVLO_STREAM_MESSAGE_CODE, "Stream buffer: the source could not be read"}));
    EXPECT_EQ(StreamBufferSourceSize(sb_), PIVLO_STREAM_FAILED);
}

// Without retained data what lies behind the position is released.
TEST_F(StreamBufferTest, ForwardOnlyModeReleasesWhatLiesBehind) {
    StreamBufferClose(host_.ctx(), sb_);
    Open(0);
    Read(300);
    EXPECT_LE(TestAllocator::LiveBlocks(), 3u) << "handle plus the block in use";
    StreamBufferSeek(sb_, 0, 0);
    EXPECT_EQ(ReadResult(4), -1);
}

// A wrong kind, no read function or no descriptor: refused with a message,
// unless the caller asked for quiet. With the default block size a large
// read is served whole.
TEST(StreamBufferInit, UnusableDescriptorsAreRefusedAndTheDefaultBlockSizeServes) {
    TestHost host;
    host.UseExSinks();
    StreamDescriptor wrongKind{3, MemoryStream::Read, nullptr, 0};
    StreamDescriptor noRead{PIVLO_STREAM_READ_CALLBACK, nullptr, nullptr, 0};
    for (StreamDescriptor* desc : {&wrongKind, &noRead, static_cast<StreamDescriptor*>(nullptr)})
        EXPECT_EQ(StreamBufferInit2_(host.ctx(), desc, host->errorProcEx, &host, 1, 1, 0), nullptr);
    EXPECT_EQ(host.codecErrors.size(), 3u);
    EXPECT_EQ(StreamBufferInit_(host.ctx(), &noRead, nullptr, 1, 0, 0), nullptr);
    EXPECT_EQ(host.codecErrors.size(), 3u) << "reportErrors 0 keeps quiet";

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
