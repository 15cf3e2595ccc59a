// Image reading: a page's own samples through replaceable put routines, and
// libtiff's RGBA reader with what libtiff 4.5 gets wrong worked around.

#include <algorithm>
#include <cstdio>
#include <cstring>

#include "adapter.h"
#include "osttiff/osttiff.h"

namespace {

constexpr uint64_t kLargest32 = 0xFFFFFFFFu;

// Where row `row` of `plane` of the page lands in a raster filled bottom row
// first, as the image reader delivers it.
uint8_t* RasterRow(const TIFFImageRecord* image, uint8_t* raster, uint32_t row, uint16_t plane) {
    const uint64_t fromBottom = image->rasterHeight - 1u - row;
    return raster + (uint64_t{plane} * image->rasterHeight + fromBottom) * image->rowBytes;
}

// Copies one decoded row to `to`: as it is, or (reducing 16-bit samples) as
// the high byte of every sample.
void CopyRow(const TIFFImageRecord* image, uint8_t* to, const uint8_t* from) {
    if (!image->reduceTo8) {
        std::memcpy(to, from, image->rowBytes);
        return;
    }
    const auto* samples = reinterpret_cast<const uint16_t*>(from);
    for (uint64_t i = 0; i < image->rowBytes; ++i) to[i] = static_cast<uint8_t>(samples[i] >> 8);
}

}  // namespace

extern "C" {

void putcontigcopy(TIFFImageRecord* image, uint8_t* raster, uint32_t row, uint32_t rows, uint16_t,
                   const uint8_t* data) {
    for (uint32_t r = 0; r < rows && row + r < image->rasterHeight; ++r)
        CopyRow(image, RasterRow(image, raster, row + r, 0), data + r * image->storedRowBytes);
}

void putstripsepcopy(TIFFImageRecord* image, uint8_t* raster, uint32_t row, uint32_t rows, uint16_t plane,
                     const uint8_t* data) {
    if (plane >= image->samplesPerPixel) return;
    for (uint32_t r = 0; r < rows && row + r < image->rasterHeight; ++r)
        CopyRow(image, RasterRow(image, raster, row + r, plane), data + r * image->storedRowBytes);
}

int TIFFImageBegin(TIFFImageRecord* image, TIFF* tif, int stopOnError, char message[1024]) {
    std::memset(image, 0, sizeof *image);
    image->tif = tif;
    image->stopOnError = stopOnError;
    uint16_t photometric = 0, compression = COMPRESSION_NONE, hSub = 1, vSub = 1;
    if (!TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &image->width) || !TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &image->height)) {
        std::snprintf(message, 1024, "Missing image dimensions");
        return 0;
    }
    TIFFGetFieldDefaulted(tif, TIFFTAG_BITSPERSAMPLE, &image->bitsPerSample);
    TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLESPERPIXEL, &image->samplesPerPixel);
    TIFFGetFieldDefaulted(tif, TIFFTAG_PLANARCONFIG, &image->planarConfig);
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric);
    TIFFGetFieldDefaulted(tif, TIFFTAG_ROWSPERSTRIP, &image->rowsPerStrip);
    if (TIFFIsTiled(tif)) {
        std::snprintf(message, 1024, "Tiled pages are not read sample by sample");
        return 0;
    }
    if (photometric == PHOTOMETRIC_YCBCR) TIFFGetFieldDefaulted(tif, TIFFTAG_YCBCRSUBSAMPLING, &hSub, &vSub);
    if (photometric == PHOTOMETRIC_YCBCR && compression != COMPRESSION_JPEG && (hSub != 1 || vSub != 1)) {
        std::snprintf(message, 1024, "YCbCr samples stored in subsampled blocks cannot be delivered as stored");
        return 0;
    }
    if (compression == COMPRESSION_JPEG && photometric == PHOTOMETRIC_YCBCR)
        TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
    image->rowsPerStrip = std::max<uint32_t>(1, std::min(image->rowsPerStrip, image->height));
    const tmsize_t row = TIFFScanlineSize(tif);
    const tmsize_t strip = TIFFStripSize(tif);
    if (row <= 0 || strip <= 0 || static_cast<uint64_t>(strip) > kLargest32) {
        std::snprintf(message, 1024, "Unable to size the page's rows");
        return 0;
    }
    image->storedRowBytes = static_cast<uint64_t>(row);
    image->stripSize = strip;
    image->strip = PivloMalloc(tif, static_cast<uint32_t>(strip));
    if (!image->strip) {
        std::snprintf(message, 1024, "No space for a strip of %lld bytes", static_cast<long long>(strip));
        return 0;
    }
    image->put = image->planarConfig == PLANARCONFIG_SEPARATE ? putstripsepcopy : putcontigcopy;
    return 1;
}

int TIFFImageGet(TIFFImageRecord* image, uint8_t* raster, uint32_t width, uint32_t height) {
    TIFF* tif = image->tif;
    if (!image->strip || !image->put || width != image->width || height == 0 || height > image->height) return 0;
    image->rasterHeight = height;
    image->rowBytes = image->reduceTo8 && image->bitsPerSample == 16 ? image->storedRowBytes / 2 : image->storedRowBytes;
    image->reduceTo8 = image->reduceTo8 && image->bitsPerSample == 16;
    const bool separate = image->planarConfig == PLANARCONFIG_SEPARATE;
    const uint16_t planes = separate ? image->samplesPerPixel : 1;
    for (uint16_t plane = 0; plane < planes; ++plane)
        for (uint32_t row = 0; row < height; row += image->rowsPerStrip) {
            const uint32_t rows = std::min(image->rowsPerStrip, height - row);
            const uint32_t strip = TIFFComputeStrip(tif, row, plane);
            const tmsize_t size = static_cast<tmsize_t>(rows * image->storedRowBytes);
            if (TIFFReadEncodedStrip(tif, strip, image->strip, std::min(size, image->stripSize)) < 0) {
                // As libtiff's RGBA reader: without stop-on-error a strip that
                // cannot be read leaves its rows as they were.
                if (image->stopOnError) return 0;
                continue;
            }
            image->put(image, raster, row, rows, plane, static_cast<const uint8_t*>(image->strip));
        }
    return 1;
}

void TIFFImageEnd(TIFF* tif, TIFFImageRecord* image) {
    PivloFree(tif, image->strip);
    image->strip = nullptr;
}

// libtiff 4.5 checks the first uncompressed tile of every RGBA read against
// the size of its own read buffer, which it rounds up to a multiple of 1 KiB
// when the source is not mapped into memory: every such read of tiles of
// other sizes fails ("Invalid tile byte count"). A buffer of exactly one
// tile, lent to libtiff for the read, passes the check; libtiff is given a
// buffer of its own again before this one goes.
int TIFFRGBAImageGetPivlo(TIFFRGBAImage* image, uint32_t* raster, uint32_t width, uint32_t height) {
    TIFF* tif = image->tif;
    uint16_t compression = COMPRESSION_NONE;
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    const tmsize_t tile = TIFFIsTiled(tif) && compression == COMPRESSION_NONE ? TIFFTileSize(tif) : 0;
    void* exact = tile > 0 && static_cast<uint64_t>(tile) <= 0x7FFFFFFF ? PivloMalloc(tif, static_cast<uint32_t>(tile)) : nullptr;
    if (exact) TIFFReadBufferSetup(tif, exact, tile);
    const int result = TIFFRGBAImageGet(image, raster, width, height);
    if (exact) {
        TIFFReadBufferSetup(tif, nullptr, tile);
        PivloFree(tif, exact);
    }
    return result;
}

}  // extern "C"
