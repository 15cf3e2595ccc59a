// Compressed pages delivered without decoding: the strips of a one-strip
// Group 4 or JPEG page as they are, and the strips of a JPEG page joined
// into one JPEG interchange stream.
#pragma once

#include <cstdint>

#include <tiffio.h>

namespace zan {

// Delivers the raw bytes of every strip of the current page, in strip
// order, to the job's destination (bits of each byte reversed when
// `reverse` is set, for FillOrder 2). With `adobeSegment` set, an Adobe
// APP14 segment (transform 0: the components are RGB) follows the stream's
// SOI unless the stream carries one. 1, or 0 after a reported failure.
int extractSingleStrip(TIFF* tif, uint32_t reverse, bool adobeSegment = false);

// Joins the JPEGTables and the strips of the current JPEG page into one
// baseline JPEG stream (one frame header patched to the page's height, a
// restart interval, every strip boundary a restart marker) delivered to the
// job's destination. 1 with *directConversion 1 when delivered; 1 with
// *directConversion 0 (and a trace saying why) when the page's layout does
// not allow the join; 0 after a reported failure.
int extractMultistripJPEG(TIFF* tif, uint32_t* directConversion);

}  // namespace zan
