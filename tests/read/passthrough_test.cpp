// Compressed pages handed on without decoding: raw Group 4 and JPEG strips,
// and JPEG strips joined into one stream that decodes to exactly the
// page's pixels; soft refusals fall back to decoding.

#include <gtest/gtest.h>

#include <tiffio.h>

#include <algorithm>
#include <cstring>
#include <memory>

#include "read_support.h"
#include "support/corpus.h"
#include "support/jpeg_fixtures.h"

namespace {

using namespace zantest;

// The raw bytes of strip `strip` of the first page.
Bytes RawStrip(const Bytes& tiff, uint32_t strip = 0) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    Bytes data(static_cast<size_t>(TIFFGetStrileByteCount(tif, strip)));
    TIFFReadRawStrip(tif, strip, data.data(), static_cast<tmsize_t>(data.size()));
    TIFFClose(tif);
    return data;
}

Bytes G4Page(uint16_t photometric, uint16_t fillOrder = 0) {
    PageSpec p;
    p.width = 45;
    p.height = 20;
    p.bitsPerSample = 1;
    p.photometric = photometric;
    p.compression = COMPRESSION_CCITTFAX4;
    p.rowsPerStrip = 20;
    p.fillOrder = fillOrder;
    FileSpec spec;
    spec.pages[0] = p;
    return MakeTiff(spec);
}

enum class Out { Memory, File, DummyFile, Callbacks, FixedBuffer };

// A pass-through job: the page in memory, delivered to `out`.
class PassJob {
public:
    PassJob(const Bytes& tiff, uint32_t destFormat, Out out) : job_(tiff), out_(out) {
        job_->destFormat = destFormat;
        switch (out) {
        case Out::Memory:
            job_->destKind = ZAN_DEST_MEMORY;
            job_->destMemory = &block_;
            job_->destSizeOut = &size_;
            break;
        case Out::File:
        case Out::DummyFile:
            WriteFileBytes(file_.path(), Bytes{'o', 'l', 'd'});
            job_->destKind = ZAN_DEST_FILE;
            job_->destFp = std::fopen(file_.c_str(), "r+b");
            job_->destPath = out == Out::DummyFile ? "dummyfile" : file_.c_str();
            if (out == Out::DummyFile) std::fseek(job_->destFp, 0, SEEK_END);
            break;
        case Out::Callbacks:
            job_->destKind = ZAN_DEST_CALLBACKS;
            job_->destWriteProc = MemoryStream::Write;
            job_->destSeekProc = MemoryStream::Seek;
            job_->destUserData = &stream_;
            break;
        case Out::FixedBuffer:
            fixed_.assign(1 << 16, 0xEE);
            job_->destKind = ZAN_DEST_FIXED_BUFFER;
            job_->destMemory = fixed_.data();
            job_->destMemoryCapacity = static_cast<uint32_t>(fixed_.size());
            job_->destSizeOut = &size_;
            break;
        }
    }
    ~PassJob() {
        if (job_->destFp) std::fclose(job_->destFp);
        job_->destFp = nullptr;
        TestAllocator::Free(block_);
    }

    int Run() { return zanTIFFToFrameBuffer(job_.host().ctx(), &direct_); }

    // What the destination received (a file's earlier bytes left out).
    Bytes Delivered() {
        switch (out_) {
        case Out::Memory: return block_ ? Bytes(static_cast<uint8_t*>(block_), static_cast<uint8_t*>(block_) + size_) : Bytes();
        case Out::File: std::fflush(job_->destFp); return ReadFileBytes(file_.path());
        case Out::DummyFile: {
            std::fflush(job_->destFp);
            const Bytes all = ReadFileBytes(file_.path());
            return Bytes(all.begin() + 3, all.end());
        }
        case Out::Callbacks: return stream_.data;
        case Out::FixedBuffer: return Bytes(fixed_.begin(), fixed_.begin() + size_);
        }
        return {};
    }

    ReadJob& job() { return job_; }
    uint32_t direct() const { return direct_; }
    bool Traced(const std::string& text) const {
        for (const Message& m : const_cast<ReadJob&>(job_).host().messages)
            if (m.severity == 2 && m.level == 1 && m.text == text) return true;
        return false;
    }

private:
    ReadJob job_;
    Out out_;
    TempFile file_;
    MemoryStream stream_;
    Bytes fixed_;
    void* block_ = nullptr;
    uint32_t size_ = 0;
    uint32_t direct_ = 0;
};

