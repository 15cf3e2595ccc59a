#include "support/tiff_fixtures.h"

#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>

namespace zantest {

TempFile::TempFile(const std::string& suffix) {
    const char* dir = std::getenv("TMPDIR");
    std::string pattern = std::string(dir && *dir ? dir : "/tmp") + "/zantiff-test-XXXXXX" + suffix;
    std::vector<char> name(pattern.begin(), pattern.end());
    name.push_back('\0');
    const int fd = mkstemps(name.data(), static_cast<int>(suffix.size()));
    if (fd < 0) throw std::runtime_error("cannot create a temporary file");
    close(fd);
    path_ = name.data();
}

TempFile::~TempFile() { std::remove(path_.c_str()); }

uint32_t PixelValue(uint32_t page, uint32_t x, uint32_t y, uint32_t sample, uint16_t bits) {
    const uint32_t v = x * 7u + y * 13u + sample * 29u + page * 31u + (x * y) % 5u;
    return bits >= 32 ? v : v & ((1u << bits) - 1u);
}

namespace {

// Packs samples of one row (or one plane row) MSB-first at `bits` per sample.
void PackRow(uint8_t* out, size_t outSize, const std::vector<uint32_t>& samples, uint16_t bits) {
    std::memset(out, 0, outSize);
    if (bits == 16) {
        for (size_t i = 0; i < samples.size(); ++i) {
            const uint16_t v = static_cast<uint16_t>(samples[i]);
            std::memcpy(out + 2 * i, &v, 2);  // native order; libtiff swaps as needed
        }
        return;
    }
    size_t bit = 0;
    for (uint32_t v : samples) {
        for (int b = bits - 1; b >= 0; --b, ++bit)
            if (v & (1u << b)) out[bit / 8] |= static_cast<uint8_t>(0x80u >> (bit % 8));
    }
}

std::vector<uint32_t> RowSamples(const PageLayout& p, uint32_t page, uint32_t y, int plane) {
    std::vector<uint32_t> samples;
    for (uint32_t x = 0; x < p.width; ++x) {
        if (plane >= 0) {
            samples.push_back(PixelValue(page, x, y, static_cast<uint32_t>(plane), p.bitsPerSample));
        } else {
            for (uint32_t s = 0; s < p.samplesPerPixel; ++s)
                samples.push_back(PixelValue(page, x, y, s, p.bitsPerSample));
        }
    }
    return samples;
}

bool SetPageTags(TIFF* tif, const PageLayout& p) {
    bool ok = TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, p.width) &&
              TIFFSetField(tif, TIFFTAG_IMAGELENGTH, p.height) &&
              TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, p.samplesPerPixel) &&
              TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, p.bitsPerSample) &&
              TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, p.photometric) &&
              TIFFSetField(tif, TIFFTAG_COMPRESSION, p.compression) &&
              TIFFSetField(tif, TIFFTAG_PLANARCONFIG, p.planar);
    if (!p.extraSamples.empty())
        ok = ok && TIFFSetField(tif, TIFFTAG_EXTRASAMPLES,
                                static_cast<uint16_t>(p.extraSamples.size()),
                                p.extraSamples.data());
    if (!p.description.empty())
        ok = ok && TIFFSetField(tif, TIFFTAG_IMAGEDESCRIPTION, p.description.c_str());
    if (!p.documentName.empty())
        ok = ok && TIFFSetField(tif, TIFFTAG_DOCUMENTNAME, p.documentName.c_str());
    if (p.xResolution != 0) ok = ok && TIFFSetField(tif, TIFFTAG_XRESOLUTION, static_cast<double>(p.xResolution));
    if (p.yResolution != 0) ok = ok && TIFFSetField(tif, TIFFTAG_YRESOLUTION, static_cast<double>(p.yResolution));
    if (p.resolutionUnit) ok = ok && TIFFSetField(tif, TIFFTAG_RESOLUTIONUNIT, p.resolutionUnit);
    if (p.fillOrder) ok = ok && TIFFSetField(tif, TIFFTAG_FILLORDER, p.fillOrder);
    if (!p.iccProfile.empty())
        ok = ok && TIFFSetField(tif, TIFFTAG_ICCPROFILE, static_cast<uint32_t>(p.iccProfile.size()),
                                p.iccProfile.data());
    if (!p.colorMap.empty()) {
        const size_t n = p.colorMap.size() / 3;
        ok = ok && TIFFSetField(tif, TIFFTAG_COLORMAP, p.colorMap.data(), p.colorMap.data() + n,
                                p.colorMap.data() + 2 * n);
    }
    if (p.jpegQuality) ok = ok && TIFFSetField(tif, TIFFTAG_JPEGQUALITY, p.jpegQuality);
    if (p.orientation) ok = ok && TIFFSetField(tif, TIFFTAG_ORIENTATION, p.orientation);
    if (p.tileWidth) {
        ok = ok && TIFFSetField(tif, TIFFTAG_TILEWIDTH, p.tileWidth) &&
             TIFFSetField(tif, TIFFTAG_TILELENGTH, p.tileHeight);
    } else {
        ok = ok && TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP,
                                p.rowsPerStrip ? p.rowsPerStrip : TIFFDefaultStripSize(tif, 0));
    }
    return ok;
}

