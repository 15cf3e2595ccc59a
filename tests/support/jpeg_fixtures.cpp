#include "support/jpeg_fixtures.h"

#include <cstdio>
#include <csetjmp>
#include <cstdlib>

#include <jpeglib.h>
#include <tiffio.h>

namespace zantest {
namespace {

struct ErrorJump {
    jpeg_error_mgr manager;
    std::jmp_buf jump;
};

void JumpOut(j_common_ptr info) { std::longjmp(reinterpret_cast<ErrorJump*>(info->err)->jump, 1); }

// Bytes libjpeg wrote to memory, taken over.
Bytes TakeMemory(unsigned char*& data, unsigned long size) {
    Bytes bytes(data, data + size);
    std::free(data);
    data = nullptr;
    return bytes;
}

}  // namespace

uint8_t JpegSourceSample(uint32_t x, uint32_t y, int component) {
    return static_cast<uint8_t>((x * 3 + y * 2 + component * 60 + (x * y) % 7) & 0xFF);
}

Bytes MakeJpegTiff(const JpegPageLayout& layout) {
    jpeg_compress_struct c{};
    jpeg_error_mgr errors{};
    c.err = jpeg_std_error(&errors);
    jpeg_create_compress(&c);
    c.image_width = layout.width;
    c.input_components = layout.components;
    c.in_color_space = layout.components == 1 ? JCS_GRAYSCALE : JCS_RGB;
    jpeg_set_defaults(&c);
    if (layout.components == 3) jpeg_set_colorspace(&c, layout.rgb ? JCS_RGB : JCS_YCbCr);
    jpeg_set_quality(&c, 90, TRUE);
    c.comp_info[0].h_samp_factor = layout.components == 1 ? 1 : layout.h;
    c.comp_info[0].v_samp_factor = layout.components == 1 ? 1 : layout.v;
    c.restart_interval = static_cast<unsigned>(layout.restartInterval);
    c.image_height = layout.rowsPerStrip;  // for the tables; each strip sets its own
    unsigned char* memory = nullptr;
    unsigned long size = 0;
    Bytes tables;
    if (layout.tables) {
        jpeg_mem_dest(&c, &memory, &size);
        jpeg_write_tables(&c);
        tables = TakeMemory(memory, size);
    }
    std::vector<Bytes> strips;
    for (uint32_t top = 0; top < layout.height; top += layout.rowsPerStrip) {
        const uint32_t rows = std::min(layout.rowsPerStrip, layout.height - top);
        c.image_height = rows;
        jpeg_mem_dest(&c, &memory, &size);
        jpeg_start_compress(&c, layout.tables && !layout.wholeStrips ? FALSE : TRUE);
        Bytes row(static_cast<size_t>(layout.width) * layout.components);
        for (uint32_t y = top; y < top + rows; ++y) {
            for (uint32_t x = 0; x < layout.width; ++x)
                for (int k = 0; k < layout.components; ++k) row[x * layout.components + k] = JpegSourceSample(x, y, k);
            JSAMPROW pointer = row.data();
            jpeg_write_scanlines(&c, &pointer, 1);
        }
        jpeg_finish_compress(&c);
        strips.push_back(TakeMemory(memory, size));
    }
    jpeg_destroy_compress(&c);

    TempFile file;
    TIFF* tif = TIFFOpen(file.c_str(), "w");
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, layout.width);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, layout.height);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, layout.components);
    TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_JPEG);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC,
                 layout.components == 1 ? PHOTOMETRIC_MINISBLACK : layout.rgb ? PHOTOMETRIC_RGB : PHOTOMETRIC_YCBCR);
    if (layout.components == 3 && !layout.rgb) TIFFSetField(tif, TIFFTAG_YCBCRSUBSAMPLING, layout.h, layout.v);
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, layout.rowsPerStrip);
    if (!tables.empty()) TIFFSetField(tif, TIFFTAG_JPEGTABLES, static_cast<uint32_t>(tables.size()), tables.data());
    for (uint32_t s = 0; s < strips.size(); ++s)
        TIFFWriteRawStrip(tif, s, strips[s].data(), static_cast<tmsize_t>(strips[s].size()));
    TIFFClose(tif);
    return ReadFileBytes(file.path());
}

