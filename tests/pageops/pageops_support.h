// A page-operation job over files made from bytes.
#pragma once

#include <cstdio>
#include <string>
#include <vector>

#include "support/test_host.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace zantest {

using Texts = std::vector<std::string>;

class FileJob {
public:
    FileJob(const Bytes& source, const Bytes& dest) {
        WriteFileBytes(sourceFile_.path(), source);
        WriteFileBytes(destFile_.path(), dest);
        sourceFp_ = std::fopen(sourceFile_.c_str(), "rb");
        destFp_ = std::fopen(destFile_.c_str(), "r+b");
        host_->sourceKind = ZAN_SOURCE_FILE;
        host_->sourceFp = sourceFp_;
        host_->destKind = ZAN_DEST_FILE;
        host_->destFp = destFp_;
    }
    ~FileJob() {
        host_.EndJob();
        std::fclose(sourceFp_);
        std::fclose(destFp_);
    }
    int Concatenate() { return zanConcatenateTIFF(host_.ctx()); }
    int Extract(int32_t page) { return zanExtractTIFFPage(host_.ctx(), page); }
    Bytes Dest() {
        std::fflush(destFp_);
        return ReadFileBytes(destFile_.path());
    }
    TestHost& host() { return host_; }
    std::vector<std::string> Errors() const { return host_.Errors(); }

private:
    TempFile sourceFile_, destFile_;
    FILE* sourceFp_ = nullptr;
    FILE* destFp_ = nullptr;
    TestHost host_;
};

}  // namespace zantest
