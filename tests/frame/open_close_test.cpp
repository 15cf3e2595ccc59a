// Opening codec objects on every kind of source and destination, teardown,
// and what a host sees when any of it fails.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <functional>
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
using Texts = std::vector<std::string>;

// Puts handlers of its own in force as the codec's process-wide ones for its
// lifetime; InForce() tells whether they are the codec's again.
struct HandlerProbe {
    static void Error(const char*, const char*, va_list) {}
    static void Warning(const char*, const char*, va_list) {}
    TIFFErrorHandler savedError = TIFFSetErrorHandler(Error);
    TIFFErrorHandler savedWarning = TIFFSetWarningHandler(Warning);
    ~HandlerProbe() {
        TIFFSetErrorHandler(savedError);
        TIFFSetWarningHandler(savedWarning);
    }
    static bool InForce() {  // and leaves the handlers in force as they are
        const TIFFErrorHandler error = TIFFSetErrorHandler(nullptr);
        const TIFFErrorHandler warning = TIFFSetWarningHandler(nullptr);
        TIFFSetErrorHandler(error);
        TIFFSetWarningHandler(warning);
        return error == Error && warning == Warning;
    }
};

// Three pages: grey, wider grey, LZW-compressed RGB.
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
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](const auto& x, const auto& y) {
        return x.width == y.width && x.height == y.height && x.pixels == y.pixels;
    });
}

enum class SourceKind { File, Memory, Callbacks, StreamBuffer };
constexpr SourceKind kSources[] = {SourceKind::File, SourceKind::Memory, SourceKind::Callbacks,
                                   SourceKind::StreamBuffer};
const char* const kSourceNames[] = {"File", "Memory", "Callbacks", "StreamBuffer"};

