// Opening codec objects on every kind of source and destination, teardown,
// and what a host sees when any of it fails.

#include <gtest/gtest.h>

#include <cstdio>
#include <functional>
#include <memory>
#include <string>

#include "frame/tiff_open.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "support/memory_stream.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace {

using namespace zantest;
using zan::OpenTIFFForReading;
using zan::OpenTIFFForWriting;

// A record of the codec's process-wide handlers, to check they come back.
struct HandlerProbe {
    static void Error(const char*, const char*, va_list) {}
    static void Warning(const char*, const char*, va_list) {}
    HandlerProbe() {
        savedError = TIFFSetErrorHandler(Error);
        savedWarning = TIFFSetWarningHandler(Warning);
    }
    ~HandlerProbe() {
        TIFFSetErrorHandler(savedError);
        TIFFSetWarningHandler(savedWarning);
    }
    // True when the probe's handlers are the codec's again.
    static bool InForce() {
        const TIFFErrorHandler e = TIFFSetErrorHandler(Error);
        const TIFFErrorHandler w = TIFFSetWarningHandler(Warning);
        return e == Error && w == Warning;
    }
    TIFFErrorHandler savedError, savedWarning;
};

FileSpec ThreePages() {
    FileSpec spec;
    spec.pages.assign(3, PageSpec{});
    spec.pages[1].width = 24;
    spec.pages[2].samplesPerPixel = 3;
    spec.pages[2].photometric = PHOTOMETRIC_RGB;
    spec.pages[2].compression = COMPRESSION_LZW;
    return spec;
}

// Every page of the codec object from its current directory on, decoded.
std::vector<DecodedPage> DecodeAll(TIFF* tif) {
    std::vector<DecodedPage> pages;
    do {
        DecodedPage page;
        TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &page.width);
        TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &page.height);
        std::vector<uint8_t> strip(static_cast<size_t>(TIFFStripSize(tif)));
        for (uint32_t s = 0; s < TIFFNumberOfStrips(tif); ++s) {
            const tmsize_t n = TIFFReadEncodedStrip(tif, s, strip.data(), -1);
            if (n < 0) return {};
            page.pixels.insert(page.pixels.end(), strip.begin(), strip.begin() + n);
        }
        pages.push_back(std::move(page));
    } while (TIFFReadDirectory(tif));
    return pages;
}

bool SamePages(const std::vector<DecodedPage>& a, const std::vector<DecodedPage>& b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); ++i)
        if (a[i].width != b[i].width || a[i].height != b[i].height || a[i].pixels != b[i].pixels)
            return false;
    return true;
}

// ---------------------------------------------------------------- reading

enum class SourceKind { File, Memory, Callbacks, StreamBuffer };

// Binds a TestHost's source to `bytes` in the chosen way and keeps what the
// source needs alive.
class SourceFixture {
public:
    SourceFixture(TestHost& host, SourceKind kind, const Bytes& bytes) : bytes_(bytes) {
        ConversionContext* ctx = host.ctx();
        switch (kind) {
        case SourceKind::File: {
            // The TIFF sits after 5 bytes of something else in the file.
            Bytes padded(bytes.size() + 5, '!');
            std::copy(bytes.begin(), bytes.end(), padded.begin() + 5);
            WriteFileBytes(file_.path(), padded);
            fp_ = std::fopen(file_.c_str(), "rb");
            ctx->sourceKind = ZAN_SOURCE_FILE;
            ctx->sourceFp = fp_;
            ctx->sourceBaseOffset = 5;
            break;
        }
        case SourceKind::Memory:
            ctx->sourceKind = ZAN_SOURCE_MEMORY;
            ctx->sourceMemory = bytes_.data();
            ctx->sourceMemorySize = static_cast<uint32_t>(bytes_.size());
            break;
        case SourceKind::Callbacks:
        case SourceKind::StreamBuffer:
            stream_.data = bytes;
            UseStreamSource(ctx, &stream_, kind == SourceKind::Callbacks);
            break;
        }
    }
    ~SourceFixture() {
        if (fp_) std::fclose(fp_);
    }
    FILE* fp() const { return fp_; }
    MemoryStream& stream() { return stream_; }

private:
    Bytes bytes_;
    TempFile file_;
    FILE* fp_ = nullptr;
    MemoryStream stream_;
};

