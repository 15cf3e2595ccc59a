// Opening codec objects on every kind of source and destination, teardown,
// and what a host sees when any of it fails.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <functional>
#include <string>

#include "frame/tiff_open.h"
#include "frame_support.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "support/allocation_sweep.h"
#include "support/host_destination.h"
#include "support/memory_stream.h"
#include "support/tiff_builder.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace {

using namespace zantest;
using zan::OpenTIFFForReading;
using zan::OpenTIFFForWriting;

// Three pages: grey, wider grey, LZW-compressed RGB.
FileLayout ThreePages() {
    FileLayout file;
    file.pages.assign(3, PageLayout{});
    file.pages[1].width = 24;
    file.pages[2].samplesPerPixel = 3;
    file.pages[2].photometric = PHOTOMETRIC_RGB;
    file.pages[2].compression = COMPRESSION_LZW;
    return file;
}

// Every page of the codec object from its current directory on, decoded.
std::vector<DecodedPage> DecodeAll(TIFF* tif) {
    std::vector<DecodedPage> pages;
    do {
        DecodedPage& page = pages.emplace_back();
        TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &page.width);
        TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &page.height);
        Bytes strip(static_cast<size_t>(TIFFStripSize(tif)));
        for (uint32_t s = 0; s < TIFFNumberOfStrips(tif); ++s) {
            const tmsize_t n = TIFFReadEncodedStrip(tif, s, strip.data(), -1);
            if (n < 0) return {};
            page.pixels.insert(page.pixels.end(), strip.begin(), strip.begin() + n);
        }
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

// Binds a TestHost's source to `bytes` in the chosen way (a file holds them
// after 5 bytes of something else), keeps what the source needs alive, and
// ends the job before letting go of it.
class SourceFixture {
public:
    SourceFixture(TestHost& host, SourceKind kind, const Bytes& bytes) : host_(host), bytes_(bytes) {
        if (kind == SourceKind::File) {
            Bytes padded(5 + bytes.size(), '!');
            std::copy(bytes.begin(), bytes.end(), padded.begin() + 5);
            WriteFileBytes(file_.path(), padded);
            host->sourceKind = ZAN_SOURCE_FILE;
            host->sourceFp = fp_ = std::fopen(file_.c_str(), "rb");
            host->sourceBaseOffset = 5;
        } else if (kind == SourceKind::Memory) {
            host->sourceKind = ZAN_SOURCE_MEMORY;
            host->sourceMemory = bytes_.data();
            host->sourceMemorySize = static_cast<uint32_t>(bytes_.size());
        } else {
            stream_.data = bytes;
            UseStreamSource(host.ctx(), &stream_, kind == SourceKind::Callbacks);
        }
    }
    ~SourceFixture() {
        host_.EndJob();
        if (fp_) std::fclose(fp_);
    }
    FILE* fp() const { return fp_; }
    MemoryStream& stream() { return stream_; }
    const Bytes& bytes() const { return bytes_; }

private:
    TestHost& host_;
    Bytes bytes_;
    TempFile file_;
    FILE* fp_ = nullptr;
    MemoryStream stream_;
};

