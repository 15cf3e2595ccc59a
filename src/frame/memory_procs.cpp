// Procedures over memory: the memory image (a whole source in memory, or the
// growing destination block of the module) and the host's fixed buffer.
//
// Positions are 32-bit and wrap as they would in a 32-bit build; a position
// may lie beyond the data, where reads return nothing. Bytes that a write
// skips over (a seek past the end, then a write) read back as zeros, as they
// would in a file.

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <limits>

#include "frame/io_procs.h"
#include "pivlo/pivlo.h"

namespace zan {
namespace {

ConversionContext* Ctx(void* client) { return static_cast<ConversionContext*>(client); }

// Address `offset` bytes after `base`, computed on integers: a position may
// lie outside the block, and the block may be absent.
unsigned char* At(const void* base, uint64_t offset) {
    return reinterpret_cast<unsigned char*>(reinterpret_cast<uintptr_t>(base) + offset);
}

uint64_t Distance(const void* from, const void* to) {
    return reinterpret_cast<uintptr_t>(to) - reinterpret_cast<uintptr_t>(from);
}

uint64_t MemOffset(const ConversionContext* ctx) { return Distance(ctx->memBase, ctx->memPos); }

uint64_t FixedOffset(const ConversionContext* ctx) {
    return Distance(ctx->destMemory, ctx->destMemPos);
}

uint64_t FixedRemaining(const ConversionContext* ctx) {
    const uint64_t used = FixedOffset(ctx);
    return used >= ctx->destMemoryCapacity ? 0 : ctx->destMemoryCapacity - used;
}

// Zeroes [highWater, offset) of `block` when a write starts beyond the data.
void ZeroSkippedBytes(unsigned char* block, uint64_t highWater, uint64_t offset) {
    if (offset > highWater) std::memset(block + highWater, 0, static_cast<size_t>(offset - highWater));
}

// Enlarges the growing block to hold `end` bytes plus 512; false when the new
// size does not fit in 32 bits or the host refuses.
bool GrowMemoryImage(ConversionContext* ctx, uint64_t end) {
    const uint64_t capacity = end + 512;
    if (capacity > std::numeric_limits<uint32_t>::max() || !ctx->reallocProc) return false;
    const uint64_t offset = MemOffset(ctx);
    void* grown = ctx->reallocProc(ctx->memBase, static_cast<uint32_t>(capacity));
    if (!grown) return false;
    ctx->memBase = static_cast<unsigned char*>(grown);
    ctx->memPos = At(grown, offset);
    ctx->memCapacity = static_cast<uint32_t>(capacity);
    return true;
}

}  // namespace

// ---- memory image ----

int32_t MemReadProc(void* client, void* buffer, int32_t n) {
    ConversionContext* ctx = Ctx(client);
    const uint64_t offset = MemOffset(ctx);
    if (n <= 0 || offset >= ctx->memSize) return 0;
    const uint64_t count = std::min<uint64_t>(static_cast<uint64_t>(n), ctx->memSize - offset);
    std::memcpy(buffer, ctx->memPos, static_cast<size_t>(count));
    ctx->memPos += count;
    return static_cast<int32_t>(count);
}

uint32_t MemSeekProc(void* client, uint32_t offset, int whence) {
    ConversionContext* ctx = Ctx(client);
    const auto current = static_cast<uint32_t>(MemOffset(ctx));
    uint32_t position = current;
    switch (whence) {
    case SEEK_SET: position = offset; break;
    case SEEK_CUR: position = current + offset; break;  // wraps: a backward move
    case SEEK_END: position = ctx->memSize + offset; break;
    default: return current;
    }
    ctx->memPos = At(ctx->memBase, position);
    return position;
}

uint32_t MemSizeProc(void* client) { return Ctx(client)->memSize; }

// Hands out the image but answers "not mapped", so the codec always reads
// through MemReadProc.
int MemMapProc(void* client, void** base, uint32_t* size) {
    *base = Ctx(client)->memBase;
    *size = Ctx(client)->memSize;
    return 0;
}

void MemUnmapProc(void*, void*, uint32_t) {}

int32_t MemGrowWriteProc(void* client, void* buffer, int32_t n) {
    ConversionContext* ctx = Ctx(client);
    if (n <= 0) return 0;
    const uint64_t offset = MemOffset(ctx);
    const uint64_t end = offset + static_cast<uint64_t>(n);
    uint64_t count = static_cast<uint64_t>(n);
    if (end > ctx->memCapacity && !GrowMemoryImage(ctx, end)) {
        zanError(ctx, "Memory allocation error");
        count = offset < ctx->memCapacity ? ctx->memCapacity - offset : 0;  // what still fits
        if (count == 0) return 0;
    }
    ZeroSkippedBytes(ctx->memBase, ctx->memSize, offset);
    std::memcpy(ctx->memPos, buffer, static_cast<size_t>(count));
    ctx->memPos += count;
    ctx->memSize = static_cast<uint32_t>(std::max<uint64_t>(ctx->memSize, offset + count));
    return static_cast<int32_t>(count);
}

// ---- fixed host buffer ----

int32_t FixedReadProc(void* client, void* buffer, int32_t n) {
    ConversionContext* ctx = Ctx(client);
    if (n <= 0 || static_cast<uint64_t>(n) > FixedRemaining(ctx)) return 0;
    std::memcpy(buffer, ctx->destMemPos, static_cast<size_t>(n));
    ctx->destMemPos += n;
    return n;
}

int32_t FixedWriteProc(void* client, void* buffer, int32_t n) {
    ConversionContext* ctx = Ctx(client);
    if (n <= 0) return 0;
    const uint64_t offset = FixedOffset(ctx);
    const uint64_t count = std::min<uint64_t>(static_cast<uint64_t>(n), FixedRemaining(ctx));
    if (count == 0) return 0;
    ZeroSkippedBytes(static_cast<unsigned char*>(ctx->destMemory), ctx->memSize, offset);
    std::memcpy(ctx->destMemPos, buffer, static_cast<size_t>(count));
    ctx->destMemPos += count;
    ctx->memSize = static_cast<uint32_t>(std::max<uint64_t>(ctx->memSize, offset + count));
    return static_cast<int32_t>(count);
}

// The end of a fixed buffer is the end of the data written into it (its
// high-water mark, memSize): the codec appends every directory there, also
// after it has gone back to read or patch an earlier one. Only a zero move
// from the end is possible.
uint32_t FixedSeekProc(void* client, uint32_t offset, int whence) {
    ConversionContext* ctx = Ctx(client);
    switch (whence) {
    case SEEK_SET:
        if (offset > ctx->destMemoryCapacity) return kSeekFailed;
        ctx->destMemPos = At(ctx->destMemory, offset);
        return offset;
    case SEEK_CUR:
        if (offset > FixedRemaining(ctx)) return kSeekFailed;
        ctx->destMemPos += offset;
        return static_cast<uint32_t>(FixedOffset(ctx));
    case SEEK_END:
        if (offset != 0 || ctx->memSize > ctx->destMemoryCapacity) return kSeekFailed;
        ctx->destMemPos = At(ctx->destMemory, ctx->memSize);
        return ctx->memSize;
    default:
        return 0;
    }
}

uint32_t FixedSizeProc(void* client) { return static_cast<uint32_t>(FixedOffset(Ctx(client))); }

}  // namespace zan
