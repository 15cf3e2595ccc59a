// zanTIFFToFrameBuffer decoding to pixels: the frame a host receives, as
// libtiff decodes the same page, for the RGBA way and the native way, and
// what every call leaves behind, whatever happens.

#include <gtest/gtest.h>

#include <tiffio.h>

#include <cstring>

#include "read_support.h"
#include "support/corpus.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

PageSpec Page(uint32_t width, uint32_t height, uint16_t samples, uint16_t photometric, uint16_t bits = 8,
              uint16_t compression = COMPRESSION_NONE, uint16_t planar = PLANARCONFIG_CONTIG) {
    PageSpec p;
    p.width = width;
    p.height = height;
    p.samplesPerPixel = samples;
    p.photometric = photometric;
    p.bitsPerSample = bits;
    p.compression = compression;
    p.planar = planar;
    p.rowsPerStrip = 5;
    return p;
}

Bytes OnePage(const PageSpec& page) {
    FileSpec spec;
    spec.pages[0] = page;
    return MakeTiff(spec);
}

// The frame libtiff's RGBA decode gives for `tiff`, packed as the host's
// frame of `format` (8 RGB, 13/14 grey, 11/12 bilevel): what the RGBA way
// must deliver. Grey and bilevel frames of min-is-white pages hold
// min-is-white values.
Bytes RgbaFrame(const Bytes& tiff, uint32_t format) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    uint32_t w = 0, h = 0;
    TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &w);
    TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &h);
    std::vector<uint32_t> raster(static_cast<size_t>(w) * h);
    const bool ok = TIFFReadRGBAImageOriented(tif, w, h, raster.data(), ORIENTATION_TOPLEFT, 0);
    TIFFClose(tif);
    if (!ok) return {};
    const bool minIsWhite = format == 11 || format == 13;
    Bytes frame;
    if (format == 11 || format == 12) frame.assign((w + 7) / 8 * h, 0);
    for (uint32_t y = 0; y < h; ++y)
        for (uint32_t x = 0; x < w; ++x) {
            const uint32_t v = raster[static_cast<size_t>(y) * w + x];
            if (format == 8) {
                frame.insert(frame.end(), {static_cast<uint8_t>(TIFFGetR(v)), static_cast<uint8_t>(TIFFGetG(v)),
                                           static_cast<uint8_t>(TIFFGetB(v))});
            } else if (format == 13 || format == 14) {
                frame.push_back(static_cast<uint8_t>(minIsWhite ? 255 - TIFFGetR(v) : TIFFGetR(v)));
            } else if ((TIFFGetR(v) >= 128) != minIsWhite) {
                frame[(w + 7) / 8 * y + x / 8] |= static_cast<uint8_t>(0x80 >> (x % 8));
            }
        }
    return frame;
}

// The page's own samples as libtiff decodes its strips: contiguous rows, or
// the planes one after another.
Bytes StoredFrame(const Bytes& tiff) {
    Bytes frame;
    for (const DecodedPage& page : {DecodeWithLibtiff(tiff)[0]}) frame = page.pixels;
    return frame;
}

// The first `keep` samples of every pixel of `samples`-sample pixels of
// `sampleBytes` bytes each.
Bytes KeepSamples(const Bytes& frame, uint32_t samples, uint32_t keep, uint32_t sampleBytes) {
    Bytes kept;
    for (size_t at = 0; at < frame.size(); at += samples * sampleBytes)
        kept.insert(kept.end(), frame.begin() + at, frame.begin() + at + keep * sampleBytes);
    return kept;
}

// 16-bit samples reduced to their high bytes.
Bytes HighBytes(const Bytes& frame) {
    Bytes high;
    for (size_t i = 0; i + 1 < frame.size(); i += 2) {
        uint16_t v;
        std::memcpy(&v, &frame[i], 2);
        high.push_back(static_cast<uint8_t>(v >> 8));
    }
    return high;
}

// Runs the call and checks its promise: the codec object closed, the source
// released, the job idle.
int Decode(ReadJob& job, uint32_t* direct) {
    const int result = zanTIFFToFrameBuffer(job.host().ctx(), direct);
    EXPECT_EQ(job->tiff, nullptr);
    EXPECT_EQ(job->fileHandle, nullptr);
    EXPECT_EQ(job->streamBuffer, nullptr);
    EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_IDLE));
    return result;
}

Bytes Frame(ReadJob& job) {
    const auto* data = static_cast<const uint8_t*>(job->frameData);
    return data ? Bytes(data, data + job->frameBufferSize) : Bytes();
}

