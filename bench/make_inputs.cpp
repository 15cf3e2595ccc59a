// Writes the benchmark inputs with libtiff:
//   make_inputs multipage OUT.tif   200 pages of 512x512 8-bit grey, LZW
//   make_inputs large OUT.tif       one 8192x8192 8-bit RGB page, uncompressed (~200 MB)

#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include <tiffio.h>

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

}  // namespace

int main(int argc, char** argv) {
    if (argc != 3) {
        std::fprintf(stderr, "usage: make_inputs multipage|large OUT.tif\n");
        return 2;
    }
    const std::string kind = argv[1];
    TIFF* tif = TIFFOpen(argv[2], "w");
    if (!tif) return 1;
    bool ok = true;
    if (kind == "multipage") {
        for (uint32_t page = 0; page < 200 && ok; ++page) ok = WritePage(tif, 512, 512, 1, COMPRESSION_LZW, page);
    } else {
        ok = WritePage(tif, 8192, 8192, 3, COMPRESSION_NONE, 0);
    }
    TIFFClose(tif);
    return ok ? 0 : 1;
}
