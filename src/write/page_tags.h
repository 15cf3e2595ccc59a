// Tags the page writers share: the colour layout of a page by the host's
// colour-space code, resolution and ICC profile.
#pragma once

#include <cstdint>

#include <tiffio.h>

#include "zantiff/conversion_context.h"

namespace zan {

// How a page of one host colour space is stored, and the bytes of a row.
struct ColourLayout {
    uint16_t bitsPerSample = 8;
    uint16_t samplesPerPixel = 1;
    uint16_t photometric = PHOTOMETRIC_MINISBLACK;
    bool unassociatedAlpha = false;  // ExtraSamples {2}
    uint64_t rowBytes = 0;
};

// The layout of colour-space code `colorSpace` (1..8) for rows of `width`
// pixels; `sixteen` asks for 16-bit samples. False for codes outside 1..8.
bool ColourLayoutFor(uint32_t colorSpace, uint32_t width, bool sixteen, bool whiteIsZero,
                     uint32_t components, ColourLayout* layout);

// BitsPerSample, SamplesPerPixel, PhotometricInterpretation and, for alpha,
// ExtraSamples, in that order.
void SetColourTags(TIFF* tif, const ColourLayout& layout);

// The tags every written page starts with: a full-resolution page of
// `width` x `height`, the orientation asked for (top-left by default),
// contiguous samples, bits in their natural order.
void SetWholePageTags(ConversionContext* ctx, TIFF* tif, uint32_t width, uint32_t height);

// ResolutionUnit inch always; the resolutions asked for when both are above
// 0, else `fallbackX` and `fallbackY` when both are above 0.
void SetResolution(ConversionContext* ctx, TIFF* tif, float fallbackX = 0, float fallbackY = 0);

// The ICC profile, when the context has one.
void SetIccProfile(ConversionContext* ctx, TIFF* tif);

// Reduces `samples8` 16-bit (little-endian) samples to their high bytes in
// place; the first `samples8` bytes then hold the 8-bit samples.
inline void KeepHighBytes(uint8_t* samples, uint64_t samples8) {
    for (uint64_t i = 0; i < samples8; ++i) samples[i] = samples[2 * i + 1];
}

}  // namespace zan
