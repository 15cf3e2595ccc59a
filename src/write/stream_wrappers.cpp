// zanG4ToTIFF and zanJPEGToTIFF: an already compressed Group 4 or JPEG
// stream wrapped, unchanged, as the single strip of a one-page TIFF. The
// whole job runs inside the call: it ends with no codec object open, no
// memory image held by the module, and the codec's message handlers as they
// were before the call.

#include <algorithm>
#include <cstdio>
#include <utility>

#include "frame/codec_messages.h"
#include "frame/file_stream.h"
#include "frame/host_memory.h"
#include "frame/io_procs.h"
#include "frame/report.h"
#include "frame/tiff_open.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "write/page_tags.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

// Data read from a file or the host's callbacks goes to the codec in pieces:
// large ones from a block of the job (few calls into the codec and the
// file), else 4096 bytes at a time through a buffer of the call.
constexpr uint32_t kSmallPiece = 4096;
constexpr uint32_t kLargePiece = 1u << 20;
// The first block of a memory image is a guess; the image grows as needed.
constexpr uint64_t kLargestFirstBlock = 64u << 20;

// Where the compressed data comes from.
class StreamSource {
public:
    StreamSource() = default;
    StreamSource(const StreamSource&) = delete;
    StreamSource& operator=(const StreamSource&) = delete;
    ~StreamSource() {
        if (ctx_) ReleaseBlock(ctx_, large_);
    }

    // The data of the job's source: the memory block, a stream with read
    // (and, for JPEG, seek) callbacks, or sourceFp (from sourceBaseOffset,
    // or as it stands when `fromCurrent`). False after a reported refusal.
    bool Open(ConversionContext* ctx, bool fromCurrent) {
        ctx_ = ctx;
        if (ctx->sourceKind == ZAN_SOURCE_MEMORY && ctx->sourceMemory) {
            memory_ = static_cast<const uint8_t*>(ctx->sourceMemory);
            size_ = ctx->sourceMemorySize;
            return true;
        }
        if (ctx->sourceKind == ZAN_SOURCE_STREAM && !ctx->sourceFp) {
            if (!ctx->sourceReadProc || (!fromCurrent && !ctx->sourceSeekProc))
                return ReportError(ctx, "A stream source needs its read function (and for JPEG data its seek function).");
            if (!fromCurrent && ctx->sourceSeekProc(0, SEEK_SET, ctx->sourceUserData) != 0)
                return ReportError(ctx, "The stream source cannot go back to its start.");
        } else {
            if (!ctx->sourceFp) return ReportError(ctx, "There is no source stream to read the data from.");
            if (!fromCurrent && SeekStream(ctx->sourceFp, ctx->sourceBaseOffset, SEEK_SET) != 0)
                return ReportError(ctx, "The source file cannot be read.");
            file_ = ctx->sourceFp;
        }
        const uint64_t expected = Expected();
        if (expected == 0 || expected > kSmallPiece) {
            large_ = static_cast<uint8_t*>(AllocateBlock(ctx, kLargePiece));
        }
        return true;
    }

    // How many bytes the data probably holds (0 when unknown), for the
    // first size of a memory image.
    uint64_t Expected() const {
        if (memory_) return size_;
        if (!file_) return 0;
        const int64_t end = StreamSize(file_), at = TellStream(file_);
        return end > at && at >= 0 ? static_cast<uint64_t>(end - at) : 0;
    }

    // The next piece (a memory source at once). 0 at the end of the data or
    // on a read error.
    uint32_t Next(const uint8_t** data) {
        if (memory_) {
            *data = memory_;
            return std::exchange(size_, 0);
        }
        uint8_t* buffer = large_ ? large_ : small_;
        const uint32_t room = large_ ? kLargePiece : kSmallPiece;
        *data = buffer;
        if (file_) return static_cast<uint32_t>(std::fread(buffer, 1, room, file_));
        // The host's reads may deliver less than asked: fill the piece.
        uint32_t filled = 0;
        while (filled < room) {
            const int32_t got = ctx_->sourceReadProc(buffer + filled, static_cast<int32_t>(room - filled),
                                                     ctx_->sourceUserData);
            if (got <= 0) break;
            filled += std::min<uint32_t>(static_cast<uint32_t>(got), room - filled);
        }
        return filled;
    }

private:
    ConversionContext* ctx_ = nullptr;
    const uint8_t* memory_ = nullptr;
    uint32_t size_ = 0;
    FILE* file_ = nullptr;
    uint8_t* large_ = nullptr;
    uint8_t small_[kSmallPiece];
};

