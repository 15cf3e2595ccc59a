// The page copy's layout rules and its refusals, seen in the files written.

#include <gtest/gtest.h>

#include <algorithm>

#include <tiffio.h>

#include "pageops_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

Bytes ExtractFirst(const Bytes& source, std::vector<std::string>* errors = nullptr) {
    FileJob job(source, {});
    const int result = job.Extract(1);
    if (errors) *errors = job.Errors();
    return result ? job.Dest() : Bytes();
}

uint16_t OffsetsType(const Bytes& out) {
    FoundEntry e;
    return FindEntry(out, 8, 273, &e) ? e.type : 0;
}

TEST(PageCopy, ShortOffsetsStayShortWhileTheyFitAndWidenWhenTheyMightNot) {
    // One page of S strips; D + 4 (S + 128) + T against 65535.
    for (uint32_t height : {8u, 120u}) {
        BuiltPage page = GreyPage(500, height, 1);
        page.offsetsType = 3;
        page.countsType = 3;
        const Bytes source = BuildTiff({page});
        if (source.size() > 65535) continue;
        const Bytes out = ExtractFirst(source);
        ASSERT_FALSE(out.empty());
        const uint64_t total = 500u * height;
        EXPECT_EQ(OffsetsType(out), total + 4 * (height + 128) + 200 > 65535 ? 4 : 3) << height;
        EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[0].pixels);
    }
}

// Two strips, both arrays inline as SHORTs: D is the end of the directory
// and T twice the width.
BuiltPage TwoStripPage(uint32_t width) {
    BuiltPage page = GreyPage(width, 2, 1);
    page.offsetsType = 3;
    page.countsType = 3;
    return page;
}

TEST(PageCopy, WideningHappensAtTheExactThreshold) {
    uint32_t lo = 1000, hi = 40000;
    ASSERT_EQ(OffsetsType(ExtractFirst(BuildTiff({TwoStripPage(lo)}))), 3);
    ASSERT_EQ(OffsetsType(ExtractFirst(BuildTiff({TwoStripPage(hi)}))), 4);
    while (hi - lo > 1) {
        const uint32_t mid = (lo + hi) / 2;
        (OffsetsType(ExtractFirst(BuildTiff({TwoStripPage(mid)}))) == 3 ? lo : hi) = mid;
    }
    const Bytes out = ExtractFirst(BuildTiff({TwoStripPage(lo)}));
    const uint64_t d = 8 + 2 + 12u * Get16(out, 8) + 4;
    EXPECT_LE(d + 4 * (2 + 128) + 2u * lo, 65535u);
    EXPECT_GT(d + 4 * (2 + 128) + 2u * hi, 65535u);
    const Bytes wide = ExtractFirst(BuildTiff({TwoStripPage(hi)}));
    EXPECT_EQ(DecodeWithLibtiff(wide)[0].pixels, DecodeWithLibtiff(BuildTiff({TwoStripPage(hi)}))[0].pixels);
}

TEST(PageCopy, InlineOffsetsGetTheNewOffsetsInline) {
    BuiltPage one = GreyPage(4, 2, 2);
    BuiltPage two = GreyPage(4, 2, 1);
    two.offsetsType = 3;
    two.countsType = 3;
    for (const BuiltPage& page : {one, two}) {
        const Bytes source = BuildTiff({page}, {false, 40});
        const Bytes out = ExtractFirst(source);
        ASSERT_FALSE(out.empty());
        EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[0].pixels);
        EXPECT_LT(out.size(), source.size()) << "the padding is not copied";
    }
}

TEST(PageCopy, TiledPagesAreCopiedTileByTile) {
    TempFile file;
    FileSpec spec;
    spec.pages[0].width = 40;
    spec.pages[0].height = 33;
    spec.pages[0].tileWidth = 16;
    spec.pages[0].tileHeight = 16;
    spec.pages[0].compression = COMPRESSION_LZW;
    WriteTiffFile(file.path(), spec);
    const Bytes source = ReadFileBytes(file.path());
    const Bytes out = ExtractFirst(source);
    const PageDump a = DumpPage(source, 0), b = DumpPage(out, 0);
    ASSERT_TRUE(b.ok);
    EXPECT_EQ(a.data, b.data);
    EXPECT_TRUE(b.dataComplete);
}

