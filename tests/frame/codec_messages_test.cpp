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
using zantest::CodecMessage;
using zantest::TestHost;

constexpr const char* kOverrun = "DANGER OUTPUT MESSAGE BUFFER OVERRUN";

// Handlers that count what reaches them while they are the codec's own.
int gOuterErrors = 0;
int gOuterWarnings = 0;
void OuterError(const char*, const char*, va_list) { ++gOuterErrors; }
void OuterWarning(const char*, const char*, va_list) { ++gOuterWarnings; }

class CodecMessagesTest : public ::testing::Test {
protected:
    void SetUp() override {
        previousError_ = TIFFSetErrorHandler(OuterError);
        previousWarning_ = TIFFSetWarningHandler(OuterWarning);
        gOuterErrors = gOuterWarnings = 0;
    }
    void TearDown() override {
        TIFFSetErrorHandler(previousError_);
        TIFFSetWarningHandler(previousWarning_);
    }

private:
    TIFFErrorHandler previousError_ = nullptr;
    TIFFErrorHandler previousWarning_ = nullptr;
};

TEST_F(CodecMessagesTest, FirstStyleSinksGetModuleAndTextWithCode400) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    TIFFError("TIFFReadDirectory", "Bad value %d for \"%s\"", 7, "Compression");
    TIFFWarning("TIFFFetchNormalTag", "Unknown field with tag %u", 33550u);
    RestoreCodecMessages(host.ctx());
    EXPECT_EQ(host.codecErrors,
              (std::vector<CodecMessage>{{-400, "TIFFReadDirectory:Bad value 7 for \"Compression\""}}));
    EXPECT_EQ(host.codecWarnings,
              (std::vector<CodecMessage>{{-400, "TIFFFetchNormalTag:Unknown field with tag 33550"}}));
    EXPECT_EQ(gOuterErrors, 0);
}

TEST_F(CodecMessagesTest, SecondStyleSinksGetTheUserData) {
    TestHost host;
    host.UseExSinks();
    host->errorProc = nullptr;  // the first style must not be used
    RedirectCodecMessages(host.ctx());
    TIFFError("mod", "error");
    TIFFWarning("mod", "warning");
    RestoreCodecMessages(host.ctx());
    EXPECT_EQ(host.codecErrors, (std::vector<CodecMessage>{{-400, "mod:error"}}));
    EXPECT_EQ(host.codecWarnings, (std::vector<CodecMessage>{{-400, "mod:warning"}}));
}

TEST_F(CodecMessagesTest, NullErrorSinkDropsErrorsWhileWarningsArrive) {
    TestHost host;
    host->errorProc = nullptr;
    RedirectCodecMessages(host.ctx());
    TIFFError("mod", "lost");
    TIFFWarning("mod", "kept");
    RestoreCodecMessages(host.ctx());
    EXPECT_TRUE(host.codecErrors.empty());
    EXPECT_EQ(host.codecWarnings, (std::vector<CodecMessage>{{-400, "mod:kept"}}));
    EXPECT_EQ(gOuterErrors, 0) << "no handler may be installed for a null sink";
}

TEST_F(CodecMessagesTest, RestorePutsBackTheHandlersInForceAtRedirection) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    EXPECT_EQ(host->savedErrorHandler, &OuterError);
    EXPECT_EQ(host->savedWarningHandler, &OuterWarning);
    RestoreCodecMessages(host.ctx());
    TIFFError("mod", "after");
    TIFFWarning("mod", "after");
    EXPECT_EQ(gOuterErrors, 1);
    EXPECT_EQ(gOuterWarnings, 1);
    EXPECT_TRUE(host.codecErrors.empty());
}

TEST_F(CodecMessagesTest, RedirectingTwiceKeepsTheFirstSavedHandlers) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    RedirectCodecMessages(host.ctx());
    RestoreCodecMessages(host.ctx());
    TIFFError("mod", "after");
    EXPECT_EQ(gOuterErrors, 1);
}

