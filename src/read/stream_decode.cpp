// Stream decoding: a TIFF that arrives in pieces, fed by the host to the
// codec's push decoder. The module creates and ends the decoder, describes
// the page when its directory has arrived, forms the rows of bands with the
// scanline reader (so that they are exactly the rows zanTIFFReadNextScanLine
// gives), tells whether the page is one compressed chunk, and switches the
// decoder to raw delivery or to libjpeg for such a chunk on request.

#include <algorithm>
#include <cmath>
#include <iterator>

#include "frame/codec_messages.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "read/page_description.h"
#include "read/scanline_reader.h"
#include "zantiff/stream_chunk.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

TIFFStreamDecoder* DecoderOf(const ConversionContext* ctx) {
    return static_cast<TIFFStreamDecoder*>(ctx->streamDecoder);
}

// Ends the job's decoder, if it has one.
void EndDecoder(ConversionContext* ctx) {
    TIFFStreamDecoder* decoder = DecoderOf(ctx);
    ctx->streamDecoder = nullptr;
    TIFFStreamDecodeEnd(ctx, &decoder);
}

// ---- rows of bands: the scanline reader on the decoder's codec object ----
// The codec object is the job's only while a row is formed: the decoder owns
// and closes it.

class BorrowedTiff {
public:
    BorrowedTiff(ConversionContext* ctx, TIFF* tif) : ctx_(ctx) { ctx_->tiff = tif; }
    ~BorrowedTiff() { ctx_->tiff = nullptr; }

private:
    ConversionContext* ctx_;
};

uint32_t BeginRows(void* user, TIFF* tif, uint32_t* written) {
    auto* ctx = static_cast<ConversionContext*>(user);
    const BorrowedTiff borrowed(ctx, tif);
    // The page described at the header is the one read: the first.
    const int32_t page = ctx->pageNumber;
    ctx->pageNumber = 0;
    ctx->state = ZAN_STATE_DESCRIBED;
    const uint32_t ready = SetUpPage(ctx);
    ctx->pageNumber = page;
    if (!ready) {
        ctx->state = ZAN_STATE_IDLE;
        return 0;
    }
    *written = static_cast<uint32_t>(BytesWrittenToLine(ctx));
    return ctx->lineBytes;
}

int ReadRow(void* user, TIFF* tif, uint8_t* row) {
    auto* ctx = static_cast<ConversionContext*>(user);
    const BorrowedTiff borrowed(ctx, tif);
    return ReadNextRow(ctx, row, static_cast<uint32_t>(BytesWrittenToLine(ctx))) != 0;
}

void EndRows(void* user) {
    auto* ctx = static_cast<ConversionContext*>(user);
    if (ctx->state == ZAN_STATE_READING) ReleaseReaderBuffers(ctx);
    ctx->state = ZAN_STATE_IDLE;
}

// ---- the page described ----

// Compression 7 without tables outside the strip, or 4; and a single strip
// or tile the size of the image. The chunk type (4 or 5), or 0.
uint32_t OneChunkType(ConversionContext* ctx, TIFF* tif) {
    uint16_t compression = COMPRESSION_NONE;
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    uint32_t type = 0;
    if (compression == COMPRESSION_JPEG) {
        constexpr uint32_t kTables[] = {TIFFTAG_JPEGTABLES, TIFFTAG_JPEGIFOFFSET, TIFFTAG_JPEGLOSSLESSPREDICTORS,
                                        TIFFTAG_JPEGPOINTTRANSFORM, TIFFTAG_JPEGQTABLES, TIFFTAG_JPEGDCTABLES,
                                        TIFFTAG_JPEGACTABLES};
        if (std::any_of(std::begin(kTables), std::end(kTables), [&](uint32_t tag) { return TIFFFieldIsSetPivlo(tif, tag); }))
            return 0;
        type = 5;
    } else if (compression == COMPRESSION_CCITTFAX4) {
        type = 4;
    } else {
        return 0;
    }
    // A strip of at least the image's rows is the one strip of the image.
    if (TIFFIsTiled(tif)) {
        uint32_t width = 0, length = 0;
        TIFFGetField(tif, TIFFTAG_TILEWIDTH, &width);
        TIFFGetField(tif, TIFFTAG_TILELENGTH, &length);
        return width == ctx->imageWidth && length == ctx->imageHeight ? type : 0;
    }
    uint32_t rows = 0;
    TIFFGetFieldDefaulted(tif, TIFFTAG_ROWSPERSTRIP, &rows);
    return rows >= ctx->imageHeight && TIFFNumberOfStrips(tif) == 1 ? type : 0;
}

