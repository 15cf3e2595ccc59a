// Frames through the RGBA reader: 8-bit RGBA from libtiff, 16-bit RGBA of
// this layer's own (libtiff's reader has 8 bits only), and the routines that
// turn a bottom-up RGBA raster into a top-down frame of RGB, grey or
// bilevel pixels in place.

#include <algorithm>
#include <cstring>

#include "adapter.h"
#include "osttiff/osttiff.h"

namespace {

using osttiff::Adapter;
using osttiff::AdapterOfTiff;

constexpr int kFlipHorizontally = 1, kFlipVertically = 2;

// The flips that show a page of `orientation` top row first, left column
// first (libtiff's rule for its RGBA reader, which cannot transpose: the
// transposed orientations are taken as their flips).
int FlipsForTopLeft(uint16_t orientation) {
    switch (orientation) {
    case ORIENTATION_TOPRIGHT: case ORIENTATION_RIGHTTOP: return kFlipHorizontally;
    case ORIENTATION_BOTRIGHT: case ORIENTATION_RIGHTBOT: return kFlipHorizontally | kFlipVertically;
    case ORIENTATION_BOTLEFT: case ORIENTATION_LEFTBOT: return kFlipVertically;
    default: return 0;
    }
}

// Swaps the rows of a raster top to bottom, in place.
void FlipRows(uint8_t* raster, uint64_t rowBytes, uint32_t rows) {
    for (uint32_t top = 0, bottom = rows ? rows - 1 : 0; top < bottom; ++top, --bottom)
        std::swap_ranges(raster + top * rowBytes, raster + (top + 1) * rowBytes, raster + bottom * rowBytes);
}

uint64_t Pixels(uint32_t width, uint32_t height) { return uint64_t{width} * height; }

// ---- 16-bit RGBA ----

// A 16-bit page read block by block (strips or tiles, all planes) into
// 16-bit RGBA pixels, bottom row first as libtiff's 8-bit reader delivers.
class Rgba16Reader {
public:
    Rgba16Reader(TIFF* tif, uint16_t* raster, uint32_t width, uint32_t height)
        : tif_(tif), raster_(raster), width_(width), height_(height) {}
    ~Rgba16Reader() {
        for (void* block : blocks_) PivloFree(tif_, block);
    }

    int Read(int stopOnError) {
        uint16_t bits = 0, photometric = 0, orientation = ORIENTATION_TOPLEFT, extraCount = 0;
        uint16_t* extra = nullptr;
        TIFFGetFieldDefaulted(tif_, TIFFTAG_BITSPERSAMPLE, &bits);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_SAMPLESPERPIXEL, &samples_);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_PLANARCONFIG, &planar_);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_ORIENTATION, &orientation);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_EXTRASAMPLES, &extraCount, &extra);
        if (!TIFFGetField(tif_, TIFFTAG_PHOTOMETRIC, &photometric)) return Refuse("Missing PhotometricInterpretation");
        if (bits != 16) return Refuse("Sorry, can not handle images with %d-bit samples as 16-bit RGBA", bits);
        photometric_ = photometric;
        flips_ = FlipsForTopLeft(orientation);
        switch (photometric) {
        case PHOTOMETRIC_MINISBLACK: case PHOTOMETRIC_MINISWHITE: colours_ = 1; break;
        case PHOTOMETRIC_RGB: colours_ = 3; break;
        case PHOTOMETRIC_PALETTE:
            colours_ = 1;
            if (!TIFFGetField(tif_, TIFFTAG_COLORMAP, &map_[0], &map_[1], &map_[2]))
                return Refuse("Missing required \"Colormap\" tag");
            break;
        default: return Refuse("Sorry, can not handle images with photometric %d as 16-bit RGBA", photometric);
        }
        if (samples_ < colours_) return Refuse("Sorry, can not handle images with %d samples", samples_);
        alpha_ = extraCount > 0 && extra && extra[0] != EXTRASAMPLE_UNSPECIFIED && samples_ > colours_;
        return TIFFIsTiled(tif_) ? ReadTiles(stopOnError) : ReadStrips(stopOnError);
    }

