// Checks of a page's claims against the data it stores, made before any
// buffer is sized from the page's directory.
#pragma once

#include <cstdint>

#include <tiffio.h>

#include "zantiff/conversion_context.h"

namespace zan {

// Bytes of the current directory's image as stored (rows of all planes), or
// 0 when libtiff cannot size a row.
uint64_t StoredImageBytes(TIFF* tif);

// True when the strips or tiles of the current directory can hold an image
// of `storedBytes` bytes: their byte counts times the most that the page's
// compression can expand a byte to (a fax page needs a bit a row). A tiny
// file that claims a huge image (a decompression bomb) fails, before any
// work buffer is sized from its claims.
// Byte counts are taken as far as the source holds them, when its size is
// known without reading it (libtiff invents the byte counts of uncompressed
// pages without StripByteCounts from the image size).
bool PageDataCanHold(const ConversionContext* ctx, TIFF* tif, uint64_t storedBytes);

// The message for a page that fails PageDataCanHold.
constexpr char kPageDataTooSmall[] = "The page's data is too small for the image it describes.";

}  // namespace zan
