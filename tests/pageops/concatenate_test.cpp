// Concatenation as a host sees it: the pages of the destination afterwards,
// their byte order, and what a failure leaves behind. (EXIF directories
// appended across byte orders are checked on the corpus files.)

#include <gtest/gtest.h>

#include "pageops_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

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

TEST(Concatenate, PointersOfTypeIfdAndFieldsStoredAsLongChangeByteOrder) {
    // libtiff writes the ExifIFD pointer as type IFD: the EXIF directory is
    // relocated and converted like the page's own.
    const Bytes exif = MakeExifTiff();
    FileJob withExif(exif, BuildTiff({GreyPage(3, 3, 3)}, {.bigEndian = true}));
    ASSERT_EQ(withExif.Concatenate(), 1) << ::testing::PrintToString(withExif.Errors());
    const PageDump copied = DumpPage(withExif.Dest(), 1), original = DumpPage(exif, 0);
    EXPECT_FALSE(original.exifTags.empty());
    EXPECT_EQ(WithoutLines(copied.exifTags, {"Directory at"}), WithoutLines(original.exifTags, {"Directory at"}));
    EXPECT_EQ(copied.data, original.data);

    // Compression and BitsPerSample as LONG: 16-bit samples of an
    // uncompressed page are swapped, a compressed page with them refused.
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
    EXPECT_EQ(refused.Errors(),
              std::vector<std::string>{"Page samples of more than 8 bits cannot change byte order without decoding."});
}

#if defined(__GLIBC__)
// A destination stream that records where its writes land, in order.
struct RecordingFile {
    FILE* file;
    int64_t position = 0;
    std::vector<std::pair<int64_t, size_t>> writes;
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

TEST(Concatenate, PagesAreLinkedOnlyOnceWrittenWhole) {
    // The destination never points at a page that is not all there: the
    // link to each appended page is the last thing written for it.
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

TEST(Concatenate, FileAppendedToACopyOfItselfDoublesItsPages) {
    const Bytes file = BuildTiff({GreyPage(4, 4, 2), GreyPage(3, 3, 3)});
    FileJob job(file, file);
    ASSERT_EQ(job.Concatenate(), 1);
    EXPECT_EQ(DecodeWithLibtiff(job.Dest()).size(), 4u);
}

TEST(Concatenate, OddSizedDestinationGetsOneSkippedByte) {
    Bytes dest = BuildTiff({GreyPage(3, 3, 3)});
    if (dest.size() % 2 == 0) dest.push_back(0);
    FileJob job(BuildTiff({GreyPage(4, 4, 4)}), dest);
    ASSERT_EQ(job.Concatenate(), 1);
    const auto dirs = DirectoryOffsets(job.Dest());
    ASSERT_EQ(dirs.size(), 2u);
    EXPECT_EQ(dirs[1], dest.size() + 1);
}

TEST(Concatenate, FilesWithoutDirectories) {
    const Bytes page = BuildTiff({GreyPage(3, 3, 3)});
    FileJob emptySource(BuildTiff({}), page);
    EXPECT_EQ(emptySource.Concatenate(), 1);
    EXPECT_EQ(emptySource.Dest().size(), page.size() + 12) << "the write test stays at the end";
    EXPECT_EQ(DecodeWithLibtiff(emptySource.Dest()).size(), 1u);
    FileJob emptyDest(page, BuildTiff({}));
    ASSERT_EQ(emptyDest.Concatenate(), 1);
    EXPECT_EQ(DecodeWithLibtiff(emptyDest.Dest()).size(), 1u) << "the destination gets its first page";
}

TEST(Concatenate, FieldsItCannotConvertFailTheCallAndLeaveTheDestinationReadable) {
    struct Case {
        RawEntry entry;
        const char* message;
    };
    const Case cases[] = {
        {TypedEntry(40000, 13, 1, Bytes{8, 0, 0, 0}), "Unhandled TIFF TYPE."},
        {DoubleEntry(33550, 1.5), "Unhandled type."},
        {TypedEntry(40001, 99, 1, Bytes{1}), "Unhandled TIFF TYPE."},
    };
    for (const Case& c : cases) {
        BuiltPage bad = GreyPage(4, 4, 4);
        bad.entries.push_back(c.entry);
        FileJob job(BuildTiff({GreyPage(2, 2, 2), bad}), BuildTiff({GreyPage(3, 3, 3)}));  // same byte order
        EXPECT_EQ(job.Concatenate(), 0);
        EXPECT_EQ(job.Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(DecodeWithLibtiff(job.Dest()).size(), 2u) << "the former page and the one appended before";
    }
}

TEST(Concatenate, RefusedFilesHaveTheirOwnMessagesAndTheDestinationKeepsItsPages) {
    const Bytes good = BuildTiff({GreyPage(3, 3, 3)});
    Bytes notTiff = good, badId = good, looping = BuildTiff({GreyPage(3, 3, 3), GreyPage(3, 3, 3)});
    notTiff[1] = 'M';
    badId[2] = 0;
    const auto dirs = DirectoryOffsets(looping);
    Put32(looping, dirs[1] + 2 + 12u * Get16(looping, dirs[1]), dirs[0]);
    struct Case {
        Bytes source, dest;
        const char* message;
        bool memorySource = false;
    } cases[] = {
        {notTiff, good, "Source is not TIFF."},
        {good, notTiff, "Destination is not TIFF."},
        {badId, good, "Error in second 2 bytes (TIFF id).\n"},
        {good, badId, "Error in second 2 bytes (TIFF id).\n"},
        {looping, good, "Source directory chain loops."},
        {good, looping, "Destination directory chain loops."},
        {good, good, "Source and destination must be files.", true},
    };
    for (const Case& c : cases) {
        FileJob job(c.source, c.dest);
        if (c.memorySource) job.host()->sourceKind = ZAN_SOURCE_MEMORY;
        EXPECT_EQ(job.Concatenate(), 0);
        EXPECT_EQ(job.Errors(), std::vector<std::string>{c.message});
        EXPECT_EQ(DecodeWithLibtiff(job.Dest()).size(), DecodeWithLibtiff(c.dest).size()) << c.message;
    }
}

TEST(Concatenate, ReadOnlyDestinationFailsTheWriteTest) {
    const Bytes dest = BuildTiff({GreyPage(3, 3, 3)});
    TempFile file;
    WriteFileBytes(file.path(), dest);
    FileJob job(BuildTiff({GreyPage(3, 3, 3)}), {});
    FILE* readOnly = std::fopen(file.c_str(), "rb");
    job.host()->destFp = readOnly;
    EXPECT_EQ(job.Concatenate(), 0);
    EXPECT_EQ(job.Errors(), std::vector<std::string>{"Unable to write to destination file."});
    std::fclose(readOnly);
    EXPECT_EQ(ReadFileBytes(file.path()), dest);
}

}  // namespace
