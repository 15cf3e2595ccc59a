// Multi-page writing to every destination kind, the host's metadata applied
// to pages, and an EXIF directory on every page.

#include <gtest/gtest.h>

#include <tiffio.h>

#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "write_support.h"

namespace {

using namespace zantest;

// A metadata list of the test allocator, released with the object.
class Metadata {
public:
    Metadata() : list_(pivloCreateMetadataList(TestAllocator::Alloc, TestAllocator::Free)) {}
    ~Metadata() { pivloDestroyMetadataList(list_); }
    MetadataList* get() { return list_; }

    void Text(uint32_t group, uint32_t tag, const std::string& text) {
        MetadataEntry e{};
        e.group = group;
        e.tag = tag;
        e.type = ZAN_METADATA_BLOCK;
        e.size = static_cast<uint32_t>(text.size() + 1);
        e.value.block = list_->allocProc(e.size);
        std::memcpy(e.value.block, text.c_str(), e.size);
        zanAddToMetadataList(nullptr, list_, &e);
    }
    void Scalar(uint32_t group, uint32_t tag, uint32_t type, MetadataValue value, uint32_t size = 1) {
        MetadataEntry e{};
        e.group = group;
        e.tag = tag;
        e.type = type;
        e.size = size;
        e.value = value;
        zanAddToMetadataList(nullptr, list_, &e);
    }
    void Float(uint32_t group, uint32_t tag, float v) {
        MetadataValue value{};
        value.f32 = v;
        Scalar(group, tag, ZAN_METADATA_F32, value);
    }
    void Short(uint32_t group, uint32_t tag, uint16_t v) {
        MetadataValue value{};
        value.u16[0] = v;
        Scalar(group, tag, ZAN_METADATA_U16, value, group == ZAN_METADATA_EXIF ? 2 : 1);
    }
    // With `counted` false the entry gives only the block's byte length.
    void Array16(uint32_t tag, std::vector<uint16_t> values, bool counted = true) {
        MetadataEntry e{};
        e.group = ZAN_METADATA_EXIF;
        e.tag = tag;
        e.type = ZAN_METADATA_BLOCK;
        e.size = static_cast<uint32_t>(values.size() * 2);
        e.count = counted ? static_cast<uint32_t>(values.size()) : 0;
        e.value.block = list_->allocProc(e.size);
        std::memcpy(e.value.block, values.data(), e.size);
        zanAddToMetadataList(nullptr, list_, &e);
    }

private:
    MetadataList* list_;
};

// Three grey pages, each with its own EXIF FNumber when `exif` is set.
Bytes ThreePages(Dest dest, bool exif) {
    WriteJob job(dest);
    for (int page = 0; page < 3; ++page) {
        Metadata metadata;
        metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_ARTIST, "artist " + std::to_string(page));
        if (exif) {
            metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 1.5f + page);
            metadata.Text(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, "2024:01:0" + std::to_string(page + 1) + " 10:00:00");
            metadata.Array16(EXIFTAG_ISOSPEEDRATINGS, {100, 200});
            metadata.Text(ZAN_METADATA_EXIF, EXIFTAG_IMAGEUNIQUEID, "short id");
        }
        job->writeMetadataList = metadata.get();
        job.Describe(2, 12 + page, 7, page == 1 ? 7 : 1);
        EXPECT_TRUE(job.WriteRows(PatternRows(7, 12 + page, page)));
        if (page < 2) {
            EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
        } else {
            zanDestroyTIFF(job.host().ctx());  // the last page is finished by teardown
        }
        job->writeMetadataList = nullptr;
    }
    EXPECT_TRUE(job.host().Errors().empty()) << ::testing::PrintToString(job.host().Errors());
    return job.Finish();
}

TEST(MultiPage, EveryDestinationKindGivesTheSameFile) {
    for (bool exif : {false, true}) {
        const Bytes memory = ThreePages(Dest::Memory, exif);
        EXPECT_EQ(ThreePages(Dest::File, exif), memory) << exif;
        EXPECT_EQ(ThreePages(Dest::Callbacks, exif), memory) << exif;
        EXPECT_EQ(ThreePages(Dest::FixedBuffer, exif), memory) << exif;
        const auto pages = DecodeWithLibtiff(memory);
        ASSERT_EQ(pages.size(), 3u);
        EXPECT_EQ(pages[2].width, 14u);
    }
}

