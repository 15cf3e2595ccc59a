// The stream buffer service: a seekable view of a source that can only be
// read forward through a host callback.
//
// Data read from the source is kept in fixed-size blocks indexed by their
// position. The source is read only as far as a read needs (or to its end
// when its size or a seek from the end is asked for). Released ranges are
// remembered as a set of disjoint intervals; a block whose bytes are all
// released is freed at once, and reading released bytes fails, so the result
// never depends on how the data happened to be blocked.

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <limits>
#include <map>
#include <new>
#include <vector>

#include "pivlo/pivlo.h"

namespace {

constexpr uint32_t kDefaultBlockSize = 64 * 1024;
constexpr uint64_t kMaxPosition = std::numeric_limits<uint32_t>::max();  // 0xFFFFFFFF = failure

// Disjoint half-open intervals [start, end), merged on insertion.
class IntervalSet {
public:
    void Add(uint64_t start, uint64_t end) {
        auto it = ranges_.upper_bound(start);
        if (it != ranges_.begin()) {
            auto prev = std::prev(it);
            if (prev->second >= start) {
                start = prev->first;
                end = std::max(end, prev->second);
                it = ranges_.erase(prev);
            }
        }
        while (it != ranges_.end() && it->first <= end) {
            end = std::max(end, it->second);
            it = ranges_.erase(it);
        }
        ranges_.emplace(start, end);
    }

    // True when [start, end) lies inside one interval.
    bool Covers(uint64_t start, uint64_t end) const {
        auto it = ranges_.upper_bound(start);
        if (it == ranges_.begin()) return false;
        --it;
        return it->first <= start && it->second >= end;
    }

    // True when [start, end) and the set share a byte.
    bool Touches(uint64_t start, uint64_t end) const {
        auto it = ranges_.lower_bound(end);
        if (it == ranges_.begin()) return false;
        --it;
        return it->second > start;
    }

private:
    std::map<uint64_t, uint64_t> ranges_;
};

}  // namespace

struct StreamBuffer {
    ConversionContext* ctx = nullptr;
    ZanStreamReadProc read = nullptr;
    void* userData = nullptr;
    ZanMessageProc sink = nullptr;
    ZanMessageProcEx sinkEx = nullptr;
    void* sinkUserData = nullptr;
    bool retainData = true;
    bool reportErrors = true;
    uint32_t blockSize = kDefaultBlockSize;

    std::vector<unsigned char*> blocks;  // block i holds [i*blockSize, (i+1)*blockSize)
    IntervalSet released;
    uint64_t fetched = 0;     // bytes read from the source so far
    bool sourceEnded = false; // the source returned 0
    bool sourceFailed = false;
    uint64_t position = 0;

    void Report(const char* text) const {
        if (!reportErrors) return;
        if (sinkEx) sinkEx(PIVLO_STREAM_MESSAGE_CODE, text, sinkUserData);
        else if (sink) sink(PIVLO_STREAM_MESSAGE_CODE, text);
    }

    uint64_t BlockStart(size_t index) const { return uint64_t{blockSize} * index; }

    void FreeBlock(size_t index) {
        if (index < blocks.size() && blocks[index]) {
            ctx->freeProc(blocks[index]);
            blocks[index] = nullptr;
        }
    }

    // Frees every stored block inside [start, end) whose bytes can no longer
    // be read: released ones, and without retained data those behind `limit`.
    void FreeDeadBlocks(uint64_t start, uint64_t end, uint64_t limit) {
        const size_t first = static_cast<size_t>(start / blockSize);
        for (size_t i = first; i < blocks.size() && BlockStart(i) < end; ++i) {
            if (!blocks[i]) continue;
            const uint64_t blockEnd = BlockStart(i) + blockSize;
            if (released.Covers(BlockStart(i), blockEnd) || (!retainData && blockEnd <= limit))
                FreeBlock(i);
        }
    }

    unsigned char* BlockFor(uint64_t at) {
        const size_t index = static_cast<size_t>(at / blockSize);
        if (index >= blocks.size()) blocks.resize(index + 1, nullptr);
        if (!blocks[index]) blocks[index] = static_cast<unsigned char*>(ctx->allocProc(blockSize));
        return blocks[index];
    }