private:
    // The reason, worded as libtiff's RGBA reader words it.
    int Refuse(const char* reason) {
        TIFFErrorExtR(tif_, TIFFFileName(tif_), "%s", reason);
        return 0;
    }
    int Refuse(const char* format, int value) {
        TIFFErrorExtR(tif_, TIFFFileName(tif_), format, value);
        return 0;
    }

    bool Separate() const { return planar_ == PLANARCONFIG_SEPARATE && samples_ > 1; }
    uint16_t Planes() const { return Separate() ? std::min<uint16_t>(samples_, 4) : 1; }

    bool TakeBlocks(tmsize_t size) {
        if (size <= 0 || static_cast<uint64_t>(size) > 0x7FFFFFFFu) return false;
        blockSize_ = size;
        for (uint16_t p = 0; p < Planes(); ++p)
            if (!(blocks_[p] = PivloMalloc(tif_, static_cast<uint32_t>(size)))) return false;
        return true;
    }

    // Sample s of pixel (x, y) of a block whose rows are `rowBytes` apart.
    uint16_t Sample(uint32_t x, uint32_t y, uint16_t s, uint64_t rowBytes) const {
        const uint8_t* block = static_cast<const uint8_t*>(blocks_[Separate() ? s : 0]);
        const uint64_t index = Separate() ? x : uint64_t{x} * samples_ + s;
        uint16_t v;
        std::memcpy(&v, block + y * rowBytes + index * 2, 2);
        return v;
    }

    // Stores the pixel of the page at (x, y) of the block whose top left
    // pixel is (left, top).
    void Place(uint32_t left, uint32_t top, uint32_t x, uint32_t y, uint64_t rowBytes) {
        const uint32_t px = left + x, py = top + y;
        if (px >= width_ || py >= height_) return;
        uint16_t rgba[4] = {0, 0, 0, 0xFFFF};
        if (photometric_ == PHOTOMETRIC_PALETTE) {
            const uint16_t index = Sample(x, y, 0, rowBytes);
            for (int c = 0; c < 3; ++c) rgba[c] = map_[c][index];
        } else if (colours_ == 1) {
            rgba[0] = rgba[1] = rgba[2] = Sample(x, y, 0, rowBytes);
            if (photometric_ == PHOTOMETRIC_MINISWHITE) rgba[0] = rgba[1] = rgba[2] = 0xFFFF - rgba[0];
        } else {
            for (uint16_t c = 0; c < 3; ++c) rgba[c] = Sample(x, y, c, rowBytes);
        }
        if (alpha_) rgba[3] = Sample(x, y, colours_, rowBytes);
        // Display position, then bottom row first.
        const uint32_t dx = flips_ & kFlipHorizontally ? width_ - 1 - px : px;
        const uint32_t dy = flips_ & kFlipVertically ? height_ - 1 - py : py;
        std::memcpy(raster_ + (uint64_t{height_ - 1 - dy} * width_ + dx) * 4, rgba, sizeof rgba);
    }

    int ReadStrips(int stopOnError) {
        uint32_t rowsPerStrip = 0;
        TIFFGetFieldDefaulted(tif_, TIFFTAG_ROWSPERSTRIP, &rowsPerStrip);
        rowsPerStrip = std::max<uint32_t>(1, std::min(rowsPerStrip, height_));
        const tmsize_t row = TIFFScanlineSize(tif_);
        if (row <= 0 || !TakeBlocks(TIFFStripSize(tif_))) return Refuse("No space for strip buffer");
        for (uint32_t top = 0; top < height_; top += rowsPerStrip) {
            const uint32_t rows = std::min(rowsPerStrip, height_ - top);
            bool read = true;
            for (uint16_t p = 0; p < Planes() && read; ++p)
                read = TIFFReadEncodedStrip(tif_, TIFFComputeStrip(tif_, top, p), blocks_[p], blockSize_) >= 0;
            if (!read) {
                if (stopOnError) return 0;
                continue;
            }
            for (uint32_t y = 0; y < rows; ++y)
                for (uint32_t x = 0; x < width_; ++x) Place(0, top, x, y, static_cast<uint64_t>(row));
        }
        return 1;
    }

    int ReadTiles(int stopOnError) {
        uint32_t tileWidth = 0, tileHeight = 0;
        TIFFGetField(tif_, TIFFTAG_TILEWIDTH, &tileWidth);
        TIFFGetField(tif_, TIFFTAG_TILELENGTH, &tileHeight);
        const tmsize_t row = TIFFTileRowSize(tif_);
        if (tileWidth == 0 || tileHeight == 0 || row <= 0 || !TakeBlocks(TIFFTileSize(tif_)))
            return Refuse("No space for tile buffer");
        for (uint32_t top = 0; top < height_; top += tileHeight)
            for (uint32_t left = 0; left < width_; left += tileWidth) {
                bool read = true;
                for (uint16_t p = 0; p < Planes() && read; ++p)
                    read = TIFFReadTile(tif_, blocks_[p], left, top, 0, p) >= 0;
                if (!read) {
                    if (stopOnError) return 0;
                    continue;
                }
                for (uint32_t y = 0; y < tileHeight; ++y)
                    for (uint32_t x = 0; x < tileWidth; ++x) Place(left, top, x, y, static_cast<uint64_t>(row));
            }
        return 1;
    }

    TIFF* tif_;
    uint16_t* raster_;
    uint32_t width_, height_;
    uint16_t samples_ = 1, planar_ = PLANARCONFIG_CONTIG, photometric_ = 0, colours_ = 1;
    bool alpha_ = false;
    int flips_ = 0;
    uint16_t* map_[3] = {nullptr, nullptr, nullptr};
    void* blocks_[4] = {nullptr, nullptr, nullptr, nullptr};
    tmsize_t blockSize_ = 0;
};

