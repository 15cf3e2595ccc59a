// The stream decoder against the scanline reader on the same 8000 x 8000
// RGB LZW page in the same run: the page fed in pieces of 64 KiB, against
// zanTIFFReadNextScanLine reading it whole from memory. The page's
// directory comes first (as a streaming writer would put it), and each case
// reports the peak of the job's memory (the blocks of the job's allocator)
// as peak_job_MB.

#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include <tiffio.h>

#include "bench_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

constexpr uint32_t kSize = 8000;
constexpr uint32_t kPiece = 64 << 10;

// The job's allocator, counting the bytes it has out and their peak.
struct TrackedHeap {
    static inline uint64_t current = 0, peak = 0;
    static void* Alloc(uint32_t n) {
        auto* block = static_cast<uint64_t*>(std::malloc(n + 16u));
        if (!block) return nullptr;
        *block = n;
        Count(n);
        return block + 2;
    }
    static void* Realloc(void* p, uint32_t n) {
        if (!p) return Alloc(n);
        auto* block = static_cast<uint64_t*>(p) - 2;
        const uint64_t old = *block;
        auto* grown = static_cast<uint64_t*>(std::realloc(block, n + 16u));
        if (!grown) return nullptr;
        *grown = n;
        current -= old;
        Count(n);
        return grown + 2;
    }
    static void Free(void* p) {
        if (!p) return;
        auto* block = static_cast<uint64_t*>(p) - 2;
        current -= *block;
        std::free(block);
    }
    static void Count(uint64_t n) {
        current += n;
        peak = std::max(peak, current);
    }
};

void Little16(zanbench::Bytes& b, uint16_t v) { b.insert(b.end(), {uint8_t(v), uint8_t(v >> 8)}); }
void Little32(zanbench::Bytes& b, uint32_t v) {
    for (int i = 0; i < 4; ++i) b.push_back(static_cast<uint8_t>(v >> (8 * i)));
}

// The page written by libtiff, then laid out again with its directory and
// tables first and the strips after them.
const zanbench::Bytes& DirectoryFirstPage() {
    static const zanbench::Bytes page = [] {
        const char* path = "/tmp/zantiff-bench-stream.tif";
        TIFF* tif = TIFFOpen(path, "w");
        TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, kSize);
        TIFFSetField(tif, TIFFTAG_IMAGELENGTH, kSize);
        TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
        TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 3);
        TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_RGB);
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_LZW);
        TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, TIFFDefaultStripSize(tif, 0));
        std::vector<uint8_t> row(kSize * 3);
        for (uint32_t y = 0; y < kSize; ++y) {
            for (size_t i = 0; i < row.size(); ++i) row[i] = static_cast<uint8_t>((i / 3 + y) / 3 + (i * 7 + y * 13) % 11);
            TIFFWriteScanline(tif, row.data(), y, 0);
        }
        TIFFClose(tif);
        tif = TIFFOpen(path, "r");
        uint32_t rowsPerStrip = 0;
        TIFFGetField(tif, TIFFTAG_ROWSPERSTRIP, &rowsPerStrip);
        const uint32_t strips = TIFFNumberOfStrips(tif);
        std::vector<zanbench::Bytes> data(strips);
        for (uint32_t s = 0; s < strips; ++s) {
            data[s].resize(static_cast<size_t>(TIFFGetStrileByteCount(tif, s)));
            TIFFReadRawStrip(tif, s, data[s].data(), static_cast<tmsize_t>(data[s].size()));
        }
        TIFFClose(tif);
        std::remove(path);
        // Header, directory of 10 entries, BitsPerSample, the two strip tables, strips.
        const uint32_t entries = 10, directoryEnd = 8 + 2 + entries * 12 + 4;
        const uint32_t bitsAt = directoryEnd, offsetsAt = bitsAt + 6, countsAt = offsetsAt + 4 * strips;
        uint32_t next = countsAt + 4 * strips;
        zanbench::Bytes out = {'I', 'I', 42, 0};
        Little32(out, 8);
        Little16(out, entries);
        auto entry = [&](uint16_t tag, uint16_t type, uint32_t count, uint32_t value) {
            Little16(out, tag);
            Little16(out, type);
            Little32(out, count);
            Little32(out, value);
        };
        entry(TIFFTAG_IMAGEWIDTH, TIFF_LONG, 1, kSize);
        entry(TIFFTAG_IMAGELENGTH, TIFF_LONG, 1, kSize);
        entry(TIFFTAG_BITSPERSAMPLE, TIFF_SHORT, 3, bitsAt);
        entry(TIFFTAG_COMPRESSION, TIFF_SHORT, 1, COMPRESSION_LZW);
        entry(TIFFTAG_PHOTOMETRIC, TIFF_SHORT, 1, PHOTOMETRIC_RGB);
        entry(TIFFTAG_STRIPOFFSETS, TIFF_LONG, strips, offsetsAt);
        entry(TIFFTAG_SAMPLESPERPIXEL, TIFF_SHORT, 1, 3);
        entry(TIFFTAG_ROWSPERSTRIP, TIFF_LONG, 1, rowsPerStrip);
        entry(TIFFTAG_STRIPBYTECOUNTS, TIFF_LONG, strips, countsAt);
        entry(TIFFTAG_PLANARCONFIG, TIFF_SHORT, 1, PLANARCONFIG_CONTIG);
        Little32(out, 0);
        for (int i = 0; i < 3; ++i) Little16(out, 8);
        for (uint32_t s = 0; s < strips; ++s) {
            Little32(out, next);
            next += static_cast<uint32_t>(data[s].size());
        }
        for (uint32_t s = 0; s < strips; ++s) Little32(out, static_cast<uint32_t>(data[s].size()));
        for (const zanbench::Bytes& strip : data) out.insert(out.end(), strip.begin(), strip.end());
        return out;
    }();
    return page;
}

