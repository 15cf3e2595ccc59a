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
    uint64_t lastPageOffset = 0;   // page directory written last by TIFFWritePageDirectoryPivlo
    // ExtraSamples that libtiff completed while reading a directory (it
    // warns, then counts surplus samples as extra ones): the directory and
    // the count it stores itself.
    uint64_t completedExtraDirectory = 0;
    uint16_t storedExtraCount = 0;
    bool extraCompleted = false;
    int sixteenBitOutput = 0;      // RGBA reads give 16-bit samples (TIFFSet16BitOutput)
};

// The adapter of a codec object opened by TIFFClientOpenPivlo; null for any
// other codec object.
Adapter* AdapterOfTiff(TIFF* tif);

}  // namespace osttiff
