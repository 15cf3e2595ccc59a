// Access to the third-party corpus (../shared/corpus), read in place.
#pragma once

#include <string>
#include <vector>

namespace zantest {

struct CorpusFile {
    std::string relpath;
    std::string status;      // ok, warn or bad
    std::string categories;  // comma-separated
    std::string description;
    std::string path;        // absolute path

    bool HasCategory(const std::string& category) const;
};

// Directory of the corpus: $ZANTIFF_CORPUS, else the one next to the
// project. Empty when it is not there.
std::string CorpusDir();

// Every file of the manifest; empty when the corpus is not there.
std::vector<CorpusFile> CorpusFiles();

}  // namespace zantest