// An open object (or a page already described) counts as open: the same
// object comes back, whatever the kind now says, without touching the
// source. An unknown kind fails without a message, and a job left with
// nothing open can be torn down twice. The codec's handlers come back.
TEST(OpenTIFF, OpenJobIsNotOpenedAgainAndUnknownKindsFailQuietly) {
    HandlerProbe probe;
    {
        TestHost reader;
        SourceFixture source(reader, SourceKind::Callbacks, MakePages(1));
        ASSERT_EQ(OpenTIFFForReading(reader.ctx()), 1);
        TIFF* const read = reader->tiff;
        const int reads = source.stream().reads;
        reader->sourceKind = 99;
        EXPECT_EQ(OpenTIFFForReading(reader.ctx()), 1);
        EXPECT_EQ(reader->tiff, read);
        EXPECT_EQ(source.stream().reads, reads);
    }
    EXPECT_TRUE(HandlerProbe::InForce());
    {
        TestHost writer;
        HostDestination dest(writer, DestKind::GrowingMemory);
        ASSERT_EQ(OpenTIFFForWriting(writer.ctx()), 1);
        TIFF* const written = writer->tiff;
        writer->destKind = 42;
        EXPECT_EQ(OpenTIFFForWriting(writer.ctx()), 1);
        EXPECT_EQ(writer->tiff, written);
        writer->destKind = ZAN_DEST_MEMORY;
    }
    TestHost host;
    host->state = ZAN_STATE_DESCRIBED;
    host->sourceKind = 99;
    EXPECT_EQ(OpenTIFFForReading(host.ctx()), 1);
    EXPECT_EQ(host->tiff, nullptr);
    host->state = 0;
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

// In append mode a second page lands behind the file the destination holds
// (a fixed buffer's file ends where its structure says, not where the buffer
// does). A callback destination that cannot read back fails at the second
// page with the reason, its first page still readable.
TEST(WritingOpen, SecondPageGoesBehindTheFirstOrFailsWithoutReadBack) {
    const std::pair<DestKind, bool> cases[] = {
        {DestKind::FileReopened, true}, {DestKind::Callbacks, true}, {DestKind::FixedBuffer, true},
        {DestKind::Callbacks, false}};
    for (const auto& [kind, append] : cases) {
        SCOPED_TRACE(std::string(kDestNames[static_cast<int>(kind)]) + (append ? " appending" : " no read-back"));
        TestHost host;
        HostDestination dest(host, kind);
        if (append) {
            dest.Preload(MakePages(1));
            host->appendPages = 1;
        } else {
            host->sourceReadProc = nullptr;
        }
        ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
        if (!append) { ASSERT_TRUE(WritePages(host->tiff, FileLayout{})); }
        FileLayout second;
        second.pages[0].width = 9;
        EXPECT_EQ(WritePages(host->tiff, second, 1), append);
        EXPECT_EQ(host.HasError("Destination cannot be read back: a source read function is needed to add a page"),
                  !append);
        host.EndJob();
        const auto pages = DecodeWithLibtiff(dest.Written());
        ASSERT_EQ(pages.size(), append ? 2u : 1u);
        EXPECT_EQ(pages[0].width, 16u);
        if (append) { EXPECT_EQ(pages[1].width, 9u); }
    }
}

// Each refused destination fails the open with its own host error, the
// codec's handlers back in force and nothing held: a growing image whose
// codec object cannot be created releases its block and the work buffer.
TEST(WritingOpen, DestinationThatCannotBeOpenedIsRefusedWithItsReason) {
    const struct {
        DestKind kind;
        const char* error;
        std::function<void(TestHost&)> spoil;
    } cases[] = {
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
        {DestKind::FixedBuffer, "The destination buffer holds no TIFF to add a page to.",
         [](TestHost& host) {
             // A file whose only directory names itself as the next one.
             Bytes looping = MakeTiff(FileLayout{});
             const uint32_t ifd = DirectoryOffsets(looping)[0];
             Put32(looping, ifd + 2 + 12 * Get16(looping, ifd), ifd);
             std::copy(looping.begin(), looping.end(), static_cast<uint8_t*>(host->destMemory));
             host->appendPages = 1;
         }},
        {DestKind::FileAsIs, "Memory allocation", [](TestHost&) { TestAllocator::FailNthCall(1); }},
        {DestKind::GrowingMemory, "Memory allocation", [](TestHost&) { TestAllocator::FailNthCall(1); }},
        {DestKind::GrowingMemory, "Unable to create TIFF object",
         [](TestHost& host) {
             pivloWorkBuffer(host.ctx(), 100);
             TestAllocator::FailNthCall(2);  // the block is had, the codec's own record is not
         }},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(kDestNames[static_cast<int>(c.kind)]);
        HandlerProbe probe;
        TestHost host;
        HostDestination dest(host, c.kind);
        c.spoil(host);
        EXPECT_EQ(OpenTIFFForWriting(host.ctx()), 0);
        EXPECT_EQ(host.Errors(), Texts{c.error});
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
        if (c.kind == DestKind::FileReopened) { EXPECT_EQ(host->destFp, nullptr); }
        EXPECT_TRUE(HandlerProbe::InForce());
    }
}

// A page too big for the buffer, or a buffer too small for the header: the
// open or the write fails with a report, and nothing lands past the capacity.
TEST(FixedBuffer, WritingPastTheCapacityFailsWithoutOverflow) {
    FileLayout big;
    big.pages[0].width = big.pages[0].height = 64;
    for (const auto& [capacity, file] : {std::pair{200u, big}, std::pair{4u, FileLayout{}}}) {
        SCOPED_TRACE(capacity);
        TestHost host;
        HostDestination dest(host, DestKind::FixedBuffer, capacity);
        if (OpenTIFFForWriting(host.ctx()) == 1) {
            EXPECT_FALSE(WritePages(host->tiff, file));
        } else {
            EXPECT_TRUE(host.HasError("Unable to create TIFF object"));
        }
        host.EndJob();
        EXPECT_FALSE(host.codecErrors.empty()) << "the codec reports the failed write";
        EXPECT_TRUE(dest.GuardIntact());
        EXPECT_LE(dest.size(), capacity);
    }
}

// Teardown writes out a page in progress (the state is left as it is) and
// hands the growing image over once; with no page written it is the 8-byte
// header the codec wrote at the open.
TEST(Teardown, GrowingImageIsHandedOverOnceWithThePageInProgress) {
    for (bool pageInProgress : {false, true}) {
        SCOPED_TRACE(pageInProgress);
        TestHost host;
        HostDestination dest(host, DestKind::GrowingMemory);
        ASSERT_EQ(OpenTIFFForWriting(host.ctx()), 1);
        const uint8_t row[8] = {1, 2, 3, 4, 5, 6, 7, 8};
        if (pageInProgress) {
            TIFF* tif = host->tiff;
            TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, 8);
            TIFFSetField(tif, TIFFTAG_IMAGELENGTH, 2);
            TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
            TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
            for (uint32_t y = 0; y < 2; ++y) TIFFWriteScanline(tif, const_cast<uint8_t*>(row), y, 0);
            host->state = ZAN_STATE_WRITING;
        }
        zanDestroyTIFF(host.ctx());
        EXPECT_EQ(host->state, pageInProgress ? static_cast<uint32_t>(ZAN_STATE_WRITING) : 0u);
        const Bytes written = dest.Written();
        if (pageInProgress) {
            const auto pages = DecodeWithLibtiff(written);
            ASSERT_EQ(pages.size(), 1u);
            EXPECT_EQ(pages[0].pixels, Bytes({1, 2, 3, 4, 5, 6, 7, 8, 1, 2, 3, 4, 5, 6, 7, 8}));
        } else {
            ASSERT_EQ(written.size(), 8u);
            EXPECT_EQ(written[0], written[1]) << "II or MM";
        }
        void* const handed = dest.block();
        dest.Forget();
        zanDestroyTIFF(host.ctx());
        EXPECT_EQ(dest.block(), nullptr) << "nothing is handed over again";
        TestAllocator::Free(handed);
    }
}

