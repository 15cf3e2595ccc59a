// zanTIFFToFrameBuffer decoding to pixels: the frame a host receives, as
// libtiff decodes the same page, for the RGBA way and the native way, and
// what every call leaves behind, whatever happens.

#include "read_support.h"

namespace {

using namespace zantest;

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
    // The frame and its description, from every source kind.
    PageLayout upsideDown = Page(9, 6, 3, PHOTOMETRIC_RGB);
    upsideDown.orientation = ORIENTATION_BOTLEFT;
    PageLayout mirrored = upsideDown;
    mirrored.orientation = ORIENTATION_TOPRIGHT;
    PageLayout palette = Page(12, 7, 1, PHOTOMETRIC_PALETTE);
    for (int i = 0; i < 768; ++i) palette.colorMap.push_back(static_cast<uint16_t>((i * 97 % 256) * 257));
    const struct Case {
        const char* what;
        PageLayout page;
        uint32_t format, colorSpace, samples, whiteIsZero;
    } cases[] = {
        {"RGB, LZW", Page(37, 21, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW), 8, 8, 3, 0},
        {"RGB tiles", Tiled(Page(40, 37, 3, PHOTOMETRIC_RGB)), 8, 8, 3, 0},
        {"RGB shown top row first", upsideDown, 8, 8, 3, 0},
        {"RGB shown left column first", mirrored, 8, 8, 3, 0},
        {"RGB planes", Page(11, 7, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE), 8, 8, 3, 0},
        {"palette", palette, 8, 8, 3, 0},
        {"CMYK", Page(10, 6, 4, PHOTOMETRIC_SEPARATED), 8, 8, 3, 0},
        {"16-bit RGB cut to 8", Page(10, 6, 3, PHOTOMETRIC_RGB, 16), 8, 8, 3, 0},
        {"grey", Page(13, 9), 14, 2, 1, 0},
        {"min-is-white grey keeps its sense", Page(13, 9, 1, PHOTOMETRIC_MINISWHITE), 13, 2, 1, 1},
        {"4-bit grey", Page(13, 9, 1, PHOTOMETRIC_MINISBLACK, 4), 14, 2, 1, 0},
        {"bilevel", Page(21, 9, 1, PHOTOMETRIC_MINISBLACK, 1, COMPRESSION_PACKBITS), 12, 1, 1, 0},
        {"min-is-white bilevel", Page(21, 9, 1, PHOTOMETRIC_MINISWHITE, 1, COMPRESSION_CCITTFAX4, 1, 9), 11, 1, 1, 1},
    };
    for (const Case& c : cases)
        for (Source source : {Source::Memory, Source::File, Source::StreamBuffer}) {
            SCOPED_TRACE(::testing::Message() << c.what << ", source " << static_cast<int>(source));
            const Bytes tiff = OnePage(c.page);
            ReadJob job(tiff, source);
            uint32_t direct = 0;
            ASSERT_EQ(Decode(job, &direct), 1) << ::testing::PrintToString(job.host().Errors());
            EXPECT_EQ(direct, 0u);
            EXPECT_EQ(std::tuple(job->outputFormat, job->colorSpace, job->outputSamplesPerPixel, job->frameWhiteIsZero),
                      std::tuple(c.format, c.colorSpace, c.samples, c.whiteIsZero));
            EXPECT_EQ(job->outputPlanarConfig, 1u);
            EXPECT_EQ(job->frameWidth, c.page.width);
            EXPECT_EQ(Frame(job), RgbaFrame(tiff, c.format));
        }
}

