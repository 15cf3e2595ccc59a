#include "fuzz_support.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zanfuzz {
namespace {

void DropHostMessage(ConversionContext*, int, int, const char*) {}

// The host's allocator grants no block above 256 MiB, as a host with a
// memory budget would: a page that claims more (and whose data could hold
// it) meets a refused allocation instead of running the fuzzer out of
// memory. Blocks are the C heap's, so that handed-over images go with free.
constexpr uint32_t kLargestBlock = 256u << 20;
void* BudgetAlloc(uint32_t size) { return size > kLargestBlock ? nullptr : std::malloc(size ? size : 1); }
void* BudgetRealloc(void* block, uint32_t size) {
    return size > kLargestBlock ? nullptr : std::realloc(block, size ? size : 1);
}
void BudgetFree(void* block) { std::free(block); }
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
    ctx->allocProc = BudgetAlloc;
    ctx->reallocProc = BudgetRealloc;
    ctx->freeProc = BudgetFree;
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

std::vector<uint8_t> JpegTiff(const JpegPageLayout& layout, const std::vector<std::vector<uint8_t>>& pieces) {
    std::vector<uint8_t> t = {'I', 'I', 42, 0, 0, 0, 0, 0};
    auto put16 = [&](uint16_t v) { t.push_back(v & 0xFF); t.push_back(v >> 8); };
    auto put32 = [&](uint32_t v) { put16(v & 0xFFFF); put16(v >> 16); };
    auto append = [&](const std::vector<uint8_t>& bytes) {
        if (t.size() & 1) t.push_back(0);
        const auto at = static_cast<uint32_t>(t.size());
        t.insert(t.end(), bytes.begin(), bytes.end());
        return at;
    };
    const uint32_t tables = append(pieces[0]);
    std::vector<uint32_t> offsets, counts;
    for (size_t i = 1; i < pieces.size(); ++i) {
        offsets.push_back(append(pieces[i]));
        counts.push_back(static_cast<uint32_t>(pieces[i].size()));
    }
    if (offsets.empty()) {
        offsets.push_back(tables);
        counts.push_back(0);
    }
    auto array = [&](const std::vector<uint32_t>& v) {
        std::vector<uint8_t> bytes;
        for (uint32_t x : v) for (int i = 0; i < 4; ++i) bytes.push_back(static_cast<uint8_t>(x >> (8 * i)));
        return append(bytes);
    };
    const auto n = static_cast<uint32_t>(offsets.size());
    const uint32_t offsetsAt = n > 1 ? array(offsets) : offsets[0];
    const uint32_t countsAt = n > 1 ? array(counts) : counts[0];
    const bool colour = layout.kind != 0;
    const uint32_t bitsAt = colour ? array({0x00080008u, 0x00000008u}) : 8;  // three SHORT 8s
    if (t.size() & 1) t.push_back(0);
    const auto ifd = static_cast<uint32_t>(t.size());
    t[4] = ifd & 0xFF;
    t[5] = (ifd >> 8) & 0xFF;
    t[6] = (ifd >> 16) & 0xFF;
    t[7] = ifd >> 24;
    struct Entry { uint16_t tag, type; uint32_t count, value; };
    std::vector<Entry> entries = {
        {256, 4, 1, layout.width}, {257, 4, 1, layout.height}, {258, 3, colour ? 3u : 1u, bitsAt},
        {259, 3, 1, 7}, {262, 3, 1, layout.kind == 0 ? 1u : layout.kind == 1 ? 6u : 2u},
        {273, 4, n, offsetsAt}, {277, 3, 1, colour ? 3u : 1u}, {278, 4, 1, layout.rowsPerStrip},
        {279, 4, n, countsAt}, {347, 7, static_cast<uint32_t>(pieces[0].size()), tables}};
    if (layout.kind == 1) entries.push_back({530, 3, 2, 0x00020002u});
    put16(static_cast<uint16_t>(entries.size()));
    for (const Entry& e : entries) {
        put16(e.tag);
        put16(e.type);
        put32(e.count);
        // A value of up to 4 bytes lies in the entry: small JPEGTables too.
        if (e.tag == 347 && e.count <= 4) {
            uint32_t inline_ = 0;
            for (uint32_t i = 0; i < e.count; ++i) inline_ |= uint32_t{pieces[0][i]} << (8 * i);
            put32(inline_);
        } else {
            put32(e.value);
        }
    }
    put32(0);
    return t;
}

void RequestJpegData(const void* tiff, uint32_t size) {
    ConversionContext ctx;
    InitQuietJob(&ctx);
    ctx.sourceKind = ZAN_SOURCE_MEMORY;
    ctx.sourceMemory = tiff;
    ctx.sourceMemorySize = size;
    ctx.destFormat = ZAN_DEST_FORMAT_JPEG;
    void* block = nullptr;
    uint32_t produced = 0;
    ctx.destKind = ZAN_DEST_MEMORY;
    ctx.destMemory = &block;
    ctx.destSizeOut = &produced;
    uint32_t direct = 0;
    zanTIFFToFrameBuffer(&ctx, &direct);
    zanDestroyTIFF(&ctx);
    pivloReleaseContext(&ctx);
    std::free(block);
}

}  // namespace zanfuzz
