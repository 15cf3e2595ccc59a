#include "stream_input.h"

#include <algorithm>
#include <cstring>
#include <limits>

#include <tiffio.h>

namespace osttiff {

HeldInput::~HeldInput() {
    if (block_ && ctx_->freeProc) ctx_->freeProc(block_);
}

HeldInput::Taken HeldInput::Take(const uint8_t* data, uint32_t length, uint64_t keepUntil) {
    const uint64_t from = arrived_;
    arrived_ += length;
    const uint64_t low = std::max(from, floor_), high = std::min(arrived_, keepUntil);
    if (low >= high) return Taken::kOk;
    if (size_ == 0) {
        start_ = low;
        head_ = 0;
    } else if (low != end()) {
        return Taken::kOutOfOrder;  // a gap inside what is held
    }
    const uint64_t adding = high - low;
    if (size_ + adding > kHeldInputLimit) return Taken::kOverLimit;
    if (head_ + size_ + adding > capacity_) {
        // Bytes let go at the front make room first; the block grows when
        // that is not enough, doubling so that growth stays linear.
        if (head_ > 0) {
            std::memmove(block_, block_ + head_, static_cast<size_t>(size_));
            head_ = 0;
        }
        if (size_ + adding > capacity_) {
            const uint64_t wanted = std::min<uint64_t>(
                std::max<uint64_t>({size_ + adding, capacity_ * 2, 64 << 10}), kHeldInputLimit);
            if (!ctx_->reallocProc && block_) return Taken::kNoMemory;
            void* grown = block_ ? ctx_->reallocProc(block_, static_cast<uint32_t>(wanted))
                                 : (ctx_->allocProc ? ctx_->allocProc(static_cast<uint32_t>(wanted)) : nullptr);
            if (!grown) return Taken::kNoMemory;
            block_ = static_cast<uint8_t*>(grown);
            capacity_ = wanted;
        }
    }
    std::memcpy(block_ + head_ + size_, data + (low - from), static_cast<size_t>(adding));
    size_ += adding;
    return Taken::kOk;
}

void HeldInput::DropBefore(uint64_t position) {
    floor_ = std::max(floor_, position);
    if (position <= start_) return;
    const uint64_t dropped = std::min(position - start_, size_);
    head_ += dropped;
    size_ -= dropped;
    start_ += dropped;
    if (size_ == 0) {
        head_ = 0;
        start_ = position;
    }
}

uint32_t HeldInput::Read(uint64_t position, void* into, uint32_t length) const {
    if (position < start_ || position >= end()) return 0;
    const uint64_t count = std::min<uint64_t>(length, end() - position);
    std::memcpy(into, block_ + head_ + (position - start_), static_cast<size_t>(count));
    return static_cast<uint32_t>(count);
}

const uint8_t* HeldInput::At(uint64_t position) const {
    if (position < start_ || position >= end()) return nullptr;
    return block_ + head_ + (position - start_);
}

namespace {

// Integers of the file's byte order, read from the held bytes.
class FileWords {
public:
    FileWords(const HeldInput& input, bool bigEndian) : input_(input), big_(bigEndian) {}
    bool Get(uint64_t position, unsigned bytes, uint64_t* value) const {
        uint8_t b[8];
        if (input_.Read(position, b, bytes) != bytes) return false;
        uint64_t v = 0;
        for (unsigned i = 0; i < bytes; ++i) v |= uint64_t{b[big_ ? bytes - 1 - i : i]} << (8 * i);
        *value = v;
        return true;
    }

private:
    const HeldInput& input_;
    bool big_;
};

unsigned TypeSize(uint64_t type) {
    switch (type) {
    case 1: case 2: case 6: case 7: return 1;
    case 3: case 8: return 2;
    case 4: case 9: case 11: case 13: return 4;
    case 5: case 10: case 12: case 16: case 17: case 18: return 8;
    default: return 0;  // a type libtiff does not know: the entry is skipped
    }
}

// Where the values of one entry lie.
struct EntryValues {
    uint64_t type = 0, count = 0, position = 0;
    bool present = false;
};

// The furthest end of the strips or tiles listed by the offsets and byte
// counts entries (0 when they do not pair up).
uint64_t FurthestDataEnd(const FileWords& words, const EntryValues& offsets, const EntryValues& counts) {
    if (!offsets.present || !counts.present || offsets.count != counts.count) return 0;
    const unsigned offsetSize = TypeSize(offsets.type), countSize = TypeSize(counts.type);
    uint64_t furthest = 0;
    for (uint64_t i = 0; i < offsets.count; ++i) {
        uint64_t offset = 0, count = 0;
        if (!words.Get(offsets.position + i * offsetSize, offsetSize, &offset) ||
            !words.Get(counts.position + i * countSize, countSize, &count))
            return 0;
        if (count <= std::numeric_limits<uint64_t>::max() - offset) furthest = std::max(furthest, offset + count);
    }
    return furthest;
}

}  // namespace

DirectoryScan ScanFirstDirectory(const HeldInput& input) {
    DirectoryScan scan;
    uint8_t header[4];
    if (input.Read(0, header, 4) < 4) return scan;
    const bool big = header[0] == 'M' && header[1] == 'M';
    if (!(big || (header[0] == 'I' && header[1] == 'I'))) {
        scan.state = DirectoryScan::State::kNotTiff;
        return scan;
    }
    const FileWords words(input, big);
    uint64_t version = 0, ifd = 0;
    words.Get(2, 2, &version);
    if (version != 42 && version != 43) {
        scan.state = DirectoryScan::State::kNotTiff;
        return scan;
    }
    const bool bigTiff = version == 43;
    const unsigned countBytes = bigTiff ? 8 : 2, entryBytes = bigTiff ? 20 : 12, wordBytes = bigTiff ? 8 : 4;
    scan.needed = bigTiff ? 16 : 8;
    if (!words.Get(bigTiff ? 8 : 4, wordBytes, &ifd)) return scan;
    uint64_t entries = 0;
    // Directories libtiff cannot read (none, or beyond what may be held) are
    // left to libtiff to refuse.
    if (ifd == 0 || ifd > kHeldInputLimit) {
        scan.state = DirectoryScan::State::kComplete;
        return scan;
    }
    scan.needed = ifd + countBytes;
    if (!words.Get(ifd, countBytes, &entries)) return scan;
    if (entries == 0 || entries > kHeldInputLimit / entryBytes) {
        scan.state = DirectoryScan::State::kComplete;
        return scan;
    }
    scan.needed = ifd + countBytes + entries * entryBytes + wordBytes;
    if (input.arrived() < scan.needed) return scan;

    EntryValues offsets, counts;
    uint64_t needed = scan.needed;
    for (uint64_t i = 0; i < entries; ++i) {
        const uint64_t at = ifd + countBytes + i * entryBytes;
        uint64_t tag = 0, type = 0, count = 0, value = 0;
        words.Get(at, 2, &tag);
        words.Get(at + 2, 2, &type);
        words.Get(at + 4, wordBytes, &count);
        const unsigned size = TypeSize(type);
        // Values beyond what may be held are libtiff's to judge.
        if (size == 0 || count > kHeldInputLimit / size) continue;
        const uint64_t bytes = count * size;
        EntryValues values{type, count, at + 4 + wordBytes, true};
        if (bytes > wordBytes) {
            words.Get(at + 4 + wordBytes, wordBytes, &value);
            if (value > kHeldInputLimit) continue;
            values.position = value;
            needed = std::max(needed, value + bytes);
        }
        if (tag == TIFFTAG_STRIPOFFSETS || tag == TIFFTAG_TILEOFFSETS) offsets = values;
        if (tag == TIFFTAG_STRIPBYTECOUNTS || tag == TIFFTAG_TILEBYTECOUNTS) counts = values;
    }
    scan.needed = needed;
    if (input.arrived() < needed) return scan;
    scan.dataEnd = FurthestDataEnd(words, offsets, counts);
    scan.state = DirectoryScan::State::kComplete;
    return scan;
}

}  // namespace osttiff
