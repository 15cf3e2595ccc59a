// zanTIFFReadNextScanLine: the rows of the selected page, top row first,
// each converted into the host's line format. The first call sets the page
// up (checks, conversions, buffers); every call reads and converts one row.

#include <algorithm>
#include <cstring>
#include <limits>

#include "frame/checked_size.h"
#include "frame/codec_messages.h"
#include "frame/host_memory.h"
#include "frame/job_finishers.h"
#include "frame/tiff_open.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "read/colour_channels.h"
#include "read/page_data.h"
#include "read/page_description.h"
#include "read/scanline_reader.h"
#include "read/row_conversions.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

// Rows are read into the work line (frameData) when a conversion needs
// room beyond the host's line, and straight into the host's line otherwise.
bool UsesWorkLine(const ConversionContext* ctx) {
    return ctx->paletteExpansion || ctx->dropSampleCount || ctx->reduceTo8Bits;
}

// A job torn down while reading gives the reader's buffers back.
const bool kReadingFinisher = RegisterJobFinisher(ZAN_STATE_READING, ReleaseReaderBuffers);

}  // namespace

void ReleaseReaderBuffers(ConversionContext* ctx) {
    ReleaseField(ctx, ctx->stripBuffer);
    ctx->stripBufferSize = 0;
    if (UsesWorkLine(ctx)) ReleaseField(ctx, ctx->frameData);
    ReleaseField(ctx, ctx->paletteRed);  // the three tables are one block
    ctx->paletteGreen = ctx->paletteBlue = nullptr;
}

void EndReadJob(ConversionContext* ctx) {
    if (ctx->state == ZAN_STATE_READING) ReleaseReaderBuffers(ctx);
    if (ctx->tiff) {
        TIFFClose(ctx->tiff);
        ctx->tiff = nullptr;
    }
    RestoreCodecMessages(ctx);
    CloseStreamBuffer(ctx);
    ReleaseFileHandle(ctx);
    ctx->state = ZAN_STATE_IDLE;
}

bool RefuseWhileWriting(ConversionContext* ctx) {
    if (ctx->state != ZAN_STATE_WRITING && ctx->state != ZAN_STATE_PAGE_CLOSED) return false;
    zanError(ctx, "Can not read while writing.");
    return true;
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

// How rows reach the reader (`readByStrip`): one scanline at a time, out of
// a block of decoded rows (JPEG strips, bands of tiles), or out of a band
// the codec's RGBA reader converted to RGB (YCbCr pages other than JPEG,
// whose samples are stored in subsampled blocks).
enum RowSource : uint32_t { kScanlines = 0, kBlocks = 1, kRgbaBands = 2 };

constexpr char kLineTooLong[] = "A line of the page is larger than 4 GiB.";

// The rows of a block: a tile's length or the page's RowsPerStrip. Returns
// the message of a failure, or null.
const char* BlockRows(TIFF* tif, uint32_t* rows) {
    if (!TIFFIsTiled(tif)) {
        TIFFGetFieldDefaulted(tif, TIFFTAG_ROWSPERSTRIP, rows);
        return nullptr;
    }
    return TIFFGetField(tif, TIFFTAG_TILELENGTH, rows) && *rows != 0 ? nullptr : "Error getting tileheight field.";
}

// Rows of a JPEG page come out of strips decoded in RGB, and rows of a tiled
// page out of a band of tiles (one row of tiles, all planes) assembled in
// the strip buffer; a tiled page's buffer also holds one tile after the band.
// The buffer holds what the codec delivers once RGB output is asked for.
// Returns the message of a failure, or null.
const char* SetUpBlockReading(ConversionContext* ctx, TIFF* tif, bool jpeg, uint64_t* rowBytes) {
    if (jpeg) {
        TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
        const tmsize_t rgbRow = TIFFScanlineSize(tif);
        if (rgbRow <= 0) return "Unable to work out the size of a line.";
        *rowBytes = static_cast<uint64_t>(rgbRow);
    }
    const bool tiled = TIFFIsTiled(tif);
    uint32_t bandRows = 0;
    if (const char* failure = BlockRows(tif, &bandRows)) return failure;
    uint64_t size = 0;
    if (tiled) {
        const tmsize_t tile = TIFFTileSize(tif);
        if (tile <= 0) return "Unable to work out the size of a tile.";
        if (!MultiplySizes(*rowBytes, bandRows, &size)) return kLineTooLong;
        size += static_cast<uint64_t>(tile);
    } else {
        bandRows = std::max<uint32_t>(1, std::min(bandRows, ctx->imageHeight));
        const tmsize_t strip = TIFFStripSize(tif);
        if (!MultiplySizes(*rowBytes, bandRows, &size)) return kLineTooLong;
        size = std::max<uint64_t>(static_cast<uint64_t>(std::max<tmsize_t>(strip, 0)), size);
    }
    if (!FitsIn32(size) || !FitsIn32(*rowBytes)) return kLineTooLong;
    ctx->rowsPerStrip = bandRows;
    ctx->stripCount = tiled ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif);
    ctx->nextStrip = 0;
    if (!AllocateField(ctx, ctx->stripBuffer, size)) return kMemoryError;
    ctx->stripBufferSize = static_cast<uint32_t>(size);
    ctx->scanlineSize = ctx->lineBytes = static_cast<uint32_t>(*rowBytes);
    ctx->readByStrip = kBlocks;
    return nullptr;
}

