// Pixel routines the module calls on decoded frames.

#include <algorithm>
#include <cstdint>

#include "pivlo/pivlo.h"

extern "C" {

const uint8_t pivloRgbPalette8[8][3] = {{0, 0, 0},   {0, 0, 255},   {0, 255, 0},   {0, 255, 255},
                                         {255, 0, 0}, {255, 0, 255}, {255, 255, 0}, {255, 255, 255}};

int zanVerticalReverseImage(ConversionContext*, void* buffer, uint32_t rowBytes, uint32_t rows) {
    if (!buffer && rows > 0 && rowBytes > 0) return 0;
    auto* bytes = static_cast<uint8_t*>(buffer);
    for (uint32_t top = 0, bottom = rows ? rows - 1 : 0; top < bottom; ++top, --bottom)
        std::swap_ranges(bytes + uint64_t{top} * rowBytes, bytes + uint64_t{top + 1} * rowBytes,
                         bytes + uint64_t{bottom} * rowBytes);
    return 1;
}

int zanConvert1BitRGBPlanarTo4BitRGBPalette8(ConversionContext*, const void* red, const void* green,
                                            const void* blue, void* destination, uint32_t width, uint32_t height) {
    if (!red || !green || !blue || !destination) return 0;
    const uint64_t planeRow = (uint64_t{width} + 7) / 8, outRow = (uint64_t{width} + 1) / 2;
    const auto* planes = static_cast<const uint8_t*>(red);
    const auto* g = static_cast<const uint8_t*>(green);
    const auto* b = static_cast<const uint8_t*>(blue);
    auto* out = static_cast<uint8_t*>(destination);
    for (uint32_t y = 0; y < height; ++y) {
        const uint8_t* r = planes + y * planeRow;
        const uint8_t* gr = g + y * planeRow;
        const uint8_t* bl = b + y * planeRow;
        uint8_t* o = out + y * outRow;
        for (uint32_t x = 0; x < width; ++x) {
            const uint32_t shift = 7 - x % 8;
            const uint32_t index = ((r[x / 8] >> shift) & 1) << 2 | ((gr[x / 8] >> shift) & 1) << 1 |
                                   ((bl[x / 8] >> shift) & 1);
            if (x % 2 == 0) o[x / 2] = static_cast<uint8_t>(index << 4);
            else o[x / 2] = static_cast<uint8_t>(o[x / 2] | index);
        }
    }
    return 1;
}

}  // extern "C"
