// Binding a codec object to the job's source or destination.
#pragma once

#include "zantiff/conversion_context.h"

namespace zan {

// 1 when `tiff` holds a codec object bound to the source (at once when one is
// already open or a page is described), 0 after a reported failure with
// nothing left held.
int OpenTIFFForReading(ConversionContext* ctx);

// How a destination is opened, where callers differ: the message of a
// destination file that cannot be reopened, and the first capacity of a
// growing memory image (0: frameBufferSize / 2 + 60).
struct WriteOpening {
    const char* reopenFailure = "Unable to reopen destination file.";
    uint64_t memoryCapacity = 0;
};

// 1 when `tiff` holds a codec object bound to the destination (at once when
// one is already open), 0 after a reported failure.
int OpenTIFFForWriting(ConversionContext* ctx, const WriteOpening& opening = WriteOpening{});

// Releases the job's file record, if any.
void ReleaseFileHandle(ConversionContext* ctx);

// Closes the job's stream buffer, if any.
void CloseStreamBuffer(ConversionContext* ctx);

// Hands the growing memory image over to the host (shrunk to its data,
// through destMemory and destSizeOut) when the job holds one, or reports a
// fixed buffer's size through destSizeOut; the module holds no image after.
void HandOverResult(ConversionContext* ctx);

// Gives up a growing memory image the job holds (a failed one-shot write).
void DiscardMemoryImage(ConversionContext* ctx);

}  // namespace zan