// A YCbCr page that is not JPEG keeps its chroma in subsampled blocks; the
// codec's RGBA reader turns a band of rows (a strip's or a row of tiles'
// worth) into RGB, and the lines are RGB. Returns the message of a failure,
// or null.
const char* SetUpRgbaBands(ConversionContext* ctx, TIFF* tif) {
    if (ctx->bitsPerSample != 8 || ctx->fileSamplesPerPixel != 3)
        return "Only 8-bit YCbCr pages of three samples are supported line by line.";
    char message[1024] = "";
    TIFFRGBAImage probe;
    if (!TIFFRGBAImageBegin(&probe, tif, 0, message)) {
        TIFFError(TIFFFileName(tif), "%s", message);
        return "Unable to convert the page's YCbCr samples to RGB.";
    }
    TIFFRGBAImageEnd(&probe);
    uint32_t bandRows = 0;
    if (const char* failure = BlockRows(tif, &bandRows)) return failure;
    bandRows = std::max<uint32_t>(1, std::min(bandRows, ctx->imageHeight));
    uint64_t raster = 0, line = 0;
    if (!MultiplySizes(ctx->imageWidth, bandRows, 4, &raster) || !FitsIn32(raster) ||
        !MultiplySizes(ctx->imageWidth, 3, &line) || !FitsIn32(line))
        return kLineTooLong;
    if (!AllocateField(ctx, ctx->stripBuffer, raster)) return kMemoryError;
    ctx->stripBufferSize = static_cast<uint32_t>(raster);
    ctx->rowsPerStrip = bandRows;
    ctx->nextStrip = 0;
    ctx->planarConfig = 1;  // RGB lines, whatever the planes were
    ctx->scanlineSize = ctx->lineBytes = static_cast<uint32_t>(line);
    ctx->readByStrip = kRgbaBands;
    return nullptr;
}

}  // namespace

