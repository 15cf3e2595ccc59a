// zanTIFFToFrameBuffer: the selected page in one call, as compressed data
// handed on undecoded, as the page's own samples, or as an RGB, grey or
// bilevel frame through the codec's RGBA reader. Whatever happens, the call
// ends with the codec object closed, the source released and the job idle.

#include <algorithm>
#include <cstring>

#include "frame/checked_size.h"
#include "frame/codec_messages.h"
#include "frame/host_memory.h"
#include "frame/report.h"
#include "frame/tiff_open.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "read/colour_channels.h"
#include "read/page_data.h"
#include "read/page_description.h"
#include "read/passthrough.h"
#include "read/scanline_reader.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

// Frame formats of the host.
enum : uint32_t {
    kFormatG4 = 1,
    kFormatGreyJpeg = 2,
    kFormatColourJpeg = 8,
    kFormatPalette = 19,
};

// What the page is, as the decode needs it.
struct Page {
    uint32_t width = 0, height = 0;
    uint16_t photometric = 0, bits = 1, samples = 1, planar = PLANARCONFIG_CONTIG, compression = COMPRESSION_NONE;
    bool tiled = false;
};

// The host's format code of a native frame; 0 for photometric values the
// host has none for (the frame keeps the format it had).
uint32_t NativeFormat(uint16_t photometric, uint16_t bits, uint16_t samples) {
    switch (photometric) {
    case PHOTOMETRIC_MINISWHITE: return bits == 1 ? ZAN_IMAGE_BILEVEL_WHITE_IS_ZERO : ZAN_IMAGE_GREY_WHITE_IS_ZERO;
    case PHOTOMETRIC_MINISBLACK: return bits == 1 ? ZAN_IMAGE_BILEVEL_BLACK_IS_ZERO : ZAN_IMAGE_GREY_BLACK_IS_ZERO;
    case PHOTOMETRIC_RGB: return bits == 8 ? uint32_t{ZAN_COLORSPACE_RGB} : uint32_t{ZAN_IMAGE_RGB};
    case PHOTOMETRIC_PALETTE: return ZAN_IMAGE_PALETTE;
    case PHOTOMETRIC_SEPARATED:
        if (samples != 4) return ZAN_IMAGE_SEPARATED;
        return bits == 8 ? uint32_t{ZAN_COLORSPACE_CMYK} : uint32_t{ZAN_IMAGE_CMYK};
    case PHOTOMETRIC_YCBCR: return ZAN_IMAGE_YCBCR;
    case PHOTOMETRIC_CIELAB: return ZAN_IMAGE_CIELAB;
    case PHOTOMETRIC_LOGL: return ZAN_IMAGE_LOGL;
    case PHOTOMETRIC_LOGLUV: return ZAN_IMAGE_LOGLUV;
    default: return 0;
    }
}

class FrameDecode {
public:
    explicit FrameDecode(ConversionContext* ctx) : ctx_(ctx) {}

    int Run(uint32_t* direct) {
        const int result = Decode(direct);
        if (!result) {
            ReleaseBlock(ctx_, buffer_);
            buffer_ = nullptr;
            zanResetFrameBuffer(ctx_);
        }
        End();
        return result;
    }

private:
    int Fail(const char* message) {
        if (message) zanError(ctx_, message);
        return 0;
    }

    // The end of every call: the job holds nothing and is idle.
    void End() { EndReadJob(ctx_); }

