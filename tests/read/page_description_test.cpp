// zanTIFFGetInfo: which page is described, and how, in the host's codes.

#include "read_support.h"

namespace {

using namespace zantest;

Bytes ThreeWidths() {
    FileLayout layout;
    layout.pages = {Page(10, 8), Page(20, 8), Page(30, 8)};
    return MakeTiff(layout);
}

TEST(PageSelection, PageNumberChoosesThePageDescribed) {
    // Below 1 the last page; beyond the file a refusal that closes the source.
    const Bytes tiff = ThreeWidths();
    const std::vector<std::pair<int, uint32_t>> widths = {{0, 30}, {2, 20}, {1, 10}, {3, 30}, {4, 0}};
    for (const auto& [page, width] : widths) {
        SCOPED_TRACE(page);
        ReadJob job(tiff, Source::File);
        job->pageNumber = page;
        EXPECT_EQ(job.GetInfo(), width ? 1 : 0);
        if (!width) {
            EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"Unable to access target page."});
            EXPECT_EQ(job->tiff, nullptr);
            EXPECT_EQ(job->fileHandle, nullptr);
            EXPECT_NE(job->state, static_cast<uint32_t>(ZAN_STATE_DESCRIBED));
            continue;
        }
        EXPECT_EQ(job->imageWidth, width);
        EXPECT_EQ(job->pageCount, 3u);
        EXPECT_EQ(job->state, static_cast<uint32_t>(ZAN_STATE_DESCRIBED));
    }
}

TEST(PageSelection, PagesAreCountedFromTheCurrentPageAndNotOnStreams) {
    // A second call counts from the page described; a stream is not counted
    // at all, and its first page stays current.
    ReadJob job(ThreeWidths());
    job->pageNumber = 2;
    ASSERT_EQ(job.GetInfo(), 1);
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->pageCount, 2u);
    ReadJob stream(ThreeWidths(), Source::StreamBuffer);
    stream->pageCount = 77;
    ASSERT_EQ(stream.GetInfo(), 1);
    EXPECT_EQ(stream->pageCount, 77u);
    EXPECT_EQ(stream->imageWidth, 10u);
}

TEST(PageDescription, PhotometricAndResolutionInTheHostsCodes) {
    // imageType and colorSpace codes (a photometric value the host has no
    // code for keeps the imageType the host had); resolutions in pixels per
    // inch (0 without a unit), the unit's code and the stored value.
    const struct Case {
        uint16_t photometric, samples, bits;
        uint32_t imageType, colorSpace;
        uint16_t unit;
        float x;
        uint32_t hostUnit;
    } cases[] = {
        {PHOTOMETRIC_MINISWHITE, 1, 1, 11, 1, RESUNIT_INCH, 100, 1},
        {PHOTOMETRIC_MINISBLACK, 1, 1, 12, 1, RESUNIT_CENTIMETER, 254, 2},
        {PHOTOMETRIC_MINISWHITE, 1, 8, 13, 2, RESUNIT_NONE, 0, 0},
        {PHOTOMETRIC_MINISBLACK, 1, 8, 14, 2, RESUNIT_INCH, 100, 1},
        {PHOTOMETRIC_RGB, 3, 8, 17, 8, RESUNIT_INCH, 100, 1},
        {PHOTOMETRIC_SEPARATED, 4, 8, 28, 5, RESUNIT_INCH, 100, 1},
        {PHOTOMETRIC_SEPARATED, 2, 8, 21, 6, RESUNIT_INCH, 100, 1},
        {PHOTOMETRIC_CIELAB, 3, 8, 24, 8, RESUNIT_INCH, 100, 1},
        {7, 1, 8, 99, 8, RESUNIT_INCH, 100, 1},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.photometric);
        PageLayout p = Page(4, 2, c.samples, c.photometric, c.bits);
        p.xResolution = 100;
        p.yResolution = 50;
        p.resolutionUnit = c.unit;
        ReadJob job(OnePage(p));
        job->imageType = 99;
        ASSERT_EQ(job.GetInfo(), 1);
        EXPECT_EQ(job->imageType, c.imageType);
        EXPECT_EQ(job->colorSpace, c.colorSpace);
        EXPECT_EQ(job->inkFill, c.photometric == PHOTOMETRIC_SEPARATED ? 0xFCFCFCFCu : 0u);
        EXPECT_FLOAT_EQ(job->xResolution, c.x);
        EXPECT_FLOAT_EQ(job->yResolution, c.x / 2);
        EXPECT_EQ(job->fileXResolution, 100.0f);
        EXPECT_EQ(job->resolutionUnit, c.hostUnit);
    }
    // A page without PhotometricInterpretation is refused.
    BuiltPage none = GreyPage(4, 2, 2);
    none.entries.erase(none.entries.begin() + 4);  // 262
    ReadJob refused(BuildTiff({none}));
    EXPECT_EQ(refused.GetInfo(), 0);
    EXPECT_EQ(refused.host().Errors(), std::vector<std::string>{"Error getting tiff field."});
}

TEST(PageDescription, CompressionTilesTextsAndProfileAndTheirReplacement) {
    // Copies come from the job's allocator; the next page's description
    // replaces them.
    FileLayout layout;
    layout.pages.assign(2, Page(40, 40));
    PageLayout& p = layout.pages[0];
    p.compression = COMPRESSION_LZW;
    p.tileWidth = 16;
    p.tileHeight = 32;
    p.description = "a description";
    p.documentName = "doc";
    p.iccProfile = Bytes(300, 0x42);
    p.fillOrder = FILLORDER_LSB2MSB;
    ReadJob job(MakeTiff(layout));
    job->pageNumber = 1;
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->compression, static_cast<uint32_t>(ZAN_COMPRESSION_LZW));
    EXPECT_EQ(job->tileWidth, 16u);
    EXPECT_EQ(job->tileHeight, 32u);
    EXPECT_STREQ(job->imageDescription, "a description");
    EXPECT_STREQ(job->documentName, "doc");
    ASSERT_EQ(job->iccProfileSize, 300u);
    EXPECT_EQ(static_cast<const uint8_t*>(job->iccProfile)[299], 0x42);
    EXPECT_EQ(job->fillOrder, 2u);
    EXPECT_TRUE(TestAllocator::Owns(job->iccProfile));
    job->pageNumber = 2;
    job->state = ZAN_STATE_IDLE;
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_EQ(job->imageDescription, nullptr);
    EXPECT_EQ(job->iccProfileSize, 0u);
}

}  // namespace
