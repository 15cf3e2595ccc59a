#include "write/page_tags.h"

namespace zan {

bool ColourLayoutFor(uint32_t colorSpace, uint32_t width, bool sixteen, bool whiteIsZero,
                     uint32_t components, ColourLayout* layout) {
    const uint16_t bits = sixteen ? 16 : 8;
    const uint64_t w = width, k = sixteen ? 2 : 1;
    ColourLayout l;
    switch (colorSpace) {
    case ZAN_COLORSPACE_BILEVEL:
        l = {1, 1, static_cast<uint16_t>(whiteIsZero ? PHOTOMETRIC_MINISWHITE : PHOTOMETRIC_MINISBLACK), false, (w + 7) / 8};
        break;
    case ZAN_COLORSPACE_GREY: l = {bits, 1, PHOTOMETRIC_MINISBLACK, false, w * k}; break;
    case ZAN_COLORSPACE_GREY_ALPHA: l = {bits, 2, PHOTOMETRIC_MINISBLACK, true, 2 * w * k}; break;
    case ZAN_COLORSPACE_CMYK_1BIT: l = {1, 4, PHOTOMETRIC_SEPARATED, false, (w + 1) / 2}; break;
    case ZAN_COLORSPACE_CMYK: l = {bits, 4, PHOTOMETRIC_SEPARATED, false, 4 * w * k}; break;
    case ZAN_COLORSPACE_SEPARATED:
        l = {bits, static_cast<uint16_t>(components), PHOTOMETRIC_SEPARATED, false, w * components * k};
        break;
    case ZAN_COLORSPACE_RGB_ALPHA: l = {bits, 4, PHOTOMETRIC_RGB, true, 4 * w * k}; break;
    case ZAN_COLORSPACE_RGB: l = {bits, 3, PHOTOMETRIC_RGB, false, 3 * w * k}; break;
    default: return false;
    }
    *layout = l;
    return true;
}

void SetColourTags(TIFF* tif, const ColourLayout& layout) {
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, layout.bitsPerSample);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, layout.samplesPerPixel);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, layout.photometric);
    if (layout.unassociatedAlpha) {
        static const uint16_t kUnassociated[1] = {EXTRASAMPLE_UNASSALPHA};
        TIFFSetField(tif, TIFFTAG_EXTRASAMPLES, 1, kUnassociated);
    }
}

void SetWholePageTags(ConversionContext* ctx, TIFF* tif, uint32_t width, uint32_t height) {
    TIFFSetField(tif, TIFFTAG_SUBFILETYPE, 0);
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, width);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, height);
    TIFFSetField(tif, TIFFTAG_ORIENTATION, ctx->outputOrientation ? ctx->outputOrientation : ORIENTATION_TOPLEFT);
    TIFFSetField(tif, TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG);
    TIFFSetField(tif, TIFFTAG_FILLORDER, FILLORDER_MSB2LSB);
}

void SetResolution(ConversionContext* ctx, TIFF* tif, float fallbackX, float fallbackY) {
    TIFFSetField(tif, TIFFTAG_RESOLUTIONUNIT, RESUNIT_INCH);
    float x = ctx->outputXResolution, y = ctx->outputYResolution;
    if (!(x > 0 && y > 0)) {
        x = fallbackX;
        y = fallbackY;
    }
    if (x > 0 && y > 0) {
        TIFFSetField(tif, TIFFTAG_XRESOLUTION, static_cast<double>(x));
        TIFFSetField(tif, TIFFTAG_YRESOLUTION, static_cast<double>(y));
    }
}

void SetIccProfile(ConversionContext* ctx, TIFF* tif) {
    if (ctx->outputIccProfile && ctx->outputIccProfileSize)
        TIFFSetField(tif, TIFFTAG_ICCPROFILE, ctx->outputIccProfileSize, ctx->outputIccProfile);
}

}  // namespace zan
