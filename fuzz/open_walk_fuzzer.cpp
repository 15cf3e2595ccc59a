// Opens the input through OpenTIFFForReading on the source kind chosen by
// the last input byte and walks every directory, reading the tags a reader
// looks at first. Must never crash, hang or leak.

#include <cstddef>
#include <cstdint>

#include "frame/tiff_open.h"
#include "fuzz_support.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 2) return 0;
    const uint8_t selector = data[size - 1];
    zanfuzz::InputStream input{data, size - 1, 0, static_cast<uint32_t>(selector >> 4)};
    ConversionContext ctx;
    zanfuzz::InitQuietJob(&ctx);
    zanfuzz::UseInputAsSource(&ctx, &input, selector);
    if (zan::OpenTIFFForReading(&ctx)) {
        TIFF* tif = ctx.tiff;
        int pages = 0;
        do {
            uint32_t width = 0, height = 0;
            uint16_t bits = 0, photometric = 0;
            TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &width);
            TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &height);
            TIFFGetFieldDefaulted(tif, TIFFTAG_BITSPERSAMPLE, &bits);
            TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric);
            uint32_t offset = 0;
            TIFFGetStrileOffset32(tif, 0, &offset);
        } while (++pages < 64 && TIFFReadDirectory(tif));
    }
    zanDestroyTIFF(&ctx);
    pivloReleaseContext(&ctx);
    return 0;
}
