// The scanline writer: pages of every colour space and compression read
// back by libtiff and by the module's own reader, the tags of each, and the
// writer's states and refusals.

#include <gtest/gtest.h>

#include <cmath>
#include <map>

#include <tiffio.h>

#include "osttiff/osttiff.h"
#include "write_support.h"

namespace {

using namespace zantest;

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

TEST(ScanlineWriter, EveryColourSpaceAndLosslessCompressionRoundTrips) {
    // libtiff and the module read the lines back, under each layout's tags;
    // bi-level pages also min-is-white with Group 4 options asked.
    const struct Layout {
        uint32_t colorSpace, samples;
        const char* photometric;
        bool alpha;
    } layouts[] = {
        {1, 1, "min-is-black", false}, {2, 1, "min-is-black", false}, {3, 2, "min-is-black", true},
        {4, 4, "separated", false},    {5, 4, "separated", false},    {6, 3, "separated", false},
        {7, 4, "RGB color", true},     {8, 3, "RGB color", false},
    };
    const uint32_t width = 21, height = 11;
    const std::map<uint32_t, std::string> nameOf = {{1, "None"}, {2, "PackBits"}, {3, "CCITT Group 3"},
                                                    {4, "CCITT Group 4"}, {7, "LZW"}, {9, "None"}, {12, "Deflate"}};
    for (const Layout& l : layouts) {
        const bool bilevel = l.colorSpace == 1 || l.colorSpace == 4;
        const std::vector<uint32_t> compressions =
            l.colorSpace == 1 ? std::vector<uint32_t>{1, 3, 4} : std::vector<uint32_t>{1, 2, 7, 9, 12};
        for (uint32_t variant : bilevel ? std::vector<uint32_t>{0, 1} : std::vector<uint32_t>{8, 16})
            for (uint32_t compression : compressions) {
                const uint32_t bits = bilevel ? 8 : variant;
                const bool white = bilevel && variant == 1;
                SCOPED_TRACE(::testing::Message() << "colour space " << l.colorSpace << ", compression "
                                                  << compression << ", " << variant);
                WriteJob job;
                job.Describe(l.colorSpace, width, height, compression, bits, bits);
                job->componentCount = 3;
                job->lzwPredictor = bilevel ? 0 : 2;
                job->whiteIsZero = job->t6OptionsSet = white;
                job->outputXResolution = job->outputYResolution = 72;
                const uint64_t rowBytes = l.colorSpace == 1 ? (width + 7) / 8
                                          : l.colorSpace == 4 ? (width + 1) / 2
                                                              : uint64_t{width} * l.samples * (bits / 8);
                auto rows = PatternRows(height, rowBytes);
                if (l.colorSpace == 1)  // fax coding keeps no bits beyond the width
                    for (Bytes& row : rows) row.back() &= static_cast<uint8_t>(0xFF << (8 - width % 8));
                ASSERT_TRUE(job.WriteRows(rows)) << ::testing::PrintToString(job.host().Errors());
                const Bytes tiff = job.Finish();
                std::vector<std::string> lines = {
                    "Compression Scheme: " + nameOf.at(compression), "Samples/Pixel: " + std::to_string(l.samples),
                    "Bits/Sample: " + std::to_string(bilevel ? 1 : bits),
                    std::string("Photometric Interpretation: ") +
                        (white && l.colorSpace == 1 ? "min-is-white" : l.photometric),
                    "Resolution: 72, 72 pixels/inch", std::string("Software: ") + TIFFGetVersionLinePivlo()};
                std::vector<std::string> absent;
                auto listedIf = [&](bool listed, const std::string& line) {
                    if (listed) lines.push_back(line);
                    else absent.push_back(line.substr(0, line.find(':')));
                };
                listedIf(l.alpha, "Extra Samples: 1<unassoc-alpha>");
                listedIf(compression == 7 && !bilevel, "Predictor: horizontal differencing 2 (0x2)");
                listedIf(compression == 4 && white, "Group 4 Options: (0 = 0x0)");
                if (compression == 3)  // a fax page (the Software set first stays)
                    for (const char* line : {"Subfile Type: multi-page document (2 = 0x2)", "Page Number: 0-1",
                                             "FillOrder: lsb-to-msb", "Group 3 Options: (0 = 0x0)", "Rows/Strip: 11"})
                        lines.push_back(line);
                const PageDump page = DumpPage(tiff, 0);
                ExpectListing(page.tags, lines, absent);
                EXPECT_EQ(page.data, Joined(rows));
                const auto back = ReadBackWithModule(tiff, bits);
                ASSERT_EQ(back.size(), height);
                EXPECT_EQ(back[height - 1], rows[height - 1]);
            }
    }
}

TEST(ScanlineWriter, JpegColourPagesAreStoredAsYCbCrAndGreyOnesAsGrey) {
    // Colour lines come back within JPEG's error, subsampled as the host asked.
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
    ExpectListing(DumpPage(tiff, 0).tags, {"Photometric Interpretation: YCbCr", "YCbCr Subsampling: 2, 2"});
    const auto back = ReadBackWithModule(tiff, 8);
    ASSERT_EQ(back.size(), 32u);
    int worst = 0;
    for (uint32_t y = 0; y < 32; ++y)
        for (size_t i = 0; i < 96; ++i) worst = std::max(worst, std::abs(back[y][i] - rows[y][i]));
    EXPECT_LE(worst, 12);

    WriteJob grey;
    grey.Describe(2, 16, 16, 5);
    ASSERT_TRUE(grey.WriteRows(PatternRows(16, 16)));
    ExpectListing(DumpPage(grey.Finish(), 0).tags,
                  {"Compression Scheme: JPEG", "Photometric Interpretation: min-is-black"});
}

TEST(ScanlineWriter, ShortLinesAreRefusedAndSixteenBitOnesReducedInPlace) {
    // Short lines are refused without advancing (a 16-bit line needs its 16-bit
    // bytes); the host's line holds its reduction to 8 bits.
    struct Case {
        uint32_t colorSpace, width, bits, size, shortSize;
    } cases[] = {{8, 10, 8, 30, 29}, {2, 4, 16, 8, 4}};
    for (const Case& c : cases) {
        SCOPED_TRACE(c.bits);
        WriteJob job;
        job.Describe(c.colorSpace, c.width, 2, 1, c.bits, 8);
        const Bytes line = PatternRows(1, c.size)[0], kept = c.bits == 16 ? HighBytes(line) : line;
        Bytes first = line, second = line;
        EXPECT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), first.data(), c.shortSize), 0u);
        ASSERT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), first.data(), c.size), c.size);
        EXPECT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), second.data(), c.shortSize), 0u);
        EXPECT_EQ(job->currentRow, 1u);
        EXPECT_EQ(job->lineBytes, kept.size());
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>(2, "Incorrect line size."));
        EXPECT_EQ(Bytes(first.begin(), first.begin() + kept.size()), kept);
        ASSERT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), second.data(), c.size), c.size);
        EXPECT_EQ(DumpPage(job.Finish(), 0).data, Joined({kept, kept}));
    }
}

