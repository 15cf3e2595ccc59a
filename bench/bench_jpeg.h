// The JPEG of the wrapping benchmarks, shared by the benchmark programs and
// make_bench_inputs: 8000 x 6000, 4:2:0, about 30 MB.
#pragma once

#include <cstdint>
#include <cstdio>
#include <vector>

#include <jpeglib.h>

namespace zanbench {

// A photograph-sized JPEG with grain: gradients and per-pixel noise, at a
// high quality, give a stream of about 30 MB.
inline bool WriteBenchJpeg(const char* path) {
    FILE* out = std::fopen(path, "wb");
    if (!out) return false;
    constexpr uint32_t kWidth = 8000, kHeight = 6000;
    jpeg_compress_struct c{};
    jpeg_error_mgr errors{};
    c.err = jpeg_std_error(&errors);
    jpeg_create_compress(&c);
    jpeg_stdio_dest(&c, out);
    c.image_width = kWidth;
    c.image_height = kHeight;
    c.input_components = 3;
    c.in_color_space = JCS_RGB;
    jpeg_set_defaults(&c);
    jpeg_set_quality(&c, 96, TRUE);
    jpeg_start_compress(&c, TRUE);
    std::vector<uint8_t> row(kWidth * 3);
    uint32_t noise = 12345;
    for (uint32_t y = 0; y < kHeight; ++y) {
        for (uint32_t i = 0; i < row.size(); ++i) {
            noise = noise * 1103515245u + 12345u;
            row[i] = static_cast<uint8_t>((i / 3 + y) / 60 + (i % 3) * 40 + (noise >> 27));
        }
        JSAMPROW pointer = row.data();
        jpeg_write_scanlines(&c, &pointer, 1);
    }
    jpeg_finish_compress(&c);
    jpeg_destroy_compress(&c);
    return std::fclose(out) == 0;
}

}  // namespace zanbench
