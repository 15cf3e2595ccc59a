// What the teardown does with work a job left in progress. The frame knows
// no reader or writer: the layer that puts a job into a state registers the
// finisher of that state (from its own translation unit, so a state can only
// arise where its finisher is linked in), and zanDestroyTIFF runs the one of
// the job's state.
#pragma once

#include <cstdint>

#include "zantiff/conversion_context.h"

namespace zan {

using JobFinisher = void (*)(ConversionContext* ctx);

// Registers the finisher of jobs in `state` (one a state; the last wins).
// Returns true, for use in a namespace-scope initialiser.
bool RegisterJobFinisher(uint32_t state, JobFinisher finisher);

// Runs the finisher registered for the job's state, if any.
void FinishJobWork(ConversionContext* ctx);

}  // namespace zan
