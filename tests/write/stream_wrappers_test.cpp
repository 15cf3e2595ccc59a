// zanJPEGToTIFF and zanG4ToTIFF: compressed streams wrapped unchanged into a
// one-page TIFF that libtiff reads back to the stream's own pixels, on every
// destination kind, and what each call leaves behind.

#include <gtest/gtest.h>

#include <tiffio.h>

#include <algorithm>
#include <cstring>

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

// A wrapping job whose source is `stream` in memory (or in a file from a
// base offset of 100).
class WrapJob : public WriteJob {
public:
    WrapJob(const Bytes& stream, Dest dest = Dest::Memory, bool fromFile = false) : WriteJob(dest), stream_(stream) {
        if (fromFile) {
            Bytes padded(100 + stream.size(), '#');
            std::copy(stream.begin(), stream.end(), padded.begin() + 100);
            WriteFileBytes(file_.path(), padded);
            fp_ = std::fopen(file_.c_str(), "rb");
            (*this)->sourceKind = ZAN_SOURCE_FILE;
            (*this)->sourceFp = fp_;
            (*this)->sourceBaseOffset = 100;
        } else {
            (*this)->sourceKind = ZAN_SOURCE_MEMORY;
            (*this)->sourceMemory = stream_.data();
            (*this)->sourceMemorySize = static_cast<uint32_t>(stream_.size());
        }
    }
    ~WrapJob() {
        if (fp_) std::fclose(fp_);
    }
    int Jpeg() {
        direct_ = 1;
        const int result = zanJPEGToTIFF(host().ctx(), &direct_);
        EXPECT_EQ((*this)->tiff, nullptr);
        EXPECT_EQ((*this)->fileHandle, nullptr);
        return result;
    }
    uint32_t direct() const { return direct_; }

private:
    Bytes stream_;
    TempFile file_;
    FILE* fp_ = nullptr;
    uint32_t direct_ = 1;
};

// The first page's strip 0 as stored, and its pixels as libtiff decodes
// them (JPEG as RGB).
struct ReadBack {
    Bytes strip, pixels;
    uint16_t photometric = 0, subH = 0, subV = 0;
    float xResolution = 0;
};
ReadBack ReadWithLibtiff(const Bytes& tiff) {
    ReadBack back;
    PageReader page(tiff);
    TIFF* tif = page.get();
    if (!tif) return back;
    back.photometric = static_cast<uint16_t>(page.U16(TIFFTAG_PHOTOMETRIC));
    TIFFGetField(tif, TIFFTAG_YCBCRSUBSAMPLING, &back.subH, &back.subV);
    back.xResolution = page.F32(TIFFTAG_XRESOLUTION);
    back.strip.resize(static_cast<size_t>(TIFFGetStrileByteCount(tif, 0)));
    TIFFReadRawStrip(tif, 0, back.strip.data(), static_cast<tmsize_t>(back.strip.size()));
    TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
    back.pixels.resize(static_cast<size_t>(TIFFStripSize(tif)));
    if (TIFFReadEncodedStrip(tif, 0, back.pixels.data(), -1) < 0) back.pixels.clear();
    return back;
}

JpegStreamSpec Stream(int components, int h, int v, bool rgb = false) {
    JpegStreamSpec spec;
    spec.page.width = 50;  // not a whole number of MCUs
    spec.page.height = 35;
    spec.page.components = components;
    spec.page.h = h;
    spec.page.v = v;
    spec.page.rgb = rgb;
    return spec;
}

TEST(JpegWrap, PagesDecodeToTheStreamsOwnPixels) {
    JpegStreamSpec dense = Stream(3, 2, 2);
    dense.density = 118;  // dots a centimetre
    dense.densityUnit = 2;
    const struct Case {
        const char* what;
        JpegStreamSpec spec;
        uint16_t photometric, subH, subV;
    } cases[] = {
        {"4:2:0", dense, PHOTOMETRIC_YCBCR, 2, 2},
        {"4:2:2", Stream(3, 2, 1), PHOTOMETRIC_YCBCR, 2, 1},
        {"4:4:4", Stream(3, 1, 1), PHOTOMETRIC_YCBCR, 1, 1},
        {"4:1:1", Stream(3, 4, 1), PHOTOMETRIC_YCBCR, 4, 1},
        {"grey", Stream(1, 1, 1), PHOTOMETRIC_MINISBLACK, 0, 0},
        {"RGB components", Stream(3, 1, 1, true), PHOTOMETRIC_RGB, 0, 0},
    };
    for (const Case& c : cases)
        for (bool fromFile : {false, true}) {
            SCOPED_TRACE(::testing::Message() << c.what << (fromFile ? ", file" : ", memory"));
            const Bytes jpeg = MakeJpeg(c.spec);
            WrapJob job(jpeg, Dest::Memory, fromFile);
            ASSERT_EQ(job.Jpeg(), 1) << ::testing::PrintToString(job.host().Errors());
            EXPECT_EQ(job.direct(), 1u);
            EXPECT_EQ(job->outputWidth, 50u);
            const Bytes tiff = job.Finish();
            EXPECT_EQ(tiff.size(), job.size()) << "exactly the bytes of the file";
            const ReadBack back = ReadWithLibtiff(tiff);
            EXPECT_EQ(back.strip, jpeg) << "the stream is the strip, unchanged";
            EXPECT_EQ(back.photometric, c.photometric);
            if (c.subH) {
                EXPECT_EQ(back.subH, c.subH);
                EXPECT_EQ(back.subV, c.subV);
            }
            const DecodedJpeg own = DecodeJpeg(jpeg, c.spec.page.rgb, true);
            EXPECT_EQ(back.pixels, own.pixels);
            if (c.spec.densityUnit) {
                EXPECT_FLOAT_EQ(back.xResolution, 118 * 2.54f);
            }
        }
}

