/*
 * libzantiff - the record exchanged with zanTIFFStreamDecode.
 * Plain C (C99 and C++17 or later).
 */
#ifndef ZANTIFF_STREAM_CHUNK_H
#define ZANTIFF_STREAM_CHUNK_H

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Results of zanTIFFStreamDecode. */
enum {
    ZAN_STREAM_ERROR = 0,
    ZAN_STREAM_PAGE_DESCRIBED = 3,
    ZAN_STREAM_CONTINUE = 4,
    ZAN_STREAM_STATUS_5 = 5,
    ZAN_STREAM_STATUS_6 = 6
};

typedef struct StreamChunk {
    const unsigned char* input; /* next unread byte; advanced by what is consumed */
    uint32_t inputLength;       /* unread bytes; reduced by what is consumed */
    uint32_t inputConsumed;     /* running total of consumed bytes */
    void* output;               /* out: band (or raw block) delivered; null when none */
    uint32_t bandWidth;         /* out: pixels per row of the band */
    uint32_t bandRows;          /* out: rows in the band */
    uint32_t bandValue;         /* out: further band value of the decoder */
    uint32_t rowsRemaining;     /* out: rows still to come after this band */
    uint32_t rawSize;           /* out: byte length of a raw block */
} StreamChunk;

#ifdef __cplusplus
}
#endif

#endif /* ZANTIFF_STREAM_CHUNK_H */
