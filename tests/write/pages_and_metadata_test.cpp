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
        MetadataValue value{.block = list_->allocProc(static_cast<uint32_t>(size))};
        std::memcpy(value.block, data, size);
        Add(group, tag, ZAN_METADATA_BLOCK, value, static_cast<uint32_t>(size), static_cast<uint32_t>(count));
    }
    void Text(uint32_t group, uint32_t tag, const std::string& s) { Block(group, tag, s.c_str(), s.size() + 1); }
    void Array16(uint32_t tag, const std::vector<uint16_t>& values, bool counted = true) {
        Block(ZAN_METADATA_EXIF, tag, values.data(), values.size() * 2, counted ? values.size() : 0);
    }
    void Float(uint32_t group, uint32_t tag, float v) { Add(group, tag, ZAN_METADATA_F32, MetadataValue{.f32 = v}); }
    void Short(uint32_t group, uint32_t tag, uint16_t v) {
        Add(group, tag, ZAN_METADATA_U16, MetadataValue{.u16 = {v, 0}}, group == ZAN_METADATA_EXIF ? 2 : 1);
    }

private:
    MetadataList* list_;
};

std::string DateTaken(int page) { return "2024:01:01 10:" + std::to_string(10 + page % 50) + ":00"; }

// Pages `from` to `to` (excluded), page i 6 + i pixels wide, each with its
// own artist and EXIF entries (FNumber 2 + i the first), the second in LZW.
// Each page is ended by zanTIFFNextImage, or the last by teardown.
void WriteExifPages(WriteJob& job, int from, int to, bool teardownLast = false) {
    for (int page = from; page < to; ++page) {
        Metadata metadata;
        metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_ARTIST, "artist " + std::to_string(page));
        metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 2.0f + page);
        metadata.Text(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, DateTaken(page));
        metadata.Array16(EXIFTAG_ISOSPEEDRATINGS, {100, 200});
        metadata.Text(ZAN_METADATA_EXIF, EXIFTAG_IMAGEUNIQUEID, "short id");
        job->writeMetadataList = metadata.get();
        job.Describe(2, 6 + page, 3, page == 1 ? 7 : 1);
        EXPECT_TRUE(job.WriteRows(PatternRows(3, 6 + page, page)));
        if (teardownLast && page == to - 1) {
            zanDestroyTIFF(job.host().ctx());
        } else {
            EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), 1) << page;
        }
        job->writeMetadataList = nullptr;
    }
}

Bytes ThreePages(Dest dest) {
    WriteJob job(dest);
    WriteExifPages(job, 0, 3, true);
    EXPECT_TRUE(job.host().Errors().empty()) << ::testing::PrintToString(job.host().Errors());
    return job.Finish();
}

// The listing line of an FNumber.
std::string FNumber(float value) { return "FNumber: " + std::to_string(value); }

// One 8x2 grey page written with `metadata` (no list when null), then
// zanTIFFNextImage called `nextImages` times (0: teardown ends the page):
// the bytes written and the messages.
struct Written {
    Bytes tiff;
    std::vector<std::string> errors, warnings;
};
Written WritePage(Metadata* metadata, int nextImages = 1) {
    WriteJob job;
    if (metadata) job->writeMetadataList = metadata->get();
    job.Describe(2, 8, 2, 1);
    EXPECT_TRUE(job.WriteRows(PatternRows(2, 8))) << "metadata never stops the page";
    for (int i = 0; i < nextImages; ++i) EXPECT_EQ(zanTIFFNextImage(job.host().ctx()), i == 0 ? 1 : 0);
    job->writeMetadataList = nullptr;
    return {job.Finish(), job.host().Errors(), job.host().Warnings()};
}

