// The test host: job records wired to a counting, failable allocator and to
// message capture, the way a host application would set them up.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "zantiff/conversion_context.h"

namespace zantest {

// Allocator behind every TestHost record. It counts calls, tracks live
// blocks and can be told to fail.
struct TestAllocator {
    static void* Alloc(uint32_t byteCount);
    static void* Realloc(void* block, uint32_t byteCount);
    static void Free(void* block);

    // Forgets counts and failure plans (live blocks are kept).
    static void Reset();
    // The nth allocating call from now (alloc or realloc, counting from 1)
    // fails; 0 cancels.
    static void FailNthCall(int n);
    // Every allocating call from now fails until FailNthCall/Reset.
    static void FailAll();
    static int Calls();       // allocating calls since Reset
    static size_t LiveBlocks();
    static bool Owns(const void* block);
};

struct Message {
    int severity;  // 0 error, 1 warning, 2 trace
    int level;
    std::string text;
};

struct CodecMessage {
    int code;
    std::string text;
    bool operator==(const CodecMessage&) const = default;
};

// One job record with capture of the host messages (hostMessageProc) and of
// the codec messages in both sink styles.
class TestHost {
public:
    TestHost();
    ~TestHost();
    TestHost(const TestHost&) = delete;
    TestHost& operator=(const TestHost&) = delete;

    ConversionContext* ctx() { return &ctx_; }
    ConversionContext* operator->() { return &ctx_; }

    // Second-style sinks with this host as user data instead of first-style.
    void UseExSinks();
    // Ends the job: zanDestroyTIFF, then the host's release of the record.
    void EndJob();

    std::vector<Message> messages;
    std::vector<CodecMessage> codecErrors;
    std::vector<CodecMessage> codecWarnings;

    std::vector<std::string> Errors() const;    // host error texts, in order
    std::vector<std::string> Warnings() const;
    bool HasError(const std::string& text) const;
    void ClearMessages();

private:
    ConversionContext ctx_{};
    bool ended_ = false;
};

}  // namespace zantest