TEST(MultiPage, EveryPageCarriesItsOwnExifDirectory) {
    const Bytes tiff = ThreePages(Dest::Memory, true);
    for (uint32_t page = 0; page < 3; ++page) {
        PageReader reader(tiff, page);
        EXPECT_EQ(TIFFCurrentDirectory(reader.get()), page);
        EXPECT_EQ(reader.Text(TIFFTAG_ARTIST), "artist " + std::to_string(page));
        uint64_t offset = 0;
        ASSERT_TRUE(TIFFGetField(reader.get(), TIFFTAG_EXIFIFD, &offset)) << page;
        ASSERT_TRUE(TIFFReadEXIFDirectory(reader.get(), offset));
        float fnumber = 0;
        ASSERT_TRUE(TIFFGetField(reader.get(), EXIFTAG_FNUMBER, &fnumber));
        EXPECT_FLOAT_EQ(fnumber, 1.5f + page);
        EXPECT_EQ(reader.Text(EXIFTAG_DATETIMEORIGINAL), "2024:01:0" + std::to_string(page + 1) + " 10:00:00");
        uint16_t count = 0;
        uint16_t* iso = nullptr;
        ASSERT_TRUE(TIFFGetField(reader.get(), EXIFTAG_ISOSPEEDRATINGS, &count, &iso));
        EXPECT_EQ(count, 2);
        EXPECT_EQ(reader.Text(EXIFTAG_IMAGEUNIQUEID), std::string("short id") + std::string(24, ' '))
            << "a fixed-length EXIF text is padded so that readers keep it";
    }
    EXPECT_EQ(DecodeWithLibtiff(tiff).size(), 3u);
}

TEST(PageMetadata, GuardedTagsTheSetUpWroteAreKept) {
    WriteJob job;
    Metadata metadata;
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_SOFTWARE, "metadata software");
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_XRESOLUTION, 150);
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_YRESOLUTION, 75);
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_RESOLUTIONUNIT, RESUNIT_CENTIMETER);
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_XPOSITION, 1);
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_YPOSITION, 2);
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_MAKE, "maker");
    MetadataValue skipped{};
    skipped.u8 = 9;
    metadata.Scalar(ZAN_METADATA_IMAGE, TIFFTAG_MODEL, ZAN_METADATA_U8, skipped);
    job->writeMetadataList = metadata.get();
    job.Describe(2, 8, 2, 1);
    ASSERT_TRUE(job.WriteRows(PatternRows(2, 8)));
    job->writeMetadataList = nullptr;
    EXPECT_TRUE(job.host().Errors().empty());
    const Bytes tiff = job.Finish();
    PageReader page(tiff);
    EXPECT_EQ(page.Text(TIFFTAG_SOFTWARE), TIFFGetVersionLinePivlo());
    float x = 0, y = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_XRESOLUTION, &x));
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_YRESOLUTION, &y));
    EXPECT_EQ(x, 150.0f);
    EXPECT_EQ(y, 75.0f) << "both halves of a pair the page did not hold";
    EXPECT_EQ(page.U16(TIFFTAG_RESOLUTIONUNIT), static_cast<uint32_t>(RESUNIT_INCH));
    // The positions share one presence flag: the YPosition entry is passed
    // over once XPosition is set (libtiff then stores the pair, Y as 0).
    float xpos = -1, ypos = -1;
    EXPECT_TRUE(TIFFGetField(page.get(), TIFFTAG_XPOSITION, &xpos));
    EXPECT_EQ(xpos, 1.0f);
    TIFFGetField(page.get(), TIFFTAG_YPOSITION, &ypos);
    EXPECT_EQ(ypos, 0.0f) << "the metadata's YPosition of 2 does not reach the page";
    EXPECT_EQ(page.Text(TIFFTAG_MAKE), "maker");
    EXPECT_EQ(page.Text(TIFFTAG_MODEL), "") << "a type 2 entry is passed over";
}

TEST(PageMetadata, RefusedEntryStopsThePassWithAMessage) {
    WriteJob job;
    Metadata metadata;
    MetadataValue value{};
    value.u32 = 1;
    metadata.Scalar(ZAN_METADATA_IMAGE, 65000, ZAN_METADATA_U32, value);
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_MAKE, "after");
    job->writeMetadataList = metadata.get();
    job.Describe(2, 8, 2, 1);
    ASSERT_TRUE(job.WriteRows(PatternRows(2, 8))) << "the page goes on";
    job->writeMetadataList = nullptr;
    EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"Error in saving metadata"});
    PageReader page(job.Finish());
    EXPECT_EQ(page.Text(TIFFTAG_MAKE), "");
}

TEST(PageMetadata, ExifEntryOfAnUnknownTypeIsWarnedAbout) {
    WriteJob job;
    Metadata metadata;
    MetadataValue value{};
    metadata.Scalar(ZAN_METADATA_EXIF, EXIFTAG_EXPOSUREPROGRAM, ZAN_METADATA_AS_CODEC, value);
    metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 4);
    job->writeMetadataList = metadata.get();
    job.Describe(2, 8, 2, 1);
    ASSERT_TRUE(job.WriteRows(PatternRows(2, 8)));
    ASSERT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
    job->writeMetadataList = nullptr;
    EXPECT_EQ(job.host().Warnings(), std::vector<std::string>{"Unknown TIFF EXIF type"});
    PageReader page(job.Finish());
    uint64_t offset = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_EXIFIFD, &offset));
}