// The frame of a fixture page's first `samples` samples at `bits` bits (as
// WantRow delivers them), rows top first: pixel by pixel, or plane after
// plane. Three 1-bit planes asked for as a 4-bit palette image become one
// index of their bits, two pixels a byte.
Bytes WantFrame(PageLayout p, uint32_t samples, uint32_t bits, bool planes) {
    Bytes frame;
    if (bits == 4) {
        frame.resize((p.width + 1) / 2 * p.height);
        for (uint32_t i = 0; i < p.width * p.height; ++i) {
            const uint32_t x = i % p.width, y = i / p.width;
            const uint32_t index = PixelValue(0, x, y, 0, 1) << 2 | PixelValue(0, x, y, 1, 1) << 1 | PixelValue(0, x, y, 2, 1);
            frame[y * ((p.width + 1) / 2) + x / 2] |= static_cast<uint8_t>(index << (x % 2 ? 0 : 4));
        }
        return frame;
    }
    p.samplesPerPixel = static_cast<uint16_t>(samples);
    p.planar = planes ? PLANARCONFIG_SEPARATE : PLANARCONFIG_CONTIG;
    for (uint32_t plane = 0; plane < (planes ? samples : 1); ++plane)
        for (uint32_t y = 0; y < p.height; ++y) {
            const Bytes row = WantRow(p, y, bits);
            const size_t n = row.size() / (planes ? samples : 1);
            frame.insert(frame.end(), row.begin() + plane * n, row.begin() + (plane + 1) * n);
        }
    return frame;
}

TEST(FrameDecode, FramesThatKeepTheSamples) {
    // 16-bit frames the RGBA way, the page's own samples the native way, and
    // three 1-bit planes as the 4-bit palette image the host asked for.
    PageLayout rgba16 = Page(10, 6, 4, PHOTOMETRIC_RGB, 16);
    rgba16.extraSamples = {EXTRASAMPLE_UNASSALPHA};
    const PageLayout tiledPlanes = Tiled(Page(20, 18, 3, PHOTOMETRIC_RGB, 16, COMPRESSION_LZW, PLANARCONFIG_SEPARATE));
    PageLayout rgba = Page(9, 7, 4, PHOTOMETRIC_RGB);
    rgba.extraSamples = {EXTRASAMPLE_ASSOCALPHA};
    PageLayout palette = Page(12, 7, 1, PHOTOMETRIC_PALETTE);
    for (int i = 0; i < 768; ++i) palette.colorMap.push_back(static_cast<uint16_t>(i * 85));
    const PageLayout rgb16 = Page(6, 5, 3, PHOTOMETRIC_RGB, 16);
    const struct Case {
        const char* what;
        PageLayout page;
        uint32_t native, outputBits, drop;
        uint32_t format, samples, bits, planar;
    } cases[] = {
        {"16-bit RGB", Page(10, 6, 3, PHOTOMETRIC_RGB, 16, COMPRESSION_LZW), 0, 16, 0, 8, 3, 16, 1},
        {"16-bit RGBA loses its alpha", rgba16, 0, 16, 0, 8, 3, 16, 1},
        {"16-bit RGB planes in tiles", tiledPlanes, 0, 16, 0, 8, 3, 16, 1},
        {"16-bit grey", Page(7, 5, 1, PHOTOMETRIC_MINISBLACK, 16), 0, 16, 0, 14, 1, 16, 1},
        {"16-bit min-is-white grey, as stored", Page(7, 5, 1, PHOTOMETRIC_MINISWHITE, 16), 0, 16, 0, 13, 1, 16, 1},
        {"1-bit RGB planes to a 4-bit palette",
         Page(13, 6, 3, PHOTOMETRIC_RGB, 1, COMPRESSION_NONE, PLANARCONFIG_SEPARATE), 0, 0, 0, 19, 1, 4, 1},
        {"native RGB", Page(9, 7, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW), 1, 8, 0, 8, 3, 8, 1},
        {"native RGB planes", Page(11, 7, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE), 1, 8, 0,
         8, 3, 8, 2},
        {"native, alpha dropped", rgba, 1, 8, 1, 8, 3, 8, 1},
        {"native, alpha kept", rgba, 1, 8, 0, 8, 4, 8, 1},
        {"native palette indices", palette, 1, 8, 0, 19, 1, 8, 1},
        {"native 16 bits kept", rgb16, 1, 16, 0, 17, 3, 16, 1},
        {"native 16 bits as 8", rgb16, 1, 8, 0, 8, 3, 8, 1},
        {"native 1-bit grey", Page(19, 5, 1, PHOTOMETRIC_MINISWHITE, 1), 1, 8, 0, 11, 1, 1, 1},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        ReadJob job(OnePage(c.page));
        job->keepFileLayout = c.native;
        job->outputBitsPerSample = c.outputBits;
        job->dropExtraSamples = c.drop;
        job->requestedFormat = 19;
        job->requestedBitsPerSample = 4;
        job->requestedPaletteBits = 8;
        uint32_t direct = 0;
        ASSERT_EQ(Decode(job, &direct), 1) << ::testing::PrintToString(job.host().Errors());
        EXPECT_EQ(std::tuple(job->outputFormat, job->outputSamplesPerPixel, job->outputBitsPerSample, job->outputPlanarConfig),
                  std::tuple(c.format, c.samples, c.bits, c.planar));
        EXPECT_EQ(Frame(job), WantFrame(c.page, c.samples, c.bits, c.planar == 2));
        if (c.format == 19) {
            EXPECT_EQ(job->outputPaletteBits, c.native ? 16u : 8u);
        }
        if (c.page.photometric == PHOTOMETRIC_PALETTE) {
            ASSERT_NE(job->paletteRed, nullptr);
            EXPECT_EQ(job->paletteBlue[5], c.page.colorMap[512 + 5]);
        }
    }
}