// Every size is worked out in 64 bits and refused beyond 32 bits.
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
    const uint64_t width = ctx->imageWidth;
    // Nothing is sized from the page's claims before its data is known to
    // be able to hold them.
    if (!PageDataCanHold(ctx, tif, StoredImageBytes(tif))) return fail(kPageDataTooSmall);

    // Extra samples: those the directory lists, or the surplus over the
    // colour channels of a page without the tag (the first taken as
    // associated alpha).
    const uint16_t colours = colourChannelCount(photometric);
    uint16_t listed = 0;
    const uint16_t* kinds = nullptr;
    if (!TIFFGetStoredExtraSamplesPivlo(tif, &listed, &kinds)) return fail("Error getting tiff field.");
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

    if (photometric == PHOTOMETRIC_YCBCR && compression != COMPRESSION_JPEG) {
        SetupFailure::ClearSetupFields(ctx);
        if (const char* failure = SetUpRgbaBands(ctx, tif)) return fail(failure);
        ctx->state = ZAN_STATE_READING;
        return 1;
    }

    // One row of all samples; for separate planes one plane's row times the
    // planes, so that the planes lie side by side without overlapping.
    const tmsize_t codecRow = TIFFScanlineSize(tif);
    if (codecRow <= 0) return fail("Unable to work out the size of a line.");
    uint64_t rowBytes = 0;
    if (!MultiplySizes(static_cast<uint64_t>(codecRow), ctx->planarConfig == 2 ? samples : 1u, &rowBytes) ||
        !FitsIn32(rowBytes))
        return fail(kLineTooLong);
    ctx->scanlineSize = ctx->lineBytes = static_cast<uint32_t>(rowBytes);
    if (compression == COMPRESSION_JPEG || TIFFIsTiled(tif))
        if (const char* failure = SetUpBlockReading(ctx, tif, compression == COMPRESSION_JPEG, &rowBytes))
            return fail(failure);

    // The line the host receives and the work line behind it, in 64 bits.
    const uint64_t allSamples = uint64_t{samples} * width;
    uint64_t lineBytes = rowBytes;
    if (photometric == PHOTOMETRIC_PALETTE) {
        if (bits != 2 && bits != 4 && bits != 8) return fail("Only supports 2 or 4 or 8 bit per sample palette tiff.");
        // The indices are the only sample of a palette page; a row of more
        // samples would not fit the RGB work line it is read into.
        if (samples != 1) return fail("Palette tiff with more than one sample per pixel not supported.");
        lineBytes = width * 3;
        if (!FitsIn32(lineBytes)) return fail(kLineTooLong);
        if (!AllocateField(ctx, ctx->frameData, std::max<uint64_t>(lineBytes, rowBytes))) return fail(kMemoryError);
        ++ctx->paletteExpansion;
        if (!CopyPalette(ctx, tif)) return fail(nullptr);
    } else if (extra > 0) {
        const uint64_t kept = (samples - extra) * width;
        // Narrow samples are widened to bytes in the work line before dropping.
        const uint64_t work = bits < 8 ? std::max<uint64_t>(rowBytes, allSamples) : rowBytes;
        lineBytes = bits == 16 && ctx->outputBitsPerSample == 16 ? kept * 2 : kept;
        if (!FitsIn32(lineBytes) || !FitsIn32(work)) return fail(kLineTooLong);
        if (!AllocateField(ctx, ctx->frameData, work)) return fail(kMemoryError);
        ctx->dropSampleCount = extra;
    }
    if (bits == 16) {
        // Anything but a wish for 16 bits delivers 8.
        ctx->reduceTo8Bits = ctx->outputBitsPerSample != 16;
        // 16-bit rows read into the host's line need no work line.
        if (extra == 0 && ctx->reduceTo8Bits) {
            lineBytes = rowBytes / 2;
            if (!AllocateField(ctx, ctx->frameData, rowBytes)) return fail(kMemoryError);
        }
    }
    if (photometric != PHOTOMETRIC_PALETTE && (bits == 2 || bits == 4) && extra == 0) lineBytes = allSamples;
    if (!FitsIn32(lineBytes)) return fail(kLineTooLong);
    ctx->lineBytes = static_cast<uint32_t>(lineBytes);
    ctx->state = ZAN_STATE_READING;
    return 1;
}

