/*
 * libpivlo - the reference host framework: the services the TIFF module calls
 * (messages, buffer resets, metadata list, byte-order accessors, the stream
 * buffer service) and the helpers a host uses to set a job up.
 *
 * Plain C (C99 and C++17 or later).
 */
#ifndef PIVLO_PIVLO_H
#define PIVLO_PIVLO_H

#include <stdint.h>

#include "zantiff/conversion_context.h"
#include "zantiff/metadata.h"

#if defined(_WIN32)
#  define PIVLO_API __declspec(dllexport)
#else
#  define PIVLO_API __attribute__((visibility("default")))
#endif

#if defined(__GNUC__)
#  define PIVLO_PRINTF(fmt, args) __attribute__((format(printf, fmt, args)))
#else
#  define PIVLO_PRINTF(fmt, args)
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* Message severities handed to hostMessageProc. */
enum { PIVLO_ERROR = 0, PIVLO_WARNING = 1, PIVLO_TRACE = 2 };

/* ---- job set-up ---- */

/* Zeroes the record and sets allocProc/reallocProc/freeProc to the C heap.
 * Hosts that bring their own allocators set them afterwards. */
PIVLO_API void pivloInitContext(ConversionContext* ctx);

/* Releases what a job handed over to the host in the record: the frame
 * buffer, the copies of the ICC profile, DocumentName and ImageDescription,
 * the palette copy and the host's work buffer. Every one comes from the
 * record's allocProc. A memory image handed over through destMemory is the
 * host's own variable and is not touched. */
PIVLO_API void pivloReleaseContext(ConversionContext* ctx);

/* ---- messages ----
 * Routed to ctx->hostMessageProc; without one, errors and warnings go to
 * standard error and traces are dropped. */
PIVLO_API void zanError(ConversionContext* ctx, const char* text);
PIVLO_API void zanErrorV(ConversionContext* ctx, const char* format, ...) PIVLO_PRINTF(2, 3);
PIVLO_API void zanWarning(ConversionContext* ctx, const char* text);
PIVLO_API void zanTrace(ConversionContext* ctx, const char* text, int level);

/* ---- buffers ---- */

/* Discards the host's frame buffer (ctx->frameData, a block of allocProc)
 * and clears frameData and frameBufferSize. */
PIVLO_API void zanResetFrameBuffer(ConversionContext* ctx);

/* The host's work buffer: a scratch block of at least byteCount bytes that
 * belongs to the job (from ctx->allocProc), kept between calls and grown on
 * demand. Null when it cannot be obtained. */
PIVLO_API void* pivloWorkBuffer(ConversionContext* ctx, uint32_t byteCount);

/* Releases the host's work buffer of the job, if any. */
PIVLO_API void zanResetWorkBuffer(ConversionContext* ctx);

/* ---- metadata list ---- */

/* A new empty list whose entries and blocks come from allocProc/freeProc
 * (the C heap when either is null; the list's members then name the heap
 * procedures, so that the module allocates blocks for it from the heap as
 * well). Null when the list cannot be allocated. */
PIVLO_API MetadataList* pivloCreateMetadataList(MetadataAllocProc allocProc,
                                                MetadataFreeProc freeProc);

/* Copies the entry record to the end of the list. Nonzero on success; the
 * list then owns the block a ZAN_METADATA_BLOCK entry addresses. On failure
 * the caller keeps the block. */
PIVLO_API int zanAddToMetadataList(ConversionContext* ctx, MetadataList* list,
                                   const MetadataEntry* entry);

/* The first entry (walk on through entry->next) and the number of entries. */
PIVLO_API const MetadataEntry* pivloMetadataListFirst(const MetadataList* list);
PIVLO_API uint32_t pivloMetadataListLength(const MetadataList* list);

/* Releases every entry, every block it owns, and the list. */
PIVLO_API void pivloDestroyMetadataList(MetadataList* list);

/* ---- byte order ---- */
PIVLO_API uint16_t zanGetUINT16Big(ConversionContext* ctx, const unsigned char* bytes);
PIVLO_API uint16_t zanGetUINT16Little(ConversionContext* ctx, const unsigned char* bytes);
PIVLO_API uint32_t zanGetUINT32Big(ConversionContext* ctx, const unsigned char* bytes);
PIVLO_API uint32_t zanGetUINT32Little(ConversionContext* ctx, const unsigned char* bytes);
PIVLO_API void zanMake2ByteIntBig(ConversionContext* ctx, uint16_t value, unsigned char* bytes);
PIVLO_API void zanMake2ByteIntLittle(ConversionContext* ctx, uint16_t value, unsigned char* bytes);
PIVLO_API void zanMake4ByteIntBig(ConversionContext* ctx, uint32_t value, unsigned char* bytes);
PIVLO_API void zanMake4ByteIntLittle(ConversionContext* ctx, uint32_t value, unsigned char* bytes);

/* ---- source inspection ---- */

/* Describes a JPEG source in the record, from libjpeg's header reader:
 * imageWidth, imageHeight, componentCount, bitsPerSample (the sample
 * precision), horizontalSampling and verticalSampling of the first three
 * components (0 for components the stream lacks), xResolution and
 * yResolution (the JFIF density in pixels per inch: centimetres converted, 0
 * without a unit or a JFIF segment), and imageType: 14 grey, 17 RGB (an
 * Adobe segment of transform 0, or components named R, G, B), 22 YCbCr, 28
 * CMYK or YCCK. The source is the memory block (sourceKind 4), a stream with
 * read and seek callbacks (read from its start; sourceKind 2), or sourceFp
 * from sourceBaseOffset. Nonzero on success; a source that is missing or
 * that libjpeg cannot read is reported. */