TEST(FrameDecode, RefusalsTheirMessagesAndWhatIsLeft) {
    // No frame, the message, and the state the job was in. 2^16 x 2^14 grey
    // pixels whose Deflate data could hold them: 2^32 bytes of RGBA do not
    // fit in 32 bits.
    const Bytes grey = OnePage(Page(4, 4));
    const struct Case {
        const char* what;
        Bytes tiff;
        int pageNumber;
        uint32_t outputBits, state;
        const char* message;
    } cases[] = {
        {"no such page", grey, 3, 0, 0, "Unable to access the page."},
        {"8 bits to 16", grey, 0, 16, 0, "Compressing from 1, 4, 8 to 16 bits image is not supported."},
        {"4 GiB of RGBA", HugePage(65536, 16384, 1, 8, 1100000), 0, 0, 0, "Buffer size too big"},
        {"byte counts made up from the image size", UncountedPage(0x80000008u, 8), 0, 0, 0,
         "The page's data is too small for the image it describes."},
        {"a page being written", grey, 0, 0, ZAN_STATE_WRITING, "Can not read while writing."},
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
    // A failed call reports, and leaves no frame and no block behind.
    PageLayout palette = Page(12, 7, 1, PHOTOMETRIC_PALETTE);
    palette.colorMap.assign(768, 9);
    for (const Bytes& tiff : {OnePage(Page(9, 7, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW)), OnePage(palette)})
        for (uint32_t native : {0u, 1u})
            FailEachAllocation([&](int n) {
                ReadJob job(tiff, Source::File);
                job->keepFileLayout = native;
                FailAllocation(n);
                uint32_t direct = 0;
                const int result = zanTIFFToFrameBuffer(job.host().ctx(), &direct);
                if (!result) {
                    EXPECT_TRUE(job.Reported());
                    EXPECT_EQ(job->frameData, nullptr);
                }
                return result == 1;
            });
}

TEST(FrameDecode, CorpusFramesAgreeWithLibtiffAndHostileFilesEndCleanly) {
    // Every file decodes or reports; frames equal libtiff's RGBA decode.
    const auto files = CorpusFiles();
    if (files.empty()) GTEST_SKIP() << "corpus not found";
    int compared = 0;
    for (const CorpusFile& file : files) {
        SCOPED_TRACE(file.relpath);
        const Bytes tiff = ReadFileBytes(file.path);
        ReadJob job(tiff);
        job->pageNumber = 1;
        uint32_t direct = 0;
        if (!Decode(job, &direct)) {
            EXPECT_TRUE(job.Reported());
            continue;
        }
        const Bytes want = file.status == "bad" ? Bytes() : RgbaFrame(tiff, job->outputFormat);
        if (want.empty()) continue;
        EXPECT_TRUE(Frame(job) == want);
        ++compared;
    }
    EXPECT_GT(compared, 200);
}

}  // namespace
