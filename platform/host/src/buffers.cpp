// Job set-up and the host's buffers: the C-heap allocators of a fresh record,
// the frame buffer reset, the per-job work buffer and the release of what a
// job handed over in the record.

#include <cstdlib>
#include <cstring>
#include <mutex>
#include <unordered_map>

#include "pivlo/pivlo.h"

namespace {

// The C heap behind pivloInitContext. A request for 0 bytes still yields a
// block, so that shrinking a memory image to nothing never loses it.
void* HeapAlloc(uint32_t n) { return std::malloc(n ? n : 1); }
void* HeapRealloc(void* block, uint32_t n) { return std::realloc(block, n ? n : 1); }
void HeapFree(void* block) { std::free(block); }

struct WorkBuffer {
    void* block = nullptr;
    uint32_t size = 0;
};

// Work buffers belong to the host, not to the record the module sees, so they
// live in a table keyed by the job's record.
std::mutex gWorkMutex;
std::unordered_map<const ConversionContext*, WorkBuffer>& WorkBuffers() {
    static auto* table = new std::unordered_map<const ConversionContext*, WorkBuffer>();
    return *table;
}

void Release(ConversionContext* ctx, void* block) {
    if (block && ctx->freeProc) ctx->freeProc(block);
}

}  // namespace

extern "C" {

void pivloInitContext(ConversionContext* ctx) {
    std::memset(ctx, 0, sizeof *ctx);
    ctx->allocProc = HeapAlloc;
    ctx->reallocProc = HeapRealloc;
    ctx->freeProc = HeapFree;
}

void zanResetFrameBuffer(ConversionContext* ctx) {
    if (!ctx) return;
    Release(ctx, ctx->frameData);
    ctx->frameData = nullptr;
    ctx->frameBufferSize = 0;
}

void* pivloWorkBuffer(ConversionContext* ctx, uint32_t byteCount) {
    if (!ctx || !ctx->allocProc) return nullptr;
    std::lock_guard<std::mutex> lock(gWorkMutex);
    try {
        WorkBuffer& wb = WorkBuffers()[ctx];
        if (wb.block && wb.size >= byteCount) return wb.block;
        void* grown = ctx->allocProc(byteCount);
        if (!grown) return nullptr;
        Release(ctx, wb.block);
        wb.block = grown;
        wb.size = byteCount;
        return grown;
    } catch (...) {
        return nullptr;
    }
}

void zanResetWorkBuffer(ConversionContext* ctx) {
    if (!ctx) return;
    std::lock_guard<std::mutex> lock(gWorkMutex);
    auto& table = WorkBuffers();
    auto it = table.find(ctx);
    if (it == table.end()) return;
    Release(ctx, it->second.block);
    table.erase(it);
}

void pivloReleaseContext(ConversionContext* ctx) {
    if (!ctx) return;
    zanResetFrameBuffer(ctx);
    zanResetWorkBuffer(ctx);
    Release(ctx, ctx->iccProfile);
    ctx->iccProfile = nullptr;
    ctx->iccProfileSize = 0;
    Release(ctx, ctx->documentName);
    ctx->documentName = nullptr;
    Release(ctx, ctx->imageDescription);
    ctx->imageDescription = nullptr;
    // The palette copy is one block with red at its start.
    Release(ctx, ctx->paletteRed);
    ctx->paletteRed = ctx->paletteGreen = ctx->paletteBlue = nullptr;
}

}  // extern "C"