PIVLO_API int zanGetImageInfo(ConversionContext* ctx);

/* The colour space (host code) in which this host takes the rows of a page
 * whose single JPEG chunk is decoded directly: 2 grey for grey and bilevel
 * pages, 5 CMYK for separated pages of four inks, 8 RGB otherwise (the
 * page's colorSpace as described). */
PIVLO_API uint32_t zanGetColorSpaceIfConvertedToRaw(ConversionContext* ctx);

/* ---- pixel routines ---- */

/* Swaps the rows of an image of `rows` rows of `rowBytes` bytes top to
 * bottom, in place. Nonzero on success. */
PIVLO_API int zanVerticalReverseImage(ConversionContext* ctx, void* buffer, uint32_t rowBytes, uint32_t rows);

/* The host's palette of 4-bit RGB frames: entry r*4 + g*2 + b is the colour
 * whose channels are full where the bit is set, zero where it is not. */
PIVLO_API extern const uint8_t pivloRgbPalette8[8][3];

/* Three 1-bit planes (rows of (width + 7) / 8 bytes, first pixel in the high
 * bit) into one 4-bit image of pivloRgbPalette8 indices: rows of
 * (width + 1) / 2 bytes, first pixel in the high nibble. `destination` must
 * not overlap the planes. Nonzero on success. */
PIVLO_API int zanConvert1BitRGBPlanarTo4BitRGBPalette8(ConversionContext* ctx, const void* red,
                                                      const void* green, const void* blue, void* destination,
                                                      uint32_t width, uint32_t height);

/* Reverses the bit order inside each byte (FillOrder 2 <-> 1), in place. */
PIVLO_API void zanByteReverseBuffer(ConversionContext* ctx, void* buffer, uint32_t byteCount);

/* ---- stream buffer service ----
 * A buffered source over a host read callback for sources that cannot seek.
 * It reads from the source only as far as a read or seek needs, keeps what it
 * read until the caller discards it, serves backward seeks within data not
 * yet discarded, and learns the source's size by reading to its end only when
 * asked for it. Its blocks come from the record's allocProc. */

/* How a stream source is described. */
typedef struct StreamDescriptor {
    uint32_t kind;                /* PIVLO_STREAM_READ_CALLBACK */
    ZanStreamReadProc readProc;   /* (buffer, byteCount, userData) -> bytes, <0 on failure */
    void* userData;
    uint32_t streamParam;         /* free for the source; kept unchanged */
} StreamDescriptor;

enum { PIVLO_STREAM_READ_CALLBACK = 4 };

/* Result of a seek or size query that failed. */
#define PIVLO_STREAM_FAILED 0xFFFFFFFFu

/* Code with which the service reports its failures to the error sink. */
#define PIVLO_STREAM_MESSAGE_CODE (-300)

typedef struct StreamBuffer StreamBuffer;

/* retainData: 1 keeps read data until discarded (backward seeks possible);
 * 0 releases every block as soon as the read position has passed it.
 * reportErrors: 1 sends failures to the error sink. blockSize: bytes per
 * buffer block, 0 for 64 KiB. Null when the descriptor is unusable or memory
 * is short (reported to the sink). */
PIVLO_API StreamBuffer* StreamBufferInit_(ConversionContext* ctx, const StreamDescriptor* desc,
                                          ZanMessageProc errorProc, int retainData,
                                          int reportErrors, uint32_t blockSize);
PIVLO_API StreamBuffer* StreamBufferInit2_(ConversionContext* ctx, const StreamDescriptor* desc,
                                           ZanMessageProcEx errorProc, void* userData,
                                           int retainData, int reportErrors, uint32_t blockSize);

/* Reads up to byteCount bytes at the current position, which advances by the
 * bytes delivered. Fewer bytes at the end of the source; -1 when the source
 * fails, memory is short or the range was discarded. */
PIVLO_API int32_t StreamBufferRead(ConversionContext* ctx, StreamBuffer* sb, void* buffer,
                                   int32_t byteCount);

/* whence 0 start, 1 current (offset taken as signed), 2 end (signed; reads
 * the source to its end). Returns the new position, 0xFFFFFFFF when it would
 * lie before 0 or beyond 32 bits (the position is then unchanged). */
PIVLO_API uint32_t StreamBufferSeek(StreamBuffer* sb, uint32_t offset, int whence);

/* Releases the byte range [first, last]; reading it later fails. 0 on
 * success, -1 when the range is inverted. */
PIVLO_API int StreamBufferDiscardData(ConversionContext* ctx, StreamBuffer* sb, uint32_t first,
                                      uint32_t last);

/* Total size of the source (reads it to its end the first time);
 * 0xFFFFFFFF when it cannot be learnt. */
PIVLO_API uint32_t StreamBufferSourceSize(StreamBuffer* sb);

/* Releases every block and the handle. */
PIVLO_API void StreamBufferClose(ConversionContext* ctx, StreamBuffer* sb);

#ifdef __cplusplus
}
#endif

#endif /* PIVLO_PIVLO_H */