int DescribeStreamPage(ConversionContext* ctx, TIFFStreamDecoder* decoder) {
    TIFF* tif = TIFFStreamDecodeTIFF(decoder);
    if (!tif || !ReadImageDescription(ctx, tif)) return ZAN_STREAM_ERROR;
    const uint32_t code = TIFFStreamDecodeColorSpace(decoder);
    if (code == 29 || code == 30 || code == 32) ctx->colorSpace = code;
    ctx->streamMode = ZAN_STREAM_DESCRIBED;
    if (const uint32_t type = OneChunkType(ctx, tif)) {
        ctx->streamMode = ZAN_STREAM_ONE_CHUNK;
        ctx->chunkType = type;
    }
    return ZAN_STREAM_PAGE_DESCRIBED;
}

// ---- bands ----

// The ink values of a separated band spread from the dot range to 0..255.
// The result depends on the byte alone: worked out once for each of the 256
// values, then looked up.
void StretchDotRange(const ConversionContext* ctx, uint8_t* band, uint64_t bytes) {
    const int span = int{ctx->dotRangeHigh} - int{ctx->dotRangeLow};
    const float low = ctx->dotRangeLow;
    uint8_t stretched[256];
    for (int value = 0; value < 256; ++value) {
        float v = 0;
        if (span == 0) {
            v = static_cast<float>(value) > low ? 255.0f : 0.0f;  // equal bounds: a threshold
        } else {
            const auto factor = static_cast<float>(255.0 / span);
            v = (static_cast<float>(value) - low) * factor;
        }
        stretched[value] = static_cast<uint8_t>(std::clamp(v, 0.0f, 255.0f));
    }
    for (uint64_t i = 0; i < bytes; ++i) band[i] = stretched[band[i]];
}

int HandOverBand(ConversionContext* ctx, TIFFStreamDecoder* decoder, StreamChunk* chunk) {
    if (ctx->streamMode == ZAN_STREAM_NO_DECOMPRESSION) {
        chunk->output = ctx->rawOutput;
        chunk->rawSize = ctx->rawOutputSize;
        return ZAN_STREAM_CONTINUE;
    }
    const TIFFStreamBand* band = TIFFStreamDecodeBand(decoder);
    chunk->output = band->data;
    chunk->bandWidth = band->width;
    if (ctx->streamMode == ZAN_STREAM_BYPASS) {
        chunk->bandRows = band->bypassRows;
        chunk->bandValue = 0;
        const uint64_t done = uint64_t{ctx->rowsDelivered} + band->bypassRows;
        chunk->rowsRemaining = ctx->imageHeight > done ? static_cast<uint32_t>(ctx->imageHeight - done) : 0;
        return ZAN_STREAM_CONTINUE;
    }
    chunk->bandRows = band->rows;
    chunk->bandValue = band->value;
    chunk->rowsRemaining = band->rowsRemaining;
    // Only bands of four bytes a pixel hold four inks of 8 bits.
    const uint64_t pixelBytes = uint64_t{band->width} * 4;
    if (TIFFStreamDecodeColorSpace(decoder) == 5 && band->value == pixelBytes)
        StretchDotRange(ctx, static_cast<uint8_t*>(band->data), pixelBytes * band->rows);
    return ZAN_STREAM_CONTINUE;
}

// The decoder's chunk, as the job records it.
void RecordChunk(ConversionContext* ctx, TIFF* tif) {
    uint32_t offset = 0, size = 0;
    TIFFGetStrileOffset32(tif, 0, &offset);
    TIFFGetStrileByteCount32(tif, 0, &size);
    ctx->rawChunkOffset = offset;
    ctx->rawChunkSize = size;
}

// Raw delivery and bypass are chosen before anything of the page was
// delivered, for a page that is one chunk.
bool MayChooseChunkDelivery(const ConversionContext* ctx) {
    TIFFStreamDecoder* decoder = DecoderOf(ctx);
    return decoder && ctx->streamMode == ZAN_STREAM_ONE_CHUNK && !TIFFStreamDecodeStarted(decoder);
}

}  // namespace
}  // namespace zan

using namespace zan;

extern "C" ZAN_API int zanTIFFStreamDecodeInit(ConversionContext* ctx, void* hostValue) {
    if (!ctx) return 0;
    // The rows of bands come from the job's reader: not while it writes.
    if (RefuseWhileWriting(ctx)) return 0;
    // A decoder of an earlier stream of the job is not left behind.
    EndDecoder(ctx);
    RedirectCodecMessages(ctx);
    // Every stream starts undescribed, whatever an earlier one chose.
    ctx->streamMode = ZAN_STREAM_NOTHING;
    ctx->chunkType = ctx->rowsDelivered = 0;
    TIFFStreamDecoder* decoder = TIFFStreamDecodeInit(hostValue, ctx);
    ctx->streamDecoder = decoder;
    if (!decoder) {
        zanError(ctx, "TIFF Stream decode initialization error.");
        return 0;
    }
    const TIFFStreamRowReader reader{ctx, BeginRows, ReadRow, EndRows};
    TIFFStreamDecodeSetRowReader(decoder, &reader);
    return 2;
}

