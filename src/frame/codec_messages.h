// Routing of the codec library's error and warning messages to the job's
// message sinks.
#pragma once

#include <cstdarg>
#include <cstdint>

#include "zantiff/conversion_context.h"

namespace zan {

constexpr int CODEC_MESSAGE_CODE = -400;
constexpr int MESSAGE_BUFFER_SIZE = 512;

// Installs the module's handlers in the codec library for this job's sinks
// and saves the handlers in force in savedErrorHandler/savedWarningHandler.
// A job that has already redirected only has its sinks refreshed, so that the
// handlers saved first are the ones put back.
void RedirectCodecMessages(ConversionContext* ctx);

// True while this job's redirection is in force.
bool CodecMessagesRedirected(const ConversionContext* ctx);

// Puts back the handlers saved when this job redirected; nothing when the job
// has no redirection in force (so a job that never opened anything leaves the
// codec's handlers alone).
void RestoreCodecMessages(ConversionContext* ctx);

// Number of codec error texts delivered to a host sink so far (process-wide),
// so that a caller can tell whether a failing codec call has explained
// itself to the host.
uint64_t CodecErrorsDelivered();

// The handlers, with the codec library's handler signature.
void CodecErrorToHost(const char* module, const char* format, va_list args);
void CodecWarningToHost(const char* module, const char* format, va_list args);

}  // namespace zan
