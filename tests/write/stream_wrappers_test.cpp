// zanJPEGToTIFF and zanG4ToTIFF: compressed streams wrapped unchanged into a
// one-page TIFF that libtiff reads back to the stream's own pixels, on every
// destination kind, and what each call leaves behind.

#include <gtest/gtest.h>

#include <tiffio.h>

#include <algorithm>

#include "support/jpeg_fixtures.h"
#include "write_support.h"

namespace {

using namespace zantest;

// The codec's handlers in force now.
std::pair<TIFFErrorHandler, TIFFErrorHandler> Handlers() {
    const TIFFErrorHandler error = TIFFSetErrorHandler(nullptr), warning = TIFFSetWarningHandler(nullptr);
    TIFFSetErrorHandler(error);
    TIFFSetWarningHandler(warning);
    return {error, warning};
}

enum class From { Memory, File, Callbacks };

// A wrapping job whose source is `stream` in memory, in a file from a base
// offset of 100, or behind host callbacks. Every call must leave no codec
// object or file record behind, and the codec's handlers as they were.
class WrapJob : public WriteJob {
public:
    WrapJob(const Bytes& stream, From from = From::Memory, Dest dest = Dest::Memory) : WriteJob(dest), stream_(stream) {
        source_.data = stream;
        if (from == From::File) {
            Bytes padded(100 + stream.size(), '#');
            std::copy(stream.begin(), stream.end(), padded.begin() + 100);
            WriteFileBytes(file_.path(), padded);
            (*this)->sourceKind = ZAN_SOURCE_FILE;
            (*this)->sourceFp = fp_ = std::fopen(file_.c_str(), "rb");
            (*this)->sourceBaseOffset = 100;
            return;
        }
        (*this)->sourceKind = ZAN_SOURCE_MEMORY;
        (*this)->sourceMemory = stream_.data();
        (*this)->sourceMemorySize = static_cast<uint32_t>(stream_.size());
        if (from == From::Callbacks) UseStreamSource(host().ctx(), &source_, true);
    }
    ~WrapJob() {
        if (fp_) std::fclose(fp_);
    }
    int Jpeg() {
        direct_ = 1;
        return Checked(zanJPEGToTIFF(host().ctx(), &direct_));
    }
    int G4() { return Checked(zanG4ToTIFF(host().ctx())); }
    uint32_t direct() const { return direct_; }

private:
    int Checked(int result) {
        EXPECT_EQ((*this)->tiff, nullptr);
        EXPECT_EQ((*this)->fileHandle, nullptr);
        EXPECT_EQ(Handlers(), handlers_);
        return result;
    }
    Bytes stream_;
    MemoryStream source_;
    TempFile file_;
    FILE* fp_ = nullptr;
    uint32_t direct_ = 1;
    const std::pair<TIFFErrorHandler, TIFFErrorHandler> handlers_ = Handlers();
};

// The first page's strip 0 as stored, and its pixels as libtiff decodes
// them (JPEG as RGB).
std::pair<Bytes, Bytes> StripAndPixels(const Bytes& tiff) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    if (!tif) return {};
    Bytes strip(static_cast<size_t>(TIFFGetStrileByteCount(tif, 0)));
    TIFFReadRawStrip(tif, 0, strip.data(), static_cast<tmsize_t>(strip.size()));
    TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
    Bytes pixels(static_cast<size_t>(TIFFStripSize(tif)));
    if (TIFFReadEncodedStrip(tif, 0, pixels.data(), -1) < 0) pixels.clear();
    TIFFClose(tif);
    return {strip, pixels};
}

// A stream of 50 x 35 pixels: not a whole number of MCUs.
JpegStreamLayout Stream(int components, int h, int v, bool rgb = false) {
    JpegStreamLayout stream;
    stream.page = {.width = 50, .height = 35, .components = components, .h = h, .v = v, .rgb = rgb};
    return stream;
}

