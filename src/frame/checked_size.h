// Sizes worked out from numbers a file or a host supplies: products that
// must not wrap before they are compared with a limit.
#pragma once

#include <cstdint>
#include <limits>

namespace zan {

// a × b, or false when the product does not fit in 64 bits.
inline bool MultiplySizes(uint64_t a, uint64_t b, uint64_t* product) {
    if (a != 0 && b > std::numeric_limits<uint64_t>::max() / a) return false;
    *product = a * b;
    return true;
}

// a × b × c, or false when any step does not fit in 64 bits.
inline bool MultiplySizes(uint64_t a, uint64_t b, uint64_t c, uint64_t* product) {
    uint64_t ab = 0;
    return MultiplySizes(a, b, &ab) && MultiplySizes(ab, c, product);
}

// True when `size` can be handed to a 32-bit interface.
inline bool FitsIn32(uint64_t size) { return size <= std::numeric_limits<uint32_t>::max(); }

}  // namespace zan
