#include "frame/job_finishers.h"

namespace zan {
namespace {

// Constant-initialised: registrations from other translation units' static
// initialisers find it ready whatever their order.
constexpr uint32_t kStates = 8;
JobFinisher gFinishers[kStates] = {};

}  // namespace

bool RegisterJobFinisher(uint32_t state, JobFinisher finisher) {
    if (state < kStates) gFinishers[state] = finisher;
    return true;
}

void FinishJobWork(ConversionContext* ctx) {
    if (ctx->state < kStates && gFinishers[ctx->state]) gFinishers[ctx->state](ctx);
}

}  // namespace zan
