// zanTIFFGetInfo and the scanline reader on hostile input. The last input
// byte chooses the source kind (memory, callbacks, stream buffer) and the
// reader's options: extra-sample dropping, 8- or 16-bit output, the page,
// and whether metadata is gathered. Every row is read; nothing may crash,
// hang or leak.

#include <cstddef>
#include <cstdint>
#include <vector>

#include "fuzz_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 2) return 0;
    const uint8_t options = data[size - 1];
    zanfuzz::InputStream input{data, size - 1, 0, static_cast<uint32_t>((options >> 6) * 7)};
    ConversionContext ctx;
    zanfuzz::InitQuietJob(&ctx);
    zanfuzz::UseInputAsSource(&ctx, &input, options);
    ctx.dropExtraSamples = (options >> 2) & 1;
    ctx.outputBitsPerSample = (options & 8) ? 16 : 8;
    ctx.pageNumber = (options >> 4) & 3;
    MetadataList* list = (options & 0x40) ? pivloCreateMetadataList(nullptr, nullptr) : nullptr;
    ctx.metadataList = list;
    if (zanTIFFGetInfo(&ctx)) {
        // Rows are bounded so that a declared giant page costs time, not memory.
        const uint64_t room = uint64_t{ctx.imageWidth} * (ctx.samplesPerPixel > 3 ? ctx.samplesPerPixel : 3) * 2 + 16;
        if (room <= (4u << 20)) {
            std::vector<uint8_t> line(static_cast<size_t>(room));
            for (uint32_t row = 0; row < ctx.imageHeight && row < 4096; ++row)
                if (!zanTIFFReadNextScanLine(&ctx, line.data(), static_cast<uint32_t>(line.size()))) break;
        }
    }
    zanDestroyTIFF(&ctx);
    pivloReleaseContext(&ctx);
    pivloDestroyMetadataList(list);
    return 0;
}
