// The metadata list a host receives from zanTIFFGetInfo.

#include <gtest/gtest.h>

#include <cstring>

#include <tiffio.h>

#include "../read/read_support.h"
#include "pivlo/pivlo.h"

namespace {

using namespace zantest;

// A reading job with a metadata list from the test allocator.
class MetadataJob : public ReadJob {
public:
    explicit MetadataJob(const Bytes& tiff, Source source = Source::Memory) : ReadJob(tiff, source) {
        list_ = pivloCreateMetadataList(TestAllocator::Alloc, TestAllocator::Free);
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

private:
    MetadataList* list_;
};

Bytes DescribedPage() {
    FileSpec spec;
    PageSpec& p = spec.pages[0];
    p.description = "described";
    p.documentName = "name";
    p.xResolution = 300;
    p.yResolution = 150;
    p.resolutionUnit = RESUNIT_INCH;
    p.iccProfile = Bytes(40, 9);
    return MakeTiff(spec);
}

TEST(MetadataReading, ImageTagsComeInTableOrderWithTheirForms) {
    MetadataJob job(DescribedPage());
    ASSERT_EQ(job.GetInfo(), 1);
    const auto image = job.Entries(ZAN_METADATA_IMAGE);
    std::vector<uint32_t> tags;
    for (const auto* e : image) tags.push_back(e->tag);
    EXPECT_EQ(tags, (std::vector<uint32_t>{269, 270, 282, 283, 296}));
    const MetadataEntry* description = job.Find(270);
    EXPECT_EQ(description->type, static_cast<uint32_t>(ZAN_METADATA_BLOCK));
    EXPECT_EQ(description->size, 10u);
    EXPECT_STREQ(static_cast<const char*>(description->value.block), "described");
    EXPECT_EQ(job.Find(282)->type, static_cast<uint32_t>(ZAN_METADATA_F32));
    EXPECT_EQ(job.Find(282)->value.f32, 300.0f);
    EXPECT_EQ(job.Find(296)->type, static_cast<uint32_t>(ZAN_METADATA_U16));
    EXPECT_EQ(job.Find(296)->value.u16[0], RESUNIT_INCH);
    const auto icc = job.Entries(ZAN_METADATA_ICC);
    ASSERT_EQ(icc.size(), 1u);
    EXPECT_EQ(icc[0]->size, 40u);
    EXPECT_NE(icc[0]->value.block, job->iccProfile) << "the list has its own copy";
    EXPECT_TRUE(job.Entries(ZAN_METADATA_EXIF).empty());
}

TEST(MetadataReading, ExifTagsArriveInTheirFormsAndThePageStaysReadable) {
    MetadataJob job(MakeExifTiff());
    ASSERT_EQ(job.GetInfo(), 1);
    const MetadataEntry* version = job.Find(EXIFTAG_EXIFVERSION);
    ASSERT_NE(version, nullptr);
    EXPECT_EQ(version->type, static_cast<uint32_t>(ZAN_METADATA_BLOCK));
    EXPECT_EQ(version->size, 4u);
    EXPECT_EQ(version->count, 0u);
    EXPECT_EQ(std::memcmp(version->value.block, "0231", 4), 0);
    const MetadataEntry* iso = job.Find(EXIFTAG_ISOSPEEDRATINGS);
    ASSERT_NE(iso, nullptr);
    EXPECT_EQ(iso->size, 6u);
    EXPECT_EQ(iso->count, 3u);
    EXPECT_EQ(static_cast<const uint16_t*>(iso->value.block)[2], 400);
    const MetadataEntry* fnumber = job.Find(EXIFTAG_FNUMBER);
    ASSERT_NE(fnumber, nullptr);
    EXPECT_EQ(fnumber->type, static_cast<uint32_t>(ZAN_METADATA_F32));
    EXPECT_EQ(fnumber->size, 4u);
    EXPECT_FLOAT_EQ(fnumber->value.f32, 2.8f);
    const MetadataEntry* date = job.Find(EXIFTAG_DATETIMEORIGINAL);
    ASSERT_NE(date, nullptr);
    EXPECT_EQ(date->group, static_cast<uint32_t>(ZAN_METADATA_EXIF));
    EXPECT_STREQ(static_cast<const char*>(date->value.block), "2024:05:06 07:08:09");
    // The image directory is current again after the EXIF directory.
    EXPECT_EQ(TIFFCurrentDirectory(job->tiff), 0u);
    EXPECT_EQ(job.ReadAll().size(), 8u);
}

TEST(MetadataReading, StreamSourcesKeepTheirPageReadableAndSkipExif) {
    MetadataJob job(MakeExifTiff(), Source::StreamBuffer);
    ASSERT_EQ(job.GetInfo(), 1);
    EXPECT_TRUE(job.Entries(ZAN_METADATA_EXIF).empty());
    EXPECT_EQ(job.host().Warnings(), std::vector<std::string>{"EXIF data of a stream source is not read."});
    EXPECT_EQ(job.ReadAll().size(), 8u);
}

TEST(MetadataReading, ListFailuresAreReportedAndThePageStaysUsable) {
    // The list allocates from the same test allocator after the job's own
    // allocations for the description; those are counted first.
    int own = 0;
    {
        ReadJob plain(DescribedPage());
        TestAllocator::Reset();
        ASSERT_EQ(plain.GetInfo(), 1);
        own = TestAllocator::Calls();
    }
    for (int n = 1;; ++n) {
        MetadataJob job(DescribedPage());
        TestAllocator::Reset();
        TestAllocator::FailNthCall(own + n);
        ASSERT_EQ(job.GetInfo(), 1) << "a metadata failure does not fail the call";
        const int calls = TestAllocator::Calls();
        TestAllocator::Reset();
        if (calls < own + n) break;
        const auto errors = job.host().Errors();
        ASSERT_EQ(errors.size(), 1u) << n;
        EXPECT_TRUE(errors[0] == "Memory allocation error" || errors[0] == "Error in storing metadata" ||
                    errors[0] == "Error in reading metadata")
            << errors[0];
        EXPECT_EQ(job.ReadAll().size(), 8u);
    }
}

}  // namespace
