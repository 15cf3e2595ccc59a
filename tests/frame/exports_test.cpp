// libzantiff.so exports the module's 22 zan functions and nothing else.

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

// A host linking the library finds exactly these names defined.
TEST(Exports, SharedLibraryExportsExactlyTheInterfaceFunctions) {
    ASSERT_EQ(kInterface.size(), 22u);
    const std::string command = std::string("nm -D --defined-only ") + ZANTIFF_SHARED_LIBRARY;
    FILE* pipe = popen(command.c_str(), "r");
    ASSERT_NE(pipe, nullptr);
    std::set<std::string> exported;
    char line[512], name[400];
    while (std::fgets(line, sizeof line, pipe))
        if (std::sscanf(line, "%*s %*c %399s", name) == 1) exported.insert(name);
    ASSERT_EQ(pclose(pipe), 0);
    EXPECT_EQ(exported, kInterface);
}

}  // namespace
