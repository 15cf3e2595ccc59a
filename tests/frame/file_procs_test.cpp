// File procedures: positions relative to the base offset, 32-bit results.

#include <gtest/gtest.h>

#include <cstdio>
#include <string>

#include "frame/io_procs.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"

namespace {

using namespace zan;

// A file "HDR0123456" whose TIFF data start after "HDR".
class FileProcsTest : public ::testing::Test {
protected:
    void SetUp() override {
        zantest::WriteFileBytes(file_.path(), {'H', 'D', 'R', '0', '1', '2', '3', '4', '5', '6'});
        record_ = FileHandleRecord{std::fopen(file_.c_str(), "r+b"), 3};
        ASSERT_NE(record_.stream, nullptr);
        host_->fileHandle = &record_;
    }
    void TearDown() override {
        host_->fileHandle = nullptr;
        if (record_.stream) std::fclose(record_.stream);
    }

    zantest::TempFile file_;
    FileHandleRecord record_{};
    zantest::TestHost host_;
    ConversionContext* c_ = host_.ctx();
};

TEST_F(FileProcsTest, PositionsAreRelativeToTheBaseOffset) {
    EXPECT_EQ(FileSeekProc(c_, 0, SEEK_SET), 0u);
    char out[4] = {};
    EXPECT_EQ(FileReadProc(c_, out, 2), 2);
    EXPECT_EQ(std::string(out, 2), "01");
    EXPECT_EQ(FileSeekProc(c_, 0, SEEK_CUR), 2u);
    EXPECT_EQ(FileSizeProc(c_), 7u);
    EXPECT_EQ(FileSeekProc(c_, 0, SEEK_CUR), 2u) << "the size query keeps the position";
}

// Relative moves take signed (wrapped) offsets; a position before the base
// is a failure; an unknown whence answers 0 without moving.
TEST_F(FileProcsTest, RelativeMovesTakeSignedOffsetsAndStopAtTheBase) {
    FileSeekProc(c_, 5, SEEK_SET);
    EXPECT_EQ(FileSeekProc(c_, 0u - 2, SEEK_CUR), 3u);
    EXPECT_EQ(FileSeekProc(c_, 0u - 1, SEEK_END), 6u);
    EXPECT_EQ(FileSeekProc(c_, 0, 42), 0u);
    EXPECT_EQ(FileSeekProc(c_, 0, SEEK_CUR), 6u);
    FileSeekProc(c_, 1, SEEK_SET);
    EXPECT_EQ(FileSeekProc(c_, 0u - 3, SEEK_CUR), kSeekFailed);
}

TEST_F(FileProcsTest, ShortReadAtTheEndAndWritesThatExtend) {
    FileSeekProc(c_, 5, SEEK_SET);
    char out[8] = {};
    EXPECT_EQ(FileReadProc(c_, out, 8), 2);
    FileSeekProc(c_, 0, SEEK_END);
    EXPECT_EQ(FileWriteProc(c_, const_cast<char*>("789"), 3), 3);
    EXPECT_EQ(FileSizeProc(c_), 10u);
    EXPECT_EQ(FileReadProc(c_, out, -1), 0);
}

TEST_F(FileProcsTest, ProceduresWithoutAStreamFail) {
    std::fclose(record_.stream);
    record_.stream = nullptr;
    char out[2];
    EXPECT_EQ(FileReadProc(c_, out, 2), 0);
    EXPECT_EQ(FileWriteProc(c_, out, 2), 0);
    EXPECT_EQ(FileSeekProc(c_, 0, SEEK_SET), kSeekFailed);
    EXPECT_EQ(FileSizeProc(c_), 0u);
}

}  // namespace
