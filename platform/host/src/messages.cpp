// Message services of the reference host: every report of the module goes
// through the job's hostMessageProc, or to standard error without one.

#include <cstdarg>
#include <cstdio>
#include <string>

#include "pivlo/pivlo.h"

namespace {

void Deliver(ConversionContext* ctx, int severity, int level, const char* text) {
    if (!text) text = "";
    if (ctx && ctx->hostMessageProc) {
        ctx->hostMessageProc(ctx, severity, level, text);
        return;
    }
    if (severity == PIVLO_ERROR) std::fprintf(stderr, "error: %s\n", text);
    else if (severity == PIVLO_WARNING) std::fprintf(stderr, "warning: %s\n", text);
    // Traces are dropped without a host sink.
}

}  // namespace

extern "C" {

void zanError(ConversionContext* ctx, const char* text) { Deliver(ctx, PIVLO_ERROR, 0, text); }

void zanErrorV(ConversionContext* ctx, const char* format, ...) {
    va_list args;
    va_start(args, format);
    va_list again;
    va_copy(again, args);
    const int length = format ? std::vsnprintf(nullptr, 0, format, args) : -1;
    va_end(args);
    if (length < 0) {
        va_end(again);
        Deliver(ctx, PIVLO_ERROR, 0, format);
        return;
    }
    std::string text(static_cast<size_t>(length), '\0');
    std::vsnprintf(text.data(), text.size() + 1, format, again);
    va_end(again);
    Deliver(ctx, PIVLO_ERROR, 0, text.c_str());
}

void zanWarning(ConversionContext* ctx, const char* text) { Deliver(ctx, PIVLO_WARNING, 0, text); }

void zanTrace(ConversionContext* ctx, const char* text, int level) {
    Deliver(ctx, PIVLO_TRACE, level, text);
}

}  // extern "C"
