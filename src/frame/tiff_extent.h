// The bytes a classic TIFF held in memory occupies, found from its
// structure.
#pragma once

#include <cstdint>

namespace zan {

// Sets `extent` to the end of the furthest byte that the TIFF at `data`
// (`size` bytes) uses: its header, its directories (with their EXIF, GPS,
// Interoperability and SubIFD directories), the values they store outside
// their entries and the strips or tiles of every page. False when the bytes
// are no classic TIFF, or when anything the structure names lies outside
// them or its chain of directories loops.
bool FindTiffExtent(const uint8_t* data, uint32_t size, uint32_t* extent);

}  // namespace zan
