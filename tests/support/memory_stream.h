// A host stream over bytes in memory, for the callback and stream-buffer
// sources and the callback destination.
#pragma once

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <vector>

#include "zantiff/conversion_context.h"

namespace zantest {

struct MemoryStream {
    std::vector<uint8_t> data;
    size_t position = 0;
    int reads = 0;
    size_t bytesRead = 0;
    int32_t maxChunk = 0;  // nonzero: a read delivers at most this many bytes
    bool failReads = false;

    static int32_t Read(void* buffer, int32_t n, void* user) {
        auto* s = static_cast<MemoryStream*>(user);
        ++s->reads;
        if (s->failReads) return -1;
        if (n <= 0 || s->position >= s->data.size()) return 0;
        size_t count = std::min<size_t>(static_cast<size_t>(n), s->data.size() - s->position);
        if (s->maxChunk > 0) count = std::min<size_t>(count, static_cast<size_t>(s->maxChunk));
        std::memcpy(buffer, s->data.data() + s->position, count);
        s->position += count;
        s->bytesRead += count;
        return static_cast<int32_t>(count);
    }

    static int32_t Write(const void* buffer, int32_t n, void* user) {
        auto* s = static_cast<MemoryStream*>(user);
        if (n <= 0) return 0;
        if (s->data.size() < s->position + static_cast<size_t>(n)) s->data.resize(s->position + n);
        std::memcpy(s->data.data() + s->position, buffer, static_cast<size_t>(n));
        s->position += static_cast<size_t>(n);
        return n;
    }

    static uint32_t Seek(uint32_t offset, int whence, void* user) {
        auto* s = static_cast<MemoryStream*>(user);
        int64_t target = 0;
        switch (whence) {
        case 0: target = offset; break;
        case 1: target = static_cast<int64_t>(s->position) + static_cast<int32_t>(offset); break;
        case 2: target = static_cast<int64_t>(s->data.size()) + static_cast<int32_t>(offset); break;
        default: return 0xFFFFFFFFu;
        }
        if (target < 0) return 0xFFFFFFFFu;
        s->position = static_cast<size_t>(target);
        return static_cast<uint32_t>(target);
    }
};

// Points the record's source callbacks at `stream` (seek callback optional).
inline void UseStreamSource(ConversionContext* ctx, MemoryStream* stream, bool withSeek) {
    ctx->sourceKind = ZAN_SOURCE_STREAM;
    ctx->sourceReadProc = MemoryStream::Read;
    ctx->sourceSeekProc = withSeek ? MemoryStream::Seek : nullptr;
    ctx->sourceUserData = stream;
}

}  // namespace zantest
