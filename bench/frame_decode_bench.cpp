// zanTIFFToFrameBuffer against libtiff on the same 8000 x 8000 pages in the
// same run: the whole-page decode against TIFFReadRGBAImage (RGB and grey,
// LZW), and the join of a multi-strip JPEG page against a plain copy of its
// strips and against decoding and encoding it again.

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include <jpeglib.h>
#include <tiffio.h>

#include "bench_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

constexpr uint32_t kSize = 8000;

enum class Kind { RgbLzw, GreyLzw, Jpeg };

// Writes the page of `kind` once per run and gives its path.
const std::string& InputFile(Kind kind) {
    static std::map<Kind, std::string> paths;
    if (auto found = paths.find(kind); found != paths.end()) return found->second;
    const char* names[] = {"rgb-lzw", "grey-lzw", "jpeg"};
    const std::string path = std::string("/tmp/zantiff-bench-frame-") + names[static_cast<int>(kind)] + ".tif";
    const uint16_t samples = kind == Kind::GreyLzw ? 1 : 3;
    TIFF* tif = TIFFOpen(path.c_str(), "w");
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, kSize);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, kSize);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, samples);
    if (kind == Kind::Jpeg) {
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_JPEG);
        TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_YCBCR);
        TIFFSetField(tif, TIFFTAG_YCBCRSUBSAMPLING, 2, 2);
        TIFFSetField(tif, TIFFTAG_JPEGQUALITY, 85);
        TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
        TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, 64);
    } else {
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_LZW);
        TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, samples == 3 ? PHOTOMETRIC_RGB : PHOTOMETRIC_MINISBLACK);
        TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, TIFFDefaultStripSize(tif, 0));
    }
    std::vector<uint8_t> row(static_cast<size_t>(kSize) * samples);
    for (uint32_t y = 0; y < kSize; ++y) {
        // Smooth gradients with some texture: compresses like a photograph.
        for (size_t i = 0; i < row.size(); ++i) row[i] = static_cast<uint8_t>((i / samples + y) / 3 + (i * 7 + y * 13) % 11);
        TIFFWriteScanline(tif, row.data(), y, 0);
    }
    TIFFClose(tif);
    return paths.emplace(kind, path).first->second;
}

// The page's bytes in memory, read once per run.
const zanbench::Bytes& InputBytes(Kind kind) {
    static std::map<Kind, zanbench::Bytes> bytes;
    if (auto found = bytes.find(kind); found != bytes.end()) return found->second;
    FILE* fp = std::fopen(InputFile(kind).c_str(), "rb");
    zanbench::Bytes data;
    uint8_t chunk[1 << 16];
    for (size_t n; (n = std::fread(chunk, 1, sizeof chunk, fp)) > 0;) data.insert(data.end(), chunk, chunk + n);
    std::fclose(fp);
    return bytes.emplace(kind, std::move(data)).first->second;
}

// One call of zanTIFFToFrameBuffer; the frame (or the JPEG stream, asked
// for with `destFormat`) is released afterwards. Frames are decoded from the
// file; the JPEG join, whose own work is a copy, reads the page from memory
// (as its references do), so that file reads do not hide it.
void Module(benchmark::State& state, Kind kind, uint32_t destFormat) {
    const std::string& path = InputFile(kind);
    const zanbench::Bytes& bytes = InputBytes(kind);
    for (auto _ : state) {
        FILE* fp = destFormat ? nullptr : std::fopen(path.c_str(), "rb");
        ConversionContext ctx;
        zanbench::InitQuietJob(&ctx);
        if (fp) {
            ctx.sourceKind = ZAN_SOURCE_FILE;
            ctx.sourceFp = fp;
        } else {
            ctx.sourceKind = ZAN_SOURCE_MEMORY;
            ctx.sourceMemory = bytes.data();
            ctx.sourceMemorySize = static_cast<uint32_t>(bytes.size());
        }
        ctx.destFormat = destFormat;
        void* stream = nullptr;
        uint32_t streamSize = 0;
        ctx.destKind = ZAN_DEST_MEMORY;
        ctx.destMemory = &stream;
        ctx.destSizeOut = &streamSize;
        uint32_t direct = 0;
        if (!zanTIFFToFrameBuffer(&ctx, &direct) || (destFormat && direct != 1)) state.SkipWithError("decode failed");
        benchmark::DoNotOptimize(ctx.frameData);
        std::free(stream);
        zanDestroyTIFF(&ctx);
        pivloReleaseContext(&ctx);
        if (fp) std::fclose(fp);
    }
}