// The frame both wrappers share: the destination opened, the page written
// through the tags and the data, the result handed over, and everything
// closed again whatever happens.
class Wrapper {
public:
    // Routes the codec's messages to the job's sinks for the call; the
    // handlers in force before it are put back at its end (a job whose own
    // routing was in force keeps it).
    explicit Wrapper(ConversionContext* ctx) : ctx_(ctx), routedBefore_(CodecMessagesRedirected(ctx)) {
        RedirectCodecMessages(ctx);
    }
    ~Wrapper() {
        // A codec object of the call still open means the page was not written.
        if (opened_ && ctx_->tiff) {
            TIFFClose(ctx_->tiff);
            ctx_->tiff = nullptr;
            DiscardMemoryImage(ctx_);
        }
        if (opened_) ReleaseFileHandle(ctx_);
        if (!routedBefore_) RestoreCodecMessages(ctx_);
    }

    bool Open(const WriteOpening& opening) {
        if (ctx_->destKind == ZAN_DEST_MEMORY) {
            if (ctx_->destMemory) *static_cast<void**>(ctx_->destMemory) = nullptr;
            if (ctx_->destSizeOut) *ctx_->destSizeOut = 0;
        }
        zanResetWorkBuffer(ctx_);
        // A codec object the job holds is not this call's to write to.
        if (ctx_->tiff) return ReportError(ctx_, "A page is being written in this job.");
        ctx_->outputWidth = ctx_->imageWidth;
        ctx_->outputHeight = ctx_->imageHeight;
        opened_ = OpenTIFFForWriting(ctx_, opening) != 0;
        return opened_;
    }

    // The data as strip 0, in pieces, then the directory; the result is
    // handed over. False after a failure (reported by the codec or here).
    bool Write(StreamSource& source) {
        TIFF* tif = ctx_->tiff;
        uint64_t total = 0;
        const uint8_t* data = nullptr;
        for (uint32_t n; (n = source.Next(&data)) > 0; total += n)
            if (TIFFWriteRawStrip(tif, 0, const_cast<uint8_t*>(data), n) == -1) return false;
        // A page without strip data would be a file libtiff cannot open.
        if (total == 0) return ReportError(ctx_, "The source holds no data to wrap.");
        if (!TIFFWriteDirectory(tif)) return false;
        const bool failed = TIFFIOFailedPivlo(tif) != 0;
        TIFFClose(tif);
        ctx_->tiff = nullptr;
        if (failed) {
            DiscardMemoryImage(ctx_);
            return ReportError(ctx_, "Unable to write the page to the destination.");
        }
        HandOverResult(ctx_);
        return true;
    }

private:
    ConversionContext* ctx_;
    bool routedBefore_;
    bool opened_ = false;
};

// The first block of a memory image. The page is the stream and a few
// hundred bytes of structure, so a stream of known length sizes it; else
// `guess` does. Never below 60 bytes, and no larger than a first guess needs
// to be (the image grows on demand).
uint64_t FirstBlock(const StreamSource& source, uint64_t guess) {
    const uint64_t expected = source.Expected();
    return std::clamp<uint64_t>(expected ? expected + 1024 : guess, 60, kLargestFirstBlock);
}

// ---- JPEG ----

// Whether the JPEG can be a TIFF page as it is; the reason when it cannot.
// Colour is YCbCr with chroma of 1 x 1 (libtiff reads no other layout) and
// luma of 1, 2 or 4 each way, or RGB without subsampling; grey has no
// sampling of its own.
const char* JpegUnfit(const ConversionContext* ctx, bool* rgb) {
    const int32_t* h = ctx->horizontalSampling;
    const int32_t* v = ctx->verticalSampling;
    *rgb = ctx->imageType == ZAN_IMAGE_RGB;
    if (ctx->componentCount != 3 && ctx->componentCount != 1) return "No direct conversion: num components not 3 or 1.";
    if (ctx->bitsPerSample != 0 && ctx->bitsPerSample != 8) return "No direct conversion: samples are not of 8 bits.";
    if (ctx->componentCount == 1) return h[0] == 1 && v[0] == 1 ? nullptr : "No direct conversion: Invalid subsampling factors.";
    if (h[1] != h[2] || v[1] != v[2]) return "No direct conversion: Unequal subsampling factors for the cb and cr comps.";
    if (h[1] <= 0 || v[1] <= 0 || h[0] < h[1] || v[0] < v[1]) return "No direct conversion: Invalid subsampling factors.";
    const int32_t hr = h[0] / h[1], vr = v[0] / v[1];
    const auto allowed = [](int32_t r) { return r == 1 || r == 2 || r == 4; };
    if (h[0] % h[1] != 0 || v[0] % v[1] != 0 || !allowed(hr) || !allowed(vr) || h[1] != 1 || v[1] != 1 ||
        (*rgb && (hr != 1 || vr != 1)))
        return "No direct conversion: Invalid subsampling factors.";
    return nullptr;
}

