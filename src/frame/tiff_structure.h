// What every walk of the TIFF file structure shares: the tags that lead to
// image data and sub-directories, the sizes of the field types, and the
// following of a chain of directories with loop detection.
#pragma once

#include <cstdint>

namespace zan {

constexpr uint16_t kStripOffsets = 273, kStripByteCounts = 279;
constexpr uint16_t kTileOffsets = 324, kTileByteCounts = 325;
constexpr uint16_t kSubIfds = 330, kExifIfd = 34665, kGpsIfd = 34853, kInteropIfd = 40965;

// Size in bytes of one value of a field type; 0 for unknown types.
constexpr uint32_t TiffTypeSize(uint16_t type) {
    switch (type) {
    case 1: case 2: case 6: case 7: return 1;
    case 3: case 8: return 2;
    case 4: case 9: case 11: case 13: return 4;
    case 5: case 10: case 12: return 8;
    default: return 0;
    }
}

enum class ChainEnd { End, Stopped, Loop };

// Follows a chain of directories from `first` until an offset of 0:
// step(offset, &next) takes the directory at `offset` and gives the next
// one's offset, or returns false to stop the walk. A chain that returns to a
// directory already taken ends as Loop (Brent's cycle detection: no memory,
// at most a few steps more than the chain has).
template <typename Step>
ChainEnd FollowChain(uint32_t first, Step step) {
    uint32_t tortoise = first;
    uint64_t power = 1, steps = 0;
    for (uint32_t current = first; current != 0;) {
        uint32_t next = 0;
        if (!step(current, &next)) return ChainEnd::Stopped;
        if (next == tortoise) return ChainEnd::Loop;
        if (++steps == power) {
            tortoise = next;
            power *= 2;
            steps = 0;
        }
        current = next;
    }
    return ChainEnd::End;
}

}  // namespace zan
