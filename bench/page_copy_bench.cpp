// Extracting every page of a 200-page file, one call a page, in-process:
// zanExtractTIFFPage against the fastest copy libtiff offers without
// decoding (TIFFSetDirectory, the page's tags, TIFFReadRawStrip and
// TIFFWriteRawStrip into a new file), on the same file in the same run.
// Without process start-up, which dominates the command-line comparison.

#include <benchmark/benchmark.h>

#include <cstdio>
#include <string>
#include <vector>

#include <tiffio.h>

#include "bench_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

constexpr uint32_t kPages = 200;
const char* const kOutput = "/tmp/zantiff-bench-page.tif";

const std::string& SourcePath() {
    static const std::string path =
        zanbench::WriteTemporary(zanbench::GeneratedTiff(kPages, 512, 512, COMPRESSION_LZW), "pages.tif");
    return path;
}

void Module_ExtractEveryPage(benchmark::State& state) {
    SourcePath();  // generated outside the measured loop
    for (auto _ : state) {
        for (uint32_t page = 1; page <= kPages; ++page) {
            FILE* source = std::fopen(SourcePath().c_str(), "rb");
            FILE* dest = std::fopen(kOutput, "w+b");
            ConversionContext ctx;
            zanbench::InitQuietJob(&ctx);
            ctx.sourceKind = ZAN_SOURCE_FILE;
            ctx.sourceFp = source;
            ctx.destKind = ZAN_DEST_FILE;
            ctx.destFp = dest;
            if (!zanExtractTIFFPage(&ctx, static_cast<int32_t>(page))) state.SkipWithError("extract failed");
            pivloReleaseContext(&ctx);
            std::fclose(dest);
            std::fclose(source);
        }
    }
    state.SetItemsProcessed(state.iterations() * kPages);
}

// The page's tags that describe its data, copied as they are.
void CopyPageTags(TIFF* in, TIFF* out) {
    for (uint32_t tag : {TIFFTAG_IMAGEWIDTH, TIFFTAG_IMAGELENGTH, TIFFTAG_ROWSPERSTRIP}) {
        uint32_t v = 0;
        if (TIFFGetField(in, tag, &v)) TIFFSetField(out, tag, v);
    }
    for (uint32_t tag : {TIFFTAG_BITSPERSAMPLE, TIFFTAG_SAMPLESPERPIXEL, TIFFTAG_PHOTOMETRIC,
                         TIFFTAG_COMPRESSION, TIFFTAG_PLANARCONFIG, TIFFTAG_PREDICTOR}) {
        uint16_t v = 0;
        if (TIFFGetField(in, tag, &v)) TIFFSetField(out, tag, v);
    }
    char* description = nullptr;
    if (TIFFGetField(in, TIFFTAG_IMAGEDESCRIPTION, &description)) TIFFSetField(out, TIFFTAG_IMAGEDESCRIPTION, description);
}

void Libtiff_ExtractEveryPage(benchmark::State& state) {
    std::vector<uint8_t> strip;
    SourcePath();
    for (auto _ : state) {
        for (uint32_t page = 0; page < kPages; ++page) {
            TIFF* in = TIFFOpen(SourcePath().c_str(), "r");
            TIFF* out = TIFFOpen(kOutput, "w");
            if (!in || !out || !TIFFSetDirectory(in, static_cast<tdir_t>(page))) {
                state.SkipWithError("open failed");
                break;
            }
            CopyPageTags(in, out);
            uint64_t* sizes = nullptr;
            TIFFGetField(in, TIFFTAG_STRIPBYTECOUNTS, &sizes);
            for (uint32_t s = 0; s < TIFFNumberOfStrips(in); ++s) {
                strip.resize(static_cast<size_t>(sizes[s]));
                const tmsize_t n = TIFFReadRawStrip(in, s, strip.data(), static_cast<tmsize_t>(strip.size()));
                if (n < 0 || TIFFWriteRawStrip(out, s, strip.data(), n) < 0) state.SkipWithError("copy failed");
            }
            TIFFClose(out);
            TIFFClose(in);
        }
    }
    state.SetItemsProcessed(state.iterations() * kPages);
}

}  // namespace

BENCHMARK(Module_ExtractEveryPage)->Unit(benchmark::kMillisecond);
BENCHMARK(Libtiff_ExtractEveryPage)->Unit(benchmark::kMillisecond);

BENCHMARK_MAIN();
