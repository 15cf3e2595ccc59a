// What the reading tests share: a reading job over a TIFF held in memory (or
// another source kind), fixture pages and libtiff's reference decodes.
#pragma once

#include <gtest/gtest.h>

#include <tiffio.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "support/allocation_sweep.h"
#include "support/corpus.h"
#include "support/jpeg_fixtures.h"
#include "support/memory_stream.h"
#include "support/test_host.h"
#include "support/tiff_builder.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace zantest {

enum class Source { Memory, File, Callbacks, StreamBuffer };

class ReadJob {
public:
    explicit ReadJob(const Bytes& tiff, Source source = Source::Memory) : bytes_(tiff) {
        if (source == Source::Memory) {
            host_->sourceKind = ZAN_SOURCE_MEMORY;
            host_->sourceMemory = bytes_.data();
            host_->sourceMemorySize = static_cast<uint32_t>(bytes_.size());
        } else if (source == Source::File) {
            WriteFileBytes(file_.path(), bytes_);
            fp_ = std::fopen(file_.c_str(), "rb");
            host_->sourceKind = ZAN_SOURCE_FILE;
            host_->sourceFp = fp_;
        } else {
            stream_.data = bytes_;
            UseStreamSource(host_.ctx(), &stream_, source == Source::Callbacks);
        }
    }
    ~ReadJob() {
        host_.EndJob();
        if (fp_) std::fclose(fp_);
    }

    int GetInfo() { return zanTIFFGetInfo(host_.ctx()); }

    // Every row of the page, or fewer when a read fails.
    std::vector<Bytes> ReadAll() {
        std::vector<Bytes> rows;
        Bytes line(1 << 20);
        for (uint32_t y = 0; y == 0 || y < host_->imageHeight; ++y) {
            const uint32_t n = zanTIFFReadNextScanLine(host_.ctx(), line.data(), static_cast<uint32_t>(line.size()));
            if (n == 0) break;
            rows.emplace_back(line.begin(), line.begin() + n);
        }
        return rows;
    }

    // Whether a host or a codec message told of a failure.
    bool Reported() const { return !host_.Errors().empty() || !host_.codecErrors.empty(); }

    TestHost& host() { return host_; }
    ConversionContext* operator->() { return host_.ctx(); }
    const std::string& path() const { return file_.path(); }

private:
    Bytes bytes_;
    TempFile file_;
    FILE* fp_ = nullptr;
    MemoryStream stream_;
    TestHost host_;
};

inline PageLayout Page(uint32_t width, uint32_t height, uint16_t samples = 1,
                     uint16_t photometric = PHOTOMETRIC_MINISBLACK, uint16_t bits = 8,
                     uint16_t compression = COMPRESSION_NONE, uint16_t planar = PLANARCONFIG_CONTIG,
                     uint32_t rowsPerStrip = 4) {
    PageLayout p;
    p.width = width;
    p.height = height;
    p.samplesPerPixel = samples;
    p.photometric = photometric;
    p.bitsPerSample = bits;
    p.compression = compression;
    p.planar = planar;
    p.rowsPerStrip = rowsPerStrip;
    return p;
}

inline PageLayout Tiled(PageLayout p, uint32_t size = 16) {
    p.tileWidth = p.tileHeight = size;
    return p;
}

inline Bytes OnePage(const PageLayout& page) {
    FileLayout layout;
    layout.pages[0] = page;
    return MakeTiff(layout);
}

// A Group 4 page of `photometric`, in one strip unless told otherwise.
inline Bytes G4Page(uint32_t width, uint32_t height, uint16_t photometric = PHOTOMETRIC_MINISWHITE,
                    uint32_t rowsPerStrip = 0, uint32_t tile = 0, uint16_t fillOrder = 0) {
    PageLayout p = Tiled(Page(width, height, 1, photometric, 1, COMPRESSION_CCITTFAX4, PLANARCONFIG_CONTIG,
                            rowsPerStrip ? rowsPerStrip : height), tile);
    p.fillOrder = fillOrder;
    return OnePage(p);
}

// A Deflate page of `width` x `height` pixels whose single strip holds
// `stripBytes` bytes of no meaning.
inline Bytes HugePage(uint32_t width, uint32_t height, uint16_t samples, uint16_t bits, uint32_t stripBytes) {
    BuiltPage page;
    page.entries = {LongEntry(256, {width}), LongEntry(257, {height}),
                    ShortEntry(258, std::vector<uint16_t>(samples, bits)), ShortEntry(259, {COMPRESSION_ADOBE_DEFLATE}),
                    ShortEntry(262, {PHOTOMETRIC_MINISBLACK}), ShortEntry(277, {samples}), LongEntry(278, {height})};
    page.strips = {Bytes(stripBytes, 0x55)};
    return BuildTiff({page});
}

