// File, host-callback and stream-buffer procedures, and the procedure sets
// handed to the codec for each kind of source and destination.

#include "frame/io_procs.h"

#include "frame/file_stream.h"

#include <cstdint>
#include <cstdio>
#include <limits>

#include "pivlo/pivlo.h"

namespace zan {
namespace {

ConversionContext* Ctx(void* client) { return static_cast<ConversionContext*>(client); }

FileHandleRecord* FileOf(void* client) {
    return static_cast<FileHandleRecord*>(Ctx(client)->fileHandle);
}

// A stream position as the codec sees it: relative to the base offset, and
// only when that fits in 32 bits (0xFFFFFFFF is the failure value).
uint32_t RelativePosition(int64_t position, uint32_t base) {
    if (position < 0 || position < static_cast<int64_t>(base)) return kSeekFailed;
    const int64_t relative = position - base;
    return relative >= static_cast<int64_t>(kSeekFailed) ? kSeekFailed
                                                         : static_cast<uint32_t>(relative);
}

}  // namespace

// ---- null procedure ----

int32_t NullProc(void*, void*, int32_t) { return 0; }
int NullProc(void*) { return 0; }
int NullProc(void*, void**, uint32_t*) { return 0; }

// ---- files ----

int32_t FileReadProc(void* client, void* buffer, int32_t n) {
    FileHandleRecord* file = FileOf(client);
    if (!file || !file->stream || n <= 0) return 0;
    return static_cast<int32_t>(std::fread(buffer, 1, static_cast<size_t>(n), file->stream));
}

int32_t FileWriteProc(void* client, void* buffer, int32_t n) {
    FileHandleRecord* file = FileOf(client);
    if (!file || !file->stream || n <= 0) return 0;
    return static_cast<int32_t>(std::fwrite(buffer, 1, static_cast<size_t>(n), file->stream));
}

// Relative moves (whence 1 and 2) take the offset as signed 32-bit, so the
// codec can move backwards.
uint32_t FileSeekProc(void* client, uint32_t offset, int whence) {
    FileHandleRecord* file = FileOf(client);
    if (!file || !file->stream) return kSeekFailed;
    int status = 0;
    switch (whence) {
    case SEEK_SET:
        status = SeekStream(file->stream, int64_t{file->baseOffset} + offset, SEEK_SET);
        break;
    case SEEK_CUR:
    case SEEK_END:
        status = SeekStream(file->stream, static_cast<int32_t>(offset), whence);
        break;
    default:
        return 0;
    }
    if (status != 0) return kSeekFailed;
    return RelativePosition(TellStream(file->stream), file->baseOffset);
}

// Bytes from the base offset to the end of the file; 0xFFFFFFFF stands for
// any size beyond 32-bit positions.
uint32_t FileSizeProc(void* client) {
    FileHandleRecord* file = FileOf(client);
    if (!file || !file->stream) return 0;
    const int64_t end = StreamSize(file->stream);
    if (end <= static_cast<int64_t>(file->baseOffset)) return 0;
    const int64_t size = end - file->baseOffset;
    return size > static_cast<int64_t>(std::numeric_limits<uint32_t>::max())
               ? std::numeric_limits<uint32_t>::max()
               : static_cast<uint32_t>(size);
}


// ---- host callbacks ----

int32_t CallbackSourceReadProc(void* client, void* buffer, int32_t n) {
    ConversionContext* ctx = Ctx(client);
    return ctx->sourceReadProc ? ctx->sourceReadProc(buffer, n, ctx->sourceUserData) : -1;
}

uint32_t CallbackSourceSeekProc(void* client, uint32_t offset, int whence) {
    ConversionContext* ctx = Ctx(client);
    return ctx->sourceSeekProc ? ctx->sourceSeekProc(offset, whence, ctx->sourceUserData)
                               : kSeekFailed;
}

// Leaves the host's stream at its end.
uint32_t CallbackSourceSizeProc(void* client) { return CallbackSourceSeekProc(client, 0, SEEK_END); }

int32_t CallbackDestWriteProc(void* client, void* buffer, int32_t n) {
    ConversionContext* ctx = Ctx(client);
    return ctx->destWriteProc ? ctx->destWriteProc(buffer, n, ctx->destUserData) : -1;
}

uint32_t CallbackDestSeekProc(void* client, uint32_t offset, int whence) {
    ConversionContext* ctx = Ctx(client);
    return ctx->destSeekProc ? ctx->destSeekProc(offset, whence, ctx->destUserData)
                             : kSeekFailed;
}

uint32_t CallbackDestSizeProc(void* client) { return CallbackDestSeekProc(client, 0, SEEK_END); }

int32_t CallbackDestUnreadableProc(void* client, void*, int32_t) {
    zanError(Ctx(client),
             "Destination cannot be read back: a source read function is needed to add a page");
    return -1;
}

// ---- stream buffer service ----

// Every read releases the bytes it asked for: the codec reads each byte of a
// stream source once, and the service keeps only what may still be needed.
int32_t StreamReadProc(void* client, void* buffer, int32_t n) {
    if (n < 1) return 0;
    ConversionContext* ctx = Ctx(client);
    auto* sb = static_cast<StreamBuffer*>(ctx->streamBuffer);
    const uint32_t start = StreamBufferSeek(sb, 0, SEEK_CUR);
    const int32_t got = StreamBufferRead(ctx, sb, buffer, n);
    const uint32_t last = start + static_cast<uint32_t>(n - 1);
    if (StreamBufferDiscardData(ctx, sb, start, last < start ? PIVLO_STREAM_FAILED - 1 : last) == -1)
        return 0;
    return got;
}

int32_t StreamWriteProc(void* client, void*, int32_t) {
    zanError(Ctx(client), "Error in calling streamwrite function");
    return 0;
}

uint32_t StreamSeekProc(void* client, uint32_t offset, int whence) {
    return StreamBufferSeek(static_cast<StreamBuffer*>(Ctx(client)->streamBuffer), offset, whence);
}

uint32_t StreamSizeProc(void* client) {
    return StreamBufferSourceSize(static_cast<StreamBuffer*>(Ctx(client)->streamBuffer));
}

int StreamMapProc(void*, void**, uint32_t* size) {
    *size = 0;
    return 0;
}

// ---- procedure sets ----

// Host files are read through their streams, never mapped: a file that the
// host truncates while the job runs gives a read error, not a fault.
ClientProcs FileSourceProcs() {
    return {FileReadProc, NullProc, FileSeekProc, NullProc, FileSizeProc, nullptr, nullptr};
}

ClientProcs MemorySourceProcs() {
    return {MemReadProc, NullProc, MemSeekProc, NullProc, MemSizeProc, MemMapProc, MemUnmapProc};
}

ClientProcs CallbackSourceProcs() {
    return {CallbackSourceReadProc, NullProc, CallbackSourceSeekProc, NullProc,
            CallbackSourceSizeProc, NullProc, MemUnmapProc};
}

ClientProcs StreamBufferSourceProcs() {
    return {StreamReadProc, StreamWriteProc, StreamSeekProc, NullProc,
            StreamSizeProc, StreamMapProc, MemUnmapProc};
}

// Every destination can read back what it wrote: the codec reads the
// previous directory when it links the next page.
ClientProcs FileDestProcs() {
    return {FileReadProc, FileWriteProc, FileSeekProc, NullProc, FileSizeProc, nullptr, nullptr};
}

ClientProcs CallbackDestProcs(const ConversionContext* ctx) {
    return {ctx->sourceReadProc ? CallbackSourceReadProc : CallbackDestUnreadableProc,
            CallbackDestWriteProc, CallbackDestSeekProc, NullProc, CallbackDestSizeProc,
            nullptr, nullptr};
}

ClientProcs FixedBufferDestProcs() {
    return {FixedReadProc, FixedWriteProc, FixedSeekProc, NullProc, FixedSizeProc, nullptr,
            nullptr};
}

ClientProcs GrowingMemoryDestProcs() {
    return {MemReadProc, MemGrowWriteProc, MemSeekProc, NullProc, MemSizeProc, MemMapProc,
            MemUnmapProc};
}

}  // namespace zan
