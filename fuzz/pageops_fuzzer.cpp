// The file-level page operations on hostile input: the input is the source
// file (its last byte chooses the operation and page); extraction writes a
// file of its own, concatenation appends onto a valid file. Must never
// crash, hang or leak, and never write more than the source can justify.

#include <cstddef>
#include <cstdint>
#include <cstdio>

#include "fuzz_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 2) return 0;
    const uint8_t selector = data[size - 1];
    FILE* source = zanfuzz::TemporaryStream(std::vector<uint8_t>(data, data + size - 1));
    const bool concatenate = selector & 0x80;
    FILE* dest = zanfuzz::TemporaryStream(concatenate ? zanfuzz::TinyTiff() : std::vector<uint8_t>());
    if (source && dest) {
        ConversionContext ctx;
        zanfuzz::InitQuietJob(&ctx);
        ctx.sourceKind = ZAN_SOURCE_FILE;
        ctx.sourceFp = source;
        ctx.destKind = ZAN_DEST_FILE;
        ctx.destFp = dest;
        if (concatenate) zanConcatenateTIFF(&ctx);
        else zanExtractTIFFPage(&ctx, 1 + selector % 3);
        zanDestroyTIFF(&ctx);
        pivloReleaseContext(&ctx);
    }
    if (source) std::fclose(source);
    if (dest) std::fclose(dest);
    return 0;
}