TEST(JpegWrap, StreamsTiffCannotHoldAsTheyAreAreDeclined) {
    JpegStreamSpec cmyk = Stream(4, 1, 1);
    JpegStreamSpec unequal = Stream(3, 2, 2);
    unequal.crH = 2;
    JpegStreamSpec ratio3 = Stream(3, 3, 1);
    Bytes remainder = MakeJpeg(Stream(3, 3, 1));  // Y 3 x 1 over chroma 2 x 1
    SetFrameSampling(remainder, 1, 2, 1);
    SetFrameSampling(remainder, 2, 2, 1);
    JpegStreamSpec chroma = Stream(3, 2, 2);
    chroma.cbH = chroma.crH = 2;  // libtiff reads chroma of 1 x 1 only
    const struct Case {
        const char* what;
        Bytes stream;
        const char* trace;
    } cases[] = {
        {"CMYK", MakeJpeg(cmyk), "No direct conversion: num components not 3 or 1."},
        {"unequal chroma", MakeJpeg(unequal),
         "No direct conversion: Unequal subsampling factors for the cb and cr comps."},
        {"luma of 3", MakeJpeg(ratio3), "No direct conversion: Invalid subsampling factors."},
        {"a remainder", remainder, "No direct conversion: Invalid subsampling factors."},
        {"chroma of 2", MakeJpeg(chroma), "No direct conversion: Invalid subsampling factors."},
    };
    const auto before = Handlers();
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        WrapJob job(c.stream);
        EXPECT_EQ(job.Jpeg(), 1);
        EXPECT_EQ(job.direct(), 0u);
        EXPECT_TRUE(job.host().Errors().empty());
        EXPECT_EQ(job.host().messages.back().text, c.trace);
        EXPECT_TRUE(job.Finish().empty()) << "nothing written";
        EXPECT_EQ(Handlers(), before);
    }
}

