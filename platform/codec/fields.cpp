// Field descriptions, directories as stored, and the EXIF bracket.

#include <algorithm>
#include <cstring>
#include <vector>

#include "adapter.h"
#include "osttiff/osttiff.h"

namespace {

uint16_t Get16(const unsigned char* b, bool swapped) {
    return swapped ? static_cast<uint16_t>(b[0] << 8 | b[1]) : static_cast<uint16_t>(b[1] << 8 | b[0]);
}

uint64_t GetN(const unsigned char* b, int n, bool swapped) {
    uint64_t v = 0;
    for (int i = 0; i < n; ++i) v |= uint64_t{b[swapped ? i : n - 1 - i]} << (8 * (n - 1 - i));
    return v;
}

// Reads n bytes at `offset` through the object's own client procedures.
bool ReadClient(TIFF* tif, uint64_t offset, void* buffer, tmsize_t n) {
    const thandle_t handle = TIFFClientdata(tif);
    if (TIFFGetSeekProc(tif)(handle, offset, SEEK_SET) != offset) return false;
    return TIFFGetReadProc(tif)(handle, buffer, n) == n;
}

// Finds `tag` among the entries of the directory at `offset`. The entry's
// type, count and value field are returned when found. -1 when the entries
// cannot be read.
struct StoredEntry {
    uint16_t type = 0;
    uint64_t count = 0;
    unsigned char value[8] = {0};
};

int FindStoredEntry(TIFF* tif, uint64_t offset, uint32_t tag, StoredEntry* found) {
    const bool big = TIFFIsBigTIFF(tif);
    const bool swapped = TIFFIsByteSwapped(tif) != 0;
    const int countSize = big ? 8 : 2, entrySize = big ? 20 : 12, fieldSize = big ? 8 : 4;
    unsigned char head[8];
    if (!ReadClient(tif, offset, head, countSize)) return -1;
    const uint64_t entries = GetN(head, countSize, swapped);
    if (entries > 0xFFFF) return -1;  // larger than libtiff reads itself
    std::vector<unsigned char> table(static_cast<size_t>(entries) * entrySize);
    if (!table.empty() && !ReadClient(tif, offset + countSize, table.data(), static_cast<tmsize_t>(table.size())))
        return -1;
    for (uint64_t i = 0; i < entries; ++i) {
        const unsigned char* e = table.data() + i * entrySize;
        if (Get16(e, swapped) != tag) continue;
        found->type = Get16(e + 2, swapped);
        found->count = GetN(e + 4, fieldSize, swapped);
        std::memcpy(found->value, e + 4 + fieldSize, static_cast<size_t>(fieldSize));
        return 1;
    }
    return 0;
}

}  // namespace

extern "C" {

int TIFFFieldInfoPivlo(TIFF* tif, uint32_t tag, TIFFFieldInfo* info) {
    const TIFFField* field = TIFFFindField(tif, tag, TIFF_ANY);
    if (!field) return 0;
    std::memset(info, 0, sizeof *info);
    info->field_tag = TIFFFieldTag(field);
    info->field_readcount = static_cast<short>(TIFFFieldReadCount(field));
    info->field_writecount = static_cast<short>(TIFFFieldWriteCount(field));
    info->field_type = TIFFFieldDataType(field);
    info->field_passcount = static_cast<unsigned char>(TIFFFieldPassCount(field));
    info->field_name = const_cast<char*>(TIFFFieldName(field));
    return 1;
}

int TIFFDirectoryHasTagPivlo(TIFF* tif, uint32_t tag) {
    StoredEntry entry;
    return FindStoredEntry(tif, TIFFCurrentDirOffset(tif), tag, &entry);
}

int TIFFGetStoredExtraSamplesPivlo(TIFF* tif, uint16_t* count, const uint16_t** values) {
    static const uint16_t kNone[1] = {0};
    const int stored = TIFFDirectoryHasTagPivlo(tif, TIFFTAG_EXTRASAMPLES);
    if (stored == 0) {
        *count = 0;
        *values = kNone;
        return 1;
    }
    uint16_t* libtiffValues = nullptr;
    if (!TIFFGetFieldDefaulted(tif, TIFFTAG_EXTRASAMPLES, count, &libtiffValues)) return 0;
    *values = libtiffValues ? libtiffValues : kNone;
    return 1;
}

int zanBeginTiffEXIFDir(TIFF* tif) {
    osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    if (!a) return 0;
    if (a->exifDepth++ == 0) a->exifBaseDirectory = TIFFCurrentDirectory(tif);
    return 1;
}

int zanEndTiffEXIFDir(TIFF* tif) {
    osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    if (!a || a->exifDepth == 0) return 0;
    --a->exifDepth;
    return 1;
}

int TIFFInEXIFDirPivlo(TIFF* tif) {
    osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    return a && a->exifDepth > 0;
}

tdir_t TIFFEXIFBaseDirectoryPivlo(TIFF* tif) {
    osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    return a ? a->exifBaseDirectory : 0;
}

}  // extern "C"

// ---- EXIF directories written, and writing helpers ----

#include <string>

extern "C" {

int zanCreateTiffEXIFDir(TIFF* tif) {
    if (!TIFFInEXIFDirPivlo(tif)) return 0;
    return TIFFCreateEXIFDirectory(tif) == 0;
}

int TIFFWriteEXIFDirectoryPivlo(TIFF* tif) {
    osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    uint64_t offset = 0;
    if (!a || !TIFFWriteCustomDirectory(tif, &offset)) return 0;
    a->lastExifOffset = offset;
    return 1;
}

uint64_t TIFFLastEXIFOffsetPivlo(TIFF* tif) {
    osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    return a ? a->lastExifOffset : 0;
}

int TIFFFieldIsSetPivlo(TIFF* tif, uint32_t tag) {
    if (!TIFFFindField(tif, tag, TIFF_ANY)) return 0;
    // Room for every shape TIFFGetField delivers: up to three pointers or a
    // count and a pointer, each slot wide enough for a double.
    alignas(8) unsigned char slots[4][16];
    return TIFFGetField(tif, tag, slots[0], slots[1], slots[2], slots[3]) != 0;
}

int TIFFSetAsciiFieldPivlo(TIFF* tif, uint32_t tag, const char* text) {
    const TIFFField* field = TIFFFindField(tif, tag, TIFF_ANY);
    if (!field || TIFFFieldDataType(field) != TIFF_ASCII || !text) return 0;
    const int count = TIFFFieldWriteCount(field);  // above 1: fixed, the zero included
    if (count > 1 && std::strlen(text) + 1 != static_cast<size_t>(count)) {
        std::string fitted(text);
        fitted.resize(static_cast<size_t>(count) - 1, ' ');
        return TIFFSetField(tif, tag, fitted.c_str());
    }
    return TIFFSetField(tif, tag, text);
}

const char* TIFFGetVersionLinePivlo(void) {
    static const std::string line = [] {
        const std::string full = TIFFGetVersion();
        return full.substr(0, full.find('\n'));
    }();
    return line.c_str();
}

}  // extern "C"
