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

    void Add(uint32_t group, uint32_t tag, uint32_t type, MetadataValue value, uint32_t size = 1, uint32_t count = 0) {
        MetadataEntry e{.group = group, .tag = tag, .count = count, .type = type, .size = size, .value = value,
                        .next = nullptr};
        zanAddToMetadataList(nullptr, list_, &e);
    }
    // A copy of `size` bytes; `count` values, or 0 when only the byte length is given.
    void Block(uint32_t group, uint32_t tag, const void* data, size_t size, size_t count = 0) {
        MetadataValue value{};
        value.block = list_->allocProc(static_cast<uint32_t>(size));
        std::memcpy(value.block, data, size);
        Add(group, tag, ZAN_METADATA_BLOCK, value, static_cast<uint32_t>(size), static_cast<uint32_t>(count));
    }
    void Text(uint32_t group, uint32_t tag, const std::string& text) {
        Block(group, tag, text.c_str(), text.size() + 1);
    }
    void Array16(uint32_t tag, const std::vector<uint16_t>& values, bool counted = true) {
        Block(ZAN_METADATA_EXIF, tag, values.data(), values.size() * 2, counted ? values.size() : 0);
    }
    void Float(uint32_t group, uint32_t tag, float v) {
        MetadataValue value{};
        value.f32 = v;
        Add(group, tag, ZAN_METADATA_F32, value);
    }
    void Short(uint32_t group, uint32_t tag, uint16_t v) {
        MetadataValue value{};
        value.u16[0] = v;
        Add(group, tag, ZAN_METADATA_U16, value, group == ZAN_METADATA_EXIF ? 2 : 1);
    }

private:
    MetadataList* list_;
};

std::string DateTaken(int page) { return "2024:01:0" + std::to_string(page + 1) + " 10:00:00"; }

// Three grey pages, 12 to 14 pixels wide, each with its own artist and EXIF
// entries; the last one finished by teardown.
Bytes ThreePages(Dest dest) {
    WriteJob job(dest);
    for (int page = 0; page < 3; ++page) {
        Metadata metadata;
        metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_ARTIST, "artist " + std::to_string(page));
        metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 1.5f + page);
        metadata.Text(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, DateTaken(page));
        metadata.Array16(EXIFTAG_ISOSPEEDRATINGS, {100, 200});
        metadata.Text(ZAN_METADATA_EXIF, EXIFTAG_IMAGEUNIQUEID, "short id");
        job->writeMetadataList = metadata.get();
        job.Describe(2, 12 + page, 7, page == 1 ? 7 : 1);
        EXPECT_TRUE(job.WriteRows(PatternRows(7, 12 + page, page)));
        if (page < 2) {
            EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
        } else {
            zanDestroyTIFF(job.host().ctx());
        }
        job->writeMetadataList = nullptr;
    }
    EXPECT_TRUE(job.host().Errors().empty()) << ::testing::PrintToString(job.host().Errors());
    return job.Finish();
}

// One 8x2 grey page written with `metadata` (no list when null), closed by
// zanTIFFNextImage: the bytes written and the host's messages.
struct Written {
    Bytes tiff;
    std::vector<std::string> errors, warnings;
};
Written WritePage(Metadata* metadata) {
    WriteJob job;
    if (metadata) job->writeMetadataList = metadata->get();
    job.Describe(2, 8, 2, 1);
    EXPECT_TRUE(job.WriteRows(PatternRows(2, 8))) << "metadata never stops the page";
    EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
    job->writeMetadataList = nullptr;
    return {job.Finish(), job.host().Errors(), job.host().Warnings()};
}

// The FNumber of a page's EXIF directory: 0 without the directory, -1 without the tag.
float FNumber(const Bytes& tiff, uint32_t page) {
    PageReader reader(tiff, page);
    return reader.OpenExif() ? reader.F32(EXIFTAG_FNUMBER) : 0;
}

