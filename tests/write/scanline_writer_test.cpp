// The scanline writer: pages of every colour space and compression read
// back by libtiff and by the module's own reader, the tags of each, and the
// writer's states and refusals.

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <functional>
#include <map>

#include <tiffio.h>

#include "osttiff/osttiff.h"
#include "write_support.h"

namespace {

using namespace zantest;

struct Layout {
    uint32_t colorSpace;
    uint16_t samples, photometric;
    bool alpha;
};

const Layout kLayouts[] = {
    {1, 1, PHOTOMETRIC_MINISBLACK, false}, {2, 1, PHOTOMETRIC_MINISBLACK, false},
    {3, 2, PHOTOMETRIC_MINISBLACK, true},  {4, 4, PHOTOMETRIC_SEPARATED, false},
    {5, 4, PHOTOMETRIC_SEPARATED, false},  {6, 3, PHOTOMETRIC_SEPARATED, false},
    {7, 4, PHOTOMETRIC_RGB, true},         {8, 3, PHOTOMETRIC_RGB, false},
};

uint64_t RowBytes(const Layout& l, uint32_t width, uint32_t bits) {
    if (l.colorSpace == 1) return (width + 7) / 8;
    if (l.colorSpace == 4) return (width + 1) / 2;
    return uint64_t{width} * l.samples * (bits / 8);
}

// Every row the module's reader delivers for the written page.
std::vector<Bytes> ReadBackWithModule(const Bytes& tiff, uint32_t outputBits) {
    TestHost host;
    host->sourceKind = ZAN_SOURCE_MEMORY;
    host->sourceMemory = tiff.data();
    host->sourceMemorySize = static_cast<uint32_t>(tiff.size());
    host->outputBitsPerSample = outputBits;
    std::vector<Bytes> rows;
    Bytes line(1 << 16);
    while (uint32_t n = zanTIFFReadNextScanLine(host.ctx(), line.data(), static_cast<uint32_t>(line.size())))
        rows.emplace_back(line.begin(), line.begin() + n);
    return rows;
}

// One 8-bit page of pattern rows written with what `setup` adds; its bytes.
Bytes WritePage(uint32_t colorSpace, uint32_t width, uint32_t height, uint32_t compression,
                const std::function<void(WriteJob&)>& setup = {}) {
    WriteJob job;
    job.Describe(colorSpace, width, height, compression);
    if (setup) setup(job);
    EXPECT_TRUE(job.WriteRows(PatternRows(height, RowBytes(kLayouts[colorSpace - 1], width, 8))));
    return job.Finish();
}

TEST(ScanlineWriter, EveryColourSpaceAndLosslessCompressionRoundTrips) {
    const uint32_t width = 21, height = 11;
    // Code 9 is no compression.
    const std::map<uint32_t, uint16_t> tagOf = {{1, COMPRESSION_NONE},     {2, COMPRESSION_PACKBITS},
                                                {3, COMPRESSION_CCITTFAX3}, {4, COMPRESSION_CCITTFAX4},
                                                {7, COMPRESSION_LZW},       {9, COMPRESSION_NONE},
                                                {12, COMPRESSION_DEFLATE}};
    for (const Layout& l : kLayouts) {
        const bool bilevel = l.colorSpace == 1 || l.colorSpace == 4;
        const std::vector<uint32_t> compressions =
            l.colorSpace == 1 ? std::vector<uint32_t>{1, 3, 4} : std::vector<uint32_t>{1, 2, 7, 9, 12};
        for (uint32_t bits : bilevel ? std::vector<uint32_t>{8} : std::vector<uint32_t>{8, 16})
            for (uint32_t compression : compressions) {
                SCOPED_TRACE(::testing::Message() << "colour space " << l.colorSpace << ", compression "
                                                  << compression << ", " << bits << " bits");
                WriteJob job;
                job.Describe(l.colorSpace, width, height, compression, bits, bits);
                job->componentCount = 3;
                auto rows = PatternRows(height, RowBytes(l, width, bits));
                if (l.colorSpace == 1)  // fax coding keeps no bits beyond the width
                    for (Bytes& row : rows) row.back() &= static_cast<uint8_t>(0xFF << (8 - width % 8));
                ASSERT_TRUE(job.WriteRows(rows)) << ::testing::PrintToString(job.host().Errors());
                const Bytes tiff = job.Finish();
                PageReader page(tiff);
                ASSERT_NE(page.get(), nullptr);
                EXPECT_EQ(page.U16(TIFFTAG_COMPRESSION), tagOf.at(compression));
                EXPECT_EQ(page.U16(TIFFTAG_SAMPLESPERPIXEL), l.samples);
                EXPECT_EQ(page.U16(TIFFTAG_BITSPERSAMPLE), bilevel ? 1u : bits);
                EXPECT_EQ(page.U16(TIFFTAG_PHOTOMETRIC), l.photometric);
                EXPECT_EQ(page.U16(TIFFTAG_RESOLUTIONUNIT), static_cast<uint32_t>(RESUNIT_INCH));
                EXPECT_EQ(page.Text(TIFFTAG_SOFTWARE), TIFFGetVersionLinePivlo());
                uint16_t count = 0, *kinds = nullptr;
                const bool extra = TIFFGetField(page.get(), TIFFTAG_EXTRASAMPLES, &count, &kinds) && count;
                EXPECT_EQ(extra, l.alpha);
                if (extra) {
                    EXPECT_EQ(kinds[0], EXTRASAMPLE_UNASSALPHA);
                }
                Bytes written;
                for (const Bytes& row : rows) written.insert(written.end(), row.begin(), row.end());
                EXPECT_EQ(DumpPage(tiff, 0).data, written) << "libtiff decodes the lines written";
                const auto back = ReadBackWithModule(tiff, bits);
                ASSERT_EQ(back.size(), height);
                EXPECT_EQ(back[height - 1], rows[height - 1]) << "the module reads them back too";
            }
    }
}

TEST(ScanlineWriter, FaxPagesGetTheirTags) {
    PageReader g3(WritePage(1, 100, 20, 3));
    EXPECT_EQ(g3.U32(TIFFTAG_SUBFILETYPE), static_cast<uint32_t>(FILETYPE_PAGE));
    uint16_t number = 9, of = 9;
    ASSERT_TRUE(TIFFGetField(g3.get(), TIFFTAG_PAGENUMBER, &number, &of));
    EXPECT_EQ(number, 0);
    EXPECT_EQ(of, 1);
    EXPECT_EQ(g3.U16(TIFFTAG_FILLORDER), static_cast<uint32_t>(FILLORDER_LSB2MSB));
    EXPECT_EQ(g3.U32(TIFFTAG_GROUP3OPTIONS), 0u);
    EXPECT_EQ(g3.U32(TIFFTAG_ROWSPERSTRIP), 20u);
    EXPECT_EQ(g3.Text(TIFFTAG_SOFTWARE), TIFFGetVersionLinePivlo()) << "the version came first";
    EXPECT_EQ(g3.U16(TIFFTAG_PHOTOMETRIC), 1u);
    for (uint32_t set : {0u, 1u}) {
        PageReader g4(WritePage(1, 100, 4, 4, [set](WriteJob& job) {
            job->whiteIsZero = 1;
            job->t6OptionsSet = set;
            job->t6Options = 0;
        }));
        EXPECT_EQ(g4.U16(TIFFTAG_PHOTOMETRIC), 0u);
        EXPECT_EQ(g4.U32(TIFFTAG_GROUP4OPTIONS) != 0xFFFFFFFFu, set != 0) << "Group 4 options only when asked";
    }
}

TEST(ScanlineWriter, LzwPredictorIsWrittenWhenAsked) {
    PageReader page(WritePage(2, 8, 4, 7, [](WriteJob& job) { job->lzwPredictor = 2; }));
    EXPECT_EQ(page.U16(TIFFTAG_PREDICTOR), 2u);
}

TEST(ScanlineWriter, JpegColourPagesAreStoredAsYCbCrAndGreyOnesAsGrey) {
    WriteJob job;
    job.Describe(8, 32, 32, 5);
    job->outputSamplingCount = 3;
    job->outputHorizontalSampling[0] = job->outputVerticalSampling[0] = 2;
    job->outputHorizontalSampling[1] = job->outputVerticalSampling[1] = 1;
    job->outputHorizontalSampling[2] = job->outputVerticalSampling[2] = 1;
    std::vector<Bytes> rows(32, Bytes(96));
    for (uint32_t y = 0; y < 32; ++y)
        for (uint32_t x = 0; x < 32; ++x) rows[y][3 * x] = x * 8, rows[y][3 * x + 1] = y * 8, rows[y][3 * x + 2] = 100;
    ASSERT_TRUE(job.WriteRows(rows));
    const Bytes tiff = job.Finish();
    PageReader page(tiff);
    EXPECT_EQ(page.U16(TIFFTAG_PHOTOMETRIC), static_cast<uint32_t>(PHOTOMETRIC_YCBCR));
    uint16_t h = 0, v = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_YCBCRSUBSAMPLING, &h, &v));
    EXPECT_EQ(h, 2);
    EXPECT_EQ(v, 2);
    const auto back = ReadBackWithModule(tiff, 8);
    ASSERT_EQ(back.size(), 32u);
    int worst = 0;
    for (uint32_t y = 0; y < 32; ++y)
        for (size_t i = 0; i < 96; ++i) worst = std::max(worst, std::abs(back[y][i] - rows[y][i]));
    EXPECT_LE(worst, 12) << "within JPEG's error";

    PageReader grey(WritePage(2, 16, 16, 5));
    EXPECT_EQ(grey.U16(TIFFTAG_PHOTOMETRIC), 1u);
    EXPECT_EQ(grey.U16(TIFFTAG_COMPRESSION), static_cast<uint32_t>(COMPRESSION_JPEG));
}

