// zantiff: the command-line host of libzantiff.

#include <cstdio>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <tiffio.h>

#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

// Messages of a job go to standard error with their severity.
void PrintMessage(ConversionContext*, int severity, int, const char* text) {
    static const char* const kPrefix[] = {"error", "warning", "trace"};
    const int index = severity >= 0 && severity <= 2 ? severity : 0;
    std::fprintf(stderr, "zantiff: %s: %s\n", kPrefix[index], text);
}

// A job record with the C-heap allocators and message printing, released and
// torn down when it goes out of scope.
class Job {
public:
    Job() {
        pivloInitContext(&ctx_);
        ctx_.hostMessageProc = PrintMessage;
    }
    ~Job() {
        zanDestroyTIFF(&ctx_);
        pivloReleaseContext(&ctx_);
    }
    Job(const Job&) = delete;
    Job& operator=(const Job&) = delete;
    ConversionContext* operator->() { return &ctx_; }
    ConversionContext* get() { return &ctx_; }

private:
    ConversionContext ctx_{};
};

// Collects the handshake's report so that it can be printed as one block.
void CollectMessage(ConversionContext* ctx, int, int, const char* text) {
    static_cast<std::string*>(ctx->hostUserData)->append(text);
}

int RunVersion() {
    Job job;
    std::string report;
    job->hostMessageProc = CollectMessage;
    job->hostUserData = &report;
    const int served = zanGetTiffVersion(job.get(), ZANTIFF_VERSION_MAJOR, ZANTIFF_VERSION_MINOR,
                                         ZANTIFF_VERSION_MICRO);
    if (!served) {
        std::fprintf(stderr, "zantiff: the module refused this tool's interface version:\n%s\n",
                     report.c_str());
        return 1;
    }
    const std::string codec = TIFFGetVersion();
    std::printf("zantiff %d.%d.%d (module interface accepted)\n%s\n", ZANTIFF_VERSION_MAJOR,
                ZANTIFF_VERSION_MINOR, ZANTIFF_VERSION_MICRO,
                codec.substr(0, codec.find('\n')).c_str());
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    CLI::App app{"zantiff - read, write and rearrange TIFF files through libzantiff"};
    bool showVersion = false;
    app.add_flag("-V,--version", showVersion,
                 "Check the module's interface version and print the versions");
    app.require_subcommand(0, 1);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& e) {
        return app.exit(e);
    }
    if (showVersion) return RunVersion();
    std::fputs(app.help().c_str(), stdout);
    return 0;
}
