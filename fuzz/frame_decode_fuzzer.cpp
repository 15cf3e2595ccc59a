// zanTIFFToFrameBuffer on hostile input. The last input byte and the one
// before it choose the request: RGBA or native decoding, 8- or 16-bit
// frames, extra samples dropped, the 1-bit RGB to palette conversion, a
// pass-through of JPEG or Group 4 data to memory, a fixed buffer or host
// callbacks, the page and the source kind. Nothing may crash, hang or leak.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "fuzz_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

int32_t Swallow(const void*, int32_t n, void*) { return n; }
uint32_t Nowhere(uint32_t offset, int, void*) { return offset; }

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 3) return 0;
    const uint8_t a = data[size - 1], b = data[size - 2];
    zanfuzz::InputStream input{data, size - 2, 0, static_cast<uint32_t>((b >> 6) * 5)};
    ConversionContext ctx;
    zanfuzz::InitQuietJob(&ctx);
    zanfuzz::UseInputAsSource(&ctx, &input, a);
    ctx.keepFileLayout = (a >> 2) & 1;
    ctx.outputBitsPerSample = (a & 8) ? 16 : 8;
    ctx.dropExtraSamples = (a >> 4) & 1;
    if (a & 0x20) {
        ctx.requestedFormat = 19;
        ctx.requestedBitsPerSample = 4;
        ctx.requestedPaletteBits = 8;
    }
    ctx.pageNumber = (a >> 6) & 3;
    ctx.destFormat = (b & 3) == 1 ? ZAN_DEST_FORMAT_JPEG : (b & 3) == 2 ? ZAN_DEST_FORMAT_G4 : 0;
    void* block = nullptr;
    uint32_t produced = 0;
    std::vector<uint8_t> fixed(4096);
    switch ((b >> 2) & 3) {
    case 0:
        ctx.destKind = ZAN_DEST_MEMORY;
        ctx.destMemory = &block;
        ctx.destSizeOut = &produced;
        break;
    case 1:
        ctx.destKind = ZAN_DEST_FIXED_BUFFER;
        ctx.destMemory = fixed.data();
        ctx.destMemoryCapacity = static_cast<uint32_t>(fixed.size());
        ctx.destSizeOut = &produced;
        break;
    default:
        ctx.destKind = ZAN_DEST_CALLBACKS;
        ctx.destWriteProc = Swallow;
        ctx.destSeekProc = Nowhere;
        break;
    }
    uint32_t direct = 0;
    zanTIFFToFrameBuffer(&ctx, &direct);
    zanDestroyTIFF(&ctx);
    pivloReleaseContext(&ctx);
    std::free(block);
    return 0;
}
