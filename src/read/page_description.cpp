// zanTIFFGetInfo and ReadImageDescription: counting the pages, selecting the
// wanted one and describing it in the host's codes.

#include "read/page_description.h"

#include <algorithm>
#include <cstring>

#include "frame/codec_messages.h"
#include "frame/host_memory.h"
#include "frame/report.h"
#include "frame/tiff_open.h"
#include "metadata/metadata_reader.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "read/colour_channels.h"
#include "read/scanline_reader.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

constexpr char kFieldError[] = "Error getting tiff field.";
constexpr char kMemoryError[] = "Memory allocation error.";

uint32_t HostCompressionCode(uint16_t compression) {
    switch (compression) {
    case COMPRESSION_NONE: return ZAN_COMPRESSION_NONE;
    case COMPRESSION_PACKBITS: return ZAN_COMPRESSION_PACKBITS;
    case COMPRESSION_CCITTFAX3: return ZAN_COMPRESSION_CCITT_G3;
    case COMPRESSION_CCITTFAX4: return ZAN_COMPRESSION_CCITT_G4;
    case COMPRESSION_JPEG: return ZAN_COMPRESSION_JPEG;
    case COMPRESSION_CCITTRLE: return ZAN_COMPRESSION_CCITT_RLE;
    case COMPRESSION_LZW: return ZAN_COMPRESSION_LZW;
    case COMPRESSION_NEXT: return ZAN_COMPRESSION_NEXT;
    case COMPRESSION_CCITTRLEW: return ZAN_COMPRESSION_CCITT_RLEW;
    case COMPRESSION_THUNDERSCAN: return ZAN_COMPRESSION_THUNDERSCAN;
    case COMPRESSION_OJPEG: return ZAN_COMPRESSION_OJPEG;
    default: return ZAN_COMPRESSION_OTHER;
    }
}

// imageType and colorSpace of a photometric interpretation; imageType is
// left as it is for values the host has no code for.
void DescribePhotometric(ConversionContext* ctx, uint16_t photometric, uint16_t bits, uint16_t inks) {
    ctx->colorSpace = ZAN_COLORSPACE_RGB;
    switch (photometric) {
    case PHOTOMETRIC_MINISWHITE:
    case PHOTOMETRIC_MINISBLACK: {
        const bool white = photometric == PHOTOMETRIC_MINISWHITE;
        ctx->imageType = bits == 1 ? (white ? ZAN_IMAGE_BILEVEL_WHITE_IS_ZERO : ZAN_IMAGE_BILEVEL_BLACK_IS_ZERO)
                                   : (white ? ZAN_IMAGE_GREY_WHITE_IS_ZERO : ZAN_IMAGE_GREY_BLACK_IS_ZERO);
        ctx->colorSpace = bits == 1 ? ZAN_COLORSPACE_BILEVEL : ZAN_COLORSPACE_GREY;
        break;
    }
    case PHOTOMETRIC_RGB: ctx->imageType = ZAN_IMAGE_RGB; break;
    case PHOTOMETRIC_PALETTE: ctx->imageType = ZAN_IMAGE_PALETTE; break;
    case PHOTOMETRIC_MASK: ctx->imageType = ZAN_IMAGE_MASK; break;
    case PHOTOMETRIC_SEPARATED:
        ctx->imageType = inks == 4 ? ZAN_IMAGE_CMYK : ZAN_IMAGE_SEPARATED;
        ctx->colorSpace = inks == 4 ? ZAN_COLORSPACE_CMYK : ZAN_COLORSPACE_SEPARATED;
        break;
    case PHOTOMETRIC_YCBCR: ctx->imageType = ZAN_IMAGE_YCBCR; break;
    case PHOTOMETRIC_CIELAB: ctx->imageType = ZAN_IMAGE_CIELAB; break;
    case PHOTOMETRIC_LOGL: ctx->imageType = ZAN_IMAGE_LOGL; break;
    case PHOTOMETRIC_LOGLUV: ctx->imageType = ZAN_IMAGE_LOGLUV; break;
    default: break;
    }
}

