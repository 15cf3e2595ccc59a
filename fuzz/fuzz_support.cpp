#include "fuzz_support.h"

#include <algorithm>
#include <cstring>

#include "pivlo/pivlo.h"

namespace zanfuzz {
namespace {

void DropHostMessage(ConversionContext*, int, int, const char*) {}
void DropCodecMessage(int, const char*) {}

int32_t ReadInput(void* buffer, int32_t n, void* user) {
    auto* in = static_cast<InputStream*>(user);
    if (n <= 0 || in->position >= in->size) return 0;
    size_t count = std::min<size_t>(static_cast<size_t>(n), in->size - in->position);
    if (in->chunk) count = std::min<size_t>(count, in->chunk);
    std::memcpy(buffer, in->data + in->position, count);
    in->position += count;
    return static_cast<int32_t>(count);
}

uint32_t SeekInput(uint32_t offset, int whence, void* user) {
    auto* in = static_cast<InputStream*>(user);
    int64_t target = whence == 0   ? int64_t{offset}
                     : whence == 1 ? static_cast<int64_t>(in->position) + static_cast<int32_t>(offset)
                     : whence == 2 ? static_cast<int64_t>(in->size) + static_cast<int32_t>(offset)
                                   : -1;
    if (target < 0 || target >= 0xFFFFFFFFll) return 0xFFFFFFFFu;
    in->position = static_cast<size_t>(target);
    return static_cast<uint32_t>(target);
}

}  // namespace

void InitQuietJob(ConversionContext* ctx) {
    pivloInitContext(ctx);
    ctx->hostMessageProc = DropHostMessage;
    ctx->errorProc = DropCodecMessage;
    ctx->warningProc = DropCodecMessage;
}

void UseInputAsSource(ConversionContext* ctx, InputStream* input, uint8_t selector) {
    switch (selector % 4) {
    case 0:
    case 3:
        ctx->sourceKind = ZAN_SOURCE_MEMORY;
        ctx->sourceMemory = input->data;
        ctx->sourceMemorySize = static_cast<uint32_t>(input->size);
        break;
    case 1:
        ctx->sourceKind = ZAN_SOURCE_STREAM;
        ctx->sourceReadProc = ReadInput;
        ctx->sourceSeekProc = SeekInput;
        ctx->sourceUserData = input;
        break;
    case 2:
        ctx->sourceKind = ZAN_SOURCE_STREAM;
        ctx->sourceReadProc = ReadInput;
        ctx->sourceSeekProc = nullptr;
        ctx->sourceUserData = input;
        break;
    }
}

}  // namespace zanfuzz

namespace zanfuzz {

std::vector<uint8_t> TinyTiff() {
    // Header, 8 bytes of pixels at 8, then the directory at 16.
    std::vector<uint8_t> t = {'I', 'I', 42, 0, 16, 0, 0, 0, 1, 2, 3, 4, 5, 6, 7, 8};
    const uint16_t entries[][2] = {{256, 4}, {257, 2}, {258, 8}, {262, 1}, {273, 8}, {278, 2}, {279, 8}};
    auto put16 = [&](uint16_t v) { t.push_back(v & 0xFF); t.push_back(v >> 8); };
    auto put32 = [&](uint32_t v) { put16(v & 0xFFFF); put16(v >> 16); };
    put16(7);
    for (const auto& e : entries) {
        put16(e[0]);
        put16(3);  // SHORT
        put32(1);
        put32(e[1]);
    }
    put32(0);
    return t;
}

FILE* TemporaryStream(const std::vector<uint8_t>& bytes) {
    FILE* f = std::tmpfile();
    if (f && !bytes.empty()) std::fwrite(bytes.data(), 1, bytes.size(), f);
    if (f) std::rewind(f);
    return f;
}

}  // namespace zanfuzz
