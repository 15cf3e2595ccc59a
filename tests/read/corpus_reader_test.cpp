// Third-party files through zanTIFFGetInfo and the scanline reader: the
// description agrees with libtiff, the lines agree with libtiff's own RGBA
// decode, and hostile files end with a result and a message.

#include <gtest/gtest.h>

#include <tiffio.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "read_support.h"
#include "support/corpus.h"

namespace {

using namespace zantest;

// What libtiff says of the first page, decoded top-down as RGBA.
struct LibtiffPage {
    uint32_t width = 0, height = 0;
    uint16_t bits = 1, samples = 1, photometric = 0, planar = 1, compression = 1, orientation = 1,
             unit = 2;
    float xres = 0;
    bool hasXres = false;
    std::vector<uint32_t> rgba;  // empty when libtiff cannot decode it as RGBA
    Bytes samples8;              // 8- and 16-bit contiguous pages: rows from strip or tile reads
};

// The page's rows assembled from whole strips or tiles decoded by libtiff.
Bytes AssembleRows(TIFF* tif, uint32_t width, uint32_t height) {
    const tmsize_t rowSize = TIFFScanlineSize(tif);
    Bytes image(static_cast<size_t>(rowSize) * height);
    if (!TIFFIsTiled(tif)) {
        uint32_t rowsPerStrip = 0;
        TIFFGetFieldDefaulted(tif, TIFFTAG_ROWSPERSTRIP, &rowsPerStrip);
        rowsPerStrip = std::min(rowsPerStrip, height);
        for (uint32_t s = 0; s < TIFFNumberOfStrips(tif); ++s) {
            const size_t at = static_cast<size_t>(s) * rowsPerStrip * rowSize;
            if (at >= image.size() || TIFFReadEncodedStrip(tif, s, image.data() + at, static_cast<tmsize_t>(image.size() - at)) < 0)
                return {};
        }
        return image;
    }
    uint32_t tw = 0, th = 0;
    TIFFGetField(tif, TIFFTAG_TILEWIDTH, &tw);
    TIFFGetField(tif, TIFFTAG_TILELENGTH, &th);
    Bytes tile(static_cast<size_t>(TIFFTileSize(tif)));
    const size_t pixel = static_cast<size_t>(rowSize) / width;
    for (uint32_t ty = 0; ty < height; ty += th)
        for (uint32_t tx = 0; tx < width; tx += tw) {
            if (TIFFReadTile(tif, tile.data(), tx, ty, 0, 0) < 0) return {};
            for (uint32_t y = ty; y < std::min(height, ty + th); ++y)
                std::copy_n(tile.begin() + static_cast<size_t>(y - ty) * tw * pixel, std::min(tw, width - tx) * pixel,
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
        const uint64_t pixels = uint64_t{page.width} * page.height;
        const bool decode = pixels > 0 && pixels <= (20u << 20);
        if (decode && page.planar == PLANARCONFIG_CONTIG && (page.bits == 8 || page.bits == 16) &&
            page.compression != COMPRESSION_JPEG && page.compression != COMPRESSION_OJPEG)
            page.samples8 = AssembleRows(tif, page.width, page.height);
        if (decode) {
            page.rgba.resize(static_cast<size_t>(pixels));
            if (!TIFFReadRGBAImageOriented(tif, page.width, page.height, page.rgba.data(), ORIENTATION_TOPLEFT, 0))
                page.rgba.clear();
        }
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
bool LineColour(const ConversionContext* ctx, uint16_t photometric, const Bytes& line, uint32_t x,
                uint32_t rgb[3]) {
    const uint32_t bits = ctx->bitsPerSample;
    if (photometric == PHOTOMETRIC_PALETTE || (photometric == PHOTOMETRIC_RGB && bits != 1) ||
        photometric == PHOTOMETRIC_YCBCR) {
        for (uint32_t c = 0; c < 3; ++c) rgb[c] = line[ctx->planarConfig == 2 ? c * ctx->imageWidth + x : x * 3 + c];
        return true;
    }
    if (photometric == PHOTOMETRIC_MINISBLACK || photometric == PHOTOMETRIC_MINISWHITE) {
        uint32_t v = bits != 1 ? line[x] : (line[x / 8] >> (7 - x % 8)) & 1 ? 255 : 0;
        if (photometric == PHOTOMETRIC_MINISWHITE) v = 255 - v;
        rgb[0] = rgb[1] = rgb[2] = v;
        return true;
    }
    return false;
}

class CorpusReader : public ::testing::Test {
protected:
    void SetUp() override {
        files_ = CorpusFiles();
        if (files_.empty()) GTEST_SKIP() << "corpus not found";
    }
    std::vector<CorpusFile> files_;
};

TEST_F(CorpusReader, DescriptionsAndLinesAgreeWithLibtiff) {
    int described = 0, compared = 0;
    for (const CorpusFile& file : files_) {
        if (file.status == "bad") continue;
        const LibtiffPage want = ReadWithLibtiff(file.path);
        const Bytes tiff = ReadFileBytes(file.path);
        ReadJob job(tiff);
        job->pageNumber = 1;
        if (!job.GetInfo()) {
            // Only pages the description cannot serve: no photometric, BigTIFF
            // offsets beyond 4 GiB and the like; always with a message.
            EXPECT_FALSE(job.host().Errors().empty()) << file.relpath;
            continue;
        }
        ++described;
        EXPECT_EQ(job->imageWidth, want.width) << file.relpath;
        EXPECT_EQ(job->imageHeight, want.height) << file.relpath;
        EXPECT_EQ(job->bitsPerSample, want.bits) << file.relpath;
        EXPECT_EQ(job->samplesPerPixel, want.samples) << file.relpath;
        EXPECT_EQ(job->planarConfig, want.planar == 1 ? 1u : 2u) << file.relpath;
        if (want.compression == COMPRESSION_LZW || want.compression == COMPRESSION_JPEG) {
            EXPECT_EQ(job->compression, want.compression == COMPRESSION_LZW ? 7u : 5u) << file.relpath;
        }
        if (want.hasXres) {
            const float inch = want.unit == RESUNIT_NONE         ? 0.0f
                               : want.unit == RESUNIT_CENTIMETER ? want.xres * 2.54f
                                                                 : want.xres;
            EXPECT_FLOAT_EQ(job->xResolution, inch) << file.relpath;
            EXPECT_FLOAT_EQ(job->fileXResolution, want.xres) << file.relpath;
        }

        // The lines, as 8-bit samples without extra samples.
        ReadJob lines(tiff);
        lines->pageNumber = 1;
        lines->outputBitsPerSample = 8;
        lines->dropExtraSamples = 1;
        if (!lines.GetInfo()) continue;
        const auto rows = lines.ReadAll();
        if (rows.size() != lines->imageHeight) {
            // A page the reader does not take ends with a message.
            EXPECT_TRUE(!lines.host().Errors().empty() || !lines.host().codecErrors.empty()) << file.relpath;
            continue;
        }
        if (want.orientation != ORIENTATION_TOPLEFT || lines->alphaSampleIndex || lines->extraSampleCount) continue;
        const bool direct = !want.samples8.empty() && (want.photometric == PHOTOMETRIC_RGB ||
                                                       want.photometric == PHOTOMETRIC_MINISBLACK ||
                                                       want.photometric == PHOTOMETRIC_MINISWHITE);
        int worst = 0;
        if (direct) {
            // Samples as stored: 8-bit ones as they are, 16-bit ones by their high byte.
            const size_t row = want.samples8.size() / want.height;
            for (uint32_t y = 0; y < want.height; ++y)
                for (size_t i = 0; i < rows[y].size(); ++i) {
                    const uint8_t* at = &want.samples8[y * row + i * (want.bits / 8)];
                    uint16_t v16 = *at;
                    if (want.bits == 16) std::memcpy(&v16, at, 2);
                    worst = std::max(worst, std::abs(rows[y][i] - (want.bits == 16 ? v16 >> 8 : *at)));
                }
            ++compared;
            EXPECT_EQ(worst, 0) << file.relpath;
            continue;
        }
        if (want.rgba.empty()) continue;
        // 16-bit samples and palettes are cut, where libtiff rounds, to 8 bits.
        const int tolerance =
            lines->compression == ZAN_COMPRESSION_JPEG ? 10 : want.photometric == 3 || want.bits == 16 ? 1 : 0;
        bool comparable = true;
        for (uint32_t y = 0; y < want.height && comparable; ++y)
            for (uint32_t x = 0; x < want.width && comparable; ++x) {
                uint32_t rgb[3];
                comparable = LineColour(lines.host().ctx(), want.photometric, rows[y], x, rgb);
                const uint32_t pixel = want.rgba[static_cast<size_t>(y) * want.width + x];
                for (int c = 0; c < 3 && comparable; ++c)
                    worst = std::max(worst, std::abs(static_cast<int>(rgb[c]) - static_cast<int>((pixel >> (8 * c)) & 0xFF)));
            }
        if (!comparable) continue;
        ++compared;
        EXPECT_LE(worst, tolerance) << file.relpath;
    }
    EXPECT_GT(described, 300);
    EXPECT_GT(compared, 120);
}

TEST_F(CorpusReader, HostileFilesEndWithAResultAndAMessage) {
    for (const CorpusFile& file : files_) {
        if (file.status != "bad") continue;
        for (Source source : {Source::Memory, Source::StreamBuffer}) {
            ReadJob job(ReadFileBytes(file.path), source);
            job->outputBitsPerSample = 16;
            if (!job.GetInfo()) {
                EXPECT_FALSE(job.host().Errors().empty()) << file.relpath;
                continue;
            }
            if (uint64_t{job->imageWidth} * job->imageHeight > (64u << 20)) continue;  // time, not safety
            const auto rows = job.ReadAll();
            if (rows.size() != job->imageHeight) {
                EXPECT_TRUE(!job.host().Errors().empty() || !job.host().codecErrors.empty()) << file.relpath;
            }
        }
    }
}

}  // namespace
