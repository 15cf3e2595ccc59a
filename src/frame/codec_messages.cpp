// The codec library's handlers are process-wide, so the sinks they forward to
// are kept in process-wide slots as well: one job at a time may have its
// messages redirected.

#include "frame/codec_messages.h"

#include <cstdio>
#include <cstring>

#include "osttiff/osttiff.h"

namespace zan {
namespace {

struct MessageSlots {
    ZanMessageProc error = nullptr;
    ZanMessageProc warning = nullptr;
    ZanMessageProcEx errorEx = nullptr;
    ZanMessageProcEx warningEx = nullptr;
    void* userData = nullptr;
    bool exStyle = false;
    const ConversionContext* owner = nullptr;  // job whose redirection is in force
};

MessageSlots gSlots;
// The handlers in force before any job redirected the codec's messages. A
// job that starts while another job's redirection is in force saves these,
// not the module's own forwarding handlers: otherwise, once both jobs end,
// the forwarding handlers (with no sinks left) would stay in force for good
// and every later libtiff message of the process would be lost.
TIFFErrorHandler gOriginalError = nullptr;
TIFFErrorHandler gOriginalWarning = nullptr;
uint64_t gErrorsDelivered = 0;

constexpr const char kOverrunNotice[] = "DANGER OUTPUT MESSAGE BUFFER OVERRUN";

// Length of `text` without a UTF-8 sequence that a cut left incomplete.
size_t WithoutPartialCharacter(const char* text, size_t length) {
    for (size_t back = 1; back <= 4 && back <= length; ++back) {
        const auto c = static_cast<unsigned char>(text[length - back]);
        if ((c & 0xC0) == 0x80) continue;  // continuation byte: keep looking for the lead
        const size_t needed = c < 0x80 ? 1 : (c & 0xE0) == 0xC0 ? 2 : (c & 0xF0) == 0xE0 ? 3 : 4;
        return back >= needed ? length : length - back;
    }
    return length;
}

// Ends a message that was cut at the buffer's limit.
void EndCutMessage(char* text) {
    const size_t kept = WithoutPartialCharacter(text, MESSAGE_BUFFER_SIZE - 1);
    text[kept] = '\0';
}

// Formats "module:message" into `text` (MESSAGE_BUFFER_SIZE bytes). Returns
// false when the message had to be cut or could not be formatted.
bool FormatCodecMessage(char* text, const char* module, const char* format, va_list args) {
    constexpr size_t kSize = MESSAGE_BUFFER_SIZE;
    const int prefix = std::snprintf(text, kSize, "%s:", module ? module : "");
    if (prefix < 0) {
        text[0] = '\0';
        return false;
    }
    if (static_cast<size_t>(prefix) >= kSize) {
        EndCutMessage(text);
        return false;
    }
    const size_t room = kSize - static_cast<size_t>(prefix);
    char* body = text + prefix;
    body[0] = '\0';
    const int length = format ? std::vsnprintf(body, room, format, args) : 0;
    if (length < 0) {
        body[0] = '\0';
        return false;
    }
    if (static_cast<size_t>(length) >= room) {
        EndCutMessage(text);
        return false;
    }
    return true;
}

void SendTo(ZanMessageProc sink, ZanMessageProcEx sinkEx, const char* text) {
    if (gSlots.exStyle) {
        if (sinkEx) sinkEx(CODEC_MESSAGE_CODE, text, gSlots.userData);
    } else if (sink) {
        sink(CODEC_MESSAGE_CODE, text);
    }
}

bool ErrorSinkSet() { return gSlots.exStyle ? gSlots.errorEx != nullptr : gSlots.error != nullptr; }
bool WarningSinkSet() {
    return gSlots.exStyle ? gSlots.warningEx != nullptr : gSlots.warning != nullptr;
}

}  // namespace

void RedirectCodecMessages(ConversionContext* ctx) {
    const bool ex = ctx->useExMessageProcs != 0;
    gSlots.exStyle = ex;
    gSlots.userData = ex ? ctx->messageUserData : nullptr;
    gSlots.error = ex ? nullptr : ctx->errorProc;
    gSlots.warning = ex ? nullptr : ctx->warningProc;
    gSlots.errorEx = ex ? ctx->errorProcEx : nullptr;
    gSlots.warningEx = ex ? ctx->warningProcEx : nullptr;

    const TIFFErrorHandler previousError =
        TIFFSetErrorHandler(ErrorSinkSet() ? CodecErrorToHost : nullptr);
    const TIFFErrorHandler previousWarning =
        TIFFSetWarningHandler(WarningSinkSet() ? CodecWarningToHost : nullptr);
    if (gSlots.owner == ctx) return;  // keep what was in force before this job
    if (!gSlots.owner) {
        gOriginalError = previousError;
        gOriginalWarning = previousWarning;
    }
    ctx->savedErrorHandler = gOriginalError;
    ctx->savedWarningHandler = gOriginalWarning;
    gSlots.owner = ctx;
}

bool CodecMessagesRedirected(const ConversionContext* ctx) { return gSlots.owner == ctx; }

void RestoreCodecMessages(ConversionContext* ctx) {
    if (gSlots.owner != ctx) return;
    TIFFSetErrorHandler(ctx->savedErrorHandler);
    TIFFSetWarningHandler(ctx->savedWarningHandler);
    gSlots = MessageSlots{};
}

uint64_t CodecErrorsDelivered() { return gErrorsDelivered; }

void CodecErrorToHost(const char* module, const char* format, va_list args) {
    if (!ErrorSinkSet()) return;
    ++gErrorsDelivered;
    char text[MESSAGE_BUFFER_SIZE];
    if (!FormatCodecMessage(text, module, format, args))
        SendTo(gSlots.error, gSlots.errorEx, kOverrunNotice);
    SendTo(gSlots.error, gSlots.errorEx, text);
}

void CodecWarningToHost(const char* module, const char* format, va_list args) {
    if (!WarningSinkSet()) return;
    char text[MESSAGE_BUFFER_SIZE];
    if (!FormatCodecMessage(text, module, format, args)) {
        if (ErrorSinkSet()) SendTo(gSlots.error, gSlots.errorEx, kOverrunNotice);
        else SendTo(gSlots.warning, gSlots.warningEx, kOverrunNotice);
    }
    SendTo(gSlots.warning, gSlots.warningEx, text);
}

}  // namespace zan
