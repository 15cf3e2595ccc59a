// libzantiff.so exports the module's zan functions and nothing else.

#include <gtest/gtest.h>

#include <cstdio>
#include <set>
#include <string>

namespace {

const std::set<std::string> kInterface = {
    "zanGetTiffVersion", "zanTIFFGetInfo", "zanTIFFReadNextScanLine", "zanTIFFToFrameBuffer",
    "zanTIFFStreamDecodeInit", "zanTIFFStreamDecode", "zanTIFFStreamDecodeComplete",
    "zanTIFFStreamDecodeEnd", "zanTIFFStreamDecodeIsOneChunkTIFF",
    "zanTIFFStreamDecodeSetNoDecompression", "zanTIFFStreamDecodeSetBypassLibTiff",
    "zanTIFFStreamDecodeSetRawBufferOutSize", "zanTIFFSetField", "zanTIFFNextImage",
    "zanTIFFWriteNextScanLine", "zanFrameBufferToTIFF", "zanG4ToTIFF", "zanJPEGToTIFF",
    "zanTIFFSetTIFFTags", "zanConcatenateTIFF", "zanExtractTIFFPage", "zanDestroyTIFF"};

TEST(Exports, SharedLibraryExportsOnlyInterfaceFunctions) {
    ASSERT_EQ(kInterface.size(), 22u);
    const std::string command = std::string("nm -D --defined-only ") + ZANTIFF_SHARED_LIBRARY;
    FILE* pipe = popen(command.c_str(), "r");
    ASSERT_NE(pipe, nullptr);
    std::set<std::string> exported;
    char line[512];
    while (std::fgets(line, sizeof line, pipe)) {
        char type = 0;
        char name[400] = {0};
        if (std::sscanf(line, "%*s %c %399s", &type, name) == 2) exported.insert(name);
    }
    ASSERT_EQ(pclose(pipe), 0);
    ASSERT_FALSE(exported.empty());
    for (const auto& name : exported) EXPECT_TRUE(kInterface.count(name)) << name << " is exported";
    EXPECT_TRUE(exported.count("zanGetTiffVersion"));
    EXPECT_TRUE(exported.count("zanDestroyTIFF"));
}

}  // namespace