TEST(MultiPage, EveryDestinationKindGivesTheSameFileWithEachPagesExif) {
    // Pages with EXIF directories: the codec reads back what it wrote on
    // every destination kind.
    const Bytes tiff = ThreePages(Dest::Memory);
    for (Dest dest : {Dest::File, Dest::Callbacks, Dest::FixedBuffer})
        EXPECT_EQ(ThreePages(dest), tiff) << static_cast<int>(dest);
    const auto pages = DecodeWithLibtiff(tiff);
    ASSERT_EQ(pages.size(), 3u);
    EXPECT_EQ(pages[2].width, 14u);
    for (uint32_t page = 0; page < 3; ++page) {
        SCOPED_TRACE(page);
        EXPECT_FLOAT_EQ(FNumber(tiff, page), 1.5f + page);
        PageReader reader(tiff, page);
        EXPECT_EQ(reader.Text(TIFFTAG_ARTIST), "artist " + std::to_string(page));
        ASSERT_TRUE(reader.OpenExif());
        EXPECT_EQ(reader.Text(EXIFTAG_DATETIMEORIGINAL), DateTaken(page));
        uint16_t count = 0, *iso = nullptr;
        ASSERT_TRUE(TIFFGetField(reader.get(), EXIFTAG_ISOSPEEDRATINGS, &count, &iso));
        EXPECT_EQ(count, 2);
        EXPECT_EQ(reader.Text(EXIFTAG_IMAGEUNIQUEID), std::string("short id") + std::string(24, ' '))
            << "a fixed-length EXIF text is padded so that readers keep it";
    }
}

TEST(MultiPage, NextImageEndsOnlyAPageBeingWritten) {
    // A second call in a row has no page to end (it would write an empty
    // directory that readers reject).
    WriteJob job;
    job.Describe(2, 6, 3, 1);
    ASSERT_TRUE(job.WriteRows(PatternRows(3, 6)));
    EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
    EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 0);
    EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"No page is being written."});
    job.Describe(2, 9, 3, 1);
    ASSERT_TRUE(job.WriteRows(PatternRows(3, 9)));
    const auto pages = DecodeWithLibtiff(job.Finish());
    ASSERT_EQ(pages.size(), 2u);
    EXPECT_EQ(pages[1].width, 9u);
}

// A callback destination whose write of an EXIF directory holding FNumber
// alone (one entry, tag 33437) fails, once.
struct ExifFailingStream : MemoryStream {
    bool failed = false;
    static int32_t Write(const void* buffer, int32_t n, void* user) {
        auto* s = static_cast<ExifFailingStream*>(user);
        const auto* b = static_cast<const uint8_t*>(buffer);
        if (!s->failed && n == 18 && b[0] == 1 && b[1] == 0 && b[2] == 0x9D && b[3] == 0x82) {
            s->failed = true;
            return -1;
        }
        return MemoryStream::Write(buffer, n, user);
    }
};

TEST(MultiPage, FailedExifDirectoryLeavesEveryPageWhole) {
    // The page whose EXIF directory could not be written stays as it was
    // written (without an EXIF link), and the next page gets a directory of
    // its own instead of rewriting it.
    WriteJob job(Dest::Callbacks);
    ExifFailingStream stream;
    job->destWriteProc = ExifFailingStream::Write;
    job->destUserData = job->sourceUserData = &stream;
    for (int page = 0; page < 2; ++page) {
        Metadata metadata;
        metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 2.0f + page);
        job->writeMetadataList = metadata.get();
        job.Describe(2, 6 + page, 3, 1);
        ASSERT_TRUE(job.WriteRows(PatternRows(3, 6 + page, page)));
        EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1) << page;
        job->writeMetadataList = nullptr;
    }
    job.Finish();
    EXPECT_TRUE(stream.failed);
    EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"TIFF EXIF write error"});
    const auto pages = DecodeWithLibtiff(stream.data);
    ASSERT_EQ(pages.size(), 2u);
    for (uint32_t page = 0; page < 2; ++page) {
        EXPECT_EQ(pages[page].width, 6 + page);
        Bytes pixels;
        for (const Bytes& row : PatternRows(3, 6 + page, page)) pixels.insert(pixels.end(), row.begin(), row.end());
        EXPECT_EQ(pages[page].pixels, pixels) << page;
    }
    EXPECT_EQ(FNumber(stream.data, 0), 0.0f) << "no EXIF link to a directory that is not there";
    EXPECT_EQ(FNumber(stream.data, 1), 3.0f);
}

