// JPEG streams wrapped into TIFF, on hostile streams: the header reader
// describes the stream, the layout rules decide, and the stream becomes the
// page's strip. The first byte chooses the source kind (memory, a file from
// a base offset, host callbacks) and the destination kind; the page written,
// when there is one, is read back as JPEG data. Nothing may crash, hang or
// leak.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <vector>

#include "fuzz_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) return 0;
    const uint8_t selector = data[0];
    const std::vector<uint8_t> stream(data + 1, data + size);
    ConversionContext ctx;
    zanfuzz::InitQuietJob(&ctx);
    zanfuzz::InputStream input{stream.data(), stream.size(), 0, 0};
    FILE* file = nullptr;
    switch (selector % 3) {
    case 0:
        ctx.sourceKind = ZAN_SOURCE_MEMORY;
        ctx.sourceMemory = stream.data();
        ctx.sourceMemorySize = static_cast<uint32_t>(stream.size());
        break;
    case 1: {
        std::vector<uint8_t> padded(7 + stream.size(), 0xFF);
        std::copy(stream.begin(), stream.end(), padded.begin() + 7);
        file = zanfuzz::TemporaryStream(padded);
        if (!file) return 0;
        ctx.sourceKind = ZAN_SOURCE_FILE;
        ctx.sourceFp = file;
        ctx.sourceBaseOffset = 7;
        break;
    }
    default:
        zanfuzz::UseInputAsSource(&ctx, &input, 1);  // callbacks with a seek
        break;
    }
    void* block = nullptr;
    uint32_t produced = 0;
    std::vector<uint8_t> fixed;
    if (selector & 0x80) {
        fixed.resize(1 << 16);
        ctx.destKind = ZAN_DEST_FIXED_BUFFER;
        ctx.destMemory = fixed.data();
        ctx.destMemoryCapacity = static_cast<uint32_t>(fixed.size());
    } else {
        ctx.destKind = ZAN_DEST_MEMORY;
        ctx.destMemory = &block;
    }
    ctx.destSizeOut = &produced;
    uint32_t direct = 1;
    const int written = zanJPEGToTIFF(&ctx, &direct);
    // Pages small enough to decode should the pass-through decline.
    const bool small = uint64_t{ctx.outputWidth} * ctx.outputHeight <= (1u << 22);
    zanDestroyTIFF(&ctx);
    pivloReleaseContext(&ctx);
    if (written && direct && produced && small) zanfuzz::RequestJpegData(block ? block : fixed.data(), produced);
    std::free(block);
    if (file) std::fclose(file);
    return 0;
}
