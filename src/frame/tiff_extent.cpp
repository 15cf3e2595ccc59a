#include "frame/tiff_extent.h"

#include <algorithm>

#include "frame/tiff_structure.h"

namespace zan {
namespace {

// Directories a walk visits at most, sub-directories included: far beyond
// any real file, and a bound on the work a hostile one can cause.
constexpr uint32_t kMostDirectories = 1u << 16;
constexpr int kMostDepth = 4;

class ExtentWalk {
public:
    ExtentWalk(const uint8_t* data, uint32_t size, bool big) : data_(data), size_(size), big_(big) {}

    uint64_t end() const { return end_; }

    uint32_t Get16(uint64_t at) const {
        return big_ ? (data_[at] << 8 | data_[at + 1]) : (data_[at + 1] << 8 | data_[at]);
    }
    uint32_t Get32(uint64_t at) const {
        const uint32_t a = data_[at], b = data_[at + 1], c = data_[at + 2], d = data_[at + 3];
        return big_ ? (a << 24 | b << 16 | c << 8 | d) : (d << 24 | c << 16 | b << 8 | a);
    }

    // Marks [at, at + n) used; false when it lies outside the data.
    bool Use(uint64_t at, uint64_t n) {
        if (at + n > size_) return false;
        end_ = std::max(end_, at + n);
        return true;
    }

    // The directory at `ifd` and what it refers to; `next` receives its
    // next-directory offset.
    bool Directory(uint32_t ifd, int depth, uint32_t* next) {
        if (++visited_ > kMostDirectories || depth > kMostDepth || !Use(ifd, 2)) return false;
        const uint32_t count = Get16(ifd);
        if (!Use(ifd, 2 + 12ull * count + 4)) return false;
        *next = Get32(ifd + 2 + 12ull * count);
        uint64_t offsets = 0, counts = 0;
        uint32_t offsetsCount = 0, countsCount = 0, offsetsType = 0, countsType = 0;
        for (uint32_t i = 0; i < count; ++i) {
            const uint64_t entry = ifd + 2 + 12ull * i;
            const uint32_t tag = Get16(entry), type = Get16(entry + 2), n = Get32(entry + 4);
            const uint64_t bytes = uint64_t{n} * TypeSize(type);
            const uint64_t value = bytes > 4 ? Get32(entry + 8) : entry + 8;
            if (bytes > 4 && !Use(value, bytes)) return false;
            if (tag == kStripOffsets || tag == kTileOffsets) {
                offsets = value;
                offsetsType = type;
                offsetsCount = n;
            } else if (tag == kStripByteCounts || tag == kTileByteCounts) {
                counts = value;
                countsType = type;
                countsCount = n;
            } else if ((tag == kExifIfd || tag == kGpsIfd || tag == kInteropIfd || tag == kSubIfds) &&
                       (type == 4 || type == 13)) {
                for (uint32_t k = 0; k < n; ++k) {
                    uint32_t chained = Get32(value + 4ull * k);
                    // A SubIFD may continue in a chain of its own.
                    for (uint32_t steps = 0; chained != 0; ++steps)
                        if (steps > kMostDirectories || !Directory(chained, depth + 1, &chained)) return false;
                }
            }
        }
        return Strips(offsets, offsetsType, counts, countsType, std::min(offsetsCount, countsCount));
    }

private:
    // Unknown types count as one byte a value.
    static uint64_t TypeSize(uint32_t type) { return std::max<uint32_t>(1, TiffTypeSize(static_cast<uint16_t>(type))); }

    uint32_t Number(uint64_t at, uint32_t type, uint32_t index) const {
        return type == 3 ? Get16(at + 2ull * index) : Get32(at + 4ull * index);
    }

    bool Strips(uint64_t offsets, uint32_t offsetsType, uint64_t counts, uint32_t countsType, uint32_t blocks) {
        if (offsets == 0 || counts == 0) return true;
        if ((offsetsType != 3 && offsetsType != 4) || (countsType != 3 && countsType != 4)) return false;
        for (uint32_t i = 0; i < blocks; ++i)
            if (!Use(Number(offsets, offsetsType, i), Number(counts, countsType, i))) return false;
        return true;
    }

    const uint8_t* data_;
    uint32_t size_;
    bool big_;
    uint64_t end_ = 8;
    uint32_t visited_ = 0;
};

}  // namespace

bool FindTiffExtent(const uint8_t* data, uint32_t size, uint32_t* extent) {
    if (!data || size < 8 || (data[0] != 'I' && data[0] != 'M') || data[1] != data[0]) return false;
    ExtentWalk walk(data, size, data[0] == 'M');
    if (walk.Get16(2) != 42) return false;
    const ChainEnd end = FollowChain(walk.Get32(4), [&](uint32_t ifd, uint32_t* next) {
        return walk.Directory(ifd, 0, next);
    });
    if (end != ChainEnd::End) return false;
    *extent = static_cast<uint32_t>(walk.end());
    return true;
}

}  // namespace zan
