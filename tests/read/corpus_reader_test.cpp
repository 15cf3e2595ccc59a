// Third-party files through zanTIFFGetInfo and the scanline reader: the
// description agrees with libtiff, the lines agree with libtiff's own decode,
// and hostile files end with a result and a message.

#include <cstdlib>

#include "read_support.h"

namespace {

using namespace zantest;

// What libtiff says of the first page.
struct LibtiffPage {
    uint32_t width = 0, height = 0;
    uint16_t bits = 1, samples = 1, photometric = 0, planar = 1, compression = 1, orientation = 1, unit = 2;
    float xres = 0, yres = 0;
    bool hasXres = false;
    std::vector<uint32_t> rgba;  // libtiff's RGBA decode, top row first; empty when it cannot
    Bytes stored;                // 8- and 16-bit contiguous pages: the rows, from whole strips or tiles
};

// The page's rows assembled from whole strips or tiles decoded by libtiff.
Bytes AssembleRows(TIFF* tif, uint32_t width, uint32_t height) {
    const auto rowSize = static_cast<size_t>(TIFFScanlineSize(tif));
    Bytes image(rowSize * height);
    uint32_t tw = width, th = 0;
    const bool tiled = TIFFIsTiled(tif);
    TIFFGetField(tif, TIFFTAG_TILEWIDTH, &tw);
    TIFFGetFieldDefaulted(tif, tiled ? TIFFTAG_TILELENGTH : TIFFTAG_ROWSPERSTRIP, &th);
    th = std::min(th, height);
    Bytes block(static_cast<size_t>(tiled ? TIFFTileSize(tif) : TIFFStripSize(tif)));
    const size_t pixel = rowSize / width;
    for (uint32_t ty = 0; ty < height; ty += th)
        for (uint32_t tx = 0; tx < width; tx += tw) {
            if ((tiled ? TIFFReadTile(tif, block.data(), tx, ty, 0, 0)
                       : TIFFReadEncodedStrip(tif, ty / th, block.data(), static_cast<tmsize_t>(block.size()))) < 0)
                return {};
            for (uint32_t y = ty; y < std::min(height, ty + th); ++y)
                std::copy_n(block.begin() + static_cast<size_t>(y - ty) * tw * pixel, std::min(tw, width - tx) * pixel,
                            image.begin() + static_cast<size_t>(y) * rowSize + tx * pixel);
        }
    return image;
}

LibtiffPage ReadWithLibtiff(const std::string& path) {
    LibtiffPage page;
    const TIFFErrorHandler e = TIFFSetErrorHandler(nullptr), w = TIFFSetWarningHandler(nullptr);
    if (TIFF* tif = TIFFOpen(path.c_str(), "r")) {
        TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &page.width);
        TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &page.height);
        TIFFGetFieldDefaulted(tif, TIFFTAG_BITSPERSAMPLE, &page.bits);
        TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLESPERPIXEL, &page.samples);
        TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &page.photometric);
        TIFFGetFieldDefaulted(tif, TIFFTAG_PLANARCONFIG, &page.planar);
        TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &page.compression);
        TIFFGetFieldDefaulted(tif, TIFFTAG_ORIENTATION, &page.orientation);
        TIFFGetFieldDefaulted(tif, TIFFTAG_RESOLUTIONUNIT, &page.unit);
        page.hasXres = TIFFGetField(tif, TIFFTAG_XRESOLUTION, &page.xres) != 0;
        TIFFGetField(tif, TIFFTAG_YRESOLUTION, &page.yres);
        const uint64_t pixels = uint64_t{page.width} * page.height;
        const bool decode = pixels > 0 && pixels <= (20u << 20);
        if (decode && page.planar == PLANARCONFIG_CONTIG && (page.bits == 8 || page.bits == 16) &&
            page.compression != COMPRESSION_JPEG && page.compression != COMPRESSION_OJPEG)
            page.stored = AssembleRows(tif, page.width, page.height);
        page.rgba.resize(decode ? static_cast<size_t>(pixels) : 0);
        if (decode && !TIFFReadRGBAImageOriented(tif, page.width, page.height, page.rgba.data(), ORIENTATION_TOPLEFT, 0))
            page.rgba.clear();
        TIFFClose(tif);
    }
    TIFFSetErrorHandler(e);
    TIFFSetWarningHandler(w);
    return page;
}

// The colour the host's line says pixel x has, as libtiff's RGBA would show
// it (grey repeated, min-is-white inverted), or false for kinds libtiff
// converts in ways the reader does not (alpha, CMYK, Lab, ...). YCbCr pages
// come as RGB, as libtiff's RGBA shows them.
bool LineColour(const ConversionContext* ctx, uint16_t photometric, const Bytes& line, uint32_t x, int rgb[3]) {
    const uint32_t bits = ctx->bitsPerSample;
    if (photometric == PHOTOMETRIC_PALETTE || (photometric == PHOTOMETRIC_RGB && bits != 1) ||
        photometric == PHOTOMETRIC_YCBCR) {
        for (uint32_t c = 0; c < 3; ++c) rgb[c] = line[ctx->planarConfig == 2 ? c * ctx->imageWidth + x : x * 3 + c];
        return true;
    }
    if (photometric != PHOTOMETRIC_MINISBLACK && photometric != PHOTOMETRIC_MINISWHITE) return false;
    int v = bits != 1 ? line[x] : (line[x / 8] >> (7 - x % 8)) & 1 ? 255 : 0;
    if (photometric == PHOTOMETRIC_MINISWHITE) v = 255 - v;
    rgb[0] = rgb[1] = rgb[2] = v;
    return true;
}

