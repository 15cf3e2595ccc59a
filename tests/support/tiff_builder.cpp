#include "support/tiff_builder.h"

#include <algorithm>
#include <cstring>
#include <set>

namespace zantest {
namespace {

uint32_t ElementWidth(uint16_t type) {  // unit of byte swapping
    switch (type) {
    case 3: case 8: return 2;
    case 4: case 5: case 9: case 10: case 11: case 13: return 4;
    case 12: return 8;
    default: return 1;
    }
}

bool IsBig(const Bytes& tiff) { return tiff.size() >= 2 && tiff[0] == 'M'; }

Bytes ToFileOrder(const Bytes& host, uint16_t type, bool big) {
    Bytes out = host;
    const uint32_t w = ElementWidth(type);
    if (big && w > 1)
        for (size_t i = 0; i + w <= out.size(); i += w) std::reverse(out.begin() + i, out.begin() + i + w);
    return out;
}

template <typename T>
Bytes HostBytes(const std::vector<T>& values) {
    Bytes b(values.size() * sizeof(T));
    std::memcpy(b.data(), values.data(), b.size());
    return b;
}

class Writer {
public:
    explicit Writer(bool big) : big_(big) {}
    Bytes bytes;
    void Align() {
        if (bytes.size() & 1) bytes.push_back(0);
    }
    void Put16At(size_t at, uint16_t v) {
        if (big_) { bytes[at] = v >> 8; bytes[at + 1] = v & 0xFF; }
        else { bytes[at] = v & 0xFF; bytes[at + 1] = v >> 8; }
    }
    void Put32At(size_t at, uint32_t v) {
        for (int i = 0; i < 4; ++i)
            bytes[at + i] = static_cast<uint8_t>(big_ ? v >> (24 - 8 * i) : v >> (8 * i));
    }
    size_t Append(const Bytes& b) {
        Align();
        const size_t at = bytes.size();
        bytes.insert(bytes.end(), b.begin(), b.end());
        return at;
    }
    bool big_;
};

// Writes one directory with its values; returns its offset and the offset of
// its next-IFD field.
uint32_t WriteDirectory(Writer& w, std::vector<RawEntry> entries, uint32_t* nextField) {
    std::sort(entries.begin(), entries.end(),
              [](const RawEntry& a, const RawEntry& b) { return a.tag < b.tag; });
    std::vector<uint32_t> valueAt(entries.size(), 0);
    for (size_t i = 0; i < entries.size(); ++i) {
        const Bytes v = ToFileOrder(entries[i].value, entries[i].type, w.big_);
        if (v.size() > 4) valueAt[i] = static_cast<uint32_t>(w.Append(v));
    }
    w.Align();
    const size_t ifd = w.bytes.size();
    w.bytes.resize(ifd + 2 + 12 * entries.size() + 4, 0);
    w.Put16At(ifd, static_cast<uint16_t>(entries.size()));
    for (size_t i = 0; i < entries.size(); ++i) {
        const size_t at = ifd + 2 + 12 * i;
        w.Put16At(at, entries[i].tag);
        w.Put16At(at + 2, entries[i].type);
        w.Put32At(at + 4, entries[i].count);
        const Bytes v = ToFileOrder(entries[i].value, entries[i].type, w.big_);
        if (v.size() > 4) w.Put32At(at + 8, valueAt[i]);
        else std::copy(v.begin(), v.end(), w.bytes.begin() + at + 8);
    }
    *nextField = static_cast<uint32_t>(ifd + 2 + 12 * entries.size());
    return static_cast<uint32_t>(ifd);
}

}  // namespace

RawEntry ShortEntry(uint16_t tag, std::vector<uint16_t> v) {
    return {tag, 3, static_cast<uint32_t>(v.size()), HostBytes(v)};
}
RawEntry LongEntry(uint16_t tag, std::vector<uint32_t> v) {
    return {tag, 4, static_cast<uint32_t>(v.size()), HostBytes(v)};
}
RawEntry AsciiEntry(uint16_t tag, const std::string& text) {
    Bytes b(text.begin(), text.end());
    b.push_back(0);
    return {tag, 2, static_cast<uint32_t>(b.size()), b};
}
RawEntry RationalEntry(uint16_t tag, uint32_t n, uint32_t d) {
    return {tag, 5, 1, HostBytes(std::vector<uint32_t>{n, d})};
}
RawEntry DoubleEntry(uint16_t tag, double value) {
    return {tag, 12, 1, HostBytes(std::vector<double>{value})};
}
RawEntry TypedEntry(uint16_t tag, uint16_t type, uint32_t count, Bytes value) {
    return {tag, type, count, std::move(value)};
}

BuiltPage GreyPage(uint32_t width, uint32_t height, uint32_t rowsPerStrip, uint8_t seed) {
    BuiltPage page;
    page.entries = {LongEntry(256, {width}), LongEntry(257, {height}), ShortEntry(258, {8}),
                    ShortEntry(259, {1}), ShortEntry(262, {1}), ShortEntry(277, {1}),
                    LongEntry(278, {rowsPerStrip})};
    for (uint32_t y0 = 0; y0 < height; y0 += rowsPerStrip) {
        Bytes strip;
        for (uint32_t y = y0; y < std::min(height, y0 + rowsPerStrip); ++y)
            for (uint32_t x = 0; x < width; ++x) strip.push_back(static_cast<uint8_t>(x + 3 * y + seed));
        page.strips.push_back(strip);
    }
    return page;
}

Bytes BuildTiff(const std::vector<BuiltPage>& pages, const BuildOptions& options) {
    Writer w(options.bigEndian);
    w.bytes = {static_cast<uint8_t>(options.bigEndian ? 'M' : 'I'),
               static_cast<uint8_t>(options.bigEndian ? 'M' : 'I'), 0, 0, 0, 0, 0, 0};
    w.Put16At(2, 42);
    w.bytes.resize(8 + options.leadingPadding, 0);
    uint32_t link = 4;
    for (const BuiltPage& page : pages) {
        std::vector<RawEntry> entries = page.entries;
        std::vector<uint32_t> offsets, counts;
        for (const Bytes& strip : page.strips) {
            offsets.push_back(static_cast<uint32_t>(w.Append(strip)));
            counts.push_back(static_cast<uint32_t>(strip.size()));
        }
        if (page.stripTags) {
            auto numbers = [](uint16_t tag, uint16_t type, const std::vector<uint32_t>& v) {
                if (type == 4) return LongEntry(tag, v);
                std::vector<uint16_t> s(v.begin(), v.end());
                return ShortEntry(tag, s);
            };
            entries.push_back(numbers(273, page.offsetsType, offsets));
            entries.push_back(numbers(279, page.countsType, counts));
        }
        if (!page.exif.empty()) {
            uint32_t exifNext = 0;
            const uint32_t exif = WriteDirectory(w, page.exif[0].entries, &exifNext);
            entries.push_back(LongEntry(34665, {exif}));
        }
        uint32_t nextField = 0;
        const uint32_t ifd = WriteDirectory(w, entries, &nextField);
        w.Put32At(link, ifd);
        link = nextField;
    }
    return w.bytes;
}

uint16_t Get16(const Bytes& t, size_t at) {
    return IsBig(t) ? static_cast<uint16_t>(t[at] << 8 | t[at + 1])
                    : static_cast<uint16_t>(t[at + 1] << 8 | t[at]);
}

uint32_t Get32(const Bytes& t, size_t at) {
    uint32_t v = 0;
    for (int i = 0; i < 4; ++i) v |= uint32_t{t[at + i]} << (IsBig(t) ? 24 - 8 * i : 8 * i);
    return v;
}

void Put32(Bytes& t, size_t at, uint32_t value) {
    for (int i = 0; i < 4; ++i)
        t[at + i] = static_cast<uint8_t>(IsBig(t) ? value >> (24 - 8 * i) : value >> (8 * i));
}

std::vector<uint32_t> DirectoryOffsets(const Bytes& tiff) {
    std::vector<uint32_t> dirs;
    std::set<uint32_t> seen;
    for (uint32_t ifd = Get32(tiff, 4); ifd != 0 && dirs.size() < 100 && seen.insert(ifd).second;) {
        if (ifd + 2 > tiff.size()) break;
        dirs.push_back(ifd);
        const size_t next = ifd + 2 + 12u * Get16(tiff, ifd);
        if (next + 4 > tiff.size()) break;
        ifd = Get32(tiff, next);
    }
    return dirs;
}

bool FindEntry(const Bytes& tiff, uint32_t ifd, uint16_t tag, FoundEntry* found) {
    const uint16_t n = Get16(tiff, ifd);
    for (uint16_t i = 0; i < n; ++i) {
        const size_t at = ifd + 2 + 12u * i;
        if (Get16(tiff, at) == tag) {
            *found = {Get16(tiff, at + 2), Get32(tiff, at + 4), at + 8};
            return true;
        }
    }
    return false;
}

}  // namespace zantest
