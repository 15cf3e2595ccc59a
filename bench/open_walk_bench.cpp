// Opening a TIFF and walking its directories: the module's open over 32-bit
// client procedures against libtiff over its own 64-bit procedures, on the
// same 200-page file, from memory and from a file.

#include <benchmark/benchmark.h>

#include <cstdio>

#include "bench_support.h"
#include "frame/tiff_open.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

using zanbench::GeneratedTiff;

const zanbench::Bytes& TwoHundredPages() { return GeneratedTiff(200, 256, 64, COMPRESSION_LZW); }

int WalkAndDecodeFirstStrips(TIFF* tif) {
    static std::vector<uint8_t> strip(1 << 20);
    int pages = 0;
    do {
        TIFFReadEncodedStrip(tif, 0, strip.data(), static_cast<tmsize_t>(strip.size()));
        ++pages;
    } while (TIFFReadDirectory(tif));
    return pages;
}

void Module_MemorySource(benchmark::State& state) {
    const auto& bytes = TwoHundredPages();
    for (auto _ : state) {
        ConversionContext ctx;
        zanbench::InitQuietJob(&ctx);
        ctx.sourceKind = ZAN_SOURCE_MEMORY;
        ctx.sourceMemory = bytes.data();
        ctx.sourceMemorySize = static_cast<uint32_t>(bytes.size());
        if (!zan::OpenTIFFForReading(&ctx)) state.SkipWithError("open failed");
        benchmark::DoNotOptimize(WalkAndDecodeFirstStrips(ctx.tiff));
        zanDestroyTIFF(&ctx);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * bytes.size()));
}

void Libtiff_MemorySource(benchmark::State& state) {
    const auto& bytes = TwoHundredPages();
    for (auto _ : state) {
        TIFF* tif = zanbench::OpenMemoryWithLibtiff(bytes, "rm");
        if (!tif) state.SkipWithError("open failed");
        benchmark::DoNotOptimize(WalkAndDecodeFirstStrips(tif));
        TIFFClose(tif);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * bytes.size()));
}

void Module_FileSource(benchmark::State& state) {
    const auto& bytes = TwoHundredPages();
    const std::string path = zanbench::WriteTemporary(bytes, "open-walk.tif");
    for (auto _ : state) {
        FILE* fp = std::fopen(path.c_str(), "rb");
        ConversionContext ctx;
        zanbench::InitQuietJob(&ctx);
        ctx.sourceKind = ZAN_SOURCE_FILE;
        ctx.sourceFp = fp;
        if (!zan::OpenTIFFForReading(&ctx)) state.SkipWithError("open failed");
        benchmark::DoNotOptimize(WalkAndDecodeFirstStrips(ctx.tiff));
        zanDestroyTIFF(&ctx);
        std::fclose(fp);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * bytes.size()));
}

void Libtiff_FileSource(benchmark::State& state) {
    const auto& bytes = TwoHundredPages();
    const std::string path = zanbench::WriteTemporary(bytes, "open-walk.tif");
    for (auto _ : state) {
        TIFF* tif = TIFFOpen(path.c_str(), "rm");
        if (!tif) state.SkipWithError("open failed");
        benchmark::DoNotOptimize(WalkAndDecodeFirstStrips(tif));
        TIFFClose(tif);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * bytes.size()));
}

BENCHMARK(Module_MemorySource)->Unit(benchmark::kMillisecond);
BENCHMARK(Libtiff_MemorySource)->Unit(benchmark::kMillisecond);
BENCHMARK(Module_FileSource)->Unit(benchmark::kMillisecond);
BENCHMARK(Libtiff_FileSource)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