// ---- frames written as the RGBA reader goes ----

// libtiff's RGBA reader hands the samples of every run of pixels to a put
// routine. For the commonest pages (8-bit RGB, 8-bit grey) the routines
// below write the frame's own pixels straight away, top row first, instead
// of RGBA words that a second pass would pack: the raster of W x H words
// becomes W x H x 3 (or x 1) bytes at its start.
struct PackedImage {
    TIFFRGBAImage rgba;  // first: libtiff hands the put routine this
    uint32_t* words;     // the raster libtiff addresses, in 32-bit words
    uint8_t* bytes;      // the same raster, where the frame's pixels go
};

uint8_t* FrameAt(TIFFRGBAImage* img, uint32_t* cp, unsigned bytesPerPixel) {
    auto* packed = reinterpret_cast<PackedImage*>(img);
    return packed->bytes + static_cast<uint64_t>(cp - packed->words) * bytesPerPixel;
}

void PutRgb8(TIFFRGBAImage* img, uint32_t* cp, uint32_t, uint32_t, uint32_t w, uint32_t h, int32_t fromskew,
             int32_t toskew, unsigned char* pp) {
    const int samples = img->samplesperpixel;
    fromskew *= samples;
    for (; h > 0; --h) {
        uint8_t* out = FrameAt(img, cp, 3);
        if (samples == 3) {
            std::memcpy(out, pp, uint64_t{w} * 3);  // the run is the frame's row already
            pp += uint64_t{w} * 3;
        } else {
            for (uint32_t i = 0; i < w; ++i, pp += samples, out += 3) {
                out[0] = pp[0];
                out[1] = pp[1];
                out[2] = pp[2];
            }
        }
        cp += w;
        cp += toskew;
        pp += fromskew;
    }
}

// Grey samples as stored: a min-is-white page gives a min-is-white frame.
void PutGrey8(TIFFRGBAImage* img, uint32_t* cp, uint32_t, uint32_t, uint32_t w, uint32_t h, int32_t fromskew,
              int32_t toskew, unsigned char* pp) {
    const int samples = img->samplesperpixel;
    fromskew *= samples;
    for (; h > 0; --h) {
        uint8_t* out = FrameAt(img, cp, 1);
        if (samples == 1) {
            std::memcpy(out, pp, w);
            pp += w;
        } else {
            for (uint32_t i = 0; i < w; ++i, pp += samples) out[i] = pp[0];
        }
        cp += w;
        cp += toskew;
        pp += fromskew;
    }
}

