// TIFF files made with libtiff for the tests, and temporary files.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <tiffio.h>

namespace zantest {

using Bytes = std::vector<uint8_t>;

// A file in the temporary directory, removed when the object goes.
class TempFile {
public:
    explicit TempFile(const std::string& suffix = ".tif");
    ~TempFile();
    TempFile(const TempFile&) = delete;
    TempFile& operator=(const TempFile&) = delete;
    const std::string& path() const { return path_; }
    const char* c_str() const { return path_.c_str(); }

private:
    std::string path_;
};

// What a fixture page looks like. Pixels follow PixelValue().
struct PageLayout {
    uint32_t width = 16;
    uint32_t height = 8;
    uint16_t samplesPerPixel = 1;
    uint16_t bitsPerSample = 8;
    uint16_t photometric = PHOTOMETRIC_MINISBLACK;
    uint16_t compression = COMPRESSION_NONE;
    uint16_t planar = PLANARCONFIG_CONTIG;
    uint32_t rowsPerStrip = 0;  // 0: libtiff's default
    uint32_t tileWidth = 0;     // nonzero: tiled
    uint32_t tileHeight = 0;
    std::vector<uint16_t> extraSamples;  // ExtraSamples values, written when not empty
    std::string description;             // ImageDescription when not empty
    std::string documentName;            // DocumentName when not empty
    float xResolution = 0;               // XResolution/YResolution when nonzero
    float yResolution = 0;
    uint16_t resolutionUnit = 0;         // ResolutionUnit when nonzero
    uint16_t fillOrder = 0;              // FillOrder when nonzero
    Bytes iccProfile;                    // ICCProfile when not empty
    std::vector<uint16_t> colorMap;      // ColorMap (red, green, blue tables) when not empty
    int jpegQuality = 0;                 // JPEG pages: quality when nonzero
    uint16_t orientation = 0;            // Orientation when nonzero
};

struct FileLayout {
    std::vector<PageLayout> pages{PageLayout{}};
    bool bigEndian = false;
    bool bigTiff = false;
};

// Deterministic sample value of (page, x, y, sample), masked to the depth.
uint32_t PixelValue(uint32_t page, uint32_t x, uint32_t y, uint32_t sample, uint16_t bits);

// Writes an EXIF directory filled by `fill` (TIFFSetField calls) before the
// page's own tags, and points the page at it; the image directory must be
// empty when this is called (libtiff 4.5's working sequence).
bool WriteExifForNextPage(TIFF* tif, void (*fill)(TIFF*));

// Fills a typical EXIF directory: ExposureTime, FNumber, ISOSpeedRatings
// (3 values), ExifVersion, DateTimeOriginal, ImageUniqueID.
void FillTypicalExif(TIFF* tif);

// A one-page grey file with the typical EXIF directory.
Bytes MakeExifTiff();

// Writes the file with libtiff to `path`.
void WriteTiffFile(const std::string& path, const FileLayout& layout);
// The same file as bytes.
Bytes MakeTiff(const FileLayout& layout);
// A file of `pages` pages of the default page layout.
Bytes MakePages(int pages);

// Writes the pages of `layout` into an open codec object (tags, pixels,
// TIFFWriteDirectory for each page). False when libtiff refuses any step.
bool WritePages(TIFF* tif, const FileLayout& layout, uint32_t firstPageIndex = 0);

Bytes ReadFileBytes(const std::string& path);
void WriteFileBytes(const std::string& path, const Bytes& bytes);

// What libtiff sees in a TIFF: page count and, per page, size and pixels of
// the first strip decoded. Reads from memory through a private client.
struct DecodedPage {
    uint32_t width = 0;
    uint32_t height = 0;
    Bytes pixels;  // every strip decoded, in order
};
std::vector<DecodedPage> DecodeWithLibtiff(const Bytes& tiff);

// What libtiff reports of one page (0-based): TIFFPrintDirectory's text of
// the image directory, then of its EXIF directory when it has one, and every
// strip or tile decoded. `ok` is false when libtiff cannot open the file or
// reach the page.
struct PageDump {
    bool ok = false;
    std::string tags;
    std::string exifTags;
    Bytes data;
    bool dataComplete = true;  // every strip or tile decoded
};
PageDump DumpPage(const Bytes& tiff, uint32_t page);

// Lines of a TIFFPrintDirectory text, without those naming any of `words`.
std::string WithoutLines(const std::string& text, const std::vector<std::string>& words);

}  // namespace zantest
