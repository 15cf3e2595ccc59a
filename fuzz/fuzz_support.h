// Shared pieces of the fuzz targets: a quiet job record and the ways of
// handing fuzz input to the module as a source.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <vector>

#include "zantiff/conversion_context.h"

namespace zanfuzz {

// A host stream over the fuzz input, read in chunks of a chosen size.
struct InputStream {
    const uint8_t* data;
    size_t size;
    size_t position;
    uint32_t chunk;  // largest piece one read delivers (0: no limit)
};

// A job record with C-heap allocators that grant no block above 256 MiB,
// and every message dropped.
void InitQuietJob(ConversionContext* ctx);

// Points the job's source at `input` as kind `selector % 4`: memory, file-like
// callbacks with a seek, the stream buffer service without one, or a memory
// source that a trickling chunk size does not affect.
void UseInputAsSource(ConversionContext* ctx, InputStream* input, uint8_t selector);

}  // namespace zanfuzz

namespace zanfuzz {

// The TIFF in `tiff` asked for as JPEG data through the whole-page call (a
// page that cannot pass through is decoded); everything is released.
void RequestJpegData(const void* tiff, uint32_t size);

// A small valid one-page TIFF (grey 4x2, little-endian).
std::vector<uint8_t> TinyTiff();

// A read-write stream in the temporary directory holding `bytes`.
FILE* TemporaryStream(const std::vector<uint8_t>& bytes);

// A one-page JPEG TIFF (little-endian) whose JPEGTables is pieces[0] and
// whose strips are the other pieces, as they are.
struct JpegPageLayout {
    uint32_t width = 8;
    uint32_t height = 8;
    uint32_t rowsPerStrip = 8;
    int kind = 0;  // 0 grey, 1 YCbCr 2x2, 2 RGB
};
std::vector<uint8_t> JpegTiff(const JpegPageLayout& layout, const std::vector<std::vector<uint8_t>>& pieces);

}  // namespace zanfuzz
