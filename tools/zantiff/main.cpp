// zantiff: the command-line host of libzantiff.

#include <cstdio>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <tiffio.h>

#include "commands.h"
#include "job.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

using zantool::Job;

// Collects the handshake's report so that it can be printed as one block.
int RunVersion() {
    Job job;
    job.Quiet();
    const int served = zanGetTiffVersion(job.get(), ZANTIFF_VERSION_MAJOR, ZANTIFF_VERSION_MINOR,
                                         ZANTIFF_VERSION_MICRO);
    if (!served) {
        std::fprintf(stderr, "zantiff: the module refused this tool's interface version:\n");
        job.Print();
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
    int status = 0;
    zantool::AddReadCommands(app, status);
    zantool::AddWriteCommands(app, status);
    zantool::AddPageCommands(app, status);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& e) {
        return app.exit(e);
    }
    if (showVersion) return RunVersion();
    if (app.get_subcommands().empty()) std::fputs(app.help().c_str(), stdout);
    return status;
}
