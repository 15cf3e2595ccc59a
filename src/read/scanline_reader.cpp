// zanTIFFReadNextScanLine: the rows of the selected page, top row first,
// each converted into the host's line format. The first call sets the page
// up (checks, conversions, buffers); every call reads and converts one row.

#include <algorithm>
#include <cstring>
#include <limits>

#include "frame/codec_messages.h"
#include "frame/host_memory.h"
#include "frame/tiff_open.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "read/colour_channels.h"
#include "read/page_description.h"
#include "read/reader_buffers.h"
#include "read/row_conversions.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

// Rows are read into the work line (frameData) when a conversion needs
// room beyond the host's line, and straight into the host's line otherwise.
bool UsesWorkLine(const ConversionContext* ctx) {
    return ctx->paletteExpansion || ctx->dropSampleCount || ctx->reduceTo8Bits;
}

}  // namespace

void ReleaseReaderBuffers(ConversionContext* ctx) {
    ReleaseField(ctx, ctx->stripBuffer);
    ctx->stripBufferSize = 0;
    if (UsesWorkLine(ctx)) ReleaseField(ctx, ctx->frameData);
    ReleaseField(ctx, ctx->paletteRed);  // the three tables are one block
    ctx->paletteGreen = ctx->paletteBlue = nullptr;
}

namespace {

constexpr char kMemoryError[] = "Memory allocation error.";

// A failure of the set-up: reported; a source the set-up opened itself is
// closed again, a page described by zanTIFFGetInfo stays open.
class SetupFailure {
public:
    SetupFailure(ConversionContext* ctx, bool openedHere) : ctx_(ctx), openedHere_(openedHere) {}
    uint32_t operator()(const char* message) const {
        if (message) zanError(ctx_, message);
        ReleaseReaderBuffers(ctx_);
        ClearSetupFields(ctx_);
        if (openedHere_) {
            RestoreCodecMessages(ctx_);
            if (ctx_->tiff) {
                TIFFClose(ctx_->tiff);
                ctx_->tiff = nullptr;
            }
            CloseStreamBuffer(ctx_);
            ReleaseFileHandle(ctx_);
        }
        return 0;
    }
    static void ClearSetupFields(ConversionContext* ctx) {
        ctx->alphaSampleIndex = ctx->extraSampleCount = ctx->dropSampleCount = 0;
        ctx->reduceTo8Bits = ctx->readByStrip = ctx->paletteExpansion = 0;
    }

private:
    ConversionContext* ctx_;
    bool openedHere_;
};

// A work block of `size` bytes for the context field, from the job's
// allocator. A 64-bit size beyond 32 bits is a shortage of memory.
template <typename T>
bool AllocateField(ConversionContext* ctx, T*& field, uint64_t size) {
    if (size == 0 || size > std::numeric_limits<uint32_t>::max()) return false;
    field = static_cast<T*>(AllocateBlock(ctx, static_cast<uint32_t>(size)));
    return field != nullptr;
}

// The page's ColorMap, scaled to bytes when it holds 16-bit values.
bool CopyPalette(ConversionContext* ctx, TIFF* tif) {
    const uint32_t entries = 1u << ctx->bitsPerSample;
    uint16_t *red = nullptr, *green = nullptr, *blue = nullptr;
    if (!TIFFGetField(tif, TIFFTAG_COLORMAP, &red, &green, &blue) || !red || !green || !blue) {
        zanError(ctx, "Error getting tiff field.");
        return false;
    }
    if (!AllocateField(ctx, ctx->paletteRed, 6ull * entries)) {
        zanError(ctx, kMemoryError);
        return false;
    }
    ctx->paletteGreen = ctx->paletteRed + entries;
    ctx->paletteBlue = ctx->paletteRed + 2 * entries;
    std::memcpy(ctx->paletteRed, red, 2ull * entries);
    std::memcpy(ctx->paletteGreen, green, 2ull * entries);
    std::memcpy(ctx->paletteBlue, blue, 2ull * entries);
    uint16_t* const all = ctx->paletteRed;
    if (std::any_of(all, all + 3 * entries, [](uint16_t e) { return e > 255; }))
        for (uint32_t i = 0; i < 3 * entries; ++i) all[i] = static_cast<uint16_t>(all[i] * 255u / 65535u);
    return true;
}

// Rows of a JPEG page come out of strips decoded in RGB, and rows of a tiled
// page out of a band of tiles (one row of tiles, all planes) assembled in
// the strip buffer; a tiled page's buffer also holds one tile after the band.
// The buffer holds what the codec delivers once RGB output is asked for.
bool SetUpBlockReading(ConversionContext* ctx, TIFF* tif, bool jpeg, uint64_t* rowBytes) {
    if (jpeg) {
        TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
        const tmsize_t rgbRow = TIFFScanlineSize(tif);
        if (rgbRow <= 0) return false;
        *rowBytes = static_cast<uint64_t>(rgbRow);
    }
    const bool tiled = TIFFIsTiled(tif);
    uint32_t bandRows = 0;
    uint64_t size = 0;
    if (tiled) {
        const tmsize_t tile = TIFFTileSize(tif);
        if (!TIFFGetField(tif, TIFFTAG_TILELENGTH, &bandRows) || bandRows == 0 || tile <= 0) return false;
        size = *rowBytes * bandRows + static_cast<uint64_t>(tile);
    } else {
        TIFFGetFieldDefaulted(tif, TIFFTAG_ROWSPERSTRIP, &bandRows);
        bandRows = std::max<uint32_t>(1, std::min(bandRows, ctx->imageHeight));
        const tmsize_t strip = TIFFStripSize(tif);
        size = std::max<uint64_t>(static_cast<uint64_t>(std::max<tmsize_t>(strip, 0)), *rowBytes * bandRows);
    }
    ctx->rowsPerStrip = bandRows;
    ctx->stripCount = tiled ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif);
    ctx->nextStrip = 0;
    if (!AllocateField(ctx, ctx->stripBuffer, size)) return false;
    ctx->stripBufferSize = static_cast<uint32_t>(size);
    ctx->scanlineSize = ctx->lineBytes = static_cast<uint32_t>(*rowBytes);
    ctx->readByStrip = 1;
    return true;
}

