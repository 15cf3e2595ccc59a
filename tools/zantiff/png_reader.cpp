#include "png_reader.h"

#include <png.h>

#include <csetjmp>
#include <cstdio>
#include <memory>

namespace zantool {
namespace {

void OnPngError(png_structp png, png_const_charp message) {
    std::fprintf(stderr, "zantiff: PNG: %s\n", message);
    png_longjmp(png, 1);
}

struct PngReadState {
    png_structp png = nullptr;
    png_infop info = nullptr;
    ~PngReadState() { png_destroy_read_struct(&png, &info, nullptr); }
};

}  // namespace

bool ReadPng(const std::string& path, PngImage* image) {
    std::unique_ptr<FILE, int (*)(FILE*)> file(std::fopen(path.c_str(), "rb"), std::fclose);
    if (!file) {
        std::fprintf(stderr, "zantiff: cannot open %s\n", path.c_str());
        return false;
    }
    PngReadState s;
    s.png = png_create_read_struct(PNG_LIBPNG_VER_STRING, nullptr, OnPngError, nullptr);
    if (s.png) s.info = png_create_info_struct(s.png);
    if (!s.png || !s.info) return false;
    if (setjmp(png_jmpbuf(s.png))) return false;
    png_init_io(s.png, file.get());
    png_read_info(s.png, s.info);
    const int type = png_get_color_type(s.png, s.info);
    const int depth = png_get_bit_depth(s.png, s.info);
    const bool bilevel = type == PNG_COLOR_TYPE_GRAY && depth == 1 && !png_get_valid(s.png, s.info, PNG_INFO_tRNS);
    if (!bilevel) {
        png_set_palette_to_rgb(s.png);
        png_set_expand_gray_1_2_4_to_8(s.png);
        png_set_tRNS_to_alpha(s.png);
    }
    const uint16_t probe = 1;
    if (depth == 16 && *reinterpret_cast<const uint8_t*>(&probe) == 1) png_set_swap(s.png);  // host order
    png_read_update_info(s.png, s.info);
    image->width = png_get_image_width(s.png, s.info);
    image->height = png_get_image_height(s.png, s.info);
    image->bitsPerSample = bilevel ? 1 : png_get_bit_depth(s.png, s.info);
    switch (png_get_color_type(s.png, s.info)) {
    case PNG_COLOR_TYPE_GRAY: image->colorSpace = bilevel ? 1 : 2; break;
    case PNG_COLOR_TYPE_GRAY_ALPHA: image->colorSpace = 3; break;
    case PNG_COLOR_TYPE_RGB: image->colorSpace = 8; break;
    default: image->colorSpace = 7; break;
    }
    image->rowBytes = png_get_rowbytes(s.png, s.info);
    image->pixels.resize(static_cast<size_t>(image->rowBytes * image->height));
    std::vector<png_bytep> rows(image->height);
    for (uint32_t y = 0; y < image->height; ++y) rows[y] = image->pixels.data() + y * image->rowBytes;
    png_read_image(s.png, rows.data());
    png_read_end(s.png, nullptr);
    return true;
}

}  // namespace zantool
