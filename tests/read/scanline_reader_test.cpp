// zanTIFFReadNextScanLine: the lines a host receives for every page kind the
// reader takes, from every source kind, and its states and refusals. (JPEG
// pages are compared with libtiff's decode on the corpus files.)

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>

#include <tiffio.h>

#include <unistd.h>

#include "read_support.h"
#include "support/corpus.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

PageSpec Page(uint32_t width, uint32_t height, uint16_t samples = 1, uint16_t photometric = PHOTOMETRIC_MINISBLACK,
              uint16_t bits = 8, uint16_t compression = COMPRESSION_NONE, uint16_t planar = PLANARCONFIG_CONTIG) {
    PageSpec p;
    p.width = width;
    p.height = height;
    p.samplesPerPixel = samples;
    p.photometric = photometric;
    p.bitsPerSample = bits;
    p.compression = compression;
    p.planar = planar;
    p.rowsPerStrip = 4;
    return p;
}

PageSpec Tiled(PageSpec p) {
    p.tileWidth = p.tileHeight = 16;
    return p;
}

Bytes OnePage(const PageSpec& page) {
    FileSpec spec;
    spec.pages[0] = page;
    return MakeTiff(spec);
}

Bytes TwoPagesSecondSevenWide() {
    FileSpec spec;
    spec.pages.assign(2, PageSpec{});
    spec.pages[1].width = 7;
    return MakeTiff(spec);
}

// Row y of a fixture page, sample by sample through `f`.
template <typename F = uint32_t (*)(uint32_t)>
Bytes EachSample(const PageSpec& p, uint32_t y, F f = [](uint32_t v) { return v; }) {
    Bytes row;
    for (uint32_t x = 0; x < p.width; ++x)
        for (uint32_t s = 0; s < p.samplesPerPixel; ++s)
            row.push_back(static_cast<uint8_t>(f(PixelValue(0, x, y, s, p.bitsPerSample))));
    return row;
}

// A YCbCr JPEG page written by libtiff (quality 95).
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
        for (uint32_t x = 0; x < width; ++x) row[3 * x] = x * 4, row[3 * x + 1] = y * 4, row[3 * x + 2] = 128;
        TIFFWriteScanline(tif, row.data(), y, 0);
    }
    TIFFClose(tif);
    return ReadFileBytes(file.path());
}

TEST(ScanlineReader, RowsOfEachPageKindFromEverySource) {
    using Row = Bytes (*)(const PageSpec&, uint32_t);
    const Row asStored = [](const PageSpec& p, uint32_t y) { return EachSample(p, y); };
    const Row highBytes = [](const PageSpec& p, uint32_t y) {
        return EachSample(p, y, [](uint32_t v) { return v >> 8; });
    };
    const Row hostOrder16 = [](const PageSpec& p, uint32_t y) {
        Bytes row;
        for (uint32_t x = 0; x < p.width; ++x)
            for (uint32_t s = 0; s < p.samplesPerPixel; ++s) {
                const uint16_t v = static_cast<uint16_t>(PixelValue(0, x, y, s, 16));
                row.insert(row.end(), reinterpret_cast<const uint8_t*>(&v), reinterpret_cast<const uint8_t*>(&v) + 2);
            }
        return row;
    };
    const Row widened = [](const PageSpec& p, uint32_t y) {  // 2 bits times 85, 4 bits times 17
        return EachSample(p, y, [&](uint32_t v) { return v * (255 / ((1u << p.bitsPerSample) - 1)); });
    };
    const Row planeByPlane = [](const PageSpec& p, uint32_t y) {
        Bytes row;
        for (uint32_t s = 0; s < p.samplesPerPixel; ++s)
            for (uint32_t x = 0; x < p.width; ++x) row.push_back(static_cast<uint8_t>(PixelValue(0, x, y, s, 8)));
        return row;
    };
    const Row packed = [](const PageSpec& p, uint32_t y) {
        Bytes row((p.width + 7) / 8);
        for (uint32_t x = 0; x < p.width; ++x)
            row[x / 8] |= static_cast<uint8_t>(PixelValue(0, x, y, 0, 1) << (7 - x % 8));
        return row;
    };
    const auto rgb = [](uint16_t bits, uint16_t compression = COMPRESSION_NONE, uint16_t planar = PLANARCONFIG_CONTIG) {
        return Page(13, 9, 3, PHOTOMETRIC_RGB, bits, compression, planar);
    };
    struct Case {
        const char* what;
        PageSpec page;
        uint32_t outputBits;
        Row row;
        bool streamBufferToo = true;  // see the note below
    } cases[] = {
        {"RGB", rgb(8), 0, asStored},
        {"RGB, LZW", rgb(8, COMPRESSION_LZW), 0, asStored},
        {"RGB, PackBits", rgb(8, COMPRESSION_PACKBITS), 0, asStored},
        {"16 bits kept", rgb(16), 16, hostOrder16},
        {"16 bits reduced", rgb(16), 8, highBytes},
        {"anything but 16 delivers 8 bits", rgb(16), 0, highBytes},
        {"2-bit grey", Page(11, 8, 1, PHOTOMETRIC_MINISBLACK, 2), 0, widened},
        {"4-bit grey", Page(11, 8, 1, PHOTOMETRIC_MINISBLACK, 4), 0, widened},
        {"five inks are no extra samples", Page(3, 2, 5, PHOTOMETRIC_SEPARATED), 0, asStored},
        {"separate planes one after another", rgb(8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE), 0, planeByPlane, false},
        {"tiles", Tiled(Page(40, 37, 3, PHOTOMETRIC_RGB)), 0, asStored},
        {"tiles of separate planes",
         Tiled(Page(40, 37, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE)), 0, planeByPlane},
        {"bilevel Group 4, packed", Page(20, 8, 1, PHOTOMETRIC_MINISWHITE, 1, COMPRESSION_CCITTFAX4), 0, packed},
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
            for (uint32_t y = 0; y < c.page.height; ++y) EXPECT_EQ(rows[y], c.row(c.page, y)) << "row " << y;
        }
}