    // Reads from the source until `target` bytes have been fetched or the
    // source ends. False on a source failure or shortage of memory.
    bool FetchUpTo(uint64_t target) {
        target = std::min(target, kMaxPosition);
        const uint64_t from = fetched;
        while (fetched < target && !sourceEnded) {
            unsigned char* block = BlockFor(fetched);
            if (!block) {
                Report("Stream buffer: memory allocation failed");
                return false;
            }
            const uint32_t offset = static_cast<uint32_t>(fetched % blockSize);
            const uint64_t want = std::min<uint64_t>(blockSize - offset, target - fetched);
            const int32_t got = read(block + offset, static_cast<int32_t>(want), userData);
            if (got < 0 || static_cast<uint64_t>(got) > want) {
                sourceFailed = true;
                Report("Stream buffer: the source could not be read");
                return false;
            }
            if (got == 0) sourceEnded = true;
            fetched += static_cast<uint64_t>(got);
        }
        FreeDeadBlocks(from, fetched, position);
        return true;
    }

    // Reads the whole source. False when it fails or exceeds 32-bit positions.
    bool FetchAll() {
        if (!FetchUpTo(kMaxPosition)) return false;
        if (!sourceEnded) {
            // One byte more would lie beyond the last 32-bit position.
            unsigned char probe = 0;
            if (read(&probe, 1, userData) != 0) {
                Report("Stream buffer: the source is larger than 4 GiB");
                return false;
            }
            sourceEnded = true;
        }
        return true;
    }

    void CopyOut(uint64_t from, uint64_t count, unsigned char* out) const {
        while (count > 0) {
            const size_t index = static_cast<size_t>(from / blockSize);
            const uint32_t offset = static_cast<uint32_t>(from % blockSize);
            const uint64_t n = std::min<uint64_t>(blockSize - offset, count);
            std::memcpy(out, blocks[index] + offset, static_cast<size_t>(n));
            out += n;
            from += n;
            count -= n;
        }
    }

    // True when every block holding [from, from+count) is still stored.
    bool Stored(uint64_t from, uint64_t count) const {
        if (count == 0) return true;
        const size_t last = static_cast<size_t>((from + count - 1) / blockSize);
        for (size_t i = static_cast<size_t>(from / blockSize); i <= last; ++i)
            if (i >= blocks.size() || !blocks[i]) return false;
        return true;
    }

    ~StreamBuffer() {
        for (size_t i = 0; i < blocks.size(); ++i) FreeBlock(i);
    }
};

namespace {

StreamBuffer* Create(ConversionContext* ctx, const StreamDescriptor* desc, ZanMessageProc sink,
                     ZanMessageProcEx sinkEx, void* sinkUserData, int retainData,
                     int reportErrors, uint32_t blockSize) {
    auto report = [&](const char* text) {
        if (!reportErrors) return;
        if (sinkEx) sinkEx(PIVLO_STREAM_MESSAGE_CODE, text, sinkUserData);
        else if (sink) sink(PIVLO_STREAM_MESSAGE_CODE, text);
    };
    if (!ctx || !ctx->allocProc || !ctx->freeProc) {
        report("Stream buffer: the job has no memory procedures");
        return nullptr;
    }
    if (!desc || desc->kind != PIVLO_STREAM_READ_CALLBACK || !desc->readProc) {
        report("Stream buffer: the source is not a read callback");
        return nullptr;
    }
    void* memory = ctx->allocProc(sizeof(StreamBuffer));
    if (!memory) {
        report("Stream buffer: memory allocation failed");
        return nullptr;
    }
    auto* sb = new (memory) StreamBuffer();
    sb->ctx = ctx;
    sb->read = desc->readProc;
    sb->userData = desc->userData;
    sb->sink = sink;
    sb->sinkEx = sinkEx;
    sb->sinkUserData = sinkUserData;
    sb->retainData = retainData != 0;
    sb->reportErrors = reportErrors != 0;
    sb->blockSize = blockSize ? blockSize : kDefaultBlockSize;
    return sb;
}

}  // namespace

