#include "read/raw_delivery.h"

#include <cstring>

#include "frame/checked_size.h"
#include "frame/file_stream.h"
#include "frame/host_memory.h"
#include "frame/report.h"

namespace zan {
namespace {

constexpr char kFileAccess[] = "File access error.";

// The host's stream is kept as it is when it is named "dummyfile".
bool KeepsOpenStream(const ConversionContext* ctx) {
    return ctx->destPath && ctx->destFp && std::strcmp(ctx->destPath, "dummyfile") == 0;
}

}  // namespace

RawDelivery::~RawDelivery() {
    if (!begun_ || finished_) return;
    ReleaseBlock(ctx_, block_);
    if (fileStart_ >= 0 && ctx_->destFp) SeekStream(ctx_->destFp, fileStart_, SEEK_SET);
    if (ctx_->destKind == ZAN_DEST_CALLBACKS && ctx_->destSeekProc)
        ctx_->destSeekProc(callbackStart_, SEEK_SET, ctx_->destUserData);
}

bool RawDelivery::Begin(uint64_t bound, const char* memoryMessage) {
    switch (ctx_->destKind) {
    case ZAN_DEST_FILE:
        if (!KeepsOpenStream(ctx_)) {
            if (ctx_->destFp) std::fclose(ctx_->destFp);
            ctx_->destFp = ctx_->destPath ? std::fopen(ctx_->destPath, "wb") : nullptr;
            if (!ctx_->destFp) return ReportError(ctx_, kFileAccess);
        }
        fileStart_ = TellStream(ctx_->destFp);
        if (fileStart_ < 0) return ReportError(ctx_, kFileAccess);
        break;
    case ZAN_DEST_CALLBACKS:
        if (!ctx_->destWriteProc) return ReportError(ctx_, "Destination write function is not set.");
        if (ctx_->destSeekProc) callbackStart_ = ctx_->destSeekProc(0, SEEK_CUR, ctx_->destUserData);
        break;
    case ZAN_DEST_FIXED_BUFFER:
        if (!ctx_->destMemory) return ReportError(ctx_, "Destination buffer is not set.");
        if (ctx_->destSizeOut) *ctx_->destSizeOut = 0;
        capacity_ = ctx_->destMemoryCapacity;
        break;
    default:
        if (ctx_->destMemory) *static_cast<void**>(ctx_->destMemory) = nullptr;
        if (ctx_->destSizeOut) *ctx_->destSizeOut = 0;
        if (!FitsIn32(bound)) return ReportError(ctx_, memoryMessage);
        block_ = static_cast<uint8_t*>(AllocateBlock(ctx_, static_cast<uint32_t>(bound ? bound : 1)));
        if (!block_) return ReportError(ctx_, memoryMessage);
        capacity_ = bound;
        break;
    }
    begun_ = true;
    return true;
}

bool RawDelivery::Write(const void* data, uint32_t n) {
    if (n == 0) return true;  // an empty piece (its data may be null) writes nothing
    switch (ctx_->destKind) {
    case ZAN_DEST_FILE:
        if (std::fwrite(data, 1, n, ctx_->destFp) != n) return ReportError(ctx_, kFileAccess);
        break;
    case ZAN_DEST_CALLBACKS:
        if (n > 0x7FFFFFFFu ||
            ctx_->destWriteProc(data, static_cast<int32_t>(n), ctx_->destUserData) != static_cast<int32_t>(n))
            return ReportError(ctx_, "Unable to write to the destination.");
        break;
    case ZAN_DEST_FIXED_BUFFER:
        if (written_ + n > capacity_) return ReportError(ctx_, "Destination buffer is too small for the data.");
        std::memcpy(static_cast<uint8_t*>(ctx_->destMemory) + written_, data, n);
        break;
    default:
        if (written_ + n > capacity_) return ReportError(ctx_, "Memory allocation error.");
        std::memcpy(block_ + written_, data, n);
        break;
    }
    written_ += n;
    return true;
}

uint8_t* RawDelivery::Reserve(uint32_t n) {
    if (written_ + n > capacity_) return nullptr;
    if (ctx_->destKind == ZAN_DEST_FIXED_BUFFER) return static_cast<uint8_t*>(ctx_->destMemory) + written_;
    return block_ ? block_ + written_ : nullptr;
}

void RawDelivery::Finish() {
    finished_ = true;
    if (ctx_->destKind == ZAN_DEST_FILE) {
        std::fflush(ctx_->destFp);
    } else if (ctx_->destKind == ZAN_DEST_FIXED_BUFFER) {
        if (ctx_->destSizeOut) *ctx_->destSizeOut = static_cast<uint32_t>(written_);
    } else if (ctx_->destKind != ZAN_DEST_CALLBACKS) {
        // The block goes to the host holding exactly the bytes delivered (the
        // bound Begin was given may be larger); should the host not shrink
        // it, the larger block goes, with the same size reported.
        if (written_ > 0 && written_ < capacity_ && ctx_->reallocProc)
            if (void* shrunk = ctx_->reallocProc(block_, static_cast<uint32_t>(written_)))
                block_ = static_cast<uint8_t*>(shrunk);
        if (ctx_->destMemory) *static_cast<void**>(ctx_->destMemory) = block_;
        else ReleaseBlock(ctx_, block_);
        if (ctx_->destSizeOut) *ctx_->destSizeOut = static_cast<uint32_t>(written_);
        block_ = nullptr;
    }
}

}  // namespace zan
