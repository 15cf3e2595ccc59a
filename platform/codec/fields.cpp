// Field descriptions, directories as stored, the pages and EXIF directories
// written.

#include <algorithm>
#include <cstring>
#include <vector>

#include "adapter.h"
#include "osttiff/osttiff.h"

namespace {

// Numbers of the file's byte order.
uint64_t GetNumber(TIFF* tif, const unsigned char* b, int n) {
    uint64_t v = 0;
    for (int i = 0; i < n; ++i) {
        const unsigned char byte = TIFFIsBigEndian(tif) ? b[i] : b[n - 1 - i];
        v = v << 8 | byte;
    }
    return v;
}

void PutNumber(TIFF* tif, uint64_t v, unsigned char* b, int n) {
    for (int i = 0; i < n; ++i) {
        const auto byte = static_cast<unsigned char>(v >> (8 * i));
        b[TIFFIsBigEndian(tif) ? n - 1 - i : i] = byte;
    }
}

// Reads or writes n bytes at `offset` through the object's own client
// procedures.
bool ReadClient(TIFF* tif, uint64_t offset, void* buffer, tmsize_t n) {
    const thandle_t handle = TIFFClientdata(tif);
    if (TIFFGetSeekProc(tif)(handle, offset, SEEK_SET) != offset) return false;
    return TIFFGetReadProc(tif)(handle, buffer, n) == n;
}

bool WriteClient(TIFF* tif, uint64_t offset, void* buffer, tmsize_t n) {
    const thandle_t handle = TIFFClientdata(tif);
    if (TIFFGetSeekProc(tif)(handle, offset, SEEK_SET) != offset) return false;
    return TIFFGetWriteProc(tif)(handle, buffer, n) == n;
}

// The classic directory at `offset`: its entry count and the offset of its
// next-directory field.
bool ReadDirectoryHead(TIFF* tif, uint64_t offset, uint16_t* count, uint64_t* linkField) {
    unsigned char bytes[2];
    if (offset == 0 || !ReadClient(tif, offset, bytes, 2)) return false;
    *count = static_cast<uint16_t>(GetNumber(tif, bytes, 2));
    *linkField = offset + 2 + 12u * uint64_t{*count};
    return true;
}

// The value of a 4-byte offset field (the header's first-directory field, or
// a directory's next-directory field).
bool ReadLink(TIFF* tif, uint64_t field, uint64_t* value) {
    unsigned char bytes[4];
    if (!ReadClient(tif, field, bytes, 4)) return false;
    *value = GetNumber(tif, bytes, 4);
    return true;
}

// The offset of the field that links the directory written next into the
// chain: the last directory's next-directory field, or the header's. Walks
// the chain once, stopping at libtiff's own limit of directories.
bool ChainEndField(TIFF* tif, uint64_t* field) {
    constexpr uint32_t kMostDirectories = 1u << 20;
    *field = 4;
    uint64_t next = 0;
    if (!ReadLink(tif, 4, &next)) return false;
    for (uint32_t steps = 0; next != 0; ++steps) {
        uint16_t count = 0;
        if (steps == kMostDirectories || !ReadDirectoryHead(tif, next, &count, field) || !ReadLink(tif, *field, &next))
            return false;
    }
    return true;
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

int TIFFGetStoredExtraSamplesPivlo(TIFF* tif, uint16_t* count, const uint16_t** values) {
    static const uint16_t kNone[1] = {0};
    uint16_t* libtiffValues = nullptr;
    if (!TIFFGetFieldDefaulted(tif, TIFFTAG_EXTRASAMPLES, count, &libtiffValues)) return 0;
    *values = libtiffValues ? libtiffValues : kNone;
    // libtiff appends what it completed behind the values the directory
    // stores, so the stored ones are the first.
    const osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    if (a && a->extraCompleted && a->completedExtraDirectory == TIFFCurrentDirOffset(tif))
        *count = std::min(*count, a->storedExtraCount);
    if (*count == 0) *values = kNone;
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

int TIFFWritePageDirectoryPivlo(TIFF* tif) {
    osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    if (!a || TIFFIsBigTIFF(tif)) return TIFFWriteDirectory(tif);
    // The page is linked from the field found here: the directory written
    // last by this object (known), or the end of the chain (walked once).
    uint64_t linkField = 0;
    uint16_t count = 0;
    const bool found = a->lastPageOffset ? ReadDirectoryHead(tif, a->lastPageOffset, &count, &linkField)
                                         : ChainEndField(tif, &linkField);
    a->lastPageOffset = 0;
    if (!TIFFWriteDirectory(tif)) return 0;
    uint64_t page = 0;
    if (found && ReadLink(tif, linkField, &page)) a->lastPageOffset = page;
    return 1;
}

uint64_t TIFFLastPageOffsetPivlo(TIFF* tif) {
    osttiff::Adapter* a = osttiff::AdapterOfTiff(tif);
    return a ? a->lastPageOffset : 0;
}

int TIFFSetLastPageEXIFPivlo(TIFF* tif, uint64_t exifOffset) {
    const uint64_t page = TIFFLastPageOffsetPivlo(tif);
    uint16_t count = 0;
    uint64_t linkField = 0;
    if (page == 0 || exifOffset > 0xFFFFFFFFu || !ReadDirectoryHead(tif, page, &count, &linkField)) return 0;
    std::vector<unsigned char> entries(12u * count + 4u);
    if (!ReadClient(tif, page + 2, entries.data(), static_cast<tmsize_t>(entries.size()))) return 0;
    for (uint16_t i = 0; i < count; ++i) {
        unsigned char* entry = entries.data() + 12u * i;
        if (GetNumber(tif, entry, 2) != TIFFTAG_EXIFIFD) continue;
        if (exifOffset != 0) {
            PutNumber(tif, exifOffset, entry + 8, 4);
            return WriteClient(tif, page + 2 + 12u * i + 8, entry + 8, 4);
        }
        // The entry goes; the directory keeps its place (later links reach
        // it there) and ends 12 bytes earlier.
        std::memmove(entry, entry + 12, entries.size() - 12u * (i + 1u));
        entries.resize(entries.size() - 12);
        unsigned char head[2];
        PutNumber(tif, count - 1u, head, 2);
        return WriteClient(tif, page, head, 2) &&
               WriteClient(tif, page + 2, entries.data(), static_cast<tmsize_t>(entries.size()));
    }
    return 0;
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
