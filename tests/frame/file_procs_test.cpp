// File procedures: positions relative to the base offset, 32-bit results.

#include <gtest/gtest.h>

#include <cstdio>
#include <string>

#include "frame/io_procs.h"
#include "frame_support.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"

namespace {

using namespace zan;
using namespace zantest;

// A file "HDR0123456" whose TIFF data start after "HDR".
class FileProcsTest : public ::testing::Test {
protected:
    void SetUp() override {
        WriteFileBytes(file_.path(), {'H', 'D', 'R', '0', '1', '2', '3', '4', '5', '6'});
        record_ = FileHandleRecord{std::fopen(file_.c_str(), "r+b"), 3};
        ASSERT_NE(record_.stream, nullptr);
        host_->fileHandle = &record_;
    }
    void TearDown() override {
        host_->fileHandle = nullptr;
        if (record_.stream) std::fclose(record_.stream);
    }

    TempFile file_;
    FileHandleRecord record_{};
    TestHost host_;
    ConversionContext* c_ = host_.ctx();
};

// The codec sees positions from the base offset: relative moves take signed
// (wrapped) offsets, a position before the base fails, an unknown whence
// answers 0 without moving; a read at the end is short, a write there
// extends the file; without a stream every procedure fails.
TEST_F(FileProcsTest, PositionsAreRelativeToTheBaseOffset) {
    ExpectSeeks(FileSeekProc, c_, {{0, SEEK_SET, 0}});
    char out[8] = {};
    EXPECT_EQ(FileReadProc(c_, out, 2), 2);
    EXPECT_EQ(std::string(out, 2), "01");
    EXPECT_EQ(FileSizeProc(c_), 7u);
    ExpectSeeks(FileSeekProc, c_,
                {{0, SEEK_CUR, 2}, {5, SEEK_SET, 5}, {Back(2), SEEK_CUR, 3}, {Back(1), SEEK_END, 6},
                 {0, 42, 0}, {0, SEEK_CUR, 6}, {1, SEEK_SET, 1}, {Back(3), SEEK_CUR, kSeekFailed}, {5, SEEK_SET, 5}});
    EXPECT_EQ(FileReadProc(c_, out, 8), 2);
    FileSeekProc(c_, 0, SEEK_END);
    EXPECT_EQ(FileWriteProc(c_, const_cast<char*>("789"), 3), 3);
    EXPECT_EQ(FileSizeProc(c_), 10u);
    EXPECT_EQ(FileReadProc(c_, out, -1), 0);
    std::fclose(record_.stream);
    record_.stream = nullptr;
    EXPECT_EQ(FileReadProc(c_, out, 2), 0);
    EXPECT_EQ(FileWriteProc(c_, out, 2), 0);
    EXPECT_EQ(FileSeekProc(c_, 0, SEEK_SET), kSeekFailed);
    EXPECT_EQ(FileSizeProc(c_), 0u);
}

}  // namespace