TEST_F(CodecMessagesTest, RestoreWithoutRedirectionLeavesTheCodecAlone) {
    TestHost host;
    RestoreCodecMessages(host.ctx());  // a job that never opened anything
    TIFFError("mod", "still routed");
    EXPECT_EQ(gOuterErrors, 1);
}

TEST_F(CodecMessagesTest, LongMessageIsAnnouncedAndCutTo511Characters) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    const std::string body(600, 'x');
    TIFFError("module", "%s", body.c_str());
    RestoreCodecMessages(host.ctx());
    ASSERT_EQ(host.codecErrors.size(), 2u);
    EXPECT_EQ(host.codecErrors[0], (CodecMessage{-400, kOverrun}));
    EXPECT_EQ(host.codecErrors[1].text, "module:" + std::string(511 - 7, 'x'));
}

TEST_F(CodecMessagesTest, MessageThatJustFitsIsNotAnnounced) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    TIFFError("m", "%s", std::string(509, 'y').c_str());  // "m:" + 509 = 511 characters
    TIFFError("m", "%s", std::string(510, 'y').c_str());  // one too many
    RestoreCodecMessages(host.ctx());
    ASSERT_EQ(host.codecErrors.size(), 3u);
    EXPECT_EQ(host.codecErrors[0].text.size(), 511u);
    EXPECT_EQ(host.codecErrors[1].text, kOverrun);
    EXPECT_EQ(host.codecErrors[2].text.size(), 511u);
}

TEST_F(CodecMessagesTest, CutNeverSplitsAUtf8Character) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    std::string body(508, 'a');
    body += "\xC3\xA9\xC3\xA9";  // the first é straddles the limit
    TIFFError("m", "%s", body.c_str());
    RestoreCodecMessages(host.ctx());
    ASSERT_EQ(host.codecErrors.size(), 2u);
    EXPECT_EQ(host.codecErrors[1].text, "m:" + std::string(508, 'a'));
}

TEST_F(CodecMessagesTest, OverlongModuleNameIsCutToo) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    TIFFError(std::string(700, 'M').c_str(), "text");
    RestoreCodecMessages(host.ctx());
    ASSERT_EQ(host.codecErrors.size(), 2u);
    EXPECT_EQ(host.codecErrors[1].text, std::string(511, 'M'));
}

TEST_F(CodecMessagesTest, WarningOverrunNoticeGoesToTheErrorSinkWhenThereIsOne) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    TIFFWarning("m", "%s", std::string(600, 'w').c_str());
    RestoreCodecMessages(host.ctx());
    EXPECT_EQ(host.codecErrors, (std::vector<CodecMessage>{{-400, kOverrun}}));
    ASSERT_EQ(host.codecWarnings.size(), 1u);
    EXPECT_EQ(host.codecWarnings[0].text.size(), 511u);
}

TEST_F(CodecMessagesTest, WarningOverrunNoticeGoesToTheWarningSinkWithoutAnErrorSink) {
    TestHost host;
    host.UseExSinks();
    host->errorProcEx = nullptr;
    RedirectCodecMessages(host.ctx());
    TIFFWarning("m", "%s", std::string(600, 'w').c_str());
    RestoreCodecMessages(host.ctx());
    EXPECT_TRUE(host.codecErrors.empty());
    ASSERT_EQ(host.codecWarnings.size(), 2u);
    EXPECT_EQ(host.codecWarnings[0], (CodecMessage{-400, kOverrun}));
}

TEST_F(CodecMessagesTest, NullModuleNameGivesAnEmptyPrefix) {
    TestHost host;
    RedirectCodecMessages(host.ctx());
    TIFFErrorExt(nullptr, nullptr, "no module");
    RestoreCodecMessages(host.ctx());
    EXPECT_EQ(host.codecErrors, (std::vector<CodecMessage>{{-400, ":no module"}}));
}

}  // namespace