// What a host does with libtiff alone: the RGBA raster of the page.
void Libtiff(benchmark::State& state, Kind kind) {
    const std::string& path = InputFile(kind);
    for (auto _ : state) {
        TIFF* tif = TIFFOpen(path.c_str(), "r");
        std::unique_ptr<uint32_t[]> raster(new uint32_t[static_cast<size_t>(kSize) * kSize]);
        if (!TIFFReadRGBAImage(tif, kSize, kSize, raster.get(), 0)) state.SkipWithError("read failed");
        benchmark::DoNotOptimize(raster.get());
        TIFFClose(tif);
    }
}

// The bytes of every strip copied into one block, as they are, from the
// page in memory.
void Copy(benchmark::State& state, Kind kind) {
    const zanbench::Bytes& bytes = InputBytes(kind);
    for (auto _ : state) {
        TIFF* tif = zanbench::OpenMemoryWithLibtiff(bytes, "r");
        uint64_t total = 0;
        for (uint32_t s = 0; s < TIFFNumberOfStrips(tif); ++s) total += TIFFGetStrileByteCount(tif, s);
        std::unique_ptr<uint8_t[]> out(new uint8_t[total]);
        uint64_t at = 0;
        for (uint32_t s = 0; s < TIFFNumberOfStrips(tif); ++s) {
            const tmsize_t n = TIFFReadRawStrip(tif, s, out.get() + at, static_cast<tmsize_t>(total - at));
            if (n < 0) state.SkipWithError("read failed");
            at += static_cast<uint64_t>(n);
        }
        benchmark::DoNotOptimize(out.get());
        TIFFClose(tif);
    }
}

// Decoding the page (in memory) to RGB and encoding it as one JPEG again.
void Recode(benchmark::State& state, Kind kind) {
    const zanbench::Bytes& bytes = InputBytes(kind);
    for (auto _ : state) {
        TIFF* tif = zanbench::OpenMemoryWithLibtiff(bytes, "r");
        TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
        jpeg_compress_struct c{};
        jpeg_error_mgr errors{};
        c.err = jpeg_std_error(&errors);
        jpeg_create_compress(&c);
        unsigned char* memory = nullptr;
        unsigned long size = 0;
        jpeg_mem_dest(&c, &memory, &size);
        c.image_width = kSize;
        c.image_height = kSize;
        c.input_components = 3;
        c.in_color_space = JCS_RGB;
        jpeg_set_defaults(&c);
        jpeg_set_quality(&c, 85, TRUE);
        jpeg_start_compress(&c, TRUE);
        std::vector<uint8_t> strip(static_cast<size_t>(TIFFStripSize(tif)));
        uint32_t rowsPerStrip = 0;
        TIFFGetField(tif, TIFFTAG_ROWSPERSTRIP, &rowsPerStrip);
        for (uint32_t s = 0; s < TIFFNumberOfStrips(tif); ++s) {
            if (TIFFReadEncodedStrip(tif, s, strip.data(), -1) < 0) state.SkipWithError("read failed");
            for (uint32_t r = 0; r < rowsPerStrip && c.next_scanline < kSize; ++r) {
                JSAMPROW row = strip.data() + static_cast<size_t>(r) * kSize * 3;
                jpeg_write_scanlines(&c, &row, 1);
            }
        }
        jpeg_finish_compress(&c);
        jpeg_destroy_compress(&c);
        std::free(memory);
        TIFFClose(tif);
    }
}

BENCHMARK_CAPTURE(Module, FrameRgbLzw, Kind::RgbLzw, 0)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Libtiff, FrameRgbLzw, Kind::RgbLzw)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Module, FrameGreyLzw, Kind::GreyLzw, 0)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Libtiff, FrameGreyLzw, Kind::GreyLzw)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Module, JoinJpeg, Kind::Jpeg, ZAN_DEST_FORMAT_JPEG)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Copy, JoinJpeg, Kind::Jpeg)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Recode, JoinJpeg, Kind::Jpeg)->Unit(benchmark::kMillisecond)->Iterations(1);

}  // namespace

BENCHMARK_MAIN();