constexpr Out kOuts[] = {Out::Memory, Out::File, Out::DummyFile, Out::Callbacks, Out::FixedBuffer};

TEST(RawStrips, OneStripPagesArriveAsStoredOnEveryDestination) {
    auto reversed = [](Bytes b) {
        for (uint8_t& v : b) {
            uint8_t r = 0;
            for (int i = 0; i < 8; ++i) r = static_cast<uint8_t>(r | ((v >> i) & 1) << (7 - i));
            v = r;
        }
        return b;
    };
    JpegPageSpec whole;
    whole.components = 1;
    whole.tables = false;
    whole.rowsPerStrip = whole.height;
    const Bytes g4 = G4Page(PHOTOMETRIC_MINISWHITE), g4Fill2 = G4Page(PHOTOMETRIC_MINISWHITE, FILLORDER_LSB2MSB);
    const Bytes jpeg = MakeJpegTiff(whole);
    const struct Case {
        const char* what;
        Bytes tiff;
        uint32_t destFormat, format;
        Bytes want;
    } cases[] = {
        {"Group 4", g4, ZAN_DEST_FORMAT_G4, 1, RawStrip(g4)},
        {"Group 4, FillOrder 2: bits reversed", g4Fill2, ZAN_DEST_FORMAT_G4, 1, reversed(RawStrip(g4Fill2))},
        {"grey JPEG stream", jpeg, ZAN_DEST_FORMAT_JPEG, 2, RawStrip(jpeg)},
    };
    for (const Case& c : cases)
        for (Out out : kOuts) {
            SCOPED_TRACE(::testing::Message() << c.what << ", destination " << static_cast<int>(out));
            PassJob pass(c.tiff, c.destFormat, out);
            ASSERT_EQ(pass.Run(), 1) << ::testing::PrintToString(pass.job().host().Errors());
            EXPECT_EQ(pass.direct(), 1u);
            EXPECT_EQ(pass.job()->outputFormat, c.format);
            EXPECT_EQ(pass.job()->outputWidth, c.destFormat == ZAN_DEST_FORMAT_G4 ? 45u : 64u);
            EXPECT_EQ(pass.job()->frameData, nullptr);
            EXPECT_EQ(pass.Delivered(), c.want);
            EXPECT_TRUE(pass.Traced("Converted w/o decompression; single strip."));
            EXPECT_EQ(pass.job()->tiff, nullptr);
        }
}

TEST(RawStrips, PagesThatCannotPassAreDecoded) {
    // A min-is-black Group 4 page, and a page of another compression.
    for (const Bytes& tiff : {G4Page(PHOTOMETRIC_MINISBLACK), MakeJpegTiff(JpegPageSpec{})}) {
        PassJob pass(tiff, ZAN_DEST_FORMAT_G4, Out::Memory);
        ASSERT_EQ(pass.Run(), 1);
        EXPECT_EQ(pass.direct(), 0u);
        EXPECT_NE(pass.job()->frameData, nullptr);
        EXPECT_TRUE(pass.Delivered().empty());
    }
}

// The joined stream of `tiff` decodes exactly as its strips do one by one
// (a page the join declines is decoded, when that is allowed).
void ExpectLosslessJoin(const Bytes& tiff, const std::string& what, bool mayDecline = false) {
    PassJob pass(tiff, ZAN_DEST_FORMAT_JPEG, Out::Memory);
    ASSERT_EQ(pass.Run(), 1) << what << ::testing::PrintToString(pass.job().host().Errors());
    if (mayDecline && pass.direct() == 0) return;
    ASSERT_EQ(pass.direct(), 1u) << what << ::testing::PrintToString(pass.job().host().messages.back().text);
    const DecodedJpeg joined = DecodeJpeg(pass.Delivered()), strips = DecodeJpegStrips(tiff);
    ASSERT_FALSE(joined.pixels.empty()) << what;
    EXPECT_EQ(joined.width, strips.width) << what;
    EXPECT_EQ(joined.height, strips.height) << what;
    EXPECT_TRUE(joined.pixels == strips.pixels) << what;
    EXPECT_EQ(pass.job()->outputHeight, strips.height) << what;
    EXPECT_EQ(pass.job()->outputFormat, joined.components == 1 ? 2u : 8u) << what;
}