// A palette page whose ColorMap is `map` (256 entries a table).
Bytes PalettePage(std::vector<uint16_t> map) {
    PageSpec p = Page(6, 2, 1, PHOTOMETRIC_PALETTE);
    p.colorMap = std::move(map);
    return OnePage(p);
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

TEST(ScanlineReader, AlphaIsDividedOutAndExtraSamplesDroppedOnRequest) {
    // A fourth sample counts as alpha whether ExtraSamples calls it
    // associated alpha or the page has no ExtraSamples tag at all, from a
    // source read once (where the directory cannot be looked at again) as
    // from any other.
    for (bool tagged : {true, false})
        for (uint32_t drop : {0u, 1u})
        for (Source source : {Source::Memory, Source::StreamBuffer}) {
            SCOPED_TRACE(::testing::Message() << (tagged ? "tagged" : "untagged") << ", drop " << drop
                                              << ", source " << static_cast<int>(source));
            PageSpec p = Page(4, 2, 4, PHOTOMETRIC_RGB);
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
            EXPECT_EQ(described.ReadAll(), rows) << "describing first changes nothing";
            ASSERT_EQ(rows.size(), 2u);
            ASSERT_EQ(rows[1].size(), drop ? 12u : 16u);
            const Bytes s = EachSample(p, 1);
            const float a = static_cast<float>(s[3] / 255.0);
            for (int c = 0; c < 3; ++c)
                EXPECT_EQ(rows[1][c], static_cast<uint8_t>(static_cast<int>(std::trunc(s[c] / a + 0.5f))));
            if (!drop) {
                EXPECT_EQ(rows[1][3], s[3]) << "alpha stays";
            }
        }
}

TEST(ScanlineReader, PageNumberIsHonouredWithoutGetInfo) {
    ReadJob job(TwoPagesSecondSevenWide());
    job->pageNumber = 2;
    const auto rows = job.ReadAll();
    ASSERT_EQ(rows.size(), 8u);
    EXPECT_EQ(rows[0].size(), 7u);
}

// An uncompressed or LZW YCbCr page written by libtiff with `subsampling`,
// in tiles or strips; its stored blocks hold a smooth pattern.
Bytes YCbCrPage(uint16_t subsampling, bool tiled, uint16_t compression = COMPRESSION_NONE) {
    TempFile file;
    TIFF* tif = TIFFOpen(file.c_str(), "w");
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, 37);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, 21);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 3);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_YCBCR);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, compression);
    TIFFSetField(tif, TIFFTAG_YCBCRSUBSAMPLING, subsampling >> 4, subsampling & 15);
    if (tiled) {
        TIFFSetField(tif, TIFFTAG_TILEWIDTH, 16);
        TIFFSetField(tif, TIFFTAG_TILELENGTH, 16);
    } else {
        TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, 8);
    }
    // Blocks of h x v luma samples and their two chroma samples.
    const uint32_t h = subsampling >> 4, v = subsampling & 15;
    const uint32_t width = tiled ? 16 : 37, rows = tiled ? 16 : 8;
    const auto size = static_cast<tmsize_t>((width + h - 1) / h * ((rows + v - 1) / v) * (h * v + 2));
    const uint32_t blocks = tiled ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif);
    for (uint32_t b = 0; b < blocks; ++b) {
        Bytes data(static_cast<size_t>(size));
        for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(96 + (i * 7 + b * 13) % 64);
        if (tiled) TIFFWriteEncodedTile(tif, b, data.data(), size);
        else TIFFWriteEncodedStrip(tif, b, data.data(), size);
    }
    TIFFClose(tif);
    return ReadFileBytes(file.path());
}

