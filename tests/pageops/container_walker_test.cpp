// The page copy's layout rules and its refusals, seen in the files written.
// (Tiled pages and long values are copied in the corpus tests.)

#include <gtest/gtest.h>

#include <algorithm>

#include <tiffio.h>

#include "pageops_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

Bytes ExtractFirst(const Bytes& source) {
    FileJob job(source, {});
    return job.Extract(1) ? job.Dest() : Bytes();
}

// A grey page of one-row strips whose offsets and byte counts are SHORTs.
BuiltPage ShortStrips(uint32_t width, uint32_t height) {
    BuiltPage page = GreyPage(width, height, 1);
    page.offsetsType = page.countsType = 3;
    return page;
}

uint16_t OffsetsType(const Bytes& out) {
    FoundEntry e;
    return FindEntry(out, 8, 273, &e) ? e.type : 0;
}

TEST(PageCopy, ShortOffsetsStayShortWhileTheyFitAndWidenWhenTheyMightNot) {
    // One page of S strips; D + 4 (S + 128) + T against 65535.
    for (uint32_t height : {8u, 120u}) {
        const Bytes source = BuildTiff({ShortStrips(500, height)});
        if (source.size() > 65535) continue;
        const Bytes out = ExtractFirst(source);
        ASSERT_FALSE(out.empty());
        const uint64_t total = 500u * height;
        EXPECT_EQ(OffsetsType(out), total + 4 * (height + 128) + 200 > 65535 ? 4 : 3) << height;
        EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[0].pixels);
    }
}

TEST(PageCopy, WideningHappensAtTheExactThreshold) {
    // Two strips, both arrays inline as SHORTs: D is the end of the directory
    // and T twice the width.
    auto twoStrips = [](uint32_t width) { return BuildTiff({ShortStrips(width, 2)}); };
    uint32_t lo = 1000, hi = 40000;
    ASSERT_EQ(OffsetsType(ExtractFirst(twoStrips(lo))), 3);
    ASSERT_EQ(OffsetsType(ExtractFirst(twoStrips(hi))), 4);
    while (hi - lo > 1) {
        const uint32_t mid = (lo + hi) / 2;
        (OffsetsType(ExtractFirst(twoStrips(mid))) == 3 ? lo : hi) = mid;
    }
    const Bytes out = ExtractFirst(twoStrips(lo));
    const uint64_t d = 8 + 2 + 12u * Get16(out, 8) + 4;
    EXPECT_LE(d + 4 * (2 + 128) + 2u * lo, 65535u);
    EXPECT_GT(d + 4 * (2 + 128) + 2u * hi, 65535u);
    const Bytes wide = ExtractFirst(twoStrips(hi));
    EXPECT_EQ(DecodeWithLibtiff(wide)[0].pixels, DecodeWithLibtiff(twoStrips(hi))[0].pixels);
}

TEST(PageCopy, InlineOffsetsGetTheNewOffsetsInline) {
    for (const BuiltPage& page : {GreyPage(4, 2, 2), ShortStrips(4, 2)}) {
        const Bytes source = BuildTiff({page}, {.leadingPadding = 40});
        const Bytes out = ExtractFirst(source);
        ASSERT_FALSE(out.empty());
        EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[0].pixels);
        EXPECT_LT(out.size(), source.size()) << "the padding is not copied";
    }
}

// A grey page with `entries` added, its own strip tags left out unless kept.
Bytes WithStripTags(std::vector<RawEntry> entries, bool keepOwn = false) {
    BuiltPage page = GreyPage(4, 2, 2);
    page.stripTags = keepOwn;
    page.entries.insert(page.entries.end(), entries.begin(), entries.end());
    return BuildTiff({page});
}

TEST(PageCopy, RefusesPagesItCannotRelocateAndWritesNoPage) {
    Bytes farValue = BuildTiff({GreyPage(4, 2, 2)});
    FoundEntry e;
    ASSERT_TRUE(FindEntry(farValue, DirectoryOffsets(farValue)[0], 256, &e));
    Put32(farValue, e.valueField - 4, 50);  // ImageWidth as a 50-value LONG array far away
    Put32(farValue, e.valueField, 0x7FFFFFF0);
    Bytes brokenChain = BuildTiff({GreyPage(4, 2, 2)});
    Put32(brokenChain, 4, static_cast<uint32_t>(brokenChain.size() - 3));
    const struct Case {
        Bytes source;
        const char* message;
        size_t written = 8;  // the header of the one-page file, or nothing when the walk fails first
    } cases[] = {
        {WithStripTags({LongEntry(324, {8})}, true), "Strip and Tile offsets both present."},
        {WithStripTags({LongEntry(325, {8})}, true), "Strip and Tile byte counts both present."},
        {WithStripTags({TypedEntry(273, 1, 1, Bytes{8}), LongEntry(279, {8})}), "Unhandled TIFF value type."},
        {WithStripTags({LongEntry(273, {8, 16}), LongEntry(279, {8})}),
         "Source num of strips and num of stripsize do not match."},
        {WithStripTags({LongEntry(273, {8})}), "Source page has strip offsets but no byte counts."},
        {WithStripTags({LongEntry(279, {8})}), "Source page has strip byte counts but no offsets."},
        {WithStripTags({LongEntry(273, {8}), LongEntry(279, {1000000})}),
         "Source strip data lie beyond the end of the file."},
        {farValue, "Source value lies beyond the end of the file."},
        {brokenChain, "Source directory chain is damaged.", 0},
    };
    for (const Case& c : cases) {
        FileJob job(c.source, {});
        EXPECT_EQ(job.Extract(1), 0);
        EXPECT_EQ(job.Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(job.Dest().size(), c.written) << c.message;
    }
}

// A page whose strips libtiff wrote last first: descending offsets, odd
// sizes, and one strip larger than a copy run.
Bytes StripsInReverse(uint32_t width, uint32_t height, uint32_t rowsPerStrip) {
    TempFile file;
    TIFF* tif = TIFFOpen(file.c_str(), "w");
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, width);
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, height);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 1);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
    TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, rowsPerStrip);
    const uint32_t strips = (height + rowsPerStrip - 1) / rowsPerStrip;
    for (uint32_t s = strips; s-- > 0;) {
        const uint32_t rows = std::min(rowsPerStrip, height - s * rowsPerStrip);
        Bytes data(static_cast<size_t>(width) * rows);
        for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(i * 7 + s);
        TIFFWriteEncodedStrip(tif, s, data.data(), static_cast<tmsize_t>(data.size()));
    }
    TIFFClose(tif);
    return ReadFileBytes(file.path());
}

TEST(PageCopy, StripsInAnyOrderAndOfAnySizeLandAtEvenOffsets) {
    for (const Bytes& source : {StripsInReverse(33, 40, 1), StripsInReverse(33, 40, 3),
                                StripsInReverse(1501, 1400, 1047)}) {
        const Bytes out = ExtractFirst(source);
        ASSERT_FALSE(out.empty());
        EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[0].pixels);
        FoundEntry offsets;
        ASSERT_TRUE(FindEntry(out, 8, 273, &offsets));
        for (uint32_t i = 0; i < offsets.count; ++i) {
            const uint32_t at = offsets.count == 1 ? Get32(out, offsets.valueField)
                                                   : Get32(out, Get32(out, offsets.valueField) + 4 * i);
            EXPECT_EQ(at % 2, 0u) << "strip " << i;
        }
    }
}

}  // namespace