// A page left half read: its strip buffer, work line and palette copy go.
// A memory source is never taken for the memory image, even with a memory
// destination set for a pass-through delivery.
TEST(Teardown, ReaderBuffersAreReleasedAndTheMemorySourceIsLeftAlone) {
    FileLayout tiled, palette;
    tiled.pages[0].tileWidth = tiled.pages[0].tileHeight = 16;
    palette.pages[0].photometric = PHOTOMETRIC_PALETTE;
    for (int i = 0; i < 768; ++i) palette.pages[0].colorMap.push_back(static_cast<uint16_t>(i * 85));
    for (const FileLayout& file : {tiled, palette}) {
        TestHost host;
        SourceFixture source(host, SourceKind::Memory, MakeTiff(file));
        void* out = nullptr;
        host->destKind = ZAN_DEST_MEMORY;
        host->destMemory = &out;
        Bytes line(256);
        TestAllocator::Reset();
        ASSERT_NE(zanTIFFReadNextScanLine(host.ctx(), line.data(), static_cast<uint32_t>(line.size())), 0u);
        EXPECT_NE(host->stripBuffer != nullptr, host->paletteRed != nullptr) << "the page's own buffers";
        zanDestroyTIFF(host.ctx());
        EXPECT_EQ(host->stripBuffer, nullptr);
        EXPECT_EQ(host->paletteRed, nullptr);
        EXPECT_EQ(host->frameData, nullptr) << "the palette's work line";
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
        EXPECT_EQ(out, nullptr);
        EXPECT_EQ(source.bytes(), MakeTiff(file)) << "the host's data are untouched";
    }
}

// Runs `job` on a fresh host with each of its allocations failing in turn
// (FailEachAllocation): a failed run is reported and puts the codec's
// handlers back.
void SweepAllocationFailures(const std::function<bool(TestHost&)>& job) {
    FailEachAllocation([&](int n) {
        HandlerProbe probe;
        bool succeeded = false;
        {
            TestHost host;
            FailAllocation(n);
            succeeded = job(host);
            if (!succeeded) { EXPECT_FALSE(host.Errors().empty()); }
        }
        EXPECT_TRUE(HandlerProbe::InForce());
        return succeeded;
    });
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

// Every kind of destination ends up holding the same multi-page file. The
// host's size and image variables are cleared at the open; a growing image
// starts at half the frame buffer plus 60 bytes and is handed over from the
// job's allocator, the only block left.
TEST(WritingOpen, EveryDestinationHoldsTheSameFileWhateverAllocationFails) {
    const auto pages = DecodeWithLibtiff(MakeTiff(ThreePages()));
    Bytes reference;
    for (DestKind kind : kDests) {
        SCOPED_TRACE(kDestNames[static_cast<int>(kind)]);
        const bool growing = kind == DestKind::GrowingMemory;
        SweepAllocationFailures([&](TestHost& host) {
            HostDestination dest(host, kind);
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
