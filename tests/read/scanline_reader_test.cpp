// zanTIFFReadNextScanLine: the lines a host receives for every page kind the
// reader takes, from every source kind, and its states and refusals.

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>

#include <tiffio.h>

#include "read_support.h"

namespace {

using namespace zantest;

// The samples of row y of a fixture page, pixel by pixel.
std::vector<uint32_t> RowSamples(const PageSpec& p, uint32_t y, uint32_t page = 0) {
    std::vector<uint32_t> samples;
    for (uint32_t x = 0; x < p.width; ++x)
        for (uint32_t s = 0; s < p.samplesPerPixel; ++s) samples.push_back(PixelValue(page, x, y, s, p.bitsPerSample));
    return samples;
}

Bytes AsBytes(const std::vector<uint32_t>& samples) { return Bytes(samples.begin(), samples.end()); }

FileSpec OnePage(const PageSpec& page) {
    FileSpec spec;
    spec.pages[0] = page;
    return spec;
}

PageSpec Rgb8() {
    PageSpec p;
    p.width = 13;
    p.height = 9;
    p.samplesPerPixel = 3;
    p.photometric = PHOTOMETRIC_RGB;
    p.rowsPerStrip = 4;
    return p;
}

class EverySource : public ::testing::TestWithParam<Source> {};

TEST_P(EverySource, RgbRowsArriveAsStored) {
    for (uint16_t compression : {COMPRESSION_NONE, COMPRESSION_LZW, COMPRESSION_PACKBITS}) {
        PageSpec p = Rgb8();
        p.compression = compression;
        ReadJob job(MakeTiff(OnePage(p)), GetParam());
        ASSERT_EQ(job.GetInfo(), 1);
        const auto rows = job.ReadAll();
        ASSERT_EQ(rows.size(), p.height) << ::testing::PrintToString(job.host().Errors());
        for (uint32_t y = 0; y < p.height; ++y) EXPECT_EQ(rows[y], AsBytes(RowSamples(p, y))) << y;
        EXPECT_EQ(job->lineBytes, 39u);
        EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_READING));
    }
}

INSTANTIATE_TEST_SUITE_P(Sources, EverySource,
                         ::testing::Values(Source::Memory, Source::File, Source::Callbacks,
                                           Source::StreamBuffer));

TEST(ScanlineReader, SixteenBitSamplesAreKeptOrReduced) {
    PageSpec p = Rgb8();
    p.bitsPerSample = 16;
    const Bytes tiff = MakeTiff(OnePage(p));
    for (uint32_t wish : {16u, 8u, 0u}) {
        ReadJob job(tiff);
        job->outputBitsPerSample = wish;
        const auto rows = job.ReadAll();
        ASSERT_EQ(rows.size(), p.height);
        const auto samples = RowSamples(p, 5);
        if (wish == 16) {
            ASSERT_EQ(rows[5].size(), samples.size() * 2);
            for (size_t i = 0; i < samples.size(); ++i) {
                uint16_t v;
                std::memcpy(&v, &rows[5][2 * i], 2);
                EXPECT_EQ(v, samples[i]);
            }
        } else {
            ASSERT_EQ(rows[5].size(), samples.size()) << "anything but 16 delivers 8 bits";
            for (size_t i = 0; i < samples.size(); ++i) EXPECT_EQ(rows[5][i], samples[i] >> 8);
        }
    }
}

TEST(ScanlineReader, NarrowGreySamplesBecomeBytes) {
    for (uint16_t bits : {2, 4}) {
        PageSpec p;
        p.width = 11;
        p.bitsPerSample = bits;
        ReadJob job(MakeTiff(OnePage(p)));
        const auto rows = job.ReadAll();
        ASSERT_EQ(rows.size(), p.height);
        const uint32_t scale = bits == 2 ? 85 : 17;
        Bytes expected;
        for (uint32_t v : RowSamples(p, 3)) expected.push_back(static_cast<uint8_t>(v * scale));
        EXPECT_EQ(rows[3], expected);
    }
}

TEST(ScanlineReader, BilevelRowsArrivePacked) {
    PageSpec p;
    p.width = 20;
    p.bitsPerSample = 1;
    p.photometric = PHOTOMETRIC_MINISWHITE;
    p.compression = COMPRESSION_CCITTFAX4;
    const Bytes tiff = MakeTiff(OnePage(p));
    ReadJob job(tiff);
    const auto rows = job.ReadAll();
    ASSERT_EQ(rows.size(), p.height);
    EXPECT_EQ(rows[0].size(), 3u);
    const auto decoded = DecodeWithLibtiff(tiff)[0].pixels;
    EXPECT_EQ(rows[2], Bytes(decoded.begin() + 6, decoded.begin() + 9));
}