TEST(FrameDecode, RgbaFramesAreLibtiffsDecodePacked) {
    PageSpec tiles = Page(40, 37, 3, PHOTOMETRIC_RGB);
    tiles.tileWidth = tiles.tileHeight = 16;
    PageSpec upsideDown = Page(9, 6, 3, PHOTOMETRIC_RGB);
    upsideDown.orientation = ORIENTATION_BOTLEFT;
    PageSpec mirrored = upsideDown;
    mirrored.orientation = ORIENTATION_TOPRIGHT;
    PageSpec palette = Page(12, 7, 1, PHOTOMETRIC_PALETTE);
    for (int i = 0; i < 768; ++i) palette.colorMap.push_back(static_cast<uint16_t>((i * 97 % 256) * 257));
    PageSpec bilevelWhite = Page(21, 9, 1, PHOTOMETRIC_MINISWHITE, 1, COMPRESSION_CCITTFAX4);
    bilevelWhite.rowsPerStrip = 9;
    const struct Case {
        const char* what;
        PageSpec page;
        uint32_t format, colorSpace, samples, whiteIsZero;
    } cases[] = {
        {"RGB, LZW", Page(37, 21, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW), 8, 8, 3, 0},
        {"RGB tiles", tiles, 8, 8, 3, 0},
        {"RGB shown top row first", upsideDown, 8, 8, 3, 0},
        {"RGB shown left column first", mirrored, 8, 8, 3, 0},
        {"RGB planes", Page(11, 7, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE), 8, 8, 3, 0},
        {"palette", palette, 8, 8, 3, 0},
        {"CMYK", Page(10, 6, 4, PHOTOMETRIC_SEPARATED), 8, 8, 3, 0},
        {"16-bit RGB cut to 8", Page(10, 6, 3, PHOTOMETRIC_RGB, 16), 8, 8, 3, 0},
        {"grey", Page(13, 9, 1, PHOTOMETRIC_MINISBLACK), 14, 2, 1, 0},
        {"min-is-white grey keeps its sense", Page(13, 9, 1, PHOTOMETRIC_MINISWHITE), 13, 2, 1, 1},
        {"4-bit grey", Page(13, 9, 1, PHOTOMETRIC_MINISBLACK, 4), 14, 2, 1, 0},
        {"bilevel", Page(21, 9, 1, PHOTOMETRIC_MINISBLACK, 1, COMPRESSION_PACKBITS), 12, 1, 1, 0},
        {"min-is-white bilevel", bilevelWhite, 11, 1, 1, 1},
    };
    for (const Case& c : cases)
        for (Source source : {Source::Memory, Source::File, Source::StreamBuffer}) {
            SCOPED_TRACE(::testing::Message() << c.what << ", source " << static_cast<int>(source));
            const Bytes tiff = OnePage(c.page);
            ReadJob job(tiff, source);
            uint32_t direct = 0;
            ASSERT_EQ(Decode(job, &direct), 1) << ::testing::PrintToString(job.host().Errors());
            EXPECT_EQ(direct, 0u);
            EXPECT_EQ(job->outputFormat, c.format);
            EXPECT_EQ(job->colorSpace, c.colorSpace);
            EXPECT_EQ(job->outputSamplesPerPixel, c.samples);
            EXPECT_EQ(job->outputPlanarConfig, 1u);
            if (c.samples == 1) {
                EXPECT_EQ(job->frameWhiteIsZero, c.whiteIsZero);
            }
            EXPECT_EQ(job->frameWidth, c.page.width);
            EXPECT_EQ(Frame(job), RgbaFrame(tiff, c.format));
        }
}

TEST(FrameDecode, SixteenBitFramesKeepTheSamples) {
    PageSpec rgba = Page(10, 6, 4, PHOTOMETRIC_RGB, 16);
    rgba.extraSamples = {EXTRASAMPLE_UNASSALPHA};
    PageSpec tiledPlanes = Page(20, 18, 3, PHOTOMETRIC_RGB, 16, COMPRESSION_LZW, PLANARCONFIG_SEPARATE);
    tiledPlanes.tileWidth = tiledPlanes.tileHeight = 16;
    const struct Case {
        const char* what;
        PageSpec page;
        uint32_t format, samples;
    } cases[] = {
        {"RGB", Page(10, 6, 3, PHOTOMETRIC_RGB, 16, COMPRESSION_LZW), 8, 3},
        {"RGBA loses its alpha", rgba, 8, 3},
        {"RGB planes in tiles", tiledPlanes, 8, 3},
        {"grey", Page(7, 5, 1, PHOTOMETRIC_MINISBLACK, 16), 14, 1},
        {"min-is-white grey", Page(7, 5, 1, PHOTOMETRIC_MINISWHITE, 16), 13, 1},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        const Bytes tiff = OnePage(c.page);
        ReadJob job(tiff);
        job->outputBitsPerSample = 16;
        uint32_t direct = 0;
        ASSERT_EQ(Decode(job, &direct), 1) << ::testing::PrintToString(job.host().Errors());
        EXPECT_EQ(job->outputFormat, c.format);
        EXPECT_EQ(job->outputBitsPerSample, 16u);
        Bytes want;
        for (uint32_t y = 0; y < c.page.height; ++y)
            for (uint32_t x = 0; x < c.page.width; ++x)
                for (uint32_t s = 0; s < c.samples; ++s) {
                    const auto v = static_cast<uint16_t>(PixelValue(0, x, y, s, 16));
                    want.insert(want.end(), reinterpret_cast<const uint8_t*>(&v), reinterpret_cast<const uint8_t*>(&v) + 2);
                }
        EXPECT_EQ(Frame(job), want) << "as stored, a min-is-white frame too";
    }
}

