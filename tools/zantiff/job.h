// What every command of the tool shares: a job record wired to the
// reference host, files that close themselves, and a progress line.
#pragma once

#include <chrono>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zantool {

// A job record with the C-heap allocators whose messages go to standard
// error (and are kept, so that a command can tell failures apart). Torn
// down with zanDestroyTIFF and pivloReleaseContext.
class Job {
public:
    Job();
    ~Job();
    Job(const Job&) = delete;
    Job& operator=(const Job&) = delete;

    ConversionContext* operator->() { return &ctx_; }
    ConversionContext* get() { return &ctx_; }

    // Makes the job read page `page` (from 1) of the open file `source`.
    void ReadPage(FILE* source, int page) {
        ctx_.sourceKind = ZAN_SOURCE_FILE;
        ctx_.sourceFp = source;
        ctx_.pageNumber = page;
    }

    // Keeps messages instead of printing them; Print() shows them later.
    void Quiet() { quiet_ = true; }
    void Print() const;
    const std::vector<std::string>& errors() const { return errors_; }
    // The module's traces (level 1 notes of what it did or declined).
    const std::vector<std::string>& traces() const { return traces_; }
    bool HasError(const std::string& text) const;

private:
    static void OnMessage(ConversionContext* ctx, int severity, int level, const char* text);
    static void OnCodecError(int code, const char* text, void* user);
    static void OnCodecWarning(int code, const char* text, void* user);

    ConversionContext ctx_{};
    bool quiet_ = false;
    std::vector<std::string> errors_;
    std::vector<std::string> traces_;
    std::vector<std::string> lines_;
};

struct FileCloser {
    void operator()(FILE* f) const {
        if (f) std::fclose(f);
    }
};
using File = std::unique_ptr<FILE, FileCloser>;

// After a command over several files: names each file that failed on
// standard error; the command's status (1 when any failed).
int ReportFailures(const char* command, const std::vector<std::string>& failed, size_t files);

// Opens a file or prints why it cannot be opened.
File OpenFile(const std::string& path, const char* mode);

// A one-line progress report on standard error, shown only on a terminal:
// "<what> done/total, rate per second". `what` names the command and its
// unit ("split: page"). Updates come at most ten times a second (and the
// last one always).
class Progress {
public:
    explicit Progress(std::string what);
    ~Progress();
    void Update(unsigned done, unsigned total = 0);

private:
    std::string what_;
    bool shown_ = false;
    bool terminal_;
    std::chrono::steady_clock::time_point start_, last_;
};

}  // namespace zantool
