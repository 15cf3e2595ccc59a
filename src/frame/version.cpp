// The version handshake: a host states the interface version it was built
// against, and a mismatch is explained line by line through its error sink.

#include "frame/version.h"

#include <cstdio>
#include <cstdlib>

#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zan {

ReportBufferAllocator gReportBufferAllocator = std::malloc;

namespace {

constexpr size_t kReportBufferSize = 1024;
constexpr char kModuleName[] = "libzantiff";

// The headline of a mismatch, or null when the module serves the caller:
// any 1.0.x, 1.1.0 to 1.1.8, and a negative minor number.
const char* MismatchHeadline(int32_t major, int32_t minor, int32_t micro) {
    if (major != ZANTIFF_VERSION_MAJOR) return "Major Tiff Version Mismatch: Incorrect major version.";
    if (minor > ZANTIFF_VERSION_MINOR) return "Minor Tiff Version Mismatch: Incorrect minor version.";
    if (minor == ZANTIFF_VERSION_MINOR && micro > ZANTIFF_VERSION_MICRO)
        return "Micro Tiff Version Mismatch: Incorrect micro version.";
    return nullptr;
}

}  // namespace
}  // namespace zan

extern "C" ZAN_API int zanGetTiffVersion(ConversionContext* ctx, int32_t major, int32_t minor,
                                         int32_t micro) {
    using namespace zan;
    const char* headline = MismatchHeadline(major, minor, micro);
    if (!headline) return 1;
    zanError(ctx, headline);
    zanError(ctx, "\n");
    char* report = static_cast<char*>(gReportBufferAllocator(kReportBufferSize));
    if (!report) return 0;
    std::snprintf(report, kReportBufferSize, "Library version Major=%d Minor=%d Micro=%d\n",
                  ZANTIFF_VERSION_MAJOR, ZANTIFF_VERSION_MINOR, ZANTIFF_VERSION_MICRO);
    zanError(ctx, report);
    std::snprintf(report, kReportBufferSize, "Caller expects Major=%d Minor=%d Micro=%d\n",
                  static_cast<int>(major), static_cast<int>(minor), static_cast<int>(micro));
    zanError(ctx, report);
    std::snprintf(report, kReportBufferSize, "Module name: %s.dll", kModuleName);
    zanError(ctx, report);
    zanError(ctx, "\n");
    std::free(report);
    return 0;
}