TEST(FrameDecode, NativeFramesAreThePagesOwnSamples) {
    PageSpec rgba = Page(9, 7, 4, PHOTOMETRIC_RGB);
    rgba.extraSamples = {EXTRASAMPLE_ASSOCALPHA};
    PageSpec palette = Page(12, 7, 1, PHOTOMETRIC_PALETTE);
    for (int i = 0; i < 768; ++i) palette.colorMap.push_back(static_cast<uint16_t>(i * 85));
    const auto planes = Page(11, 7, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE);
    const struct Case {
        const char* what;
        PageSpec page;
        uint32_t outputBits, drop;
        uint32_t format, samples, bits, planar;
        Bytes (*expect)(const Bytes& stored);
    } cases[] = {
        {"RGB", Page(9, 7, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW), 8, 0, 8, 3, 8, 1, [](const Bytes& s) { return s; }},
        {"RGB planes", planes, 8, 0, 8, 3, 8, 2, [](const Bytes& s) { return s; }},
        {"alpha dropped", rgba, 8, 1, 8, 3, 8, 1, [](const Bytes& s) { return KeepSamples(s, 4, 3, 1); }},
        {"alpha kept", rgba, 8, 0, 8, 4, 8, 1, [](const Bytes& s) { return s; }},
        {"palette indices", palette, 8, 0, 19, 1, 8, 1, [](const Bytes& s) { return s; }},
        {"16 bits kept", Page(6, 5, 3, PHOTOMETRIC_RGB, 16), 16, 0, 17, 3, 16, 1, [](const Bytes& s) { return s; }},
        {"16 bits as 8", Page(6, 5, 3, PHOTOMETRIC_RGB, 16), 8, 0, 8, 3, 8, 1, HighBytes},
        {"1-bit grey", Page(19, 5, 1, PHOTOMETRIC_MINISWHITE, 1), 8, 0, 11, 1, 1, 1, [](const Bytes& s) { return s; }},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        const Bytes tiff = OnePage(c.page);
        ReadJob job(tiff);
        job->keepFileLayout = 1;
        job->outputBitsPerSample = c.outputBits;
        job->dropExtraSamples = c.drop;
        uint32_t direct = 0;
        ASSERT_EQ(Decode(job, &direct), 1) << ::testing::PrintToString(job.host().Errors());
        EXPECT_EQ(job->outputFormat, c.format);
        EXPECT_EQ(job->outputSamplesPerPixel, c.samples);
        EXPECT_EQ(job->outputBitsPerSample, c.bits);
        EXPECT_EQ(job->outputPlanarConfig, c.planar);
        EXPECT_EQ(Frame(job), c.expect(StoredFrame(tiff)));
        if (c.page.photometric == PHOTOMETRIC_PALETTE) {
            ASSERT_NE(job->paletteRed, nullptr);
            EXPECT_EQ(job->paletteBlue[5], c.page.colorMap[512 + 5]);
            EXPECT_EQ(job->outputPaletteBits, 16u);
        }
    }
}

TEST(FrameDecode, OneBitRgbPlanesBecomeA4BitPalette) {
    const PageSpec page = Page(13, 6, 3, PHOTOMETRIC_RGB, 1, COMPRESSION_NONE, PLANARCONFIG_SEPARATE);
    ReadJob job(OnePage(page));
    job->requestedFormat = 19;
    job->requestedBitsPerSample = 4;
    job->requestedPaletteBits = 8;
    uint32_t direct = 0;
    ASSERT_EQ(Decode(job, &direct), 1) << ::testing::PrintToString(job.host().Errors());
    EXPECT_EQ(job->outputFormat, 19u);
    EXPECT_EQ(job->outputBitsPerSample, 4u);
    EXPECT_EQ(job->outputPaletteBits, 8u);
    const Bytes frame = Frame(job);
    ASSERT_EQ(frame.size(), 7u * 6);
    for (uint32_t y = 0; y < 6; ++y)
        for (uint32_t x = 0; x < 13; ++x) {
            const uint32_t index = (frame[y * 7 + x / 2] >> (x % 2 ? 0 : 4)) & 15;
            const uint32_t want = PixelValue(0, x, y, 0, 1) << 2 | PixelValue(0, x, y, 1, 1) << 1 | PixelValue(0, x, y, 2, 1);
            EXPECT_EQ(index, want) << x << "," << y;
        }
}