// A palette page whose ColorMap is `map` (256 entries a table).
Bytes PalettePage(std::vector<uint16_t> map) {
    PageSpec p;
    p.width = 6;
    p.height = 2;
    p.photometric = PHOTOMETRIC_PALETTE;
    p.colorMap = std::move(map);
    return MakeTiff(OnePage(p));
}

TEST(ScanlineReader, PaletteEntriesAreScaledOnlyWhenWide) {
    std::vector<uint16_t> narrow(768);
    for (int i = 0; i < 256; ++i) narrow[i] = narrow[256 + i] = narrow[512 + i] = static_cast<uint16_t>(i);
    ReadJob a(PalettePage(narrow));
    const auto rowsA = a.ReadAll();
    ASSERT_EQ(rowsA.size(), 2u);
    EXPECT_EQ(a->lineBytes, 18u);
    const uint8_t index = static_cast<uint8_t>(PixelValue(0, 1, 0, 0, 8));
    EXPECT_EQ(rowsA[0][3], index) << "entries of at most 255 are used as they are";

    std::vector<uint16_t> wide(768, 0);
    wide[index] = 65535;
    wide[256 + index] = 257;
    wide[512 + index] = 256;
    ReadJob b(PalettePage(wide));
    const auto rowsB = b.ReadAll();
    ASSERT_EQ(rowsB.size(), 2u);
    EXPECT_EQ(Bytes(rowsB[0].begin() + 3, rowsB[0].begin() + 6), Bytes({255, 1, 0}));
}

TEST(ScanlineReader, AssociatedAlphaIsDividedOutAndExtrasDropped) {
    PageSpec p;
    p.width = 4;
    p.height = 2;
    p.samplesPerPixel = 4;
    p.photometric = PHOTOMETRIC_RGB;
    p.extraSamples = {EXTRASAMPLE_ASSOCALPHA};
    const Bytes tiff = MakeTiff(OnePage(p));
    for (uint32_t drop : {0u, 1u}) {
        ReadJob job(tiff);
        job->dropExtraSamples = drop;
        const auto rows = job.ReadAll();
        ASSERT_EQ(rows.size(), 2u);
        EXPECT_EQ(rows[1].size(), drop ? 12u : 16u);
        const auto s = RowSamples(p, 1);
        const float a = static_cast<float>(s[3] / 255.0);
        EXPECT_EQ(rows[1][0], static_cast<uint8_t>(static_cast<int>(std::trunc(s[0] / a + 0.5f))));
        if (!drop) {
            EXPECT_EQ(rows[1][3], s[3]) << "alpha stays";
        }
    }
}

TEST(ScanlineReader, SurplusSampleOfAPageWithoutTheTagIsAlpha) {
    PageSpec p;
    p.width = 3;
    p.height = 1;
    p.samplesPerPixel = 4;
    p.photometric = PHOTOMETRIC_RGB;  // no ExtraSamples: libtiff would call it unspecified
    ReadJob job(MakeTiff(OnePage(p)));
    job->dropExtraSamples = 1;
    const auto rows = job.ReadAll();
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0].size(), 9u);
    EXPECT_EQ(job->alphaSampleIndex, 3u);
    const auto s = RowSamples(p, 0);
    const float a = static_cast<float>(s[3] / 255.0);
    EXPECT_EQ(rows[0][1], static_cast<uint8_t>(static_cast<int>(std::trunc(s[1] / a + 0.5f))));
}

TEST(ScanlineReader, FiveInkPageHasNoExtraSamples) {
    PageSpec p;
    p.width = 3;
    p.height = 2;
    p.samplesPerPixel = 5;
    p.photometric = PHOTOMETRIC_SEPARATED;
    ReadJob job(MakeTiff(OnePage(p)));
    job->dropExtraSamples = 1;
    const auto rows = job.ReadAll();
    ASSERT_EQ(rows.size(), 2u);
    EXPECT_EQ(rows[1], AsBytes(RowSamples(p, 1)));
}

