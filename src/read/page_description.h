// Page selection and description of the page read.
#pragma once

#include <tiffio.h>

#include "zantiff/conversion_context.h"

namespace zan {

// Describes the current directory of `tif` in the context (size, samples,
// photometric and compression in the host's codes, resolution, ICC profile
// and text copies, tiles). 1, or 0 after a reported failure.
int ReadImageDescription(ConversionContext* ctx, TIFF* tif);

// Makes page `pageNumber` (from 1) current when it is not; pageNumber below
// 1 keeps the current directory. False when the page cannot be reached.
bool SelectPage(TIFF* tif, int32_t pageNumber);

// True when the job's source can be read again at earlier positions (every
// source but a stream read through the stream buffer service).
bool SourceCanReread(const ConversionContext* ctx);

// ExtraSamples of the current directory as the file stores it (count 0 when
// absent), or libtiff's answer when the source cannot be read again.
bool GetStoredExtraSamples(const ConversionContext* ctx, TIFF* tif, uint16_t* count,
                           const uint16_t** values);

}  // namespace zan
