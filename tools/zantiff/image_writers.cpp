#include "image_writers.h"

#include <png.h>

#include <csetjmp>
#include <cstring>

namespace zantool {
namespace {

class PngWriter : public ImageWriter {
public:
    PngWriter(FILE* out, const ImageLayout& layout) : layout_(layout) {
        png_ = png_create_write_struct(PNG_LIBPNG_VER_STRING, nullptr, OnError, nullptr);
        if (png_) info_ = png_create_info_struct(png_);
        if (!png_ || !info_ || setjmp(png_jmpbuf(png_))) {
            failed_ = true;
            return;
        }
        static const int kTypes[] = {PNG_COLOR_TYPE_GRAY, PNG_COLOR_TYPE_GRAY_ALPHA, PNG_COLOR_TYPE_RGB,
                                     PNG_COLOR_TYPE_RGB_ALPHA};
        png_init_io(png_, out);
        png_set_IHDR(png_, info_, layout.width, layout.height, static_cast<int>(layout.bits),
                     kTypes[layout.channels - 1], PNG_INTERLACE_NONE, PNG_COMPRESSION_TYPE_DEFAULT,
                     PNG_FILTER_TYPE_DEFAULT);
        png_write_info(png_, info_);
        // The reader delivers 16-bit samples in host order; PNG stores them
        // big-endian.
        const uint16_t probe = 1;
        if (layout.bits == 16 && *reinterpret_cast<const uint8_t*>(&probe) == 1) png_set_swap(png_);
    }
    ~PngWriter() override { png_destroy_write_struct(&png_, &info_); }

    bool WriteRow(const uint8_t* row) override {
        if (failed_ || setjmp(png_jmpbuf(png_))) return !(failed_ = true);
        png_write_row(png_, const_cast<uint8_t*>(row));
        return true;
    }
    bool Finish() override {
        if (failed_ || setjmp(png_jmpbuf(png_))) return !(failed_ = true);
        png_write_end(png_, nullptr);
        return true;
    }

private:
    static void OnError(png_structp png, png_const_charp message) {
        std::fprintf(stderr, "zantiff: PNG: %s\n", message);
        png_longjmp(png, 1);
    }

    ImageLayout layout_;
    png_structp png_ = nullptr;
    png_infop info_ = nullptr;
    bool failed_ = false;
};

class PamWriter : public ImageWriter {
public:
    PamWriter(FILE* out, const ImageLayout& layout) : out_(out), layout_(layout) {
        const unsigned maxval = layout.bits == 16 ? 65535u : 255u;
        failed_ = std::fprintf(out, "P7\nWIDTH %u\nHEIGHT %u\nDEPTH %u\nMAXVAL %u\nTUPLTYPE %s\nENDHDR\n",
                               layout.width, layout.height, layout.channels, maxval,
                               layout.tupleType.c_str()) < 0;
        row_.resize(static_cast<size_t>(layout.width) * layout.channels * (layout.bits / 8));
    }
    bool WriteRow(const uint8_t* row) override {
        if (failed_) return false;
        std::memcpy(row_.data(), row, row_.size());
        if (layout_.bits == 16)  // PAM stores samples big-endian
            for (size_t i = 0; i + 1 < row_.size(); i += 2) {
                uint16_t v;
                std::memcpy(&v, &row[i], 2);
                row_[i] = static_cast<uint8_t>(v >> 8);
                row_[i + 1] = static_cast<uint8_t>(v);
            }
        failed_ = std::fwrite(row_.data(), 1, row_.size(), out_) != row_.size();
        return !failed_;
    }
    bool Finish() override { return !failed_ && std::fflush(out_) == 0; }

private:
    FILE* out_;
    ImageLayout layout_;
    std::vector<uint8_t> row_;
    bool failed_ = false;
};

}  // namespace

std::unique_ptr<ImageWriter> StartPng(FILE* out, const ImageLayout& layout) {
    if (layout.channels < 1 || layout.channels > 4) return nullptr;
    if (layout.bits == 1 && layout.channels != 1) return nullptr;
    return std::make_unique<PngWriter>(out, layout);
}

std::unique_ptr<ImageWriter> StartPam(FILE* out, const ImageLayout& layout) {
    if (layout.bits != 8 && layout.bits != 16) return nullptr;
    return std::make_unique<PamWriter>(out, layout);
}

}  // namespace zantool