// Resolutions in pixels per inch: a unit of centimetres is converted, no
// unit gives 0; the values as stored stay in fileXResolution/fileYResolution.
void DescribeResolution(ConversionContext* ctx, uint16_t unit) {
    ctx->fileXResolution = ctx->xResolution;
    ctx->fileYResolution = ctx->yResolution;
    if (unit == RESUNIT_NONE) {
        ctx->xResolution = ctx->yResolution = 0.0f;
        ctx->resolutionUnit = 0;
    } else if (unit == RESUNIT_CENTIMETER) {
        ctx->xResolution *= 2.54f;
        ctx->yResolution *= 2.54f;
        ctx->resolutionUnit = 2;
    } else {
        ctx->resolutionUnit = 1;
    }
}

// Replaces the copy in `field` with a copy of `size` bytes at `data` (none
// when data is null). False when memory is short.
template <typename T>
bool CopyBlock(ConversionContext* ctx, T*& field, const void* data, uint32_t size) {
    ReleaseField(ctx, field);
    if (!data) return true;
    void* copy = AllocateBlock(ctx, size);
    if (!copy) return false;
    std::memcpy(copy, data, size);
    field = static_cast<T*>(copy);
    return true;
}

bool CopyText(ConversionContext* ctx, TIFF* tif, uint32_t tag, char*& field) {
    char* text = nullptr;
    if (!TIFFGetField(tif, tag, &text)) text = nullptr;
    return CopyBlock(ctx, field, text, text ? static_cast<uint32_t>(std::strlen(text) + 1) : 0);
}

bool CopyIccProfile(ConversionContext* ctx, TIFF* tif) {
    ctx->iccProfileSize = 0;
    uint32_t size = 0;
    void* profile = nullptr;
    if (!TIFFGetField(tif, TIFFTAG_ICCPROFILE, &size, &profile) || !profile) size = 0;
    if (!CopyBlock(ctx, ctx->iccProfile, size ? profile : nullptr, size)) return false;
    ctx->iccProfileSize = size;
    return true;
}

// Ends the job of a failed zanTIFFGetInfo: the reader's buffers of a page
// being read, the codec object and the source go, and the job is idle, so
// that no later call works with what was closed.
int CloseFailedJob(ConversionContext* ctx) {
    EndReadJob(ctx);
    return 0;
}

}  // namespace

bool SourceCanReread(const ConversionContext* ctx) {
    return !(ctx->sourceKind == ZAN_SOURCE_STREAM && !ctx->sourceSeekProc);
}

bool SelectPage(TIFF* tif, int32_t pageNumber) {
    // Once the pages have been counted by reading to the end of the chain,
    // libtiff keeps the last page's fields but has let go of its offset
    // (TIFFCurrentDirOffset is 0), and lookups in the stored directory
    // would read the file's header as one. The page is then read again.
    const bool inPlace = TIFFCurrentDirOffset(tif) != 0;
    if (pageNumber < 1) return inPlace || TIFFSetDirectory(tif, TIFFCurrentDirectory(tif));
    const auto index = static_cast<tdir_t>(pageNumber - 1);
    return (inPlace && TIFFCurrentDirectory(tif) == index) || TIFFSetDirectory(tif, index);
}

