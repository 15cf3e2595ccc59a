// Rows per second of zanTIFFReadNextScanLine against libtiff on the same
// 4000 x 4000 files in the same run: a TIFFReadScanline loop, followed for
// the palette and 16-bit pages by the conversion the module does (RGB from
// the ColorMap's high bytes; each 16-bit sample cut to its high byte).

#include <benchmark/benchmark.h>

#include <cstdio>
#include <map>
#include <string>
#include <vector>

#include <tiffio.h>

#include "bench_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

constexpr uint32_t kSize = 4000;

enum class Kind { Rgb8, Rgb8Lzw, Rgb16, Palette8 };

const char* Name(Kind kind) {
    switch (kind) {
    case Kind::Rgb8: return "rgb8";
    case Kind::Rgb8Lzw: return "rgb8-lzw";
    case Kind::Rgb16: return "rgb16";
    case Kind::Palette8: return "palette8";
    }
    return "";
}

// Writes the benchmark file of `kind` once per run and gives its path.
const std::string& InputFile(Kind kind) {
    static std::map<Kind, std::string> paths;
    auto found = paths.find(kind);
    if (found != paths.end()) return found->second;
    const std::string path = std::string("/tmp/zantiff-bench-read-") + Name(kind) + ".tif";
    TIFF* tif = TIFFOpen(path.c_str(), "w");
    const bool palette = kind == Kind::Palette8;
    const uint16_t bits = kind == Kind::Rgb16 ? 16 : 8, samples = palette ? 1 : 3;
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, kSize);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, kSize);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, bits);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, samples);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, palette ? PHOTOMETRIC_PALETTE : PHOTOMETRIC_RGB);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, kind == Kind::Rgb8Lzw ? COMPRESSION_LZW : COMPRESSION_NONE);
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, TIFFDefaultStripSize(tif, 0));
    if (palette) {
        std::vector<uint16_t> map(768);
        for (int i = 0; i < 768; ++i) map[i] = static_cast<uint16_t>((i * 37 % 256) * 257);
        TIFFSetField(tif, TIFFTAG_COLORMAP, map.data(), map.data() + 256, map.data() + 512);
    }
    std::vector<uint8_t> row(static_cast<size_t>(kSize) * samples * bits / 8);
    for (uint32_t y = 0; y < kSize; ++y) {
        for (size_t i = 0; i < row.size(); ++i) row[i] = static_cast<uint8_t>((i / 3 + y) / 7 + (i * y) % 5);
        TIFFWriteScanline(tif, row.data(), y, 0);
    }
    TIFFClose(tif);
    return paths.emplace(kind, path).first->second;
}

void Module(benchmark::State& state, Kind kind) {
    const std::string& path = InputFile(kind);
    std::vector<uint8_t> line(static_cast<size_t>(kSize) * 6);
    for (auto _ : state) {
        FILE* fp = std::fopen(path.c_str(), "rb");
        ConversionContext ctx;
        zanbench::InitQuietJob(&ctx);
        ctx.sourceKind = ZAN_SOURCE_FILE;
        ctx.sourceFp = fp;
        ctx.outputBitsPerSample = 8;
        zanbench::ReadRowsAndRelease(state, &ctx, line, kSize);
        std::fclose(fp);
    }
    state.SetItemsProcessed(state.iterations() * kSize);
}

void Libtiff(benchmark::State& state, Kind kind) {
    const std::string& path = InputFile(kind);
    for (auto _ : state) {
        TIFF* tif = TIFFOpen(path.c_str(), "r");
        std::vector<uint8_t> line(static_cast<size_t>(TIFFScanlineSize(tif)));
        for (uint32_t y = 0; y < kSize; ++y)
            if (TIFFReadScanline(tif, line.data(), y, 0) < 0) {
                state.SkipWithError("read failed");
                break;
            }
        benchmark::DoNotOptimize(line.data());
        TIFFClose(tif);
    }
    state.SetItemsProcessed(state.iterations() * kSize);
}

// TIFFReadScanline and then what the module's lines hold: palette indices
// looked up, 16-bit samples cut to 8 bits.
void LibtiffConverting(benchmark::State& state, Kind kind) {
    const std::string& path = InputFile(kind);
    for (auto _ : state) {
        TIFF* tif = TIFFOpen(path.c_str(), "r");
        uint16_t *red = nullptr, *green = nullptr, *blue = nullptr;
        TIFFGetField(tif, TIFFTAG_COLORMAP, &red, &green, &blue);
        std::vector<uint8_t> line(static_cast<size_t>(TIFFScanlineSize(tif)));
        std::vector<uint8_t> out(static_cast<size_t>(kSize) * 3);
        for (uint32_t y = 0; y < kSize; ++y) {
            if (TIFFReadScanline(tif, line.data(), y, 0) < 0) {
                state.SkipWithError("read failed");
                break;
            }
            if (kind == Kind::Palette8) {
                for (uint32_t x = 0; x < kSize; ++x) {
                    const uint8_t index = line[x];
                    out[3 * x] = static_cast<uint8_t>(red[index] >> 8);
                    out[3 * x + 1] = static_cast<uint8_t>(green[index] >> 8);
                    out[3 * x + 2] = static_cast<uint8_t>(blue[index] >> 8);
                }
            } else {
                const auto* samples = reinterpret_cast<const uint16_t*>(line.data());
                for (size_t i = 0; i < out.size(); ++i) out[i] = static_cast<uint8_t>(samples[i] >> 8);
            }
            benchmark::DoNotOptimize(out.data());
        }
        TIFFClose(tif);
    }
    state.SetItemsProcessed(state.iterations() * kSize);
}

BENCHMARK_CAPTURE(Module, ReadRgb8, Kind::Rgb8)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Libtiff, ReadRgb8, Kind::Rgb8)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Module, ReadRgb8Lzw, Kind::Rgb8Lzw)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Libtiff, ReadRgb8Lzw, Kind::Rgb8Lzw)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Module, ReadRgb16To8, Kind::Rgb16)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(LibtiffConverting, ReadRgb16To8, Kind::Rgb16)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Module, ReadPalette8, Kind::Palette8)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(LibtiffConverting, ReadPalette8, Kind::Palette8)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