// Chooses the conversions of the page and obtains the buffers they need.
uint32_t SetUpPage(ConversionContext* ctx) {
    const bool openedHere = ctx->state != ZAN_STATE_DESCRIBED && !ctx->tiff;
    ctx->currentRow = 0;
    if (!OpenTIFFForReading(ctx)) return 0;
    const SetupFailure fail(ctx, openedHere);
    TIFF* tif = ctx->tiff;
    if (!tif) return fail("Unable to create a tiff object");
    // Buffers and decisions of an earlier page of the job give way.
    ReleaseReaderBuffers(ctx);
    SetupFailure::ClearSetupFields(ctx);
    zanResetFrameBuffer(ctx);
    if (!SelectPage(tif, ctx->pageNumber)) return fail("Unable to access target page.");

    uint16_t compression = COMPRESSION_NONE, planar = PLANARCONFIG_CONTIG, photometric = 0;
    uint16_t bits = 1, samples = 1, fillOrder = FILLORDER_MSB2LSB;
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    TIFFGetFieldDefaulted(tif, TIFFTAG_PLANARCONFIG, &planar);
    ctx->planarConfig = planar == PLANARCONFIG_CONTIG ? 1 : 2;
    if (ctx->planarConfig == 2 && compression != COMPRESSION_NONE)
        return fail("Line processing not supported for compressed planar tiff.");
    if (!TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &ctx->imageHeight) ||
        !TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &ctx->imageWidth) ||
        !TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric))
        return fail("Error getting tiff field.");
    TIFFGetFieldDefaulted(tif, TIFFTAG_BITSPERSAMPLE, &bits);
    ctx->bitsPerSample = bits;
    if (bits != 1 && bits != 2 && bits != 4 && bits != 8 && bits != 16)
        return fail("Only supports 2, 4(palette), 2, 4, 8, 16 or 1 bitspersample.");
    TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLESPERPIXEL, &samples);
    ctx->fileSamplesPerPixel = samples;
    const uint32_t width = ctx->imageWidth;

    // Extra samples: those the directory lists, or the surplus over the
    // colour channels of a page without the tag (the first taken as
    // associated alpha).
    const uint16_t colours = colourChannelCount(photometric);
    uint16_t listed = 0;
    const uint16_t* kinds = nullptr;
    if (!GetStoredExtraSamples(ctx, tif, &listed, &kinds)) return fail("Error getting tiff field.");
    uint32_t extra = 0;
    if (listed > 0) {
        const uint16_t* alpha = std::find(kinds, kinds + listed, EXTRASAMPLE_ASSOCALPHA);
        if (alpha != kinds + listed) ctx->alphaSampleIndex = colours + static_cast<uint32_t>(alpha - kinds);
        ctx->extraSampleCount = listed;
        extra = listed;
    } else if ((extra = SurplusSamples(samples, photometric)) > 0) {
        ctx->alphaSampleIndex = colours;
        ctx->extraSampleCount = extra;
    }
    extra = std::min<uint32_t>(extra, samples);
    if (!ctx->dropExtraSamples) {
        ctx->extraSamples = extra;
        extra = 0;
    }
    TIFFGetFieldDefaulted(tif, TIFFTAG_FILLORDER, &fillOrder);
    if (fillOrder == 1 || fillOrder == 2) ctx->fillOrder = fillOrder;

    // One row of all samples; for separate planes one plane's row times the
    // planes, so that the planes lie side by side without overlapping.
    const tmsize_t codecRow = TIFFScanlineSize(tif);
    uint64_t rowBytes = static_cast<uint64_t>(std::max<tmsize_t>(codecRow, 0)) *
                              (ctx->planarConfig == 2 ? samples : 1u);
    if (codecRow <= 0 || rowBytes > std::numeric_limits<uint32_t>::max()) return fail("Error getting tiff field.");
    ctx->scanlineSize = ctx->lineBytes = static_cast<uint32_t>(rowBytes);
    if ((compression == COMPRESSION_JPEG || TIFFIsTiled(tif)) &&
        !SetUpBlockReading(ctx, tif, compression == COMPRESSION_JPEG, &rowBytes))
        return fail(kMemoryError);

    const uint64_t pixels = width;
    if (photometric == PHOTOMETRIC_PALETTE) {
        if (bits != 2 && bits != 4 && bits != 8) return fail("Only supports 2 or 4 or 8 bit per sample palette tiff.");
        // The indices are the only sample of a palette page; a row of more
        // samples would not fit the RGB work line it is read into.
        if (samples != 1) return fail("Palette tiff with more than one sample per pixel not supported.");
        if (!AllocateField(ctx, ctx->frameData, std::max<uint64_t>(pixels * 3, rowBytes))) return fail(kMemoryError);
        ++ctx->paletteExpansion;
        ctx->lineBytes = static_cast<uint32_t>(pixels * 3);
        if (!CopyPalette(ctx, tif)) return fail(nullptr);
    } else if (extra > 0) {
        const uint64_t kept = (samples - extra) * pixels;
        // Narrow samples are widened to bytes in the work line before dropping.
        const uint64_t work = bits < 8 ? std::max<uint64_t>(rowBytes, samples * pixels) : rowBytes;
        ctx->lineBytes = static_cast<uint32_t>(bits == 16 && ctx->outputBitsPerSample == 16 ? kept * 2 : kept);
        if (!AllocateField(ctx, ctx->frameData, work)) return fail(kMemoryError);
        ctx->dropSampleCount = extra;
    }
    if (bits == 16) {
        // Anything but a wish for 16 bits delivers 8.
        ctx->reduceTo8Bits = ctx->outputBitsPerSample != 16;
        // 16-bit rows read into the host's line need no work line.
        if (extra == 0 && ctx->reduceTo8Bits) {
            ctx->lineBytes = ctx->scanlineSize / 2;
            if (!AllocateField(ctx, ctx->frameData, rowBytes)) return fail(kMemoryError);
        }
    }
    if (photometric != PHOTOMETRIC_PALETTE && (bits == 2 || bits == 4) && extra == 0)
        ctx->lineBytes = static_cast<uint32_t>(samples * pixels);
    ctx->state = ZAN_STATE_READING;
    return 1;
}