TEST(ScanlineWriter, SixteenBitLinesReduceInPlace) {
    WriteJob job;
    job.Describe(2, 4, 1, 1, 16, 8);
    Bytes line = {0, 1, 2, 3, 4, 5, 6, 7};
    ASSERT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), line.data(), 8), 8u);
    EXPECT_EQ(job->lineBytes, 4u);
    EXPECT_EQ(Bytes(line.begin(), line.begin() + 4), Bytes({1, 3, 5, 7}));
    EXPECT_EQ(DumpPage(job.Finish(), 0).data, Bytes({1, 3, 5, 7}));
}

TEST(ScanlineWriter, ShortLineIsRefusedAndDoesNotAdvance) {
    // A 16-bit line reduced to 8 bits needs its 16-bit bytes.
    struct Case {
        uint32_t colorSpace, width, bits, size, shortSize;
    } cases[] = {{8, 10, 8, 30, 29}, {2, 4, 16, 8, 4}};
    for (const Case& c : cases) {
        WriteJob job;
        job.Describe(c.colorSpace, c.width, 2, 1, c.bits, 8);
        Bytes line(c.size);
        EXPECT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), line.data(), c.shortSize), 0u) << c.bits;
        ASSERT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), line.data(), c.size), c.size) << c.bits;
        EXPECT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), line.data(), c.shortSize), 0u) << c.bits;
        EXPECT_EQ(job->currentRow, 1u);
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>(2, "Incorrect line size."));
    }
}