// The put routine that writes frame `packing` for this page, if there is
// one: the page's samples must be what the frame holds.
tileContigRoutine FramePut(const TIFFRGBAImage& img, int packing) {
    // libtiff mirrors rows in a pass of its own over the raster's words,
    // which the frame's bytes are not.
    if (!img.isContig || img.bitspersample != 8 || (FlipsForTopLeft(img.orientation) & kFlipHorizontally))
        return nullptr;
    if (packing == TIFF_FRAME_RGB8 && img.photometric == PHOTOMETRIC_RGB && img.alpha == 0 &&
        img.samplesperpixel >= 3)
        return PutRgb8;
    if (packing == TIFF_FRAME_GREY8 &&
        (img.photometric == PHOTOMETRIC_MINISBLACK || img.photometric == PHOTOMETRIC_MINISWHITE))
        return PutGrey8;
    return nullptr;
}

int ReadRgba8(TIFF* tif, uint32_t width, uint32_t height, uint32_t* raster, int stopOnError, int packing) {
    char message[1024] = "";
    PackedImage image{};
    if (!TIFFRGBAImageOK(tif, message) || !TIFFRGBAImageBegin(&image.rgba, tif, stopOnError, message)) {
        TIFFErrorExtR(tif, TIFFFileName(tif), "%s", message);
        return 0;
    }
    image.words = raster;
    image.bytes = reinterpret_cast<uint8_t*>(raster);
    if (tileContigRoutine put = packing >= 0 ? FramePut(image.rgba, packing) : nullptr) {
        image.rgba.put.contig = put;
        image.rgba.req_orientation = ORIENTATION_TOPLEFT;
    }
    const int result = TIFFRGBAImageGetPivlo(&image.rgba, raster, width, height);
    TIFFRGBAImageEnd(&image.rgba);
    return result;
}

}  // namespace

