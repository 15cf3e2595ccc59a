#include "job.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace zantool {

namespace {

std::string Trimmed(const char* text) {
    std::string s = text ? text : "";
    while (!s.empty() && (s.back() == '\n' || s.back() == '\r')) s.pop_back();
    return s;
}

}  // namespace

Job::Job() {
    pivloInitContext(&ctx_);
    ctx_.hostMessageProc = OnMessage;
    ctx_.hostUserData = this;
    ctx_.useExMessageProcs = 1;
    ctx_.errorProcEx = OnCodecError;
    ctx_.warningProcEx = OnCodecWarning;
    ctx_.messageUserData = this;
}

Job::~Job() {
    zanDestroyTIFF(&ctx_);
    pivloReleaseContext(&ctx_);
}

void Job::OnMessage(ConversionContext* ctx, int severity, int, const char* text) {
    auto* job = static_cast<Job*>(ctx->hostUserData);
    const std::string line = Trimmed(text);
    if (line.empty()) return;  // the version report's blank lines
    if (severity == PIVLO_ERROR) job->errors_.push_back(line);
    if (severity == PIVLO_TRACE) {
        job->traces_.push_back(line);
        return;
    }
    const std::string shown = std::string(severity == PIVLO_ERROR ? "error: " : "warning: ") + line;
    if (job->quiet_) job->lines_.push_back(shown);
    else std::fprintf(stderr, "zantiff: %s\n", shown.c_str());
}

void Job::OnCodecError(int, const char* text, void* user) {
    auto* job = static_cast<Job*>(user);
    const std::string shown = "libtiff: " + Trimmed(text);
    if (job->quiet_) job->lines_.push_back(shown);
    else std::fprintf(stderr, "zantiff: %s\n", shown.c_str());
}

void Job::OnCodecWarning(int, const char*, void*) {
    // libtiff's warnings (unknown tags and the like) are not the tool's news.
}

void Job::Print() const {
    for (const auto& line : lines_) std::fprintf(stderr, "zantiff: %s\n", line.c_str());
}

bool Job::HasError(const std::string& text) const {
    return std::find(errors_.begin(), errors_.end(), Trimmed(text.c_str())) != errors_.end();
}

int ReportFailures(const char* command, const std::vector<std::string>& failed, size_t files) {
    if (failed.empty()) return 0;
    std::fprintf(stderr, "zantiff: %s failed for %zu of %zu file(s):", command, failed.size(), files);
    for (const std::string& name : failed) std::fprintf(stderr, " %s", name.c_str());
    std::fputc('\n', stderr);
    return 1;
}

File OpenFile(const std::string& path, const char* mode) {
    File file(std::fopen(path.c_str(), mode));
    if (!file) std::fprintf(stderr, "zantiff: cannot open %s: %s\n", path.c_str(), std::strerror(errno));
    return file;
}

Progress::Progress(std::string what)
    : what_(std::move(what)), terminal_(isatty(STDERR_FILENO) != 0), start_(std::chrono::steady_clock::now()) {}

Progress::~Progress() {
    if (shown_) std::fputc('\n', stderr);
}

void Progress::Update(unsigned done, unsigned total) {
    if (!terminal_) return;
    const auto now = std::chrono::steady_clock::now();
    const bool last = total && done == total;
    if (shown_ && !last && now - last_ < std::chrono::milliseconds(100)) return;
    last_ = now;
    const double seconds = std::chrono::duration<double>(now - start_).count();
    const double rate = seconds > 0 ? done / seconds : 0;
    if (total) std::fprintf(stderr, "\r%s %u/%u, %.1f/s   ", what_.c_str(), done, total, rate);
    else std::fprintf(stderr, "\r%s %u, %.1f/s   ", what_.c_str(), done, rate);
    std::fflush(stderr);
    shown_ = true;
}

}  // namespace zantool
