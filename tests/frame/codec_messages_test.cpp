// Codec messages reach the job's sinks in the style the job chose, cut to
// the message buffer with the overrun notice, and the codec's previous
// handlers come back afterwards.

#include <gtest/gtest.h>

#include <string>

#include <tiffio.h>

#include "frame/codec_messages.h"
#include "support/test_host.h"

namespace {

using zan::RedirectCodecMessages;
using zan::RestoreCodecMessages;
using zantest::TestHost;
using Messages = std::vector<zantest::CodecMessage>;

constexpr const char* kOverrun = "DANGER OUTPUT MESSAGE BUFFER OVERRUN";

// Handlers that count what reaches them while they are the codec's own.
int gOuterErrors = 0;
int gOuterWarnings = 0;
void OuterError(const char*, const char*, va_list) { ++gOuterErrors; }
void OuterWarning(const char*, const char*, va_list) { ++gOuterWarnings; }

class CodecMessagesTest : public ::testing::Test {
protected:
    void SetUp() override { gOuterErrors = gOuterWarnings = 0; }
    void TearDown() override {
        TIFFSetErrorHandler(previousError_);
        TIFFSetWarningHandler(previousWarning_);
    }

private:
    TIFFErrorHandler previousError_ = TIFFSetErrorHandler(OuterError);
    TIFFErrorHandler previousWarning_ = TIFFSetWarningHandler(OuterWarning);
};

// "module:text" with code -400 reaches the first-style sinks, or the second
// style's with the job's user data; a null error sink drops errors, and no
// handler of the codec's own runs meanwhile.
TEST_F(CodecMessagesTest, MessagesReachTheSinksOfTheChosenStyle) {
    enum Style { FirstStyle, SecondStyle, NoErrorSink };
    for (Style style : {FirstStyle, SecondStyle, NoErrorSink}) {
        SCOPED_TRACE(style);
        TestHost host;
        if (style == SecondStyle) host.UseExSinks();
        if (style != FirstStyle) host->errorProc = nullptr;  // the first style must not be used
        RedirectCodecMessages(host.ctx());
        TIFFError("TIFFReadDirectory", "Bad value %d for \"%s\"", 7, "Compression");
        TIFFWarning("TIFFFetchNormalTag", "Unknown field with tag %u", 33550u);
        RestoreCodecMessages(host.ctx());
        const Messages error{{-400, "TIFFReadDirectory:Bad value 7 for \"Compression\""}};
        EXPECT_EQ(host.codecErrors, style == NoErrorSink ? Messages{} : error);
        EXPECT_EQ(host.codecWarnings, (Messages{{-400, "TIFFFetchNormalTag:Unknown field with tag 33550"}}));
    }
    EXPECT_EQ(gOuterErrors + gOuterWarnings, 0);
}

// Restoring puts back the handlers in force before the first redirection,
// however often the job redirected, and leaves them alone if it never did.
TEST_F(CodecMessagesTest, RestorePutsBackTheHandlersInForceBeforeRedirection) {
    for (int redirections : {0, 1, 2}) {
        SCOPED_TRACE(redirections);
        gOuterErrors = gOuterWarnings = 0;
        TestHost host;
        for (int i = 0; i < redirections; ++i) RedirectCodecMessages(host.ctx());
        RestoreCodecMessages(host.ctx());
        TIFFError("mod", "after");
        TIFFWarning("mod", "after");
        EXPECT_EQ(gOuterErrors, 1);
        EXPECT_EQ(gOuterWarnings, 1);
        EXPECT_TRUE(host.codecErrors.empty());
    }
}

// A message over 511 characters is announced on the error sink, then
// delivered cut to 511, never inside a UTF-8 character; an overlong module
// name is cut too; a null module name gives an empty prefix.
TEST_F(CodecMessagesTest, LongMessageIsAnnouncedAndCutTo511Characters) {
    const std::string longModule(700, 'M');
    const struct {
        const char* module;
        std::string body;
        std::string delivered;
        bool announced;
    } cases[] = {
        {"module", std::string(600, 'x'), "module:" + std::string(511 - 7, 'x'), true},
        {"m", std::string(509, 'y'), "m:" + std::string(509, 'y'), false},  // just fits
        {"m", std::string(510, 'y'), "m:" + std::string(509, 'y'), true},   // one too many
        {"m", std::string(508, 'a') + "\xC3\xA9\xC3\xA9", "m:" + std::string(508, 'a'), true},
        {longModule.c_str(), "text", std::string(511, 'M'), true},
        {nullptr, "no module", ":no module", false},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.delivered.substr(0, 12) + "… of " + std::to_string(c.delivered.size()));
        TestHost host;
        RedirectCodecMessages(host.ctx());
        TIFFErrorExt(nullptr, c.module, "%s", c.body.c_str());
        RestoreCodecMessages(host.ctx());
        Messages expected{{-400, c.delivered}};
        if (c.announced) expected.insert(expected.begin(), {-400, kOverrun});
        EXPECT_EQ(host.codecErrors, expected);
    }
}

// The overrun notice of a warning goes to the error sink when there is one,
// otherwise to the warning sink ahead of the cut warning.
TEST_F(CodecMessagesTest, WarningOverrunNoticeGoesToTheErrorSinkWhenThereIsOne) {
    const Messages cut{{-400, "m:" + std::string(509, 'w')}};
    const Messages notice{{-400, kOverrun}};
    for (bool errorSink : {true, false}) {
        SCOPED_TRACE(errorSink);
        TestHost host;
        if (!errorSink) {
            host.UseExSinks();
            host->errorProcEx = nullptr;
        }
        RedirectCodecMessages(host.ctx());
        TIFFWarning("m", "%s", std::string(600, 'w').c_str());
        RestoreCodecMessages(host.ctx());
        EXPECT_EQ(host.codecErrors, errorSink ? notice : Messages{});
        EXPECT_EQ(host.codecWarnings, (errorSink ? cut : Messages{notice[0], cut[0]}));
    }
}

}  // namespace
