// The record that sits between libtiff and the 32-bit client procedures of
// a codec object opened by TIFFClientOpenPivlo (libtiff's thandle_t).
#pragma once

#include "osttiff/osttiff.h"

namespace osttiff {

struct Adapter {
    void* client;
    PivloReadWriteProc read;
    PivloReadWriteProc write;
    PivloSeekProc seek;
    PivloCloseProc close;
    PivloSizeProc size;
    PivloMapProc map;
    PivloUnmapProc unmap;
    PivloAllocProc alloc;
    PivloReallocProc realloc_;
    PivloFreeProc free_;
    void* context = nullptr;       // the job, set by the module after opening
    int ioFailed = 0;              // a client procedure failed (sticky)
    int exifDepth = 0;             // open EXIF brackets
    tdir_t exifBaseDirectory = 0;  // image directory the outer bracket began on
    uint64_t lastExifOffset = 0;   // EXIF directory written last
};

// The adapter of a codec object opened by TIFFClientOpenPivlo; null for any
// other codec object.
Adapter* AdapterOfTiff(TIFF* tif);

}  // namespace osttiff
