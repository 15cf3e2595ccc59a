// zanJPEGToTIFF against the alternatives on a JPEG of about 30 MB in the
// same run: a plain copy of the same bytes from file to file (what cp does
// when it cannot copy in the kernel), and what a host does without the call,
// decoding the JPEG and encoding it again as a JPEG page through libtiff.

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include <jpeglib.h>
#include <tiffio.h>

#include "bench_jpeg.h"
#include "bench_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

const std::string kOutput = "/tmp/zantiff-bench-wrap-out.tif";

// The JPEG, written once per run.
const std::string& InputJpeg() {
    static const std::string path = [] {
        const std::string p = "/tmp/zantiff-bench-wrap.jpg";
        if (!zanbench::WriteBenchJpeg(p.c_str())) std::abort();
        return p;
    }();
    return path;
}

// File to file, as the tool's wrap command does it.
void ModuleWrap(benchmark::State& state) {
    const std::string& path = InputJpeg();
    for (auto _ : state) {
        FILE* in = std::fopen(path.c_str(), "rb");
        FILE* out = std::fopen(kOutput.c_str(), "w+b");
        ConversionContext ctx;
        zanbench::InitQuietJob(&ctx);
        ctx.sourceKind = ZAN_SOURCE_FILE;
        ctx.sourceFp = in;
        ctx.destKind = ZAN_DEST_FILE;
        ctx.destFp = out;
        ctx.destFileFlags = 1;  // the stream is ready: no reopening
        uint32_t direct = 1;
        if (!zanJPEGToTIFF(&ctx, &direct) || direct != 1) state.SkipWithError("wrap failed");
        zanDestroyTIFF(&ctx);
        pivloReleaseContext(&ctx);
        std::fclose(out);
        std::fclose(in);
    }
}

// The same bytes copied from file to file in 128 KiB pieces.
void CopyBytes(benchmark::State& state) {
    const std::string& path = InputJpeg();
    std::vector<char> buffer(128 << 10);
    for (auto _ : state) {
        FILE* in = std::fopen(path.c_str(), "rb");
        FILE* out = std::fopen(kOutput.c_str(), "wb");
        for (size_t n; (n = std::fread(buffer.data(), 1, buffer.size(), in)) > 0;)
            if (std::fwrite(buffer.data(), 1, n, out) != n) state.SkipWithError("copy failed");
        std::fclose(out);
        std::fclose(in);
    }
}

// Decoded with libjpeg and written as a JPEG page (4:2:0, quality 90) by
// libtiff, row by row.
void DecodeAndEncode(benchmark::State& state) {
    const std::string& path = InputJpeg();
    for (auto _ : state) {
        FILE* in = std::fopen(path.c_str(), "rb");
        jpeg_decompress_struct d{};
        jpeg_error_mgr errors{};
        d.err = jpeg_std_error(&errors);
        jpeg_create_decompress(&d);
        jpeg_stdio_src(&d, in);
        jpeg_read_header(&d, TRUE);
        d.out_color_space = JCS_RGB;
        jpeg_start_decompress(&d);
        TIFF* tif = TIFFOpen(kOutput.c_str(), "w");
        TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, d.output_width);
        TIFFSetField(tif, TIFFTAG_IMAGELENGTH, d.output_height);
        TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
        TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 3);
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_JPEG);
        TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_YCBCR);
        TIFFSetField(tif, TIFFTAG_YCBCRSUBSAMPLING, 2, 2);
        TIFFSetField(tif, TIFFTAG_JPEGQUALITY, 90);
        TIFFSetField(tif, TIFFTAG_JPEGCOLORMODE, JPEGCOLORMODE_RGB);
        TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, 64);
        std::vector<uint8_t> row(static_cast<size_t>(d.output_width) * 3);
        while (d.output_scanline < d.output_height) {
            const uint32_t y = d.output_scanline;
            JSAMPROW pointer = row.data();
            jpeg_read_scanlines(&d, &pointer, 1);
            if (TIFFWriteScanline(tif, row.data(), y, 0) < 0) state.SkipWithError("encode failed");
        }
        TIFFClose(tif);
        jpeg_finish_decompress(&d);
        jpeg_destroy_decompress(&d);
        std::fclose(in);
    }
}

BENCHMARK(ModuleWrap)->Name("Module/WrapJpeg30MB")->Unit(benchmark::kMillisecond);
BENCHMARK(CopyBytes)->Name("Copy/WrapJpeg30MB")->Unit(benchmark::kMillisecond);
BENCHMARK(DecodeAndEncode)->Name("Recode/WrapJpeg30MB")->Unit(benchmark::kMillisecond)->Iterations(2);

}  // namespace

BENCHMARK_MAIN();
