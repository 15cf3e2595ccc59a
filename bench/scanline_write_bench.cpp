// Writing a 4000 x 4000 page to a file: zanTIFFWriteNextScanLine against a
// plain libtiff TIFFWriteScanline loop, and zanFrameBufferToTIFF against
// TIFFWriteEncodedStrip over the same frame, with the same tags (strips of
// libtiff's default height) in the same run.

#include <benchmark/benchmark.h>

#include <cstdio>
#include <string>
#include <vector>

#include <tiffio.h>

#include "bench_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

constexpr uint32_t kSize = 4000;
const char* const kOutput = "/tmp/zantiff-bench-write.tif";

struct Case {
    bool bilevel;
    uint32_t moduleCompression;  // ZAN_COMPRESSION_*
    uint16_t libtiffCompression;
};

const Case kRgb{false, ZAN_COMPRESSION_NONE, COMPRESSION_NONE};
const Case kRgbLzw{false, ZAN_COMPRESSION_LZW, COMPRESSION_LZW};
const Case kRgbPackBits{false, ZAN_COMPRESSION_PACKBITS, COMPRESSION_PACKBITS};
const Case kBilevelG4{true, ZAN_COMPRESSION_CCITT_G4, COMPRESSION_CCITTFAX4};

uint32_t RowBytes(const Case& c) { return c.bilevel ? (kSize + 7) / 8 : kSize * 3; }

// A page with some structure, so that the compressors have work of a
// realistic kind: gradients for RGB, text-like runs for bilevel.
const std::vector<uint8_t>& Frame(const Case& c) {
    static std::vector<uint8_t> rgb, bilevel;
    std::vector<uint8_t>& frame = c.bilevel ? bilevel : rgb;
    if (!frame.empty()) return frame;
    const uint32_t rowBytes = RowBytes(c);
    frame.resize(static_cast<size_t>(rowBytes) * kSize);
    for (uint32_t y = 0; y < kSize; ++y)
        for (uint32_t i = 0; i < rowBytes; ++i)
            frame[static_cast<size_t>(y) * rowBytes + i] =
                c.bilevel ? static_cast<uint8_t>(((y / 9 + i / 5) % 7 == 0) ? 0x3C : 0x00)
                          : static_cast<uint8_t>((i / 3 + y) / 7 + (i * y) % 5);
    return frame;
}

// A context that writes one page to the benchmark's output file.
void InitFileJob(ConversionContext* ctx) {
    zanbench::InitQuietJob(ctx);
    ctx->destKind = ZAN_DEST_FILE;
    ctx->destPath = kOutput;
    ctx->destFp = std::fopen(kOutput, "wb");
}

void EndFileJob(ConversionContext* ctx) {
    zanDestroyTIFF(ctx);
    if (ctx->destFp) std::fclose(ctx->destFp);
    ctx->destFp = nullptr;
    pivloReleaseContext(ctx);
}

void ModuleScanlines(benchmark::State& state, Case c) {
    const std::vector<uint8_t>& frame = Frame(c);
    const uint32_t rowBytes = RowBytes(c);
    std::vector<uint8_t> line(rowBytes);
    for (auto _ : state) {
        ConversionContext ctx;
        InitFileJob(&ctx);
        ctx.outputColorSpace = c.bilevel ? ZAN_COLORSPACE_BILEVEL : ZAN_COLORSPACE_RGB;
        ctx.imageWidth = kSize;
        ctx.imageHeight = kSize;
        ctx.outputCompression = c.moduleCompression;
        ctx.bitsPerSample = c.bilevel ? 1 : 8;
        ctx.outputBitsPerSample = c.bilevel ? 1 : 8;
        for (uint32_t y = 0; y < kSize; ++y) {
            // The host hands each line in its own buffer, as a scanning loop would.
            std::copy_n(frame.data() + static_cast<size_t>(y) * rowBytes, rowBytes, line.data());
            if (!zanTIFFWriteNextScanLine(&ctx, line.data(), rowBytes)) {
                state.SkipWithError("write failed");
                break;
            }
        }
        EndFileJob(&ctx);
    }
    state.SetItemsProcessed(state.iterations() * kSize);
}

TIFF* OpenLibtiffPage(const Case& c) {
    TIFF* tif = TIFFOpen(kOutput, "w");
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, kSize);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, kSize);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, c.bilevel ? 1 : 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, c.bilevel ? 1 : 3);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, c.bilevel ? PHOTOMETRIC_MINISWHITE : PHOTOMETRIC_RGB);
    TIFFSetField(tif, TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, c.libtiffCompression);
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, TIFFDefaultStripSize(tif, 0xFFFFFFFFu));
    return tif;
}

void LibtiffScanlines(benchmark::State& state, Case c) {
    const std::vector<uint8_t>& frame = Frame(c);
    const uint32_t rowBytes = RowBytes(c);
    std::vector<uint8_t> line(rowBytes);
    for (auto _ : state) {
        TIFF* tif = OpenLibtiffPage(c);
        for (uint32_t y = 0; y < kSize; ++y) {
            std::copy_n(frame.data() + static_cast<size_t>(y) * rowBytes, rowBytes, line.data());
            if (TIFFWriteScanline(tif, line.data(), y, 0) < 0) {
                state.SkipWithError("write failed");
                break;
            }
        }
        TIFFClose(tif);
    }
    state.SetItemsProcessed(state.iterations() * kSize);
}

