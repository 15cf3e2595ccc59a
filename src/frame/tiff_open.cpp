// Opening codec objects on every kind of source and destination, and the
// teardown that ends a job.

#include "frame/tiff_open.h"

#include <algorithm>
#include <cstdio>

#include "frame/codec_messages.h"
#include "frame/host_memory.h"
#include "frame/io_procs.h"
#include "frame/job_finishers.h"
#include "frame/tiff_extent.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

TIFF* OpenCodecObject(ConversionContext* ctx, const char* mode, const ClientProcs& p) {
    TIFF* tif = TIFFClientOpenPivlo("", mode, ctx, p.read, p.write, p.seek, p.close, p.size,
                                    p.map, p.unmap, ctx->allocProc, ctx->reallocProc,
                                    ctx->freeProc);
    if (tif) {
        TIFFSetContextPivlo(tif, ctx);
        ctx->tiff = tif;
    }
    return tif;
}

// Binds a FileHandleRecord for `stream` and positions the stream at the base
// offset. False when no record can be had.
bool BindFile(ConversionContext* ctx, FILE* stream, uint32_t baseOffset) {
    HostBlock record(ctx, sizeof(FileHandleRecord));
    if (!record) return false;
    *record.Get<FileHandleRecord>() = FileHandleRecord{stream, baseOffset};
    ctx->fileHandle = record.Release();
    FileSeekProc(ctx, 0, SEEK_SET);
    return true;
}

bool OpenStreamBuffer(ConversionContext* ctx) {
    StreamDescriptor descriptor{PIVLO_STREAM_READ_CALLBACK, ctx->sourceReadProc,
                                ctx->sourceUserData, ctx->sourceStreamParam};
    StreamBuffer* sb =
        ctx->useExMessageProcs
            ? StreamBufferInit2_(ctx, &descriptor, ctx->errorProcEx, ctx->messageUserData, 1, 1, 0)
            : StreamBufferInit_(ctx, &descriptor, ctx->errorProc, 1, 1, 0);
    ctx->streamBuffer = sb;
    return sb != nullptr;
}

int FailReading(ConversionContext* ctx, const char* message) {
    if (message) zanError(ctx, message);
    RestoreCodecMessages(ctx);
    ReleaseFileHandle(ctx);
    CloseStreamBuffer(ctx);
    return 0;
}

int FailWriting(ConversionContext* ctx, const char* message) {
    RestoreCodecMessages(ctx);
    if (message) zanError(ctx, message);
    return 0;
}

// The growing memory image is the module's own until it is handed over. A
// memory source shares the cursor fields but belongs to the host.
bool OwnsMemoryImage(const ConversionContext* ctx) {
    return ctx->destKind == ZAN_DEST_MEMORY && ctx->memBase &&
           !(ctx->sourceKind == ZAN_SOURCE_MEMORY && ctx->memBase == ctx->sourceMemory);
}

void ClearMemoryImage(ConversionContext* ctx) {
    ctx->memBase = ctx->memPos = nullptr;
    ctx->memCapacity = 0;
}

// Shrinks the memory image to its data and hands it to the host through
// destMemory/destSizeOut. Without a place to put it, it is released instead.
void HandOverMemoryImage(ConversionContext* ctx) {
    void* block = ctx->memBase;
    if (ctx->reallocProc)
        if (void* shrunk = ctx->reallocProc(block, ctx->memSize)) block = shrunk;
    if (ctx->destMemory) *static_cast<void**>(ctx->destMemory) = block;
    else ReleaseBlock(ctx, block);
    if (ctx->destSizeOut) *ctx->destSizeOut = ctx->memSize;
    ClearMemoryImage(ctx);
    zanResetWorkBuffer(ctx);
}

}  // namespace

void ReleaseFileHandle(ConversionContext* ctx) { ReleaseField(ctx, ctx->fileHandle); }

void HandOverResult(ConversionContext* ctx) {
    if (OwnsMemoryImage(ctx)) HandOverMemoryImage(ctx);
    else if (ctx->destKind == ZAN_DEST_FIXED_BUFFER && ctx->destSizeOut) *ctx->destSizeOut = ctx->memSize;
}

void DiscardMemoryImage(ConversionContext* ctx) {
    if (!OwnsMemoryImage(ctx)) return;
    ReleaseBlock(ctx, ctx->memBase);
    ClearMemoryImage(ctx);
    zanResetWorkBuffer(ctx);
}

void CloseStreamBuffer(ConversionContext* ctx) {
    if (!ctx->streamBuffer) return;
    StreamBufferClose(ctx, static_cast<StreamBuffer*>(ctx->streamBuffer));
    ctx->streamBuffer = nullptr;
}

