// A writing job to any destination kind, and what libtiff reads back.
#pragma once

#include <gtest/gtest.h>

#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "support/host_destination.h"
#include "support/memory_stream.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace zantest {

enum class Dest { File, Callbacks, FixedBuffer, Memory };

class WriteJob {
public:
    explicit WriteJob(Dest dest = Dest::Memory, uint32_t fixedCapacity = 8 << 20)
        : destination_(host_, KindOf(dest), fixedCapacity) {}

    // Describes the image of the scanline writer.
    void Describe(uint32_t colorSpace, uint32_t width, uint32_t height, uint32_t compression,
                  uint32_t bits = 8, uint32_t outputBits = 8) {
        host_->outputColorSpace = colorSpace;
        host_->imageWidth = width;
        host_->imageHeight = height;
        host_->outputCompression = compression;
        host_->bitsPerSample = bits;
        host_->outputBitsPerSample = outputBits;
    }

    // Writes every row of `rows`; false at the first refused line.
    bool WriteRows(std::vector<Bytes> rows) {
        for (Bytes& row : rows)
            if (zanTIFFWriteNextScanLine(host_.ctx(), row.data(), static_cast<uint32_t>(row.size())) == 0) return false;
        return true;
    }

    // Ends the job and gives the bytes the destination holds.
    Bytes Finish() {
        host_.EndJob();
        return destination_.Written();
    }

    TestHost& host() { return host_; }
    ConversionContext* operator->() { return host_.ctx(); }
    uint32_t size() const { return destination_.size(); }

private:
    static DestKind KindOf(Dest dest) {
        switch (dest) {
        case Dest::File: return DestKind::FileReopened;
        case Dest::Callbacks: return DestKind::Callbacks;
        case Dest::FixedBuffer: return DestKind::FixedBuffer;
        case Dest::Memory: break;
        }
        return DestKind::GrowingMemory;
    }

    TestHost host_;
    HostDestination destination_;
};

// Rows of `height` lines of `rowBytes` deterministic bytes.
inline std::vector<Bytes> PatternRows(uint32_t height, uint64_t rowBytes, uint32_t seed = 0) {
    std::vector<Bytes> rows(height, Bytes(static_cast<size_t>(rowBytes)));
    for (uint32_t y = 0; y < height; ++y)
        for (size_t i = 0; i < rows[y].size(); ++i) rows[y][i] = static_cast<uint8_t>(i * 7 + y * 13 + seed + (i * y) % 5);
    return rows;
}

// The rows one after another, as libtiff decodes a page.
inline Bytes Joined(const std::vector<Bytes>& rows) {
    Bytes all;
    for (const Bytes& row : rows) all.insert(all.end(), row.begin(), row.end());
    return all;
}

// What a reduction of 16-bit samples to 8 bits keeps: the high bytes.
inline Bytes HighBytes(const Bytes& samples) {
    Bytes high;
    for (size_t i = 1; i < samples.size(); i += 2) high.push_back(samples[i]);
    return high;
}

// Checks libtiff's listing of a directory (DumpPage's tags or exifTags): it
// holds each of `lines` as a whole line, and no line starting with any of `absent`.
inline void ExpectListing(const std::string& listing, const std::vector<std::string>& lines,
                          const std::vector<std::string>& absent = {}) {
    for (const std::string& line : lines)
        EXPECT_NE(listing.find("  " + line + "\n"), std::string::npos) << "no \"" << line << "\" in\n" << listing;
    for (const std::string& start : absent)
        EXPECT_EQ(listing.find("  " + start), std::string::npos) << "\"" << start << "\" in\n" << listing;
}

// Whether the host was told of a failure, by the module or by the codec.
inline bool Reported(const TestHost& host) { return !host.Errors().empty() || !host.codecErrors.empty(); }

// For n = 1, 2, ...: makes a job, runs it with its nth allocating call
// failing, and checks that a failed run was reported and that no block is
// left once the job is gone. Ends after a run that made fewer than n calls
// (and must have succeeded). `run` returns whether the job succeeded.
template <typename Make, typename Run>
void SweepAllocations(Make make, Run run) {
    for (int n = 1;; ++n) {
        int calls = 0;
        bool succeeded = false;
        {
            auto job = make();
            TestAllocator::Reset();
            TestAllocator::FailNthCall(n);
            succeeded = run(*job, n);
            calls = TestAllocator::Calls();
            EXPECT_TRUE(succeeded || Reported(job->host())) << "allocation " << n;
        }
        TestAllocator::Reset();
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << "allocation " << n;
        if (calls < n) {
            EXPECT_TRUE(succeeded);
            break;
        }
    }
}

}  // namespace zantest