void SetJpegTags(ConversionContext* ctx, TIFF* tif, bool rgb) {
    const bool colour = ctx->componentCount == 3;
    SetWholePageTags(ctx, tif, ctx->imageWidth, ctx->imageHeight);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_JPEG);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, colour ? 3 : 1);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC,
                 !colour ? PHOTOMETRIC_MINISBLACK : rgb ? PHOTOMETRIC_RGB : PHOTOMETRIC_YCBCR);
    if (colour && !rgb)
        TIFFSetField(tif, TIFFTAG_YCBCRSUBSAMPLING, ctx->horizontalSampling[0] / ctx->horizontalSampling[1],
                     ctx->verticalSampling[0] / ctx->verticalSampling[1]);
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, ctx->imageHeight);
    // The resolution asked for, else the stream's own.
    SetResolution(ctx, tif, ctx->xResolution, ctx->yResolution);
}

int WrapJpeg(ConversionContext* ctx, uint32_t* directConversion) {
    if (!zanGetImageInfo(ctx)) return 0;
    bool rgb = false;
    if (const char* reason = JpegUnfit(ctx, &rgb)) {
        *directConversion = 0;
        zanTrace(ctx, reason, 1);
        return 1;
    }
    Wrapper wrapper(ctx);
    StreamSource source;
    if (!source.Open(ctx, false)) return 0;
    WriteOpening opening;
    opening.reopenFailure = "Reopening file";
    // Without the stream's length: a tenth of the 1-bit image.
    opening.memoryCapacity = FirstBlock(source, uint64_t{ctx->imageHeight} * (ctx->imageWidth / 8) / 10 + 60);
    if (!wrapper.Open(opening)) return 0;
    SetJpegTags(ctx, ctx->tiff, rgb);
    return wrapper.Write(source) ? 1 : 0;
}

// ---- Group 4 ----

void SetG4Tags(ConversionContext* ctx, TIFF* tif) {
    SetWholePageTags(ctx, tif, ctx->imageWidth, ctx->imageHeight);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 1);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 1);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, ctx->whiteIsZero ? PHOTOMETRIC_MINISWHITE : PHOTOMETRIC_MINISBLACK);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_CCITTFAX4);
    if (ctx->t6OptionsSet) TIFFSetField(tif, TIFFTAG_GROUP4OPTIONS, ctx->t6Options);
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, ctx->imageHeight);
    SetResolution(ctx, tif);
}

int WrapG4(ConversionContext* ctx) {
    Wrapper wrapper(ctx);
    StreamSource source;
    if (!source.Open(ctx, true)) return 0;
    WriteOpening opening;
    // Without the stream's length: half the 1-bit image.
    opening.memoryCapacity =
        FirstBlock(source, uint64_t{ctx->imageHeight} * ((uint64_t{ctx->imageWidth} + 7) / 8) / 2 + 60);
    if (!wrapper.Open(opening)) return 0;
    SetG4Tags(ctx, ctx->tiff);
    return wrapper.Write(source) ? 1 : 0;
}

}  // namespace
}  // namespace zan

extern "C" ZAN_API int zanG4ToTIFF(ConversionContext* ctx) {
    if (!ctx) return 0;
    return zan::WrapG4(ctx);
}

extern "C" ZAN_API int zanJPEGToTIFF(ConversionContext* ctx, uint32_t* directConversion) {
    if (!ctx) return 0;
    uint32_t unused = 1;
    return zan::WrapJpeg(ctx, directConversion ? directConversion : &unused);
}
