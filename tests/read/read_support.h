// A reading job over a TIFF held in memory (or another source kind).
#pragma once

#include <cstdio>
#include <string>
#include <vector>

#include "support/memory_stream.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace zantest {

enum class Source { Memory, File, Callbacks, StreamBuffer };

class ReadJob {
public:
    explicit ReadJob(const Bytes& tiff, Source source = Source::Memory) : bytes_(tiff) {
        switch (source) {
        case Source::Memory:
            host_->sourceKind = ZAN_SOURCE_MEMORY;
            host_->sourceMemory = bytes_.data();
            host_->sourceMemorySize = static_cast<uint32_t>(bytes_.size());
            break;
        case Source::File:
            WriteFileBytes(file_.path(), bytes_);
            fp_ = std::fopen(file_.c_str(), "rb");
            host_->sourceKind = ZAN_SOURCE_FILE;
            host_->sourceFp = fp_;
            break;
        case Source::Callbacks:
        case Source::StreamBuffer:
            stream_.data = bytes_;
            UseStreamSource(host_.ctx(), &stream_, source == Source::Callbacks);
            break;
        }
    }
    ~ReadJob() {
        host_.EndJob();
        if (fp_) std::fclose(fp_);
    }

    int GetInfo() { return zanTIFFGetInfo(host_.ctx()); }

    // Every row of the page, or fewer when a read fails.
    std::vector<Bytes> ReadAll() {
        std::vector<Bytes> rows;
        Bytes line(1 << 20);
        for (uint32_t y = 0; y == 0 || y < host_->imageHeight; ++y) {
            const uint32_t n = zanTIFFReadNextScanLine(host_.ctx(), line.data(), static_cast<uint32_t>(line.size()));
            if (n == 0) break;
            rows.emplace_back(line.begin(), line.begin() + n);
        }
        return rows;
    }

    TestHost& host() { return host_; }
    ConversionContext* operator->() { return host_.ctx(); }
    const std::string& path() const { return file_.path(); }

private:
    Bytes bytes_;
    TempFile file_;
    FILE* fp_ = nullptr;
    MemoryStream stream_;
    TestHost host_;
};

}  // namespace zantest
