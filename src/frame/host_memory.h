// Blocks from the job's allocator procedures, and a guard that gives one back
// unless it is handed on.
#pragma once

#include <cstdint>
#include <utility>

#include "zantiff/conversion_context.h"

namespace zan {

// A block from the job's allocProc; null when there is none or the host
// refuses. Null procedures count as "no memory" rather than a crash.
inline void* AllocateBlock(ConversionContext* ctx, uint32_t byteCount) {
    return ctx->allocProc ? ctx->allocProc(byteCount) : nullptr;
}

// Gives a block back to the job's freeProc (nothing for null).
inline void ReleaseBlock(ConversionContext* ctx, void* block) {
    if (block && ctx->freeProc) ctx->freeProc(block);
}

// Releases `field` (a block of the job) and clears it.
template <typename T>
void ReleaseField(ConversionContext* ctx, T*& field) {
    ReleaseBlock(ctx, const_cast<void*>(static_cast<const void*>(field)));
    field = nullptr;
}

// Sole owner of a block of the job until Release() hands it on.
class HostBlock {
public:
    HostBlock(ConversionContext* ctx, uint32_t byteCount)
        : ctx_(ctx), block_(AllocateBlock(ctx, byteCount)) {}
    HostBlock(const HostBlock&) = delete;
    HostBlock& operator=(const HostBlock&) = delete;
    ~HostBlock() { ReleaseBlock(ctx_, block_); }

    explicit operator bool() const { return block_ != nullptr; }
    template <typename T = void>
    T* Get() const { return static_cast<T*>(block_); }
    void* Release() { return std::exchange(block_, nullptr); }

private:
    ConversionContext* ctx_;
    void* block_;
};

}  // namespace zan
