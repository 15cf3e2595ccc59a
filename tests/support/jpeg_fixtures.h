// JPEG-in-TIFF pages made with libjpeg, strip by strip, and JPEG streams
// decoded with libjpeg: the layouts libtiff's own encoder does not give
// (restart intervals, any sampling) and an independent decoder.
#pragma once

#include <cstdint>

#include "support/tiff_fixtures.h"

namespace zantest {

struct JpegPageLayout {
    uint32_t width = 64;
    uint32_t height = 48;
    uint32_t rowsPerStrip = 16;
    int components = 3;          // 1 grey, 3 colour
    int h = 2, v = 2;            // luma sampling factors (chroma 1 x 1)
    int restartInterval = 0;     // MCUs; 0: none
    bool rgb = false;            // colour stored as RGB (Photometric 2) rather than YCbCr
    bool tables = true;          // tables in JPEGTables (else none)
    bool wholeStrips = false;    // strips carry their own tables too
};

// The page's pixels: a gradient with some texture.
uint8_t JpegSourceSample(uint32_t x, uint32_t y, int component);

// One-page TIFF laid out as `layout` describes, its strips JPEG streams.
Bytes MakeJpegTiff(const JpegPageLayout& layout);

// One whole JPEG stream of the page `page` describes (its strips ignored): components
// 1 grey, 3 YCbCr (or RGB), 4 CMYK; `cbH`/`cbV` and `crH`/`crV` the chroma
// sampling; a JFIF density of `density` (unit `densityUnit`: 1 inch, 2 cm).
struct JpegStreamLayout {
    JpegPageLayout page;
    int cbH = 1, cbV = 1, crH = 1, crV = 1;
    int density = 0, densityUnit = 0;
};
Bytes MakeJpeg(const JpegStreamLayout& layout);

// Rewrites the sampling factors of `component` in the stream's frame header:
// layouts libjpeg's encoder refuses to make (fractional ones) but whose
// headers it reads.
void SetFrameSampling(Bytes& jpeg, int component, int h, int v);

// Decodes a JPEG stream with libjpeg (integer DCT, no fancy upsampling):
// RGB or grey rows top first, or empty when libjpeg cannot. With
// `rgbComponents` three components are taken as RGB whatever the stream
// says (as libtiff takes them on a page of Photometric RGB).
struct DecodedJpeg {
    uint32_t width = 0, height = 0;
    int components = 0;
    Bytes pixels;
};
DecodedJpeg DecodeJpeg(const Bytes& jpeg, bool rgbComponents = false, bool fancyUpsampling = false);

// The page decoded the way its strips are stored: each strip, with the
// page's tables in front, decoded on its own, the rows stacked.
DecodedJpeg DecodeJpegStrips(const Bytes& tiff);

}  // namespace zantest
