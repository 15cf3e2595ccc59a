// Whether a metadata entry's form suits the codec's field for its tag, so
// that passing it to TIFFSetField cannot make the codec read an argument of
// another kind (a number taken for a text's address, a block's address for a
// count).
#pragma once

#include <tiffio.h>

#include "zantiff/metadata.h"

namespace zan {

// True when `entry` may be passed for `field` in the form its type gives:
// texts and arrays as blocks that hold what they promise (a text ends
// within its block, an array holds its values), integer fields as integer
// types, real fields as float or double types.
bool EntryFitsField(const TIFFField* field, const MetadataEntry& entry);

// The count passed with a block to a field that takes one: the entry's
// value count, else as many whole values as the block holds. Only for
// entries EntryFitsField accepted.
uint32_t PassedValueCount(const TIFFField* field, const MetadataEntry& entry);

// Passes a block entry that EntryFitsField accepted for `field`: with its
// value count to a field that takes one, the block alone otherwise.
int SetBlockEntry(TIFF* tif, const TIFFField* field, const MetadataEntry& entry);

// True for the tags whose two values go as two arguments (PageNumber,
// HalftoneHints, DotRange, YCbCrSubsampling).
bool IsPairTag(uint32_t tag);

// True for the per-sample fields libtiff takes as one value that it applies
// to every sample (MinSampleValue, MaxSampleValue, SampleFormat,
// SMinSampleValue, SMaxSampleValue, DataType), although their count is
// variable.
bool IsOneValueForAllSamples(uint32_t tag);

}  // namespace zan
