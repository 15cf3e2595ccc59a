// The push decoder's input: the bytes that have arrived and are still
// needed, held in one block of the job's memory, and the scan of a TIFF
// header and first directory that tells how many bytes the directory needs.
#pragma once

#include <cstddef>
#include <cstdint>

#include "zantiff/conversion_context.h"

namespace osttiff {

// The most input held at once; beyond it the stream is refused.
constexpr uint64_t kHeldInputLimit = uint64_t{1} << 30;

// Bytes of the input by their position in the stream, held while needed:
// one run [start, end) at a time. Bytes below the floor are let go and never
// held again; bytes at or beyond `keepUntil` (given with each piece) are not
// held.
class HeldInput {
public:
    enum class Taken { kOk, kOverLimit, kNoMemory, kOutOfOrder };

    explicit HeldInput(ConversionContext* ctx) : ctx_(ctx) {}
    HeldInput(const HeldInput&) = delete;
    HeldInput& operator=(const HeldInput&) = delete;
    ~HeldInput();

    // Bytes of input taken so far (the position of the next byte).
    uint64_t arrived() const { return arrived_; }
    uint64_t start() const { return start_; }
    uint64_t end() const { return start_ + size_; }
    uint64_t held() const { return size_; }

    Taken Take(const uint8_t* data, uint32_t length, uint64_t keepUntil);
    // Lets go of every byte before `position`.
    void DropBefore(uint64_t position);
    // Copies the held bytes of [position, position + length); the count.
    uint32_t Read(uint64_t position, void* into, uint32_t length) const;
    // The held byte at `position` and those after it (null when not held).
    const uint8_t* At(uint64_t position) const;

private:
    ConversionContext* ctx_;
    uint8_t* block_ = nullptr;
    uint64_t capacity_ = 0;
    uint64_t head_ = 0;  // index of `start_` in the block
    uint64_t start_ = 0;
    uint64_t size_ = 0;
    uint64_t arrived_ = 0;
    uint64_t floor_ = 0;
};

// What the first directory of a TIFF needs before libtiff can read it.
struct DirectoryScan {
    enum class State { kNeedMore, kComplete, kNotTiff } state = State::kNeedMore;
    // Bytes [0, needed) must have arrived (when kNeedMore: as far as known).
    uint64_t needed = 8;
    // The furthest end of the strips or tiles the directory lists (0 when
    // not known).
    uint64_t dataEnd = 0;
};

// Scans the header and first directory among the bytes of `input` (held
// from position 0).
DirectoryScan ScanFirstDirectory(const HeldInput& input);

}  // namespace osttiff
