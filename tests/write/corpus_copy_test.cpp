// Corpus files with EXIF data copied through the module's reader and writer
// (the tool's copy): the EXIF directory of each page keeps its tags.

#include <gtest/gtest.h>

#include <cstdio>
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
    const auto files = CorpusFiles();
    if (files.empty()) GTEST_SKIP() << "corpus not found";
    int copied = 0;
    std::set<std::string> lost;
    for (const CorpusFile& file : files) {
        if (file.status == "bad" || !(file.HasCategory("exif") || file.HasCategory("exif-ifd"))) continue;
        const Bytes source = ReadFileBytes(file.path);
        const PageDump original = DumpPage(source, 0);
        if (original.exifTags.empty()) continue;
        WriteJob job;
        bool failed = false;
        const uint32_t pages = zantool::CopyPages(file.path, job.host().ctx(), {}, &failed);
        if (pages == 0) continue;  // a page kind the writer has no layout for
        const PageDump copy = DumpPage(job.Finish(), 0);
        ASSERT_TRUE(copy.ok) << file.relpath;
        ++copied;
        for (const std::string& name : TagNames(original.exifTags))
            if (!TagNames(copy.exifTags).count(name)) lost.insert(name);
    }
    EXPECT_GE(copied, 5);
    // The reader passes over UNDEFINED tags of one value or of variable
    // length; nothing else may be lost.
    const std::set<std::string> expected = {
        "MakerNote", "UserComment", "FileSource", "SceneType", "OptoelectricConversionFactor", "SpatialFrequencyResponse",
        "SourceExposureTimesOfCompositeImage", "CFAPattern", "DeviceSettingDescription",
        "InteroperabilityIFDOffset", "Directory at offset"};
    for (const std::string& name : lost) EXPECT_TRUE(expected.count(name)) << name << " was lost";
    std::string all;
    for (const auto& name : lost) all += name + "; ";
    RecordProperty("lost_exif_tags", all);
    std::printf("EXIF tags not carried over: %s\n", all.c_str());
}

}  // namespace
