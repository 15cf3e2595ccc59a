// zanTIFFGetInfo: which page is described, and how, in the host's codes.

#include <gtest/gtest.h>

#include "read_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

FileSpec ThreeWidths() {
    FileSpec spec;
    spec.pages.assign(3, PageSpec{});
    spec.pages[0].width = 10;
    spec.pages[1].width = 20;
    spec.pages[2].width = 30;
    return spec;
}

TEST(PageSelection, PageNumberChoosesThePageDescribed) {
    const Bytes tiff = MakeTiff(ThreeWidths());
    for (const auto& [page, width] : std::vector<std::pair<int, uint32_t>>{{0, 30}, {2, 20}, {1, 10}, {3, 30}}) {
        ReadJob job(tiff);
        job->pageNumber = page;
        ASSERT_EQ(job.GetInfo(), 1) << page;
        EXPECT_EQ(job->imageWidth, width) << page;
        EXPECT_EQ(job->pageCount, 3u);
        EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_DESCRIBED));
    }
}

TEST(PageSelection, PageBeyondTheFileFailsAndClosesTheSource) {
    ReadJob job(MakeTiff(ThreeWidths()), Source::File);
    job->pageNumber = 4;
    EXPECT_EQ(job.GetInfo(), 0);
    EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"Unable to access target page."});
    EXPECT_EQ(job->tiff, nullptr);
    EXPECT_EQ(job->fileHandle, nullptr);
    EXPECT_NE(job->state, static_cast<uint32_t>(ZAN_STATE_DESCRIBED));
}

TEST(PageSelection, StreamSourcesAreNotCounted) {
    ReadJob job(MakeTiff(ThreeWidths()), Source::StreamBuffer);
    job->pageCount = 77;
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->pageCount, 77u);
    EXPECT_EQ(job->imageWidth, 10u) << "the first page stays current";
}

TEST(PageSelection, SecondCallCountsFromTheCurrentPage) {
    ReadJob job(MakeTiff(ThreeWidths()));
    job->pageNumber = 2;
    ASSERT_EQ(job.GetInfo(), 1);
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->pageCount, 2u) << "page 2 and the one after it";
}

TEST(PageDescription, ResolutionsAreInPixelsPerInch) {
    FileSpec cm;
    cm.pages[0].xResolution = 100;
    cm.pages[0].yResolution = 50;
    cm.pages[0].resolutionUnit = RESUNIT_CENTIMETER;
    ReadJob a(MakeTiff(cm));
    ASSERT_EQ(a.GetInfo(), 1);
    EXPECT_EQ(a->xResolution, 100.0f * 2.54f);
    EXPECT_EQ(a->yResolution, 50.0f * 2.54f);
    EXPECT_EQ(a->fileXResolution, 100.0f);
    EXPECT_EQ(a->resolutionUnit, 2u);

    FileSpec none = cm;
    none.pages[0].resolutionUnit = RESUNIT_NONE;
    ReadJob b(MakeTiff(none));
    ASSERT_EQ(b.GetInfo(), 1);
    EXPECT_EQ(b->xResolution, 0.0f);
    EXPECT_EQ(b->fileXResolution, 100.0f);
    EXPECT_EQ(b->resolutionUnit, 0u);

    FileSpec inch = cm;
    inch.pages[0].resolutionUnit = RESUNIT_INCH;
    ReadJob c(MakeTiff(inch));
    ASSERT_EQ(c.GetInfo(), 1);
    EXPECT_EQ(c->xResolution, 100.0f);
    EXPECT_EQ(c->resolutionUnit, 1u);
}

TEST(PageDescription, SurplusSamplesAreExtraSamples) {
    FileSpec rgba;
    rgba.pages[0].samplesPerPixel = 4;
    rgba.pages[0].photometric = PHOTOMETRIC_RGB;  // no ExtraSamples tag
    for (uint32_t drop : {0u, 1u}) {
        ReadJob job(MakeTiff(rgba));
        job->dropExtraSamples = drop;
        ASSERT_EQ(job.GetInfo(), 1);
        EXPECT_EQ(job->samplesPerPixel, drop ? 3u : 4u);
        EXPECT_EQ(job->extraSamples, drop ? 0u : 1u);
        EXPECT_EQ(job->imageType, static_cast<uint32_t>(ZAN_IMAGE_RGB));
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

TEST(PageDescription, UnknownPhotometricKeepsTheImageType) {
    BuiltPage page = GreyPage(4, 2, 2);
    page.entries[4] = ShortEntry(262, {7});
    ReadJob job(BuildTiff({page}));
    job->imageType = 99;
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->imageType, 99u);
    EXPECT_EQ(job->colorSpace, 8u);
}

TEST(PageDescription, PageWithoutPhotometricIsRefused) {
    BuiltPage page = GreyPage(4, 2, 2);
    page.entries.erase(page.entries.begin() + 4);  // 262
    ReadJob job(BuildTiff({page}));
    EXPECT_EQ(job.GetInfo(), 0);
    EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"Error getting tiff field."});
}

TEST(PageDescription, CompressionTilesTextsAndProfile) {
    FileSpec spec;
    PageSpec& p = spec.pages[0];
    p.compression = COMPRESSION_LZW;
    p.tileWidth = 16;
    p.tileHeight = 32;
    p.width = 40;
    p.height = 40;
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

TEST(PageDescription, EveryAllocationCanFailCleanly) {
    FileSpec spec;
    spec.pages[0].description = "d";
    spec.pages[0].documentName = "n";
    spec.pages[0].iccProfile = Bytes(16, 1);
    const Bytes tiff = MakeTiff(spec);
    for (int n = 1;; ++n) {
        ReadJob job(tiff, Source::File);
        TestAllocator::Reset();
        TestAllocator::FailNthCall(n);
        const int result = job.GetInfo();
        const int calls = TestAllocator::Calls();
        if (!result) {
            EXPECT_FALSE(job.host().Errors().empty()) << n;
            EXPECT_EQ(job->tiff, nullptr) << n;
        }
        TestAllocator::Reset();
        if (calls < n) {
            EXPECT_EQ(result, 1);
            break;
        }
    }
}

}  // namespace