bool WriteTiles(TIFF* tif, const PageLayout& p, uint32_t page) {
    const int planes = p.planar == PLANARCONFIG_SEPARATE ? p.samplesPerPixel : 1;
    std::vector<uint8_t> tile(static_cast<size_t>(TIFFTileSize(tif)));
    const uint32_t perPixel = planes > 1 ? 1 : p.samplesPerPixel;
    for (int plane = 0; plane < planes; ++plane)
        for (uint32_t ty = 0; ty < p.height; ty += p.tileHeight)
            for (uint32_t tx = 0; tx < p.width; tx += p.tileWidth) {
                std::memset(tile.data(), 0, tile.size());
                for (uint32_t y = 0; y < p.tileHeight && ty + y < p.height; ++y)
                    for (uint32_t x = 0; x < p.tileWidth && tx + x < p.width; ++x)
                        for (uint32_t s = 0; s < perPixel; ++s) {
                            const uint32_t sample = planes > 1 ? plane : s;
                            const uint32_t v = PixelValue(page, tx + x, ty + y, sample, p.bitsPerSample);
                            const size_t index = (static_cast<size_t>(y) * p.tileWidth + x) * perPixel + s;
                            if (p.bitsPerSample == 16) {
                                const uint16_t v16 = static_cast<uint16_t>(v);
                                std::memcpy(&tile[index * 2], &v16, 2);
                            } else if (p.bitsPerSample < 8) {
                                // Tile rows of narrow samples start on a byte, first sample high.
                                const size_t rowBits = (size_t{p.tileWidth} * perPixel * p.bitsPerSample + 7) / 8 * 8;
                                const size_t bit = y * rowBits + (size_t{x} * perPixel + s) * p.bitsPerSample;
                                tile[bit / 8] |= static_cast<uint8_t>(v << (8 - p.bitsPerSample - bit % 8));
                            } else {
                                tile[index] = static_cast<uint8_t>(v);
                            }
                        }
                if (TIFFWriteTile(tif, tile.data(), tx, ty, 0, static_cast<uint16_t>(plane)) < 0)
                    return false;
            }
    return true;
}

bool WriteScanlines(TIFF* tif, const PageLayout& p, uint32_t page) {
    const int planes = p.planar == PLANARCONFIG_SEPARATE ? p.samplesPerPixel : 1;
    std::vector<uint8_t> row(static_cast<size_t>(TIFFScanlineSize(tif)));
    for (int plane = 0; plane < planes; ++plane)
        for (uint32_t y = 0; y < p.height; ++y) {
            PackRow(row.data(), row.size(), RowSamples(p, page, y, planes > 1 ? plane : -1),
                    p.bitsPerSample);
            if (TIFFWriteScanline(tif, row.data(), y, static_cast<uint16_t>(plane)) < 0) return false;
        }
    return true;
}

}  // namespace

bool WritePages(TIFF* tif, const FileLayout& layout, uint32_t firstPageIndex) {
    for (size_t i = 0; i < layout.pages.size(); ++i) {
        const PageLayout& p = layout.pages[i];
        const auto page = static_cast<uint32_t>(firstPageIndex + i);
        if (!SetPageTags(tif, p)) return false;
        if (!(p.tileWidth ? WriteTiles(tif, p, page) : WriteScanlines(tif, p, page))) return false;
        if (!TIFFWriteDirectory(tif)) return false;
    }
    return true;
}

bool WriteExifForNextPage(TIFF* tif, void (*fill)(TIFF*)) {
    uint64_t offset = 0;
    if (TIFFCreateEXIFDirectory(tif) != 0) return false;
    fill(tif);
    if (!TIFFWriteCustomDirectory(tif, &offset)) return false;
    TIFFFreeDirectory(tif);
    TIFFCreateDirectory(tif);
    return TIFFSetField(tif, TIFFTAG_EXIFIFD, offset) != 0;
}

void FillTypicalExif(TIFF* tif) {
    static const uint16_t iso[3] = {100, 200, 400};
    TIFFSetField(tif, EXIFTAG_EXPOSURETIME, 0.004);
    TIFFSetField(tif, EXIFTAG_FNUMBER, 2.8);
    TIFFSetField(tif, EXIFTAG_ISOSPEEDRATINGS, 3, iso);
    TIFFSetField(tif, EXIFTAG_EXIFVERSION, "0231");
    TIFFSetField(tif, EXIFTAG_DATETIMEORIGINAL, "2024:05:06 07:08:09");
    TIFFSetField(tif, EXIFTAG_IMAGEUNIQUEID, "0123456789abcdef0123456789abcdef");
}