Bytes MakeJpeg(const JpegStreamLayout& layout) {
    const JpegPageLayout& page = layout.page;
    jpeg_compress_struct c{};
    jpeg_error_mgr errors{};
    c.err = jpeg_std_error(&errors);
    jpeg_create_compress(&c);
    c.image_width = page.width;
    c.image_height = page.height;
    c.input_components = page.components;
    c.in_color_space = page.components == 1 ? JCS_GRAYSCALE : page.components == 4 ? JCS_CMYK : JCS_RGB;
    jpeg_set_defaults(&c);
    if (page.components == 3) jpeg_set_colorspace(&c, page.rgb ? JCS_RGB : JCS_YCbCr);
    jpeg_set_quality(&c, 90, TRUE);
    c.comp_info[0].h_samp_factor = page.h;
    c.comp_info[0].v_samp_factor = page.v;
    if (page.components >= 3) {
        c.comp_info[1].h_samp_factor = layout.cbH;
        c.comp_info[1].v_samp_factor = layout.cbV;
        c.comp_info[2].h_samp_factor = layout.crH;
        c.comp_info[2].v_samp_factor = layout.crV;
    }
    if (layout.densityUnit) {
        c.write_JFIF_header = TRUE;
        c.density_unit = static_cast<UINT8>(layout.densityUnit);
        c.X_density = c.Y_density = static_cast<UINT16>(layout.density);
    }
    unsigned char* memory = nullptr;
    unsigned long size = 0;
    jpeg_mem_dest(&c, &memory, &size);
    jpeg_start_compress(&c, TRUE);
    Bytes row(static_cast<size_t>(page.width) * page.components);
    for (uint32_t y = 0; y < page.height; ++y) {
        for (uint32_t x = 0; x < page.width; ++x)
            for (int k = 0; k < page.components; ++k) row[x * page.components + k] = JpegSourceSample(x, y, k);
        JSAMPROW pointer = row.data();
        jpeg_write_scanlines(&c, &pointer, 1);
    }
    jpeg_finish_compress(&c);
    jpeg_destroy_compress(&c);
    return TakeMemory(memory, size);
}

void SetFrameSampling(Bytes& jpeg, int component, int h, int v) {
    // SOF0: FF C0, length, precision, height, width, count, then three bytes
    // a component: id, sampling (h << 4 | v), table.
    for (size_t at = 2; at + 4 < jpeg.size(); ++at)
        if (jpeg[at] == 0xFF && jpeg[at + 1] == 0xC0) {
            const size_t sampling = at + 11 + 3 * static_cast<size_t>(component);
            if (sampling < jpeg.size()) jpeg[sampling] = static_cast<uint8_t>(h << 4 | v);
            return;
        }
}

DecodedJpeg DecodeJpeg(const Bytes& jpeg, bool rgbComponents, bool fancyUpsampling) {
    DecodedJpeg decoded;
    jpeg_decompress_struct d{};
    ErrorJump errors{};
    d.err = jpeg_std_error(&errors.manager);
    errors.manager.error_exit = JumpOut;
    errors.manager.output_message = [](j_common_ptr) {};
    if (setjmp(errors.jump)) {
        jpeg_destroy_decompress(&d);
        return {};
    }
    jpeg_create_decompress(&d);
    jpeg_mem_src(&d, jpeg.data(), static_cast<unsigned long>(jpeg.size()));
    jpeg_read_header(&d, TRUE);
    d.dct_method = JDCT_ISLOW;
    d.do_fancy_upsampling = fancyUpsampling ? TRUE : FALSE;
    if (rgbComponents && d.num_components == 3) d.jpeg_color_space = JCS_RGB;
    d.out_color_space = d.num_components == 1 ? JCS_GRAYSCALE : JCS_RGB;
    jpeg_start_decompress(&d);
    decoded.width = d.output_width;
    decoded.height = d.output_height;
    decoded.components = d.output_components;
    decoded.pixels.resize(static_cast<size_t>(d.output_width) * d.output_height * d.output_components);
    while (d.output_scanline < d.output_height) {
        JSAMPROW row = decoded.pixels.data() + static_cast<size_t>(d.output_scanline) * d.output_width * d.output_components;
        jpeg_read_scanlines(&d, &row, 1);
    }
    jpeg_finish_decompress(&d);
    jpeg_destroy_decompress(&d);
    return decoded;
}

DecodedJpeg DecodeJpegStrips(const Bytes& tiff) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    const TIFFErrorHandler e = TIFFSetErrorHandler(nullptr), w = TIFFSetWarningHandler(nullptr);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    DecodedJpeg page;
    uint32_t count = 0;
    uint8_t* tables = nullptr;
    uint16_t photometric = 0;
    if (tif) TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric);
    if (tif && TIFFGetField(tif, TIFFTAG_JPEGTABLES, &count, &tables) && count >= 4) {
        const Bytes head(tables, tables + count - 2);  // without the tables' EOI
        for (uint32_t s = 0; s < TIFFNumberOfStrips(tif); ++s) {
            Bytes strip(static_cast<size_t>(TIFFGetStrileByteCount(tif, s)));
            if (strip.size() < 2 || TIFFReadRawStrip(tif, s, strip.data(), static_cast<tmsize_t>(strip.size())) < 0)
                return {};
            Bytes whole = head;
            whole.insert(whole.end(), strip.begin() + 2, strip.end());  // without the strip's SOI
            const DecodedJpeg part = DecodeJpeg(whole, photometric == PHOTOMETRIC_RGB);
            if (part.pixels.empty()) return {};
            page.width = part.width;
            page.components = part.components;
            page.height += part.height;
            page.pixels.insert(page.pixels.end(), part.pixels.begin(), part.pixels.end());
        }
    }
    if (tif) TIFFClose(tif);
    TIFFSetErrorHandler(e);
    TIFFSetWarningHandler(w);
    return page;
}

}  // namespace zantest
