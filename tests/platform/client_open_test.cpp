// Codec objects over 32-bit client procedures.

#include <gtest/gtest.h>

#include <cstring>

#include <vector>

#include "osttiff/osttiff.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"

namespace {

using namespace zantest;

// A 32-bit client over bytes in memory that records what libtiff asked.
struct Client {
    Bytes data;
    uint64_t position = 0;
    int closes = 0;
    bool failSeeks = false;
    int64_t shortWritesAfter = -1;  // >= 0: writes past this many bytes come up short
    std::vector<uint32_t> seekOffsets;

    static int32_t Read(void* c, void* buffer, int32_t n) {
        auto* self = static_cast<Client*>(c);
        if (self->position >= self->data.size()) return 0;
        const auto count = static_cast<int32_t>(
            std::min<uint64_t>(static_cast<uint64_t>(n), self->data.size() - self->position));
        std::memcpy(buffer, self->data.data() + self->position, static_cast<size_t>(count));
        self->position += static_cast<uint64_t>(count);
        return count;
    }
    static int32_t Write(void* c, void* buffer, int32_t n) {
        auto* self = static_cast<Client*>(c);
        int32_t count = n;
        if (self->shortWritesAfter >= 0 &&
            self->position + static_cast<uint64_t>(n) > static_cast<uint64_t>(self->shortWritesAfter))
            count = n / 2;
        if (self->data.size() < self->position + count) self->data.resize(self->position + count);
        std::memcpy(self->data.data() + self->position, buffer, static_cast<size_t>(count));
        self->position += static_cast<uint64_t>(count);
        return count;
    }
    static uint32_t Seek(void* c, uint32_t offset, int whence) {
        auto* self = static_cast<Client*>(c);
        self->seekOffsets.push_back(offset);
        if (self->failSeeks) return PIVLO_SEEK_FAILED;
        if (whence == SEEK_SET) self->position = offset;
        else if (whence == SEEK_CUR) self->position += static_cast<int32_t>(offset);
        else self->position = self->data.size() + static_cast<int32_t>(offset);
        return static_cast<uint32_t>(self->position);
    }
    static int Close(void* c) {
        ++static_cast<Client*>(c)->closes;
        return 0;
    }
    static uint32_t Size(void* c) { return static_cast<uint32_t>(static_cast<Client*>(c)->data.size()); }

    TIFF* Open(const char* mode, PivloAllocProc alloc = TestAllocator::Alloc,
               PivloFreeProc release = TestAllocator::Free) {
        return TIFFClientOpenPivlo("client", mode, this, Read, Write, Seek, Close, Size, nullptr,
                                   nullptr, alloc, TestAllocator::Realloc, release);
    }
};

class ClientOpenTest : public ::testing::Test {
protected:
    void SetUp() override {
        previous_ = TIFFSetErrorHandler(nullptr);
        previousWarning_ = TIFFSetWarningHandler(nullptr);
        TestAllocator::Reset();
    }
    void TearDown() override {
        TIFFSetErrorHandler(previous_);
        TIFFSetWarningHandler(previousWarning_);
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
    }
    TIFFErrorHandler previous_ = nullptr;
    TIFFErrorHandler previousWarning_ = nullptr;
};

TEST_F(ClientOpenTest, ReadsEveryPageThroughThe32BitProcedures) {
    Client client;
    client.data = MakePages(3);
    TIFF* tif = client.Open("r");
    ASSERT_NE(tif, nullptr);
    EXPECT_EQ(TIFFClientdataPivlo(tif), &client);
    EXPECT_EQ(TIFFNumberOfDirectories(tif), 3u);
    std::vector<uint8_t> strip(static_cast<size_t>(TIFFStripSize(tif)));
    EXPECT_GT(TIFFReadEncodedStrip(tif, 0, strip.data(), -1), 0);
    EXPECT_EQ(TIFFIOFailedPivlo(tif), 0);
    TIFFClose(tif);
    EXPECT_EQ(client.closes, 1) << "the close procedure runs once, at TIFFClose";
}

TEST_F(ClientOpenTest, WritesAndAppendsPages) {
    Client client;
    TIFF* tif = client.Open("w");
    ASSERT_NE(tif, nullptr);
    ASSERT_TRUE(WritePages(tif, FileSpec{}));
    TIFFClose(tif);
    client.position = 0;
    tif = client.Open("a");
    ASSERT_NE(tif, nullptr);
    ASSERT_TRUE(WritePages(tif, FileSpec{}, 1));
    TIFFClose(tif);
    EXPECT_EQ(DecodeWithLibtiff(client.data).size(), 2u);
}

TEST_F(ClientOpenTest, ContextSlotAndOffsetsOf32Bits) {
    Client client;
    client.data = MakePages(1);
    TIFF* tif = client.Open("rc");
    ASSERT_NE(tif, nullptr);
    EXPECT_EQ(TIFFGetContextPivlo(tif), nullptr);
    int job = 0;
    TIFFSetContextPivlo(tif, &job);
    EXPECT_EQ(TIFFGetContextPivlo(tif), &job);
    uint32_t offset = 0, count = 0;
    ASSERT_EQ(TIFFGetStrileOffset32(tif, 0, &offset), 1);
    ASSERT_EQ(TIFFGetStrileByteCount32(tif, 0, &count), 1);
    EXPECT_EQ(offset, TIFFGetStrileOffset(tif, 0));
    EXPECT_EQ(count, 16u * 8u);
    EXPECT_EQ(TIFFGetStrileOffset32(tif, 5, &offset), 0) << "index beyond the strips";
    TIFFClose(tif);
}

TEST_F(ClientOpenTest, FailingSeekFailsTheOpenWithoutCallingClose) {
    Client client;
    client.data = MakePages(1);
    client.failSeeks = true;
    EXPECT_EQ(client.Open("r"), nullptr);
    EXPECT_EQ(client.closes, 0);
}

TEST_F(ClientOpenTest, ShortWriteIsRemembered) {
    Client client;
    client.shortWritesAfter = 40;
    TIFF* tif = client.Open("w");
    ASSERT_NE(tif, nullptr);
    WritePages(tif, FileSpec{});
    EXPECT_EQ(TIFFIOFailedPivlo(tif), 1);
    TIFFClose(tif);
}

TEST_F(ClientOpenTest, AdapterWithoutMemoryFailsTheOpen) {
    Client client;
    client.data = MakePages(1);
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(client.Open("r"), nullptr);
    TestAllocator::Reset();
    TIFF* tif = client.Open("r", nullptr, nullptr);  // the C heap without host procedures
    ASSERT_NE(tif, nullptr);
    void* own = PivloMalloc(tif, 32);
    EXPECT_NE(own, nullptr);
    PivloFree(tif, own);
    TIFFClose(tif);
}

TEST_F(ClientOpenTest, ObjectsNotOpenedHereHaveNoClientData) {
    TempFile file;
    WriteFileBytes(file.path(), MakePages(1));
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    ASSERT_NE(tif, nullptr);
    EXPECT_EQ(TIFFClientdataPivlo(tif), nullptr);
    EXPECT_EQ(TIFFGetContextPivlo(tif), nullptr);
    TIFFClose(tif);
}

TEST_F(ClientOpenTest, BadModeIsRefused) {
    Client client;
    EXPECT_EQ(client.Open("x"), nullptr);
}

}  // namespace