TEST(JpegJoin, JoinedStreamsDecodeToThePagesPixels) {
    struct Layout {
        const char* what;
        int components, h, v;
        uint32_t rowsPerStrip;
    };
    const Layout layouts[] = {{"4:2:0", 3, 2, 2, 16}, {"4:2:2", 3, 2, 1, 8}, {"1x2", 3, 1, 2, 16},
                              {"4:4:4", 3, 1, 1, 8},  {"grey", 1, 1, 1, 8},  {"4:2:0, one strip", 3, 2, 2, 48}};
    for (const Layout& l : layouts)
        for (int restart : {0, 2}) {
            JpegPageSpec spec;
            spec.width = 72;  // not a whole number of 16-pixel MCUs
            spec.components = l.components;
            spec.h = l.h;
            spec.v = l.v;
            spec.rowsPerStrip = l.rowsPerStrip;
            // A restart interval that divides every strip's MCUs.
            spec.restartInterval = restart ? static_cast<int>((72 + 8 * l.h - 1) / (8 * l.h)) : 0;
            ExpectLosslessJoin(MakeJpegTiff(spec), std::string(l.what) + (restart ? ", restarts" : ""));
        }
    JpegPageSpec rgb;
    rgb.rgb = true;
    rgb.h = rgb.v = 1;
    ExpectLosslessJoin(MakeJpegTiff(rgb), "RGB, with its Adobe segment");
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

TEST(JpegJoin, LayoutsItCannotJoinAreDecodedWithTheReasonTraced) {
    JpegPageSpec base;
    JpegPageSpec wholeStreams = base;
    wholeStreams.wholeStrips = true;  // every strip carries its tables
    JpegPageSpec shortStrips = base;
    shortStrips.rowsPerStrip = 8;  // half a 16-row MCU
    JpegPageSpec restarts = base;
    restarts.restartInterval = 2;
    const Bytes plain = MakeJpegTiff(base);
    const Bytes noEnd = Patched(plain, Bytes{0xFF, 0xD9}, Bytes{0xFF, 0x00});
    const Bytes otherRestarts = Patched(MakeJpegTiff(restarts), Bytes{0xFF, 0xDD, 0x00, 0x04, 0x00, 0x02},
                                        Bytes{0xFF, 0xDD, 0x00, 0x04, 0x00, 0x04});
    const Bytes noComponents = Patched(plain, Bytes{0xFF, 0xC0, 0x00, 0x11, 0x08}, Bytes{0xFF, 0xC0, 0x00, 0x11, 0x08, 0x00, 0x30, 0x00, 0x40, 0x00});
    JpegPageSpec noTables = base;
    noTables.tables = false;
    const struct Case {
        const char* what;
        Bytes tiff;
        const char* trace;
        bool decodes = true;  // the page then decodes
    } cases[] = {
        {"no tables", MakeJpegTiff(noTables), "Conversion without decompression failed: no jpeg table or no SOI at start."},
        {"whole streams", MakeJpegTiff(wholeStreams), "Conversion w/o decompression failed : unexpected jpeg marker."},
        {"strips of half an MCU", MakeJpegTiff(shortStrips),
         "Conversion w/o decompression failed: strip height not multiple of mcu height."},
        {"a strip without its end", noEnd, "Conversion w/o decompression failed: missing expected end jpeg marker."},
        {"restart intervals that differ", otherRestarts, "Conversion w/o decompression failed: inconsistent DRI's."},
        {"a frame without components", noComponents, "Conversion w/o decompression failed: invalid SOF.", false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        PassJob pass(c.tiff, ZAN_DEST_FORMAT_JPEG, Out::Memory);
        EXPECT_EQ(pass.Run(), c.decodes ? 1 : 0) << ::testing::PrintToString(pass.job().host().Errors());
        EXPECT_EQ(pass.direct(), 0u);
        EXPECT_TRUE(pass.Traced(c.trace));
        EXPECT_EQ(pass.Delivered(), Bytes()) << "nothing handed over";
    }
}

TEST(JpegJoin, FailuresOfMemoryAndFilesAreReported) {
    const Bytes tiff = MakeJpegTiff(JpegPageSpec{});
    for (int n = 1;; ++n) {
        int calls = 0;
        {
            PassJob pass(tiff, ZAN_DEST_FORMAT_JPEG, Out::Memory);
            TestAllocator::Reset();
            TestAllocator::FailNthCall(n);
            const int result = pass.Run();
            calls = TestAllocator::Calls();
            if (!result) {
                EXPECT_FALSE(pass.job().host().Errors().empty() && pass.job().host().codecErrors.empty()) << n;
            }
            if (calls < n) {
                EXPECT_EQ(result, 1);
                EXPECT_EQ(pass.direct(), 1u);
            }
        }
        TestAllocator::Reset();
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << n;
        if (calls < n) break;
    }
    PassJob unopenable(tiff, ZAN_DEST_FORMAT_JPEG, Out::File);
    unopenable.job()->destPath = "/nonexistent-dir/zantiff/out.jpg";
    EXPECT_EQ(unopenable.Run(), 0);
    EXPECT_EQ(unopenable.job().host().Errors(), std::vector<std::string>{"File access error."});
}

// `stream` wrapped into a one-page TIFF in memory by the module: a JPEG
// from memory, or a Group 4 stream of `width` x `height` min-is-white pixels
// read from a file where it starts at byte 100.
Bytes Wrapped(const Bytes& stream, bool jpeg, uint32_t width = 0, uint32_t height = 0) {
    TestHost host;
    void* block = nullptr;
    uint32_t size = 0;
    host->sourceKind = ZAN_SOURCE_MEMORY;
    host->sourceMemory = stream.data();
    host->sourceMemorySize = static_cast<uint32_t>(stream.size());
    TempFile file;
    std::unique_ptr<FILE, int (*)(FILE*)> fp(nullptr, std::fclose);
    if (!jpeg) {
        Bytes padded(100 + stream.size(), 0xFF);
        std::copy(stream.begin(), stream.end(), padded.begin() + 100);
        WriteFileBytes(file.path(), padded);
        fp.reset(std::fopen(file.c_str(), "rb"));
        std::fseek(fp.get(), 100, SEEK_SET);
        host->sourceKind = ZAN_SOURCE_FILE;
        host->sourceFp = fp.get();
    }
    host->destKind = ZAN_DEST_MEMORY;
    host->destMemory = &block;
    host->destSizeOut = &size;
    host->imageWidth = width;
    host->imageHeight = height;
    host->whiteIsZero = 1;
    uint32_t direct = 1;
    const int result = jpeg ? zanJPEGToTIFF(host.ctx(), &direct) : zanG4ToTIFF(host.ctx());
    EXPECT_EQ(result, 1) << ::testing::PrintToString(host.Errors());
    EXPECT_EQ(direct, 1u);
    host.EndJob();
    Bytes tiff = block ? Bytes(static_cast<uint8_t*>(block), static_cast<uint8_t*>(block) + size) : Bytes();
    TestAllocator::Free(block);
    return tiff;
}

// What the pass-through delivers for the page, or empty when it declines.
Bytes PassedThrough(const Bytes& tiff, uint32_t destFormat) {
    PassJob pass(tiff, destFormat, Out::Memory);
    return pass.Run() == 1 && pass.direct() == 1 ? pass.Delivered() : Bytes();
}

TEST(RoundTrips, StreamsTakenFromPagesAndWrappedAgainComeBackUnchanged) {
    JpegPageSpec rgb;
    rgb.rgb = true;
    rgb.h = rgb.v = 1;
    JpegPageSpec grey;
    grey.components = 1;
    grey.h = grey.v = 1;
    for (const JpegPageSpec& spec : {JpegPageSpec{}, rgb, grey}) {
        const Bytes page = MakeJpegTiff(spec);
        const Bytes stream = PassedThrough(page, ZAN_DEST_FORMAT_JPEG);
        ASSERT_FALSE(stream.empty());
        const Bytes wrapped = Wrapped(stream, true);
        EXPECT_EQ(PassedThrough(wrapped, ZAN_DEST_FORMAT_JPEG), stream) << spec.components << spec.rgb;
    }
    // Group 4 pages of the corpus: the stream, wrapped again, is the page.
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
