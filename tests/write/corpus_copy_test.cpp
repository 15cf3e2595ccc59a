// Corpus files with EXIF data copied through the module's reader and writer
// (the tool's copy): the EXIF directory of each page keeps its tags.

#include <gtest/gtest.h>

#include <set>
#include <sstream>

#include "page_copy.h"
#include "support/corpus.h"
#include "write_support.h"

namespace {

using namespace zantest;

// Tag names of a TIFFPrintDirectory text, one per line ("  Name: value").
std::set<std::string> TagNames(const std::string& text) {
    std::set<std::string> names;
    std::istringstream in(text);
    std::string line;
    while (std::getline(in, line)) {
        const size_t colon = line.find(':');
        if (line.rfind("  ", 0) == 0 && colon != std::string::npos) names.insert(line.substr(2, colon - 2));
    }
    return names;
}

TEST(CorpusCopy, ExifTagsSurviveACopy) {
    // Every EXIF tag is in the copy but the UNDEFINED ones of one value or of
    // variable length, which the reader passes over.
    const auto files = CorpusFiles();
    if (files.empty()) GTEST_SKIP() << "corpus not found";
    const std::set<std::string> passedOver = {
        "MakerNote", "UserComment", "FileSource", "SceneType", "OptoelectricConversionFactor",
        "SpatialFrequencyResponse", "SourceExposureTimesOfCompositeImage", "CFAPattern", "DeviceSettingDescription",
        "InteroperabilityIFDOffset", "Directory at offset"};
    int copied = 0;
    for (const CorpusFile& file : files) {
        if (file.status == "bad" || !(file.HasCategory("exif") || file.HasCategory("exif-ifd"))) continue;
        const PageDump original = DumpPage(ReadFileBytes(file.path), 0);
        if (original.exifTags.empty()) continue;
        WriteJob job;
        bool failed = false;
        if (zantool::CopyPages(file.path, job.host().ctx(), {}, &failed) == 0) continue;  // a page without a layout
        const PageDump copy = DumpPage(job.Finish(), 0);
        ASSERT_TRUE(copy.ok) << file.relpath;
        ++copied;
        const std::set<std::string> kept = TagNames(copy.exifTags);
        for (const std::string& name : TagNames(original.exifTags))
            EXPECT_TRUE(kept.count(name) || passedOver.count(name)) << name << " was lost from " << file.relpath;
    }
    EXPECT_GE(copied, 5);
}

}  // namespace