TEST(JpegWrap, PagesDecodeToTheStreamsOwnPixels) {
    // From every source kind the stream is the strip, unchanged, under tags
    // of the stream's own layout and density.
    JpegStreamLayout dense = Stream(3, 2, 2);
    dense.density = 118;  // dots a centimetre
    dense.densityUnit = 2;
    const std::string ycbcr = "Photometric Interpretation: YCbCr";
    const struct Case {
        const char* what;
        JpegStreamLayout stream;
        std::vector<std::string> lines, absent;
    } cases[] = {
        {"4:2:0", dense, {ycbcr, "YCbCr Subsampling: 2, 2", "Resolution: 299.72, 299.72 pixels/inch"}, {}},
        {"4:2:2", Stream(3, 2, 1), {ycbcr, "YCbCr Subsampling: 2, 1"}, {"Resolution"}},
        {"4:4:4", Stream(3, 1, 1), {ycbcr, "YCbCr Subsampling: 1, 1"}, {"Resolution"}},
        {"4:1:1", Stream(3, 4, 1), {ycbcr, "YCbCr Subsampling: 4, 1"}, {"Resolution"}},
        {"grey", Stream(1, 1, 1), {"Photometric Interpretation: min-is-black"}, {"YCbCr Subsampling", "Resolution"}},
        {"RGB", Stream(3, 1, 1, true), {"Photometric Interpretation: RGB color"}, {"YCbCr Subsampling", "Resolution"}},
    };
    for (const Case& c : cases)
        for (From from : {From::Memory, From::File, From::Callbacks}) {
            SCOPED_TRACE(::testing::Message() << c.what << ", source " << static_cast<int>(from));
            const Bytes jpeg = MakeJpeg(c.stream);
            WrapJob job(jpeg, from);
            ASSERT_EQ(job.Jpeg(), 1) << ::testing::PrintToString(job.host().Errors());
            EXPECT_EQ(job.direct(), 1u);
            EXPECT_EQ(job->outputWidth, 50u);
            const Bytes tiff = job.Finish();
            EXPECT_EQ(tiff.size(), job.size()) << "exactly the bytes of the file";
            EXPECT_EQ(StripAndPixels(tiff), std::make_pair(jpeg, DecodeJpeg(jpeg, c.stream.page.rgb, true).pixels));
            const std::string tags = DumpPage(tiff, 0).tags;
            ExpectListing(tags, {"Compression Scheme: JPEG", "Image Width: 50 Image Length: 35", "Rows/Strip: 35"});
            ExpectListing(tags, c.lines, c.absent);
        }
}

TEST(StreamWraps, CallsThatGiveNoPageSayWhy) {
    // Streams a page cannot hold as they are are declined with a trace (no
    // direct conversion); unusable sources and destinations are refused.
    JpegStreamLayout unequal = Stream(3, 2, 2), chroma = Stream(3, 2, 2);
    unequal.crH = 2;
    chroma.cbH = chroma.crH = 2;  // libtiff reads chroma of 1 x 1 only
    Bytes remainder = MakeJpeg(Stream(3, 3, 1));  // Y 3 x 1 over chroma 2 x 1
    SetFrameSampling(remainder, 1, 2, 1);
    SetFrameSampling(remainder, 2, 2, 1);
    const Bytes jpeg = MakeJpeg(Stream(3, 2, 2));
    const char* const invalid = "No direct conversion: Invalid subsampling factors.";
    const struct Case {
        Bytes stream;
        From from;
        void (*spoil)(ConversionContext*);
        int result;
        const char* message;
        bool g4 = false;
    } cases[] = {
        {MakeJpeg(Stream(4, 1, 1)), From::Memory, nullptr, 1, "No direct conversion: num components not 3 or 1."},
        {MakeJpeg(unequal), From::Memory, nullptr, 1,
         "No direct conversion: Unequal subsampling factors for the cb and cr comps."},
        {MakeJpeg(Stream(3, 3, 1)), From::Memory, nullptr, 1, invalid},
        {remainder, From::Memory, nullptr, 1, invalid},
        {MakeJpeg(chroma), From::Memory, nullptr, 1, invalid},
        {Bytes(300, 0x42), From::Memory, nullptr, 0,
         "Unable to read the JPEG header: Not a JPEG file: starts with 0x42 0x42"},
        {jpeg, From::Callbacks, [](ConversionContext* ctx) { ctx->sourceSeekProc = nullptr; }, 0,
         "A JPEG stream source needs read and seek functions."},
        {jpeg, From::Memory, [](ConversionContext* ctx) { ctx->sourceKind = ZAN_SOURCE_FILE; }, 0,
         "The JPEG source file cannot be read."},
        {jpeg, From::Memory,
         [](ConversionContext* ctx) {
             ctx->destKind = ZAN_DEST_FILE;
             ctx->destPath = "/nonexistent-dir/out.tif";
         },
         0, "Reopening file"},
        // A Group 4 stream read from where the file stands (at its end) when
        // a memory source has no memory.
        {{}, From::File,
         [](ConversionContext* ctx) {
             ctx->sourceKind = ZAN_SOURCE_MEMORY;
             std::fseek(ctx->sourceFp, 0, SEEK_END);
         },
         0, "The source holds no data to wrap.", true},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.message);
        WrapJob job(c.stream, c.from);
        job->imageWidth = job->imageHeight = 8;
        if (c.spoil) c.spoil(job.host().ctx());
        EXPECT_EQ(c.g4 ? job.G4() : job.Jpeg(), c.result);
        EXPECT_EQ(job.direct(), c.result == 1 ? 0u : 1u);
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>(c.result == 1 ? 0 : 1, c.message));
        ASSERT_FALSE(job.host().messages.empty());
        EXPECT_EQ(job.host().messages.back().text, c.message);
        EXPECT_EQ(job->memBase, nullptr);
        EXPECT_TRUE(job.Finish().empty());
    }
}

