// The scanline reader's page set-up and row reading, for the calls that
// deliver rows (zanTIFFReadNextScanLine and the stream decoder's bands), and
// the buffers it keeps for a page.
#pragma once

#include <cstdint>

#include "zantiff/conversion_context.h"

namespace zan {

// Releases the reader's strip buffer, its work line (when set-up took one)
// and its palette copy.
void ReleaseReaderBuffers(ConversionContext* ctx);

// Ends a reading job: the reader's buffers of a page being read, the codec
// object, the routing of the codec's messages, the stream buffer and the
// file record go, and the job is idle.
void EndReadJob(ConversionContext* ctx);

// True, after reporting it, when the job writes pages: its codec object is
// no page to read.
bool RefuseWhileWriting(ConversionContext* ctx);

// Chooses the conversions of the selected page and obtains the buffers they
// need (opening the source first unless a page was described); the job's
// state becomes reading. 1, or 0 after a reported failure.
uint32_t SetUpPage(ConversionContext* ctx);

// Bytes a row read writes into the host's line: at least the delivered
// line's bytes (`lineBytes`).
uint64_t BytesWrittenToLine(const ConversionContext* ctx);

// Reads and converts the next row into `line` (room for `capacity` bytes).
// The bytes of the line, or 0 after a reported failure.
uint32_t ReadNextRow(ConversionContext* ctx, uint8_t* line, uint32_t capacity);

}  // namespace zan