TEST(ScanlineWriter, CallerTagsWinOverDefaults) {
    WriteJob job;
    job.Describe(8, 10, 10, 1);
    job->outputOrientation = 2;
    ASSERT_EQ(zanTIFFSetField(job.host().ctx(), TIFFTAG_ORIENTATION, 3), 1);
    ASSERT_EQ(zanTIFFSetField(job.host().ctx(), TIFFTAG_ROWSPERSTRIP, 3), 1);
    ASSERT_TRUE(job.WriteRows(PatternRows(10, 30)));
    EXPECT_EQ(zanTIFFSetField(job.host().ctx(), TIFFTAG_ARTIST, "late"), 0);
    EXPECT_EQ(job.host().Warnings(), std::vector<std::string>{"Can't set tiff fields at this state."});
    PageReader page(job.Finish());
    EXPECT_EQ(page.U16(TIFFTAG_ORIENTATION), 3u);
    EXPECT_EQ(page.U32(TIFFTAG_ROWSPERSTRIP), 3u);
}

TEST(ScanlineWriter, RefusalsAndTheirMessages) {
    struct Case {
        uint32_t colorSpace, width, height, compression, bits, outputBits;
        const char* message;
    } cases[] = {
        {0, 4, 4, 1, 8, 8, "Source colorspace not supported."},
        {9, 4, 4, 1, 8, 8, "Source colorspace not supported."},
        {2, 0, 4, 1, 8, 8, "Image dimension can not be zero."},
        {2, 4, 4, 0, 8, 8, "Unrecognized or unset compression."},
        {2, 4, 4, 13, 8, 8, "Unrecognized or unset compression."},
        {1, 4, 4, 2, 8, 8, "G4 and no compression is the only compression method supported for BW."},
        {2, 4, 4, 1, 8, 16, "Compressing from 8 to 16 bits image is not supported."},
        {2, 4, 4, 1, 1, 16, "Compressing from 1 to 16 bits image is not supported."},
    };
    for (const Case& c : cases) {
        WriteJob job;
        job.Describe(c.colorSpace, c.width, c.height, c.compression, c.bits, c.outputBits);
        Bytes line(64);
        EXPECT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), line.data(), 64), 0u);
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_IDLE));
        EXPECT_EQ(job->tiff != nullptr, c.outputBits == 16) << "the 16-bit checks come after the open";
    }
    WriteJob reading;
    reading->state = ZAN_STATE_READING;
    Bytes line(8);
    EXPECT_EQ(zanTIFFWriteNextScanLine(reading.host().ctx(), line.data(), 8), 0u);
    EXPECT_EQ(reading.host().Errors(), std::vector<std::string>{"Cannot write while reading."});
    reading->state = ZAN_STATE_IDLE;
}

TEST(ScanlineWriter, TeardownFinishesThePageAsNextImageWould) {
    auto write = [](bool nextImage) {
        WriteJob job;
        job.Describe(8, 9, 5, 7);
        EXPECT_TRUE(job.WriteRows(PatternRows(5, 27)));
        if (nextImage) {
            EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
        }
        return job.Finish();
    };
    EXPECT_EQ(write(false), write(true));
}

TEST(ScanlineWriter, EveryAllocationCanFailCleanly) {
    for (int n = 1;; ++n) {
        int calls = 0;
        {
            WriteJob job;
            job.Describe(8, 64, 64, 7);
            TestAllocator::Reset();
            TestAllocator::FailNthCall(n);
            const bool written = job.WriteRows(PatternRows(64, 192)) && zanTIFFNextImage(job.host().ctx());
            if (!written) {
                EXPECT_FALSE(job.host().Errors().empty() && job.host().codecErrors.empty()) << n;
            }
            job.Finish();
            calls = TestAllocator::Calls();
        }
        TestAllocator::Reset();
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << n;
        if (calls < n) break;
    }
}

}  // namespace