class ReadingTest : public ::testing::TestWithParam<SourceKind> {};

TEST_P(ReadingTest, ReadsEveryPageOfEverySourceKind) {
    HandlerProbe probe;
    const Bytes tiff = MakeTiff(ThreePages());
    {
        TestHost host;
        SourceFixture source(host, GetParam(), tiff);
        ASSERT_EQ(OpenTIFFForReading(host.ctx()), 1) << ::testing::PrintToString(host.Errors());
        ASSERT_NE(host->tiff, nullptr);
        EXPECT_EQ(TIFFGetContextPivlo(host->tiff), host.ctx());
        EXPECT_FALSE(HandlerProbe::InForce()) << "the job's handlers are in force while open";
        EXPECT_TRUE(SamePages(DecodeAll(host->tiff), DecodeWithLibtiff(tiff)));
        EXPECT_TRUE(host.Errors().empty());
        host.EndJob();
        EXPECT_EQ(host->tiff, nullptr);
        EXPECT_EQ(host->fileHandle, nullptr);
        EXPECT_EQ(host->streamBuffer, nullptr);
        if (source.fp()) {
            EXPECT_EQ(std::fseek(source.fp(), 0, SEEK_SET), 0) << "the file stays open";
        }
    }
    EXPECT_TRUE(HandlerProbe::InForce());
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
}

std::string SourceName(const ::testing::TestParamInfo<SourceKind>& info) {
    static const char* const kNames[] = {"File", "Memory", "Callbacks", "StreamBuffer"};
    return kNames[static_cast<int>(info.param)];
}

INSTANTIATE_TEST_SUITE_P(Sources, ReadingTest,
                         ::testing::Values(SourceKind::File, SourceKind::Memory,
                                           SourceKind::Callbacks, SourceKind::StreamBuffer),
                         SourceName);

TEST(ReadingOpen, SecondOpenTouchesNeitherSourceNorHandlers) {
    TestHost host;
    SourceFixture source(host, SourceKind::Callbacks, MakePages(1));
    ASSERT_EQ(OpenTIFFForReading(host.ctx()), 1);
    TIFF* first = host->tiff;
    const int reads = source.stream().reads;
    const auto saved = host->savedErrorHandler;
    host->sourceKind = 99;
    EXPECT_EQ(OpenTIFFForReading(host.ctx()), 1);
    EXPECT_EQ(host->tiff, first);
    EXPECT_EQ(source.stream().reads, reads);
    EXPECT_EQ(host->savedErrorHandler, saved);
}

TEST(ReadingOpen, DescribedPageCountsAsOpen) {
    TestHost host;
    host->state = ZAN_STATE_DESCRIBED;
    host->sourceKind = 99;
    EXPECT_EQ(OpenTIFFForReading(host.ctx()), 1);
    EXPECT_EQ(host->tiff, nullptr);
}

TEST(ReadingOpen, UnknownSourceKindFailsWithoutAMessage) {
    HandlerProbe probe;
    TestHost host;
    for (uint32_t kind : {0u, 3u, 5u}) {
        host->sourceKind = kind;
        EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
    }
    EXPECT_TRUE(host.messages.empty());
    EXPECT_TRUE(HandlerProbe::InForce());
}

