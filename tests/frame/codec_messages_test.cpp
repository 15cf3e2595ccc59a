// Codec messages reach the job's sinks in the style the job chose, cut to
// the message buffer with the overrun notice, and the codec's previous
// handlers come back afterwards.

#include <gtest/gtest.h>

#include <string>

#include <tiffio.h>

#include "frame/codec_messages.h"
#include "frame_support.h"
#include "support/test_host.h"

namespace {

using namespace zantest;
using zan::RedirectCodecMessages;
using zan::RestoreCodecMessages;
using Messages = std::vector<CodecMessage>;

constexpr const char* kOverrun = "DANGER OUTPUT MESSAGE BUFFER OVERRUN";

// "module:text" with code -400 reaches the first-style sinks, or the second
// style's with the job's user data; a null error sink drops errors; no
// handler of the codec's own runs meanwhile. Restoring puts back the
// handlers in force before the first redirection, however often the job
// redirected, and leaves them alone if it never did.
TEST(CodecMessages, MessagesReachTheChosenSinksAndTheHandlersComeBack) {
    enum Style { FirstStyle, SecondStyle, NoErrorSink };
    const std::pair<Style, int> cases[] = {{FirstStyle, 1}, {SecondStyle, 2}, {NoErrorSink, 1}, {FirstStyle, 0}};
    for (const auto& [style, redirections] : cases) {
        SCOPED_TRACE(testing::Message() << "style " << style << ", redirected " << redirections << " times");
        HandlerProbe probe;
        TestHost host;
        if (style == SecondStyle) host.UseExSinks();
        if (style != FirstStyle) host->errorProc = nullptr;  // the first style must not be used
        for (int i = 0; i < redirections; ++i) RedirectCodecMessages(host.ctx());
        TIFFError("TIFFReadDirectory", "Bad value %d for \"%s\"", 7, "Compression");
        TIFFWarning("TIFFFetchNormalTag", "Unknown field with tag %u", 33550u);
        RestoreCodecMessages(host.ctx());
        EXPECT_TRUE(HandlerProbe::InForce());
        const bool redirected = redirections > 0;
        EXPECT_EQ(HandlerProbe::errors + HandlerProbe::warnings, redirected ? 0 : 2);
        const Messages error{{-400, "TIFFReadDirectory:Bad value 7 for \"Compression\""}};
        const Messages warning{{-400, "TIFFFetchNormalTag:Unknown field with tag 33550"}};
        EXPECT_EQ(host.codecErrors, redirected && style != NoErrorSink ? error : Messages{});
        EXPECT_EQ(host.codecWarnings, redirected ? warning : Messages{});
    }
}

// Two jobs whose redirections overlap: once both have ended, the handlers
// in force before either are back, whatever order they end in.
TEST(CodecMessages, OverlappingJobsLeaveTheHandlersAsTheyFoundThem) {
    for (bool firstEndsFirst : {false, true}) {
        HandlerProbe probe;
        TestHost a, b;
        RedirectCodecMessages(a.ctx());
        RedirectCodecMessages(b.ctx());
        RestoreCodecMessages(firstEndsFirst ? a.ctx() : b.ctx());
        RestoreCodecMessages(firstEndsFirst ? b.ctx() : a.ctx());
        EXPECT_TRUE(HandlerProbe::InForce()) << firstEndsFirst;
    }
}

// A message over 511 characters is announced, then delivered cut to 511,
// never inside a UTF-8 character; an overlong module name is cut too; a null
// module name gives an empty prefix. A warning's notice goes to the error
// sink when there is one, otherwise to the warning sink ahead of the warning.
TEST(CodecMessages, LongMessageIsAnnouncedAndCutTo511Characters) {
    enum Kind { Error, Warning, WarningWithoutErrorSink };
    const std::string longModule(700, 'M');
    const struct {
        Kind kind;
        const char* module;
        std::string body;
        std::string delivered;
        bool announced;
    } cases[] = {
        {Error, "module", std::string(600, 'x'), "module:" + std::string(511 - 7, 'x'), true},
        {Error, "m", std::string(509, 'y'), "m:" + std::string(509, 'y'), false},  // just fits
        {Error, "m", std::string(510, 'y'), "m:" + std::string(509, 'y'), true},   // one too many
        {Error, "m", std::string(508, 'a') + "\xC3\xA9\xC3\xA9", "m:" + std::string(508, 'a'), true},
        {Error, longModule.c_str(), "text", std::string(511, 'M'), true},
        {Error, nullptr, "no module", ":no module", false},
        {Warning, "m", std::string(600, 'w'), "m:" + std::string(509, 'w'), true},
        {WarningWithoutErrorSink, "m", std::string(600, 'w'), "m:" + std::string(509, 'w'), true},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << "kind " << c.kind << ": " << c.delivered.substr(0, 12) << "… of "
                                        << c.delivered.size());
        TestHost host;
        if (c.kind == WarningWithoutErrorSink) {
            host.UseExSinks();
            host->errorProcEx = nullptr;
        }
        RedirectCodecMessages(host.ctx());
        if (c.kind == Error) TIFFErrorExt(nullptr, c.module, "%s", c.body.c_str());
        else TIFFWarningExt(nullptr, c.module, "%s", c.body.c_str());
        RestoreCodecMessages(host.ctx());
        Messages errors, warnings;
        (c.kind == Error ? errors : warnings).push_back({-400, c.delivered});
        Messages& noticeSink = c.kind == WarningWithoutErrorSink ? warnings : errors;
        if (c.announced) noticeSink.insert(noticeSink.begin(), {-400, kOverrun});
        EXPECT_EQ(host.codecErrors, errors);
        EXPECT_EQ(host.codecWarnings, warnings);
    }
}

}  // namespace
