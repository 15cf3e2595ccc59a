// zanFrameBufferToTIFF: the host's whole frame as one page in one call,
// bi-level frames in CCITT Group 4 and all others in PackBits.

#include <algorithm>
#include <limits>

#include "frame/checked_size.h"
#include "frame/codec_messages.h"
#include "frame/host_memory.h"
#include "frame/report.h"
#include "frame/tiff_open.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "write/page_setup.h"
#include "write/page_tags.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

// Closes what the call opened: the codec object first (closing may still
// write, and what it reports still reaches the host), then the handlers
// and the file record.
void CloseJob(ConversionContext* ctx) {
    if (ctx->tiff) {
        TIFFClose(ctx->tiff);
        ctx->tiff = nullptr;
    }
    RestoreCodecMessages(ctx);
    ReleaseFileHandle(ctx);
}

int FailWrite(ConversionContext* ctx) {
    CloseJob(ctx);
    DiscardMemoryImage(ctx);
    return 0;
}

void SetPageTags(ConversionContext* ctx, TIFF* tif, const ColourLayout& layout) {
    SetWholePageTags(ctx, tif, ctx->frameWidth, ctx->frameHeight);
    TIFFSetField(tif, TIFFTAG_SOFTWARE, TIFFGetVersionLinePivlo());
    const bool bilevel = ctx->colorSpace == ZAN_COLORSPACE_BILEVEL;
    SetColourTags(tif, layout);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, bilevel ? COMPRESSION_CCITTFAX4 : COMPRESSION_PACKBITS);
    if (bilevel && ctx->t6OptionsSet) TIFFSetField(tif, TIFFTAG_GROUP4OPTIONS, ctx->t6Options);
    SetResolution(ctx, tif);
    SetIccProfile(ctx, tif);
}

}  // namespace
}  // namespace zan

extern "C" ZAN_API int zanFrameBufferToTIFF(ConversionContext* ctx) {
    using namespace zan;
    if (!ctx) return 0;
    const uint32_t space = ctx->colorSpace;
    if (space != ZAN_COLORSPACE_BILEVEL && space != ZAN_COLORSPACE_GREY && space != ZAN_COLORSPACE_GREY_ALPHA &&
        space != ZAN_COLORSPACE_RGB_ALPHA && space != ZAN_COLORSPACE_RGB)
        return ReportError(ctx, "Incompatible frame type");
    if (ctx->outputBitsPerSample == 16 && ctx->bitsPerSample == 8)
        return ReportError(ctx, "Compressing from 8 to 16 bits image is not supported.");
    if (ctx->outputBitsPerSample == 16 && ctx->bitsPerSample == 1)
        return ReportError(ctx, "Compressing from 1 to 16 bits image is not supported.");
    const bool sixteen = ctx->bitsPerSample == 16 && ctx->outputBitsPerSample == 16;
    const bool reduce = ctx->bitsPerSample == 16 && !sixteen;
    ColourLayout layout;
    ColourLayoutFor(space, ctx->frameWidth, sixteen, ctx->frameWhiteIsZero != 0, 0, &layout);
    if (ctx->frameWidth == 0 || ctx->frameHeight == 0 || !ctx->frameData)
        return ReportError(ctx, "Image dimension can not be zero.");
    // The frame must hold every row (twice the bytes when reduced from 16
    // bits), and a 32-bit size must be able to say so.
    uint64_t frameBytes = 0;
    if (!MultiplySizes(layout.rowBytes, ctx->frameHeight, reduce ? 2 : 1, &frameBytes) || !FitsIn32(frameBytes) ||
        (ctx->frameBufferSize != 0 && ctx->frameBufferSize < frameBytes))
        return ReportError(ctx, "Frame buffer too small for the frame described.");

    zanResetWorkBuffer(ctx);
    if (!OpenTIFFForWriting(ctx)) return 0;
    TIFF* tif = ctx->tiff;
    SetPageTags(ctx, tif, layout);
    auto* frame = static_cast<uint8_t*>(ctx->frameData);
    // The 8-bit rows end up packed one after another at the frame's start.
    if (reduce) KeepHighBytes(frame, layout.rowBytes * ctx->frameHeight);
    const uint32_t rowsPerStrip = std::max<uint32_t>(1, TIFFDefaultStripSize(tif, 0xFFFFFFFFu));
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, rowsPerStrip);
    if (ctx->writeMetadataList) ApplyPageMetadata(ctx, tif);

    for (uint32_t row = 0; row < ctx->frameHeight; row += rowsPerStrip) {
        const uint32_t rows = std::min(rowsPerStrip, ctx->frameHeight - row);
        const uint8_t* data = frame + uint64_t{row} * layout.rowBytes;
        if (TIFFWriteEncodedStrip(tif, row / rowsPerStrip, const_cast<uint8_t*>(data),
                                  static_cast<tmsize_t>(uint64_t{rows} * layout.rowBytes)) == -1)
            return FailWrite(ctx);
    }
    if (!FinishPage(ctx)) return FailWrite(ctx);
    const bool failedWrite = TIFFIOFailedPivlo(tif) != 0;
    CloseJob(ctx);
    if (failedWrite) {
        DiscardMemoryImage(ctx);
        return ReportError(ctx, "Unable to write the page to the destination.");
    }
    HandOverResult(ctx);
    return 1;
}
