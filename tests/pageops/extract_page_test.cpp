// Page extraction as a host sees it: the file written and the messages.
// (Every page of the corpus's multi-page files is extracted with its tags
// and pixels in corpus_pageops_test.)

#include <gtest/gtest.h>

#include <algorithm>

#include "pageops_support.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

std::vector<BuiltPage> ThreeGreyPages() {
    return {GreyPage(10, 6, 2, 0), GreyPage(7, 5, 5, 50), GreyPage(12, 4, 1, 100)};
}

// Each refusal fails the call with its own message and writes nothing.
TEST(ExtractPage, RefusalsHaveTheirOwnMessages) {
    const Bytes source = BuildTiff(ThreeGreyPages());
    Bytes notTiff = source, badId = source;
    notTiff[0] = 'X';
    badId[2] = 43;
    const struct {
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
    for (const auto& c : cases) {
        FileJob job(c.source, {});
        if (c.setUp) c.setUp(job);
        EXPECT_EQ(job.Extract(c.page), 0) << c.message;
        EXPECT_EQ(job.Errors(), Texts{c.message});
        EXPECT_TRUE(job.Dest().empty()) << c.message;
    }
}

// The page becomes a file of its own in the source's byte order, written
// from the destination's start whatever it held: its directory follows the
// header, marked a standalone page (SubfileType 0, PageNumber 0 of 1), its
// values right after it, DOUBLE and IFD fields copied unchanged.
TEST(ExtractPage, PageIsStandaloneInTheSourcesByteOrder) {
    BuiltPage page = GreyPage(8, 2, 1);
    page.entries.push_back(LongEntry(254, {2}));
    page.entries.push_back(AsciiEntry(270, "abcd"));  // 5 bytes: one skipped byte follows
    page.entries.push_back(AsciiEntry(271, "xyzw"));
    page.entries.push_back(ShortEntry(297, {2, 3}));
    page.entries.push_back(AsciiEntry(305, "scanner"));
    page.entries.push_back(DoubleEntry(33550, 2.5));
    page.entries.push_back(TypedEntry(40000, 13, 1, Bytes{0x10, 0, 0, 0}));  // IFD
    const Bytes source = BuildTiff({GreyPage(4, 4, 4), page, GreyPage(12, 4, 1, 100)}, {.bigEndian = true});
    FileJob job(source, Bytes(100, 0xEE));
    std::fseek(job.host()->destFp, 60, SEEK_SET);
    ASSERT_EQ(job.Extract(2), 1) << ::testing::PrintToString(job.Errors());
    const Bytes out = job.Dest();
    EXPECT_EQ(Bytes(out.begin(), out.begin() + 8), Bytes({'M', 'M', 0, 42, 0, 0, 0, 8}));
    const auto pages = DecodeWithLibtiff(out);
    ASSERT_EQ(pages.size(), 1u);
    EXPECT_EQ(pages[0].pixels, DecodeWithLibtiff(source)[1].pixels);
    FoundEntry e, description, make, in;
    ASSERT_TRUE(FindEntry(out, 8, 254, &e));
    EXPECT_EQ(Get32(out, e.valueField), 0u);
    ASSERT_TRUE(FindEntry(out, 8, 297, &e));
    EXPECT_EQ(Get16(out, e.valueField), 0u);
    EXPECT_EQ(Get16(out, e.valueField + 2), 1u);
    EXPECT_NE(DumpPage(out, 0).tags.find("scanner"), std::string::npos);
    ASSERT_TRUE(FindEntry(out, 8, 270, &description) && FindEntry(out, 8, 271, &make));
    EXPECT_EQ(Get32(out, description.valueField), 8u + 2 + 12u * Get16(out, 8) + 4);
    EXPECT_EQ(Get32(out, make.valueField), Get32(out, description.valueField) + 6);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(&out[Get32(out, make.valueField)])), "xyzw");
    ASSERT_TRUE(FindEntry(out, 8, 33550, &e) && FindEntry(source, DirectoryOffsets(source)[1], 33550, &in));
    const auto at = [](const Bytes& b, const FoundEntry& f) { return b.begin() + Get32(b, f.valueField); };
    EXPECT_TRUE(std::equal(at(out, e), at(out, e) + 8, at(source, in)));
    ASSERT_TRUE(FindEntry(out, 8, 40000, &e));
    EXPECT_EQ(e.type, 13u);
    EXPECT_EQ(Get32(out, e.valueField), 0x10u);
}

}  // namespace
