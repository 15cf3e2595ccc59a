// Where compressed data delivered without decoding goes, by destination
// kind: the destination file, the host's write callbacks, the host's fixed
// buffer, or a block of the job's allocator handed to the host.
#pragma once

#include <cstdint>
#include <cstdio>

#include "zantiff/conversion_context.h"

namespace zan {

class RawDelivery {
public:
    explicit RawDelivery(ConversionContext* ctx) : ctx_(ctx) {}
    RawDelivery(const RawDelivery&) = delete;
    RawDelivery& operator=(const RawDelivery&) = delete;
    // What was not handed over is given up: the block released, a file put
    // back at the place the data began.
    ~RawDelivery();

    // Prepares the destination for at most `bound` bytes: a file is reopened
    // for writing (not when its path is "dummyfile" and the stream is open),
    // a memory block of `bound` bytes is taken (`memoryMessage` reports a
    // refusal). False after a reported failure.
    bool Begin(uint64_t bound, const char* memoryMessage);

    // Appends `n` bytes. False after a reported failure.
    bool Write(const void* data, uint32_t n);

    // Room for `n` bytes at the end of a memory destination (a block or a
    // fixed buffer), to be filled in place and then taken with Commit; null
    // for other destinations or when the room is not there.
    uint8_t* Reserve(uint32_t n);
    void Commit(uint32_t n) { written_ += n; }

    // Hands the data over: the block (of the bound given to Begin) and the
    // size written through destMemory and destSizeOut (when the host set
    // them), the size of a fixed buffer's data through destSizeOut.
    void Finish();

    uint64_t written() const { return written_; }

private:
    ConversionContext* ctx_;
    bool begun_ = false;
    bool finished_ = false;
    int64_t fileStart_ = -1;   // where a file's data began
    uint32_t callbackStart_ = 0;
    uint8_t* block_ = nullptr; // memory destination
    uint64_t capacity_ = 0;
    uint64_t written_ = 0;
};

}  // namespace zan
