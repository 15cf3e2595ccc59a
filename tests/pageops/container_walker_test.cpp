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

// Little-endian numbers for building structures by hand.
void Put16Le(Bytes& b, size_t at, uint16_t v) {
    b[at] = static_cast<uint8_t>(v);
    b[at + 1] = static_cast<uint8_t>(v >> 8);
}
void Put32Le(Bytes& b, size_t at, uint32_t v) {
    for (int i = 0; i < 4; ++i) b[at + i] = static_cast<uint8_t>(v >> (8 * i));
}

// A page with `n` ExifIFD entries, each pointing at its own empty directory
// (zero bytes of the leading padding read as such).
Bytes ManyExifDirectories(uint32_t n) {
    BuiltPage page = GreyPage(4, 2, 2);
    for (uint32_t i = 0; i < n; ++i) page.entries.push_back(LongEntry(34665, {8 + 6 * i}));
    return BuildTiff({page}, {.leadingPadding = 6 * n + 8});
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
        // Offsets the copy cannot relocate would point into the wrong place.
        {WithStripTags({LongEntry(330, {8})}, true), "Pages with SubIFDs cannot be copied."},
        {WithStripTags({LongEntry(519, {8})}, true),
         "Old-style JPEG tables outside the JPEG interchange data cannot be copied."},
        {WithStripTags({LongEntry(513, {8}), LongEntry(514, {4}), LongEntry(520, {40})}, true),
         "Old-style JPEG tables outside the JPEG interchange data cannot be copied."},
        {ManyExifDirectories(65), "Source page has too many EXIF, GPS or Interoperability directories."},
    };
    for (const Case& c : cases) {
        FileJob job(c.source, {});
        EXPECT_EQ(job.Extract(1), 0);
        EXPECT_EQ(job.Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(job.Dest().size(), c.written) << c.message;
    }
}

TEST(PageCopy, SubDirectoriesPointedAtManyTimesAreCopiedOnce) {
    // 30 ExifIFD entries point at one EXIF directory, whose 30 Interop
    // entries point at one Interoperability directory holding 2 KiB: copied
    // once each, the page stays the size it is (900 copies of the 2 KiB
    // before).
    Bytes padding(2 + 12 + 4 + 2 + (2 + 12 * 30 + 4) + 2048, 0);
    const uint32_t interop = 8, exif = 28, value = exif + 2 + 12 * 30 + 4;
    Put16Le(padding, interop - 8, 1);
    Put16Le(padding, interop - 8 + 2, 1);  // InteroperabilityIndex
    Put16Le(padding, interop - 8 + 4, 7);  // UNDEFINED
    Put32Le(padding, interop - 8 + 6, 2048);
    Put32Le(padding, interop - 8 + 10, value);
    Put16Le(padding, exif - 8, 30);
    for (uint32_t i = 0; i < 30; ++i) {
        const size_t at = exif - 8 + 2 + 12 * i;
        Put16Le(padding, at, 40965);
        Put16Le(padding, at + 2, 4);
        Put32Le(padding, at + 4, 1);
        Put32Le(padding, at + 8, interop);
    }
    BuiltPage page = GreyPage(4, 2, 2);
    for (int i = 0; i < 30; ++i) page.entries.push_back(LongEntry(34665, {exif}));
    Bytes source = BuildTiff({page}, {.leadingPadding = static_cast<uint32_t>(padding.size())});
    std::copy(padding.begin(), padding.end(), source.begin() + 8);
    const Bytes out = ExtractFirst(source);
    ASSERT_FALSE(out.empty());
    EXPECT_LT(out.size(), source.size());
    EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[0].pixels);
}

TEST(PageCopy, OldStyleJpegDataMovesWithItsTables) {
    // JPEGInterchangeFormat's block is copied whole, and the table offsets
    // that point into it move with it.
    Bytes block(64);
    for (size_t i = 0; i < block.size(); ++i) block[i] = static_cast<uint8_t>(200 - i);
    BuiltPage page = GreyPage(4, 2, 2);
    page.entries.push_back(LongEntry(513, {8}));
    page.entries.push_back(LongEntry(514, {64}));
    page.entries.push_back(LongEntry(519, {8, 24, 40}));
    page.entries.push_back(LongEntry(520, {56}));
    Bytes source = BuildTiff({page}, {.leadingPadding = 64 + 100});
    std::copy(block.begin(), block.end(), source.begin() + 8);
    const Bytes out = ExtractFirst(source);
    ASSERT_FALSE(out.empty());
    FoundEntry jpeg, tables, dc;
    ASSERT_TRUE(FindEntry(out, 8, 513, &jpeg) && FindEntry(out, 8, 519, &tables) && FindEntry(out, 8, 520, &dc));
    const uint32_t at = Get32(out, jpeg.valueField);
    EXPECT_EQ(Bytes(out.begin() + at, out.begin() + at + 64), block);
    const uint32_t array = Get32(out, tables.valueField);
    EXPECT_EQ(Get32(out, array), at);
    EXPECT_EQ(Get32(out, array + 8), at + 32);
    EXPECT_EQ(Get32(out, dc.valueField), at + 48) << "one table: inline";
    EXPECT_LT(out.size(), source.size()) << "the padding around the block is not copied";
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