// Binds a TestHost's source to `bytes` in the chosen way, keeps what the
// source needs alive, and ends the job before letting go of it.
class SourceFixture {
public:
    SourceFixture(TestHost& host, SourceKind kind, const Bytes& bytes) : host_(host), bytes_(bytes) {
        ConversionContext* ctx = host.ctx();
        switch (kind) {
        case SourceKind::File: {
            // The TIFF sits after 5 bytes of something else in the file.
            Bytes padded(5 + bytes.size(), '!');
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
        host_.EndJob();
        if (fp_) std::fclose(fp_);
    }
    FILE* fp() const { return fp_; }
    MemoryStream& stream() { return stream_; }

private:
    TestHost& host_;
    Bytes bytes_;
    TempFile file_;
    FILE* fp_ = nullptr;
    MemoryStream stream_;
};

enum class DestKind { FileReopened, FileAsIs, Callbacks, FixedBuffer, GrowingMemory };
constexpr DestKind kDests[] = {DestKind::FileReopened, DestKind::FileAsIs, DestKind::Callbacks,
                               DestKind::FixedBuffer, DestKind::GrowingMemory};
const char* const kDestNames[] = {"FileReopened", "FileAsIs", "Callbacks", "FixedBuffer",
                                  "GrowingMemory"};

// A destination of the chosen kind for a TestHost, and the bytes it holds
// once the job has ended (which its destructor makes sure of). A fixed
// buffer is followed by guard bytes.
class DestinationFixture {
public:
    DestinationFixture(TestHost& host, DestKind kind, uint32_t fixedCapacity = 1 << 20)
        : host_(host), kind_(kind), fixed_(fixedCapacity + kGuard, kGuardByte) {
        ConversionContext* ctx = host.ctx();
        switch (kind) {
        case DestKind::FileReopened:
        case DestKind::FileAsIs:
            WriteFileBytes(file_.path(), {});
            ctx->destKind = ZAN_DEST_FILE;
            ctx->destPath = file_.c_str();
            // Read-only when reopened: writing works only through the module's own stream.
            ctx->destFp = std::fopen(file_.c_str(), kind == DestKind::FileAsIs ? "w+b" : "rb");
            if (kind == DestKind::FileAsIs) ctx->destFileFlags = ZAN_DEST_FILE_USE_AS_IS;
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
        host_.EndJob();
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
            if (!block_ || block_ == kUnset) return {};
            return Bytes(static_cast<uint8_t*>(block_), static_cast<uint8_t*>(block_) + size_);
        }
        return {};
    }
    bool GuardIntact() const {
        return std::all_of(fixed_.end() - kGuard, fixed_.end(), [](uint8_t b) { return b == kGuardByte; });
    }
    MemoryStream& stream() { return stream_; }
    // Puts `bytes` at the start of the fixed buffer, as a file already there.
    void Preload(const Bytes& bytes) { std::copy(bytes.begin(), bytes.end(), fixed_.begin()); }
    void* block() const { return block_; }
    void Forget() { block_ = nullptr; }
    uint32_t size() const { return size_; }
    const TempFile& file() const { return file_; }

private:
    static constexpr size_t kGuard = 16;
    static constexpr uint8_t kGuardByte = 0xAB;
    inline static char unsetMark_ = 0;
    inline static void* const kUnset = &unsetMark_;  // the open must overwrite it
    TestHost& host_;
    DestKind kind_;
    TempFile file_;
    MemoryStream stream_;
    Bytes fixed_;
    void* block_ = kUnset;
    uint32_t size_ = 0xDEAD;
};

// An open object (or a page already described) counts as open: the same
// object comes back, whatever the kind now says, without touching the source
// or saving the handlers anew (the codec's come back at teardown).
TEST(OpenTIFF, OpenJobIsNotOpenedAgain) {
    HandlerProbe probe;
    TestHost reader;
    SourceFixture source(reader, SourceKind::Callbacks, MakePages(1));
    ASSERT_EQ(OpenTIFFForReading(reader.ctx()), 1);
    TIFF* const read = reader->tiff;
    const int reads = source.stream().reads;
    reader->sourceKind = 99;
    EXPECT_EQ(OpenTIFFForReading(reader.ctx()), 1);
    EXPECT_EQ(reader->tiff, read);
    EXPECT_EQ(source.stream().reads, reads);
    reader.EndJob();
    EXPECT_TRUE(HandlerProbe::InForce());

    TestHost described;
    described->state = ZAN_STATE_DESCRIBED;
    described->sourceKind = 99;
    EXPECT_EQ(OpenTIFFForReading(described.ctx()), 1);
    EXPECT_EQ(described->tiff, nullptr);

    TestHost writer;
    DestinationFixture dest(writer, DestKind::GrowingMemory);
    ASSERT_EQ(OpenTIFFForWriting(writer.ctx()), 1);
    TIFF* const written = writer->tiff;
    writer->destKind = 42;
    EXPECT_EQ(OpenTIFFForWriting(writer.ctx()), 1);
    EXPECT_EQ(writer->tiff, written);
    writer->destKind = ZAN_DEST_MEMORY;
}

// A job left with nothing open can also be torn down twice.
TEST(OpenTIFF, UnknownSourceOrDestinationKindFailsWithoutAMessage) {
    HandlerProbe probe;
    TestHost host;
    for (uint32_t kind : {0u, 3u, 5u}) {
        host->sourceKind = kind;
        EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
    }
    for (uint32_t kind : {0u, 5u, 17u}) {
        host->destKind = kind;
        EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
    }
    zanDestroyTIFF(host.ctx());
    zanDestroyTIFF(host.ctx());
    zanDestroyTIFF(nullptr);
    EXPECT_TRUE(host.messages.empty());
    EXPECT_TRUE(HandlerProbe::InForce());
}

// Whatever keeps a source from being opened, the host gets one error saying
// what failed, the codec's handlers are back and nothing is held. The codec
// says why it refused the bytes; the stream buffer service says why it could
// not start, in the message style the job chose.
TEST(ReadingOpen, SourceThatCannotBeOpenedIsRefusedAndNothingIsHeld) {
    enum Fault { NotATiff, ReadsFail, NoData, NoMemory, NoMemorySecondStyle };
    const std::pair<SourceKind, Fault> cases[] = {
        {SourceKind::File, NotATiff},       {SourceKind::Memory, NotATiff},
        {SourceKind::Callbacks, NotATiff},  {SourceKind::StreamBuffer, NotATiff},
        {SourceKind::Callbacks, ReadsFail}, {SourceKind::StreamBuffer, ReadsFail},
        {SourceKind::Memory, NoData},       {SourceKind::File, NoMemory},
        {SourceKind::StreamBuffer, NoMemory}, {SourceKind::StreamBuffer, NoMemorySecondStyle}};
    for (const auto& [kind, fault] : cases) {
        SCOPED_TRACE(std::string(kSourceNames[static_cast<int>(kind)]) + " fault " + std::to_string(fault));
        const bool noMemory = fault == NoMemory || fault == NoMemorySecondStyle;
        HandlerProbe probe;
        TestHost host;
        if (fault == NoMemorySecondStyle) {
            host.UseExSinks();
            host->errorProc = nullptr;
        }
        SourceFixture source(host, kind, fault == NotATiff ? Bytes{'n', 'o', 't', ' ', 't', 'i', 'f', 'f'}
                                                           : MakePages(1));
        source.stream().failReads = fault == ReadsFail;
        if (fault == NoData) {
            host->sourceMemory = nullptr;
            host->sourceMemorySize = 4096;
        }
        if (noMemory) TestAllocator::FailNthCall(1);
        EXPECT_EQ(OpenTIFFForReading(host.ctx()), 0);
        const char* error = !noMemory                   ? "Unable to create a tiff object"
                            : kind == SourceKind::File ? "Memory allocation"
                                                        : "Initializing stream buffer";
        EXPECT_EQ(host.Errors(), Texts{error});
        if (!noMemory) {
            EXPECT_FALSE(host.codecErrors.empty()) << "the codec says why";
        } else if (kind == SourceKind::StreamBuffer) {
            ASSERT_EQ(host.codecErrors.size(), 1u);
            EXPECT_EQ(host.codecErrors[0].code, PIVLO_STREAM_MESSAGE_CODE);
        }
        EXPECT_TRUE(HandlerProbe::InForce());
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
    }
}

// ---------------------------------------------------------------- writing

TEST(WritingOpen, AppendModeAddsPagesToAnExistingFile) {
    // A fixed buffer's file ends where its structure says, not where the
    // buffer does.
    for (DestKind kind : {DestKind::FileReopened, DestKind::Callbacks, DestKind::FixedBuffer}) {
        SCOPED_TRACE(kDestNames[static_cast<int>(kind)]);
        TestHost host;
        DestinationFixture dest(host, kind);
        const Bytes first = MakePages(1);
        if (kind == DestKind::Callbacks) dest.stream().data = first;
        else if (kind == DestKind::FixedBuffer) dest.Preload(first);
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
    EXPECT_TRUE(WritePages(host->tiff, FileSpec{}, 0));
    EXPECT_FALSE(WritePages(host->tiff, FileSpec{}, 1));
    EXPECT_TRUE(host.HasError(
        "Destination cannot be read back: a source read function is needed to add a page"));
    host.EndJob();
    EXPECT_GE(DecodeWithLibtiff(dest.Written()).size(), 1u) << "the first page stays readable";
}

// Each refused destination fails the open with its own host error, the
// codec's handlers back in force and nothing held: a growing image whose
// codec object cannot be created releases its block and the work buffer.
TEST(WritingOpen, DestinationThatCannotBeOpenedIsRefusedWithItsReason) {
    struct Case {
        DestKind kind;
        const char* error;
        std::function<void(TestHost&)> spoil;
    };
    const Case cases[] = {
        {DestKind::FileReopened, "Unable to reopen destination file.",
         [](TestHost& host) {
             std::fclose(host->destFp);
             host->destFp = nullptr;
             host->destPath = "/nonexistent-dir/zantiff/out.tif";
         }},
        {DestKind::Callbacks, "Destination function is supported only when seek function is provided",
         [](TestHost& host) { host->destSeekProc = nullptr; }},
        {DestKind::FixedBuffer, "The destination buffer holds no TIFF to add a page to.",
         [](TestHost& host) { host->appendPages = 1; }},
        {DestKind::FileAsIs, "Memory allocation", [](TestHost&) { TestAllocator::FailNthCall(1); }},
        {DestKind::GrowingMemory, "Memory allocation", [](TestHost&) { TestAllocator::FailNthCall(1); }},
        {DestKind::GrowingMemory, "Unable to create TIFF object",
         [](TestHost& host) {
             pivloWorkBuffer(host.ctx(), 100);
             TestAllocator::FailNthCall(2);  // the block is had, the codec's own record is not
         }},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(kDestNames[static_cast<int>(c.kind)]);
        HandlerProbe probe;
        TestHost host;
        DestinationFixture dest(host, c.kind);
        c.spoil(host);
        EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
        EXPECT_EQ(host.Errors(), Texts{c.error});
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
        if (c.kind == DestKind::FileReopened) { EXPECT_EQ(host->destFp, nullptr); }
        EXPECT_TRUE(HandlerProbe::InForce());
    }
}

// With no page written the image is the 8-byte header the codec wrote at the
// open; a second teardown hands nothing over again.
TEST(GrowingMemory, EmptyImageIsHandedOverOnceAsTheHeaderAlone) {
    TestHost host;
    DestinationFixture dest(host, DestKind::GrowingMemory);
    ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
    zanDestroyTIFF(host.ctx());
    EXPECT_EQ(dest.size(), 8u);
    ASSERT_NE(dest.block(), nullptr);
    EXPECT_EQ(dest.Written()[0], dest.Written()[1]) << "II or MM";
    void* const handed = dest.block();
    dest.Forget();
    zanDestroyTIFF(host.ctx());
    EXPECT_EQ(dest.block(), nullptr);
    TestAllocator::Free(handed);
}

// A page too big for the buffer, or a buffer too small for the header: the
// open or the write fails with a report, and nothing lands past the capacity.
TEST(FixedBuffer, WritingPastTheCapacityFailsWithoutOverflow) {
    FileSpec big;
    big.pages[0].width = big.pages[0].height = 64;
    for (const auto& [capacity, spec] : {std::pair{200u, big}, std::pair{4u, FileSpec{}}}) {
        SCOPED_TRACE(capacity);
        TestHost host;
        DestinationFixture dest(host, DestKind::FixedBuffer, capacity);
        if (OpenTIFFForWriting(host.ctx()) == 1) {
            EXPECT_FALSE(WritePages(host->tiff, spec));
        } else {
            EXPECT_TRUE(host.HasError("Unable to create TIFF object"));
        }
        host.EndJob();
        EXPECT_FALSE(host.codecErrors.empty()) << "the codec reports the failed write";
        EXPECT_TRUE(dest.GuardIntact());
        EXPECT_LE(dest.size(), capacity);
    }
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

// A page left half read: its strip buffer, work line and palette copy go.
TEST(Teardown, ReaderBuffersAreReleased) {
    FileSpec tiled;
    tiled.pages[0].tileWidth = tiled.pages[0].tileHeight = 16;
    FileSpec palette;
    palette.pages[0].photometric = PHOTOMETRIC_PALETTE;
    for (int i = 0; i < 768; ++i) palette.pages[0].colorMap.push_back(static_cast<uint16_t>(i * 85));
    for (const FileSpec& spec : {tiled, palette}) {
        const Bytes tiff = MakeTiff(spec);
        TestHost host;
        host->sourceKind = ZAN_SOURCE_MEMORY;
        host->sourceMemory = tiff.data();
        host->sourceMemorySize = static_cast<uint32_t>(tiff.size());
        Bytes line(256);
        TestAllocator::Reset();
        ASSERT_NE(zanTIFFReadNextScanLine(host.ctx(), line.data(), static_cast<uint32_t>(line.size())), 0u);
        EXPECT_NE(host->stripBuffer != nullptr, host->paletteRed != nullptr) << "the page's own buffers";
        zanDestroyTIFF(host.ctx());
        EXPECT_EQ(host->stripBuffer, nullptr);
        EXPECT_EQ(host->paletteRed, nullptr);
        EXPECT_EQ(host->frameData, nullptr) << "the palette's work line";
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
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

// ------------------------------------------- every kind, whatever fails

// Runs `job` with the nth allocation failing, for n = 1, 2, … until a run
// makes no more than n-1 allocations, which must succeed. Every run must end
// cleanly: a failure reported, the codec's handlers back, every block of the
// job released.
void SweepAllocationFailures(const std::function<bool(TestHost&)>& job) {
    for (int n = 1; n < 200; ++n) {
        SCOPED_TRACE("allocation " + std::to_string(n));
        HandlerProbe probe;
        bool succeeded = false;
        {
            TestHost host;
            TestAllocator::Reset();
            TestAllocator::FailNthCall(n);
            succeeded = job(host);
            if (!succeeded) { EXPECT_FALSE(host.Errors().empty()); }
        }
        EXPECT_TRUE(HandlerProbe::InForce());
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
        if (TestAllocator::Calls() < n) {
            TestAllocator::Reset();
            EXPECT_TRUE(succeeded) << "a run without a failed allocation must succeed";
            return;
        }
    }
    ADD_FAILURE() << "the job never got through";
}

// Every kind of source delivers every page as libtiff decodes it, with the
// job's handlers in force while open and a file source still open for its
// owner afterwards; a trickling source behind the stream buffer is read once.
TEST(ReadingOpen, EverySourceKindReadsEveryPageWhateverAllocationFails) {
    const Bytes tiff = MakeTiff(ThreePages());
    const auto pages = DecodeWithLibtiff(tiff);
    for (SourceKind kind : kSources) {
        SCOPED_TRACE(kSourceNames[static_cast<int>(kind)]);
        SweepAllocationFailures([&](TestHost& host) {
            SourceFixture source(host, kind, tiff);
            if (kind == SourceKind::StreamBuffer) source.stream().maxChunk = 7;
            if (!OpenTIFFForReading(host.ctx())) return false;
            EXPECT_FALSE(HandlerProbe::InForce());
            if (!SamePages(DecodeAll(host->tiff), pages)) {
                zanError(host.ctx(), "pages lost");  // a failure the job itself reports
                return false;
            }
            host.EndJob();
            EXPECT_EQ(host->tiff, nullptr);
            if (source.fp()) { EXPECT_EQ(std::fseek(source.fp(), 0, SEEK_SET), 0) << "the file stays open"; }
            if (kind == SourceKind::StreamBuffer) { EXPECT_LE(source.stream().bytesRead, tiff.size()); }
            return host.Errors().empty();
        });
    }
}

// Every kind of destination ends up holding the same multi-page file (a file
// handed in read-only is reopened from its path). The host's size and image
// variables are cleared at the open; a growing image starts at half the frame
// buffer plus 60 bytes and is handed over from the job's allocator, the only
// block left.
TEST(WritingOpen, EveryDestinationHoldsTheSameFileWhateverAllocationFails) {
    const auto pages = DecodeWithLibtiff(MakeTiff(ThreePages()));
    Bytes reference;
    for (DestKind kind : kDests) {
        SCOPED_TRACE(kDestNames[static_cast<int>(kind)]);
        const bool growing = kind == DestKind::GrowingMemory;
        SweepAllocationFailures([&](TestHost& host) {
            DestinationFixture dest(host, kind);
            host->frameBufferSize = 1001;
            if (!OpenTIFFForWriting(host.ctx())) return false;
            if (kind == DestKind::FixedBuffer || growing) { EXPECT_EQ(dest.size(), 0u); }
            if (growing) {
                EXPECT_EQ(dest.block(), nullptr);
                EXPECT_EQ(host->memCapacity, 500u + 60u);
            }
            const bool ok = WritePages(host->tiff, ThreePages());
            if (!ok) zanError(host.ctx(), "pages not written");
            host.EndJob();
            if (!ok || !host.Errors().empty()) return false;
            const Bytes written = dest.Written();
            if (reference.empty()) reference = written;
            EXPECT_EQ(written, reference) << "the same bytes, size included, on every destination";
            EXPECT_TRUE(SamePages(DecodeWithLibtiff(written), pages));
            EXPECT_EQ(TestAllocator::LiveBlocks(), growing ? 1u : 0u);
            if (growing) {
                EXPECT_TRUE(TestAllocator::Owns(dest.block()));
                EXPECT_EQ(host->memBase, nullptr) << "the module no longer holds the image";
            }
            return true;
        });
    }
}

}  // namespace