namespace {

// Assembles the band of tiles that holds row `row` in the strip buffer: every
// tile of that tile row, of every plane, at its place in the band's rows.
bool ReadTileBand(ConversionContext* ctx, uint32_t row) {
    TIFF* tif = ctx->tiff;
    uint32_t tileWidth = 0;
    TIFFGetField(tif, TIFFTAG_TILEWIDTH, &tileWidth);
    if (tileWidth == 0) return false;
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
    // The rows of one tile that the buffer holds: a tile's rows as the codec
    // sizes them (never more than it decodes).
    const size_t tileRows = tileRow ? std::min<size_t>(rows, static_cast<size_t>(tileSize) / tileRow) : 0;
    for (uint32_t plane = 0; plane < planes; ++plane)
        for (uint32_t x = 0; x < ctx->imageWidth; x += tileWidth) {
            const uint32_t index = TIFFComputeTile(tif, x, top, 0, static_cast<uint16_t>(plane));
            if (ctx->bitsPerSample == 1) std::memset(tile, 0, static_cast<size_t>(tileSize));  // as for rows
            if (TIFFReadEncodedTile(tif, index, tile, tileSize) == -1) return false;
            const uint32_t columns = std::min(tileWidth, ctx->imageWidth - x);
            const size_t from = static_cast<size_t>(uint64_t{x} * pixelBits / 8);
            const size_t bytes = std::min(tileRow, static_cast<size_t>((uint64_t{columns} * pixelBits + 7) / 8));
            for (size_t r = 0; r < tileRows; ++r)
                std::memcpy(ctx->stripBuffer + r * ctx->scanlineSize + static_cast<size_t>(plane) * planeRow + from,
                            tile + r * tileRow, bytes);
        }
    return true;
}

// Converts the band of rows from `top` to RGB in the strip buffer (a raster
// of 32-bit RGBA pixels), rows in the order the page stores them.
bool ReadRgbaBand(ConversionContext* ctx, uint32_t top) {
    TIFF* tif = ctx->tiff;
    char message[1024] = "";
    TIFFRGBAImage image;
    if (!TIFFRGBAImageBegin(&image, tif, 0, message)) {
        TIFFError(TIFFFileName(tif), "%s", message);
        return false;
    }
    image.req_orientation = image.orientation;  // no flips: rows as stored
    image.row_offset = static_cast<int>(top);
    image.col_offset = 0;
    const uint32_t rows = std::min(ctx->rowsPerStrip, ctx->imageHeight - top);
    const int got = TIFFRGBAImageGetPivlo(&image, reinterpret_cast<uint32_t*>(ctx->stripBuffer), ctx->imageWidth, rows);
    TIFFRGBAImageEnd(&image);
    return got != 0;
}

// Row `inBand` of the RGBA band as RGB bytes.
void CopyRgbRow(const ConversionContext* ctx, uint32_t inBand, uint8_t* line) {
    const uint8_t* pixel = ctx->stripBuffer + uint64_t{inBand} * ctx->imageWidth * 4;
    for (uint32_t x = 0; x < ctx->imageWidth; ++x, pixel += 4, line += 3) {
        uint32_t v;
        std::memcpy(&v, pixel, 4);
        line[0] = static_cast<uint8_t>(TIFFGetR(v));
        line[1] = static_cast<uint8_t>(TIFFGetG(v));
        line[2] = static_cast<uint8_t>(TIFFGetB(v));
    }
}

// Reads row currentRow into `read`. False when the codec refuses (it has
// reported).
bool ReadRow(ConversionContext* ctx, uint8_t* read) {
    TIFF* tif = ctx->tiff;
    const uint32_t row = ctx->currentRow;
    if (ctx->readByStrip == kScanlines) {
        // Fax decoders write a row's pixels only, not the bits that pad its
        // last byte: those are cleared, so that every line is the same
        // whatever the buffer held before.
        if (ctx->bitsPerSample == 1) std::memset(read, 0, ctx->scanlineSize);
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
        bool loaded = false;
        if (ctx->readByStrip == kRgbaBands) loaded = ReadRgbaBand(ctx, band * ctx->rowsPerStrip);
        else if (TIFFIsTiled(tif)) loaded = ReadTileBand(ctx, row);
        else loaded = TIFFReadEncodedStrip(tif, band, ctx->stripBuffer, ctx->stripBufferSize) != -1;
        if (!loaded) return false;
        ctx->nextStrip = band + 1;
    }
    const uint32_t inBand = row % ctx->rowsPerStrip;
    if (ctx->readByStrip == kRgbaBands) CopyRgbRow(ctx, inBand, read);
    else std::memcpy(read, ctx->stripBuffer + static_cast<size_t>(ctx->scanlineSize) * inBand, ctx->scanlineSize);
    return true;
}

}  // namespace

// The delivered line, and a row read straight into the line before it is
// widened in place.
uint64_t BytesWrittenToLine(const ConversionContext* ctx) {
    return UsesWorkLine(ctx) ? ctx->lineBytes : std::max(ctx->lineBytes, ctx->scanlineSize);
}

uint32_t ReadNextRow(ConversionContext* ctx, uint8_t* line, uint32_t capacity) {
    if (capacity < BytesWrittenToLine(ctx)) {
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
        if (!ctx->tiff) {
            zanError(ctx, "No page is open for reading.");
            return 0;
        }
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