TEST(MultiPage, ExifCostsTheSameForEveryPage) {
    // The destination is read back a fixed number of times a page: a
    // job of twice the pages reads about twice as often (a walk of the
    // chain for every page made it four times).
    auto readsFor = [](int pages) {
        WriteJob job(Dest::Callbacks);
        Metadata metadata;
        metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 2.8f);
        job->writeMetadataList = metadata.get();
        for (int page = 0; page < pages; ++page) {
            job.Describe(2, 4, 2, 1);
            EXPECT_TRUE(job.WriteRows(PatternRows(2, 4)));
            EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1);
        }
        job->writeMetadataList = nullptr;
        const Bytes tiff = job.Finish();
        EXPECT_EQ(DecodeWithLibtiff(tiff).size(), static_cast<size_t>(pages));
        EXPECT_EQ(FNumber(tiff, static_cast<uint32_t>(pages - 1)), 2.8f);
        return static_cast<const MemoryStream*>(job->sourceUserData)->reads;
    };
    const int few = readsFor(40), many = readsFor(80);
    EXPECT_LT(many, few * 5 / 2) << few << " reads for 40 pages, " << many << " for 80";
}

TEST(PageMetadata, PerSampleFieldsTakeOneValueAndTheEntriesAfterThemArrive) {
    // The forms the metadata reader gives these fields; the entries behind
    // them (a text, a resolution, the ICC profile) still reach the page.
    Metadata metadata;
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_UINT);
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_MINSAMPLEVALUE, 3);
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_MAXSAMPLEVALUE, 250);
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_DATATYPE, 1);
    MetadataValue low{}, high{};
    low.f64 = 2.0;  // stored in the samples' own integer type
    high.f64 = 240.0;
    metadata.Add(ZAN_METADATA_IMAGE, TIFFTAG_SMINSAMPLEVALUE, ZAN_METADATA_AS_CODEC, low);
    metadata.Add(ZAN_METADATA_IMAGE, TIFFTAG_SMAXSAMPLEVALUE, ZAN_METADATA_AS_CODEC, high);
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_ARTIST, "after them");
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_XRESOLUTION, 200);
    const uint8_t profile[8] = {1, 2, 3, 4, 5, 6, 7, 8};
    metadata.Block(ZAN_METADATA_ICC, TIFFTAG_ICCPROFILE, profile, sizeof profile);
    const Written written = WritePage(&metadata);
    EXPECT_TRUE(written.errors.empty()) << ::testing::PrintToString(written.errors);
    PageReader page(written.tiff);
    EXPECT_EQ(page.U16(TIFFTAG_MINSAMPLEVALUE), 3u);
    EXPECT_EQ(page.U16(TIFFTAG_MAXSAMPLEVALUE), 250u);
    double sMin = 0;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_SMINSAMPLEVALUE, &sMin));
    EXPECT_EQ(sMin, 2.0);
    EXPECT_EQ(page.Text(TIFFTAG_ARTIST), "after them");
    EXPECT_EQ(page.F32(TIFFTAG_XRESOLUTION), 200.0f);
    uint32_t size = 0;
    void* icc = nullptr;
    ASSERT_TRUE(TIFFGetField(page.get(), TIFFTAG_ICCPROFILE, &size, &icc));
    EXPECT_EQ(size, sizeof profile);
}

