// The version handshake as a host sees it: the result and the error lines.

#include <gtest/gtest.h>

#include <cstring>

#include "frame/version.h"
#include "support/test_host.h"
#include "zantiff/zantiff.h"

namespace {

using zantest::TestHost;

struct Case {
    int major, minor, micro;
    const char* headline;  // null: accepted
};

class VersionTest : public ::testing::TestWithParam<Case> {};

TEST_P(VersionTest, AcceptsOrExplainsTheMismatch) {
    const Case c = GetParam();
    TestHost host;
    const int result = zanGetTiffVersion(host.ctx(), c.major, c.minor, c.micro);
    if (!c.headline) {
        EXPECT_EQ(result, 1);
        EXPECT_TRUE(host.messages.empty());
        return;
    }
    EXPECT_EQ(result, 0);
    const std::vector<std::string> expected = {
        c.headline,
        "\n",
        "Library version Major=1 Minor=1 Micro=8\n",
        "Caller expects Major=" + std::to_string(c.major) + " Minor=" + std::to_string(c.minor) +
            " Micro=" + std::to_string(c.micro) + "\n",
        "Module name: libzantiff.dll",
        "\n",
    };
    EXPECT_EQ(host.Errors(), expected);
    EXPECT_EQ(host.messages.size(), 6u);
}

constexpr const char* kMajor = "Major Tiff Version Mismatch: Incorrect major version.";
constexpr const char* kMinor = "Minor Tiff Version Mismatch: Incorrect minor version.";
constexpr const char* kMicro = "Micro Tiff Version Mismatch: Incorrect micro version.";

INSTANTIATE_TEST_SUITE_P(Handshake, VersionTest,
                         ::testing::Values(Case{1, 1, 8, nullptr}, Case{1, 0, 99, nullptr},
                                           Case{1, 1, 0, nullptr}, Case{1, -1, 0, nullptr},
                                           Case{1, 0, -5, nullptr}, Case{1, 1, 9, kMicro},
                                           Case{1, 2, 0, kMinor}, Case{2, 0, 0, kMajor},
                                           Case{0, 1, 8, kMajor}, Case{-1, 1, 8, kMajor}),
                         [](const ::testing::TestParamInfo<Case>& info) {
                             auto name = [](int v) {
                                 return v < 0 ? "m" + std::to_string(-v) : std::to_string(v);
                             };
                             const Case& c = info.param;
                             return "v" + name(c.major) + "_" + name(c.minor) + "_" + name(c.micro);
                         });

TEST(VersionReport, WithoutHeapBufferOnlyTheHeadlineAndALineFeedArrive) {
    TestHost host;
    const auto saved = zan::gReportBufferAllocator;
    zan::gReportBufferAllocator = [](size_t) -> void* { return nullptr; };
    const int result = zanGetTiffVersion(host.ctx(), 1, 1, 9);
    zan::gReportBufferAllocator = saved;
    EXPECT_EQ(result, 0);
    EXPECT_EQ(host.Errors(), (std::vector<std::string>{kMicro, "\n"}));
}

TEST(VersionReport, TouchesNothingElseInTheRecord) {
    TestHost host;
    ConversionContext before = *host.ctx();
    zanGetTiffVersion(host.ctx(), 3, 0, 0);
    EXPECT_EQ(std::memcmp(&before, host.ctx(), sizeof before), 0);
}

}  // namespace