void ModuleFrame(benchmark::State& state, Case c) {
    std::vector<uint8_t>& frame = const_cast<std::vector<uint8_t>&>(Frame(c));
    for (auto _ : state) {
        ConversionContext ctx;
        InitFileJob(&ctx);
        ctx.colorSpace = c.bilevel ? ZAN_COLORSPACE_BILEVEL : ZAN_COLORSPACE_RGB;
        ctx.frameWidth = kSize;
        ctx.frameHeight = kSize;
        ctx.frameData = frame.data();
        ctx.frameBufferSize = static_cast<uint32_t>(frame.size());
        ctx.frameWhiteIsZero = 1;
        ctx.bitsPerSample = c.bilevel ? 1 : 8;
        ctx.outputBitsPerSample = 8;
        if (!zanFrameBufferToTIFF(&ctx)) state.SkipWithError("write failed");
        ctx.frameData = nullptr;  // the frame is the benchmark's
        EndFileJob(&ctx);
    }
    state.SetItemsProcessed(state.iterations() * kSize);
}

void LibtiffFrame(benchmark::State& state, Case c) {
    std::vector<uint8_t>& frame = const_cast<std::vector<uint8_t>&>(Frame(c));
    const uint32_t rowBytes = RowBytes(c);
    for (auto _ : state) {
        TIFF* tif = OpenLibtiffPage(c);
        uint32_t rowsPerStrip = 0;
        TIFFGetField(tif, TIFFTAG_ROWSPERSTRIP, &rowsPerStrip);
        for (uint32_t row = 0; row < kSize; row += rowsPerStrip) {
            const uint32_t rows = std::min(rowsPerStrip, kSize - row);
            if (TIFFWriteEncodedStrip(tif, row / rowsPerStrip, frame.data() + static_cast<size_t>(row) * rowBytes,
                                      static_cast<tmsize_t>(rows) * rowBytes) < 0) {
                state.SkipWithError("write failed");
                break;
            }
        }
        TIFFClose(tif);
    }
    state.SetItemsProcessed(state.iterations() * kSize);
}

// The module's scanline cases are Module/<case>; the frame writer always
// compresses RGB with PackBits and bilevel with G4, so it has those two.
void ModuleWriteRgb8(benchmark::State& s) { ModuleScanlines(s, kRgb); }
void LibtiffWriteRgb8(benchmark::State& s) { LibtiffScanlines(s, kRgb); }
void ModuleWriteRgb8Lzw(benchmark::State& s) { ModuleScanlines(s, kRgbLzw); }
void LibtiffWriteRgb8Lzw(benchmark::State& s) { LibtiffScanlines(s, kRgbLzw); }
void ModuleWriteRgb8PackBits(benchmark::State& s) { ModuleScanlines(s, kRgbPackBits); }
void LibtiffWriteRgb8PackBits(benchmark::State& s) { LibtiffScanlines(s, kRgbPackBits); }
void ModuleWriteBilevelG4(benchmark::State& s) { ModuleScanlines(s, kBilevelG4); }
void LibtiffWriteBilevelG4(benchmark::State& s) { LibtiffScanlines(s, kBilevelG4); }
void ModuleFrameRgb8PackBits(benchmark::State& s) { ModuleFrame(s, kRgbPackBits); }
void LibtiffFrameRgb8PackBits(benchmark::State& s) { LibtiffFrame(s, kRgbPackBits); }
void ModuleFrameBilevelG4(benchmark::State& s) { ModuleFrame(s, kBilevelG4); }
void LibtiffFrameBilevelG4(benchmark::State& s) { LibtiffFrame(s, kBilevelG4); }

}  // namespace

BENCHMARK(ModuleWriteRgb8)->Name("Module/WriteRgb8")->Unit(benchmark::kMillisecond);
BENCHMARK(LibtiffWriteRgb8)->Name("Libtiff/WriteRgb8")->Unit(benchmark::kMillisecond);
BENCHMARK(ModuleWriteRgb8Lzw)->Name("Module/WriteRgb8Lzw")->Unit(benchmark::kMillisecond);
BENCHMARK(LibtiffWriteRgb8Lzw)->Name("Libtiff/WriteRgb8Lzw")->Unit(benchmark::kMillisecond);
BENCHMARK(ModuleWriteRgb8PackBits)->Name("Module/WriteRgb8PackBits")->Unit(benchmark::kMillisecond);
BENCHMARK(LibtiffWriteRgb8PackBits)->Name("Libtiff/WriteRgb8PackBits")->Unit(benchmark::kMillisecond);
BENCHMARK(ModuleWriteBilevelG4)->Name("Module/WriteBilevelG4")->Unit(benchmark::kMillisecond);
BENCHMARK(LibtiffWriteBilevelG4)->Name("Libtiff/WriteBilevelG4")->Unit(benchmark::kMillisecond);
BENCHMARK(ModuleFrameRgb8PackBits)->Name("Module/FrameRgb8PackBits")->Unit(benchmark::kMillisecond);
BENCHMARK(LibtiffFrameRgb8PackBits)->Name("Libtiff/FrameRgb8PackBits")->Unit(benchmark::kMillisecond);
BENCHMARK(ModuleFrameBilevelG4)->Name("Module/FrameBilevelG4")->Unit(benchmark::kMillisecond);
BENCHMARK(LibtiffFrameBilevelG4)->Name("Libtiff/FrameBilevelG4")->Unit(benchmark::kMillisecond);

BENCHMARK_MAIN();