// libtiff's RGBA decode of the first page, top row first, as RGB rows.
std::vector<Bytes> LibtiffRgbRows(const Bytes& tiff) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    uint32_t width = 0, height = 0;
    TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &width);
    TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &height);
    std::vector<uint32_t> raster(static_cast<size_t>(width) * height);
    std::vector<Bytes> rows;
    if (TIFFReadRGBAImageOriented(tif, width, height, raster.data(), ORIENTATION_TOPLEFT, 0))
        for (uint32_t y = 0; y < height; ++y) {
            Bytes row;
            for (uint32_t x = 0; x < width; ++x) {
                const uint32_t v = raster[static_cast<size_t>(y) * width + x];
                row.insert(row.end(), {static_cast<uint8_t>(TIFFGetR(v)), static_cast<uint8_t>(TIFFGetG(v)),
                                       static_cast<uint8_t>(TIFFGetB(v))});
            }
            rows.push_back(row);
        }
    TIFFClose(tif);
    return rows;
}

TEST(ScanlineReader, YCbCrPagesOtherThanJpegComeAsRgb) {
    // Subsampled blocks in tiles and strips, and old-style JPEG pages (one
    // strip, several strips) of the corpus: every line as libtiff's RGBA
    // decode shows it, and nothing read beyond a buffer.
    std::vector<std::pair<std::string, Bytes>> pages = {
        {"tiles, 2x2", YCbCrPage(0x22, true)},
        {"strips, 2x1, LZW", YCbCrPage(0x21, false, COMPRESSION_LZW)},
        {"strips, 1x1", YCbCrPage(0x11, false)},
    };
    if (!CorpusDir().empty())
        for (const char* name : {"pillow/old-style-jpeg-compression.tif", "libtiff/ojpeg_chewey_subsamp21_multi_strip.tiff"})
            pages.emplace_back(name, ReadFileBytes(CorpusDir() + "/" + name));
    for (const auto& [what, tiff] : pages) {
        SCOPED_TRACE(what);
        const auto want = LibtiffRgbRows(tiff);
        ASSERT_FALSE(want.empty());
        ReadJob job(tiff);
        const auto rows = job.ReadAll();
        EXPECT_EQ(job->lineBytes, job->imageWidth * 3);
        EXPECT_EQ(rows, want) << ::testing::PrintToString(job.host().Errors()) ;
    }
}

TEST(ScanlineReader, FileTruncatedWhileReadingGivesAReadError) {
    // The file is read through its stream, so the host that truncates it
    // meets a failed read, not a fault.
    PageSpec p = Page(64, 64, 3, PHOTOMETRIC_RGB);
    p.rowsPerStrip = 1;
    ReadJob job(OnePage(p), Source::File);
    ASSERT_EQ(job.GetInfo(), 1);
    Bytes line(1024);
    ASSERT_GT(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 1024), 0u);
    ASSERT_EQ(truncate(job.path().c_str(), 256), 0);
    uint32_t delivered = 1;
    while (delivered < 64 && zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 1024) > 0) ++delivered;
    EXPECT_LT(delivered, 64u);
    EXPECT_TRUE(!job.host().Errors().empty() || !job.host().codecErrors.empty());
}

