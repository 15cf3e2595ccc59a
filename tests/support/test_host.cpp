#include "support/test_host.h"

#include <algorithm>
#include <cstdlib>
#include <mutex>
#include <unordered_map>

#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zantest {
namespace {

struct AllocatorState {
    std::mutex mutex;
    std::unordered_map<const void*, uint32_t> live;
    int calls = 0;
    int failAt = 0;
    bool failAll = false;
};

AllocatorState& State() {
    static auto* state = new AllocatorState();
    return *state;
}

// Counts one allocating call; true when it must fail.
bool ShouldFail(AllocatorState& s) {
    ++s.calls;
    return s.failAll || (s.failAt != 0 && s.calls == s.failAt);
}

// First-style sinks carry no user data, so they report to the host that
// redirected last.
TestHost* gCurrentHost = nullptr;

void CaptureHostMessage(ConversionContext* ctx, int severity, int level, const char* text) {
    auto* host = static_cast<TestHost*>(ctx->hostUserData);
    host->messages.push_back({severity, level, text});
}

void CaptureCodecError(int code, const char* text) {
    if (gCurrentHost) gCurrentHost->codecErrors.push_back({code, text});
}
void CaptureCodecWarning(int code, const char* text) {
    if (gCurrentHost) gCurrentHost->codecWarnings.push_back({code, text});
}
void CaptureCodecErrorEx(int code, const char* text, void* user) {
    static_cast<TestHost*>(user)->codecErrors.push_back({code, text});
}
void CaptureCodecWarningEx(int code, const char* text, void* user) {
    static_cast<TestHost*>(user)->codecWarnings.push_back({code, text});
}

std::vector<std::string> TextsOf(const std::vector<Message>& all, int severity) {
    std::vector<std::string> texts;
    for (const auto& m : all)
        if (m.severity == severity) texts.push_back(m.text);
    return texts;
}

}  // namespace

void* TestAllocator::Alloc(uint32_t n) {
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    if (ShouldFail(s)) return nullptr;
    void* block = std::malloc(n ? n : 1);
    if (block) s.live[block] = n;
    return block;
}

void* TestAllocator::Realloc(void* block, uint32_t n) {
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    if (ShouldFail(s)) return nullptr;
    void* moved = std::realloc(block, n ? n : 1);
    if (!moved) return nullptr;
    if (block) s.live.erase(block);
    s.live[moved] = n;
    return moved;
}

void TestAllocator::Free(void* block) {
    if (!block) return;
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    s.live.erase(block);
    std::free(block);
}

void TestAllocator::Reset() {
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    s.calls = 0;
    s.failAt = 0;
    s.failAll = false;
}

void TestAllocator::FailNthCall(int n) {
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    s.failAll = false;
    s.failAt = n ? s.calls + n : 0;
}

void TestAllocator::FailAll() {
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    s.failAll = true;
}

int TestAllocator::Calls() {
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    return s.calls;
}

size_t TestAllocator::LiveBlocks() {
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    return s.live.size();
}

bool TestAllocator::Owns(const void* block) {
    auto& s = State();
    std::lock_guard<std::mutex> lock(s.mutex);
    return s.live.count(block) != 0;
}

TestHost::TestHost() {
    pivloInitContext(&ctx_);
    ctx_.allocProc = TestAllocator::Alloc;
    ctx_.reallocProc = TestAllocator::Realloc;
    ctx_.freeProc = TestAllocator::Free;
    ctx_.hostMessageProc = CaptureHostMessage;
    ctx_.hostUserData = this;
    ctx_.errorProc = CaptureCodecError;
    ctx_.warningProc = CaptureCodecWarning;
    gCurrentHost = this;
}

TestHost::~TestHost() {
    EndJob();
    if (gCurrentHost == this) gCurrentHost = nullptr;
}

void TestHost::UseExSinks() {
    ctx_.useExMessageProcs = 1;
    ctx_.errorProcEx = CaptureCodecErrorEx;
    ctx_.warningProcEx = CaptureCodecWarningEx;
    ctx_.messageUserData = this;
}

void TestHost::EndJob() {
    if (ended_) return;
    ended_ = true;
    zanDestroyTIFF(&ctx_);
    pivloReleaseContext(&ctx_);
}

std::vector<std::string> TestHost::Errors() const { return TextsOf(messages, 0); }
std::vector<std::string> TestHost::Warnings() const { return TextsOf(messages, 1); }
bool TestHost::HasError(const std::string& text) const {
    const auto errors = Errors();
    return std::find(errors.begin(), errors.end(), text) != errors.end();
}

void TestHost::ClearMessages() {
    messages.clear();
    codecErrors.clear();
    codecWarnings.clear();
}

}  // namespace zantest
