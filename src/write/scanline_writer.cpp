// zanTIFFWriteNextScanLine: pages written one line at a time. The first line
// of a page checks the description, opens the destination if need be and
// sets every tag; each line then goes to the codec.

#include <algorithm>
#include <limits>

#include "frame/report.h"
#include "frame/tiff_open.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "write/page_setup.h"
#include "write/page_tags.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

// 16-bit samples go out as 8 unless 16 bits are asked for.
bool ReducesTo8(const ConversionContext* ctx) {
    return ctx->bitsPerSample == 16 && ctx->outputBitsPerSample != 16;
}

bool Writes16(const ConversionContext* ctx) {
    return ctx->bitsPerSample == 16 && ctx->outputBitsPerSample == 16;
}

// Sets `tag` to the value only when the page does not hold it yet, so that
// a caller's zanTIFFSetField wins over the default.
template <typename... Values>
void SetIfAbsent(TIFF* tif, uint32_t tag, Values... values) {
    if (!TIFFFieldIsSetPivlo(tif, tag)) TIFFSetField(tif, tag, values...);
}

// YCbCrSubsampling from the host's sampling factors: the luma factor over
// the larger chroma factor, as 1, 2 or 4.
uint16_t SubsamplingFactor(const int32_t factors[3]) {
    const int32_t chroma = std::max(factors[1], factors[2]);
    const int32_t ratio = chroma > 0 ? factors[0] / chroma : 1;
    return ratio >= 4 ? 4 : ratio < 2 ? 1 : 2;
}

void SetCompressionTags(ConversionContext* ctx, TIFF* tif) {
    switch (ctx->outputCompression) {
    case ZAN_COMPRESSION_NONE: TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_NONE); break;
    case ZAN_COMPRESSION_PACKBITS: TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_PACKBITS); break;
    case ZAN_COMPRESSION_CCITT_G3:
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_CCITTFAX3);
        SetIfAbsent(tif, TIFFTAG_SUBFILETYPE, FILETYPE_PAGE);
        SetIfAbsent(tif, TIFFTAG_PAGENUMBER, 0, 1);
        SetIfAbsent(tif, TIFFTAG_SOFTWARE, "TarnelScan");
        TIFFSetField(tif, TIFFTAG_FILLORDER, FILLORDER_LSB2MSB);
        SetIfAbsent(tif, TIFFTAG_GROUP3OPTIONS, 0);
        break;
    case ZAN_COMPRESSION_CCITT_G4:
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_CCITTFAX4);
        if (ctx->t6OptionsSet) TIFFSetField(tif, TIFFTAG_GROUP4OPTIONS, ctx->t6Options);
        break;
    case ZAN_COMPRESSION_JPEG:
        if (ctx->outputColorSpace == ZAN_COLORSPACE_GREY) {
            TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_JPEG);
            break;
        }
        // Colour lines go in as RGB; the codec stores them as YCbCr.
        TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_YCBCR);
        if (ctx->outputSamplingCount == 3)
            TIFFSetField(tif, TIFFTAG_YCBCRSUBSAMPLING, SubsamplingFactor(ctx->outputHorizontalSampling),
                         SubsamplingFactor(ctx->outputVerticalSampling));
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_JPEG);
        TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
        break;
    case ZAN_COMPRESSION_LZW:
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_LZW);
        if (ctx->lzwPredictor == 2) TIFFSetField(tif, TIFFTAG_PREDICTOR, PREDICTOR_HORIZONTAL);
        break;
    case ZAN_COMPRESSION_DEFLATE: TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_DEFLATE); break;
    default: break;  // the host's own codes: the page keeps what it has
    }
}