void StartJob(ConversionContext* ctx) {
    zanbench::InitQuietJob(ctx);
    ctx->allocProc = TrackedHeap::Alloc;
    ctx->reallocProc = TrackedHeap::Realloc;
    ctx->freeProc = TrackedHeap::Free;
    TrackedHeap::current = TrackedHeap::peak = 0;
}

void ReportPeak(benchmark::State& state) {
    state.counters["peak_job_MB"] = static_cast<double>(TrackedHeap::peak) / (1 << 20);
}

// The page fed in pieces of 64 KiB; every row of every band touched.
void Module(benchmark::State& state) {
    const zanbench::Bytes& page = DirectoryFirstPage();
    for (auto _ : state) {
        ConversionContext ctx;
        StartJob(&ctx);
        zanTIFFStreamDecodeInit(&ctx, nullptr);
        StreamChunk chunk{};
        size_t at = 0;
        uint64_t rows = 0;
        int status = ZAN_STREAM_CONTINUE;
        while (status == ZAN_STREAM_CONTINUE || status == ZAN_STREAM_PAGE_DESCRIBED) {
            if (chunk.inputLength == 0) {
                if (at == page.size()) zanTIFFStreamDecodeComplete(&ctx);
                const size_t n = std::min<size_t>(kPiece, page.size() - at);
                chunk.input = page.data() + at;
                chunk.inputLength = static_cast<uint32_t>(n);
                at += n;
            }
            status = zanTIFFStreamDecode(&ctx, &chunk);
            if (chunk.output) {
                benchmark::DoNotOptimize(static_cast<const uint8_t*>(chunk.output)[0]);
                rows += chunk.bandRows;
            }
        }
        if (status != ZAN_STREAM_STATUS_5 || rows != kSize) state.SkipWithError("stream decode failed");
        zanTIFFStreamDecodeEnd(&ctx);
        zanDestroyTIFF(&ctx);
        pivloReleaseContext(&ctx);
    }
    ReportPeak(state);
}

// The same page through zanTIFFReadNextScanLine, from memory (which libtiff
// reads in place) or from a file.
void Reader(benchmark::State& state, bool fromFile) {
    const zanbench::Bytes& page = DirectoryFirstPage();
    const std::string path = fromFile ? zanbench::WriteTemporary(page, "zantiff-bench-stream-page.tif") : "";
    std::vector<uint8_t> line(kSize * 3);
    for (auto _ : state) {
        ConversionContext ctx;
        StartJob(&ctx);
        FILE* fp = fromFile ? std::fopen(path.c_str(), "rb") : nullptr;
        if (fp) {
            ctx.sourceKind = ZAN_SOURCE_FILE;
            ctx.sourceFp = fp;
        } else {
            ctx.sourceKind = ZAN_SOURCE_MEMORY;
            ctx.sourceMemory = page.data();
            ctx.sourceMemorySize = static_cast<uint32_t>(page.size());
        }
        ctx.pageNumber = 1;
        zanbench::ReadRowsAndRelease(state, &ctx, line, kSize);
        if (fp) std::fclose(fp);
    }
    ReportPeak(state);
}

BENCHMARK(Module)->Name("Module/StreamLzw8000")->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Reader, StreamLzw8000, false)->Name("ReaderFromMemory/StreamLzw8000")->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Reader, StreamLzw8000, true)->Name("ReaderFromFile/StreamLzw8000")->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
