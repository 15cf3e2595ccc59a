// Inputs for the benchmarks, generated once per run with libtiff.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <tiffio.h>

#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zanbench {

using Bytes = std::vector<uint8_t>;

// A file of `pages` grey pages of width x height with the given compression,
// written by libtiff. Cached by its parameters for the process.
const Bytes& GeneratedTiff(uint32_t pages, uint32_t width, uint32_t height, uint16_t compression);

// Writes bytes to a file in the temporary directory and returns its path.
std::string WriteTemporary(const Bytes& bytes, const std::string& name);

// libtiff's own client over bytes in memory (64-bit procedures), the
// reference the 32-bit module procedures are compared with.
TIFF* OpenMemoryWithLibtiff(const Bytes& bytes, const char* mode);

// A job record with the C-heap allocators whose host messages go nowhere
// (a benchmark reports failures through its results).
void InitQuietJob(ConversionContext* ctx);

// Reads `rows` lines of the job's page into `line` (a failure ends the case
// with an error), then tears the job down.
void ReadRowsAndRelease(benchmark::State& state, ConversionContext* ctx, Bytes& line, uint32_t rows);

}  // namespace zanbench