TEST(ReadingOpen, SourceThatIsNoTiffIsRefusedAndNothingIsHeld) {
    HandlerProbe probe;
    for (SourceKind kind : {SourceKind::File, SourceKind::Memory, SourceKind::Callbacks,
                            SourceKind::StreamBuffer}) {
        TestHost host;
        SourceFixture source(host, kind, Bytes{'n', 'o', 't', ' ', 'a', ' ', 't', 'i', 'f', 'f'});
        EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
        EXPECT_EQ(host.Errors(), std::vector<std::string>{"Unable to create a tiff object"});
        EXPECT_FALSE(host.codecErrors.empty()) << "the codec says why";
        EXPECT_EQ(host->fileHandle, nullptr);
        EXPECT_EQ(host->streamBuffer, nullptr);
        EXPECT_TRUE(HandlerProbe::InForce());
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
    }
}

TEST(ReadingOpen, FileWithoutRecordMemoryReportsMemoryAllocation) {
    HandlerProbe probe;
    TestHost host;
    SourceFixture source(host, SourceKind::File, MakePages(1));
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
    EXPECT_EQ(host.Errors(), std::vector<std::string>{"Memory allocation"});
    EXPECT_TRUE(HandlerProbe::InForce());
}

TEST(ReadingOpen, StreamBufferThatCannotStartReportsInitializing) {
    TestHost host;
    SourceFixture source(host, SourceKind::StreamBuffer, MakePages(1));
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
    EXPECT_EQ(host.Errors(), std::vector<std::string>{"Initializing stream buffer"});
    EXPECT_EQ(host->streamBuffer, nullptr);
    ASSERT_FALSE(host.codecErrors.empty()) << "the service reports to the job's error sink";
    EXPECT_EQ(host.codecErrors[0].code, PIVLO_STREAM_MESSAGE_CODE);
}

TEST(ReadingOpen, StreamBufferUsesTheSecondMessageStyleWhenChosen) {
    TestHost host;
    host.UseExSinks();
    host->errorProc = nullptr;
    SourceFixture source(host, SourceKind::StreamBuffer, MakePages(1));
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
    ASSERT_EQ(host.codecErrors.size(), 1u);
    EXPECT_EQ(host.codecErrors[0].code, PIVLO_STREAM_MESSAGE_CODE);
}

TEST(ReadingOpen, MemorySourceWithoutDataIsRefusedCleanly) {
    TestHost host;
    host->sourceKind = ZAN_SOURCE_MEMORY;
    host->sourceMemory = nullptr;
    host->sourceMemorySize = 4096;
    EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
    EXPECT_TRUE(host.HasError("Unable to create a tiff object"));
}

TEST(ReadingOpen, StreamSourceWhoseReadsFailIsRefused) {
    for (SourceKind kind : {SourceKind::Callbacks, SourceKind::StreamBuffer}) {
        TestHost host;
        SourceFixture source(host, kind, MakePages(1));
        source.stream().failReads = true;
        EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
        EXPECT_TRUE(host.HasError("Unable to create a tiff object"));
    }
}

TEST(ReadingOpen, StreamBufferReadsTheSourceOnlyOnce) {
    TestHost host;
    const Bytes tiff = MakeTiff(ThreePages());
    SourceFixture source(host, SourceKind::StreamBuffer, tiff);
    source.stream().maxChunk = 7;  // a trickling source
    ASSERT_EQ(OpenTIFFForReading(host.ctx()), 1);
    EXPECT_TRUE(SamePages(DecodeAll(host->tiff), DecodeWithLibtiff(tiff)));
    EXPECT_LE(source.stream().bytesRead, tiff.size());
}

// ---------------------------------------------------------------- writing

enum class DestKind { FileReopened, FileAsIs, Callbacks, FixedBuffer, GrowingMemory };