    int Decode(uint32_t* direct) {
        zanResetFrameBuffer(ctx_);
        if (!OpenTIFFForReading(ctx_)) return 0;
        tif_ = ctx_->tiff;
        if (!tif_) return Fail("Unable to create a tiff object");
        if (!SelectPage(tif_, ctx_->pageNumber)) return Fail("Unable to access the page.");
        TIFFGetFieldDefaulted(tif_, TIFFTAG_COMPRESSION, &page_.compression);
        int passed = 0;
        if (PassThrough(direct, &passed)) {
            if (passed) zanResetFrameBuffer(ctx_);
            return passed;
        }
        *direct = 0;
        if (!TIFFGetField(tif_, TIFFTAG_IMAGELENGTH, &page_.height) || !TIFFGetField(tif_, TIFFTAG_IMAGEWIDTH, &page_.width))
            return Fail("Error getting tiff field.");
        TIFFGetFieldDefaulted(tif_, TIFFTAG_BITSPERSAMPLE, &page_.bits);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_SAMPLESPERPIXEL, &page_.samples);
        // Without PhotometricInterpretation the page is taken as the RGBA
        // reader takes it: grey for one sample, RGB for more.
        if (!TIFFGetField(tif_, TIFFTAG_PHOTOMETRIC, &page_.photometric))
            page_.photometric = page_.samples < 3 ? PHOTOMETRIC_MINISBLACK : PHOTOMETRIC_RGB;
        TIFFGetFieldDefaulted(tif_, TIFFTAG_PLANARCONFIG, &page_.planar);
        page_.tiled = TIFFIsTiled(tif_);
        // 16-bit frames come from 16-bit pages only.
        if (ctx_->outputBitsPerSample == 16 && page_.bits != 16)
            return Fail("Compressing from 1, 4, 8 to 16 bits image is not supported.");
        ctx_->frameHeight = page_.height;
        ctx_->frameWidth = page_.width;
        ctx_->colorSpace = ZAN_COLORSPACE_RGB;
        if (page_.width == 0 || page_.height == 0) return Fail("Image dimension can not be zero.");
        // Nothing is sized from the page's claims before its data can hold them.
        if (!PageDataCanHold(ctx_, tif_, StoredImageBytes(tif_))) return Fail(kPageDataTooSmall);
        const bool convert = !ctx_->keepFileLayout && page_.photometric == PHOTOMETRIC_RGB && page_.bits == 1 &&
                             page_.planar == PLANARCONFIG_SEPARATE && ctx_->requestedFormat == kFormatPalette &&
                             ctx_->requestedBitsPerSample == 4 && ctx_->requestedPaletteBits == 8;
        const bool native = (ctx_->keepFileLayout || convert) && !page_.tiled;
        const uint64_t codecErrors = CodecErrorsDelivered();
        if (!(native ? DecodeNative(convert) : DecodeRgba())) {
            // The codec explains its failures to the host's codec sink;
            // when nothing reached it, the host still learns of this one.
            if (CodecErrorsDelivered() == codecErrors && ctx_->frameBufferSize) zanError(ctx_, "Unable to decode the page.");
            return 0;
        }
        HandOver(*direct);
        return 1;
    }

    // Step 3: the page handed on undecoded when the host asks for the
    // compression it has. True when the page was dealt with here (*result
    // the call's result); false to decode it.
    bool PassThrough(uint32_t* direct, int* result) {
        const bool jpeg = page_.compression == COMPRESSION_JPEG && ctx_->destFormat == ZAN_DEST_FORMAT_JPEG;
        const bool g4 = page_.compression == COMPRESSION_CCITTFAX4 && ctx_->destFormat == ZAN_DEST_FORMAT_G4;
        if (!jpeg && !g4) return false;
        uint16_t fillOrder = FILLORDER_MSB2LSB, samples = 1, bits = 1, photometric = 0;
        TIFFGetFieldDefaulted(tif_, TIFFTAG_FILLORDER, &fillOrder);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_SAMPLESPERPIXEL, &samples);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_BITSPERSAMPLE, &bits);
        TIFFGetField(tif_, TIFFTAG_PHOTOMETRIC, &photometric);
        const uint32_t strips = TIFFNumberOfStrips(tif_);
        const bool reverse = fillOrder == FILLORDER_LSB2MSB;
        if (jpeg) {
            uint32_t tablesSize = 0;
            void* tables = nullptr;
            const bool hasTables = TIFFGetField(tif_, TIFFTAG_JPEGTABLES, &tablesSize, &tables) && tablesSize > 0;
            // Strips that share the page's tables, however many, are joined
            // with them; a single strip without tables is a whole stream.
            if (strips > 1 || hasTables || TIFFIsTiled(tif_)) {
                *result = extractMultistripJPEG(tif_, direct);
                return *result == 0 || *direct == 1;
            }
            *direct = 1;
            *result = extractSingleStrip(tif_, reverse, samples == 3 && photometric == PHOTOMETRIC_RGB);
            if (*result) SetDelivered(samples == 1 ? kFormatGreyJpeg : kFormatColourJpeg);
            return true;
        }
        if (strips > 1 || TIFFIsTiled(tif_) || (bits == 1 && photometric != PHOTOMETRIC_MINISWHITE)) {
            *direct = 0;
            zanTrace(ctx_,
                     strips > 1 || TIFFIsTiled(tif_) ? "No direct conversion: the Group 4 page has several strips or tiles."
                                                     : "No direct conversion: the Group 4 page is not min-is-white.",
                     1);
            return false;
        }
        *direct = 1;
        *result = extractSingleStrip(tif_, reverse);
        if (*result) SetDelivered(kFormatG4);
        return true;
    }

    void SetDelivered(uint32_t format) {
        TIFFGetField(tif_, TIFFTAG_IMAGELENGTH, &ctx_->outputHeight);
        TIFFGetField(tif_, TIFFTAG_IMAGEWIDTH, &ctx_->outputWidth);
        ctx_->outputFormat = format;
    }

    // A frame buffer of `size` bytes, or false after "Buffer size too big"
    // (it does not fit in 32 bits) or "Memory allocation".
    bool TakeBuffer(uint64_t size) {
        if (!FitsIn32(size)) return Fail("Buffer size too big");
        buffer_ = static_cast<uint8_t*>(AllocateBlock(ctx_, static_cast<uint32_t>(size)));
        if (!buffer_) return Fail("Memory allocation");
        ctx_->frameBufferSize = static_cast<uint32_t>(size);
        return true;
    }

    // ---- native decoding: the page's own samples, rows top first ----

    int DecodeNative(bool convert) {
        char message[1024] = "";
        TIFFImageRecord image;
        if (!TIFFImageBegin(&image, tif_, 0, message)) {
            TIFFError(TIFFFileName(tif_), "%s", message);
            TIFFImageEnd(tif_, &image);
            return 0;
        }
        // The image reader has chosen the copying put routine of the page's
        // planar layout; 16-bit samples are delivered as 8 unless 16 bits are
        // asked for.
        image.reduceTo8 = page_.bits == 16 && ctx_->outputBitsPerSample != 16;
        const bool separate = page_.planar != PLANARCONFIG_CONTIG;
        const uint64_t rowBytes = image.reduceTo8 ? image.storedRowBytes / 2 : image.storedRowBytes;
        const uint16_t planes = separate ? page_.samples : 1;
        // The 4-bit palette image of the conversion is larger than its three
        // 1-bit planes: the buffer holds either.
        uint64_t size = 0, converted = 0;
        const bool sized = MultiplySizes(rowBytes, page_.height, planes, &size) &&
                           MultiplySizes((uint64_t{page_.width} + 1) / 2, page_.height, &converted);
        if (!sized || !TakeBuffer(convert ? std::max(size, converted) : size)) {
            TIFFImageEnd(tif_, &image);
            return 0;
        }
        const int got = TIFFImageGet(&image, buffer_, page_.width, image.height);
        TIFFImageEnd(tif_, &image);
        const uint16_t bits = image.reduceTo8 ? 8 : page_.bits;
        // The rows arrive bottom row first.
        for (uint16_t plane = 0; plane < planes; ++plane)
            if (!zanVerticalReverseImage(ctx_, buffer_ + plane * rowBytes * page_.height, static_cast<uint32_t>(rowBytes),
                                         page_.height))
                return 0;
        frameBytes_ = size;
        uint16_t samples = page_.samples;
        if (ctx_->dropExtraSamples) samples = DropExtraSamples(bits, rowBytes, separate);
        if (!got) return 0;
        if (convert) return ConvertToPalette(rowBytes);
        if (page_.photometric == PHOTOMETRIC_PALETTE && !CopyColorMap()) return 0;
        DescribeNative(bits, samples, separate);
        return 1;
    }

    // Leaves out the extra samples of every pixel, in place; the number of
    // samples left. Pixels of whole bytes only: packed pixels keep theirs.
    uint16_t DropExtraSamples(uint16_t bits, uint64_t rowBytes, bool separate) {
        uint16_t count = 0;
        const uint16_t* kinds = nullptr;
        TIFFGetStoredExtraSamplesPivlo(tif_, &count, &kinds);
        uint16_t extra = count ? count : SurplusSamples(page_.samples, page_.photometric);
        extra = std::min(extra, page_.samples);
        const uint16_t kept = static_cast<uint16_t>(page_.samples - extra);
        if (extra == 0 || kept == 0 || bits % 8 != 0) return page_.samples;
        ctx_->extraSamples = 0;
        if (separate) {
            // The planes lie one after another: the last ones go.
            frameBytes_ = rowBytes * page_.height * kept;
            return kept;
        }
        const uint64_t sampleBytes = bits / 8u;
        const uint64_t from = sampleBytes * page_.samples, to = sampleBytes * kept;
        const uint64_t pixels = uint64_t{page_.width} * page_.height;
        for (uint64_t k = 0; k < pixels; ++k) std::memmove(buffer_ + k * to, buffer_ + k * from, to);
        frameBytes_ = to * pixels;
        return kept;
    }

    // Three 1-bit planes to one 4-bit image of the host's RGB palette.
    int ConvertToPalette(uint64_t planeRowBytes) {
        const uint64_t plane = planeRowBytes * page_.height;
        HostBlock planes(ctx_, FitsIn32(plane * 3) ? static_cast<uint32_t>(plane * 3) : 0);
        if (!planes || plane * 3 > ctx_->frameBufferSize) return Fail("Memory allocation error.");
        std::memcpy(planes.Get(), buffer_, static_cast<size_t>(plane * 3));
        const auto* p = planes.Get<uint8_t>();
        zanConvert1BitRGBPlanarTo4BitRGBPalette8(ctx_, p, p + plane, p + 2 * plane, buffer_, page_.width,
                                                 page_.height);
        ctx_->outputFormat = ctx_->colorSpace = kFormatPalette;
        ctx_->outputSamplesPerPixel = 1;
        ctx_->outputBitsPerSample = 4;
        ctx_->outputPaletteBits = 8;
        ctx_->outputPlanarConfig = 1;
        frameBytes_ = (uint64_t{page_.width} + 1) / 2 * page_.height;
        return 1;
    }

    // The ColorMap in one block: red, green and blue tables of 2^bits
    // 16-bit entries.
    bool CopyColorMap() {
        uint16_t *red = nullptr, *green = nullptr, *blue = nullptr;
        if (page_.bits > 16 || !TIFFGetField(tif_, TIFFTAG_COLORMAP, &red, &green, &blue))
            return Fail("Error getting tiff field.");
        const uint32_t entries = 1u << page_.bits;
        ReleaseField(ctx_, ctx_->paletteRed);
        ctx_->paletteGreen = ctx_->paletteBlue = nullptr;
        auto* block = static_cast<uint16_t*>(AllocateBlock(ctx_, 6 * entries));
        if (!block) return Fail("Memory allocation error.");
        std::memcpy(block, red, 2 * entries);
        std::memcpy(block + entries, green, 2 * entries);
        std::memcpy(block + 2 * entries, blue, 2 * entries);
        ctx_->paletteRed = block;
        ctx_->paletteGreen = block + entries;
        ctx_->paletteBlue = block + 2 * entries;
        return true;
    }

    void DescribeNative(uint16_t bits, uint16_t samples, bool separate) {
        uint16_t photometric = page_.photometric;
        // JPEG YCbCr pages are decoded to RGB.
        if (photometric == PHOTOMETRIC_YCBCR && page_.compression == COMPRESSION_JPEG) photometric = PHOTOMETRIC_RGB;
        const uint32_t format = NativeFormat(photometric, bits, samples);
        if (format) ctx_->outputFormat = format;
        if (photometric == PHOTOMETRIC_MINISWHITE || photometric == PHOTOMETRIC_MINISBLACK) {
            // Grey frames are grey, bilevel ones bilevel.
            ctx_->colorSpace = bits == 1 ? ZAN_COLORSPACE_BILEVEL : ZAN_COLORSPACE_GREY;
            ctx_->frameWhiteIsZero = photometric == PHOTOMETRIC_MINISWHITE;
        } else {
            ctx_->colorSpace = format ? format : uint32_t{ZAN_COLORSPACE_RGB};
        }
        if (photometric == PHOTOMETRIC_PALETTE) ctx_->outputPaletteBits = 16;
        ctx_->outputSamplesPerPixel = samples;
        ctx_->outputBitsPerSample = bits;
        ctx_->outputPlanarConfig = separate ? 2 : 1;
    }

    // ---- RGBA decoding: RGB, grey or bilevel frames ----

    int DecodeRgba() {
        const bool sixteen = ctx_->outputBitsPerSample == 16;
        const bool grey = page_.photometric == PHOTOMETRIC_MINISWHITE || page_.photometric == PHOTOMETRIC_MINISBLACK;
        const bool bilevel = grey && page_.bits == 1;
        const bool minIsWhite = page_.photometric == PHOTOMETRIC_MINISWHITE;
        uint64_t size = 0;
        if (!MultiplySizes(page_.width, page_.height, sixteen ? 8 : 4, &size) || !TakeBuffer(size)) return 0;
        int packing = TIFF_FRAME_RGB8;
        if (bilevel) packing = TIFF_FRAME_BILEVEL;
        else if (grey) packing = sixteen ? TIFF_FRAME_GREY16 : TIFF_FRAME_GREY8;
        else if (sixteen) packing = TIFF_FRAME_RGB16;
        // The frame is described before it is packed.
        const uint64_t pixels = uint64_t{page_.width} * page_.height;
        ctx_->outputPlanarConfig = 1;
        if (grey) {
            ctx_->outputFormat = bilevel ? (minIsWhite ? ZAN_IMAGE_BILEVEL_WHITE_IS_ZERO : ZAN_IMAGE_BILEVEL_BLACK_IS_ZERO)
                                         : (minIsWhite ? ZAN_IMAGE_GREY_WHITE_IS_ZERO : ZAN_IMAGE_GREY_BLACK_IS_ZERO);
            ctx_->colorSpace = bilevel ? ZAN_COLORSPACE_BILEVEL : ZAN_COLORSPACE_GREY;
            ctx_->outputSamplesPerPixel = 1;
            ctx_->outputBitsPerSample = bilevel ? 1 : sixteen ? 16 : 8;
            ctx_->frameWhiteIsZero = minIsWhite;
            frameBytes_ = bilevel ? (uint64_t{page_.width} + 7) / 8 * page_.height : pixels * (sixteen ? 2 : 1);
        } else {
            ctx_->outputFormat = ZAN_COLORSPACE_RGB;
            ctx_->colorSpace = ZAN_COLORSPACE_RGB;
            ctx_->outputSamplesPerPixel = 3;
            ctx_->outputBitsPerSample = sixteen ? 16 : 8;
            frameBytes_ = pixels * (sixteen ? 6 : 3);
        }
        if (!TIFFReadRGBAFramePivlo(tif_, buffer_, page_.width, page_.height, packing, minIsWhite)) return 0;
        if (!bilevel) ctx_->extraSamples = 0;
        return 1;
    }

    // The frame goes to the host, shrunk to its bytes.
    void HandOver(uint32_t direct) {
        if (direct != 0) return;
        void* frame = buffer_;
        if (ctx_->reallocProc && frameBytes_ < ctx_->frameBufferSize)
            if (void* shrunk = ctx_->reallocProc(buffer_, static_cast<uint32_t>(frameBytes_ ? frameBytes_ : 1)))
                frame = shrunk;
        ctx_->frameData = frame;
        ctx_->frameBufferSize = static_cast<uint32_t>(frameBytes_);
        buffer_ = nullptr;
    }

    ConversionContext* ctx_;
    TIFF* tif_ = nullptr;
    Page page_;
    uint8_t* buffer_ = nullptr;
    uint64_t frameBytes_ = 0;
};

}  // namespace
}  // namespace zan

extern "C" ZAN_API int zanTIFFToFrameBuffer(ConversionContext* ctx, uint32_t* directConversion) {
    using namespace zan;
    if (!ctx) return 0;
    // The codec object of a job that writes pages is no page to decode.
    if (RefuseWhileWriting(ctx)) return 0;
    uint32_t unused = 0;
    FrameDecode decode(ctx);
    return decode.Run(directConversion ? directConversion : &unused);
}