// Assembles the band of tiles that holds row `row` in the strip buffer: every
// tile of that tile row, of every plane, at its place in the band's rows.
bool ReadTileBand(ConversionContext* ctx, uint32_t row) {
    TIFF* tif = ctx->tiff;
    uint32_t tileWidth = 0;
    TIFFGetField(tif, TIFFTAG_TILEWIDTH, &tileWidth);
    const uint32_t bandRows = ctx->rowsPerStrip;
    const uint32_t top = row / bandRows * bandRows;
    const uint32_t rows = std::min(bandRows, ctx->imageHeight - top);
    const bool planar = ctx->planarConfig == 2;
    const uint32_t planes = planar ? ctx->fileSamplesPerPixel : 1;
    const uint32_t planeRow = ctx->scanlineSize / planes;
    const uint64_t pixelBits = uint64_t{planeRow} * 8 / std::max<uint32_t>(ctx->imageWidth, 1);
    const size_t tileRow = static_cast<size_t>(TIFFTileRowSize(tif));
    const size_t bandBytes = static_cast<size_t>(ctx->scanlineSize) * bandRows;
    uint8_t* const tile = ctx->stripBuffer + bandBytes;
    const tmsize_t tileSize = static_cast<tmsize_t>(ctx->stripBufferSize - bandBytes);
    for (uint32_t plane = 0; plane < planes; ++plane)
        for (uint32_t x = 0; x < ctx->imageWidth; x += tileWidth) {
            const uint32_t index = TIFFComputeTile(tif, x, top, 0, static_cast<uint16_t>(plane));
            if (TIFFReadEncodedTile(tif, index, tile, tileSize) == -1) return false;
            const uint32_t columns = std::min(tileWidth, ctx->imageWidth - x);
            const size_t from = static_cast<size_t>(uint64_t{x} * pixelBits / 8);
            const size_t bytes = std::min(tileRow, static_cast<size_t>((uint64_t{columns} * pixelBits + 7) / 8));
            for (uint32_t r = 0; r < rows; ++r)
                std::memcpy(ctx->stripBuffer + static_cast<size_t>(r) * ctx->scanlineSize +
                                static_cast<size_t>(plane) * planeRow + from,
                            tile + static_cast<size_t>(r) * tileRow, bytes);
        }
    return true;
}

