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

// Ends the page being written: writes its directory, checks that every
// byte reached the destination, then writes its EXIF directory from
// writeMetadataList. False when the page's directory was not written (the
// codec has reported, or a short write is reported here); a failure of the
// EXIF directory is reported and leaves the page written.
bool FinishPage(ConversionContext* ctx);

}  // namespace zan
