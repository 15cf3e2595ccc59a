// Gathering a page's tags, ICC profile and EXIF directory into the host's
// metadata list.
#pragma once

#include <tiffio.h>

#include "zantiff/conversion_context.h"

namespace zan {

// Adds the selected image-directory tags, the ICC profile (from the page's
// description) and every tag of the page's EXIF directory to
// ctx->metadataList. 1 when everything was added, 0 after a reported
// failure; the image directory is current again on every path.
int ReadTIFFMetadata(ConversionContext* ctx, TIFF* tif);

}  // namespace zan
