// Writers of the decoded lines: PNG through libpng, and PAM (Netpbm's
// arbitrary-map format) for separated pages and sample layouts PNG lacks.
#pragma once

#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

namespace zantool {

struct ImageLayout {
    uint32_t width = 0;
    uint32_t height = 0;
    uint32_t channels = 1;  // samples per pixel, interleaved
    uint32_t bits = 8;      // 1 (packed, 0 = black), 8 or 16 (host byte order)
    std::string tupleType;  // PAM: GRAYSCALE, RGB, CMYK, ... (PNG ignores it)
};

// Writes rows one at a time; Finish() completes the file. Every call
// returns false after a failure (reported on standard error).
class ImageWriter {
public:
    virtual ~ImageWriter() = default;
    virtual bool WriteRow(const uint8_t* row) = 0;
    virtual bool Finish() = 0;
};

// PNG for 1 to 4 channels (grey, grey+alpha, RGB, RGBA); null when the
// layout does not fit PNG or the file cannot be started.
std::unique_ptr<ImageWriter> StartPng(FILE* out, const ImageLayout& layout);

// PAM for any channel count at 8 or 16 bits.
std::unique_ptr<ImageWriter> StartPam(FILE* out, const ImageLayout& layout);

}  // namespace zantool
