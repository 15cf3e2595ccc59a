// Codec objects over 32-bit client procedures.
//
// libtiff 4.5 talks to its client in 64-bit offsets and signed 64-bit sizes.
// The module's procedures are 32-bit, so a small adapter record sits between
// them: it is libtiff's thandle_t, converts every size and position, splits
// oversized transfers, and turns anything that cannot be expressed in 32 bits
// into an I/O failure instead of letting it wrap.

#include "adapter.h"
#include "osttiff/osttiff.h"

#include <cstdlib>
#include <new>
#include <cstring>
#include <limits>

namespace {

using osttiff::Adapter;
using osttiff::AdapterOfTiff;



// Largest single transfer handed to a 32-bit procedure.
constexpr tmsize_t kMaxTransfer = 0x40000000;

Adapter* AdapterOf(thandle_t handle) { return static_cast<Adapter*>(handle); }

void* AllocateWith(PivloAllocProc alloc, uint32_t n) {
    return alloc ? alloc(n) : std::malloc(n);
}

void ReleaseWith(PivloFreeProc release, void* block) {
    if (release) release(block);
    else std::free(block);
}

// Moves n bytes through a 32-bit procedure in pieces of at most kMaxTransfer.
// A short piece ends the transfer; a failing first piece reports -1.
tmsize_t Transfer(Adapter* a, PivloReadWriteProc proc, void* buffer, tmsize_t n) {
    if (!proc || n < 0) {
        a->ioFailed = 1;
        return -1;
    }
    tmsize_t done = 0;
    while (done < n) {
        const int32_t want = static_cast<int32_t>(n - done > kMaxTransfer ? kMaxTransfer : n - done);
        const int32_t got = proc(a->client, static_cast<char*>(buffer) + done, want);
        if (got < 0 || got > want) {
            a->ioFailed = 1;
            return done ? done : -1;
        }
        done += got;
        if (got < want) break;
    }
    return done;
}

// A failed read delivers nothing: parts of libtiff treat a negative count as
// impossible (an old-style JPEG reader asserts on it), and every caller
// takes fewer bytes than asked for as a failure.
tmsize_t ReadThunk(thandle_t h, void* buffer, tmsize_t n) {
    Adapter* a = AdapterOf(h);
    const tmsize_t got = Transfer(a, a->read, buffer, n);
    return got < 0 ? 0 : got;
}

tmsize_t WriteThunk(thandle_t h, void* buffer, tmsize_t n) {
    Adapter* a = AdapterOf(h);
    const tmsize_t written = Transfer(a, a->write, buffer, n);
    if (written != n) a->ioFailed = 1;
    return written;
}

// Converts libtiff's 64-bit seek argument to the 32-bit one. Absolute
// positions must fit in 32 bits; relative moves may be negative (libtiff
// passes them as wrapped unsigned values) and must fit in a signed 32-bit.
bool ToSeekOffset32(toff_t off, int whence, uint32_t* out) {
    if (whence == SEEK_SET) {
        if (off > std::numeric_limits<uint32_t>::max()) return false;
        *out = static_cast<uint32_t>(off);
        return true;
    }
    const auto relative = static_cast<int64_t>(off);
    if (relative < std::numeric_limits<int32_t>::min() ||
        relative > std::numeric_limits<uint32_t>::max())
        return false;
    *out = static_cast<uint32_t>(relative);
    return true;
}

toff_t SeekThunk(thandle_t h, toff_t off, int whence) {
    Adapter* a = AdapterOf(h);
    uint32_t offset32 = 0;
    if (!a->seek || !ToSeekOffset32(off, whence, &offset32)) {
        a->ioFailed = 1;
        return static_cast<toff_t>(-1);
    }
    const uint32_t position = a->seek(a->client, offset32, whence);
    if (position == PIVLO_SEEK_FAILED) {
        a->ioFailed = 1;
        return static_cast<toff_t>(-1);
    }
    return position;
}

int CloseThunk(thandle_t h) {
    Adapter* a = AdapterOf(h);
    const int result = a->close ? a->close(a->client) : 0;
    ReleaseWith(a->free_, a);
    return result;
}

toff_t SizeThunk(thandle_t h) {
    Adapter* a = AdapterOf(h);
    return a->size ? a->size(a->client) : 0;
}

int MapThunk(thandle_t h, void** base, toff_t* size) {
    Adapter* a = AdapterOf(h);
    uint32_t size32 = 0;
    if (!a->map || !a->map(a->client, base, &size32)) return 0;
    *size = size32;
    return 1;
}

void UnmapThunk(thandle_t h, void* base, toff_t size) {
    Adapter* a = AdapterOf(h);
    if (a->unmap) a->unmap(a->client, base, static_cast<uint32_t>(size));
}

// Watches the object's warnings for the one libtiff gives when it completes
// a directory's ExtraSamples, and notes what the directory itself stores,
// so that the stored count is known without reading the directory again
// (a stream source cannot go back to it). The warning still reaches the
// process-wide handlers.
int WarningWatch(TIFF* tif, void* user, const char* module, const char* format, va_list) {
    static const char kCompleted[] = "Sum of Photometric type-related color channels";
    auto* a = static_cast<Adapter*>(user);
    if (tif && a && format && module && std::strcmp(module, "TIFFReadDirectory") == 0 &&
        std::strncmp(format, kCompleted, sizeof kCompleted - 1) == 0) {
        uint16_t count = 0;
        uint16_t* values = nullptr;
        if (!TIFFGetField(tif, TIFFTAG_EXTRASAMPLES, &count, &values)) count = 0;
        a->completedExtraDirectory = TIFFCurrentDirOffset(tif);
        a->storedExtraCount = count;
        a->extraCompleted = true;
    }
    return 0;
}


}  // namespace

