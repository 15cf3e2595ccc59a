// Compressed pages handed on without decoding: raw Group 4 and JPEG strips,
// and JPEG strips joined into one stream that decodes to exactly the
// page's pixels; soft refusals fall back to decoding.

#include "read_support.h"

namespace {

using namespace zantest;

enum class Out { Memory, File, DummyFile, Callbacks, FixedBuffer };
constexpr Out kOuts[] = {Out::Memory, Out::File, Out::DummyFile, Out::Callbacks, Out::FixedBuffer};

// A pass-through job: the page in memory, delivered to `out`. A file
// destination already holds three bytes; "dummyfile" names a stream that is
// written where it stands.
struct PassJob {
    PassJob(const Bytes& tiff, uint32_t destFormat, Out out) : job(tiff), out(out) {
        job->destFormat = destFormat;
        job->destSizeOut = &size;
        switch (out) {
        case Out::Memory:
            job->destKind = ZAN_DEST_MEMORY;
            job->destMemory = &block;
            break;
        case Out::File:
        case Out::DummyFile:
            WriteFileBytes(file.path(), Bytes{'o', 'l', 'd'});
            job->destKind = ZAN_DEST_FILE;
            job->destFp = std::fopen(file.c_str(), "r+b");
            job->destPath = out == Out::DummyFile ? "dummyfile" : file.c_str();
            std::fseek(job->destFp, 0, SEEK_END);
            break;
        case Out::Callbacks:
            job->destKind = ZAN_DEST_CALLBACKS;
            job->destWriteProc = MemoryStream::Write;
            job->destSeekProc = MemoryStream::Seek;
            job->destUserData = &stream;
            break;
        case Out::FixedBuffer:
            job->destKind = ZAN_DEST_FIXED_BUFFER;
            job->destMemory = fixed.data();
            job->destMemoryCapacity = static_cast<uint32_t>(fixed.size());
            break;
        }
    }
    ~PassJob() {
        if (job->destFp) std::fclose(job->destFp);
        job->destFp = nullptr;
        TestAllocator::Free(block);
    }

    int Run() { return zanTIFFToFrameBuffer(job.host().ctx(), &direct); }

    // What the destination received (the earlier bytes of a kept stream left out).
    Bytes Delivered() {
        if (job->destFp) std::fflush(job->destFp);
        const Bytes written = out == Out::File || out == Out::DummyFile ? ReadFileBytes(file.path()) : Bytes();
        const auto* memory = static_cast<const uint8_t*>(block);
        switch (out) {
        case Out::Memory: return memory ? Bytes(memory, memory + size) : Bytes();
        case Out::File: return written;
        case Out::DummyFile: return Bytes(written.begin() + 3, written.end());
        case Out::Callbacks: return stream.data;
        case Out::FixedBuffer: return Bytes(fixed.begin(), fixed.begin() + size);
        }
        return {};
    }

    bool Traced(const std::string& text) {
        const auto& all = job.host().messages;
        return std::any_of(all.begin(), all.end(), [&](const Message& m) {
            return m.severity == 2 && m.level == 1 && m.text == text;
        });
    }