// A destination of the chosen kind for a TestHost, and the bytes it holds
// once the job has ended.
class DestinationFixture {
public:
    DestinationFixture(TestHost& host, DestKind kind, uint32_t fixedCapacity = 1 << 20)
        : host_(host), kind_(kind), fixed_(fixedCapacity + kGuard, 0xAB) {
        ConversionContext* ctx = host.ctx();
        switch (kind) {
        case DestKind::FileReopened:
        case DestKind::FileAsIs:
            WriteFileBytes(file_.path(), {});
            ctx->destKind = ZAN_DEST_FILE;
            ctx->destPath = file_.c_str();
            if (kind == DestKind::FileAsIs) {
                ctx->destFp = std::fopen(file_.c_str(), "w+b");
                ctx->destFileFlags = ZAN_DEST_FILE_USE_AS_IS;
            } else {
                // Read-only on purpose: writing works only through the reopened stream.
                ctx->destFp = std::fopen(file_.c_str(), "rb");
            }
            break;
        case DestKind::Callbacks:
            ctx->destKind = ZAN_DEST_CALLBACKS;
            ctx->destWriteProc = MemoryStream::Write;
            ctx->destSeekProc = MemoryStream::Seek;
            ctx->destUserData = &stream_;
            ctx->sourceReadProc = MemoryStream::Read;  // read-back of what was written
            ctx->sourceUserData = &stream_;
            break;
        case DestKind::FixedBuffer:
            ctx->destKind = ZAN_DEST_FIXED_BUFFER;
            ctx->destMemory = fixed_.data();
            ctx->destMemoryCapacity = fixedCapacity;
            ctx->destSizeOut = &size_;
            break;
        case DestKind::GrowingMemory:
            ctx->destKind = ZAN_DEST_MEMORY;
            ctx->destMemory = &block_;
            ctx->destSizeOut = &size_;
            break;
        }
    }
    ~DestinationFixture() {
        if (host_->destFp) std::fclose(host_->destFp);
        host_->destFp = nullptr;
        if (block_ != kUnset) TestAllocator::Free(block_);  // the handed-over image
    }

    // The bytes written, after the job has ended.
    Bytes Written() {
        switch (kind_) {
        case DestKind::FileReopened:
        case DestKind::FileAsIs:
            std::fflush(host_->destFp);
            return ReadFileBytes(file_.path());
        case DestKind::Callbacks:
            return stream_.data;
        case DestKind::FixedBuffer:
            return Bytes(fixed_.begin(), fixed_.begin() + size_);
        case DestKind::GrowingMemory:
            return block_ && block_ != kUnset ? Bytes(static_cast<uint8_t*>(block_), static_cast<uint8_t*>(block_) + size_)
                          : Bytes();
        }
        return {};
    }
    bool GuardIntact() const {
        for (size_t i = fixed_.size() - kGuard; i < fixed_.size(); ++i)
            if (fixed_[i] != 0xAB) return false;
        return true;
    }
    MemoryStream& stream() { return stream_; }
    void* block() const { return block_; }
    uint32_t size() const { return size_; }
    const TempFile& file() const { return file_; }

private:
    static constexpr size_t kGuard = 16;
    inline static char kGuardByte = 0;
    inline static void* const kUnset = &kGuardByte;  // the open must overwrite it
    TestHost& host_;
    DestKind kind_;
    TempFile file_;
    MemoryStream stream_;
    Bytes fixed_;
    void* block_ = kUnset;
    uint32_t size_ = 0xDEAD;
};

FileSpec TwoPages() {
    FileSpec spec;
    spec.pages.assign(2, PageSpec{});
    spec.pages[1].height = 20;
    spec.pages[1].compression = COMPRESSION_PACKBITS;
    return spec;
}

class WritingTest : public ::testing::TestWithParam<DestKind> {};