int ReadImageDescription(ConversionContext* ctx, TIFF* tif) {
    uint32_t length = 0, width = 0;
    uint16_t photometric = 0, bits = 0, samples = 0, planar = 0, orientation = 0, unit = 0;
    if (!TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &length) || !TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &width) ||
        !TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric) ||
        !TIFFGetFieldDefaulted(tif, TIFFTAG_BITSPERSAMPLE, &bits) ||
        !TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLESPERPIXEL, &samples) ||
        !TIFFGetFieldDefaulted(tif, TIFFTAG_PLANARCONFIG, &planar) ||
        !TIFFGetFieldDefaulted(tif, TIFFTAG_ORIENTATION, &orientation))
        return ReportError(ctx, kFieldError);
    ctx->planarConfig = planar == PLANARCONFIG_CONTIG ? 1 : 2;
    ctx->orientation = orientation;
    TIFFGetField(tif, TIFFTAG_XRESOLUTION, &ctx->xResolution);
    TIFFGetField(tif, TIFFTAG_YRESOLUTION, &ctx->yResolution);
    if (!TIFFGetFieldDefaulted(tif, TIFFTAG_RESOLUTIONUNIT, &unit)) return ReportError(ctx, kFieldError);
    DescribeResolution(ctx, unit);

    uint16_t extraCount = 0;
    const uint16_t* extraValues = nullptr;
    if (!TIFFGetStoredExtraSamplesPivlo(tif, &extraCount, &extraValues)) return ReportError(ctx, kFieldError);
    if (extraCount == 0) extraCount = SurplusSamples(samples, photometric);
    extraCount = std::min(extraCount, samples);  // a count beyond the samples is damage
    ctx->samplesPerPixel = samples;
    if (ctx->dropExtraSamples) ctx->samplesPerPixel = static_cast<uint16_t>(samples - extraCount);
    else ctx->extraSamples = extraCount;

    if (!CopyIccProfile(ctx, tif)) return ReportError(ctx, kMemoryError);
    ctx->imageHeight = length;
    ctx->imageWidth = width;
    ctx->bitsPerSample = bits;
    DescribePhotometric(ctx, photometric, bits, static_cast<uint16_t>(samples - extraCount));
    if (photometric == PHOTOMETRIC_SEPARATED) {
        ctx->inkFill = 0xFCFCFCFCu;
        TIFFGetFieldDefaulted(tif, TIFFTAG_DOTRANGE, &ctx->dotRangeLow, &ctx->dotRangeHigh);
    }
    uint16_t compression = COMPRESSION_NONE, fillOrder = 0;
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    ctx->compression = HostCompressionCode(compression);
    ctx->fillOrder = TIFFGetField(tif, TIFFTAG_FILLORDER, &fillOrder) && fillOrder == FILLORDER_LSB2MSB ? 2 : 1;
    if (!CopyText(ctx, tif, TIFFTAG_DOCUMENTNAME, ctx->documentName) ||
        !CopyText(ctx, tif, TIFFTAG_IMAGEDESCRIPTION, ctx->imageDescription))
        return ReportError(ctx, kMemoryError);
    if (TIFFIsTiled(tif)) {
        if (!TIFFGetField(tif, TIFFTAG_TILEWIDTH, &ctx->tileWidth)) return ReportError(ctx, "Error getting tilewidth field.");
        if (!TIFFGetField(tif, TIFFTAG_TILELENGTH, &ctx->tileHeight))
            return ReportError(ctx, "Error getting tileheight field.");
    }
    return 1;
}

}  // namespace zan

extern "C" ZAN_API int zanTIFFGetInfo(ConversionContext* ctx) {
    using namespace zan;
    if (!ctx) return 0;
    // The codec object of a job that writes pages is no page to describe.
    if (RefuseWhileWriting(ctx)) return 0;
    zanResetFrameBuffer(ctx);
    if (!OpenTIFFForReading(ctx)) return 0;
    TIFF* tif = ctx->tiff;
    if (!tif) {
        // A page was described before, but the codec object has gone since.
        zanError(ctx, "Unable to create a tiff object");
        return 0;
    }
    if (ctx->sourceKind != ZAN_SOURCE_STREAM) {
        ctx->pageCount = 0;
        do {
            ++ctx->pageCount;
        } while (TIFFReadDirectory(tif));
    }
    if (!SelectPage(tif, ctx->pageNumber)) {
        zanError(ctx, "Unable to access target page.");
        return CloseFailedJob(ctx);
    }
    if (!ReadImageDescription(ctx, tif)) return CloseFailedJob(ctx);
    if (ctx->metadataList) ReadTIFFMetadata(ctx, tif);
    ctx->state = ZAN_STATE_DESCRIBED;
    return 1;
}
