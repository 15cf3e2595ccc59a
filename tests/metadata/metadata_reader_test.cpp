// The metadata list a host receives from zanTIFFGetInfo.

#include <gtest/gtest.h>

#include <cstring>
#include <tuple>

#include <tiffio.h>

#include "../read/read_support.h"
#include "pivlo/pivlo.h"

namespace {

using namespace zantest;

// An entry's group, type, size and count.
using EntryForm = std::tuple<uint32_t, uint32_t, uint32_t, uint32_t>;

// A reading job with a metadata list from the test allocator.
class MetadataJob : public ReadJob {
public:
    explicit MetadataJob(const Bytes& tiff, Source source = Source::Memory) : ReadJob(tiff, source) {
        host()->metadataList = list_;
    }
    ~MetadataJob() { pivloDestroyMetadataList(list_); }
    std::vector<const MetadataEntry*> Entries(uint32_t group) const {
        std::vector<const MetadataEntry*> found;
        for (const MetadataEntry* e = pivloMetadataListFirst(list_); e; e = e->next)
            if (e->group == group) found.push_back(e);
        return found;
    }
    const MetadataEntry* Find(uint32_t tag) const {
        for (const MetadataEntry* e = pivloMetadataListFirst(list_); e; e = e->next)
            if (e->tag == tag) return e;
        return nullptr;
    }
    // The form of the entry of `tag`, all zero when there is none.
    EntryForm FormOf(uint32_t tag) const {
        const MetadataEntry* e = Find(tag);
        return e ? EntryForm{e->group, e->type, e->size, e->count} : EntryForm{};
    }

private:
    MetadataList* list_ = pivloCreateMetadataList(TestAllocator::Alloc, TestAllocator::Free);
};

Bytes DescribedPage() {
    FileLayout file;
    PageLayout& p = file.pages[0];
    p.description = "described";
    p.documentName = "name";
    p.xResolution = 300;
    p.yResolution = 150;
    p.resolutionUnit = RESUNIT_INCH;
    p.iccProfile = Bytes(40, 9);
    return MakeTiff(file);
}

TEST(MetadataReading, ImageTagsComeInTableOrderWithTheirForms) {
    // Texts as blocks, resolutions as floats, the unit as a short, a copy of the ICC profile.
    MetadataJob job(DescribedPage());
    ASSERT_EQ(job.GetInfo(), 1);
    std::vector<uint32_t> tags;
    for (const auto* e : job.Entries(ZAN_METADATA_IMAGE)) tags.push_back(e->tag);
    EXPECT_EQ(tags, (std::vector<uint32_t>{269, 270, 282, 283, 296}));
    ASSERT_EQ(job.FormOf(270), EntryForm(ZAN_METADATA_IMAGE, ZAN_METADATA_BLOCK, 10, 0));
    EXPECT_STREQ(static_cast<const char*>(job.Find(270)->value.block), "described");
    ASSERT_EQ(job.FormOf(282), EntryForm(ZAN_METADATA_IMAGE, ZAN_METADATA_F32, 1, 0));
    EXPECT_EQ(job.Find(282)->value.f32, 300.0f);
    ASSERT_EQ(job.FormOf(296), EntryForm(ZAN_METADATA_IMAGE, ZAN_METADATA_U16, 1, 0));
    EXPECT_EQ(job.Find(296)->value.u16[0], RESUNIT_INCH);
    ASSERT_EQ(job.Entries(ZAN_METADATA_ICC).size(), 1u);
    ASSERT_EQ(job.FormOf(TIFFTAG_ICCPROFILE), EntryForm(ZAN_METADATA_ICC, ZAN_METADATA_BLOCK, 40, 0));
    EXPECT_NE(job.Find(TIFFTAG_ICCPROFILE)->value.block, job->iccProfile);
    EXPECT_TRUE(job.Entries(ZAN_METADATA_EXIF).empty());
}

TEST(MetadataReading, ExifTagsArriveInTheirFormsUnlessTheSourceIsAStream) {
    // Blocks (arrays with their count) and floats; a stream source gives none and a warning.
    MetadataJob job(MakeExifTiff());
    ASSERT_EQ(job.GetInfo(), 1);
    ASSERT_EQ(job.FormOf(EXIFTAG_EXIFVERSION), EntryForm(ZAN_METADATA_EXIF, ZAN_METADATA_BLOCK, 4, 0));
    EXPECT_EQ(std::memcmp(job.Find(EXIFTAG_EXIFVERSION)->value.block, "0231", 4), 0);
    ASSERT_EQ(job.FormOf(EXIFTAG_ISOSPEEDRATINGS), EntryForm(ZAN_METADATA_EXIF, ZAN_METADATA_BLOCK, 6, 3));
    EXPECT_EQ(static_cast<const uint16_t*>(job.Find(EXIFTAG_ISOSPEEDRATINGS)->value.block)[2], 400);
    ASSERT_EQ(job.FormOf(EXIFTAG_FNUMBER), EntryForm(ZAN_METADATA_EXIF, ZAN_METADATA_F32, 4, 0));
    EXPECT_FLOAT_EQ(job.Find(EXIFTAG_FNUMBER)->value.f32, 2.8f);
    ASSERT_EQ(job.FormOf(EXIFTAG_DATETIMEORIGINAL), EntryForm(ZAN_METADATA_EXIF, ZAN_METADATA_BLOCK, 20, 0));
    EXPECT_STREQ(static_cast<const char*>(job.Find(EXIFTAG_DATETIMEORIGINAL)->value.block), "2024:05:06 07:08:09");
    EXPECT_EQ(TIFFCurrentDirectory(job->tiff), 0u) << "the image directory is current again";
    EXPECT_EQ(job.ReadAll().size(), 8u);

    MetadataJob stream(MakeExifTiff(), Source::StreamBuffer);
    ASSERT_EQ(stream.GetInfo(), 1);
    EXPECT_TRUE(stream.Entries(ZAN_METADATA_EXIF).empty());
    EXPECT_EQ(stream.host().Warnings(), std::vector<std::string>{"EXIF data of a stream source is not read."});
    EXPECT_EQ(stream.ReadAll().size(), 8u);
}

TEST(MetadataReading, ListFailuresAreReportedAndThePageStaysUsable) {
    // A failure is named once; the call succeeds, the page stays readable, nothing leaks.
    int own = 0;  // the job's own allocations for the description come first
    {
        ReadJob plain(DescribedPage());
        TestAllocator::Reset();
        ASSERT_EQ(plain.GetInfo(), 1);
        own = TestAllocator::Calls();
    }
    for (int n = 1;; ++n) {
        int calls = 0;
        {
            MetadataJob job(DescribedPage());
            TestAllocator::Reset();
            TestAllocator::FailNthCall(own + n);
            ASSERT_EQ(job.GetInfo(), 1);
            calls = TestAllocator::Calls();
            TestAllocator::Reset();
            if (calls >= own + n) {
                const auto errors = job.host().Errors();
                ASSERT_EQ(errors.size(), 1u) << n;
                EXPECT_TRUE(errors[0] == "Memory allocation error" || errors[0] == "Error in storing metadata" ||
                            errors[0] == "Error in reading metadata")
                    << errors[0];
                EXPECT_EQ(job.ReadAll().size(), 8u);
            }
        }
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << n;
        if (calls < own + n) break;
    }
}

}  // namespace
