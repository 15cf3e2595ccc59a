// Image reading: libtiff's RGBA reader with what libtiff 4.5 gets wrong
// worked around.

#include "osttiff/osttiff.h"

extern "C" {

// libtiff 4.5 checks the first uncompressed tile of every RGBA read against
// the size of its own read buffer, which it rounds up to a multiple of 1 KiB
// when the source is not mapped into memory: every such read of tiles of
// other sizes fails ("Invalid tile byte count"). A buffer of exactly one
// tile, lent to libtiff for the read, passes the check; libtiff is given a
// buffer of its own again before this one goes.
int TIFFRGBAImageGetPivlo(TIFFRGBAImage* image, uint32_t* raster, uint32_t width, uint32_t height) {
    TIFF* tif = image->tif;
    uint16_t compression = COMPRESSION_NONE;
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    const tmsize_t tile = TIFFIsTiled(tif) && compression == COMPRESSION_NONE ? TIFFTileSize(tif) : 0;
    void* exact = tile > 0 && tile <= 0x7FFFFFFF ? PivloMalloc(tif, static_cast<uint32_t>(tile)) : nullptr;
    if (exact) TIFFReadBufferSetup(tif, exact, tile);
    const int result = TIFFRGBAImageGet(image, raster, width, height);
    if (exact) {
        TIFFReadBufferSetup(tif, nullptr, tile);
        PivloFree(tif, exact);
    }
    return result;
}

}  // extern "C"
