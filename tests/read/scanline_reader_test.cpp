// zanTIFFReadNextScanLine: the lines a host receives for every page kind the
// reader takes, from every source kind, and its states and refusals. (JPEG
// pages are compared with libtiff's decode on the corpus files.)

#include <unistd.h>

#include <cmath>

#include "read_support.h"

namespace {

using namespace zantest;

Bytes TwoPagesSecondSevenWide() {
    FileLayout layout;
    layout.pages = {Page(16, 8), Page(7, 8)};
    return MakeTiff(layout);
}

TEST(ScanlineReader, RowsOfEachPageKindFromEverySource) {
    // Every line as the page's samples say, from every source kind.
    const auto rgb = [](uint16_t bits, uint16_t compression = COMPRESSION_NONE, uint16_t planar = PLANARCONFIG_CONTIG) {
        return Page(13, 9, 3, PHOTOMETRIC_RGB, bits, compression, planar);
    };
    const struct Case {
        const char* what;
        PageLayout page;
        uint32_t outputBits;
        bool streamBufferToo = true;  // see the note below
    } cases[] = {
        {"RGB", rgb(8), 0},
        {"RGB, LZW", rgb(8, COMPRESSION_LZW), 0},
        {"RGB, PackBits", rgb(8, COMPRESSION_PACKBITS), 0},
        {"16 bits kept", rgb(16), 16},
        {"16 bits reduced", rgb(16), 8},
        {"anything but 16 delivers 8 bits", rgb(16), 0},
        {"2-bit grey", Page(11, 8, 1, PHOTOMETRIC_MINISBLACK, 2), 0},
        {"4-bit grey", Page(11, 8, 1, PHOTOMETRIC_MINISBLACK, 4), 0},
        {"five inks are no extra samples", Page(3, 2, 5, PHOTOMETRIC_SEPARATED), 0},
        {"separate planes one after another", rgb(8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE), 0, false},
        {"tiles", Tiled(Page(40, 37, 3, PHOTOMETRIC_RGB)), 0},
        {"tiles of separate planes", Tiled(Page(40, 37, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE)), 0},
        {"bilevel Group 4, packed", Page(20, 8, 1, PHOTOMETRIC_MINISWHITE, 1, COMPRESSION_CCITTFAX4), 0},
    };
    // A stream buffer source is read once and forward only: the planes of a
    // page cannot be gone back to.
    for (const Case& c : cases)
        for (Source source : {Source::Memory, Source::File, Source::Callbacks, Source::StreamBuffer}) {
            if (source == Source::StreamBuffer && !c.streamBufferToo) continue;
            SCOPED_TRACE(::testing::Message() << c.what << ", source " << static_cast<int>(source));
            ReadJob job(OnePage(c.page), source);
            job->outputBitsPerSample = c.outputBits;
            job->dropExtraSamples = 1;
            const auto rows = job.ReadAll();
            ASSERT_EQ(rows.size(), c.page.height) << ::testing::PrintToString(job.host().Errors());
            for (uint32_t y = 0; y < c.page.height; ++y) EXPECT_EQ(rows[y], WantRow(c.page, y, c.outputBits)) << y;
        }
}

TEST(ScanlineReader, PaletteEntriesAreScaledOnlyWhenWide) {
    // Entries of at most 255 are used as they are; wider ones are scaled.
    PageLayout p = Page(6, 2, 1, PHOTOMETRIC_PALETTE);
    const auto index = static_cast<uint8_t>(PixelValue(0, 1, 0, 0, 8));
    std::vector<uint16_t> narrow(768), wide(768, 0);
    for (int i = 0; i < 768; ++i) narrow[i] = static_cast<uint16_t>(i % 256);
    wide[index] = 65535;
    wide[256 + index] = 257;
    wide[512 + index] = 256;
    for (const auto& [map, want] : {std::pair{narrow, Bytes(3, index)}, std::pair{wide, Bytes{255, 1, 0}}}) {
        p.colorMap = map;
        ReadJob job(OnePage(p));
        const auto rows = job.ReadAll();
        ASSERT_EQ(rows.size(), 2u);
        EXPECT_EQ(job->lineBytes, 18u);
        EXPECT_EQ(Bytes(rows[0].begin() + 3, rows[0].begin() + 6), want);
    }
}

TEST(ScanlineReader, AlphaIsDividedOutAndExtraSamplesDroppedOnRequest) {
    // A fourth sample counts as alpha whether ExtraSamples calls it
    // associated alpha or the page has no ExtraSamples tag at all, from a
    // source read once (where the directory cannot be looked at again) as
    // from any other; describing the page first changes nothing.
    for (bool tagged : {true, false})
        for (uint32_t drop : {0u, 1u})
            for (Source source : {Source::Memory, Source::StreamBuffer}) {
                SCOPED_TRACE(::testing::Message() << (tagged ? "tagged" : "untagged") << ", drop " << drop
                                                  << ", source " << static_cast<int>(source));
                PageLayout p = Page(4, 2, 4, PHOTOMETRIC_RGB);
                if (tagged) p.extraSamples = {EXTRASAMPLE_ASSOCALPHA};
                ReadJob described(OnePage(p), source);
                described->dropExtraSamples = drop;
                ASSERT_EQ(described.GetInfo(), 1);
                EXPECT_EQ(described->samplesPerPixel, drop ? 3u : 4u);
                EXPECT_EQ(described->extraSamples, drop ? 0u : 1u);
                EXPECT_EQ(described->imageType, static_cast<uint32_t>(ZAN_IMAGE_RGB));
                ReadJob job(OnePage(p), source);
                job->dropExtraSamples = drop;
                const auto rows = job.ReadAll();
                EXPECT_EQ(job->alphaSampleIndex, 3u);
                EXPECT_EQ(described.ReadAll(), rows);
                ASSERT_EQ(rows.size(), 2u);
                ASSERT_EQ(rows[1].size(), drop ? 12u : 16u);
                const Bytes s = WantRow(p, 1);
                const float a = static_cast<float>(s[3] / 255.0);
                for (int c = 0; c < 3; ++c)
                    EXPECT_EQ(rows[1][c], static_cast<uint8_t>(static_cast<int>(std::trunc(s[c] / a + 0.5f))));
                if (!drop) {
                    EXPECT_EQ(rows[1][3], s[3]) << "alpha stays";
                }
            }
}

// An uncompressed or LZW YCbCr page written by libtiff with `subsampling`,
// in tiles or strips; its stored blocks hold a smooth pattern.
Bytes YCbCrPage(uint16_t subsampling, bool tiled, uint16_t compression = COMPRESSION_NONE) {
    TempFile file;
    TIFF* tif = TIFFOpen(file.c_str(), "w");
    const uint32_t h = subsampling >> 4, v = subsampling & 15, width = tiled ? 16 : 37, rows = tiled ? 16 : 8;
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, 37);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, 21);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 3);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_YCBCR);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, compression);
    TIFFSetField(tif, TIFFTAG_YCBCRSUBSAMPLING, h, v);
    TIFFSetField(tif, tiled ? TIFFTAG_TILEWIDTH : TIFFTAG_ROWSPERSTRIP, tiled ? 16 : 8);
    if (tiled) TIFFSetField(tif, TIFFTAG_TILELENGTH, 16);
    // Blocks of h x v luma samples and their two chroma samples.
    Bytes data((width + h - 1) / h * ((rows + v - 1) / v) * (h * v + 2));
    for (uint32_t b = 0; b < (tiled ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif)); ++b) {
        for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(96 + (i * 7 + b * 13) % 64);
        if (tiled) TIFFWriteEncodedTile(tif, b, data.data(), static_cast<tmsize_t>(data.size()));
        else TIFFWriteEncodedStrip(tif, b, data.data(), static_cast<tmsize_t>(data.size()));
    }
    TIFFClose(tif);
    return ReadFileBytes(file.path());
}

