// ConvertScanLine on rows as the codec delivers them: the edges the
// whole-page tests of the reader do not reach.

#include <gtest/gtest.h>

#include <algorithm>

#include "read/row_conversions.h"
#include "support/test_host.h"

namespace {

using Bytes = std::vector<uint8_t>;

TEST(RowConversions, EdgesOfEachConversion) {
    // The line the host receives from each conversion at its edges.
    uint16_t palette[3 * 4] = {10, 11, 12, 13, 20, 21, 22, 23, 30, 31, 32, 33};
    struct Case {
        const char* what;
        uint32_t width, samples, bits, alphaIndex, drop, planar;
        bool palette;
        Bytes read, line;
    } cases[] = {
        {"a zero alpha gives colour 0", 2, 4, 8, 3, 0, 1, false, {100, 50, 0, 128, 200, 10, 5, 0},
         {199, 100, 0, 128, 0, 0, 0, 0}},
        {"a colour above its alpha wraps to its low 8 bits", 1, 4, 8, 3, 0, 1, false, {255, 0, 0, 127},
         {512 & 0xFF, 0, 0, 127}},
        {"extra samples of separate planes (R R G G B B A A)", 2, 4, 8, 0, 1, 2, false, {1, 2, 3, 4, 5, 6, 7, 8},
         {1, 2, 3, 4, 5, 6}},
        {"narrow grey and alpha are widened, then the alpha dropped", 2, 2, 4, 0, 1, 1, false, {0xF0, 0x3C},
         {0xFF, 0x33}},
        {"2-bit palette indices become RGB", 4, 1, 2, 0, 0, 1, true, {0x1B},
         {10, 20, 30, 11, 21, 31, 12, 22, 32, 13, 23, 33}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        zantest::TestHost host;
        host->imageWidth = c.width;
        host->fileSamplesPerPixel = c.samples;
        host->bitsPerSample = c.bits;
        host->alphaSampleIndex = c.alphaIndex;
        host->extraSampleCount = c.alphaIndex ? 1 : 0;
        host->dropSampleCount = c.drop;
        host->planarConfig = c.planar;
        if (c.palette) {
            host->paletteExpansion = 1;
            host->paletteRed = palette;
            host->paletteGreen = palette + 4;
            host->paletteBlue = palette + 8;
        }
        // As the reader does: a row that needs no work buffer is converted
        // where it was read.
        const bool inPlace = !c.palette && !c.drop;
        Bytes read = c.read, line(c.line.size(), 0xEE);
        // The reader's read buffer has room for every sample widened to a byte.
        read.resize(std::max({read.size(), line.size(), size_t{c.width} * c.samples}));
        zan::ConvertScanLine(host.ctx(), read.data(), inPlace ? read.data() : line.data());
        if (inPlace) line.assign(read.begin(), read.begin() + static_cast<long>(line.size()));
        EXPECT_EQ(line, c.line);
        host->paletteRed = host->paletteGreen = host->paletteBlue = nullptr;
    }
}

}  // namespace