// The largest difference of the reader's rows from libtiff's: from the
// samples as stored (16-bit ones by their high byte) when `stored`, else from
// libtiff's RGBA decode; -1 when the page cannot be compared.
int WorstDifference(ReadJob& lines, const LibtiffPage& want, bool stored, const std::vector<Bytes>& rows) {
    int worst = 0;
    if (stored) {
        const size_t row = want.stored.size() / want.height;
        for (uint32_t y = 0; y < want.height; ++y)
            for (size_t i = 0; i < rows[y].size(); ++i) {
                const uint8_t* at = &want.stored[y * row + i * (want.bits / 8)];
                uint16_t v16 = *at;
                if (want.bits == 16) std::memcpy(&v16, at, 2);
                worst = std::max(worst, std::abs(rows[y][i] - (want.bits == 16 ? v16 >> 8 : *at)));
            }
        return worst;
    }
    if (want.rgba.empty()) return -1;
    for (uint32_t y = 0; y < want.height; ++y)
        for (uint32_t x = 0; x < want.width; ++x) {
            int rgb[3];
            if (!LineColour(lines.host().ctx(), want.photometric, rows[y], x, rgb)) return -1;
            const uint32_t pixel = want.rgba[static_cast<size_t>(y) * want.width + x];
            for (int c = 0; c < 3; ++c) worst = std::max(worst, std::abs(rgb[c] - static_cast<int>((pixel >> (8 * c)) & 0xFF)));
        }
    return worst;
}

TEST(CorpusReader, DescriptionsAndLinesAgreeWithLibtiffAndHostileFilesEnd) {
    // The host sees what libtiff sees of every file, or a message.
    const auto files = CorpusFiles();
    if (files.empty()) GTEST_SKIP() << "corpus not found";
    int described = 0, compared = 0;
    for (const CorpusFile& file : files) {
        SCOPED_TRACE(file.relpath);
        const Bytes tiff = ReadFileBytes(file.path);
        if (file.status == "bad") {
            // Hostile files: a result and a message, from any source.
            for (Source source : {Source::Memory, Source::StreamBuffer}) {
                ReadJob job(tiff, source);
                job->outputBitsPerSample = 16;
                if (!job.GetInfo()) {
                    EXPECT_FALSE(job.host().Errors().empty());
                } else if (uint64_t{job->imageWidth} * job->imageHeight <= (64u << 20)) {  // time, not safety
                    EXPECT_TRUE(job.ReadAll().size() == job->imageHeight || job.Reported());
                }
            }
            continue;
        }
        const LibtiffPage want = ReadWithLibtiff(file.path);
        ReadJob job(tiff);
        job->pageNumber = 1;
        if (!job.GetInfo()) {
            // Only pages the description cannot serve: no photometric, BigTIFF
            // offsets beyond 4 GiB and the like; always with a message.
            EXPECT_FALSE(job.host().Errors().empty());
            continue;
        }
        ++described;
        EXPECT_EQ(job->imageWidth, want.width);
        EXPECT_EQ(job->imageHeight, want.height);
        EXPECT_EQ(job->bitsPerSample, want.bits);
        EXPECT_EQ(job->samplesPerPixel, want.samples);
        EXPECT_EQ(job->planarConfig, want.planar == 1 ? 1u : 2u);
        if (want.compression == COMPRESSION_LZW || want.compression == COMPRESSION_JPEG) {
            EXPECT_EQ(job->compression, want.compression == COMPRESSION_LZW ? 7u : 5u);
        }
        if (want.hasXres) {
            // Pixels per inch and the unit's code (0 none, 1 inch, 2 cm); the stored value stays.
            const float scale = want.unit == RESUNIT_NONE ? 0.0f : want.unit == RESUNIT_CENTIMETER ? 2.54f : 1.0f;
            EXPECT_FLOAT_EQ(job->xResolution, want.xres * scale);
            EXPECT_FLOAT_EQ(job->yResolution, want.yres * scale);
            EXPECT_FLOAT_EQ(job->fileXResolution, want.xres);
            EXPECT_EQ(job->resolutionUnit, want.unit == RESUNIT_NONE ? 0u : want.unit == RESUNIT_CENTIMETER ? 2u : 1u);
        }

        // The lines, as 8-bit samples without extra samples; a page the
        // reader does not take ends with a message.
        ReadJob lines(tiff);
        lines->pageNumber = 1;
        lines->outputBitsPerSample = 8;
        lines->dropExtraSamples = 1;
        if (!lines.GetInfo()) continue;
        const auto rows = lines.ReadAll();
        if (rows.size() != lines->imageHeight) {
            EXPECT_TRUE(lines.Reported());
            continue;
        }
        if (want.orientation != ORIENTATION_TOPLEFT || lines->alphaSampleIndex || lines->extraSampleCount) continue;
        const bool stored = !want.stored.empty() && (want.photometric == PHOTOMETRIC_RGB ||
                                                     want.photometric == PHOTOMETRIC_MINISBLACK ||
                                                     want.photometric == PHOTOMETRIC_MINISWHITE);
        const int worst = WorstDifference(lines, want, stored, rows);
        if (worst < 0) continue;
        ++compared;
        // 16-bit samples and palettes are cut, where libtiff's RGBA rounds, to 8 bits.
        const bool rounded = want.photometric == PHOTOMETRIC_PALETTE || want.bits == 16;
        EXPECT_LE(worst, stored ? 0 : lines->compression == ZAN_COMPRESSION_JPEG ? 10 : rounded ? 1 : 0);
    }
    EXPECT_GT(described, 300);
    EXPECT_GT(compared, 120);
}

}  // namespace
