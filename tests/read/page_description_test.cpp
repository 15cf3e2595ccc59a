// zanTIFFGetInfo: which page is described, and how, in the host's codes.

#include <gtest/gtest.h>

#include "read_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

Bytes ThreeWidths() {
    FileSpec spec;
    spec.pages.assign(3, PageSpec{});
    spec.pages[0].width = 10;
    spec.pages[1].width = 20;
    spec.pages[2].width = 30;
    return MakeTiff(spec);
}

TEST(PageSelection, PageNumberChoosesThePageDescribed) {
    // Below 1 the last page; beyond the file a refusal that closes the source.
    const Bytes tiff = ThreeWidths();
    const std::vector<std::pair<int, uint32_t>> widths = {{0, 30}, {2, 20}, {1, 10}, {3, 30}, {4, 0}};
    for (const auto& [page, width] : widths) {
        ReadJob job(tiff, Source::File);
        job->pageNumber = page;
        EXPECT_EQ(job.GetInfo(), width ? 1 : 0) << page;
        if (!width) {
            EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"Unable to access target page."});
            EXPECT_EQ(job->tiff, nullptr);
            EXPECT_EQ(job->fileHandle, nullptr);
            EXPECT_NE(job->state, static_cast<uint32_t>(ZAN_STATE_DESCRIBED));
            continue;
        }
        EXPECT_EQ(job->imageWidth, width) << page;
        EXPECT_EQ(job->pageCount, 3u);
        EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_DESCRIBED));
    }
}

TEST(PageSelection, StreamSourcesAreNotCounted) {
    ReadJob job(ThreeWidths(), Source::StreamBuffer);
    job->pageCount = 77;
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->pageCount, 77u);
    EXPECT_EQ(job->imageWidth, 10u) << "the first page stays current";
}

TEST(PageSelection, SecondCallCountsFromTheCurrentPage) {
    ReadJob job(ThreeWidths());
    job->pageNumber = 2;
    ASSERT_EQ(job.GetInfo(), 1);
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->pageCount, 2u) << "page 2 and the one after it";
}

TEST(PageDescription, ResolutionsAreInPixelsPerInch) {
    struct Case {
        uint16_t unit;
        float x, y;
        uint32_t hostUnit;
    } cases[] = {{RESUNIT_CENTIMETER, 100 * 2.54f, 50 * 2.54f, 2}, {RESUNIT_NONE, 0, 0, 0}, {RESUNIT_INCH, 100, 50, 1}};
    for (const Case& c : cases) {
        FileSpec spec;
        spec.pages[0].xResolution = 100;
        spec.pages[0].yResolution = 50;
        spec.pages[0].resolutionUnit = c.unit;
        ReadJob job(MakeTiff(spec));
        ASSERT_EQ(job.GetInfo(), 1);
        EXPECT_EQ(job->xResolution, c.x) << c.unit;
        EXPECT_EQ(job->yResolution, c.y) << c.unit;
        EXPECT_EQ(job->fileXResolution, 100.0f) << "the file's own value is kept";
        EXPECT_EQ(job->resolutionUnit, c.hostUnit) << c.unit;
    }
}

TEST(PageDescription, PhotometricValuesInTheHostsCodes) {
    struct Case {
        uint16_t photometric, samples, bits;
        uint32_t imageType, colorSpace;
    } cases[] = {
        {PHOTOMETRIC_MINISWHITE, 1, 1, 11, 1}, {PHOTOMETRIC_MINISBLACK, 1, 1, 12, 1},
        {PHOTOMETRIC_MINISWHITE, 1, 8, 13, 2}, {PHOTOMETRIC_MINISBLACK, 1, 8, 14, 2},
        {PHOTOMETRIC_RGB, 3, 8, 17, 8},        {PHOTOMETRIC_SEPARATED, 4, 8, 28, 5},
        {PHOTOMETRIC_SEPARATED, 2, 8, 21, 6},  {PHOTOMETRIC_CIELAB, 3, 8, 24, 8},
    };
    for (const Case& c : cases) {
        FileSpec spec;
        spec.pages[0].photometric = c.photometric;
        spec.pages[0].samplesPerPixel = c.samples;
        spec.pages[0].bitsPerSample = c.bits;
        ReadJob job(MakeTiff(spec));
        ASSERT_EQ(job.GetInfo(), 1);
        EXPECT_EQ(job->imageType, c.imageType) << c.photometric;
        EXPECT_EQ(job->colorSpace, c.colorSpace) << c.photometric;
        if (c.photometric == PHOTOMETRIC_SEPARATED) {
            EXPECT_EQ(job->inkFill, 0xFCFCFCFCu);
        }
    }
}

TEST(PageDescription, UnknownPhotometricKeepsTheImageTypeAndNoneIsRefused) {
    BuiltPage unknown = GreyPage(4, 2, 2);
    unknown.entries[4] = ShortEntry(262, {7});
    ReadJob job(BuildTiff({unknown}));
    job->imageType = 99;
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->imageType, 99u);
    EXPECT_EQ(job->colorSpace, 8u);

    BuiltPage none = GreyPage(4, 2, 2);
    none.entries.erase(none.entries.begin() + 4);  // 262
    ReadJob refused(BuildTiff({none}));
    EXPECT_EQ(refused.GetInfo(), 0);
    EXPECT_EQ(refused.host().Errors(), std::vector<std::string>{"Error getting tiff field."});
}

TEST(PageDescription, CompressionTilesTextsAndProfile) {
    FileSpec spec;
    PageSpec& p = spec.pages[0];
    p.compression = COMPRESSION_LZW;
    p.tileWidth = 16;
    p.tileHeight = 32;
    p.width = p.height = 40;
    p.description = "a description";
    p.documentName = "doc";
    p.iccProfile = Bytes(300, 0x42);
    p.fillOrder = FILLORDER_LSB2MSB;
    ReadJob job(MakeTiff(spec));
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->compression, static_cast<uint32_t>(ZAN_COMPRESSION_LZW));
    EXPECT_EQ(job->tileWidth, 16u);
    EXPECT_EQ(job->tileHeight, 32u);
    EXPECT_STREQ(job->imageDescription, "a description");
    EXPECT_STREQ(job->documentName, "doc");
    ASSERT_EQ(job->iccProfileSize, 300u);
    EXPECT_EQ(static_cast<const uint8_t*>(job->iccProfile)[299], 0x42);
    EXPECT_EQ(job->fillOrder, 2u);
    EXPECT_TRUE(TestAllocator::Owns(job->iccProfile)) << "copies come from the job's allocator";
}

TEST(PageDescription, CopiesOfAnEarlierPageAreReplaced) {
    FileSpec spec;
    spec.pages.assign(2, PageSpec{});
    spec.pages[0].description = "first";
    ReadJob job(MakeTiff(spec));
    job->pageNumber = 1;
    ASSERT_EQ(job.GetInfo(), 1);
    job->pageNumber = 2;
    job->state = ZAN_STATE_IDLE;
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->imageDescription, nullptr);
}

}  // namespace
