// Reading PNG images (libpng) into rows for the writers.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace zantool {

struct PngImage {
    uint32_t width = 0;
    uint32_t height = 0;
    uint32_t colorSpace = 0;   // the writer's code: 1 bilevel, 2 grey, 3 grey+alpha, 7 RGBA, 8 RGB
    uint32_t bitsPerSample = 8; // 1 (bilevel, packed, 0 = black), 8 or 16 (host order)
    uint64_t rowBytes = 0;
    std::vector<uint8_t> pixels; // rows one after another
};

// Reads the PNG at `path`: palettes and transparency become RGB(A), grey of
// 2 and 4 bits becomes 8; 1-bit grey stays bi-level. False (reported on
// standard error) when it cannot be read.
bool ReadPng(const std::string& path, PngImage* image);

}  // namespace zantool