TEST(ScanlineWriter, CallerTagsWinOverDefaults) {
    // Tags set before the first line stay; later ones are refused with a warning.
    WriteJob job;
    job.Describe(8, 10, 10, 1);
    job->outputOrientation = 2;
    ASSERT_EQ(zanTIFFSetField(job.host().ctx(), TIFFTAG_ORIENTATION, 3), 1);
    ASSERT_EQ(zanTIFFSetField(job.host().ctx(), TIFFTAG_ROWSPERSTRIP, 3), 1);
    ASSERT_TRUE(job.WriteRows(PatternRows(10, 30)));
    EXPECT_EQ(zanTIFFSetField(job.host().ctx(), TIFFTAG_ARTIST, "late"), 0);
    EXPECT_EQ(job.host().Warnings(), std::vector<std::string>{"Can't set tiff fields at this state."});
    ExpectListing(DumpPage(job.Finish(), 0).tags, {"Orientation: row 0 bottom, col 0 rhs", "Rows/Strip: 3"},
                  {"Artist"});
}

TEST(ScanlineWriter, RefusalsAndTheirMessages) {
    // A refused first line names the reason and leaves the state as it was.
    struct Case {
        uint32_t colorSpace, width, compression, bits, outputBits, state;
        const char* message;
    } cases[] = {
        {0, 4, 1, 8, 8, ZAN_STATE_IDLE, "Source colorspace not supported."},
        {9, 4, 1, 8, 8, ZAN_STATE_IDLE, "Source colorspace not supported."},
        {2, 0, 1, 8, 8, ZAN_STATE_IDLE, "Image dimension can not be zero."},
        {2, 4, 0, 8, 8, ZAN_STATE_IDLE, "Unrecognized or unset compression."},
        {2, 4, 13, 8, 8, ZAN_STATE_IDLE, "Unrecognized or unset compression."},
        {1, 4, 2, 8, 8, ZAN_STATE_IDLE, "G4 and no compression is the only compression method supported for BW."},
        {2, 4, 1, 8, 16, ZAN_STATE_IDLE, "Compressing from 8 to 16 bits image is not supported."},
        {2, 4, 1, 1, 16, ZAN_STATE_IDLE, "Compressing from 1 to 16 bits image is not supported."},
        {2, 4, 1, 8, 8, ZAN_STATE_READING, "Cannot write while reading."},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.message);
        WriteJob job;
        job.Describe(c.colorSpace, c.width, 4, c.compression, c.bits, c.outputBits);
        job->state = c.state;
        Bytes line(64);
        EXPECT_EQ(zanTIFFWriteNextScanLine(job.host().ctx(), line.data(), 64), 0u);
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(job->state, c.state);
        EXPECT_EQ(job->tiff != nullptr, c.outputBits == 16) << "the 16-bit checks come after the open";
        job->state = ZAN_STATE_IDLE;
    }
}

TEST(ScanlineWriter, EveryAllocationCanFailCleanly) {
    // A failed allocation is reported and leaks nothing.
    SweepAllocations(
        [] {
            auto job = std::make_unique<WriteJob>();
            job->Describe(8, 64, 64, 7);
            return job;
        },
        [](WriteJob& job, int) {
            const bool written = job.WriteRows(PatternRows(64, 192)) && zanTIFFNextImage(job.host().ctx());
            job.Finish();
            return written;
        });
}

}  // namespace
