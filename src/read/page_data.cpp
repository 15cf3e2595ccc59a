#include "read/page_data.h"

#include <algorithm>
#include <limits>

#include "frame/checked_size.h"

namespace zan {
namespace {

// The most bytes one stored byte can decode to. PackBits turns 2 bytes into
// 128; an LZW code of 12 bits yields at most 4096 bytes; Deflate expands at
// most 1032 times; a JPEG block of 64 samples takes at least 2 bits. For
// codecs without a simple bound (Zstandard, LZMA, WebP, ...) the bound is
// generous, so that no real page is refused. Uncompressed data gets room for
// a short last strip.
uint64_t MostExpansion(uint16_t compression) {
    switch (compression) {
    case COMPRESSION_NONE: return 2;
    case COMPRESSION_PACKBITS: return 64;
    case COMPRESSION_LZW: return 4096;
    case COMPRESSION_ADOBE_DEFLATE: case COMPRESSION_DEFLATE: return 1032;
    case COMPRESSION_JPEG: case COMPRESSION_OJPEG: return 1024;
    default: return uint64_t{1} << 16;
    }
}

bool IsFax(uint16_t compression) {
    return compression == COMPRESSION_CCITTRLE || compression == COMPRESSION_CCITTFAX3 ||
           compression == COMPRESSION_CCITTFAX4 || compression == COMPRESSION_CCITTRLEW;
}

// The source's size when it is known without reading the source through:
// not for a stream read once (the stream buffer would fetch it whole) nor
// for the stream decoder (its data are still arriving); 0 when unknown.
uint64_t KnownSourceSize(const ConversionContext* ctx, TIFF* tif) {
    if (ctx->streamDecoder || (ctx->sourceKind == ZAN_SOURCE_STREAM && !ctx->sourceSeekProc)) return 0;
    const toff_t size = TIFFGetSizeProc(tif)(TIFFClientdata(tif));
    return size >= std::numeric_limits<uint32_t>::max() ? 0 : size;
}

// Sum of the byte counts of every strip or tile (saturating), each no more
// than the `sourceSize` bytes hold after its offset when that size is known.
uint64_t StoredDataBytes(TIFF* tif, uint64_t sourceSize) {
    const uint32_t blocks = TIFFIsTiled(tif) ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif);
    uint64_t total = 0;
    for (uint32_t i = 0; i < blocks; ++i) {
        int error = 0;
        uint64_t count = TIFFGetStrileByteCountWithErr(tif, i, &error);
        if (error) break;
        if (sourceSize) {
            const uint64_t offset = TIFFGetStrileOffsetWithErr(tif, i, &error);
            if (error) break;
            count = std::min(count, offset < sourceSize ? sourceSize - offset : 0);
        }
        total = count > std::numeric_limits<uint64_t>::max() - total ? std::numeric_limits<uint64_t>::max()
                                                                     : total + count;
    }
    return total;
}

}  // namespace

uint64_t StoredImageBytes(TIFF* tif) {
    uint32_t height = 0;
    uint16_t planar = PLANARCONFIG_CONTIG, samples = 1;
    TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &height);
    TIFFGetFieldDefaulted(tif, TIFFTAG_PLANARCONFIG, &planar);
    TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLESPERPIXEL, &samples);
    const uint64_t row = TIFFScanlineSize64(tif);
    uint64_t bytes = 0;
    if (!MultiplySizes(row, height, planar == PLANARCONFIG_SEPARATE ? samples : 1u, &bytes))
        return std::numeric_limits<uint64_t>::max();
    return bytes;
}

bool PageDataCanHold(const ConversionContext* ctx, TIFF* tif, uint64_t storedBytes) {
    uint16_t compression = COMPRESSION_NONE;
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    const uint64_t data = StoredDataBytes(tif, KnownSourceSize(ctx, tif));
    if (IsFax(compression)) {
        // A fax row takes at least one bit, and a blank row of any width
        // only a few: such pages get a bound of their own.
        uint32_t height = 0;
        TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &height);
        if (data < (uint64_t{height} + 7) / 8) return false;
    }
    uint64_t most = 0;
    const uint64_t expansion = IsFax(compression) ? uint64_t{1} << 20 : MostExpansion(compression);
    if (!MultiplySizes(data, expansion, &most)) return true;
    return most >= storedBytes;
}

}  // namespace zan