// Checks the description and sets the page up (state 4). 0 after a
// reported refusal, with the state as it was.
uint32_t SetUpPage(ConversionContext* ctx) {
    if (ctx->outputColorSpace < 1 || ctx->outputColorSpace > 8) return ReportError(ctx, "Source colorspace not supported.");
    if (ctx->imageWidth == 0 || ctx->imageHeight == 0) return ReportError(ctx, "Image dimension can not be zero.");
    if (ctx->outputCompression < 1 || ctx->outputCompression > 12)
        return ReportError(ctx, "Unrecognized or unset compression.");
    if (ctx->outputColorSpace == ZAN_COLORSPACE_BILEVEL && ctx->outputCompression != ZAN_COMPRESSION_NONE &&
        ctx->outputCompression != ZAN_COMPRESSION_CCITT_G3 && ctx->outputCompression != ZAN_COMPRESSION_CCITT_G4)
        return ReportError(ctx, "G4 and no compression is the only compression method supported for BW.");
    if (!OpenTIFFForWriting(ctx)) return 0;
    if (ctx->outputBitsPerSample == 16 && ctx->bitsPerSample == 8)
        return ReportError(ctx, "Compressing from 8 to 16 bits image is not supported.");
    if (ctx->outputBitsPerSample == 16 && ctx->bitsPerSample == 1)
        return ReportError(ctx, "Compressing from 1 to 16 bits image is not supported.");
    ColourLayout layout;
    ColourLayoutFor(ctx->outputColorSpace, ctx->imageWidth, Writes16(ctx), ctx->whiteIsZero != 0,
                    ctx->componentCount, &layout);
    if (layout.rowBytes == 0 || layout.rowBytes > std::numeric_limits<uint32_t>::max() / 2)
        return ReportError(ctx, "Image dimension can not be zero.");

    TIFF* tif = ctx->tiff;
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, ctx->imageWidth);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, ctx->imageHeight);
    SetIfAbsent(tif, TIFFTAG_ORIENTATION, ctx->outputOrientation ? ctx->outputOrientation : ORIENTATION_TOPLEFT);
    SetIfAbsent(tif, TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG);
    SetIfAbsent(tif, TIFFTAG_SOFTWARE, TIFFGetVersionLinePivlo());
    SetIfAbsent(tif, TIFFTAG_FILLORDER, FILLORDER_MSB2LSB);
    SetColourTags(tif, layout);
    ctx->lineBytes = static_cast<uint32_t>(layout.rowBytes);
    SetCompressionTags(ctx, tif);
    SetResolution(ctx, tif);
    SetIccProfile(ctx, tif);
    uint32_t rowsPerStrip = 0;
    if (!TIFFGetField(tif, TIFFTAG_ROWSPERSTRIP, &rowsPerStrip)) rowsPerStrip = 0;
    if (rowsPerStrip == 0)
        TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, ctx->outputCompression == ZAN_COMPRESSION_CCITT_G3
                                                    ? ctx->imageHeight
                                                    : TIFFDefaultStripSize(tif, 0xFFFFFFFFu));
    if (ctx->writeMetadataList) ApplyPageMetadata(ctx, tif);
    ctx->state = ZAN_STATE_WRITING;
    ctx->currentRow = 0;
    return 1;
}

}  // namespace
}  // namespace zan

extern "C" ZAN_API uint32_t zanTIFFWriteNextScanLine(ConversionContext* ctx, void* line, uint32_t lineSize) {
    using namespace zan;
    if (!ctx) return 0;
    if (ctx->state == ZAN_STATE_READING) return ReportError(ctx, "Cannot write while reading.");
    if ((ctx->state == ZAN_STATE_IDLE || ctx->state == ZAN_STATE_PAGE_CLOSED) && !SetUpPage(ctx)) return 0;
    if (!ctx->tiff) return ReportError(ctx, "Unable to create TIFF object");
    // A line that is reduced from 16 bits holds two bytes for every byte written.
    const uint64_t needed = uint64_t{ctx->lineBytes} * (ReducesTo8(ctx) ? 2 : 1);
    if (!line || lineSize < needed) return ReportError(ctx, "Incorrect line size.");
    auto* bytes = static_cast<uint8_t*>(line);
    if (ReducesTo8(ctx)) KeepHighBytes(bytes, ctx->lineBytes);
    if (TIFFWriteScanline(ctx->tiff, bytes, ctx->currentRow, 0) == -1) return 0;
    ++ctx->currentRow;
    return lineSize;
}
