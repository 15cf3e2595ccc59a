// The join of JPEG strips on hostile strips. The input is made into a JPEG
// page: the first bytes choose its layout (width, height, rows a strip,
// grey, YCbCr or RGB), and the rest is cut into JPEGTables and the strips
// by 16-bit lengths. The page is asked for as JPEG data; a join that is not
// possible falls back to decoding. Nothing may crash, hang or leak.

#include <cstddef>
#include <algorithm>
#include <cstdint>
#include <vector>

#include "fuzz_support.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 4) return 0;
    zanfuzz::JpegPageLayout layout;
    layout.width = 8u * (1 + data[0] % 32);
    layout.rowsPerStrip = 8u * (1 + data[1] % 8);
    layout.height = layout.rowsPerStrip * (1 + data[2] % 6) - (data[2] >> 4) % 8;
    layout.kind = data[3] % 3;
    std::vector<std::vector<uint8_t>> pieces;
    for (size_t at = 4; at + 2 <= size && pieces.size() < 64;) {
        const size_t length = std::min<size_t>(data[at] | data[at + 1] << 8, size - at - 2);
        pieces.emplace_back(data + at + 2, data + at + 2 + length);
        at += 2 + length;
    }
    if (pieces.empty()) return 0;
    const std::vector<uint8_t> tiff = zanfuzz::JpegTiff(layout, pieces);
    zanfuzz::RequestJpegData(tiff.data(), static_cast<uint32_t>(tiff.size()));
    return 0;
}