TEST_P(WritingTest, EveryDestinationHoldsTheSameMultiPageFile) {
    static Bytes reference;  // the first kind's bytes; every other kind must match
    HandlerProbe probe;
    TestHost host;
    DestinationFixture dest(host, GetParam());
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1) << ::testing::PrintToString(host.Errors());
    EXPECT_EQ(TIFFGetContextPivlo(host->tiff), host.ctx());
    ASSERT_TRUE(WritePages(host->tiff, TwoPages()));
    host.EndJob();
    EXPECT_TRUE(HandlerProbe::InForce());
    EXPECT_TRUE(host.Errors().empty()) << ::testing::PrintToString(host.Errors());
    const Bytes written = dest.Written();
    EXPECT_TRUE(SamePages(DecodeWithLibtiff(written), DecodeWithLibtiff(MakeTiff(TwoPages()))));
    if (reference.empty()) reference = written;
    EXPECT_EQ(written, reference);
    EXPECT_EQ(TestAllocator::LiveBlocks(), GetParam() == DestKind::GrowingMemory ? 1u : 0u)
        << "only the handed-over image is left, and it is the host's";
}

std::string DestName(const ::testing::TestParamInfo<DestKind>& info) {
    static const char* const kNames[] = {"FileReopened", "FileAsIs", "Callbacks", "FixedBuffer",
                                         "GrowingMemory"};
    return kNames[static_cast<int>(info.param)];
}

INSTANTIATE_TEST_SUITE_P(Destinations, WritingTest,
                         ::testing::Values(DestKind::FileReopened, DestKind::FileAsIs,
                                           DestKind::Callbacks, DestKind::FixedBuffer,
                                           DestKind::GrowingMemory),
                         DestName);

TEST(WritingOpen, AppendModeAddsPagesToAnExistingFile) {
    for (DestKind kind : {DestKind::FileReopened, DestKind::Callbacks}) {
        TestHost host;
        DestinationFixture dest(host, kind);
        const Bytes first = MakePages(1);
        if (kind == DestKind::Callbacks) dest.stream().data = first;
        else WriteFileBytes(dest.file().path(), first);
        host->appendPages = 1;
        ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
        FileSpec more;
        more.pages[0].width = 9;
        ASSERT_TRUE(WritePages(host->tiff, more, 1));
        host.EndJob();
        const auto pages = DecodeWithLibtiff(dest.Written());
        ASSERT_EQ(pages.size(), 2u);
        EXPECT_EQ(pages[0].width, 16u);
        EXPECT_EQ(pages[1].width, 9u);
    }
}

TEST(WritingOpen, CallbackDestinationWithoutReadBackFailsAtTheSecondPage) {
    TestHost host;
    DestinationFixture dest(host, DestKind::Callbacks);
    host->sourceReadProc = nullptr;
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    FileSpec one;
    EXPECT_TRUE(WritePages(host->tiff, one, 0));
    EXPECT_FALSE(WritePages(host->tiff, one, 1));
    EXPECT_TRUE(host.HasError(
        "Destination cannot be read back: a source read function is needed to add a page"));
    host.EndJob();
    const auto pages = DecodeWithLibtiff(dest.Written());
    EXPECT_GE(pages.size(), 1u) << "the first page stays readable";
}

TEST(WritingOpen, FileIsReopenedFromItsPathUnlessUsedAsIs) {
    TestHost host;
    DestinationFixture dest(host, DestKind::FileReopened);
    FILE* handedIn = host->destFp;
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    EXPECT_NE(host->destFp, nullptr);
    (void)handedIn;  // closed by the open; only the new stream may be used
    ASSERT_TRUE(WritePages(host->tiff, FileSpec{}));
    host.EndJob();
    EXPECT_EQ(DecodeWithLibtiff(dest.Written()).size(), 1u);
}

TEST(WritingOpen, FileThatCannotBeReopenedLeavesNoStream) {
    HandlerProbe probe;
    TestHost host;
    host->destKind = ZAN_DEST_FILE;
    host->destPath = "/nonexistent-dir/zantiff/out.tif";
    host->destFp = nullptr;
    EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
    EXPECT_EQ(host.Errors(), std::vector<std::string>{"Unable to reopen destination file."});
    EXPECT_EQ(host->destFp, nullptr);
    EXPECT_TRUE(HandlerProbe::InForce());
}

