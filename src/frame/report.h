// Ending a failure path with the host's error message.
#pragma once

#include "pivlo/pivlo.h"
#include "zantiff/conversion_context.h"

namespace zan {

// Reports `message` through the host and returns 0, so a failure path can
// end in one statement.
inline int ReportError(ConversionContext* ctx, const char* message) {
    zanError(ctx, message);
    return 0;
}

}  // namespace zan