int OpenTIFFForReading(ConversionContext* ctx) {
    if (ctx->state == ZAN_STATE_DESCRIBED || ctx->tiff) return 1;
    RedirectCodecMessages(ctx);
    ClientProcs procs{};
    const char* mode = "r";
    switch (ctx->sourceKind) {
    case ZAN_SOURCE_FILE:
        if (!BindFile(ctx, ctx->sourceFp, ctx->sourceBaseOffset))
            return FailReading(ctx, "Memory allocation");
        procs = FileSourceProcs();
        break;
    case ZAN_SOURCE_MEMORY: {
        // Without data there is nothing to read, whatever size was given.
        const uint32_t size = ctx->sourceMemory ? ctx->sourceMemorySize : 0;
        ctx->memBase = ctx->memPos = static_cast<unsigned char*>(const_cast<void*>(ctx->sourceMemory));
        ctx->memCapacity = ctx->memSize = size;
        procs = MemorySourceProcs();
        break;
    }
    case ZAN_SOURCE_STREAM:
        mode = "rxm";
        if (ctx->sourceSeekProc) {
            procs = CallbackSourceProcs();
        } else {
            if (!OpenStreamBuffer(ctx)) return FailReading(ctx, "Initializing stream buffer");
            procs = StreamBufferSourceProcs();
        }
        break;
    default:
        return FailReading(ctx, nullptr);
    }
    if (!OpenCodecObject(ctx, mode, procs)) return FailReading(ctx, "Unable to create a tiff object");
    return 1;
}

int OpenTIFFForWriting(ConversionContext* ctx, const WriteOpening& opening) {
    if (ctx->tiff) return 1;
    RedirectCodecMessages(ctx);
    const char* mode = ctx->appendPages == 1 ? "a" : "w";
    ClientProcs procs{};
    switch (ctx->destKind) {
    case ZAN_DEST_FILE:
        if (!(ctx->destFileFlags & ZAN_DEST_FILE_USE_AS_IS)) {
            if (ctx->destFp) std::fclose(ctx->destFp);
            ctx->destFp = ctx->destPath ? std::fopen(ctx->destPath, "r+b") : nullptr;
            if (!ctx->destFp) return FailWriting(ctx, opening.reopenFailure);
        }
        if (!BindFile(ctx, ctx->destFp, ctx->destBaseOffset))
            return FailWriting(ctx, "Memory allocation");
        procs = FileDestProcs();
        break;
    case ZAN_DEST_CALLBACKS:
        if (!ctx->destSeekProc)
            return FailWriting(ctx,
                               "Destination function is supported only when seek function is "
                               "provided");
        procs = CallbackDestProcs(ctx);
        break;
    case ZAN_DEST_FIXED_BUFFER:
        // Pages are added behind the TIFF the buffer holds: the codec finds
        // the end of the data as the buffer's high-water mark.
        if (ctx->appendPages == 1) {
            uint32_t extent = 0;
            if (!FindTiffExtent(static_cast<const uint8_t*>(ctx->destMemory), ctx->destMemoryCapacity, &extent))
                return FailWriting(ctx, "The destination buffer holds no TIFF to add a page to.");
            ctx->memSize = extent;
        }
        ctx->destMemPos = static_cast<unsigned char*>(ctx->destMemory);
        if (ctx->destSizeOut) *ctx->destSizeOut = 0;
        procs = FixedBufferDestProcs();
        break;
    case ZAN_DEST_MEMORY: {
        const uint64_t wanted = opening.memoryCapacity ? opening.memoryCapacity : ctx->frameBufferSize / 2 + 60;
        const auto capacity = static_cast<uint32_t>(std::min<uint64_t>(wanted, 0xFFFFFFFFu));
        void* block = AllocateBlock(ctx, capacity);
        if (!block) return FailWriting(ctx, "Memory allocation");
        ctx->memBase = ctx->memPos = static_cast<unsigned char*>(block);
        ctx->memCapacity = capacity;
        ctx->memSize = 0;
        if (ctx->destMemory) *static_cast<void**>(ctx->destMemory) = nullptr;
        if (ctx->destSizeOut) *ctx->destSizeOut = 0;
        procs = GrowingMemoryDestProcs();
        break;
    }
    default:
        return FailWriting(ctx, nullptr);
    }
    if (OpenCodecObject(ctx, mode, procs)) return 1;
    if (ctx->destKind == ZAN_DEST_MEMORY) {
        ReleaseBlock(ctx, ctx->memBase);
        ClearMemoryImage(ctx);
    }
    ReleaseFileHandle(ctx);
    zanResetWorkBuffer(ctx);
    return FailWriting(ctx, "Unable to create TIFF object");
}

}  // namespace zan

extern "C" ZAN_API void zanDestroyTIFF(ConversionContext* ctx) {
    using namespace zan;
    if (!ctx) return;
    // A stream decoder the host did not end (it closes its own codec object
    // and gives the reader's buffers back).
    auto* decoder = static_cast<TIFFStreamDecoder*>(ctx->streamDecoder);
    ctx->streamDecoder = nullptr;
    TIFFStreamDecodeEnd(ctx, &decoder);
    // A page being written is finished, a reader's buffers are given back.
    FinishJobWork(ctx);
    if (ctx->sourceKind == ZAN_SOURCE_STREAM) CloseStreamBuffer(ctx);
    if (ctx->tiff) {
        TIFFClose(ctx->tiff);
        ctx->tiff = nullptr;
    }
    RestoreCodecMessages(ctx);
    ReleaseFileHandle(ctx);
    HandOverResult(ctx);
}