// Host callbacks as the source; sources and destinations it refuses, each
// with the codec's handlers put back.
TEST(JpegWrap, SourcesOfEveryKindAndThoseItRefuses) {
    const Bytes jpeg = MakeJpeg(Stream(3, 2, 2));
    MemoryStream stream;
    stream.data = jpeg;
    WrapJob callbacks(jpeg);
    UseStreamSource(callbacks.host().ctx(), &stream, true);
    ASSERT_EQ(callbacks.Jpeg(), 1) << ::testing::PrintToString(callbacks.host().Errors());
    EXPECT_EQ(ReadWithLibtiff(callbacks.Finish()).strip, jpeg);

    const auto before = Handlers();
    const struct Case {
        const char* what;
        Bytes stream;
        void (*spoil)(ConversionContext*, MemoryStream*);
        const char* message;
    } cases[] = {
        {"garbage", Bytes(300, 0x42), nullptr, "Unable to read the JPEG header: Not a JPEG file: starts with 0x42 0x42"},
        {"no seek", jpeg, [](ConversionContext* ctx, MemoryStream* s) { UseStreamSource(ctx, s, false); },
         "A JPEG stream source needs read and seek functions."},
        {"no file", jpeg, [](ConversionContext* ctx, MemoryStream*) { ctx->sourceKind = ZAN_SOURCE_FILE; },
         "The JPEG source file cannot be read."},
        {"a destination that cannot be opened", jpeg,
         [](ConversionContext* ctx, MemoryStream*) {
             ctx->destKind = ZAN_DEST_FILE;
             ctx->destPath = "/nonexistent-dir/out.tif";
         },
         "Reopening file"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        MemoryStream s;
        s.data = c.stream;
        WrapJob job(c.stream);
        if (c.spoil) c.spoil(job.host().ctx(), &s);
        EXPECT_EQ(job.Jpeg(), 0);
        EXPECT_EQ(job.direct(), 1u);
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(Handlers(), before);
    }
}

// (The destination kinds are compared on Group 4 pages below: both wrappers
// write through the same frame.)
TEST(JpegWrap, AppendAddsAPageAndTheHandedOverImageIsTheHostsAlone) {
    const Bytes jpeg = MakeJpeg(Stream(1, 1, 1));
    TempFile existing;
    WriteFileBytes(existing.path(), MakePages(2));
    WrapJob append(jpeg, Dest::File);
    append->destPath = existing.c_str();
    append->appendPages = 1;
    ASSERT_EQ(append.Jpeg(), 1);
    append.Finish();
    const auto pages = DecodeWithLibtiff(ReadFileBytes(existing.path()));
    ASSERT_EQ(pages.size(), 3u);
    EXPECT_EQ(pages[2].width, 50u);

    WrapJob job(jpeg);
    ASSERT_EQ(job.Jpeg(), 1);
    void* const handed = *static_cast<void**>(job->destMemory);
    ASSERT_NE(handed, nullptr);
    zanDestroyTIFF(job.host().ctx());
    EXPECT_EQ(*static_cast<void**>(job->destMemory), handed) << "teardown hands nothing over again";
    EXPECT_TRUE(TestAllocator::Owns(handed)) << "and releases nothing of the host's";
    EXPECT_EQ(ReadWithLibtiff(job.Finish()).strip, jpeg);
}

// The raw Group 4 strip of a one-strip min-is-white page written by
// libtiff, and that page's pixels.
struct G4Source {
    Bytes strip, pixels;
    uint32_t width, height;
};
G4Source MakeG4() {
    PageSpec p;
    p.width = 70;
    p.height = 30;
    p.bitsPerSample = 1;
    p.photometric = PHOTOMETRIC_MINISWHITE;
    p.compression = COMPRESSION_CCITTFAX4;
    p.rowsPerStrip = 30;
    FileSpec spec;
    spec.pages[0] = p;
    const Bytes tiff = MakeTiff(spec);
    PageReader page(tiff);
    G4Source g4{Bytes(static_cast<size_t>(TIFFGetStrileByteCount(page.get(), 0))), DecodeWithLibtiff(tiff)[0].pixels,
                70, 30};
    TIFFReadRawStrip(page.get(), 0, g4.strip.data(), static_cast<tmsize_t>(g4.strip.size()));
    return g4;
}

TEST(G4Wrap, TheStreamBecomesThePageOnEveryDestination) {
    const G4Source g4 = MakeG4();
    const auto before = Handlers();
    Bytes first;
    for (Dest dest : {Dest::Memory, Dest::File, Dest::Callbacks, Dest::FixedBuffer}) {
        SCOPED_TRACE(static_cast<int>(dest));
        WrapJob job(g4.strip, dest);
        job->imageWidth = g4.width;
        job->imageHeight = g4.height;
        job->whiteIsZero = 1;
        job->outputXResolution = job->outputYResolution = 200;
        ASSERT_EQ(zanG4ToTIFF(job.host().ctx()), 1) << ::testing::PrintToString(job.host().Errors());
        EXPECT_EQ(job->tiff, nullptr);
        EXPECT_EQ(Handlers(), before);
        const Bytes tiff = job.Finish();
        if (first.empty()) first = tiff;
        EXPECT_EQ(tiff, first);
        const auto pages = DecodeWithLibtiff(tiff);
        ASSERT_EQ(pages.size(), 1u);
        EXPECT_EQ(pages[0].pixels, g4.pixels);
        PageReader page(tiff);
        EXPECT_EQ(page.U16(TIFFTAG_PHOTOMETRIC), static_cast<uint32_t>(PHOTOMETRIC_MINISWHITE));
        EXPECT_EQ(page.U32(TIFFTAG_ROWSPERSTRIP), g4.height);
        EXPECT_EQ(page.F32(TIFFTAG_XRESOLUTION), 200.0f);
    }
}

TEST(G4Wrap, AnEmptyStreamGivesNoPage) {
    const auto before = Handlers();
    WrapJob job(Bytes{});
    job->sourceMemory = nullptr;
    job->sourceFp = std::tmpfile();
    job->imageWidth = job->imageHeight = 8;
    EXPECT_EQ(zanG4ToTIFF(job.host().ctx()), 0);
    EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"The source holds no data to wrap."});
    EXPECT_EQ(job->memBase, nullptr) << "no memory image is left";
    EXPECT_EQ(Handlers(), before);
    std::fclose(job->sourceFp);
    job->sourceFp = nullptr;
    EXPECT_TRUE(job.Finish().empty());
}

TEST(StreamWraps, EveryAllocationCanFailCleanly) {
    const Bytes jpeg = MakeJpeg(Stream(3, 2, 2));
    const G4Source g4 = MakeG4();
    for (bool isJpeg : {true, false})
        for (int n = 1;; ++n) {
            int calls = 0, result = 0;
            {
                WrapJob job(isJpeg ? jpeg : g4.strip);
                job->imageWidth = g4.width;
                job->imageHeight = g4.height;
                TestAllocator::Reset();
                TestAllocator::FailNthCall(n);
                result = isJpeg ? job.Jpeg() : zanG4ToTIFF(job.host().ctx());
                calls = TestAllocator::Calls();
                if (!result) {
                    EXPECT_FALSE(job.host().Errors().empty() && job.host().codecErrors.empty()) << n;
                    EXPECT_EQ(job->memBase, nullptr) << n;
                }
            }
            TestAllocator::Reset();
            EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << n;
            if (calls < n) {
                EXPECT_EQ(result, 1);
                break;
            }
        }
}

}  // namespace