TEST(WritingOpen, FileRecordThatCannotBeHadReportsMemoryAllocation) {
    TestHost host;
    DestinationFixture dest(host, DestKind::FileAsIs);
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
    EXPECT_EQ(host.Errors(), std::vector<std::string>{"Memory allocation"});
    EXPECT_EQ(host->fileHandle, nullptr);
}

TEST(WritingOpen, CallbackDestinationNeedsASeekFunction) {
    HandlerProbe probe;
    TestHost host;
    DestinationFixture dest(host, DestKind::Callbacks);
    host->destSeekProc = nullptr;
    EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
    EXPECT_EQ(host.Errors(), std::vector<std::string>{
                                 "Destination function is supported only when seek function is provided"});
    EXPECT_TRUE(HandlerProbe::InForce());
}

TEST(WritingOpen, UnknownDestinationKindFailsWithoutAMessage) {
    HandlerProbe probe;
    TestHost host;
    for (uint32_t kind : {0u, 5u, 17u}) {
        host->destKind = kind;
        EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
    }
    EXPECT_TRUE(host.messages.empty());
    EXPECT_TRUE(HandlerProbe::InForce());
}

TEST(WritingOpen, SecondOpenReturnsTheSameObject) {
    TestHost host;
    DestinationFixture dest(host, DestKind::GrowingMemory);
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    TIFF* first = host->tiff;
    host->destKind = 42;
    EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    EXPECT_EQ(host->tiff, first);
    host->destKind = ZAN_DEST_MEMORY;
}

TEST(GrowingMemory, FirstBlockIsHalfTheFrameBufferPlus60) {
    for (uint32_t frame : {0u, 1u, 1000u}) {
        TestHost host;
        DestinationFixture dest(host, DestKind::GrowingMemory);
        host->frameBufferSize = frame;
        ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
        EXPECT_EQ(host->memCapacity, frame / 2 + 60);
        EXPECT_EQ(dest.block(), nullptr) << "the host's variable is cleared at the open";
        EXPECT_EQ(dest.size(), 0u);
    }
}

TEST(GrowingMemory, ImageGrowsAndIsHandedOverShrunk) {
    TestHost host;
    DestinationFixture dest(host, DestKind::GrowingMemory);
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    ASSERT_TRUE(WritePages(host->tiff, TwoPages()));
    const uint32_t written = host->memSize;
    EXPECT_GT(host->memCapacity, 60u);
    host.EndJob();
    EXPECT_EQ(dest.size(), written);
    ASSERT_NE(dest.block(), nullptr);
    EXPECT_TRUE(TestAllocator::Owns(dest.block())) << "the block comes from the job's allocator";
    EXPECT_EQ(host->memBase, nullptr) << "the module no longer holds the image";
    EXPECT_EQ(DecodeWithLibtiff(dest.Written()).size(), 2u);
}

TEST(GrowingMemory, NoPageWrittenHandsOverTheHeaderAlone) {
    TestHost host;
    DestinationFixture dest(host, DestKind::GrowingMemory);
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    host.EndJob();
    EXPECT_EQ(dest.size(), 8u) << "the codec writes the 8-byte header when it opens";
    ASSERT_NE(dest.block(), nullptr);
    EXPECT_EQ(dest.Written()[0], dest.Written()[1]) << "II or MM";
}

TEST(GrowingMemory, SecondTeardownHandsNothingOverAgain) {
    TestHost host;
    DestinationFixture dest(host, DestKind::GrowingMemory);
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    ASSERT_TRUE(WritePages(host->tiff, FileSpec{}));
    zanDestroyTIFF(host.ctx());
    void* handed = dest.block();
    *static_cast<void**>(host->destMemory) = nullptr;
    zanDestroyTIFF(host.ctx());
    EXPECT_EQ(dest.block(), nullptr);
    TestAllocator::Free(handed);
}

