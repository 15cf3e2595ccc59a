// A host destination of every kind, and the bytes it received.
#pragma once

#include <algorithm>
#include <cstdio>

#include "support/memory_stream.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace zantest {

enum class DestKind { FileReopened, FileAsIs, Callbacks, FixedBuffer, GrowingMemory };
inline constexpr DestKind kDests[] = {DestKind::FileReopened, DestKind::FileAsIs, DestKind::Callbacks,
                               DestKind::FixedBuffer, DestKind::GrowingMemory};
inline const char* const kDestNames[] = {"FileReopened", "FileAsIs", "Callbacks", "FixedBuffer", "GrowingMemory"};

// A destination of the chosen kind for a TestHost, and the bytes it holds
// once the job has ended (which its destructor makes sure of). A file handed
// in read-only must be reopened from its path; a fixed buffer is followed by
// guard bytes.
class HostDestination {
public:
    HostDestination(TestHost& host, DestKind kind, uint32_t fixedCapacity = 1 << 20)
        : host_(host), kind_(kind), fixed_(fixedCapacity + kGuard, kGuardByte) {
        switch (kind) {
        case DestKind::FileReopened:
        case DestKind::FileAsIs:
            WriteFileBytes(file_.path(), {});
            host->destKind = ZAN_DEST_FILE;
            host->destPath = file_.c_str();
            host->destFp = std::fopen(file_.c_str(), kind == DestKind::FileAsIs ? "w+b" : "rb");
            if (kind == DestKind::FileAsIs) host->destFileFlags = ZAN_DEST_FILE_USE_AS_IS;
            break;
        case DestKind::Callbacks:
            host->destKind = ZAN_DEST_CALLBACKS;
            host->destWriteProc = MemoryStream::Write;
            host->destSeekProc = MemoryStream::Seek;
            host->destUserData = &stream_;
            host->sourceReadProc = MemoryStream::Read;  // read-back of what was written
            host->sourceUserData = &stream_;
            break;
        case DestKind::FixedBuffer:
            host->destKind = ZAN_DEST_FIXED_BUFFER;
            host->destMemory = fixed_.data();
            host->destMemoryCapacity = fixedCapacity;
            host->destSizeOut = &size_;
            break;
        case DestKind::GrowingMemory:
            host->destKind = ZAN_DEST_MEMORY;
            host->destMemory = &block_;
            host->destSizeOut = &size_;
            break;
        }
    }
    ~HostDestination() {
        host_.EndJob();
        if (host_->destFp) std::fclose(host_->destFp);
        host_->destFp = nullptr;
        if (block_ != kUnset) TestAllocator::Free(block_);  // the handed-over image
    }

    // Puts `bytes` in the destination as a file already there.
    void Preload(const Bytes& bytes) {
        if (kind_ == DestKind::Callbacks) stream_.data = bytes;
        else if (kind_ == DestKind::FixedBuffer) std::copy(bytes.begin(), bytes.end(), fixed_.begin());
        else WriteFileBytes(file_.path(), bytes);
    }
    // The bytes written, after the job has ended.
    Bytes Written() {
        switch (kind_) {
        case DestKind::Callbacks: return stream_.data;
        case DestKind::FixedBuffer: return Bytes(fixed_.begin(), fixed_.begin() + size_);
        case DestKind::GrowingMemory:
            if (!block_ || block_ == kUnset) return {};
            return Bytes(static_cast<uint8_t*>(block_), static_cast<uint8_t*>(block_) + size_);
        default:
            std::fflush(host_->destFp);
            return ReadFileBytes(file_.path());
        }
    }
    bool GuardIntact() const {
        return std::all_of(fixed_.end() - kGuard, fixed_.end(), [](uint8_t b) { return b == kGuardByte; });
    }
    void* block() const { return block_; }
    void Forget() { block_ = nullptr; }
    uint32_t size() const { return size_; }

private:
    static constexpr size_t kGuard = 16;
    static constexpr uint8_t kGuardByte = 0xAB;
    inline static char unsetMark_ = 0;
    inline static void* const kUnset = &unsetMark_;  // the open must overwrite it
    TestHost& host_;
    DestKind kind_;
    TempFile file_;
    MemoryStream stream_;
    Bytes fixed_;
    void* block_ = kUnset;
    uint32_t size_ = 0xDEAD;
};

}  // namespace zantest