// An uncompressed grey page of `width` x `height` in one strip of 64 bytes
// at offset 8, without StripByteCounts: libtiff makes the strip's byte count
// up from the image's size.
inline Bytes UncountedPage(uint32_t width, uint32_t height) {
    BuiltPage page;
    page.entries = {LongEntry(256, {width}), LongEntry(257, {height}), ShortEntry(258, {8}),
                    ShortEntry(259, {COMPRESSION_NONE}), ShortEntry(262, {PHOTOMETRIC_MINISBLACK}),
                    LongEntry(273, {8}), ShortEntry(277, {1}), LongEntry(278, {height})};
    page.strips = {Bytes(64, 0x55)};
    page.stripTags = false;
    return BuildTiff({page});
}

// Row y of a fixture page as the reader delivers it: 1-bit rows packed,
// narrower samples widened to bytes (2 bits times 85, 4 bits times 17),
// 16-bit ones whole in host order when 16 bits are asked for and else by
// their high byte, separate planes one after another.
inline Bytes WantRow(const PageLayout& p, uint32_t y, uint32_t outputBits = 8) {
    const uint32_t bits = p.bitsPerSample, samples = p.samplesPerPixel;
    Bytes row(bits == 1 ? (p.width + 7) / 8 : 0);
    if (bits == 1) {
        for (uint32_t x = 0; x < p.width; ++x) row[x / 8] |= static_cast<uint8_t>(PixelValue(0, x, y, 0, 1) << (7 - x % 8));
        return row;
    }
    const bool planes = p.planar == PLANARCONFIG_SEPARATE;
    for (uint32_t i = 0; i < p.width * samples; ++i) {
        const uint32_t v = PixelValue(0, planes ? i % p.width : i / samples, y, planes ? i / p.width : i % samples, bits);
        if (bits == 16 && outputBits == 16) {
            const auto v16 = static_cast<uint16_t>(v);
            row.resize(row.size() + 2);
            std::memcpy(&row[row.size() - 2], &v16, 2);
        } else {
            row.push_back(static_cast<uint8_t>(bits == 16 ? v >> 8 : v * (255 / ((1u << bits) - 1))));
        }
    }
    return row;
}

// libtiff's RGBA decode of the first page of `tiff`, packed as the host's
// frame of `format` (8 RGB, 13/14 grey, 11/12 bilevel): what the RGBA way
// must deliver (empty when libtiff cannot decode it). Grey and bilevel
// frames of min-is-white pages hold min-is-white values.
inline Bytes RgbaFrame(const Bytes& tiff, uint32_t format) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    if (!tif) return {};
    uint32_t w = 0, h = 0;
    TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &w);
    TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &h);
    std::vector<uint32_t> raster(static_cast<size_t>(w) * h);
    const bool decoded = TIFFReadRGBAImageOriented(tif, w, h, raster.data(), ORIENTATION_TOPLEFT, 0);
    TIFFClose(tif);
    const uint32_t stride = (w + 7) / 8;
    const bool minIsWhite = format == 11 || format == 13;
    Bytes frame;
    if (decoded && (format == 11 || format == 12)) frame.assign(stride * h, 0);
    for (size_t i = 0; decoded && i < raster.size(); ++i) {
        const uint32_t v = raster[i], x = static_cast<uint32_t>(i % w);
        const auto r = static_cast<uint8_t>(TIFFGetR(v));
        if (format == 8) frame.insert(frame.end(), {r, static_cast<uint8_t>(TIFFGetG(v)), static_cast<uint8_t>(TIFFGetB(v))});
        else if (format == 13 || format == 14) frame.push_back(minIsWhite ? 255 - r : r);
        else if ((r >= 128) != minIsWhite) frame[stride * (i / w) + x / 8] |= static_cast<uint8_t>(0x80 >> (x % 8));
    }
    return frame;
}

// The first strip (or tile) of the first page as stored.
inline Bytes RawChunk(const Bytes& tiff) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    const auto offset = static_cast<std::ptrdiff_t>(TIFFGetStrileOffset(tif, 0));
    const auto size = static_cast<std::ptrdiff_t>(TIFFGetStrileByteCount(tif, 0));
    TIFFClose(tif);
    return Bytes(tiff.begin() + offset, tiff.begin() + offset + size);
}

}  // namespace zantest