TEST(ScanlineReader, YCbCrPagesOtherThanJpegComeAsRgb) {
    // Subsampled blocks in tiles and strips, and old-style JPEG pages (one
    // strip, several strips) of the corpus: every line as libtiff's RGBA
    // decode shows it, and nothing read beyond a buffer.
    std::vector<std::pair<std::string, Bytes>> pages = {{"tiles, 2x2", YCbCrPage(0x22, true)},
                                                        {"strips, 2x1, LZW", YCbCrPage(0x21, false, COMPRESSION_LZW)},
                                                        {"strips, 1x1", YCbCrPage(0x11, false)}};
    if (!CorpusDir().empty())
        for (const char* name : {"pillow/old-style-jpeg-compression.tif", "libtiff/ojpeg_chewey_subsamp21_multi_strip.tiff"})
            pages.emplace_back(name, ReadFileBytes(CorpusDir() + "/" + name));
    for (const auto& [what, tiff] : pages) {
        SCOPED_TRACE(what);
        const Bytes want = RgbaFrame(tiff, 8);
        ASSERT_FALSE(want.empty());
        ReadJob job(tiff);
        Bytes lines;
        for (const Bytes& row : job.ReadAll()) lines.insert(lines.end(), row.begin(), row.end());
        EXPECT_EQ(job->lineBytes, job->imageWidth * 3);
        EXPECT_TRUE(lines == want) << ::testing::PrintToString(job.host().Errors());
    }
}