TEST(PageCopy, RefusesPagesItCannotRelocate) {
    struct Case {
        BuiltPage page;
        const char* message;
    };
    BuiltPage both = GreyPage(4, 2, 2);
    both.entries.push_back(LongEntry(324, {8}));
    BuiltPage twoCounts = GreyPage(4, 2, 2);
    twoCounts.entries.push_back(LongEntry(325, {8}));
    BuiltPage byteOffsets = GreyPage(4, 2, 2);
    byteOffsets.stripTags = false;
    byteOffsets.entries.push_back(TypedEntry(273, 1, 1, Bytes{8}));
    byteOffsets.entries.push_back(LongEntry(279, {8}));
    BuiltPage mismatch = GreyPage(4, 2, 2);
    mismatch.stripTags = false;
    mismatch.entries.push_back(LongEntry(273, {8, 16}));
    mismatch.entries.push_back(LongEntry(279, {8}));
    BuiltPage noCounts = GreyPage(4, 2, 2);
    noCounts.stripTags = false;
    noCounts.entries.push_back(LongEntry(273, {8}));
    BuiltPage beyond = GreyPage(4, 2, 2);
    beyond.stripTags = false;
    beyond.entries.push_back(LongEntry(273, {8}));
    beyond.entries.push_back(LongEntry(279, {1000000}));
    const Case cases[] = {
        {both, "Strip and Tile offsets both present."},
        {twoCounts, "Strip and Tile byte counts both present."},
        {byteOffsets, "Unhandled TIFF value type."},
        {mismatch, "Source num of strips and num of stripsize do not match."},
        {noCounts, "Source page has strip offsets but no byte counts."},
        {beyond, "Source strip data lie beyond the end of the file."},
    };
    for (const Case& c : cases) {
        std::vector<std::string> errors;
        const Bytes out = ExtractFirst(BuildTiff({c.page}), &errors);
        EXPECT_TRUE(out.empty());
        EXPECT_EQ(errors, std::vector<std::string>{c.message});
    }
}

TEST(PageCopy, RefusedPageLeavesTheDestinationAsItWas) {
    BuiltPage page = GreyPage(4, 2, 2);
    page.stripTags = false;
    page.entries.push_back(LongEntry(279, {8}));
    FileJob job(BuildTiff({page}), {});
    EXPECT_EQ(job.Extract(1), 0);
    EXPECT_EQ(job.Errors(), std::vector<std::string>{"Source page has strip byte counts but no offsets."});
    EXPECT_EQ(job.Dest().size(), 8u) << "only the header of the one-page file";
}

TEST(PageCopy, ValueBeyondTheEndOfTheSourceIsRefused) {
    Bytes source = BuildTiff({GreyPage(4, 2, 2)});
    FoundEntry e;
    const uint32_t ifd = DirectoryOffsets(source)[0];
    // Turn ImageWidth into a 50-value LONG array that lies far away.
    ASSERT_TRUE(FindEntry(source, ifd, 256, &e));
    Put32(source, e.valueField - 4, 50);
    Put32(source, e.valueField, 0x7FFFFFF0);
    std::vector<std::string> errors;
    EXPECT_TRUE(ExtractFirst(source, &errors).empty());
    EXPECT_EQ(errors, std::vector<std::string>{"Source value lies beyond the end of the file."});
}

TEST(PageCopy, LongValuesAreCopiedWhole) {
    BuiltPage page = GreyPage(4, 2, 2);
    page.entries.push_back(AsciiEntry(270, std::string(299, 'v')));  // 300 bytes
    const Bytes out = ExtractFirst(BuildTiff({page}));
    EXPECT_NE(DumpPage(out, 0).tags.find(std::string(299, 'v')), std::string::npos);
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

TEST(PageCopy, DirectoryBeyondTheFileEndsTheWalk) {
    Bytes source = BuildTiff({GreyPage(4, 2, 2)});
    Put32(source, 4, static_cast<uint32_t>(source.size() - 3));
    std::vector<std::string> errors;
    EXPECT_TRUE(ExtractFirst(source, &errors).empty());
    EXPECT_EQ(errors, std::vector<std::string>{"Source directory chain is damaged."});
}

}  // namespace
