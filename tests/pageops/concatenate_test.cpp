// Concatenation as a host sees it: the pages of the destination afterwards,
// their byte order, and what a failure leaves behind.

#include <gtest/gtest.h>

#include "pageops_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

BuildOptions BigEndian() {
    BuildOptions options;
    options.bigEndian = true;
    return options;
}

TEST(Concatenate, AppendsBigEndianPagesToALittleEndianFileInItsOrder) {
    const Bytes dest = BuildTiff({GreyPage(9, 3, 3, 1)});
    BuiltPage described = GreyPage(6, 4, 1, 2);
    described.entries.push_back(AsciiEntry(270, "second page"));
    described.entries.push_back(RationalEntry(282, 300, 1));
    const Bytes source = BuildTiff({described, GreyPage(5, 5, 2, 3)}, BigEndian());
    FileJob job(source, dest);
    ASSERT_EQ(job.Concatenate(), 1) << ::testing::PrintToString(job.Errors());
    const Bytes out = job.Dest();
    EXPECT_EQ(out[0], 'I');
    const auto pages = DecodeWithLibtiff(out);
    ASSERT_EQ(pages.size(), 3u);
    const auto original = DecodeWithLibtiff(source);
    EXPECT_EQ(pages[1].pixels, original[0].pixels);
    EXPECT_EQ(pages[2].pixels, original[1].pixels);
    const PageDump second = DumpPage(out, 1);
    EXPECT_NE(second.tags.find("second page"), std::string::npos);
    EXPECT_NE(second.tags.find("Resolution: 300"), std::string::npos);
    const auto dirs = DirectoryOffsets(out);
    ASSERT_EQ(dirs.size(), 3u);
    FoundEntry width;
    ASSERT_TRUE(FindEntry(out, dirs[2], 256, &width));
    EXPECT_EQ(Get32(out, width.valueField), 5u) << "entries are little-endian";
}

TEST(Concatenate, FileAppendedToACopyOfItselfDoublesItsPages) {
    const Bytes file = BuildTiff({GreyPage(4, 4, 2), GreyPage(3, 3, 3)});
    FileJob job(file, file);
    ASSERT_EQ(job.Concatenate(), 1);
    EXPECT_EQ(DecodeWithLibtiff(job.Dest()).size(), 4u);
}

TEST(Concatenate, OddSizedDestinationGetsOneSkippedByte) {
    Bytes dest = BuildTiff({GreyPage(3, 3, 3)});
    if (dest.size() % 2 == 0) dest.push_back(0);
    const size_t end = dest.size();
    FileJob job(BuildTiff({GreyPage(4, 4, 4)}), dest);
    ASSERT_EQ(job.Concatenate(), 1);
    const auto dirs = DirectoryOffsets(job.Dest());
    ASSERT_EQ(dirs.size(), 2u);
    EXPECT_EQ(dirs[1], end + 1);
}

TEST(Concatenate, SourceWithoutDirectoriesChangesNoPage) {
    const Bytes dest = BuildTiff({GreyPage(3, 3, 3)});
    FileJob job(BuildTiff({}), dest);
    EXPECT_EQ(job.Concatenate(), 1);
    const Bytes out = job.Dest();
    EXPECT_EQ(out.size(), dest.size() + 12) << "the write test stays at the end";
    EXPECT_EQ(DecodeWithLibtiff(out).size(), 1u);
}

TEST(Concatenate, DestinationWithoutDirectoriesGetsItsFirstPage) {
    FileJob job(BuildTiff({GreyPage(4, 4, 4)}), BuildTiff({}));
    ASSERT_EQ(job.Concatenate(), 1);
    EXPECT_EQ(DecodeWithLibtiff(job.Dest()).size(), 1u);
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
        const Bytes dest = BuildTiff({GreyPage(3, 3, 3)});
        FileJob job(BuildTiff({GreyPage(2, 2, 2), bad}), dest);  // same byte order
        EXPECT_EQ(job.Concatenate(), 0);
        EXPECT_EQ(job.Errors(), std::vector<std::string>{c.message});
        const auto pages = DecodeWithLibtiff(job.Dest());
        EXPECT_EQ(pages.size(), 2u) << "the former page and the one appended before the failure";
    }
}

TEST(Concatenate, HeaderProblemsHaveTheirOwnMessages) {
    const Bytes good = BuildTiff({GreyPage(3, 3, 3)});
    Bytes notTiff = good;
    notTiff[1] = 'M';
    Bytes badId = good;
    badId[2] = 0;
    struct Case {
        Bytes source, dest;
        const char* message;
    } cases[] = {
        {notTiff, good, "Source is not TIFF."},
        {good, notTiff, "Destination is not TIFF."},
        {badId, good, "Error in second 2 bytes (TIFF id).\n"},
        {good, badId, "Error in second 2 bytes (TIFF id).\n"},
    };
    for (const Case& c : cases) {
        FileJob job(c.source, c.dest);
        EXPECT_EQ(job.Concatenate(), 0);
        EXPECT_EQ(job.Errors(), std::vector<std::string>{c.message});
    }
}

TEST(Concatenate, OnlyFilesAreAccepted) {
    FileJob job(BuildTiff({GreyPage(3, 3, 3)}), BuildTiff({GreyPage(3, 3, 3)}));
    job.host()->sourceKind = ZAN_SOURCE_MEMORY;
    EXPECT_EQ(job.Concatenate(), 0);
    EXPECT_EQ(job.Errors(), std::vector<std::string>{"Source and destination must be files."});
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

TEST(Concatenate, LoopingChainsEndTheWalk) {
    Bytes looping = BuildTiff({GreyPage(3, 3, 3), GreyPage(3, 3, 3)});
    const auto dirs = DirectoryOffsets(looping);
    Put32(looping, dirs[1] + 2 + 12u * Get16(looping, dirs[1]), dirs[0]);
    const Bytes good = BuildTiff({GreyPage(3, 3, 3)});
    {
        FileJob job(looping, good);
        EXPECT_EQ(job.Concatenate(), 0);
        EXPECT_EQ(job.Errors(), std::vector<std::string>{"Source directory chain loops."});
        EXPECT_EQ(DecodeWithLibtiff(job.Dest()).size(), 1u);
    }
    {
        FileJob job(good, looping);
        EXPECT_EQ(job.Concatenate(), 0);
        EXPECT_EQ(job.Errors(), std::vector<std::string>{"Destination directory chain loops."});
    }
}

TEST(Concatenate, ExifDirectorySurvivesInTheDestinationsOrder) {
    BuiltPage page = GreyPage(4, 4, 4);
    BuiltPage exif;
    exif.entries = {RationalEntry(33437, 28, 10), AsciiEntry(36867, "2024:01:02 03:04:05"),
                    ShortEntry(34855, {400})};
    page.exif.push_back(exif);
    const Bytes source = BuildTiff({page}, BigEndian());
    FileJob job(source, BuildTiff({GreyPage(3, 3, 3)}));
    ASSERT_EQ(job.Concatenate(), 1) << ::testing::PrintToString(job.Errors());
    const PageDump appended = DumpPage(job.Dest(), 1);
    const PageDump original = DumpPage(source, 0);
    ASSERT_FALSE(original.exifTags.empty());
    EXPECT_EQ(WithoutLines(appended.exifTags, {"Directory at"}),
              WithoutLines(original.exifTags, {"Directory at"}));
    EXPECT_NE(appended.exifTags.find("2024:01:02 03:04:05"), std::string::npos);
}

}  // namespace