// Reads row currentRow into `read`. False when the codec refuses (it has
// reported).
bool ReadRow(ConversionContext* ctx, uint8_t* read) {
    TIFF* tif = ctx->tiff;
    const uint32_t row = ctx->currentRow;
    if (!ctx->readByStrip) {
        if (ctx->planarConfig != 2) return TIFFReadScanline(tif, read, row, 0) != -1;
        const uint32_t planes = ctx->fileSamplesPerPixel;
        const uint32_t planeRow = ctx->scanlineSize / planes;
        for (uint32_t s = 0; s < planes; ++s)
            if (TIFFReadScanline(tif, read + static_cast<size_t>(s) * planeRow, row, static_cast<uint16_t>(s)) == -1)
                return false;
        return true;
    }
    const uint32_t band = row / ctx->rowsPerStrip;
    if (ctx->nextStrip != band + 1) {
        const bool read = TIFFIsTiled(tif)
                              ? ReadTileBand(ctx, row)
                              : TIFFReadEncodedStrip(tif, band, ctx->stripBuffer, ctx->stripBufferSize) != -1;
        if (!read) return false;
        ctx->nextStrip = band + 1;
    }
    const uint32_t inBand = row % ctx->rowsPerStrip;
    std::memcpy(read, ctx->stripBuffer + static_cast<size_t>(ctx->scanlineSize) * inBand, ctx->scanlineSize);
    return true;
}

uint32_t ReadNextRow(ConversionContext* ctx, uint8_t* line, uint32_t capacity) {
    if (capacity < ctx->lineBytes) {
        zanError(ctx, "Not enough space in line buffer.");
        return 0;
    }
    if (ctx->currentRow >= ctx->imageHeight) {
        zanError(ctx, "No more lines to read.");
        return 0;
    }
    uint8_t* read = UsesWorkLine(ctx) ? static_cast<uint8_t*>(ctx->frameData) : line;
    const uint64_t errorsBefore = CodecErrorsDelivered();
    if (!ReadRow(ctx, read)) {
        // The codec explains its failures to the host's codec sink; when
        // nothing reached it, the host still learns that the row failed.
        if (CodecErrorsDelivered() == errorsBefore) zanError(ctx, "Unable to read line.");
        return 0;
    }
    ConvertScanLine(ctx, read, line);
    ++ctx->currentRow;
    return ctx->lineBytes;
}

}  // namespace
}  // namespace zan

extern "C" ZAN_API uint32_t zanTIFFReadNextScanLine(ConversionContext* ctx, void* line, uint32_t lineCapacity) {
    using namespace zan;
    if (!ctx) return 0;
    switch (ctx->state) {
    case ZAN_STATE_WRITING:
        zanError(ctx, "Can not read while writing.");
        return 0;
    case ZAN_STATE_IDLE:
    case ZAN_STATE_DESCRIBED:
        if (!SetUpPage(ctx)) return 0;
        break;
    case ZAN_STATE_READING:
        break;
    default:
        zanError(ctx, "Wrong state in zanTIFFReadNextScanLine.");
        return 0;
    }
    if (!line) {
        zanError(ctx, "Not enough space in line buffer.");
        return 0;
    }
    return ReadNextRow(ctx, static_cast<uint8_t*>(line), lineCapacity);
}
