// The reference host's message routing and buffers.

#include <gtest/gtest.h>

#include <cstring>

#include <string>

#include "pivlo/pivlo.h"
#include "support/test_host.h"

namespace {

using zantest::TestAllocator;
using zantest::TestHost;

// Each severity reaches the host sink with its level, and formatted errors
// are not cut, however long; without a sink errors and warnings go to
// standard error and traces are dropped.
TEST(HostMessages, EverySeverityReachesTheHostSinkOrStandardError) {
    TestHost host;
    const std::string big(5000, 'q');
    zanError(host.ctx(), "broken");
    zanWarning(host.ctx(), "odd");
    zanTrace(host.ctx(), "note", 1);
    zanErrorV(host.ctx(), "Failed to set %s=%s\n", "Artist", "me");
    zanErrorV(host.ctx(), "<%s>", big.c_str());
    ASSERT_EQ(host.messages.size(), 5u);
    EXPECT_EQ(host.messages[1].severity, PIVLO_WARNING);
    EXPECT_EQ(host.messages[2].severity, PIVLO_TRACE);
    EXPECT_EQ(host.messages[2].level, 1);
    EXPECT_EQ(host.Errors(), (std::vector<std::string>{"broken", "Failed to set Artist=me\n", "<" + big + ">"}));

    ConversionContext bare;
    pivloInitContext(&bare);
    testing::internal::CaptureStderr();
    zanError(&bare, "disk full");
    zanWarning(&bare, "odd tag");
    zanTrace(&bare, "dropped", 1);
    const std::string err = testing::internal::GetCapturedStderr();
    EXPECT_NE(err.find("disk full"), std::string::npos);
    EXPECT_NE(err.find("odd tag"), std::string::npos);
    EXPECT_EQ(err.find("dropped"), std::string::npos);
}

// The work buffer is kept while big enough, grows on demand, keeps the old
// one when growth is refused, and goes with the reset.
TEST(HostBuffers, WorkBufferGrowsAndIsReleasedByTheReset) {
    TestHost host;
    void* small = pivloWorkBuffer(host.ctx(), 16);
    ASSERT_NE(small, nullptr);
    EXPECT_EQ(pivloWorkBuffer(host.ctx(), 8), small) << "big enough: kept";
    void* big = pivloWorkBuffer(host.ctx(), 4096);
    ASSERT_NE(big, nullptr);
    EXPECT_EQ(TestAllocator::LiveBlocks(), 1u);
    TestAllocator::FailNthCall(1);
    EXPECT_EQ(pivloWorkBuffer(host.ctx(), 10000), nullptr);
    EXPECT_EQ(TestAllocator::LiveBlocks(), 1u) << "a refused growth keeps the old buffer";
    zanResetWorkBuffer(host.ctx());
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
    zanResetWorkBuffer(host.ctx());
}

// Releasing the record frees the frame, the work buffer and what the job
// handed over (the palette as one block), clearing the fields; a second
// release finds nothing to free.
TEST(HostBuffers, ReleaseContextFreesWhatTheJobHandedOver) {
    TestHost host;
    host->frameData = TestAllocator::Alloc(128);
    host->frameBufferSize = 128;
    host->iccProfile = TestAllocator::Alloc(10);
    host->documentName = static_cast<char*>(TestAllocator::Alloc(10));
    host->imageDescription = static_cast<char*>(TestAllocator::Alloc(10));
    host->paletteRed = static_cast<uint16_t*>(TestAllocator::Alloc(6 * 16));
    host->paletteGreen = host->paletteRed + 16;
    host->paletteBlue = host->paletteRed + 32;
    pivloWorkBuffer(host.ctx(), 10);
    pivloReleaseContext(host.ctx());
    EXPECT_EQ(TestAllocator::LiveBlocks(), 0u);
    EXPECT_EQ(host->frameData, nullptr);
    EXPECT_EQ(host->frameBufferSize, 0u);
    EXPECT_EQ(host->paletteBlue, nullptr);
    pivloReleaseContext(host.ctx());
}

}  // namespace
