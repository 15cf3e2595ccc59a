// The interface-version handshake.
#pragma once

#include <cstddef>

namespace zan {

// Source of the handshake's 1024-byte report buffer (the process heap).
// Replaceable so that a failing heap can be exercised.
using ReportBufferAllocator = void* (*)(size_t byteCount);
extern ReportBufferAllocator gReportBufferAllocator;

}  // namespace zan