TEST(FrameDecode, RefusalsTheirMessagesAndWhatIsLeft) {
    // 2^16 x 2^14 grey pixels whose Deflate data could hold them: 2^32
    // bytes of RGBA do not fit in 32 bits.
    BuiltPage wide;
    wide.entries = {LongEntry(256, {65536}), LongEntry(257, {16384}), ShortEntry(258, {8}),
                    ShortEntry(259, {COMPRESSION_ADOBE_DEFLATE}), ShortEntry(262, {1}), ShortEntry(277, {1}),
                    LongEntry(278, {16384})};
    wide.strips = {Bytes(1100000, 0)};
    const struct Case {
        const char* what;
        Bytes tiff;
        int pageNumber;
        uint32_t outputBits, state;
        const char* message;
    } cases[] = {
        {"no such page", OnePage(Page(4, 4, 1, PHOTOMETRIC_MINISBLACK)), 3, 0, 0, "Unable to access the page."},
        {"8 bits to 16", OnePage(Page(4, 4, 1, PHOTOMETRIC_MINISBLACK)), 0, 16, 0,
         "Compressing from 1, 4, 8 to 16 bits image is not supported."},
        {"4 GiB of RGBA", BuildTiff({wide}), 0, 0, 0, "Buffer size too big"},
        {"a page being written", OnePage(Page(4, 4, 1, PHOTOMETRIC_MINISBLACK)), 0, 0, ZAN_STATE_WRITING,
         "Can not read while writing."},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        ReadJob job(c.tiff);
        job->pageNumber = c.pageNumber;
        job->outputBitsPerSample = c.outputBits;
        job->state = c.state;
        uint32_t direct = 0;
        EXPECT_EQ(zanTIFFToFrameBuffer(job.host().ctx(), &direct), 0);
        EXPECT_EQ(job.host().Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(job->frameData, nullptr);
        EXPECT_EQ(job->state, c.state);
        job->state = ZAN_STATE_IDLE;
    }
}

TEST(FrameDecode, EveryAllocationCanFailCleanly) {
    PageSpec palette = Page(12, 7, 1, PHOTOMETRIC_PALETTE);
    palette.colorMap.assign(768, 9);
    const Bytes pages[] = {OnePage(Page(9, 7, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW)), OnePage(palette)};
    for (const Bytes& tiff : pages)
        for (uint32_t native : {0u, 1u})
            for (int n = 1;; ++n) {
                int calls = 0, result = 0;
                {
                    ReadJob job(tiff, Source::File);
                    job->keepFileLayout = native;
                    TestAllocator::Reset();
                    TestAllocator::FailNthCall(n);
                    uint32_t direct = 0;
                    result = zanTIFFToFrameBuffer(job.host().ctx(), &direct);
                    calls = TestAllocator::Calls();
                    if (!result) {
                        EXPECT_FALSE(job.host().Errors().empty() && job.host().codecErrors.empty()) << n;
                        EXPECT_EQ(job->frameData, nullptr) << n;
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

TEST(FrameDecode, CorpusFramesAgreeWithLibtiffAndHostileFilesEndCleanly) {
    const auto files = CorpusFiles();
    if (files.empty()) GTEST_SKIP() << "corpus not found";
    int compared = 0;
    for (const CorpusFile& file : files) {
        const Bytes tiff = ReadFileBytes(file.path);
        ReadJob job(tiff);
        job->pageNumber = 1;
        uint32_t direct = 0;
        if (!Decode(job, &direct)) {
            EXPECT_TRUE(!job.host().Errors().empty() || !job.host().codecErrors.empty()) << file.relpath;
            continue;
        }
        if (file.status == "bad") continue;
        const Bytes want = RgbaFrame(tiff, job->outputFormat);
        if (want.empty()) continue;
        const Bytes got = Frame(job);
        ASSERT_EQ(got.size(), want.size()) << file.relpath;
        int worst = 0;
        for (size_t i = 0; i < got.size(); ++i) worst = std::max(worst, std::abs(got[i] - want[i]));
        EXPECT_EQ(worst, 0) << file.relpath;
        ++compared;
    }
    EXPECT_GT(compared, 200);
}

}  // namespace