TEST(ScanlineReader, FileTruncatedWhileReadingGivesAReadError) {
    // The file is read through its stream, so the host that truncates it
    // meets a failed read, not a fault.
    ReadJob job(OnePage(Page(64, 64, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_NONE, PLANARCONFIG_CONTIG, 1)), Source::File);
    ASSERT_EQ(job.GetInfo(), 1);
    Bytes line(1024);
    ASSERT_GT(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 1024), 0u);
    ASSERT_EQ(truncate(job.path().c_str(), 256), 0);
    uint32_t delivered = 1;
    while (delivered < 64 && zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 1024) > 0) ++delivered;
    EXPECT_LT(delivered, 64u);
    EXPECT_TRUE(job.Reported());
}

TEST(ScanlineReaderStates, RefusalsAndTheEndOfThePage) {
    // Wrong states, a short buffer (the row is not consumed) and reading past
    // the last row are refused with their messages.
    ReadJob job(OnePage(Page(13, 9, 3, PHOTOMETRIC_RGB)));
    Bytes line(64);
    auto read = [&](uint32_t size) { return zanTIFFReadNextScanLine(job.host().ctx(), line.data(), size); };
    job->state = ZAN_STATE_WRITING;
    EXPECT_EQ(read(64), 0u);
    job->state = ZAN_STATE_PAGE_CLOSED;
    EXPECT_EQ(read(64), 0u);
    job->state = ZAN_STATE_IDLE;
    ASSERT_EQ(read(64), 39u);
    EXPECT_EQ(read(38), 0u);
    EXPECT_EQ(job->currentRow, 1u);
    for (int y = 1; y < 9; ++y) ASSERT_EQ(read(64), 39u);
    EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_READING));
    EXPECT_EQ(read(64), 0u);
    EXPECT_EQ(read(10), 0u);
    EXPECT_EQ(job.host().Errors(),
              (std::vector<std::string>{"Can not read while writing.", "Wrong state in zanTIFFReadNextScanLine.",
                                        "Not enough space in line buffer.", "No more lines to read.",
                                        "Not enough space in line buffer."}));
}