namespace osttiff {

Adapter* AdapterOfTiff(TIFF* tif) {
    if (!tif || TIFFGetReadProc(tif) != ReadThunk) return nullptr;
    return static_cast<Adapter*>(TIFFClientdata(tif));
}

}  // namespace osttiff

extern "C" {

TIFF* TIFFClientOpenPivloExt(const char* name, const char* mode, void* clientData,
                             PivloReadWriteProc readProc, PivloReadWriteProc writeProc,
                             PivloSeekProc seekProc, PivloCloseProc closeProc,
                             PivloSizeProc sizeProc, PivloMapProc mapProc,
                             PivloUnmapProc unmapProc, PivloAllocProc allocProc,
                             PivloReallocProc reallocProc, PivloFreeProc freeProc,
                             TIFFOpenOptions* options) {
    void* block = AllocateWith(allocProc, sizeof(Adapter));
    if (!block) {
        TIFFErrorExt(nullptr, "TIFFClientOpenPivlo", "Out of memory for the client adapter");
        return nullptr;
    }
    auto* a = new (block) Adapter{clientData, readProc, writeProc, seekProc, closeProc, sizeProc,
                                  mapProc, unmapProc, allocProc, reallocProc, freeProc};
    // Without options of the caller's, the object's warnings are watched
    // (see WarningWatch).
    TIFFOpenOptions* own = options ? nullptr : TIFFOpenOptionsAlloc();
    if (own) TIFFOpenOptionsSetWarningHandlerExtR(own, WarningWatch, a);
    TIFF* tif = TIFFClientOpenExt(name ? name : "", mode, a, ReadThunk, WriteThunk, SeekThunk,
                                  CloseThunk, SizeThunk, MapThunk, UnmapThunk, options ? options : own);
    if (own) TIFFOpenOptionsFree(own);
    // libtiff does not call the close procedure when the open fails.
    if (!tif) ReleaseWith(freeProc, a);
    return tif;
}

TIFF* TIFFClientOpenPivlo(const char* name, const char* mode, void* clientData,
                          PivloReadWriteProc readProc, PivloReadWriteProc writeProc,
                          PivloSeekProc seekProc, PivloCloseProc closeProc,
                          PivloSizeProc sizeProc, PivloMapProc mapProc, PivloUnmapProc unmapProc,
                          PivloAllocProc allocProc, PivloReallocProc reallocProc,
                          PivloFreeProc freeProc) {
    return TIFFClientOpenPivloExt(name, mode, clientData, readProc, writeProc, seekProc,
                                  closeProc, sizeProc, mapProc, unmapProc, allocProc,
                                  reallocProc, freeProc, nullptr);
}

void* TIFFClientdataPivlo(TIFF* tif) {
    Adapter* a = AdapterOfTiff(tif);
    return a ? a->client : nullptr;
}

void TIFFSetContextPivlo(TIFF* tif, void* context) {
    if (Adapter* a = AdapterOfTiff(tif)) a->context = context;
}

void* TIFFGetContextPivlo(TIFF* tif) {
    Adapter* a = AdapterOfTiff(tif);
    return a ? a->context : nullptr;
}

int TIFFIOFailedPivlo(TIFF* tif) {
    Adapter* a = AdapterOfTiff(tif);
    return a ? a->ioFailed : 0;
}

uint64_t TIFFClientSizePivlo(TIFF* tif) {
    Adapter* a = AdapterOfTiff(tif);
    return a && a->size ? a->size(a->client) : 0;
}

void TIFFClearIOFailedPivlo(TIFF* tif) {
    if (Adapter* a = AdapterOfTiff(tif)) a->ioFailed = 0;
}

int TIFFGetStrileOffset32(TIFF* tif, uint32_t strile, uint32_t* offset) {
    int err = 0;
    const uint64_t value = TIFFGetStrileOffsetWithErr(tif, strile, &err);
    if (err || value > std::numeric_limits<uint32_t>::max()) return 0;
    *offset = static_cast<uint32_t>(value);
    return 1;
}

int TIFFGetStrileByteCount32(TIFF* tif, uint32_t strile, uint32_t* byteCount) {
    int err = 0;
    const uint64_t value = TIFFGetStrileByteCountWithErr(tif, strile, &err);
    if (err || value > std::numeric_limits<uint32_t>::max()) return 0;
    *byteCount = static_cast<uint32_t>(value);
    return 1;
}

void* PivloMalloc(TIFF* tif, uint32_t byteCount) {
    Adapter* a = AdapterOfTiff(tif);
    return AllocateWith(a ? a->alloc : nullptr, byteCount);
}

void PivloFree(TIFF* tif, void* block) {
    if (!block) return;
    Adapter* a = AdapterOfTiff(tif);
    ReleaseWith(a ? a->free_ : nullptr, block);
}

}  // extern "C"
