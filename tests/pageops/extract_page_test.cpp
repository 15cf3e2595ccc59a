// Page extraction as a host sees it: the file written and the messages.

#include <gtest/gtest.h>

#include <cstring>

#include "pageops_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

std::vector<BuiltPage> ThreeGreyPages() {
    return {GreyPage(10, 6, 2, 0), GreyPage(7, 5, 5, 50), GreyPage(12, 4, 1, 100)};
}

TEST(ExtractPage, EachPageBecomesAOnePageFile) {
    const Bytes source = BuildTiff(ThreeGreyPages());
    const auto expected = DecodeWithLibtiff(source);
    for (int32_t page = 1; page <= 3; ++page) {
        FileJob job(source, {});
        ASSERT_EQ(job.Extract(page), 1) << ::testing::PrintToString(job.Errors());
        const Bytes out = job.Dest();
        const auto pages = DecodeWithLibtiff(out);
        ASSERT_EQ(pages.size(), 1u);
        EXPECT_EQ(pages[0].width, expected[page - 1].width);
        EXPECT_EQ(pages[0].pixels, expected[page - 1].pixels);
        EXPECT_EQ(Get32(out, 4), 8u) << "the directory follows the header";
    }
}

TEST(ExtractPage, PageBeyondTheFileOrZeroIsRefused) {
    const Bytes source = BuildTiff(ThreeGreyPages());
    FileJob beyond(source, {});
    EXPECT_EQ(beyond.Extract(4), 0);
    EXPECT_EQ(beyond.Errors(), std::vector<std::string>{"Specified page beyond that of the source tiff file."});
    FileJob zero(source, {});
    EXPECT_EQ(zero.Extract(0), 0);
    EXPECT_EQ(zero.Errors(), std::vector<std::string>{"Page starts at 1."});
    FileJob empty(BuildTiff({}), {});
    EXPECT_EQ(empty.Extract(1), 0);
    EXPECT_EQ(empty.Errors(), std::vector<std::string>{"Specified page beyond that of the source tiff file."});
}

TEST(ExtractPage, FileKindsAreCheckedBeforeThePageNumber) {
    FileJob job(BuildTiff(ThreeGreyPages()), {});
    job.host()->destKind = ZAN_DEST_MEMORY;
    EXPECT_EQ(job.Extract(0), 0);
    EXPECT_EQ(job.Errors(), std::vector<std::string>{"Source and destinationf must be files."});
}

TEST(ExtractPage, HeaderProblemsHaveTheirOwnMessages) {
    Bytes notTiff = BuildTiff(ThreeGreyPages());
    notTiff[0] = 'X';
    FileJob a(notTiff, {});
    EXPECT_EQ(a.Extract(1), 0);
    EXPECT_EQ(a.Errors(), std::vector<std::string>{"Source not a tiff file.\n"});
    Bytes badId = BuildTiff(ThreeGreyPages());
    badId[2] = 43;
    FileJob b(badId, {});
    EXPECT_EQ(b.Extract(1), 0);
    EXPECT_EQ(b.Errors(), std::vector<std::string>{"Error in second 2 bytes (TIFF id).\n"});
}

TEST(ExtractPage, BigEndianSourceGivesBigEndianFile) {
    BuildOptions big;
    big.bigEndian = true;
    const Bytes source = BuildTiff(ThreeGreyPages(), big);
    FileJob job(source, {});
    ASSERT_EQ(job.Extract(2), 1);
    const Bytes out = job.Dest();
    EXPECT_EQ(Bytes(out.begin(), out.begin() + 8), Bytes({'M', 'M', 0, 42, 0, 0, 0, 8}));
    EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[1].pixels);
}

TEST(ExtractPage, PageIsMarkedStandaloneAndKeepsItsOtherFields) {
    BuiltPage page = GreyPage(8, 2, 2);
    page.entries.push_back(LongEntry(254, {2}));
    page.entries.push_back(ShortEntry(297, {2, 3}));
    page.entries.push_back(AsciiEntry(305, "scanner"));
    const Bytes source = BuildTiff({GreyPage(4, 4, 4), page});
    FileJob job(source, {});
    ASSERT_EQ(job.Extract(2), 1);
    const Bytes out = job.Dest();
    FoundEntry e;
    ASSERT_TRUE(FindEntry(out, 8, 254, &e));
    EXPECT_EQ(Get32(out, e.valueField), 0u);
    ASSERT_TRUE(FindEntry(out, 8, 297, &e));
    EXPECT_EQ(Get16(out, e.valueField), 0u);
    EXPECT_EQ(Get16(out, e.valueField + 2), 1u);
    const PageDump dump = DumpPage(out, 0);
    EXPECT_NE(dump.tags.find("scanner"), std::string::npos);
}

TEST(ExtractPage, ValuesFollowTheDirectoryAtEvenOffsets) {
    BuiltPage page = GreyPage(8, 2, 1);
    page.entries.push_back(AsciiEntry(270, "abcd"));  // 5 bytes: one skipped byte follows
    page.entries.push_back(AsciiEntry(271, "xyzw"));
    const Bytes source = BuildTiff({page});
    FileJob job(source, {});
    ASSERT_EQ(job.Extract(1), 1);
    const Bytes out = job.Dest();
    const uint16_t n = Get16(out, 8);
    FoundEntry description, make;
    ASSERT_TRUE(FindEntry(out, 8, 270, &description));
    ASSERT_TRUE(FindEntry(out, 8, 271, &make));
    EXPECT_EQ(Get32(out, description.valueField), 8u + 2 + 12u * n + 4);
    EXPECT_EQ(Get32(out, make.valueField), Get32(out, description.valueField) + 6);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(&out[Get32(out, make.valueField)])), "xyzw");
}

TEST(ExtractPage, DoubleAndIfdFieldsAreCopiedUnchanged) {
    BuiltPage page = GreyPage(8, 2, 2);
    page.entries.push_back(DoubleEntry(33550, 2.5));
    page.entries.push_back(TypedEntry(40000, 13, 1, Bytes{0x10, 0, 0, 0}));
    FileJob job(BuildTiff({page}), {});
    ASSERT_EQ(job.Extract(1), 1) << ::testing::PrintToString(job.Errors());
    const Bytes out = job.Dest();
    FoundEntry e;
    ASSERT_TRUE(FindEntry(out, 8, 33550, &e));
    double value = 0;
    std::memcpy(&value, &out[Get32(out, e.valueField)], 8);
    EXPECT_EQ(value, 2.5);
}

TEST(ExtractPage, DestinationIsWrittenFromItsStart) {
    FileJob job(BuildTiff(ThreeGreyPages()), Bytes(100, 0xEE));
    std::fseek(job.host()->destFp, 60, SEEK_SET);
    ASSERT_EQ(job.Extract(1), 1);
    EXPECT_EQ(DecodeWithLibtiff(job.Dest()).size(), 1u);
}

TEST(ExtractPage, SameFileAsSourceAndDestinationIsRefused) {
    FileJob job(BuildTiff(ThreeGreyPages()), {});
    job.host()->destFp = job.host()->sourceFp;
    EXPECT_EQ(job.Extract(1), 0);
    EXPECT_EQ(job.Errors(), std::vector<std::string>{"Source and destination must be different files."});
}

}  // namespace
