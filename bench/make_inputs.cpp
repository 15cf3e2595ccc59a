// Writes the benchmark inputs with libtiff (any other call is refused):
//   make_bench_inputs multipage OUT.tif   200 pages of 512x512 8-bit grey, LZW
//   make_bench_inputs large OUT.tif       one 8192x8192 8-bit RGB page, uncompressed (~200 MB)
//   make_bench_inputs sample OUT.tif      the demo's 3-page file: RGB (LZW), palette, 16-bit grey
//   make_bench_inputs rgb W H OUT.tif     one W x H 8-bit RGB page, uncompressed
//   make_bench_inputs jpeg OUT.jpg        an 8000x6000 4:2:0 JPEG of about 30 MB (libjpeg)

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include <tiffio.h>

#include "bench_jpeg.h"

namespace {

bool WritePage(TIFF* tif, uint32_t width, uint32_t height, uint16_t samples, uint16_t compression,
               uint32_t seed) {
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, width);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, height);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, samples);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, samples == 3 ? PHOTOMETRIC_RGB : PHOTOMETRIC_MINISBLACK);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, compression);
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, TIFFDefaultStripSize(tif, 0));
    TIFFSetField(tif, TIFFTAG_IMAGEDESCRIPTION, "benchmark page");
    std::vector<uint8_t> row(static_cast<size_t>(width) * samples);
    for (uint32_t y = 0; y < height; ++y) {
        // Smooth gradients with some texture: compresses like a photograph.
        for (size_t x = 0; x < row.size(); ++x)
            row[x] = static_cast<uint8_t>((x / samples + y) / 3 + ((x * 7 + y * 13 + seed) % 11));
        if (TIFFWriteScanline(tif, row.data(), y, 0) < 0) return false;
    }
    return TIFFWriteDirectory(tif) != 0;
}

// A palette page: a colour wheel of 256 entries, indices in bands.
bool WritePalettePage(TIFF* tif, uint32_t width, uint32_t height) {
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, width);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, height);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 1);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_PALETTE);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_PACKBITS);
    TIFFSetField(tif, TIFFTAG_IMAGEDESCRIPTION, "palette page");
    std::vector<uint16_t> map(768);
    for (int i = 0; i < 256; ++i) {
        map[i] = static_cast<uint16_t>((i * 7 % 256) * 257);
        map[256 + i] = static_cast<uint16_t>((255 - i) * 257);
        map[512 + i] = static_cast<uint16_t>((i * 3 % 256) * 257);
    }
    TIFFSetField(tif, TIFFTAG_COLORMAP, map.data(), map.data() + 256, map.data() + 512);
    std::vector<uint8_t> row(width);
    for (uint32_t y = 0; y < height; ++y) {
        for (uint32_t x = 0; x < width; ++x) row[x] = static_cast<uint8_t>((x / 10 + y / 10 * 16) & 0xFF);
        if (TIFFWriteScanline(tif, row.data(), y, 0) < 0) return false;
    }
    return TIFFWriteDirectory(tif) != 0;
}

// A 16-bit grey page: a smooth ramp.
bool WriteGrey16Page(TIFF* tif, uint32_t width, uint32_t height) {
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, width);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, height);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 16);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 1);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_ADOBE_DEFLATE);
    TIFFSetField(tif, TIFFTAG_IMAGEDESCRIPTION, "16-bit grey page");
    std::vector<uint16_t> row(width);
    for (uint32_t y = 0; y < height; ++y) {
        for (uint32_t x = 0; x < width; ++x) row[x] = static_cast<uint16_t>(x * 65535 / width);
        if (TIFFWriteScanline(tif, row.data(), y, 0) < 0) return false;
    }
    return TIFFWriteDirectory(tif) != 0;
}

}  // namespace

int main(int argc, char** argv) {
    const std::string kind = argc > 1 ? argv[1] : "";
    const bool known = ((kind == "multipage" || kind == "large" || kind == "sample" || kind == "jpeg") && argc == 3) ||
                       (kind == "rgb" && argc == 5);
    // Anything else is refused before a file is created: a mistyped call must
    // not leave a 200 MB page under an unexpected name.
    if (!known) {
        std::fprintf(stderr, "usage: make_bench_inputs multipage|large|sample OUT.tif | rgb W H OUT.tif | jpeg OUT.jpg\n");
        return 2;
    }
    if (kind == "jpeg") return zanbench::WriteBenchJpeg(argv[2]) ? 0 : 1;
    TIFF* tif = TIFFOpen(argv[argc - 1], "w");
    if (!tif) return 1;
    bool ok = true;
    if (kind == "multipage") {
        for (uint32_t page = 0; page < 200 && ok; ++page) ok = WritePage(tif, 512, 512, 1, COMPRESSION_LZW, page);
    } else if (kind == "sample") {
        ok = WritePage(tif, 160, 120, 3, COMPRESSION_LZW, 0) && WritePalettePage(tif, 160, 120) &&
             WriteGrey16Page(tif, 160, 120);
    } else if (kind == "rgb") {
        ok = WritePage(tif, static_cast<uint32_t>(std::atoi(argv[2])), static_cast<uint32_t>(std::atoi(argv[3])), 3,
                       COMPRESSION_NONE, 0);
    } else {
        ok = WritePage(tif, 8192, 8192, 3, COMPRESSION_NONE, 0);
    }
    TIFFClose(tif);
    return ok ? 0 : 1;
}