extern "C" {

int TIFFSet16BitOutput(TIFF* tif) {
    Adapter* a = AdapterOfTiff(tif);
    if (!a) return 0;
    a->sixteenBitOutput = 1;
    return 1;
}

int TIFFReadRGBAImagePivlo(TIFF* tif, uint32_t width, uint32_t height, void* raster, int stopOnError) {
    const Adapter* a = AdapterOfTiff(tif);
    if (a && a->sixteenBitOutput)
        return Rgba16Reader(tif, static_cast<uint16_t*>(raster), width, height).Read(stopOnError);
    return ReadRgba8(tif, width, height, static_cast<uint32_t*>(raster), stopOnError, -1);
}

// ---- packing: bottom-up RGBA in, top-down frame out, in place ----

int zanTIFFMirrorAndConvertRGBAToRGB(void*, void* raster, uint32_t width, uint32_t height) {
    auto* bytes = static_cast<uint8_t*>(raster);
    FlipRows(bytes, uint64_t{width} * 4, height);
    const auto* words = static_cast<const uint32_t*>(raster);
    for (uint64_t i = 0, n = Pixels(width, height); i < n; ++i) {
        const uint32_t v = words[i];
        uint8_t* out = bytes + i * 3;
        out[0] = static_cast<uint8_t>(TIFFGetR(v));
        out[1] = static_cast<uint8_t>(TIFFGetG(v));
        out[2] = static_cast<uint8_t>(TIFFGetB(v));
    }
    return 1;
}

// Grey frames of min-is-white pages hold min-is-white samples, while the
// RGBA reader gives luminance: they are inverted back.
int zanTIFFMirrorAndConvertRGBAToGRAY(void*, void* raster, uint32_t width, uint32_t height, int minIsWhite) {
    auto* bytes = static_cast<uint8_t*>(raster);
    FlipRows(bytes, uint64_t{width} * 4, height);
    const auto* words = static_cast<const uint32_t*>(raster);
    const uint8_t invert = minIsWhite ? 0xFF : 0;
    for (uint64_t i = 0, n = Pixels(width, height); i < n; ++i)
        bytes[i] = static_cast<uint8_t>(TIFFGetR(words[i]) ^ invert);
    return 1;
}

// One bit a pixel, rows of whole bytes, the first pixel in the high bit: 1
// is white on a min-is-black page and black on a min-is-white one.
int zanTIFFMirrorAndConvertRGBAToBW(void*, void* raster, uint32_t width, uint32_t height, int minIsWhite) {
    auto* bytes = static_cast<uint8_t*>(raster);
    FlipRows(bytes, uint64_t{width} * 4, height);
    const auto* words = static_cast<const uint32_t*>(raster);
    const uint64_t rowBytes = (uint64_t{width} + 7) / 8;
    for (uint32_t y = 0; y < height; ++y) {
        const uint32_t* row = words + uint64_t{y} * width;
        uint8_t* out = bytes + y * rowBytes;
        // The packed row ends before the words of its own row that are still
        // to be read: it is 32 times shorter.
        for (uint64_t b = 0; b < rowBytes; ++b) {
            uint8_t packed = 0;
            for (uint32_t bit = 0; bit < 8; ++bit) {
                const uint64_t x = b * 8 + bit;
                const bool white = x < width && TIFFGetR(row[x]) >= 128;
                if (x < width && white != static_cast<bool>(minIsWhite)) packed |= static_cast<uint8_t>(0x80 >> bit);
            }
            out[b] = packed;
        }
    }
    return 1;
}

int zanTIFFMirrorRGBAW(void*, void* raster, uint32_t width, uint32_t height, int) {
    auto* bytes = static_cast<uint8_t*>(raster);
    FlipRows(bytes, uint64_t{width} * 8, height);
    auto* samples = static_cast<uint16_t*>(raster);
    for (uint64_t i = 0, n = Pixels(width, height); i < n; ++i)
        std::memmove(samples + i * 3, samples + i * 4, 6);
    return 1;
}

int zanTIFFMirrorRGBAToGRAYW(void*, void* raster, uint32_t width, uint32_t height, int minIsWhite) {
    auto* bytes = static_cast<uint8_t*>(raster);
    FlipRows(bytes, uint64_t{width} * 8, height);
    auto* samples = static_cast<uint16_t*>(raster);
    const uint16_t invert = minIsWhite ? 0xFFFF : 0;
    for (uint64_t i = 0, n = Pixels(width, height); i < n; ++i) samples[i] = samples[i * 4] ^ invert;
    return 1;
}

int TIFFReadRGBAFramePivlo(TIFF* tif, void* raster, uint32_t width, uint32_t height, int packing, int minIsWhite) {
    const bool sixteen = packing == TIFF_FRAME_RGB16 || packing == TIFF_FRAME_GREY16;
    if (sixteen) {
        if (!TIFFSet16BitOutput(tif) || !TIFFReadRGBAImagePivlo(tif, width, height, raster, 0)) return 0;
        return packing == TIFF_FRAME_RGB16 ? zanTIFFMirrorRGBAW(nullptr, raster, width, height, 0)
                                           : zanTIFFMirrorRGBAToGRAYW(nullptr, raster, width, height, minIsWhite);
    }
    // The pages the put routines above serve come out as frames at once.
    char message[1024] = "";
    TIFFRGBAImage probe;
    if (TIFFRGBAImageOK(tif, message) && TIFFRGBAImageBegin(&probe, tif, 0, message)) {
        const bool direct = FramePut(probe, packing) != nullptr;
        TIFFRGBAImageEnd(&probe);
        if (direct) return ReadRgba8(tif, width, height, static_cast<uint32_t*>(raster), 0, packing);
    }
    if (!ReadRgba8(tif, width, height, static_cast<uint32_t*>(raster), 0, -1)) return 0;
    switch (packing) {
    case TIFF_FRAME_RGB8: return zanTIFFMirrorAndConvertRGBAToRGB(nullptr, raster, width, height);
    case TIFF_FRAME_GREY8: return zanTIFFMirrorAndConvertRGBAToGRAY(nullptr, raster, width, height, minIsWhite);
    case TIFF_FRAME_BILEVEL: return zanTIFFMirrorAndConvertRGBAToBW(nullptr, raster, width, height, minIsWhite);
    default: return 0;
    }
}

}  // extern "C"
