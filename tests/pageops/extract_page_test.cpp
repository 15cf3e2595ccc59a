// Page extraction as a host sees it: the file written and the messages.
// (Every page of the corpus's multi-page files is extracted with its tags
// and pixels in corpus_pageops_test.)

#include <gtest/gtest.h>

#include <cstring>

#include "pageops_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

std::vector<BuiltPage> ThreeGreyPages() {
    return {GreyPage(10, 6, 2, 0), GreyPage(7, 5, 5, 50), GreyPage(12, 4, 1, 100)};
}

TEST(ExtractPage, RefusalsHaveTheirOwnMessages) {
    const Bytes source = BuildTiff(ThreeGreyPages());
    Bytes notTiff = source, badId = source;
    notTiff[0] = 'X';
    badId[2] = 43;
    struct Case {
        Bytes source;
        int32_t page;
        void (*setUp)(FileJob&);
        const char* message;
    } cases[] = {
        {source, 4, nullptr, "Specified page beyond that of the source tiff file."},
        {BuildTiff({}), 1, nullptr, "Specified page beyond that of the source tiff file."},
        {source, 0, nullptr, "Page starts at 1."},
        {notTiff, 1, nullptr, "Source not a tiff file.\n"},
        {badId, 1, nullptr, "Error in second 2 bytes (TIFF id).\n"},
        // The file kinds are checked before the page number.
        {source, 0, [](FileJob& job) { job.host()->destKind = ZAN_DEST_MEMORY; },
         "Source and destinationf must be files."},
        {source, 1, [](FileJob& job) { job.host()->destFp = job.host()->sourceFp; },
         "Source and destination must be different files."},
    };
    for (const Case& c : cases) {
        FileJob job(c.source, {});
        if (c.setUp) c.setUp(job);
        EXPECT_EQ(job.Extract(c.page), 0) << c.message;
        EXPECT_EQ(job.Errors(), std::vector<std::string>{c.message});
    }
}

TEST(ExtractPage, BigEndianSourceGivesBigEndianFile) {
    const Bytes source = BuildTiff(ThreeGreyPages(), {.bigEndian = true});
    FileJob job(source, {});
    ASSERT_EQ(job.Extract(2), 1);
    const Bytes out = job.Dest();
    EXPECT_EQ(Bytes(out.begin(), out.begin() + 8), Bytes({'M', 'M', 0, 42, 0, 0, 0, 8}));
    EXPECT_EQ(DecodeWithLibtiff(out)[0].pixels, DecodeWithLibtiff(source)[1].pixels);
}

TEST(ExtractPage, PageIsStandaloneWithItsFieldsAndValuesRightAfterTheDirectory) {
    BuiltPage page = GreyPage(8, 2, 1);
    page.entries.push_back(LongEntry(254, {2}));
    page.entries.push_back(AsciiEntry(270, "abcd"));  // 5 bytes: one skipped byte follows
    page.entries.push_back(AsciiEntry(271, "xyzw"));
    page.entries.push_back(ShortEntry(297, {2, 3}));
    page.entries.push_back(AsciiEntry(305, "scanner"));
    page.entries.push_back(DoubleEntry(33550, 2.5));
    page.entries.push_back(TypedEntry(40000, 13, 1, Bytes{0x10, 0, 0, 0}));  // IFD
    FileJob job(BuildTiff({GreyPage(4, 4, 4), page}), {});
    ASSERT_EQ(job.Extract(2), 1) << ::testing::PrintToString(job.Errors());
    const Bytes out = job.Dest();
    EXPECT_EQ(Get32(out, 4), 8u) << "the directory follows the header";
    FoundEntry e, description, make;
    // A standalone page: SubfileType 0, PageNumber 0 of 1.
    ASSERT_TRUE(FindEntry(out, 8, 254, &e));
    EXPECT_EQ(Get32(out, e.valueField), 0u);
    ASSERT_TRUE(FindEntry(out, 8, 297, &e));
    EXPECT_EQ(Get16(out, e.valueField), 0u);
    EXPECT_EQ(Get16(out, e.valueField + 2), 1u);
    EXPECT_NE(DumpPage(out, 0).tags.find("scanner"), std::string::npos);
    ASSERT_TRUE(FindEntry(out, 8, 270, &description));
    ASSERT_TRUE(FindEntry(out, 8, 271, &make));
    EXPECT_EQ(Get32(out, description.valueField), 8u + 2 + 12u * Get16(out, 8) + 4);
    EXPECT_EQ(Get32(out, make.valueField), Get32(out, description.valueField) + 6);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(&out[Get32(out, make.valueField)])), "xyzw");
    // DOUBLE and IFD fields are copied unchanged.
    ASSERT_TRUE(FindEntry(out, 8, 33550, &e));
    double value = 0;
    std::memcpy(&value, &out[Get32(out, e.valueField)], 8);
    EXPECT_EQ(value, 2.5);
    ASSERT_TRUE(FindEntry(out, 8, 40000, &e));
    EXPECT_EQ(e.type, 13u);
}

TEST(ExtractPage, DestinationIsWrittenFromItsStart) {
    FileJob job(BuildTiff(ThreeGreyPages()), Bytes(100, 0xEE));
    std::fseek(job.host()->destFp, 60, SEEK_SET);
    ASSERT_EQ(job.Extract(1), 1);
    EXPECT_EQ(DecodeWithLibtiff(job.Dest()).size(), 1u);
}

}  // namespace
