// zanGetImageInfo: the description of a JPEG source, from libjpeg's header
// reader.

#include <algorithm>
#include <csetjmp>
#include <cstdio>
#include <cstring>

#include <jpeglib.h>

#include "pivlo/pivlo.h"

namespace {

// libjpeg's errors end the read through a jump, with libjpeg's text kept.
struct Errors {
    jpeg_error_mgr manager;
    std::jmp_buf jump;
    char text[JMSG_LENGTH_MAX];
};

void JumpOut(j_common_ptr info) {
    auto* errors = reinterpret_cast<Errors*>(info->err);
    (*info->err->format_message)(info, errors->text);
    std::longjmp(errors->jump, 1);
}

void Silent(j_common_ptr) {}

// A libjpeg source over the host's read callback (a stream source with a
// seek callback, read from its start).
struct CallbackSource {
    jpeg_source_mgr manager;
    ConversionContext* ctx;
    JOCTET buffer[4096];
};

void InitSource(j_decompress_ptr) {}
void TermSource(j_decompress_ptr) {}

boolean FillInput(j_decompress_ptr info) {
    auto* source = reinterpret_cast<CallbackSource*>(info->src);
    const int32_t got = source->ctx->sourceReadProc(source->buffer, sizeof source->buffer, source->ctx->sourceUserData);
    if (got <= 0) {
        // The stream ends: an end marker lets libjpeg finish with a warning.
        source->buffer[0] = 0xFF;
        source->buffer[1] = JPEG_EOI;
        source->manager.bytes_in_buffer = 2;
    } else {
        source->manager.bytes_in_buffer = static_cast<size_t>(got);
    }
    source->manager.next_input_byte = source->buffer;
    return TRUE;
}

void SkipInput(j_decompress_ptr info, long count) {
    jpeg_source_mgr* manager = info->src;
    while (count > 0) {
        if (manager->bytes_in_buffer == 0) FillInput(info);
        const size_t step = std::min(static_cast<size_t>(count), manager->bytes_in_buffer);
        manager->next_input_byte += step;
        manager->bytes_in_buffer -= step;
        count -= static_cast<long>(step);
    }
}

// Resolution in pixels per inch from the JFIF density: centimetres
// converted, no unit (or no JFIF segment) 0.
float PixelsPerInch(const jpeg_decompress_struct& d, UINT16 density) {
    if (!d.saw_JFIF_marker) return 0.0f;
    switch (d.density_unit) {
    case 1: return static_cast<float>(density);
    case 2: return static_cast<float>(density) * 2.54f;
    default: return 0.0f;
    }
}

// The host's image-type code of the stream's colours: grey, RGB (an Adobe
// transform 0, or components named R, G, B), YCbCr, CMYK.
uint32_t ImageTypeOf(J_COLOR_SPACE space) {
    switch (space) {
    case JCS_GRAYSCALE: return ZAN_IMAGE_GREY_BLACK_IS_ZERO;
    case JCS_RGB: return ZAN_IMAGE_RGB;
    case JCS_YCbCr: return ZAN_IMAGE_YCBCR;
    case JCS_CMYK: case JCS_YCCK: return ZAN_IMAGE_CMYK;
    default: return ZAN_IMAGE_SEPARATED;
    }
}

}  // namespace

extern "C" int zanGetImageInfo(ConversionContext* ctx) {
    if (!ctx) return 0;
    jpeg_decompress_struct d{};
    Errors errors{};
    d.err = jpeg_std_error(&errors.manager);
    errors.manager.error_exit = JumpOut;
    errors.manager.output_message = Silent;
    CallbackSource callbacks{};
    if (setjmp(errors.jump)) {
        jpeg_destroy_decompress(&d);
        zanErrorV(ctx, "Unable to read the JPEG header: %s", errors.text);
        return 0;
    }
    jpeg_create_decompress(&d);
    switch (ctx->sourceKind) {
    case ZAN_SOURCE_MEMORY:
        if (!ctx->sourceMemory || ctx->sourceMemorySize == 0) {
            jpeg_destroy_decompress(&d);
            zanError(ctx, "The JPEG source holds no data.");
            return 0;
        }
        jpeg_mem_src(&d, static_cast<const unsigned char*>(ctx->sourceMemory), ctx->sourceMemorySize);
        break;
    case ZAN_SOURCE_STREAM:
        // Read from the start, to which the wrapper goes back for the data.
        if (!ctx->sourceReadProc || !ctx->sourceSeekProc ||
            ctx->sourceSeekProc(0, SEEK_SET, ctx->sourceUserData) != 0) {
            jpeg_destroy_decompress(&d);
            zanError(ctx, "A JPEG stream source needs read and seek functions.");
            return 0;
        }
        callbacks.ctx = ctx;
        callbacks.manager.init_source = InitSource;
        callbacks.manager.fill_input_buffer = FillInput;
        callbacks.manager.skip_input_data = SkipInput;
        callbacks.manager.resync_to_restart = jpeg_resync_to_restart;
        callbacks.manager.term_source = TermSource;
        d.src = &callbacks.manager;
        break;
    default:
        if (!ctx->sourceFp || std::fseek(ctx->sourceFp, static_cast<long>(ctx->sourceBaseOffset), SEEK_SET) != 0) {
            jpeg_destroy_decompress(&d);
            zanError(ctx, "The JPEG source file cannot be read.");
            return 0;
        }
        jpeg_stdio_src(&d, ctx->sourceFp);
        break;
    }
    jpeg_save_markers(&d, JPEG_APP0 + 14, 0);  // Adobe's transform is read either way
    jpeg_read_header(&d, TRUE);
    ctx->imageWidth = d.image_width;
    ctx->imageHeight = d.image_height;
    ctx->componentCount = static_cast<uint32_t>(d.num_components);
    ctx->bitsPerSample = static_cast<uint32_t>(d.data_precision);
    for (int c = 0; c < 3; ++c) {
        ctx->horizontalSampling[c] = c < d.num_components ? d.comp_info[c].h_samp_factor : 0;
        ctx->verticalSampling[c] = c < d.num_components ? d.comp_info[c].v_samp_factor : 0;
    }
    ctx->xResolution = PixelsPerInch(d, d.X_density);
    ctx->yResolution = PixelsPerInch(d, d.Y_density);
    ctx->imageType = ImageTypeOf(d.jpeg_color_space);
    jpeg_destroy_decompress(&d);
    return 1;
}

extern "C" uint32_t zanGetColorSpaceIfConvertedToRaw(ConversionContext* ctx) {
    if (!ctx) return ZAN_COLORSPACE_RGB;
    switch (ctx->colorSpace) {
    case ZAN_COLORSPACE_BILEVEL:
    case ZAN_COLORSPACE_GREY: return ZAN_COLORSPACE_GREY;
    case ZAN_COLORSPACE_CMYK: return ZAN_COLORSPACE_CMYK;
    default: return ZAN_COLORSPACE_RGB;
    }
}
