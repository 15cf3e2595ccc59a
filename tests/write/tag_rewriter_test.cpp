// Tag rewriting in place, checked by reading the file back with libtiff.

#include <gtest/gtest.h>

#include <algorithm>

#include <tiffio.h>

#include "write_support.h"

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

    TempFile file_;
    Bytes original_;
    TestHost host_;
};

TEST_F(TagRewriteTest, ValuesOfEveryFormAreWrittenToTheFirstPage) {
    const char* text = "rewritten";
    const float dpi = 300.0f;
    const uint16_t pages[2] = {1, 3};
    const uint16_t extra[1] = {EXTRASAMPLE_UNASSALPHA};  // on a grey page only for the test's sake
    const uint8_t xmp[5] = {'<', 'x', '/', '>', 0};
    const float white[2] = {0.3127f, 0.329f};
    const uint8_t undefined = 7;  // 50740 DNGPrivateData is UNDEFINED: a single value is passed over
    const int orientation = 3;
    // Per-sample values that libtiff keeps as one: the first is taken.
    const uint16_t minimum[3] = {10, 20, 30};
    const double sMaximum[2] = {7.0, 9.0};  // stored in the samples' own integer type
    // A text takes any count; a rational comes from a float, a pair from two words.
    ASSERT_EQ(Rewrite({270, 282, 297, 338, 700, 318, 50740, 274, 305, 280, 341},
                      {text, &dpi, pages, extra, xmp, white, &undefined, &orientation, text, minimum, sMaximum},
                      {12345, 1, 2, 1, 5, 2, 1, 1, 1, 3, 2}),
              1)
        << ::testing::PrintToString(host_.Errors());
    const Bytes tiff = ReadFileBytes(file_.path());
    PageReader page(tiff);
    EXPECT_EQ(TIFFNumberOfDirectories(page.get()), 2u);
    EXPECT_EQ(page.Text(TIFFTAG_IMAGEDESCRIPTION), "rewritten");
    EXPECT_EQ(page.F32(TIFFTAG_XRESOLUTION), 300.0f);
    EXPECT_EQ(page.U16(TIFFTAG_ORIENTATION), 3u);
    uint16_t number = 0, of = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_PAGENUMBER, &number, &of));
    EXPECT_EQ(number, 1);
    EXPECT_EQ(of, 3);
    uint32_t length = 0;
    void* packet = nullptr;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_XMLPACKET, &length, &packet));
    EXPECT_EQ(length, 5u);
    float* wp = nullptr;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_WHITEPOINT, &wp));
    EXPECT_FLOAT_EQ(wp[1], 0.329f);
    EXPECT_EQ(page.Text(TIFFTAG_SOFTWARE), "rewritten");
    EXPECT_EQ(page.U16(TIFFTAG_MINSAMPLEVALUE), 10u);
    double sMax = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_SMAXSAMPLEVALUE, &sMax));
    EXPECT_EQ(sMax, 7.0);
    EXPECT_EQ(PageReader(tiff, 1).Text(TIFFTAG_SOFTWARE), "") << "later pages keep their directories";
    EXPECT_EQ(DecodeWithLibtiff(tiff).size(), 2u);
}

TEST_F(TagRewriteTest, RefusedValuesAreNamedAndNothingChanges) {
    const char* a = "a";
    const float dpi = 300.0f;
    const uint16_t pair[2] = {1, 3}, map[6] = {0};
    const int value = 5;
    struct Case {
        std::vector<uint16_t> tags;
        std::vector<const void*> values;
        std::vector<uint32_t> counts;
        const char* message;
    } cases[] = {
        {{282}, {&dpi}, {2}, "Number of tag values is not enough. Expected 1 values for XResolution tag, got 2\n"},
        {{297}, {pair}, {1}, "Number of tag values is not enough. Expected 2 values for PageNumber tag, got 1\n"},
        {{270, 65000}, {a, &value}, {1, 1}, "Error getting field 65000"},  // the earlier entry is not written either
        {{270, 305, 274, 315, 316}, {a, a, nullptr, a, a}, {1, 1, 1, 1, 1}, "Error in tag data."},
        {{320}, {map}, {6}, "Failed to set ColorMap\n"},  // refused rather than misread
    };
    for (const Case& c : cases) {
        host_.ClearMessages();
        EXPECT_EQ(Rewrite(c.tags, c.values, c.counts), 0) << c.message;
        EXPECT_EQ(host_.Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(ReadFileBytes(file_.path()), original_) << c.message;
    }
}

TEST_F(TagRewriteTest, CallsThatCannotServeAreRefused) {
    const char* text = "x";
    const uint16_t tag = 270;
    const uint32_t count = 1;
    const void* values[1] = {text};
    auto rewrite = [&](const char* path, uint16_t n, const uint32_t* reserved) {
        return zanTIFFSetTIFFTags(host_.ctx(), path, n, &tag, values, &count, reserved);
    };
    // No tags, no reserved argument or no path: silently.
    EXPECT_EQ(rewrite(file_.c_str(), 0, &count), 0);
    EXPECT_EQ(rewrite(file_.c_str(), 1, nullptr), 0);
    EXPECT_EQ(rewrite(nullptr, 1, &count), 0);
    EXPECT_TRUE(host_.messages.empty());
    EXPECT_EQ(rewrite("/nonexistent/x.tif", 1, &count), 0);
    EXPECT_EQ(host_.Errors(), std::vector<std::string>{"Unable to open file."});
    host_.ClearMessages();
    TempFile junk;
    WriteFileBytes(junk.path(), Bytes(64, 'j'));
    EXPECT_EQ(rewrite(junk.c_str(), 1, &count), 0);
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
