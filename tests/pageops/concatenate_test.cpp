// Concatenation as a host sees it: the pages of the destination afterwards,
// their byte order, and what a failure leaves behind. (EXIF directories
// appended across byte orders are checked on the corpus files.)

#include <gtest/gtest.h>

#include "pageops_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

// Big-endian pages join a little-endian file in its order, with their
// pixels and their values (text, resolution) converted.
TEST(Concatenate, AppendsBigEndianPagesToALittleEndianFileInItsOrder) {
    BuiltPage described = GreyPage(6, 4, 1, 2);
    described.entries.push_back(AsciiEntry(270, "second page"));
    described.entries.push_back(RationalEntry(282, 300, 1));
    const Bytes source = BuildTiff({described, GreyPage(5, 5, 2, 3)}, {.bigEndian = true});
    FileJob job(source, BuildTiff({GreyPage(9, 3, 3, 1)}));
    ASSERT_EQ(job.Concatenate(), 1) << ::testing::PrintToString(job.Errors());
    const Bytes out = job.Dest();
    EXPECT_EQ(out[0], 'I');
    const auto pages = DecodeWithLibtiff(out), original = DecodeWithLibtiff(source);
    ASSERT_EQ(pages.size(), 3u);
    EXPECT_EQ(pages[1].pixels, original[0].pixels);
    EXPECT_EQ(pages[2].pixels, original[1].pixels);
    const PageDump second = DumpPage(out, 1);
    EXPECT_NE(second.tags.find("second page"), std::string::npos);
    EXPECT_NE(second.tags.find("Resolution: 300"), std::string::npos);
}

// The ExifIFD pointer, which libtiff writes as type IFD, leads to an EXIF
// directory relocated and converted like the page's own. With Compression
// and BitsPerSample as LONG, 16-bit samples of an uncompressed page are
// swapped, and a compressed page with them is refused.
TEST(Concatenate, PointersOfTypeIfdAndFieldsStoredAsLongChangeByteOrder) {
    const Bytes exif = MakeExifTiff();
    FileJob withExif(exif, BuildTiff({GreyPage(3, 3, 3)}, {.bigEndian = true}));
    ASSERT_EQ(withExif.Concatenate(), 1) << ::testing::PrintToString(withExif.Errors());
    const PageDump copied = DumpPage(withExif.Dest(), 1), original = DumpPage(exif, 0);
    EXPECT_FALSE(original.exifTags.empty());
    EXPECT_EQ(WithoutLines(copied.exifTags, {"Directory at"}), WithoutLines(original.exifTags, {"Directory at"}));
    EXPECT_EQ(copied.data, original.data);

    auto sixteenBit = [](uint32_t compression) {
        BuiltPage page;
        page.entries = {LongEntry(256, {3}), LongEntry(257, {2}), LongEntry(258, {16}), LongEntry(259, {compression}),
                        ShortEntry(262, {1}), ShortEntry(277, {1}), LongEntry(278, {2})};
        page.strips = {Bytes{0x12, 0x34, 0x56, 0x78, 0x9A, 0xBC, 0xDE, 0xF0, 0x01, 0x02, 0x03, 0x04}};
        return BuildTiff({page}, {.bigEndian = true});
    };
    FileJob swapped(sixteenBit(COMPRESSION_NONE), BuildTiff({GreyPage(3, 3, 3)}));
    ASSERT_EQ(swapped.Concatenate(), 1) << ::testing::PrintToString(swapped.Errors());
    EXPECT_EQ(DecodeWithLibtiff(swapped.Dest())[1].pixels, DecodeWithLibtiff(sixteenBit(COMPRESSION_NONE))[0].pixels);
    FileJob refused(sixteenBit(COMPRESSION_LZW), BuildTiff({GreyPage(3, 3, 3)}));
    EXPECT_EQ(refused.Concatenate(), 0);
    EXPECT_EQ(refused.Errors(), Texts{"Page samples of more than 8 bits cannot change byte order without decoding."});
}

// The first appended directory lies right behind the destination's data, at
// an even offset: behind a copy of the file itself, behind an odd-sized
// file (one skipped byte), at 8 in a file without pages. A source without
// pages leaves only the 12-byte write test at the end.
TEST(Concatenate, AppendsBehindWhateverTheDestinationHolds) {
    const Bytes two = BuildTiff({GreyPage(4, 4, 2), GreyPage(3, 3, 3)}), none = BuildTiff({});
    Bytes odd = BuildTiff({GreyPage(3, 3, 3)});
    if (odd.size() % 2 == 0) odd.push_back(0);
    const struct {
        Bytes source, dest;
        size_t pages;
    } cases[] = {{two, two, 4}, {two, odd, 3}, {two, none, 2}, {none, odd, 1}};
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << c.source.size() << " bytes onto " << c.dest.size());
        FileJob job(c.source, c.dest);
        ASSERT_EQ(job.Concatenate(), 1) << ::testing::PrintToString(job.Errors());
        const Bytes out = job.Dest();
        EXPECT_EQ(DecodeWithLibtiff(out).size(), c.pages);
        const size_t before = DirectoryOffsets(c.dest).size();
        if (c.source == none) {
            EXPECT_EQ(out.size(), c.dest.size() + 12) << "the write test stays at the end";
        } else {
            ASSERT_GT(DirectoryOffsets(out).size(), before);
            EXPECT_EQ(DirectoryOffsets(out)[before], c.dest.size() + c.dest.size() % 2);
        }
    }
}