TEST(MultiPage, EveryDestinationKindGivesTheSameFileWithEachPagesExif) {
    // Every destination kind receives the same bytes; each page, and one
    // appended later, has its own tags and EXIF directory.
    const Bytes tiff = ThreePages(Dest::Memory);
    for (Dest dest : {Dest::File, Dest::Callbacks, Dest::FixedBuffer})
        EXPECT_EQ(ThreePages(dest), tiff) << static_cast<int>(dest);
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    WriteJob append(Dest::File);
    append->destPath = file.c_str();
    append->appendPages = 1;
    WriteExifPages(append, 3, 4);
    append.Finish();
    const Bytes all = ReadFileBytes(file.path());
    ASSERT_EQ(DecodeWithLibtiff(all).size(), 4u);
    for (int page = 0; page < 4; ++page) {
        SCOPED_TRACE(page);
        const PageDump dump = DumpPage(all, page);
        ExpectListing(dump.tags, {"Image Width: " + std::to_string(6 + page) + " Image Length: 3",
                                  "Artist: artist " + std::to_string(page)});
        // A fixed-length EXIF text is padded so that readers keep it.
        ExpectListing(dump.exifTags, {FNumber(2.0f + page), "DateTimeOriginal: " + DateTaken(page),
                                      "ISOSpeedRatings: 100,200", "ImageUniqueID: short id" + std::string(24, ' ')});
    }
}

// A callback destination whose write of an EXIF directory (entries first,
// of which FNumber, tag 33437, is the first) fails, once.
struct ExifFailingStream : MemoryStream {
    bool failed = false;
    static int32_t Write(const void* buffer, int32_t n, void* user) {
        auto* s = static_cast<ExifFailingStream*>(user);
        const auto* b = static_cast<const uint8_t*>(buffer);
        if (!s->failed && n > 4 && n == 6 + 12 * b[0] && b[1] == 0 && b[2] == 0x9D && b[3] == 0x82) {
            s->failed = true;
            return -1;
        }
        return MemoryStream::Write(buffer, n, user);
    }
};

TEST(MultiPage, FailedExifDirectoryLeavesEveryPageWhole) {
    // The page whose EXIF directory failed stays whole without an EXIF link;
    // the next page gets its own directory instead of rewriting it.
    WriteJob job(Dest::Callbacks);
    ExifFailingStream stream;
    job->destWriteProc = ExifFailingStream::Write;
    job->destUserData = job->sourceUserData = &stream;
    WriteExifPages(job, 0, 2);
    job.Finish();
    EXPECT_TRUE(stream.failed);
    EXPECT_EQ(job.host().Errors(), std::vector<std::string>{"TIFF EXIF write error"});
    const auto pages = DecodeWithLibtiff(stream.data);
    ASSERT_EQ(pages.size(), 2u);
    for (uint32_t page = 0; page < 2; ++page) EXPECT_EQ(pages[page].pixels, Joined(PatternRows(3, 6 + page, page)));
    ExpectListing(DumpPage(stream.data, 0).tags, {}, {"EXIFIFDOffset"});
    ExpectListing(DumpPage(stream.data, 1).exifTags, {FNumber(3)});
}

TEST(MultiPage, ExifCostsTheSameForEveryPage) {
    // Twice the pages read the destination about twice as often (a walk of
    // the chain for every page made it four times).
    auto readsFor = [](int pages) {
        WriteJob job(Dest::Callbacks);
        WriteExifPages(job, 0, pages);
        const Bytes tiff = job.Finish();
        EXPECT_EQ(DecodeWithLibtiff(tiff).size(), static_cast<size_t>(pages));
        ExpectListing(DumpPage(tiff, pages - 1).exifTags, {FNumber(1.0f + pages)});
        return static_cast<const MemoryStream*>(job->sourceUserData)->reads;
    };
    const int few = readsFor(40), many = readsFor(80);
    EXPECT_LT(many, few * 5 / 2) << few << " reads for 40 pages, " << many << " for 80";
}