TEST(ScanlineReader, SeparatePlanesComeOneAfterAnother) {
    PageSpec p = Rgb8();
    p.planar = PLANARCONFIG_SEPARATE;
    ReadJob job(MakeTiff(OnePage(p)));
    const auto rows = job.ReadAll();
    ASSERT_EQ(rows.size(), p.height);
    ASSERT_EQ(rows[2].size(), 39u);
    for (uint32_t s = 0; s < 3; ++s)
        for (uint32_t x = 0; x < p.width; ++x) EXPECT_EQ(rows[2][s * p.width + x], PixelValue(0, x, 2, s, 8));
}

TEST(ScanlineReader, CompressedSeparatePlanesAreRefused) {
    PageSpec p = Rgb8();
    p.planar = PLANARCONFIG_SEPARATE;
    p.compression = COMPRESSION_LZW;
    ReadJob job(MakeTiff(OnePage(p)));
    EXPECT_TRUE(job.ReadAll().empty());
    EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"Line processing not supported for compressed planar tiff."});
    EXPECT_EQ(job->tiff, nullptr) << "the reader closes what it opened";
}

TEST(ScanlineReader, TiledPagesAreReadRowByRow) {
    for (uint16_t planar : {PLANARCONFIG_CONTIG, PLANARCONFIG_SEPARATE}) {
        PageSpec p = Rgb8();
        p.width = 40;
        p.height = 37;
        p.tileWidth = 16;
        p.tileHeight = 16;
        p.planar = planar;
        ReadJob job(MakeTiff(OnePage(p)));
        const auto rows = job.ReadAll();
        ASSERT_EQ(rows.size(), p.height) << ::testing::PrintToString(job.host().codecErrors);
        for (uint32_t y : {0u, 15u, 16u, 36u}) {
            for (uint32_t x : {0u, 17u, 39u})
                for (uint32_t s = 0; s < 3; ++s) {
                    const size_t at = planar == PLANARCONFIG_CONTIG ? x * 3 + s : s * p.width + x;
                    EXPECT_EQ(rows[y][at], PixelValue(0, x, y, s, 8)) << y << "," << x;
                }
        }
    }
}

// A YCbCr JPEG page written by libtiff from RGB rows (quality 95).
Bytes JpegPage(uint32_t width, uint32_t height, uint32_t rowsPerStrip) {
    TempFile file;
    TIFF* tif = TIFFOpen(file.c_str(), "w");
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, width);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, height);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 3);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_JPEG);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_YCBCR);
    TIFFSetField(tif, TIFFTAG_YCBCRSUBSAMPLING, 2, 2);
    TIFFSetField(tif, TIFFTAG_JPEGQUALITY, 95);
    TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, rowsPerStrip);
    Bytes row(width * 3);
    for (uint32_t y = 0; y < height; ++y) {
        for (uint32_t x = 0; x < width; ++x) {
            row[3 * x] = static_cast<uint8_t>(x * 4);
            row[3 * x + 1] = static_cast<uint8_t>(y * 4);
            row[3 * x + 2] = 128;
        }
        TIFFWriteScanline(tif, row.data(), y, 0);
    }
    TIFFClose(tif);
    return ReadFileBytes(file.path());
}

TEST(ScanlineReader, JpegPagesAreDecodedStripByStripInRgb) {
    const Bytes tiff = JpegPage(40, 50, 16);
    ReadJob job(tiff);
    const auto rows = job.ReadAll();
    ASSERT_EQ(rows.size(), 50u);
    EXPECT_EQ(job->lineBytes, 120u) << "RGB rows, not subsampled blocks";
    EXPECT_EQ(job->stripCount, 4u);
    EXPECT_EQ(job->rowsPerStrip, 16u);
    int worst = 0;
    for (uint32_t y = 0; y < 50; ++y)
        for (uint32_t x = 0; x < 40; ++x) {
            worst = std::max(worst, std::abs(rows[y][3 * x] - static_cast<int>(x * 4)));
            worst = std::max(worst, std::abs(rows[y][3 * x + 1] - static_cast<int>(y * 4)));
            worst = std::max(worst, std::abs(rows[y][3 * x + 2] - 128));
        }
    EXPECT_LE(worst, 8) << "within JPEG's error";
}

