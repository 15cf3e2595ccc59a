// Writing the EXIF entries of the host's metadata list as the EXIF
// directory of the page just written.
#pragma once

#include "zantiff/conversion_context.h"

namespace zan {

// True when writeMetadataList holds entries for an EXIF directory.
bool HasExifEntries(const ConversionContext* ctx);

// Called right after a page's directory has been written with an ExifIFD
// placeholder (TIFFWritePageDirectoryPivlo): writes an EXIF directory from
// the list's EXIF entries and points the page's ExifIFD at it, or takes the
// placeholder out when the codec takes none of them. 1 when there was
// nothing to write or it has been written and linked, 0 after a reported
// failure. On every path the codec is left on a fresh directory for the
// next page.
int WriteTIFFMetadata(ConversionContext* ctx);

}  // namespace zan
