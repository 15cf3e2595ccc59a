// The client procedures through which the codec reads and writes a job's
// source or destination. The client data is always the job's
// ConversionContext; every offset and size is 32-bit.
#pragma once

#include <cstdint>
#include <cstdio>

#include "osttiff/osttiff.h"
#include "zantiff/conversion_context.h"

namespace zan {

// A file stream and the offset at which the TIFF data starts in it; every
// position the codec sees is relative to that offset.
struct FileHandleRecord {
    FILE* stream;
    uint32_t baseOffset;
};

// The seven procedures handed to TIFFClientOpenPivlo for one kind of source
// or destination.
struct ClientProcs {
    PivloReadWriteProc read;
    PivloReadWriteProc write;
    PivloSeekProc seek;
    PivloCloseProc close;
    PivloSizeProc size;
    PivloMapProc map;
    PivloUnmapProc unmap;
};

constexpr uint32_t kSeekFailed = PIVLO_SEEK_FAILED;

// Does nothing and returns 0; as the close procedure it leaves files and
// buffers open for their owners.
int32_t NullProc(void* client, void* buffer, int32_t byteCount);
int NullProc(void* client);
int NullProc(void* client, void** base, uint32_t* size);

// Files (FileHandleRecord in fileHandle).
int32_t FileReadProc(void* client, void* buffer, int32_t byteCount);
int32_t FileWriteProc(void* client, void* buffer, int32_t byteCount);
uint32_t FileSeekProc(void* client, uint32_t offset, int whence);
uint32_t FileSizeProc(void* client);

// The memory image: a memory source, or the growing destination block.
int32_t MemReadProc(void* client, void* buffer, int32_t byteCount);
uint32_t MemSeekProc(void* client, uint32_t offset, int whence);
uint32_t MemSizeProc(void* client);
int MemMapProc(void* client, void** base, uint32_t* size);
void MemUnmapProc(void* client, void* base, uint32_t size);
int32_t MemGrowWriteProc(void* client, void* buffer, int32_t byteCount);

// The host's fixed buffer (destMemory, destMemoryCapacity).
int32_t FixedReadProc(void* client, void* buffer, int32_t byteCount);
int32_t FixedWriteProc(void* client, void* buffer, int32_t byteCount);
uint32_t FixedSeekProc(void* client, uint32_t offset, int whence);
uint32_t FixedSizeProc(void* client);

// Host callbacks.
int32_t CallbackSourceReadProc(void* client, void* buffer, int32_t byteCount);
uint32_t CallbackSourceSeekProc(void* client, uint32_t offset, int whence);
uint32_t CallbackSourceSizeProc(void* client);
int32_t CallbackDestWriteProc(void* client, void* buffer, int32_t byteCount);
uint32_t CallbackDestSeekProc(void* client, uint32_t offset, int whence);
uint32_t CallbackDestSizeProc(void* client);
// Read-back of a callback destination that has no source read callback:
// reports why and fails the read.
int32_t CallbackDestUnreadableProc(void* client, void* buffer, int32_t byteCount);

// The host's stream buffer service (handle in streamBuffer).
int32_t StreamReadProc(void* client, void* buffer, int32_t byteCount);
int32_t StreamWriteProc(void* client, void* buffer, int32_t byteCount);
uint32_t StreamSeekProc(void* client, uint32_t offset, int whence);
uint32_t StreamSizeProc(void* client);
int StreamMapProc(void* client, void** base, uint32_t* size);

// Procedure sets by kind of source and destination.
ClientProcs FileSourceProcs();
ClientProcs MemorySourceProcs();
ClientProcs CallbackSourceProcs();
ClientProcs StreamBufferSourceProcs();
ClientProcs FileDestProcs();
ClientProcs CallbackDestProcs(const ConversionContext* ctx);
ClientProcs FixedBufferDestProcs();
ClientProcs GrowingMemoryDestProcs();

}  // namespace zan