TEST(GrowingMemory, CodecThatCannotBeCreatedReleasesTheBlock) {
    HandlerProbe probe;
    TestHost host;
    DestinationFixture dest(host, DestKind::GrowingMemory);
    pivloWorkBuffer(host.ctx(), 100);
    TestAllocator::FailNthCall(2);  // the block is had, the codec's own record is not
    EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
    EXPECT_TRUE(host.HasError("Unable to create TIFF object"));
    EXPECT_EQ(host->memBase, nullptr);
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << "block released and work buffer reset";
    EXPECT_TRUE(HandlerProbe::InForce());
}

TEST(GrowingMemory, FirstBlockThatCannotBeHadReportsMemoryAllocation) {
    TestHost host;
    DestinationFixture dest(host, DestKind::GrowingMemory);
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
    EXPECT_EQ(host.Errors(), std::vector<std::string>{"Memory allocation"});
}

TEST(FixedBuffer, PageThatDoesNotFitFailsWithoutOverflow) {
    TestHost host;
    DestinationFixture dest(host, DestKind::FixedBuffer, 200);
    if (OpenTIFFForWriting(host.ctx()) == 1) {
        FileSpec big;
        big.pages[0].width = 64;
        big.pages[0].height = 64;
        EXPECT_FALSE(WritePages(host->tiff, big));
    }
    host.EndJob();
    EXPECT_FALSE(host.codecErrors.empty()) << "the codec reports the failed write";
    EXPECT_TRUE(dest.GuardIntact());
    EXPECT_LE(dest.size(), 200u);
}

TEST(FixedBuffer, SizeIsTheHighWaterMarkOfWriting) {
    TestHost host;
    DestinationFixture dest(host, DestKind::FixedBuffer);
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    EXPECT_EQ(dest.size(), 0u) << "cleared at the open";
    ASSERT_TRUE(WritePages(host->tiff, FileSpec{}));
    host.EndJob();
    EXPECT_EQ(dest.size(), host->memSize);
    EXPECT_EQ(DecodeWithLibtiff(dest.Written()).size(), 1u);
}

TEST(DestinationFailure, CodecThatCannotWriteItsHeaderIsReported) {
    TestHost host;
    DestinationFixture dest(host, DestKind::FixedBuffer, 4);
    const int opened = OpenTIFFForWriting(host.ctx());
    if (opened == 0) {
        EXPECT_TRUE(host.HasError("Unable to create TIFF object"));
    } else {
        EXPECT_FALSE(WritePages(host->tiff, FileSpec{}));
    }
    host.EndJob();
    EXPECT_TRUE(dest.GuardIntact());
}

// ---------------------------------------------------------------- teardown

TEST(Teardown, PageInProgressIsWrittenOut) {
    TestHost host;
    DestinationFixture dest(host, DestKind::GrowingMemory);
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    TIFF* tif = host->tiff;
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, 8);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, 2);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
    uint8_t row[8] = {1, 2, 3, 4, 5, 6, 7, 8};
    TIFFWriteScanline(tif, row, 0, 0);
    TIFFWriteScanline(tif, row, 1, 0);
    host->state = ZAN_STATE_WRITING;
    host.EndJob();
    EXPECT_EQ(host->state, static_cast<uint32_t>(ZAN_STATE_WRITING)) << "state is left as it is";
    const auto pages = DecodeWithLibtiff(dest.Written());
    ASSERT_EQ(pages.size(), 1u);
    EXPECT_EQ(pages[0].pixels, Bytes({1, 2, 3, 4, 5, 6, 7, 8, 1, 2, 3, 4, 5, 6, 7, 8}));
}

TEST(Teardown, ReaderBuffersAreReleased) {
    for (uint32_t palette : {0u, 1u}) {
        TestHost host;
        host->state = ZAN_STATE_READING;
        host->stripBuffer = static_cast<unsigned char*>(TestAllocator::Alloc(64));
        host->frameData = TestAllocator::Alloc(32);
        host->paletteExpansion = palette;
        zanDestroyTIFF(host.ctx());
        EXPECT_EQ(host->stripBuffer, nullptr);
        EXPECT_EQ(host->frameData == nullptr, palette != 0)
            << "the work line is released only when the reader expanded a palette";
        EXPECT_EQ(TestAllocator::LiveBlocks(), palette ? 0u : 1u);
    }
}