extern "C" ZAN_API int zanTIFFStreamDecode(ConversionContext* ctx, StreamChunk* chunk) {
    if (!ctx) return ZAN_STREAM_ERROR;
    TIFFStreamDecoder* decoder = DecoderOf(ctx);
    if (!decoder || !chunk) {
        zanError(ctx, decoder ? "No stream chunk was given." : "The stream decoder has not been started.");
        return ZAN_STREAM_ERROR;
    }
    uint32_t consumed = 0;
    const int status = TIFFStreamDecode(decoder, chunk->input, chunk->input ? chunk->inputLength : 0, &consumed);
    chunk->output = nullptr;
    chunk->bandWidth = chunk->bandRows = chunk->bandValue = chunk->rowsRemaining = 0;
    int result = ZAN_STREAM_ERROR;
    switch (status) {
    case TIFF_STREAM_ERROR: return ZAN_STREAM_ERROR;  // the input stays where it was
    case TIFF_STREAM_NEED_INPUT: result = ZAN_STREAM_CONTINUE; break;
    case TIFF_STREAM_HEADER: result = DescribeStreamPage(ctx, decoder); break;
    case TIFF_STREAM_BAND: result = HandOverBand(ctx, decoder, chunk); break;
    case TIFF_STREAM_PAGE_DONE: result = ZAN_STREAM_STATUS_5; break;
    case TIFF_STREAM_TRUNCATED: result = ZAN_STREAM_STATUS_6; break;
    default: zanError(ctx, "The stream decoder gave an unknown status."); return ZAN_STREAM_ERROR;
    }
    chunk->input += consumed;
    chunk->inputConsumed += consumed;
    chunk->inputLength -= consumed;
    return result;
}

extern "C" ZAN_API int zanTIFFStreamDecodeComplete(ConversionContext* ctx) {
    if (ctx) TIFFStreamDecodeComplete(DecoderOf(ctx));
    return 1;
}

extern "C" ZAN_API int zanTIFFStreamDecodeEnd(ConversionContext* ctx) {
    if (!ctx) return 1;
    EndDecoder(ctx);
    RestoreCodecMessages(ctx);
    return 1;
}

extern "C" ZAN_API int zanTIFFStreamDecodeIsOneChunkTIFF(ConversionContext* ctx, uint32_t* answer) {
    uint32_t unused = 0;
    if (!answer) answer = &unused;
    *answer = 0;
    if (!ctx) return 0;
    if (ctx->streamMode == ZAN_STREAM_DESCRIBED) return 1;
    if (ctx->streamMode != ZAN_STREAM_ONE_CHUNK) return 0;
    *answer = ctx->chunkType;
    return 1;
}

extern "C" ZAN_API int zanTIFFStreamDecodeSetNoDecompression(ConversionContext* ctx) {
    if (!ctx || !MayChooseChunkDelivery(ctx)) return 0;
    ctx->streamMode = ZAN_STREAM_NO_DECOMPRESSION;
    RecordChunk(ctx, TIFFStreamDecodeTIFF(DecoderOf(ctx)));
    return 1;
}

extern "C" ZAN_API int zanTIFFStreamDecodeSetBypassLibTiff(ConversionContext* ctx) {
    if (!ctx) return 0;
    if (ctx->streamMode == ZAN_STREAM_BYPASS) return 1;
    if (!MayChooseChunkDelivery(ctx) || ctx->chunkType != 5) return 0;
    switch (zanGetColorSpaceIfConvertedToRaw(ctx)) {
    case ZAN_COLORSPACE_BILEVEL:
    case ZAN_COLORSPACE_GREY: ctx->outputSamplesPerPixel = 1; break;
    case ZAN_COLORSPACE_CMYK: ctx->outputSamplesPerPixel = 4; break;
    case ZAN_COLORSPACE_RGB: ctx->outputSamplesPerPixel = 3; break;
    default: break;
    }
    ctx->streamMode = ZAN_STREAM_BYPASS;
    RecordChunk(ctx, TIFFStreamDecodeTIFF(DecoderOf(ctx)));
    return 1;
}

extern "C" ZAN_API int zanTIFFStreamDecodeSetRawBufferOutSize(ConversionContext* ctx, uint32_t size) {
    if (ctx) ctx->rawBufferOutSize = size;
    return 1;
}
