// Writing the EXIF entries of the host's metadata list as the EXIF
// directory of the page just written.
#pragma once

#include "zantiff/conversion_context.h"

namespace zan {

// Called right after a page's directory has been written, with
// writeMetadataList set: writes an EXIF directory from the list's EXIF
// entries and links the page to it. 1 when there was nothing to write or it
// has been written and linked, 0 after a reported failure.
int WriteTIFFMetadata(ConversionContext* ctx);

}  // namespace zan
