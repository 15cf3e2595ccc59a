// Tag rewriting in place, checked by reading the file back with libtiff.

#include <gtest/gtest.h>

#include <algorithm>

#include <tiffio.h>

#include "write_support.h"

namespace {

using namespace zantest;

class TagRewriteTest : public ::testing::Test {
protected:
    // Two pages, the first one uncompressed strip of 16 KiB (libtiff opens it
    // for update as several strips and writes that layout back).
    void SetUp() override {
        FileLayout pages;
        pages.pages.assign(2, PageLayout{});
        pages.pages[0].description = "original";
        pages.pages[0].width = 512;
        pages.pages[0].height = pages.pages[0].rowsPerStrip = 32;
        WriteTiffFile(file_.path(), pages);
        original_ = ReadFileBytes(file_.path());
    }

    int Rewrite(std::vector<uint16_t> tags, std::vector<const void*> values, std::vector<uint32_t> counts,
                const char* path = nullptr) {
        static const int reserved = 0;
        return zanTIFFSetTIFFTags(host_.ctx(), path ? path : file_.c_str(), static_cast<uint16_t>(tags.size()),
                                  tags.data(), values.data(), counts.data(), &reserved);
    }

    TempFile file_;
    Bytes original_;
    TestHost host_;
};

TEST_F(TagRewriteTest, ValuesOfEveryFormAreWrittenToTheFirstPage) {
    // libtiff reads every value back; the later page and the pixels stay.
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
    ExpectListing(DumpPage(tiff, 0).tags,
                  {"ImageDescription: rewritten", "Resolution: 300, 0", "Page Number: 1-3", "Software: rewritten",
                   "Extra Samples: 1<unassoc-alpha>", "XMLPacket (XMP Metadata):", "White Point: 0.3127-0.329",
                   "Orientation: row 0 bottom, col 0 rhs", "Min Sample Value: 10", "SMax Sample Value: 7"});
    EXPECT_NE(DumpPage(tiff, 0).tags.find(std::string("\n<x/>\0\n", 7)), std::string::npos) << "all 5 bytes of XMP";
    ExpectListing(DumpPage(tiff, 1).tags, {}, {"Software"});
    EXPECT_EQ(DecodeWithLibtiff(tiff).size(), 2u);
    EXPECT_EQ(DumpPage(tiff, 0).data, DumpPage(original_, 0).data);
    EXPECT_TRUE(std::equal(original_.begin() + 8, original_.begin() + 8 + 512 * 32, tiff.begin() + 8))
        << "the strip's bytes stay where they were";
}

TEST_F(TagRewriteTest, RefusedCallsAreNamedAndNothingChanges) {
    // Each refusal is named, the file stays as it was and nothing leaks.
    TempFile junk;
    WriteFileBytes(junk.path(), Bytes(64, 'j'));
    const char* a = "a";
    const float dpi = 300.0f;
    const uint16_t pair[2] = {1, 3}, map[6] = {0};
    const int value = 5;
    const std::string noTiff = "Unable to create a tiff object";
    struct Case {
        std::vector<uint16_t> tags;
        std::vector<const void*> values;
        std::vector<uint32_t> counts;
        std::string message;
        const char* path = nullptr;
        int failedAllocation = 0;
    } cases[] = {
        {{282}, {&dpi}, {2}, "Number of tag values is not enough. Expected 1 values for XResolution tag, got 2\n"},
        {{297}, {pair}, {1}, "Number of tag values is not enough. Expected 2 values for PageNumber tag, got 1\n"},
        {{270, 65000}, {a, &value}, {1, 1}, "Error getting field 65000"},  // the earlier entry is not written either
        {{270, 305, 274, 315, 316}, {a, a, nullptr, a, a}, {1, 1, 1, 1, 1}, "Error in tag data."},
        {{320}, {map}, {6}, "Failed to set ColorMap\n"},  // refused rather than misread
        {{270}, {a}, {1}, "Unable to open file.", "/nonexistent/x.tif"},
        {{270}, {a}, {1}, noTiff, junk.c_str()},
        {{270}, {a}, {1}, "Memory allocation", nullptr, 1},  // the module's file record
        {{270}, {a}, {1}, noTiff, nullptr, 2},                // the codec layer's own record
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.message);
        host_.ClearMessages();
        TestAllocator::FailNthCall(c.failedAllocation);
        EXPECT_EQ(Rewrite(c.tags, c.values, c.counts, c.path), 0);
        TestAllocator::Reset();
        EXPECT_EQ(host_.Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(host_.codecErrors.empty(), c.message != noTiff);
        EXPECT_EQ(host_->fileHandle, nullptr);
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
        EXPECT_EQ(ReadFileBytes(file_.path()), original_);
    }
    // Calls without tags, reserved argument or path are refused silently.
    host_.ClearMessages();
    const uint32_t one = 1;
    const void* values[1] = {a};
    const uint16_t tag = 270;
    EXPECT_EQ(zanTIFFSetTIFFTags(host_.ctx(), file_.c_str(), 0, &tag, values, &one, &one), 0);
    EXPECT_EQ(zanTIFFSetTIFFTags(host_.ctx(), file_.c_str(), 1, &tag, values, &one, nullptr), 0);
    EXPECT_EQ(zanTIFFSetTIFFTags(host_.ctx(), nullptr, 1, &tag, values, &one, &one), 0);
    EXPECT_TRUE(host_.messages.empty());
    EXPECT_EQ(ReadFileBytes(file_.path()), original_);
}

}  // namespace
