// File procedures: positions relative to the base offset, 32-bit results.

#include <gtest/gtest.h>

#include <cstdio>
#include <string>

#include "frame/io_procs.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"

namespace {

using namespace zan;
using zantest::TempFile;
using zantest::TestHost;

class FileProcsTest : public ::testing::Test {
protected:
    void SetUp() override {
        zantest::WriteFileBytes(file_.path(), {'H', 'D', 'R', '0', '1', '2', '3', '4', '5', '6'});
        stream_ = std::fopen(file_.c_str(), "r+b");
        ASSERT_NE(stream_, nullptr);
        record_ = FileHandleRecord{stream_, 3};  // the TIFF data start after "HDR"
        host_->fileHandle = &record_;
    }
    void TearDown() override {
        host_->fileHandle = nullptr;
        std::fclose(stream_);
    }

    TempFile file_;
    FILE* stream_ = nullptr;
    FileHandleRecord record_{};
    TestHost host_;
};

TEST_F(FileProcsTest, PositionsAreRelativeToTheBaseOffset) {
    EXPECT_EQ(FileSeekProc(host_.ctx(), 0, SEEK_SET), 0u);
    char out[4] = {};
    EXPECT_EQ(FileReadProc(host_.ctx(), out, 2), 2);
    EXPECT_EQ(std::string(out, 2), "01");
    EXPECT_EQ(FileSeekProc(host_.ctx(), 0, SEEK_CUR), 2u);
    EXPECT_EQ(FileSizeProc(host_.ctx()), 7u);
    EXPECT_EQ(FileSeekProc(host_.ctx(), 0, SEEK_CUR), 2u) << "the size query keeps the position";
}

TEST_F(FileProcsTest, RelativeMovesTakeSignedOffsets) {
    FileSeekProc(host_.ctx(), 5, SEEK_SET);
    EXPECT_EQ(FileSeekProc(host_.ctx(), static_cast<uint32_t>(-2), SEEK_CUR), 3u);
    EXPECT_EQ(FileSeekProc(host_.ctx(), static_cast<uint32_t>(-1), SEEK_END), 6u);
    EXPECT_EQ(FileSeekProc(host_.ctx(), 0, 42), 0u) << "unknown whence: 0, no move";
    EXPECT_EQ(FileSeekProc(host_.ctx(), 0, SEEK_CUR), 6u);
}

TEST_F(FileProcsTest, PositionBeforeTheBaseIsAFailure) {
    FileSeekProc(host_.ctx(), 1, SEEK_SET);
    EXPECT_EQ(FileSeekProc(host_.ctx(), static_cast<uint32_t>(-3), SEEK_CUR), kSeekFailed);
}

TEST_F(FileProcsTest, ShortReadAtTheEndAndWritesThatExtend) {
    FileSeekProc(host_.ctx(), 5, SEEK_SET);
    char out[8] = {};
    EXPECT_EQ(FileReadProc(host_.ctx(), out, 8), 2);
    FileSeekProc(host_.ctx(), 0, SEEK_END);
    char more[] = "789";
    EXPECT_EQ(FileWriteProc(host_.ctx(), more, 3), 3);
    EXPECT_EQ(FileSizeProc(host_.ctx()), 10u);
    EXPECT_EQ(FileReadProc(host_.ctx(), out, -1), 0);
}

TEST_F(FileProcsTest, ProceduresWithoutAStreamFail) {
    record_.stream = nullptr;
    char out[2];
    EXPECT_EQ(FileReadProc(host_.ctx(), out, 2), 0);
    EXPECT_EQ(FileWriteProc(host_.ctx(), out, 2), 0);
    EXPECT_EQ(FileSeekProc(host_.ctx(), 0, SEEK_SET), kSeekFailed);
    EXPECT_EQ(FileSizeProc(host_.ctx()), 0u);
}

TEST(NullProcTest, DoesNothing) {
    char buffer[2] = {'x', 'y'};
    EXPECT_EQ(NullProc(nullptr, buffer, 2), 0);
    EXPECT_EQ(NullProc(nullptr), 0);
    void* base = buffer;
    uint32_t size = 5;
    EXPECT_EQ(NullProc(nullptr, &base, &size), 0);
    EXPECT_EQ(base, buffer);
    EXPECT_EQ(size, 5u);
}

}  // namespace