// One grey page with the EXIF entries of `fill`; the page's bytes.
template <typename Fill> Bytes PageWithExif(Fill fill) {
    WriteJob job;
    Metadata metadata;
    fill(metadata);
    job->writeMetadataList = metadata.get();
    job.Describe(2, 8, 2, 1);
    EXPECT_TRUE(job.WriteRows(PatternRows(2, 8)));
    EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
    job->writeMetadataList = nullptr;
    EXPECT_TRUE(job.host().Errors().empty());
    return job.Finish();
}

TEST(PageMetadata, ExifEntriesUnfitForTheirTagAreLeftOut) {
    const Bytes tiff = PageWithExif([](Metadata& m) {
        m.Array16(EXIFTAG_ISOSPEEDRATINGS, {100, 200, 400}, false);  // values counted from the bytes
        m.Short(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, 7);     // a number for a text
        m.Text(ZAN_METADATA_EXIF, EXIFTAG_EXPOSUREPROGRAM, "2");     // a text for a number
    });
    PageReader page(tiff);
    uint64_t offset = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_EXIFIFD, &offset));
    ASSERT_TRUE(TIFFReadEXIFDirectory(page.get(), offset));
    uint16_t count = 0, *iso = nullptr;
    ASSERT_TRUE(TIFFGetField(page.get(), EXIFTAG_ISOSPEEDRATINGS, &count, &iso));
    ASSERT_EQ(count, 3);
    EXPECT_EQ(iso[2], 400);
    char* text = nullptr;
    EXPECT_FALSE(TIFFGetField(page.get(), EXIFTAG_DATETIMEORIGINAL, &text));
    uint16_t program = 0;
    EXPECT_FALSE(TIFFGetField(page.get(), EXIFTAG_EXPOSUREPROGRAM, &program));

    const Bytes none = PageWithExif([](Metadata& m) { m.Short(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, 7); });
    PageReader plain(none);
    EXPECT_FALSE(TIFFGetField(plain.get(), TIFFTAG_EXIFIFD, &offset)) << "nothing taken, no EXIF directory";
    EXPECT_EQ(DecodeWithLibtiff(none).size(), 1u);
}

TEST(PageMetadata, ListWithoutExifLeavesThePageAsWritten) {
    auto write = [](bool withList) {
        WriteJob job;
        Metadata metadata;
        if (withList) job->writeMetadataList = metadata.get();
        job.Describe(8, 5, 5, 7);
        EXPECT_TRUE(job.WriteRows(PatternRows(5, 15)));
        EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
        job->writeMetadataList = nullptr;
        return job.Finish();
    };
    EXPECT_EQ(write(true), write(false));
}

TEST(Destinations, FixedBufferTooSmallFailsWithoutOverflow) {
    WriteJob job(Dest::FixedBuffer, 300);
    job.Describe(8, 64, 64, 1);
    const bool written = job.WriteRows(PatternRows(64, 192)) && zanTIFFNextImage(job.host().ctx());
    EXPECT_FALSE(written);
    EXPECT_FALSE(job.host().codecErrors.empty() && job.host().Errors().empty());
    job.Finish();
    EXPECT_LE(job.size(), 300u);
}

TEST(Destinations, AppendedPagesCarryTheirExifToo) {
    const Bytes first = ThreePages(Dest::Memory, true);
    TempFile file;
    WriteFileBytes(file.path(), first);
    WriteJob job(Dest::File);
    job->destPath = file.c_str();
    job->appendPages = 1;
    Metadata metadata;
    metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 8);
    job->writeMetadataList = metadata.get();
    job.Describe(2, 5, 5, 1);
    ASSERT_TRUE(job.WriteRows(PatternRows(5, 5)));
    ASSERT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
    job->writeMetadataList = nullptr;
    job.Finish();
    const Bytes all = ReadFileBytes(file.path());
    ASSERT_EQ(DecodeWithLibtiff(all).size(), 4u);
    PageReader page(all, 3);
    uint64_t offset = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_EXIFIFD, &offset));
    ASSERT_TRUE(TIFFReadEXIFDirectory(page.get(), offset));
    float fnumber = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), EXIFTAG_FNUMBER, &fnumber));
    EXPECT_EQ(fnumber, 8.0f);
    PageReader second(all, 1);
    ASSERT_TRUE(TIFFGetField(second.get(), TIFFTAG_EXIFIFD, &offset));
    ASSERT_TRUE(TIFFReadEXIFDirectory(second.get(), offset));
    ASSERT_TRUE(TIFFGetField(second.get(), EXIFTAG_FNUMBER, &fnumber));
    EXPECT_FLOAT_EQ(fnumber, 2.5f) << "the earlier pages keep theirs";
}

}  // namespace