// Each refusal has its own message, and the destination keeps its pages:
// untouched when a file is refused before the write test, plus the page
// appended before one with a field the conversion cannot take.
TEST(Concatenate, RefusalsHaveTheirOwnMessagesAndTheDestinationKeepsItsPages) {
    const Bytes good = BuildTiff({GreyPage(3, 3, 3)});
    Bytes notTiff = good, badId = good, looping = BuildTiff({GreyPage(3, 3, 3), GreyPage(3, 3, 3)});
    notTiff[1] = 'M';
    badId[2] = 0;
    const auto dirs = DirectoryOffsets(looping);
    Put32(looping, dirs[1] + 2 + 12u * Get16(looping, dirs[1]), dirs[0]);
    auto secondPageWith = [](const RawEntry& entry) {  // in the byte order of `good`
        BuiltPage bad = GreyPage(4, 4, 4);
        bad.entries.push_back(entry);
        return BuildTiff({GreyPage(2, 2, 2), bad});
    };
    enum After { Untouched, SamePages, OneMorePage };
    const struct {
        Bytes source, dest;
        const char* message;
        After after;
        void (*setUp)(FileJob&) = nullptr;
    } cases[] = {
        {notTiff, good, "Source is not TIFF.", Untouched},
        {good, notTiff, "Destination is not TIFF.", Untouched},
        {badId, good, "Error in second 2 bytes (TIFF id).\n", Untouched},
        {good, badId, "Error in second 2 bytes (TIFF id).\n", Untouched},
        {looping, good, "Source directory chain loops.", SamePages},
        {good, looping, "Destination directory chain loops.", SamePages},
        {good, good, "Source and destination must be files.", Untouched,
         [](FileJob& job) { job.host()->sourceKind = ZAN_SOURCE_MEMORY; }},
        {good, good, "Unable to write to destination file.", Untouched,
         [](FileJob& job) { ASSERT_NE(std::freopen(nullptr, "rb", job.host()->destFp), nullptr); }},
        {secondPageWith(TypedEntry(40000, 13, 1, Bytes{8, 0, 0, 0})), good, "Unhandled TIFF TYPE.", OneMorePage},
        {secondPageWith(DoubleEntry(33550, 1.5)), good, "Unhandled type.", OneMorePage},
        {secondPageWith(TypedEntry(40001, 99, 1, Bytes{1})), good, "Unhandled TIFF TYPE.", OneMorePage},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.message);
        FileJob job(c.source, c.dest);
        if (c.setUp) c.setUp(job);
        EXPECT_EQ(job.Concatenate(), 0);
        EXPECT_EQ(job.Errors(), Texts{c.message});
        const Bytes out = job.Dest();
        if (c.after == Untouched) { EXPECT_EQ(out, c.dest); }
        EXPECT_EQ(DecodeWithLibtiff(out).size(), DecodeWithLibtiff(c.dest).size() + (c.after == OneMorePage));
    }
}

#if defined(__GLIBC__)
// A destination stream that records where its writes land, in order.
struct RecordingFile {
    FILE* file;
    int64_t position = 0;
    std::vector<std::pair<int64_t, size_t>> writes = {};
    static ssize_t Write(void* cookie, const char* data, size_t n) {
        auto* r = static_cast<RecordingFile*>(cookie);
        r->writes.emplace_back(r->position, n);
        std::fseek(r->file, r->position, SEEK_SET);
        const size_t done = std::fwrite(data, 1, n, r->file);
        r->position += static_cast<int64_t>(done);
        return static_cast<ssize_t>(done);
    }
    static ssize_t Read(void* cookie, char* data, size_t n) {
        auto* r = static_cast<RecordingFile*>(cookie);
        std::fseek(r->file, r->position, SEEK_SET);
        const size_t done = std::fread(data, 1, n, r->file);
        r->position += static_cast<int64_t>(done);
        return static_cast<ssize_t>(done);
    }
    static int Seek(void* cookie, off64_t* offset, int whence) {
        auto* r = static_cast<RecordingFile*>(cookie);
        std::fseek(r->file, 0, SEEK_END);
        const int64_t end = std::ftell(r->file);
        r->position = whence == SEEK_SET ? *offset : whence == SEEK_CUR ? r->position + *offset : end + *offset;
        *offset = r->position;
        return 0;
    }
};

// The destination never points at a page that is not all there: the link
// to each appended page is the last thing written for it.
TEST(Concatenate, PagesAreLinkedOnlyOnceWrittenWhole) {
    const Bytes dest = BuildTiff({GreyPage(3, 3, 3)});
    FileJob job(BuildTiff({GreyPage(40, 30, 5)}), dest);
    RecordingFile recording{job.host()->destFp};
    cookie_io_functions_t io{RecordingFile::Read, RecordingFile::Write, RecordingFile::Seek, nullptr};
    FILE* recorded = fopencookie(&recording, "r+", io);
    job.host()->destFp = recorded;
    ASSERT_EQ(job.Concatenate(), 1) << ::testing::PrintToString(job.Errors());
    std::fclose(recorded);
    job.host()->destFp = recording.file;
    const auto dirs = DirectoryOffsets(job.Dest());
    ASSERT_EQ(dirs.size(), 2u);
    const int64_t link = dirs[0] + 2 + 12 * Get16(dest, dirs[0]);
    ASSERT_FALSE(recording.writes.empty());
    EXPECT_EQ(recording.writes.back(), (std::pair<int64_t, size_t>{link, 4}));
    for (size_t i = 0; i + 1 < recording.writes.size(); ++i)
        EXPECT_NE(recording.writes[i].first, link) << "write " << i << " of " << recording.writes.size();
}
#endif

}  // namespace
