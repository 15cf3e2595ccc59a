// The version handshake as a host sees it: the result and the error lines.

#include <gtest/gtest.h>

#include <cstring>

#include "frame/version.h"
#include "frame_support.h"
#include "support/test_host.h"
#include "zantiff/zantiff.h"

namespace {

using namespace zantest;

constexpr const char* kMajor = "Major Tiff Version Mismatch: Incorrect major version.";
constexpr const char* kMinor = "Minor Tiff Version Mismatch: Incorrect minor version.";
constexpr const char* kMicro = "Micro Tiff Version Mismatch: Incorrect micro version.";

// Any 1.0.x and 1.1.0 to 1.1.8 are served without a message; any other
// version fails with the headline of the first number that does not match and
// both versions, as six error lines. Nothing else in the record changes.
TEST(VersionHandshake, AcceptsOrExplainsTheMismatch) {
    const struct {
        int major, minor, micro;
        const char* headline;  // null: accepted
    } cases[] = {{1, 1, 8, nullptr}, {1, 0, 99, nullptr}, {1, 1, 0, nullptr}, {1, -1, 0, nullptr},
                 {1, 0, -5, nullptr}, {1, 1, 9, kMicro},   {1, 2, 0, kMinor},   {2, 0, 0, kMajor},
                 {0, 1, 8, kMajor},   {-1, 1, 8, kMajor}};
    for (const auto& c : cases) {
        const std::string caller = "Major=" + std::to_string(c.major) + " Minor=" + std::to_string(c.minor) +
                                   " Micro=" + std::to_string(c.micro);
        SCOPED_TRACE(caller);
        TestHost host;
        const ConversionContext before = *host.ctx();
        EXPECT_EQ(zanGetTiffVersion(host.ctx(), c.major, c.minor, c.micro), c.headline ? 0 : 1);
        const Texts expected = c.headline ? Texts{c.headline, "\n", "Library version Major=1 Minor=1 Micro=8\n",
                                                  "Caller expects " + caller + "\n",
                                                  "Module name: libzantiff.dll", "\n"}
                                          : Texts{};
        EXPECT_EQ(host.Errors(), expected);
        EXPECT_EQ(host.messages.size(), expected.size()) << "errors only";
        EXPECT_EQ(std::memcmp(&before, host.ctx(), sizeof before), 0);
    }
}

// Without a heap buffer for the report, only the headline and a line feed
// arrive.
TEST(VersionHandshake, WithoutHeapBufferOnlyTheHeadlineAndALineFeedArrive) {
    TestHost host;
    const auto saved = zan::gReportBufferAllocator;
    zan::gReportBufferAllocator = [](size_t) -> void* { return nullptr; };
    const int result = zanGetTiffVersion(host.ctx(), 1, 1, 9);
    zan::gReportBufferAllocator = saved;
    EXPECT_EQ(result, 0);
    EXPECT_EQ(host.Errors(), (Texts{kMicro, "\n"}));
}

}  // namespace
