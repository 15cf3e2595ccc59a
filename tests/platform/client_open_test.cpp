// Codec objects over 32-bit client procedures.

#include <gtest/gtest.h>

#include <vector>

#include "osttiff/osttiff.h"
#include "support/memory_stream.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"

namespace {

using namespace zantest;

// A 32-bit client over a MemoryStream.
struct Client {
    MemoryStream stream;
    int closes = 0;
    bool failSeeks = false;
    int64_t shortWritesAfter = -1;  // >= 0: writes past this many bytes come up short

    static Client& Of(void* c) { return *static_cast<Client*>(c); }
    static int32_t Read(void* c, void* buffer, int32_t n) { return MemoryStream::Read(buffer, n, &Of(c).stream); }
    static int32_t Write(void* c, void* buffer, int32_t n) {
        const int64_t limit = Of(c).shortWritesAfter;
        const bool cut = limit >= 0 && static_cast<int64_t>(Of(c).stream.position) + n > limit;
        return MemoryStream::Write(buffer, cut ? n / 2 : n, &Of(c).stream);
    }
    static uint32_t Seek(void* c, uint32_t offset, int whence) {
        return Of(c).failSeeks ? PIVLO_SEEK_FAILED : MemoryStream::Seek(offset, whence, &Of(c).stream);
    }
    static int Close(void* c) {
        ++Of(c).closes;
        return 0;
    }
    static uint32_t Size(void* c) { return static_cast<uint32_t>(Of(c).stream.data.size()); }

    TIFF* Open(const char* mode, bool hostAllocators = true) {
        stream.position = 0;
        return TIFFClientOpenPivlo("client", mode, this, Read, Write, Seek, Close, Size, nullptr, nullptr,
                                   hostAllocators ? TestAllocator::Alloc : nullptr, TestAllocator::Realloc,
                                   hostAllocators ? TestAllocator::Free : nullptr);
    }
};

// Codec messages are silenced; every test must leave no block of the
// allocator behind.
class ClientOpenTest : public ::testing::Test {
protected:
    void SetUp() override { TestAllocator::Reset(); }
    void TearDown() override {
        TIFFSetErrorHandler(previousError_);
        TIFFSetWarningHandler(previousWarning_);
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
    }
    TIFFErrorHandler previousError_ = TIFFSetErrorHandler(nullptr);
    TIFFErrorHandler previousWarning_ = TIFFSetWarningHandler(nullptr);
};

// A page written, one appended, both read back; the close procedure runs
// once for each object, at TIFFClose. A short write is remembered.
TEST_F(ClientOpenTest, WritesAppendsAndReadsThroughThe32BitProcedures) {
    Client client;
    TIFF* tif = client.Open("w");
    ASSERT_NE(tif, nullptr);
    ASSERT_TRUE(WritePages(tif, FileLayout{}));
    TIFFClose(tif);
    EXPECT_EQ(client.closes, 1);
    ASSERT_NE(tif = client.Open("a"), nullptr);
    ASSERT_TRUE(WritePages(tif, FileLayout{}, 1));
    EXPECT_EQ(TIFFIOFailedPivlo(tif), 0);
    TIFFClose(tif);
    ASSERT_NE(tif = client.Open("r"), nullptr);
    EXPECT_EQ(TIFFClientdataPivlo(tif), &client);
    EXPECT_EQ(TIFFNumberOfDirectories(tif), 2u);
    std::vector<uint8_t> strip(static_cast<size_t>(TIFFStripSize(tif)));
    EXPECT_GT(TIFFReadEncodedStrip(tif, 0, strip.data(), -1), 0);
    TIFFClose(tif);
    EXPECT_EQ(client.closes, 3);

    Client shortWriter;
    shortWriter.shortWritesAfter = 40;
    ASSERT_NE(tif = shortWriter.Open("w"), nullptr);
    WritePages(tif, FileLayout{});
    EXPECT_EQ(TIFFIOFailedPivlo(tif), 1);
    TIFFClose(tif);
}

// The context slot starts empty and keeps what the job puts there; strip
// offsets and counts come as 32-bit values; without host allocators the C
// heap serves. Objects not opened here have neither client data nor context.
TEST_F(ClientOpenTest, ContextSlotOffsetsOf32BitsAndTheCHeap) {
    Client client;
    client.stream.data = MakePages(1);
    TIFF* tif = client.Open("rc", false);
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
    void* own = PivloMalloc(tif, 32);
    EXPECT_NE(own, nullptr);
    PivloFree(tif, own);
    TIFFClose(tif);

    TempFile file;
    WriteFileBytes(file.path(), client.stream.data);
    ASSERT_NE(tif = TIFFOpen(file.c_str(), "r"), nullptr);
    EXPECT_EQ(TIFFClientdataPivlo(tif), nullptr);
    EXPECT_EQ(TIFFGetContextPivlo(tif), nullptr);
    TIFFClose(tif);
}

// A failing seek, a bad mode or an adapter without memory: no object, and
// the close procedure is not called.
TEST_F(ClientOpenTest, RefusedOpenReturnsNothingWithoutCallingClose) {
    for (int fault = 0; fault < 3; ++fault) {
        SCOPED_TRACE(fault);
        Client client;
        client.stream.data = MakePages(1);
        client.failSeeks = fault == 0;
        if (fault == 2) TestAllocator::FailNthCall(1);
        EXPECT_EQ(client.Open(fault == 1 ? "x" : "r"), nullptr);
        EXPECT_EQ(client.closes, 0);
        TestAllocator::Reset();
    }
}

}  // namespace