TEST(PageMetadata, EntriesReachThePageUnlessGuardedUnfitOrOfAnUnknownType) {
    // Entries arrive unless the set-up wrote the tag (but for a resolution
    // pair the page lacked) or they do not fit it; an unknown EXIF type is
    // warned about. The positions share one presence flag: YPosition is
    // passed over once XPosition is set (libtiff stores Y as 0).
    Metadata metadata;
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_UINT);
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_MINSAMPLEVALUE, 3);
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_MAXSAMPLEVALUE, 250);
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_DATATYPE, 1);
    metadata.Add(ZAN_METADATA_IMAGE, TIFFTAG_SMINSAMPLEVALUE, ZAN_METADATA_AS_CODEC, MetadataValue{.f64 = 2.0});
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_ARTIST, "after them");
    const uint8_t profile[8] = {1, 2, 3, 4, 5, 6, 7, 8};
    metadata.Block(ZAN_METADATA_ICC, TIFFTAG_ICCPROFILE, profile, sizeof profile);
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_SOFTWARE, "metadata software");
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_XRESOLUTION, 150);
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_YRESOLUTION, 75);
    metadata.Short(ZAN_METADATA_IMAGE, TIFFTAG_RESOLUTIONUNIT, RESUNIT_CENTIMETER);
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_XPOSITION, 1);
    metadata.Float(ZAN_METADATA_IMAGE, TIFFTAG_YPOSITION, 2);
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_MAKE, "maker");
    metadata.Add(ZAN_METADATA_IMAGE, TIFFTAG_MODEL, ZAN_METADATA_U8, MetadataValue{.u8 = 9});  // a type passed over
    metadata.Add(ZAN_METADATA_EXIF, EXIFTAG_EXPOSUREPROGRAM, ZAN_METADATA_AS_CODEC, MetadataValue{});
    metadata.Float(ZAN_METADATA_EXIF, EXIFTAG_FNUMBER, 4);
    metadata.Array16(EXIFTAG_ISOSPEEDRATINGS, {100, 200, 400}, false);  // values counted from the bytes
    metadata.Short(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, 7);     // a number for a text
    metadata.Text(ZAN_METADATA_EXIF, EXIFTAG_METERINGMODE, "2");        // a text for a number
    const Written written = WritePage(&metadata);
    EXPECT_TRUE(written.errors.empty()) << ::testing::PrintToString(written.errors);
    EXPECT_EQ(written.warnings, std::vector<std::string>{"Unknown TIFF EXIF type"});
    const PageDump page = DumpPage(written.tiff, 0);
    ExpectListing(page.tags,
                  {"Min Sample Value: 3", "Max Sample Value: 250", "SMin Sample Value: 2", "Artist: after them",
                   "ICC Profile: <present>, 8 bytes", std::string("Software: ") + TIFFGetVersionLinePivlo(),
                   "Resolution: 150, 75 pixels/inch", "Position: 1, 0", "Make: maker"},
                  {"Model"});
    ExpectListing(page.exifTags, {FNumber(4), "ISOSpeedRatings: 100,200,400"},
                  {"ExposureProgram", "DateTimeOriginal", "MeteringMode"});
}

TEST(PageMetadata, RefusedEntryStopsThePassWithAMessage) {
    // An entry the codec refuses is named, and the entries after it are not written.
    Metadata metadata;
    metadata.Add(ZAN_METADATA_IMAGE, 65000, ZAN_METADATA_U32, MetadataValue{.u32 = 1});
    metadata.Text(ZAN_METADATA_IMAGE, TIFFTAG_MAKE, "after");
    const Written written = WritePage(&metadata);
    EXPECT_EQ(written.errors, std::vector<std::string>{"Error in saving metadata"});
    ExpectListing(DumpPage(written.tiff, 0).tags, {}, {"Make"});
}

TEST(PageMetadata, PagesWithoutExifEndAlikeWhateverEndsThem) {
    // The same bytes with an empty list or none, ended by teardown or by
    // zanTIFFNextImage, whose second call in a row is refused (an empty
    // directory would follow); with no EXIF entry taken, no EXIF link.
    const Written once = WritePage(nullptr), twice = WritePage(nullptr, 2);
    Metadata empty, nothingTaken;
    EXPECT_EQ(WritePage(&empty).tiff, once.tiff);
    EXPECT_EQ(WritePage(nullptr, 0).tiff, once.tiff);
    EXPECT_EQ(twice.tiff, once.tiff);
    EXPECT_EQ(twice.errors, std::vector<std::string>{"No page is being written."});
    nothingTaken.Short(ZAN_METADATA_EXIF, EXIFTAG_DATETIMEORIGINAL, 7);
    const PageDump plain = DumpPage(WritePage(&nothingTaken).tiff, 0);
    EXPECT_EQ(plain.data, Joined(PatternRows(2, 8)));
    ExpectListing(plain.tags, {}, {"EXIFIFDOffset"});
}

}  // namespace