    ReadJob job;
    const Out out;
    TempFile file;
    MemoryStream stream;
    Bytes fixed = Bytes(1 << 16, 0xEE);
    void* block = nullptr;
    uint32_t size = 0, direct = 0;
};

TEST(RawStrips, OneStripPagesArriveAsStoredOnEveryDestination) {
    // The strip's bytes (bit-reversed for FillOrder 2), nothing decoded, and
    // the trace of the pass-through.
    auto reversed = [](Bytes b) {
        TIFFReverseBits(b.data(), static_cast<tmsize_t>(b.size()));
        return b;
    };
    const Bytes g4 = G4Page(45, 20), g4Fill2 = G4Page(45, 20, PHOTOMETRIC_MINISWHITE, 0, 0, FILLORDER_LSB2MSB);
    const Bytes jpeg = MakeJpegTiff({.rowsPerStrip = 48, .components = 1, .tables = false});
    const struct Case {
        const char* what;
        Bytes tiff;
        uint32_t destFormat, format, width;
        Bytes want;
    } cases[] = {
        {"Group 4", g4, ZAN_DEST_FORMAT_G4, 1, 45, RawChunk(g4)},
        {"Group 4, FillOrder 2: bits reversed", g4Fill2, ZAN_DEST_FORMAT_G4, 1, 45, reversed(RawChunk(g4Fill2))},
        {"grey JPEG stream", jpeg, ZAN_DEST_FORMAT_JPEG, 2, 64, RawChunk(jpeg)},
    };
    for (const Case& c : cases)
        for (Out out : kOuts) {
            SCOPED_TRACE(::testing::Message() << c.what << ", destination " << static_cast<int>(out));
            PassJob pass(c.tiff, c.destFormat, out);
            ASSERT_EQ(pass.Run(), 1) << ::testing::PrintToString(pass.job.host().Errors());
            EXPECT_EQ(pass.direct, 1u);
            EXPECT_EQ(pass.job->outputFormat, c.format);
            EXPECT_EQ(pass.job->outputWidth, c.width);
            EXPECT_EQ(pass.job->frameData, nullptr);
            EXPECT_EQ(pass.Delivered(), c.want);
            EXPECT_TRUE(pass.Traced("Converted w/o decompression; single strip."));
            EXPECT_EQ(pass.job->tiff, nullptr);
        }
}

// The joined stream of `tiff` decodes exactly as its strips do one by one
// (a page the join declines is decoded, when that is allowed).
void ExpectLosslessJoin(const Bytes& tiff, const std::string& what, bool mayDecline = false) {
    SCOPED_TRACE(what);
    PassJob pass(tiff, ZAN_DEST_FORMAT_JPEG, Out::Memory);
    ASSERT_EQ(pass.Run(), 1) << ::testing::PrintToString(pass.job.host().Errors());
    if (mayDecline && pass.direct == 0) return;
    ASSERT_EQ(pass.direct, 1u) << pass.job.host().messages.back().text;
    const DecodedJpeg joined = DecodeJpeg(pass.Delivered()), strips = DecodeJpegStrips(tiff);
    ASSERT_FALSE(joined.pixels.empty());
    EXPECT_EQ(joined.width, strips.width);
    EXPECT_EQ(joined.height, strips.height);
    EXPECT_TRUE(joined.pixels == strips.pixels);
    EXPECT_EQ(pass.job->outputHeight, strips.height);
    EXPECT_EQ(pass.job->outputFormat, joined.components == 1 ? 2u : 8u);
}

TEST(JpegJoin, JoinedStreamsDecodeToThePagesPixels) {
    // Every sampling layout, with and without restart intervals, RGB pages
    // and the multi-strip JPEG pages of the corpus.
    const struct Layout {
        const char* what;
        int components, h, v;
        uint32_t rowsPerStrip;
    } layouts[] = {{"4:2:0", 3, 2, 2, 16}, {"4:2:2", 3, 2, 1, 8}, {"1x2", 3, 1, 2, 16},
                   {"4:4:4", 3, 1, 1, 8},  {"grey", 1, 1, 1, 8},  {"4:2:0, one strip", 3, 2, 2, 48}};
    for (const Layout& l : layouts)
        for (int restart : {0, 2}) {
            // 72 pixels are not a whole number of 16-pixel MCUs; the restart
            // interval divides every strip's MCUs.
            const int interval = restart ? (72 + 8 * l.h - 1) / (8 * l.h) : 0;
            ExpectLosslessJoin(MakeJpegTiff({.width = 72, .rowsPerStrip = l.rowsPerStrip, .components = l.components,
                                             .h = l.h, .v = l.v, .restartInterval = interval}),
                               std::string(l.what) + (restart ? ", restarts" : ""));
        }
    ExpectLosslessJoin(MakeJpegTiff({.h = 1, .v = 1, .rgb = true}), "RGB, with its Adobe segment");
    for (const CorpusFile& file : CorpusFiles())
        if (file.status != "bad" && file.HasCategory("jpeg-multistrip") && !file.HasCategory("tiled"))
            ExpectLosslessJoin(ReadFileBytes(file.path), file.relpath, true);
}

// Replaces the first occurrence of `from` in the strips' bytes (they lie
// before the directory) with `to`.
Bytes Patched(Bytes tiff, const Bytes& from, const Bytes& to) {
    auto at = std::search(tiff.begin() + 8, tiff.end(), from.begin(), from.end());
    if (at != tiff.end()) std::copy(to.begin(), to.end(), at);
    return tiff;
}

TEST(PassThrough, PagesThatCannotPassAreDecodedWithTheReasonTraced) {
    // Nothing handed over, the reason traced, and the page decoded instead
    // (or, for a frame header without components, refused).
    const Bytes plain = MakeJpegTiff({});
    const Bytes noEnd = Patched(plain, Bytes{0xFF, 0xD9}, Bytes{0xFF, 0x00});
    const Bytes otherRestarts = Patched(MakeJpegTiff({.restartInterval = 2}), Bytes{0xFF, 0xDD, 0x00, 0x04, 0x00, 0x02},
                                        Bytes{0xFF, 0xDD, 0x00, 0x04, 0x00, 0x04});
    const Bytes noComponents = Patched(plain, Bytes{0xFF, 0xC0, 0x00, 0x11, 0x08},
                                       Bytes{0xFF, 0xC0, 0x00, 0x11, 0x08, 0x00, 0x30, 0x00, 0x40, 0x00});
    const struct Case {
        const char* what;
        Bytes tiff;
        uint32_t destFormat;
        std::string trace;
        bool decodes = true;
    } cases[] = {
        {"min-is-black Group 4", G4Page(45, 20, PHOTOMETRIC_MINISBLACK), ZAN_DEST_FORMAT_G4,
         "No direct conversion: the Group 4 page is not min-is-white."},
        {"Group 4 of several strips", G4Page(45, 20, PHOTOMETRIC_MINISWHITE, 10), ZAN_DEST_FORMAT_G4,
         "No direct conversion: the Group 4 page has several strips or tiles."},
        {"JPEG asked for as Group 4", plain, ZAN_DEST_FORMAT_G4, ""},
        {"no tables", MakeJpegTiff({.tables = false}), ZAN_DEST_FORMAT_JPEG,
         "Conversion without decompression failed: no jpeg table or no SOI at start."},
        {"strips that carry their own tables", MakeJpegTiff({.wholeStrips = true}), ZAN_DEST_FORMAT_JPEG,
         "Conversion w/o decompression failed : unexpected jpeg marker."},
        {"strips of half a 16-row MCU", MakeJpegTiff({.rowsPerStrip = 8}), ZAN_DEST_FORMAT_JPEG,
         "Conversion w/o decompression failed: strip height not multiple of mcu height."},
        {"a strip without its end", noEnd, ZAN_DEST_FORMAT_JPEG,
         "Conversion w/o decompression failed: missing expected end jpeg marker."},
        {"restart intervals that differ", otherRestarts, ZAN_DEST_FORMAT_JPEG,
         "Conversion w/o decompression failed: inconsistent DRI's."},
        {"a frame without components", noComponents, ZAN_DEST_FORMAT_JPEG,
         "Conversion w/o decompression failed: invalid SOF.", false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        PassJob pass(c.tiff, c.destFormat, Out::Memory);
        EXPECT_EQ(pass.Run(), c.decodes ? 1 : 0) << ::testing::PrintToString(pass.job.host().Errors());
        EXPECT_EQ(pass.direct, 0u);
        EXPECT_TRUE(c.trace.empty() || pass.Traced(c.trace));
        EXPECT_EQ(pass.Delivered(), Bytes());
        EXPECT_EQ(pass.job->frameData != nullptr, c.decodes);
    }
}

TEST(JpegJoin, FailuresOfMemoryAndFilesAreReported) {
    // Any failed allocation ends the call with a message and no block left;
    // a destination file that cannot be opened is reported.
    const Bytes tiff = MakeJpegTiff({});
    FailEachAllocation([&](int n) {
        PassJob pass(tiff, ZAN_DEST_FORMAT_JPEG, Out::Memory);
        FailAllocation(n);
        const int result = pass.Run();
        if (!result) {
            EXPECT_TRUE(pass.job.Reported());
        }
        return result == 1 && pass.direct == 1;
    });
    PassJob unopenable(tiff, ZAN_DEST_FORMAT_JPEG, Out::File);
    unopenable.job->destPath = "/nonexistent-dir/zantiff/out.jpg";
    EXPECT_EQ(unopenable.Run(), 0);
    EXPECT_EQ(unopenable.job.host().Errors(), std::vector<std::string>{"File access error."});
}

// `stream` wrapped into a one-page TIFF in memory by the module: a JPEG
// from memory, or a Group 4 stream of `width` x `height` min-is-white pixels
// read from a file where it starts at byte 100.
Bytes Wrapped(const Bytes& stream, bool jpeg, uint32_t width = 0, uint32_t height = 0) {
    Bytes padded(100 + stream.size(), 0xFF);
    std::copy(stream.begin(), stream.end(), padded.begin() + 100);
    ReadJob job(jpeg ? stream : padded, jpeg ? Source::Memory : Source::File);
    if (!jpeg) std::fseek(job->sourceFp, 100, SEEK_SET);
    void* block = nullptr;
    uint32_t size = 0, direct = 1;
    job->destKind = ZAN_DEST_MEMORY;
    job->destMemory = &block;
    job->destSizeOut = &size;
    job->imageWidth = width;
    job->imageHeight = height;
    job->whiteIsZero = 1;
    EXPECT_EQ(jpeg ? zanJPEGToTIFF(job.host().ctx(), &direct) : zanG4ToTIFF(job.host().ctx()), 1)
        << ::testing::PrintToString(job.host().Errors());
    EXPECT_EQ(direct, 1u);
    job.host().EndJob();
    Bytes tiff = block ? Bytes(static_cast<uint8_t*>(block), static_cast<uint8_t*>(block) + size) : Bytes();
    TestAllocator::Free(block);
    return tiff;
}

// What the pass-through delivers for the page, or empty when it declines.
Bytes PassedThrough(const Bytes& tiff, uint32_t destFormat) {
    PassJob pass(tiff, destFormat, Out::Memory);
    return pass.Run() == 1 && pass.direct == 1 ? pass.Delivered() : Bytes();
}

TEST(RoundTrips, StreamsTakenFromPagesAndWrappedAgainComeBackUnchanged) {
    // JPEG pages of every colour kind, and the corpus's one-strip Group 4
    // pages, whose wrapped stream also decodes to the page's pixels.
    for (const JpegPageLayout& layout : {JpegPageLayout{}, JpegPageLayout{.h = 1, .v = 1, .rgb = true},
                                     JpegPageLayout{.components = 1, .h = 1, .v = 1}}) {
        SCOPED_TRACE(::testing::Message() << layout.components << layout.rgb);
        const Bytes stream = PassedThrough(MakeJpegTiff(layout), ZAN_DEST_FORMAT_JPEG);
        ASSERT_FALSE(stream.empty());
        EXPECT_EQ(PassedThrough(Wrapped(stream, true), ZAN_DEST_FORMAT_JPEG), stream);
    }
    int pages = 0;
    for (const CorpusFile& file : CorpusFiles()) {
        if (file.status != "ok" || file.description.find("MinIsWhite; CCITT-G4; 1 strip(s)") == std::string::npos)
            continue;
        SCOPED_TRACE(file.relpath);
        const Bytes page = ReadFileBytes(file.path);
        const Bytes stream = PassedThrough(page, ZAN_DEST_FORMAT_G4);
        ASSERT_FALSE(stream.empty());
        const DecodedPage source = DecodeWithLibtiff(page).at(0);
        const Bytes wrapped = Wrapped(stream, false, source.width, source.height);
        EXPECT_EQ(DecodeWithLibtiff(wrapped).at(0).pixels, source.pixels);
        EXPECT_EQ(PassedThrough(wrapped, ZAN_DEST_FORMAT_G4), stream);
        ++pages;
    }
    if (!CorpusDir().empty()) {
        EXPECT_GT(pages, 3);
    }
}

}  // namespace
