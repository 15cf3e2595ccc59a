// Builds TIFF files byte by byte, for the cases a TIFF writer would not
// produce: SHORT strip offsets, odd-sized values, DOUBLE and IFD fields,
// broken or looping chains, both byte orders.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "support/tiff_fixtures.h"

namespace zantest {

struct RawEntry {
    uint16_t tag;
    uint16_t type;
    uint32_t count;
    Bytes value;  // in host order per element; the builder writes it in the file's order
};

RawEntry ShortEntry(uint16_t tag, std::vector<uint16_t> values);
RawEntry LongEntry(uint16_t tag, std::vector<uint32_t> values);
RawEntry AsciiEntry(uint16_t tag, const std::string& text);  // NUL added
RawEntry RationalEntry(uint16_t tag, uint32_t numerator, uint32_t denominator);
RawEntry DoubleEntry(uint16_t tag, double value);
RawEntry TypedEntry(uint16_t tag, uint16_t type, uint32_t count, Bytes value);

struct BuiltPage {
    std::vector<RawEntry> entries;   // without the strip tags
    std::vector<Bytes> strips;       // image data, one blob a strip
    uint16_t offsetsType = 4;        // SHORT (3) or LONG (4)
    uint16_t countsType = 4;
    bool stripTags = true;           // add StripOffsets/StripByteCounts
    std::vector<BuiltPage> exif;     // at most one: an EXIF directory (tag 34665)
};

// A grey 8-bit page of width x height, `rowsPerStrip` rows a strip,
// pixels (x + 3y + seed) & 0xFF.
BuiltPage GreyPage(uint32_t width, uint32_t height, uint32_t rowsPerStrip, uint8_t seed = 0);

struct BuildOptions {
    bool bigEndian = false;
    uint32_t leadingPadding = 0;  // bytes between the header and the first page's data
};

// Lays the pages out after the header (data, then values, then the
// directory of each page) and links them in order.
Bytes BuildTiff(const std::vector<BuiltPage>& pages, const BuildOptions& options = {});

// Offsets of the directories of a built or written file, in chain order
// (stops after 100 or at a loop).
std::vector<uint32_t> DirectoryOffsets(const Bytes& tiff);

// Reads and writes numbers of a file in its own byte order.
uint16_t Get16(const Bytes& tiff, size_t at);
uint32_t Get32(const Bytes& tiff, size_t at);
void Put32(Bytes& tiff, size_t at, uint32_t value);

// Entry `tag` of the directory at `ifd`: its type, count and value field
// offset; false when absent.
struct FoundEntry {
    uint16_t type;
    uint32_t count;
    size_t valueField;
};
bool FindEntry(const Bytes& tiff, uint32_t ifd, uint16_t tag, FoundEntry* found);

}  // namespace zantest
