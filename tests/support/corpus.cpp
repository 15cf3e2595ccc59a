#include "support/corpus.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

namespace zantest {

bool CorpusFile::HasCategory(const std::string& category) const {
    std::stringstream list(categories);
    std::string item;
    while (std::getline(list, item, ','))
        if (item == category) return true;
    return false;
}

std::string CorpusDir() {
    namespace fs = std::filesystem;
    const char* env = std::getenv("ZANTIFF_CORPUS");
    const fs::path dir = env && *env ? fs::path(env) : fs::path(ZANTIFF_CORPUS_DIR);
    return fs::exists(dir / "MANIFEST.tsv") ? fs::canonical(dir).string() : std::string();
}

std::vector<CorpusFile> CorpusFiles() {
    std::vector<CorpusFile> files;
    const std::string dir = CorpusDir();
    if (dir.empty()) return files;
    std::ifstream manifest(dir + "/MANIFEST.tsv");
    std::string line;
    std::getline(manifest, line);  // header
    while (std::getline(manifest, line)) {
        std::vector<std::string> fields;
        std::stringstream row(line);
        std::string field;
        while (std::getline(row, field, '\t')) fields.push_back(field);
        if (fields.size() < 10) continue;
        files.push_back({fields[0], fields[6], fields[8], fields[9], dir + "/" + fields[0]});
    }
    return files;
}

}  // namespace zantest