TEST(Teardown, MemorySourceIsNeverTakenForTheMemoryImage) {
    Bytes tiff = MakePages(1);
    TestHost host;
    host->sourceKind = ZAN_SOURCE_MEMORY;
    host->sourceMemory = tiff.data();
    host->sourceMemorySize = static_cast<uint32_t>(tiff.size());
    void* out = nullptr;
    host->destKind = ZAN_DEST_MEMORY;  // set for a pass-through delivery
    host->destMemory = &out;
    ASSERT_EQ(OpenTIFFForReading(host.ctx()), 1);
    host.EndJob();
    EXPECT_EQ(out, nullptr);
    EXPECT_EQ(tiff, MakePages(1)) << "the host's data are untouched";
}

TEST(Teardown, JobWithNothingOpenIsHarmless) {
    HandlerProbe probe;
    TestHost host;
    zanDestroyTIFF(host.ctx());
    zanDestroyTIFF(host.ctx());
    EXPECT_TRUE(HandlerProbe::InForce());
    zanDestroyTIFF(nullptr);
}

// ------------------------------------------------------- failing allocations

// Runs `job` with the nth allocation failing, for n = 1, 2, … until a run
// makes no more than n-1 allocations. Every run must end cleanly: handlers
// restored, every block of the job released, and a failure reported.
void SweepAllocationFailures(const std::function<bool(TestHost&)>& job) {
    for (int n = 1; n < 200; ++n) {
        HandlerProbe probe;
        bool succeeded = false;
        int calls = 0;
        {
            TestHost host;
            TestAllocator::Reset();
            TestAllocator::FailNthCall(n);
            succeeded = job(host);
            calls = TestAllocator::Calls();
            if (!succeeded) {
                EXPECT_FALSE(host.Errors().empty()) << "allocation " << n;
            }
            host.EndJob();
        }
        EXPECT_TRUE(HandlerProbe::InForce()) << "allocation " << n;
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << "allocation " << n;
        if (calls < n) {
            EXPECT_TRUE(succeeded) << "a run without a failed allocation must succeed";
            return;
        }
    }
    ADD_FAILURE() << "the job never got through";
}

TEST(FailingAllocations, EveryReadingJobEndsCleanly) {
    const Bytes tiff = MakeTiff(ThreePages());
    for (SourceKind kind : {SourceKind::File, SourceKind::Memory, SourceKind::Callbacks,
                            SourceKind::StreamBuffer}) {
        SCOPED_TRACE(static_cast<int>(kind));
        SweepAllocationFailures([&](TestHost& host) {
            SourceFixture source(host, kind, tiff);
            if (!OpenTIFFForReading(host.ctx())) return false;
            if (DecodeAll(host->tiff).size() == 3) return true;
            zanError(host.ctx(), "pages lost");  // a failure the job itself reports
            return false;
        });
    }
}

TEST(FailingAllocations, EveryWritingJobEndsCleanly) {
    for (DestKind kind : {DestKind::FileReopened, DestKind::Callbacks, DestKind::FixedBuffer,
                          DestKind::GrowingMemory}) {
        SCOPED_TRACE(static_cast<int>(kind));
        SweepAllocationFailures([&](TestHost& host) {
            DestinationFixture dest(host, kind);
            if (!OpenTIFFForWriting(host.ctx())) return false;
            const bool ok = WritePages(host->tiff, TwoPages());
            if (!ok) zanError(host.ctx(), "pages not written");
            host.EndJob();
            return ok && DecodeWithLibtiff(dest.Written()).size() == 2;
        });
    }
}

}  // namespace
