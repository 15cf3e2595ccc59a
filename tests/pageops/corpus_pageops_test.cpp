// Extraction and concatenation of third-party files: good files keep every
// tag and pixel; hostile files end in a result and a message, never a crash.

#include <gtest/gtest.h>

#include <algorithm>

#include "pageops_support.h"
#include "support/corpus.h"
#include "support/tiff_builder.h"

namespace {

using namespace zantest;

// Lines of TIFFPrintDirectory's text that hold offsets (they move) or the
// fields extraction rewrites.
const std::vector<std::string> kMovingLines = {"Directory at", "Subfile Type",   "Page Number", "EXIFIFD",
                                               "GPSIFD",       "Tag 34665",      "Tag 34853",   "JpegInterchangeFormat:",
                                               "JpegQTables",  "JpegDcTables",   "JpegAcTables"};

uint32_t CountPages(const Bytes& tiff) {
    uint32_t pages = 0;
    while (pages < 1000 && DumpPage(tiff, pages).ok) ++pages;
    return pages;
}

// Refusals that a good file may meet, by what the walker does not take on:
// BigTIFF, pages whose strip byte counts are missing, pages with SubIFDs,
// and in concatenation IFD-typed fields it cannot relocate, DOUBLE values
// and wide samples that would change byte order.
bool AcceptableRefusal(const Texts& errors, bool concatenating) {
    static const Texts kAlways = {"Error in second 2 bytes (TIFF id).\n",
                                  "Source page has strip offsets but no byte counts.",
                                  "Pages with SubIFDs cannot be copied."};
    static const Texts kConcatenation = {"Unhandled TIFF TYPE.", "Unhandled type.",
                                         "Page samples of more than 8 bits cannot change byte order without decoding."};
    const auto in = [&](const Texts& list) { return std::find(list.begin(), list.end(), errors[0]) != list.end(); };
    return errors.size() == 1 && (in(kAlways) || (concatenating && in(kConcatenation)));
}

// `orderChanged`: the page was copied into a file of the other byte order.
void ExpectSamePage(const PageDump& want, const PageDump& got, const std::string& what, bool orderChanged = false) {
    ASSERT_TRUE(got.ok) << what;
    EXPECT_EQ(WithoutLines(got.tags, kMovingLines), WithoutLines(want.tags, kMovingLines)) << what;
    EXPECT_EQ(WithoutLines(got.exifTags, kMovingLines), WithoutLines(want.exifTags, kMovingLines)) << what;
    // libtiff 4.5 decodes the strips after the first of a multi-strip
    // old-style JPEG page differently in a big-endian file, although the
    // structure and every byte of JPEG data are the same: only the tags are
    // compared then.
    const bool oldJpegSwapped = orderChanged && want.tags.find("Old-style JPEG") != std::string::npos;
    if (want.dataComplete && !oldJpegSwapped) {
        EXPECT_EQ(got.data, want.data) << what;
    }
}

class CorpusPageOps : public ::testing::Test {
protected:
    void SetUp() override {
        files_ = CorpusFiles();
        if (files_.empty()) GTEST_SKIP() << "corpus not found";
    }
    std::vector<CorpusFile> files_;
};

// Every page of a good multi-page or EXIF file extracts with its tags and
// pixels, or is refused for a reason the walker states.
TEST_F(CorpusPageOps, EveryPageOfGoodFilesExtractsWithItsTagsAndPixels) {
    int extracted = 0;
    for (const CorpusFile& file : files_) {
        if (file.status == "bad") continue;
        const Bytes source = ReadFileBytes(file.path);
        const uint32_t pages = CountPages(source);
        if (pages < 2 && !file.HasCategory("exif")) continue;
        for (uint32_t page = 1; page <= pages; ++page) {
            FileJob job(source, {});
            const std::string what = file.relpath + " page " + std::to_string(page);
            if (!job.Extract(static_cast<int32_t>(page))) {
                EXPECT_TRUE(AcceptableRefusal(job.Errors(), false))
                    << what << ": " << ::testing::PrintToString(job.Errors());
                continue;
            }
            ExpectSamePage(DumpPage(source, page - 1), DumpPage(job.Dest(), 0), what);
            ++extracted;
        }
    }
    EXPECT_GT(extracted, 50);
}

// Every good file appends to a file of either byte order with its tags and
// pixels, or is refused for a stated reason leaving the destination's page.
TEST_F(CorpusPageOps, GoodFilesAppendToFilesOfEitherByteOrder) {
    int appended = 0;
    for (const CorpusFile& file : files_) {
        if (file.status == "bad") continue;
        const Bytes source = ReadFileBytes(file.path);
        const uint32_t pages = CountPages(source);
        if (pages == 0) continue;
        for (bool bigEndian : {false, true}) {
            FileJob job(source, BuildTiff({GreyPage(5, 3, 3)}, {.bigEndian = bigEndian}));
            const std::string what = file.relpath + (bigEndian ? " onto MM" : " onto II");
            if (!job.Concatenate()) {
                EXPECT_TRUE(AcceptableRefusal(job.Errors(), true))
                    << what << ": " << ::testing::PrintToString(job.Errors());
                EXPECT_GE(CountPages(job.Dest()), 1u) << what << ": the destination keeps its page";
                continue;
            }
            const Bytes out = job.Dest();
            ASSERT_EQ(CountPages(out), pages + 1) << what;
            for (uint32_t p = 0; p < pages; ++p)
                ExpectSamePage(DumpPage(source, p), DumpPage(out, p + 1), what + " page " + std::to_string(p + 1),
                               bigEndian != (source[0] == 'M'));
            ++appended;
        }
    }
    EXPECT_GT(appended, 200);
}

// A hostile file ends every call with a result, and a failure with a
// message and a readable destination.
TEST_F(CorpusPageOps, HostileFilesEndWithAResultAndAMessage) {
    const Bytes valid = BuildTiff({GreyPage(5, 3, 3)});
    for (const CorpusFile& file : files_) {
        if (file.status != "bad") continue;
        const Bytes source = ReadFileBytes(file.path);
        for (int32_t page = 1; page <= 3; ++page) {
            FileJob job(source, {});
            if (job.Extract(page) == 0) {
                EXPECT_FALSE(job.Errors().empty()) << file.relpath;
            }
        }
        FileJob job(source, valid);
        if (job.Concatenate() == 0) {
            EXPECT_FALSE(job.Errors().empty()) << file.relpath;
            EXPECT_GE(CountPages(job.Dest()), 1u) << file.relpath << ": the destination stays readable";
        }
    }
}

}  // namespace