TEST(PageMetadata, GuardedTagsTheSetUpWroteAreKept) {
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
    metadata.Add(ZAN_METADATA_IMAGE, TIFFTAG_MODEL, ZAN_METADATA_U8, skipped);
    const Written written = WritePage(&metadata);
    EXPECT_TRUE(written.errors.empty());
    PageReader page(written.tiff);
    EXPECT_EQ(page.Text(TIFFTAG_SOFTWARE), TIFFGetVersionLinePivlo());
    EXPECT_EQ(page.F32(TIFFTAG_XRESOLUTION), 150.0f);
    EXPECT_EQ(page.F32(TIFFTAG_YRESOLUTION), 75.0f) << "both halves of a pair the page did not hold";
    EXPECT_EQ(page.U16(TIFFTAG_RESOLUTIONUNIT), static_cast<uint32_t>(RESUNIT_INCH));
    // The positions share one presence flag: the YPosition entry is passed
    // over once XPosition is set (libtiff then stores the pair, Y as 0).
    EXPECT_EQ(page.F32(TIFFTAG_XPOSITION), 1.0f);
    EXPECT_EQ(page.F32(TIFFTAG_YPOSITION), 0.0f) << "the metadata's YPosition of 2 does not reach the page";
    EXPECT_EQ(page.Text(TIFFTAG_MAKE), "maker");
    EXPECT_EQ(page.Text(TIFFTAG_MODEL), "") << "a type 2 entry is passed over";
}

TEST(PageMetadata, RefusedEntryStopsThePassWithAMessage) {
    Metadata metadata;
    MetadataValue value{};
    value.u32 = 1;
    metadata.Add(ZAN_METADATA_IMAGE, 65000, ZAN_METADATA_U32, value);
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_MAKE, "after");
    const Written written = WritePage(&metadata);
    EXPECT_EQ(written.errors, std::vector<std::string>{"Error in saving metadata"});
    EXPECT_EQ(PageReader(written.tiff).Text(TIFFTAG_MAKE), "");
}

TEST(PageMetadata, ExifEntryOfAnUnknownTypeIsWarnedAbout) {
    Metadata metadata;
    metadata.Add(ZAN_METADATA_EXIF, EXIFTAG_EXPOSUREPROGRAM, ZAN_METADATA_AS_CODEC, MetadataValue{});
    metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 4);
    const Written written = WritePage(&metadata);
    EXPECT_EQ(written.warnings, std::vector<std::string>{"Unknown TIFF EXIF type"});
    EXPECT_EQ(FNumber(written.tiff, 0), 4.0f) << "the other entries are written";
}

TEST(PageMetadata, ExifEntriesUnfitForTheirTagAreLeftOut) {
    Metadata unfit;
    unfit.Array16(EXIFTAG_ISOSPEEDRATINGS, {100, 200, 400}, false);      // values counted from the bytes
    unfit.Short(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, 7);         // a number for a text
    unfit.Text(ZAN_METADATA_EXIF, EXIFTAG_EXPOSUREPROGRAM, "2");         // a text for a number
    const Written written = WritePage(&unfit);
    EXPECT_TRUE(written.errors.empty());
    PageReader page(written.tiff);
    ASSERT_TRUE(page.OpenExif());
    uint16_t count = 0, *iso = nullptr;
    ASSERT_TRUE(TIFFGetField(page.get(), EXIFTAG_ISOSPEEDRATINGS, &count, &iso));
    ASSERT_EQ(count, 3);
    EXPECT_EQ(iso[2], 400);
    char* text = nullptr;
    EXPECT_FALSE(TIFFGetField(page.get(), EXIFTAG_DATETIMEORIGINAL, &text));
    uint16_t program = 0;
    EXPECT_FALSE(TIFFGetField(page.get(), EXIFTAG_EXPOSUREPROGRAM, &program));

    Metadata nothingTaken;
    nothingTaken.Short(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, 7);
    const Written plain = WritePage(&nothingTaken);
    EXPECT_FALSE(PageReader(plain.tiff).OpenExif()) << "nothing taken, no EXIF directory";
    EXPECT_EQ(DecodeWithLibtiff(plain.tiff).size(), 1u);
}

TEST(PageMetadata, ListWithoutExifLeavesThePageAsWritten) {
    Metadata empty;
    EXPECT_EQ(WritePage(&empty).tiff, WritePage(nullptr).tiff);
}

TEST(PageMetadata, AppendedPagesCarryTheirExifToo) {
    TempFile file;
    WriteFileBytes(file.path(), ThreePages(Dest::Memory));
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
    EXPECT_EQ(FNumber(all, 3), 8.0f);
    EXPECT_FLOAT_EQ(FNumber(all, 1), 2.5f) << "the earlier pages keep theirs";
}

}  // namespace