Bytes MakeExifTiff() {
    TempFile file;
    TIFF* tif = TIFFOpen(file.c_str(), "w");
    if (!tif) throw std::runtime_error("libtiff cannot create a file");
    const bool ok = WriteExifForNextPage(tif, FillTypicalExif) && WritePages(tif, FileLayout{});
    TIFFClose(tif);
    if (!ok) throw std::runtime_error("libtiff refused the EXIF fixture");
    return ReadFileBytes(file.path());
}

void WriteTiffFile(const std::string& path, const FileLayout& layout) {
    std::string mode = "w";
    mode += layout.bigEndian ? "b" : "l";
    if (layout.bigTiff) mode += "8";
    TIFF* tif = TIFFOpen(path.c_str(), mode.c_str());
    if (!tif) throw std::runtime_error("libtiff cannot create " + path);
    const bool ok = WritePages(tif, layout);
    TIFFClose(tif);
    if (!ok) throw std::runtime_error("libtiff refused a fixture page");
}

Bytes MakeTiff(const FileLayout& layout) {
    TempFile file;
    WriteTiffFile(file.path(), layout);
    return ReadFileBytes(file.path());
}

Bytes MakePages(int pages) {
    FileLayout layout;
    layout.pages.assign(static_cast<size_t>(pages), PageLayout{});
    return MakeTiff(layout);
}

Bytes ReadFileBytes(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

void WriteFileBytes(const std::string& path, const Bytes& bytes) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
}

std::vector<DecodedPage> DecodeWithLibtiff(const Bytes& tiff) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    std::vector<DecodedPage> pages;
    TIFFErrorHandler previous = TIFFSetErrorHandler(nullptr);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    TIFFSetErrorHandler(previous);
    if (!tif) return pages;
    do {
        DecodedPage page;
        TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &page.width);
        TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &page.height);
        const tmsize_t stripSize = TIFFStripSize(tif);
        std::vector<uint8_t> strip(static_cast<size_t>(stripSize > 0 ? stripSize : 0));
        for (uint32_t s = 0; s < TIFFNumberOfStrips(tif); ++s) {
            const tmsize_t n = TIFFReadEncodedStrip(tif, s, strip.data(), stripSize);
            if (n < 0) break;
            page.pixels.insert(page.pixels.end(), strip.begin(), strip.begin() + n);
        }
        pages.push_back(std::move(page));
    } while (TIFFReadDirectory(tif));
    TIFFClose(tif);
    return pages;
}

namespace {

std::string PrintDirectory(TIFF* tif) {
    FILE* text = std::tmpfile();
    if (!text) return {};
    TIFFPrintDirectory(tif, text, 0);
    std::string out;
    std::rewind(text);
    char buffer[4096];
    size_t n;
    while ((n = std::fread(buffer, 1, sizeof buffer, text)) > 0) out.append(buffer, n);
    std::fclose(text);
    return out;
}

void ReadAllBlocks(TIFF* tif, PageDump* dump) {
    const bool tiled = TIFFIsTiled(tif);
    const tmsize_t size = tiled ? TIFFTileSize(tif) : TIFFStripSize(tif);
    const uint32_t blocks = tiled ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif);
    if (size <= 0 || size > (256 << 20)) {
        dump->dataComplete = false;
        return;
    }
    std::vector<uint8_t> block(static_cast<size_t>(size));
    for (uint32_t i = 0; i < blocks; ++i) {
        const tmsize_t n = tiled ? TIFFReadEncodedTile(tif, i, block.data(), size)
                                 : TIFFReadEncodedStrip(tif, i, block.data(), size);
        if (n < 0) {
            dump->dataComplete = false;
            continue;
        }
        dump->data.insert(dump->data.end(), block.begin(), block.begin() + n);
    }
}

}  // namespace

PageDump DumpPage(const Bytes& tiff, uint32_t page) {
    PageDump dump;
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    const TIFFErrorHandler previousError = TIFFSetErrorHandler(nullptr);
    const TIFFErrorHandler previousWarning = TIFFSetWarningHandler(nullptr);
    TIFF* tif = TIFFOpen(file.c_str(), "rc");
    if (tif && TIFFSetDirectory(tif, page)) {
        dump.ok = true;
        dump.tags = PrintDirectory(tif);
        ReadAllBlocks(tif, &dump);
        uint64_t exif = 0;
        if (TIFFGetField(tif, TIFFTAG_EXIFIFD, &exif) && TIFFReadEXIFDirectory(tif, exif))
            dump.exifTags = PrintDirectory(tif);
    }
    if (tif) TIFFClose(tif);
    TIFFSetErrorHandler(previousError);
    TIFFSetWarningHandler(previousWarning);
    return dump;
}

std::string WithoutLines(const std::string& text, const std::vector<std::string>& words) {
    std::istringstream in(text);
    std::string line, out;
    while (std::getline(in, line)) {
        bool drop = false;
        for (const auto& w : words) drop = drop || line.find(w) != std::string::npos;
        if (!drop) out += line + "\n";
    }
    return out;
}

}  // namespace zantest