TEST(ScanlineReaderStates, RefusalsAndTheEndOfThePage) {
    ReadJob job(OnePage(Page(13, 9, 3, PHOTOMETRIC_RGB)));
    Bytes line(64);
    auto read = [&](uint32_t size) { return zanTIFFReadNextScanLine(job.host().ctx(), line.data(), size); };
    job->state = ZAN_STATE_WRITING;
    EXPECT_EQ(read(64), 0u);
    job->state = ZAN_STATE_PAGE_CLOSED;
    EXPECT_EQ(read(64), 0u);
    job->state = ZAN_STATE_IDLE;
    EXPECT_EQ(job.host().Errors(),
              (std::vector<std::string>{"Can not read while writing.", "Wrong state in zanTIFFReadNextScanLine."}));
    job.host().ClearMessages();
    ASSERT_EQ(read(64), 39u);
    EXPECT_EQ(read(38), 0u);
    EXPECT_EQ(job->currentRow, 1u) << "a short buffer does not advance";
    for (int y = 1; y < 9; ++y) ASSERT_EQ(read(64), 39u);
    EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_READING));
    EXPECT_EQ(read(64), 0u);
    EXPECT_EQ(read(10), 0u);
    EXPECT_EQ(job.host().Errors(), (std::vector<std::string>{"Not enough space in line buffer.",
                                                              "No more lines to read.",
                                                              "Not enough space in line buffer."}));
}

// A Deflate page of `width` x `height` pixels whose single strip holds
// `stripBytes` bytes of no meaning.
Bytes HugePage(uint32_t width, uint32_t height, uint16_t samples, uint16_t bits, uint32_t stripBytes) {
    BuiltPage page;
    page.entries = {LongEntry(256, {width}), LongEntry(257, {height}), ShortEntry(258, std::vector<uint16_t>(samples, bits)),
                    ShortEntry(259, {COMPRESSION_ADOBE_DEFLATE}), ShortEntry(262, {PHOTOMETRIC_MINISBLACK}),
                    ShortEntry(277, {samples}), LongEntry(278, {height})};
    page.strips = {Bytes(stripBytes, 0x55)};
    return BuildTiff({page});
}

TEST(ScanlineReaderStates, PagesItCannotTakeAreRefusedWithTheirMessages) {
    PageSpec palette16 = Page(16, 8, 1, PHOTOMETRIC_PALETTE, 16);
    palette16.colorMap.assign(3 * 65536, 0);
    PageSpec fourSamplePalette = Page(16, 8, 4, PHOTOMETRIC_PALETTE, 8);  // would overrun the RGB work line
    fourSamplePalette.colorMap.assign(3 * 256, 0);
    struct Case {
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
        // The reader closes what it opened itself; a page described by
        // zanTIFFGetInfo stays open and described.
        EXPECT_EQ(job->tiff != nullptr, c.describedFirst);
        if (c.describedFirst) {
            EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_DESCRIBED));
        }
    }
}

TEST(ScanlineReaderStates, FailedDescriptionEndsTheJob) {
    // A page asked for while another is being read, and one that does not
    // exist: the job is closed and idle, and a read starts afresh.
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
    EXPECT_EQ(zanTIFFReadNextScanLine(job.host().ctx(), line.data(), 64), 7u) << "a read opens the page again";
    // A job that writes pages has no page to describe.
    ReadJob writing(TwoPagesSecondSevenWide());
    writing->state = ZAN_STATE_WRITING;
    EXPECT_EQ(writing.GetInfo(), 0);
    EXPECT_EQ(writing.host().Errors(), std::vector<std::string>{"Can not read while writing."});
    writing->state = ZAN_STATE_IDLE;
}

TEST(ScanlineReaderStates, EveryAllocationOfDescriptionAndSetUpCanFail) {
    // Page kinds whose set-up allocates differently, and a page whose texts
    // and profile the description copies; described first or not.
    PageSpec palette = Page(16, 8, 1, PHOTOMETRIC_PALETTE);
    palette.colorMap.assign(768, 7);
    PageSpec texts;
    texts.description = "d";
    texts.documentName = "n";
    texts.iccProfile = Bytes(16, 1);
    const Bytes pages[] = {OnePage(palette), OnePage(Page(13, 9, 4, PHOTOMETRIC_RGB)),
                           OnePage(Page(13, 9, 3, PHOTOMETRIC_RGB, 16)), JpegPage(16, 32, 16), OnePage(texts)};
    for (const Bytes& tiff : pages)
        for (bool describeFirst : {true, false})
            for (int n = 1;; ++n) {
                int calls = 0;
                size_t rows = 0;
                {
                    ReadJob job(tiff, Source::File);
                    job->dropExtraSamples = 1;
                    TestAllocator::Reset();
                    TestAllocator::FailNthCall(n);
                    const bool described = !describeFirst || job.GetInfo() == 1;
                    if (described) rows = job.ReadAll().size();
                    calls = TestAllocator::Calls();
                    if (rows == 0) {
                        EXPECT_FALSE(job.host().Errors().empty()) << n;
                    }
                    if (!described) {
                        EXPECT_EQ(job->tiff, nullptr) << n << ": a failed description closes the page";
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

}  // namespace
