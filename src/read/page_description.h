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

}  // namespace zan
