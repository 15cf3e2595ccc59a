// The stream decoder on hostile input fed in hostile pieces. The trailing
// bytes of the input choose the options: the last byte how many piece sizes
// follow it backwards (16-bit each, used in turn), the byte before them the
// delivery (decode, raw delivery with a piece size, libjpeg's bypass) and
// where the input is cut short. Nothing may crash, hang or leak.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "fuzz_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

struct Options {
    std::vector<uint32_t> pieces;
    uint8_t delivery = 0;  // 0 decode, 1 raw, 2 bypass
    uint32_t rawPiece = 0;
    bool cut = false;
    size_t size = 0;  // bytes of TIFF data before the options
};

Options ReadOptions(const uint8_t* data, size_t size) {
    Options o;
    const size_t count = data[size - 1] % 8;
    if (size < 2 + 2 * count) return o;
    for (size_t i = 0; i < count; ++i) {
        const size_t at = size - 3 - 2 * i;
        o.pieces.push_back(std::max<uint32_t>(1, data[at] | data[at + 1] << 8));
    }
    const uint8_t choice = data[size - 2 - 2 * count];
    o.delivery = choice % 3;
    o.rawPiece = (choice >> 2) % 4 * 37;
    o.cut = choice & 0x80;
    o.size = size - 2 - 2 * count;
    if (o.pieces.empty()) o.pieces.push_back(4096);
    return o;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 2) return 0;
    const Options o = ReadOptions(data, size);
    const size_t total = o.cut ? o.size / 2 : o.size;
    ConversionContext ctx;
    zanfuzz::InitQuietJob(&ctx);
    ctx.outputBitsPerSample = (size & 1) ? 16 : 8;
    if (zanTIFFStreamDecodeInit(&ctx, nullptr) != 2) {
        pivloReleaseContext(&ctx);
        return 0;
    }
    StreamChunk chunk{};
    size_t at = 0, turn = 0;
    bool ended = false;
    // A decoder that neither consumes nor delivers nor ends would spin: the
    // calls are bounded by the input (every call either takes a byte, hands
    // out a band, or ends).
    for (size_t calls = 0; calls < 4 * total + 100000; ++calls) {
        if (chunk.inputLength == 0 && at < total) {
            const size_t n = std::min<size_t>(o.pieces[turn++ % o.pieces.size()], total - at);
            chunk.input = data + at;
            chunk.inputLength = static_cast<uint32_t>(n);
            at += n;
        } else if (chunk.inputLength == 0 && !ended) {
            zanTIFFStreamDecodeComplete(&ctx);
            ended = true;
        }
        const int status = zanTIFFStreamDecode(&ctx, &chunk);
        if (status == ZAN_STREAM_PAGE_DESCRIBED) {
            uint32_t type = 0;
            zanTIFFStreamDecodeIsOneChunkTIFF(&ctx, &type);
            zanTIFFStreamDecodeSetRawBufferOutSize(&ctx, o.rawPiece);
            if (o.delivery == 1) zanTIFFStreamDecodeSetNoDecompression(&ctx);
            if (o.delivery == 2) zanTIFFStreamDecodeSetBypassLibTiff(&ctx);
        }
        if (status == ZAN_STREAM_ERROR || status == ZAN_STREAM_STATUS_5 || status == ZAN_STREAM_STATUS_6) break;
    }
    zanTIFFStreamDecodeEnd(&ctx);
    zanDestroyTIFF(&ctx);
    pivloReleaseContext(&ctx);
    return 0;
}