TEST(ScanlineReaderStates, RefusalsAndTheEndOfThePage) {
    ReadJob job(MakeTiff(OnePage(Rgb8())));
    Bytes line(64);
    job->state = ZAN_STATE_WRITING;
    EXPECT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 64), 0u);
    job->state = ZAN_STATE_PAGE_CLOSED;
    EXPECT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 64), 0u);
    job->state = ZAN_STATE_IDLE;
    EXPECT_EQ(job.host().Errors(), (std::vector<std::string>{"Can not read while writing.",
                                                              "Wrong state in zanTIFFReadNextScanLine."}));
    job.host().ClearMessages();
    ASSERT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 64), 39u);
    EXPECT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 38), 0u);
    EXPECT_EQ(job->currentRow, 1u) << "a short buffer does not advance";
    for (int y = 1; y < 9; ++y) ASSERT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 64), 39u);
    EXPECT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 64), 0u);
    EXPECT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 10), 0u);
    EXPECT_EQ(job.host().Errors(), (std::vector<std::string>{"Not enough space in line buffer.",
                                                              "No more lines to read.",
                                                              "Not enough space in line buffer."}));
}

TEST(ScanlineReaderStates, PagesItCannotTakeAreRefusedWithTheirMessages) {
    struct Case {
        PageSpec page;
        const char* message;
    };
    PageSpec wideBits;
    wideBits.bitsPerSample = 32;
    PageSpec palette16;
    palette16.photometric = PHOTOMETRIC_PALETTE;
    palette16.bitsPerSample = 16;
    palette16.colorMap.assign(3 * 65536, 0);
    const Case cases[] = {
        {wideBits, "Only supports 2, 4(palette), 2, 4, 8, 16 or 1 bitspersample."},
        {palette16, "Only supports 2 or 4 or 8 bit per sample palette tiff."},
    };
    for (const Case& c : cases) {
        ReadJob job(MakeTiff(OnePage(c.page)));
        ASSERT_EQ(job.GetInfo(), 1);
        EXPECT_TRUE(job.ReadAll().empty());
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>{c.message});
        EXPECT_NE(job->tiff, nullptr) << "a page described by zanTIFFGetInfo stays open";
        EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_DESCRIBED));
    }
}

TEST(ScanlineReaderStates, PageNumberIsHonouredWithoutGetInfo) {
    FileSpec spec;
    spec.pages.assign(2, PageSpec{});
    spec.pages[1].width = 7;
    ReadJob job(MakeTiff(spec));
    job->pageNumber = 2;
    const auto rows = job.ReadAll();
    ASSERT_EQ(rows.size(), spec.pages[1].height);
    EXPECT_EQ(rows[0].size(), 7u);
    job->pageNumber = 3;
    ReadJob beyond(MakeTiff(spec));
    beyond->pageNumber = 3;
    EXPECT_TRUE(beyond.ReadAll().empty());
    EXPECT_EQ(beyond.host().Errors(), std::vector<std::string>{"Unable to access target page."});
    EXPECT_EQ(beyond->tiff, nullptr);
}

TEST(ScanlineReaderStates, TeardownReleasesTheReadersBlocks) {
    PageSpec p;
    p.photometric = PHOTOMETRIC_PALETTE;
    p.colorMap.assign(768, 7);
    ReadJob job(MakeTiff(OnePage(p)));
    Bytes line(100);
    ASSERT_GT(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 100), 0u);
    zanDestroyTIFF(job.host().ctx());
    EXPECT_EQ(job->frameData, nullptr);
    EXPECT_EQ(job->paletteRed, nullptr);
    EXPECT_EQ(job->stripBuffer, nullptr);
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
}

TEST(ScanlineReaderStates, EveryAllocationOfTheSetUpCanFail) {
    std::vector<Bytes> pages;
    PageSpec palette;
    palette.photometric = PHOTOMETRIC_PALETTE;
    palette.colorMap.assign(768, 7);
    PageSpec rgba = Rgb8();
    rgba.samplesPerPixel = 4;
    PageSpec wide = Rgb8();
    wide.bitsPerSample = 16;
    pages = {MakeTiff(OnePage(palette)), MakeTiff(OnePage(rgba)), MakeTiff(OnePage(wide)), JpegPage(16, 32, 16)};
    for (const Bytes& tiff : pages) {
        for (int n = 1;; ++n) {
            int calls = 0;
            size_t rows = 0;
            {
                ReadJob job(tiff, Source::File);
                job->dropExtraSamples = 1;
                TestAllocator::Reset();
                TestAllocator::FailNthCall(n);
                rows = job.ReadAll().size();
                calls = TestAllocator::Calls();
                if (rows == 0) {
                    EXPECT_FALSE(job.host().Errors().empty()) << n;
                }
            }
            TestAllocator::Reset();
            EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << n;
            if (calls < n) {
                EXPECT_GT(rows, 0u);
                break;
            }
        }
    }
}

}  // namespace
