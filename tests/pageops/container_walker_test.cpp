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

uint16_t OffsetsType(const Bytes& out) {
    FoundEntry e;
    return FindEntry(out, 8, 273, &e) ? e.type : 0;
}

// SHORT strip offsets stay SHORT while D + 4 (S + 128) + T fits in 16 bits
// (D where the offsets go, S strips of T bytes in all) and become LONG from
// the first width where they might not, inline or as an array; the pixels
// are copied either way.
TEST(PageCopy, ShortOffsetsWidenExactlyWhenTheyMightNotFit) {
    for (uint32_t strips : {2u, 8u}) {
        SCOPED_TRACE(strips);
        auto source = [strips](uint32_t width) {
            BuiltPage page = GreyPage(width, strips, 1);
            page.offsetsType = page.countsType = 3;
            return BuildTiff({page});
        };
        uint32_t lo = 100, hi = 72000 / strips;
        ASSERT_EQ(OffsetsType(ExtractFirst(source(lo))), 3);
        ASSERT_EQ(OffsetsType(ExtractFirst(source(hi))), 4);
        while (hi - lo > 1) {
            const uint32_t mid = (lo + hi) / 2;
            (OffsetsType(ExtractFirst(source(mid))) == 3 ? lo : hi) = mid;
        }
        // D: the end of the directory, and of the byte counts when they do not fit in their entry.
        const Bytes narrow = ExtractFirst(source(lo));
        const uint64_t d = 8 + 2 + 12u * Get16(narrow, 8) + 4 + (strips > 2 ? 2 * strips : 0);
        EXPECT_LE(d + 4 * (strips + 128) + uint64_t{strips} * lo, 65535u);
        EXPECT_GT(d + 4 * (strips + 128) + uint64_t{strips} * hi, 65535u);
        EXPECT_EQ(DecodeWithLibtiff(narrow)[0].pixels, DecodeWithLibtiff(source(lo))[0].pixels);
        EXPECT_EQ(DecodeWithLibtiff(ExtractFirst(source(hi)))[0].pixels, DecodeWithLibtiff(source(hi))[0].pixels);
    }
}

// A grey page with `entries` added, its own strip tags left out unless kept.
Bytes WithStripTags(std::vector<RawEntry> entries, bool keepOwn = false) {
    BuiltPage page = GreyPage(4, 2, 2);
    page.stripTags = keepOwn;
    page.entries.insert(page.entries.end(), entries.begin(), entries.end());
    return BuildTiff({page});
}

// A page with `n` ExifIFD entries, each pointing at its own empty directory
// (zero bytes of the leading padding read as such).
Bytes ManyExifDirectories(uint32_t n) {
    BuiltPage page = GreyPage(4, 2, 2);
    for (uint32_t i = 0; i < n; ++i) page.entries.push_back(LongEntry(34665, {8 + 6 * i}));
    return BuildTiff({page}, {.leadingPadding = 6 * n + 8});
}

// A page the copy cannot take whole, or whose offsets it could not
// relocate (they would point into the wrong place), is refused with its
// reason before any of it is written.
TEST(PageCopy, RefusesPagesItCannotRelocateAndWritesNoPage) {
    Bytes farValue = BuildTiff({GreyPage(4, 2, 2)});
    FoundEntry e;
    ASSERT_TRUE(FindEntry(farValue, DirectoryOffsets(farValue)[0], 256, &e));
    Put32(farValue, e.valueField - 4, 50);  // ImageWidth as a 50-value LONG array far away
    Put32(farValue, e.valueField, 0x7FFFFFF0);
    Bytes brokenChain = BuildTiff({GreyPage(4, 2, 2)});
    Put32(brokenChain, 4, static_cast<uint32_t>(brokenChain.size() - 3));
    const char* const kTables = "Old-style JPEG tables outside the JPEG interchange data cannot be copied.";
    const struct {
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
        {WithStripTags({LongEntry(330, {8})}, true), "Pages with SubIFDs cannot be copied."},
        {WithStripTags({LongEntry(519, {8})}, true), kTables},
        {WithStripTags({LongEntry(513, {8}), LongEntry(514, {4}), LongEntry(520, {40})}, true), kTables},
        {ManyExifDirectories(65), "Source page has too many EXIF, GPS or Interoperability directories."},
    };
    for (const auto& c : cases) {
        FileJob job(c.source, {});
        EXPECT_EQ(job.Extract(1), 0);
        EXPECT_EQ(job.Errors(), Texts{c.message});
        EXPECT_EQ(job.Dest().size(), c.written) << c.message;
    }
}

// 30 ExifIFD entries point at one EXIF directory, whose 30 Interop entries
// point at one Interoperability directory holding 2 KiB: each is copied
// once, so the page stays the size it is (not 900 copies of the 2 KiB).
TEST(PageCopy, SubDirectoriesPointedAtManyTimesAreCopiedOnce) {
    const uint32_t interop = 8, exif = 28, value = exif + 2 + 12 * 30 + 4;
    BuiltPage page = GreyPage(4, 2, 2);
    for (int i = 0; i < 30; ++i) page.entries.push_back(LongEntry(34665, {exif}));
    Bytes source = BuildTiff({page}, {.leadingPadding = value + 2048 - 8});
    auto put16 = [&source](size_t at, uint16_t v) {
        source[at] = static_cast<uint8_t>(v);
        source[at + 1] = static_cast<uint8_t>(v >> 8);
    };
    put16(interop, 1);
    put16(interop + 2, 1);  // InteroperabilityIndex
    put16(interop + 4, 7);  // UNDEFINED
    Put32(source, interop + 6, 2048);
    Put32(source, interop + 10, value);
    put16(exif, 30);
    for (uint32_t i = 0; i < 30; ++i) {
        const size_t at = exif + 2 + 12 * i;
        put16(at, 40965);
        put16(at + 2, 4);
        Put32(source, at + 4, 1);
        Put32(source, at + 8, interop);
    }
    const Bytes out = ExtractFirst(source);
    ASSERT_FALSE(out.empty());
    EXPECT_LT(out.size(), source.size());
    EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[0].pixels);
}

// JPEGInterchangeFormat's block is copied whole, and the table offsets that
// point into it move with it.
TEST(PageCopy, OldStyleJpegDataMovesWithItsTables) {
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

// Strips in any order and of any size are copied in index order, each at
// an even offset.
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
