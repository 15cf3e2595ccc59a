// Tag rewriting in place, checked by reading the file back with libtiff.

#include <gtest/gtest.h>

#include <algorithm>

#include <tiffio.h>

#include "support/test_host.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace {

using namespace zantest;

class TagRewriteTest : public ::testing::Test {
protected:
    void SetUp() override {
        FileSpec spec;
        spec.pages.assign(2, PageSpec{});
        spec.pages[0].description = "original";
        WriteTiffFile(file_.path(), spec);
        original_ = ReadFileBytes(file_.path());
    }

    int Rewrite(std::vector<uint16_t> tags, std::vector<const void*> values,
                std::vector<uint32_t> counts) {
        static const int reserved = 0;
        return zanTIFFSetTIFFTags(host_.ctx(), file_.c_str(), static_cast<uint16_t>(tags.size()),
                                  tags.data(), values.data(), counts.data(), &reserved);
    }

    // Opens the rewritten file with libtiff on `page`.
    TIFF* Reopen(uint32_t page = 0) {
        tif_ = TIFFOpen(file_.c_str(), "r");
        if (tif_ && page) TIFFSetDirectory(tif_, page);
        return tif_;
    }
    void TearDown() override {
        if (tif_) TIFFClose(tif_);
    }

    TempFile file_;
    Bytes original_;
    TestHost host_;
    TIFF* tif_ = nullptr;
};

TEST_F(TagRewriteTest, TextTakesAnyCount) {
    const char* text = "rewritten";
    ASSERT_EQ(Rewrite({270}, {text}, {12345}), 1) << ::testing::PrintToString(host_.Errors());
    ASSERT_NE(Reopen(), nullptr);
    char* description = nullptr;
    ASSERT_TRUE(TIFFGetField(tif_, TIFFTAG_IMAGEDESCRIPTION, &description));
    EXPECT_STREQ(description, "rewritten");
    EXPECT_EQ(TIFFNumberOfDirectories(tif_), 2u);
}

TEST_F(TagRewriteTest, RationalFromAFloat) {
    const float dpi = 300.0f;
    ASSERT_EQ(Rewrite({282}, {&dpi}, {1}), 1);
    ASSERT_NE(Reopen(), nullptr);
    float x = 0;
    ASSERT_TRUE(TIFFGetField(tif_, TIFFTAG_XRESOLUTION, &x));
    EXPECT_EQ(x, 300.0f);
}

TEST_F(TagRewriteTest, PairFromTwoWords) {
    const uint16_t pages[2] = {1, 3};
    ASSERT_EQ(Rewrite({297}, {pages}, {2}), 1);
    ASSERT_NE(Reopen(), nullptr);
    uint16_t page = 0, of = 0;
    ASSERT_TRUE(TIFFGetField(tif_, TIFFTAG_PAGENUMBER, &page, &of));
    EXPECT_EQ(page, 1);
    EXPECT_EQ(of, 3);
}

TEST_F(TagRewriteTest, WrongNumberOfValuesIsNamedAndNothingChanges) {
    const float dpi = 300.0f;
    EXPECT_EQ(Rewrite({282}, {&dpi}, {2}), 0);
    const uint16_t pages[2] = {1, 3};
    EXPECT_EQ(Rewrite({297}, {pages}, {1}), 0);
    EXPECT_EQ(host_.Errors(), (std::vector<std::string>{
                                  "Number of tag values is not enough. Expected 1 values for XResolution tag, got 2\n",
                                  "Number of tag values is not enough. Expected 2 values for PageNumber tag, got 1\n"}));
    EXPECT_EQ(ReadFileBytes(file_.path()), original_);
}

TEST_F(TagRewriteTest, UnknownTagStopsBeforeTheRewrite) {
    const char* text = "x";
    const int value = 5;
    EXPECT_EQ(Rewrite({270, 65000}, {text, &value}, {1, 1}), 0);
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Error getting field 65000"});
    EXPECT_EQ(ReadFileBytes(file_.path()), original_) << "the earlier entry is not written either";
}

TEST_F(TagRewriteTest, NullValueInTheMiddleStopsTheCall) {
    const char* a = "a";
    const int orientation = 3;
    EXPECT_EQ(Rewrite({270, 305, 274, 315, 316}, {a, a, nullptr, a, a}, {1, 1, 1, 1, 1}), 0);
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Error in tag data."});
    EXPECT_EQ(ReadFileBytes(file_.path()), original_);
    (void)orientation;
}

TEST_F(TagRewriteTest, UndefinedSingleValueIsSkippedAndTheRestApplied) {
    const uint8_t undefined = 7;
    const int orientation = 3;
    // 50740 DNGPrivateData is UNDEFINED; a single value is passed over.
    ASSERT_EQ(Rewrite({50740, 274}, {&undefined, &orientation}, {1, 1}), 1)
        << ::testing::PrintToString(host_.Errors());
    ASSERT_NE(Reopen(), nullptr);
    uint16_t o = 0;
    ASSERT_TRUE(TIFFGetField(tif_, TIFFTAG_ORIENTATION, &o));
    EXPECT_EQ(o, 3);
}

