/*
 * libzantiff - the TIFF module of the pivlo image-conversion framework.
 *
 * Every function takes the job's ConversionContext first. Unless stated
 * otherwise a function returns 1 on success and 0 on failure, and a failure
 * has been reported through the host's message functions before it returns.
 * Plain C (C99 and C++17 or later).
 */
#ifndef ZANTIFF_ZANTIFF_H
#define ZANTIFF_ZANTIFF_H

#include <stdint.h>

#include "zantiff/conversion_context.h"
#include "zantiff/metadata.h"
#include "zantiff/stream_chunk.h"

#if defined(_WIN32)
#  if defined(ZANTIFF_BUILDING)
#    define ZAN_API __declspec(dllexport)
#  else
#    define ZAN_API __declspec(dllimport)
#  endif
#else
#  define ZAN_API __attribute__((visibility("default")))
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* Interface version of this module. */
#define ZANTIFF_VERSION_MAJOR 1
#define ZANTIFF_VERSION_MINOR 1
#define ZANTIFF_VERSION_MICRO 8

/* ---- version handshake ---- */
/* 1 when the module serves a caller built for major.minor.micro; otherwise the
 * mismatch is explained through zanError and the result is 0. */
ZAN_API int zanGetTiffVersion(ConversionContext* ctx, int32_t major, int32_t minor,
                              int32_t micro);

/* ---- reading ---- */
ZAN_API int zanTIFFGetInfo(ConversionContext* ctx);
/* Returns the byte count of the delivered line, 0 on failure. */
ZAN_API uint32_t zanTIFFReadNextScanLine(ConversionContext* ctx, void* line, uint32_t lineCapacity);
ZAN_API int zanTIFFToFrameBuffer(ConversionContext* ctx, uint32_t* directConversion);

/* ---- stream decoding ---- */
/* Returns 2 on success, 0 on failure. */
ZAN_API int zanTIFFStreamDecodeInit(ConversionContext* ctx, void* hostValue);
/* Returns a ZAN_STREAM_* result. */
ZAN_API int zanTIFFStreamDecode(ConversionContext* ctx, StreamChunk* chunk);
ZAN_API int zanTIFFStreamDecodeComplete(ConversionContext* ctx);
ZAN_API int zanTIFFStreamDecodeEnd(ConversionContext* ctx);
ZAN_API int zanTIFFStreamDecodeIsOneChunkTIFF(ConversionContext* ctx, uint32_t* answer);
ZAN_API int zanTIFFStreamDecodeSetNoDecompression(ConversionContext* ctx);
ZAN_API int zanTIFFStreamDecodeSetBypassLibTiff(ConversionContext* ctx);
ZAN_API int zanTIFFStreamDecodeSetRawBufferOutSize(ConversionContext* ctx, uint32_t size);

/* ---- writing ---- */
/* The arguments after the tag are those TIFFSetField takes for that tag;
 * returns the codec's result, 0 when refused. */
ZAN_API int zanTIFFSetField(ConversionContext* ctx, uint32_t tag, ...);
ZAN_API int zanTIFFNextImage(ConversionContext* ctx);
/* Returns the line size it was given when the line was written, 0 on failure. */
ZAN_API uint32_t zanTIFFWriteNextScanLine(ConversionContext* ctx, void* line, uint32_t lineSize);
ZAN_API int zanFrameBufferToTIFF(ConversionContext* ctx);
ZAN_API int zanG4ToTIFF(ConversionContext* ctx);
ZAN_API int zanJPEGToTIFF(ConversionContext* ctx, uint32_t* directConversion);
ZAN_API int zanTIFFSetTIFFTags(ConversionContext* ctx, const char* fileName, uint16_t tagCount,
                               const uint16_t* tags, const void* const* values,
                               const uint32_t* counts, const void* reserved);

/* ---- file-level page operations ---- */
ZAN_API int zanConcatenateTIFF(ConversionContext* ctx);
/* pageNumber counts from 1. */
ZAN_API int zanExtractTIFFPage(ConversionContext* ctx, int32_t pageNumber);

/* ---- teardown ---- */
/* Ends a job, successful or not: finishes a page still being written,
 * releases what the module holds and hands a memory image to the host. */
ZAN_API void zanDestroyTIFF(ConversionContext* ctx);

#ifdef __cplusplus
}
#endif

#endif /* ZANTIFF_ZANTIFF_H */
