#include "pageops/page_files.h"

#include <string>

#include "frame/file_stream.h"
#include "pivlo/pivlo.h"

#if !defined(_WIN32)
#include <sys/stat.h>
#endif

namespace zan {

bool PageFile::Measure() {
    const int64_t bytes = StreamSize(stream);
    if (bytes < 0) return false;
    size = static_cast<uint64_t>(bytes);
    return true;
}

bool SameFile(FILE* a, FILE* b) {
    if (a == b) return true;
#if defined(_WIN32)
    return false;
#else
    struct stat sa, sb;
    return fstat(fileno(a), &sa) == 0 && fstat(fileno(b), &sb) == 0 && sa.st_dev == sb.st_dev &&
           sa.st_ino == sb.st_ino;
#endif
}

bool CheckChain(ConversionContext* ctx, ChainResult result, const char* who) {
    if (result == ChainResult::End || result == ChainResult::Stopped) return true;
    const std::string message =
        std::string(who) + (result == ChainResult::Loop ? " directory chain loops."
                                                        : " directory chain is damaged.");
    zanError(ctx, message.c_str());
    return false;
}

bool CountPages(ConversionContext* ctx, PageFile& file, const char* who, uint32_t* pages) {
    *pages = 0;
    const ChainResult walked = WalkChain(ctx, file.stream, file.order, file.size, file.firstIfd,
                                         [&](uint32_t, uint32_t) {
                                             ++*pages;
                                             return true;
                                         });
    return CheckChain(ctx, walked, who);
}

}  // namespace zan
