// Framing the pages of a destination: caller tags, the host's
// image-directory metadata, and the end of a page.
#pragma once

#include <tiffio.h>

#include "zantiff/conversion_context.h"

namespace zan {

// Copies the image-directory entries (and the ICC profile entry) of
// writeMetadataList into the page being set up; guarded tags the page
// already holds are left alone. 1, or 0 after "Error in saving metadata".
int ApplyPageMetadata(ConversionContext* ctx, TIFF* tif);

// Writes the page's directory and checks that every byte reached the
// destination. False when the codec failed (it has reported) or a write
// came up short (reported here).
bool WritePageDirectory(ConversionContext* ctx);

}  // namespace zan
