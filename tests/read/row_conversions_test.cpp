// ConvertScanLine on rows as the codec delivers them.

#include <gtest/gtest.h>

#include <cstring>

#include "read/row_conversions.h"
#include "support/test_host.h"

namespace {

using zantest::TestHost;
using Bytes = std::vector<uint8_t>;

Bytes Convert(ConversionContext* ctx, Bytes read, size_t lineSize, bool inPlace) {
    Bytes line(lineSize, 0xEE);
    if (inPlace) {
        read.resize(std::max(read.size(), lineSize));
        zan::ConvertScanLine(ctx, read.data(), read.data());
        read.resize(lineSize);
        return read;
    }
    zan::ConvertScanLine(ctx, read.data(), line.data());
    return line;
}

TEST(RowConversions, NarrowGreySamplesWidenToBytes) {
    TestHost host;
    host->imageWidth = 4;
    host->fileSamplesPerPixel = 1;
    host->bitsPerSample = 4;
    EXPECT_EQ(Convert(host.ctx(), {0x1F, 0xA0}, 4, true), Bytes({0x11, 0xFF, 0xAA, 0x00}));
    host->bitsPerSample = 2;
    EXPECT_EQ(Convert(host.ctx(), {0x1B}, 4, true), Bytes({0, 85, 170, 255}));
}

TEST(RowConversions, AssociatedAlphaIsDividedOut) {
    TestHost host;
    host->imageWidth = 2;
    host->fileSamplesPerPixel = 4;
    host->bitsPerSample = 8;
    host->alphaSampleIndex = 3;
    host->extraSampleCount = 1;
    EXPECT_EQ(Convert(host.ctx(), {100, 50, 0, 128, 200, 10, 5, 0}, 8, true),
              Bytes({199, 100, 0, 128, 0, 0, 0, 0}))
        << "a zero alpha gives colour 0";
    // A colour above its alpha wraps to its low 8 bits.
    EXPECT_EQ(Convert(host.ctx(), {255, 0, 0, 127, 0, 0, 0, 1}, 8, true)[0], static_cast<uint8_t>(512 & 0xFF));
}

TEST(RowConversions, SixteenBitSamplesReduceToTheirHighByte) {
    TestHost host;
    host->imageWidth = 2;
    host->fileSamplesPerPixel = 1;
    host->bitsPerSample = 16;
    host->reduceTo8Bits = 1;
    const uint16_t samples[2] = {0x1234, 0xABCD};
    Bytes read(4);
    std::memcpy(read.data(), samples, 4);
    EXPECT_EQ(Convert(host.ctx(), read, 2, false), Bytes({0x12, 0xAB}));
}

TEST(RowConversions, ExtraSamplesAreDroppedPerPixelOrPerPlane) {
    TestHost host;
    host->imageWidth = 2;
    host->fileSamplesPerPixel = 4;
    host->bitsPerSample = 8;
    host->dropSampleCount = 1;
    EXPECT_EQ(Convert(host.ctx(), {1, 2, 3, 4, 5, 6, 7, 8}, 6, false), Bytes({1, 2, 3, 5, 6, 7}));
    host->planarConfig = 2;  // planes R R G G B B A A
    EXPECT_EQ(Convert(host.ctx(), {1, 2, 3, 4, 5, 6, 7, 8}, 6, false), Bytes({1, 2, 3, 4, 5, 6}));
}

TEST(RowConversions, PaletteIndicesBecomeRgb) {
    TestHost host;
    uint16_t palette[3 * 4] = {10, 11, 12, 13, 20, 21, 22, 23, 30, 31, 32, 33};
    host->imageWidth = 4;
    host->bitsPerSample = 2;
    host->paletteExpansion = 1;
    host->paletteRed = palette;
    host->paletteGreen = palette + 4;
    host->paletteBlue = palette + 8;
    EXPECT_EQ(Convert(host.ctx(), {0x1B}, 12, false),
              Bytes({10, 20, 30, 11, 21, 31, 12, 22, 32, 13, 23, 33}));
    host->paletteRed = host->paletteGreen = host->paletteBlue = nullptr;
}

TEST(RowConversions, NarrowSamplesWithExtrasAreWidenedThenDropped) {
    TestHost host;
    host->imageWidth = 2;
    host->fileSamplesPerPixel = 2;  // grey + alpha at 4 bits
    host->bitsPerSample = 4;
    host->dropSampleCount = 1;
    EXPECT_EQ(Convert(host.ctx(), {0xF0, 0x3C, 0, 0}, 2, false), Bytes({0xFF, 0x33}));
}

}  // namespace