TEST(ScanlineReaderStates, PagesItCannotTakeAreRefusedWithTheirMessages) {
    // No line and the message; the reader closes what it opened itself, and a
    // page described by zanTIFFGetInfo stays open and described.
    PageLayout palette16 = Page(16, 8, 1, PHOTOMETRIC_PALETTE, 16);
    palette16.colorMap.assign(3 * 65536, 0);
    PageLayout fourSamplePalette = Page(16, 8, 4, PHOTOMETRIC_PALETTE, 8);  // would overrun the RGB work line
    fourSamplePalette.colorMap.assign(3 * 256, 0);
    const struct Case {
        Bytes tiff;
        int pageNumber;
        bool describedFirst;
        const char* message;
    } cases[] = {
        {OnePage(Page(13, 9, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW, PLANARCONFIG_SEPARATE)), 0, false,
         "Line processing not supported for compressed planar tiff."},
        {TwoPagesSecondSevenWide(), 3, false, "Unable to access target page."},
        {OnePage(Page(16, 8, 1, PHOTOMETRIC_MINISBLACK, 32)), 0, true,
         "Only supports 2, 4(palette), 2, 4, 8, 16 or 1 bitspersample."},
        {OnePage(palette16), 0, true, "Only supports 2 or 4 or 8 bit per sample palette tiff."},
        {OnePage(fourSamplePalette), 0, false, "Palette tiff with more than one sample per pixel not supported."},
        // A tiny file that claims 4 GiB of pixels, and one whose line of
        // two 4-bit samples a pixel widens to more than 4 GiB.
        {HugePage(65535, 65535, 1, 8, 64), 0, false, "The page's data is too small for the image it describes."},
        // A small file whose byte counts libtiff makes up from the image size.
        {UncountedPage(65535, 65535), 0, false, "The page's data is too small for the image it describes."},
        {HugePage(0x80000001u, 1, 2, 4, 2100000), 0, false, "A line of the page is larger than 4 GiB."},
        {YCbCrPage(0x14, false), 0, true, "Unable to convert the page's YCbCr samples to RGB."},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.message);
        ReadJob job(c.tiff);
        job->pageNumber = c.pageNumber;
        if (c.describedFirst) {
            ASSERT_EQ(job.GetInfo(), 1);
        }
        EXPECT_TRUE(job.ReadAll().empty());
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(job->tiff != nullptr, c.describedFirst);
        EXPECT_EQ(job->state, static_cast<uint32_t>(c.describedFirst ? ZAN_STATE_DESCRIBED : ZAN_STATE_IDLE));
    }
}

TEST(ScanlineReaderStates, FailedDescriptionEndsTheJob) {
    // A page asked for while another is being read, and one that does not
    // exist: the job is closed and idle, and a read starts afresh with the
    // page asked for. A job that writes pages has no page to describe.
    ReadJob job(TwoPagesSecondSevenWide());
    Bytes line(64);
    ASSERT_GT(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 64), 0u);
    job->pageNumber = 3;
    EXPECT_EQ(job.GetInfo(), 0);
    EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_IDLE));
    EXPECT_EQ(job->tiff, nullptr);
    EXPECT_EQ(job->stripBuffer, nullptr);
    EXPECT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 64), 0u);
    EXPECT_EQ(job.host().Errors(),
              (std::vector<std::string>{"Unable to access target page.", "Unable to access target page."}));
    job->pageNumber = 2;
    const auto rows = job.ReadAll();
    ASSERT_EQ(rows.size(), 8u);
    EXPECT_EQ(rows[0].size(), 7u);
    ReadJob writing(TwoPagesSecondSevenWide());
    writing->state = ZAN_STATE_WRITING;
    EXPECT_EQ(writing.GetInfo(), 0);
    EXPECT_EQ(writing.host().Errors(), std::vector<std::string>{"Can not read while writing."});
    writing->state = ZAN_STATE_IDLE;
}

TEST(ScanlineReaderStates, EveryAllocationOfDescriptionAndSetUpCanFail) {
    // Page kinds whose set-up allocates differently, and a page whose texts
    // and profile the description copies; described first or not. A failed
    // description closes the page; a failed read reports.
    PageLayout palette = Page(16, 8, 1, PHOTOMETRIC_PALETTE);
    palette.colorMap.assign(768, 7);
    PageLayout texts = Page(16, 8);
    texts.description = "d";
    texts.documentName = "n";
    texts.iccProfile = Bytes(16, 1);
    const Bytes pages[] = {OnePage(palette), OnePage(Page(13, 9, 4, PHOTOMETRIC_RGB)),
                           OnePage(Page(13, 9, 3, PHOTOMETRIC_RGB, 16)), MakeJpegTiff({.width = 16, .height = 32}),
                           OnePage(texts)};
    for (const Bytes& tiff : pages)
        for (bool describeFirst : {true, false})
            FailEachAllocation([&](int n) {
                ReadJob job(tiff, Source::File);
                job->dropExtraSamples = 1;
                FailAllocation(n);
                const bool described = !describeFirst || job.GetInfo() == 1;
                const size_t rows = described ? job.ReadAll().size() : 0;
                if (rows == 0) {
                    EXPECT_FALSE(job.host().Errors().empty());
                }
                if (!described) {
                    EXPECT_EQ(job->tiff, nullptr);
                }
                return rows > 0;
            });
}

}  // namespace