TEST(JpegWrap, TheHandedOverImageIsTheHostsAlone) {
    // Teardown neither hands the memory image over again nor releases it.
    const Bytes jpeg = MakeJpeg(Stream(1, 1, 1));
    WrapJob job(jpeg);
    ASSERT_EQ(job.Jpeg(), 1);
    void* const handed = *static_cast<void**>(job->destMemory);
    ASSERT_NE(handed, nullptr);
    zanDestroyTIFF(job.host().ctx());
    EXPECT_EQ(*static_cast<void**>(job->destMemory), handed);
    EXPECT_TRUE(TestAllocator::Owns(handed));
    EXPECT_EQ(StripAndPixels(job.Finish()).first, jpeg);
}

// The raw Group 4 strip of a one-strip min-is-white page of 70 x 30 written
// by libtiff, and that page's pixels.
std::pair<Bytes, Bytes> G4Stream() {
    FileLayout file;
    PageLayout& p = file.pages[0];
    p.width = 70;
    p.height = p.rowsPerStrip = 30;
    p.bitsPerSample = 1;
    p.photometric = PHOTOMETRIC_MINISWHITE;
    p.compression = COMPRESSION_CCITTFAX4;
    const Bytes tiff = MakeTiff(file);
    return {StripAndPixels(tiff).first, DecodeWithLibtiff(tiff)[0].pixels};
}

TEST(G4Wrap, TheStreamBecomesThePageOnEveryDestination) {
    // Every destination kind receives the same page of the stream's pixels.
    const auto [strip, pixels] = G4Stream();
    Bytes first;
    for (Dest dest : {Dest::Memory, Dest::File, Dest::Callbacks, Dest::FixedBuffer}) {
        SCOPED_TRACE(static_cast<int>(dest));
        WrapJob job(strip, From::Memory, dest);
        job->imageWidth = 70;
        job->imageHeight = 30;
        job->whiteIsZero = 1;
        job->outputXResolution = job->outputYResolution = 200;
        ASSERT_EQ(job.G4(), 1) << ::testing::PrintToString(job.host().Errors());
        const Bytes tiff = job.Finish();
        if (first.empty()) first = tiff;
        EXPECT_EQ(tiff, first);
        const auto pages = DecodeWithLibtiff(tiff);
        ASSERT_EQ(pages.size(), 1u);
        EXPECT_EQ(pages[0].pixels, pixels);
        ExpectListing(DumpPage(tiff, 0).tags, {"Compression Scheme: CCITT Group 4", "Rows/Strip: 30",
                                               "Photometric Interpretation: min-is-white",
                                               "Resolution: 200, 200 pixels/inch"});
    }
}

TEST(StreamWraps, EveryAllocationCanFailCleanly) {
    // A failed allocation is reported, leaves no memory image and leaks nothing.
    const Bytes jpeg = MakeJpeg(Stream(3, 2, 2)), g4 = G4Stream().first;
    for (const Bytes* stream : {&jpeg, &g4})
        SweepAllocations(
            [&] {
                auto job = std::make_unique<WrapJob>(*stream);
                (*job)->imageWidth = 70;
                (*job)->imageHeight = 30;
                return job;
            },
            [&](WrapJob& job, int n) {
                const int result = stream == &jpeg ? job.Jpeg() : job.G4();
                EXPECT_TRUE(result || job->memBase == nullptr) << n;
                return result == 1;
            });
}

}  // namespace