TEST_F(TagRewriteTest, CountedArraysAndVariableBlocks) {
    const uint16_t extra[1] = {EXTRASAMPLE_UNASSALPHA};
    const uint8_t xmp[5] = {'<', 'x', '/', '>', 0};
    const float white[2] = {0.3127f, 0.329f};
    // ExtraSamples is written to a grey page only for the test's sake.
    ASSERT_EQ(Rewrite({338, 700, 318}, {extra, xmp, white}, {1, 5, 2}), 1)
        << ::testing::PrintToString(host_.Errors());
    ASSERT_NE(Reopen(), nullptr);
    uint32_t length = 0;
    void* packet = nullptr;
    ASSERT_TRUE(TIFFGetField(tif_, TIFFTAG_XMLPACKET, &length, &packet));
    EXPECT_EQ(length, 5u);
    float* wp = nullptr;
    ASSERT_TRUE(TIFFGetField(tif_, TIFFTAG_WHITEPOINT, &wp));
    EXPECT_FLOAT_EQ(wp[1], 0.329f);
}

TEST_F(TagRewriteTest, ColorMapIsRefusedRatherThanMisread) {
    const uint16_t map[6] = {0};
    EXPECT_EQ(Rewrite({320}, {map}, {6}), 0);
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Failed to set ColorMap\n"});
}

TEST_F(TagRewriteTest, LaterPagesKeepTheirDirectories) {
    const char* text = "first only";
    ASSERT_EQ(Rewrite({305}, {text}, {1}), 1);
    ASSERT_NE(Reopen(1), nullptr);
    char* software = nullptr;
    EXPECT_FALSE(TIFFGetField(tif_, TIFFTAG_SOFTWARE, &software));
    EXPECT_EQ(DecodeWithLibtiff(ReadFileBytes(file_.path())).size(), 2u);
}

TEST_F(TagRewriteTest, ArgumentsThatCannotServeAreRefusedSilently) {
    const char* text = "x";
    const uint16_t tag = 270;
    const uint32_t count = 1;
    const void* values[1] = {text};
    EXPECT_EQ(zanTIFFSetTIFFTags(host_.ctx(), file_.c_str(), 0, &tag, values, &count, &count), 0);
    EXPECT_EQ(zanTIFFSetTIFFTags(host_.ctx(), file_.c_str(), 1, &tag, values, &count, nullptr), 0);
    EXPECT_EQ(zanTIFFSetTIFFTags(host_.ctx(), nullptr, 1, &tag, values, &count, &count), 0);
    EXPECT_TRUE(host_.messages.empty());
}

TEST_F(TagRewriteTest, FilesThatCannotBeOpenedOrParsedAreReported) {
    const char* text = "x";
    const uint16_t tag = 270;
    const uint32_t count = 1;
    const void* values[1] = {text};
    EXPECT_EQ(zanTIFFSetTIFFTags(host_.ctx(), "/nonexistent/x.tif", 1, &tag, values, &count, &count), 0);
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Unable to open file."});
    host_.ClearMessages();
    TempFile junk;
    WriteFileBytes(junk.path(), Bytes(64, 'j'));
    EXPECT_EQ(zanTIFFSetTIFFTags(host_.ctx(), junk.c_str(), 1, &tag, values, &count, &count), 0);
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Unable to create a tiff object"});
    EXPECT_FALSE(host_.codecErrors.empty());
    EXPECT_EQ(host_->fileHandle, nullptr);
}

TEST_F(TagRewriteTest, RecordThatCannotBeHadReportsMemoryAllocation) {
    const char* text = "x";
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(Rewrite({270}, {text}, {1}), 0);
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Memory allocation"});
    TestAllocator::Reset();
    TestAllocator::FailNthCall(2);  // the codec layer's own record
    EXPECT_EQ(Rewrite({270}, {text}, {1}), 0);
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
}

TEST_F(TagRewriteTest, ImageDataIsUntouched) {
    // One uncompressed strip of 16 KiB: libtiff opens it for update as
    // several strips and writes that layout back; the pixels stay the same.
    FileSpec big;
    big.pages[0].width = 512;
    big.pages[0].height = 32;
    big.pages[0].rowsPerStrip = 32;
    WriteTiffFile(file_.path(), big);
    const Bytes before = ReadFileBytes(file_.path());
    const char* text = "big";
    ASSERT_EQ(Rewrite({270}, {text}, {1}), 1);
    const Bytes after = ReadFileBytes(file_.path());
    EXPECT_EQ(DumpPage(after, 0).data, DumpPage(before, 0).data);
    EXPECT_TRUE(std::equal(before.begin() + 8, before.begin() + 8 + 512 * 32, after.begin() + 8))
        << "the strip's bytes stay where they were";
}

}  // namespace