extern "C" {

StreamBuffer* StreamBufferInit_(ConversionContext* ctx, const StreamDescriptor* desc,
                                ZanMessageProc errorProc, int retainData, int reportErrors,
                                uint32_t blockSize) {
    return Create(ctx, desc, errorProc, nullptr, nullptr, retainData, reportErrors, blockSize);
}

StreamBuffer* StreamBufferInit2_(ConversionContext* ctx, const StreamDescriptor* desc,
                                 ZanMessageProcEx errorProc, void* userData, int retainData,
                                 int reportErrors, uint32_t blockSize) {
    return Create(ctx, desc, nullptr, errorProc, userData, retainData, reportErrors, blockSize);
}

int32_t StreamBufferRead(ConversionContext*, StreamBuffer* sb, void* buffer, int32_t byteCount) {
    if (!sb || byteCount < 0 || (byteCount > 0 && !buffer)) return -1;
    if (byteCount == 0) return 0;
    try {
        const uint64_t end = sb->position + static_cast<uint64_t>(byteCount);
        if (end > sb->fetched && !sb->FetchUpTo(end)) return -1;
        const uint64_t available = sb->fetched > sb->position ? sb->fetched - sb->position : 0;
        const uint64_t count = std::min<uint64_t>(available, static_cast<uint64_t>(byteCount));
        if (count == 0) return 0;
        if (sb->released.Touches(sb->position, sb->position + count) ||
            !sb->Stored(sb->position, count)) {
            sb->Report("Stream buffer: the data asked for was already released");
            return -1;
        }
        sb->CopyOut(sb->position, count, static_cast<unsigned char*>(buffer));
        sb->position += count;
        if (!sb->retainData) sb->FreeDeadBlocks(0, sb->position, sb->position);
        return static_cast<int32_t>(count);
    } catch (const std::bad_alloc&) {
        sb->Report("Stream buffer: memory allocation failed");
        return -1;
    }
}

uint32_t StreamBufferSeek(StreamBuffer* sb, uint32_t offset, int whence) {
    if (!sb) return PIVLO_STREAM_FAILED;
    int64_t target = 0;
    switch (whence) {
    case 0:
        target = offset;
        break;
    case 1:
        target = static_cast<int64_t>(sb->position) + static_cast<int32_t>(offset);
        break;
    case 2:
        try {
            if (!sb->FetchAll()) return PIVLO_STREAM_FAILED;
        } catch (const std::bad_alloc&) {
            return PIVLO_STREAM_FAILED;
        }
        target = static_cast<int64_t>(sb->fetched) + static_cast<int32_t>(offset);
        break;
    default:
        return PIVLO_STREAM_FAILED;
    }
    if (target < 0 || static_cast<uint64_t>(target) >= kMaxPosition) return PIVLO_STREAM_FAILED;
    sb->position = static_cast<uint64_t>(target);
    return static_cast<uint32_t>(target);
}

int StreamBufferDiscardData(ConversionContext*, StreamBuffer* sb, uint32_t first, uint32_t last) {
    if (!sb || first > last) return -1;
    try {
        sb->released.Add(first, uint64_t{last} + 1);
    } catch (const std::bad_alloc&) {
        sb->Report("Stream buffer: memory allocation failed");
        return -1;
    }
    sb->FreeDeadBlocks(first, uint64_t{last} + 1, sb->position);
    return 0;
}

uint32_t StreamBufferSourceSize(StreamBuffer* sb) {
    if (!sb) return PIVLO_STREAM_FAILED;
    try {
        if (!sb->FetchAll()) return PIVLO_STREAM_FAILED;
    } catch (const std::bad_alloc&) {
        return PIVLO_STREAM_FAILED;
    }
    return static_cast<uint32_t>(sb->fetched);
}

void StreamBufferClose(ConversionContext*, StreamBuffer* sb) {
    if (!sb) return;
    ConversionContext* ctx = sb->ctx;
    sb->~StreamBuffer();
    ctx->freeProc(sb);
}

}  // extern "C"
