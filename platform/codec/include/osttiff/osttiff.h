/*
 * libosttiff - the codec library of the pivlo framework: libtiff 4.5 plus the
 * extensions the TIFF module calls.
 *
 * The extensions keep the module on 32-bit client procedures and 32-bit file
 * positions: every offset and size crossing a client procedure is 32-bit, and
 * anything libtiff asks for beyond 4 GiB fails as an I/O error instead of
 * wrapping. libtiff's own memory comes from the C heap (libtiff 4.5 has no
 * allocator hook); the host allocator procedures handed to
 * TIFFClientOpenPivlo serve the blocks this layer allocates itself.
 */
#ifndef OSTTIFF_OSTTIFF_H
#define OSTTIFF_OSTTIFF_H

#include <stdint.h>
#include <tiffio.h>

#if defined(_WIN32)
#  define OSTTIFF_API __declspec(dllexport)
#else
#  define OSTTIFF_API __attribute__((visibility("default")))
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* 32-bit client procedures; the first argument is the client data handed to
 * TIFFClientOpenPivlo. Reads and writes return the bytes moved (negative on
 * failure); a seek returns the new position or 0xFFFFFFFF on failure. */
typedef int32_t (*PivloReadWriteProc)(void* client, void* buffer, int32_t byteCount);
typedef uint32_t (*PivloSeekProc)(void* client, uint32_t offset, int whence);
typedef int (*PivloCloseProc)(void* client);
typedef uint32_t (*PivloSizeProc)(void* client);
typedef int (*PivloMapProc)(void* client, void** base, uint32_t* size);
typedef void (*PivloUnmapProc)(void* client, void* base, uint32_t size);

typedef void* (*PivloAllocProc)(uint32_t byteCount);
typedef void* (*PivloReallocProc)(void* block, uint32_t byteCount);
typedef void (*PivloFreeProc)(void* block);

/* The 32-bit seek's failure value. */
#define PIVLO_SEEK_FAILED 0xFFFFFFFFu

/* Opens a codec object over 32-bit client procedures (as TIFFClientOpen).
 * Null map/unmap procedures mean "not mappable". Null on failure; the close
 * procedure is called by TIFFClose only, never after a failed open. */
OSTTIFF_API TIFF* TIFFClientOpenPivlo(const char* name, const char* mode, void* clientData,
                                      PivloReadWriteProc readProc, PivloReadWriteProc writeProc,
                                      PivloSeekProc seekProc, PivloCloseProc closeProc,
                                      PivloSizeProc sizeProc, PivloMapProc mapProc,
                                      PivloUnmapProc unmapProc, PivloAllocProc allocProc,
                                      PivloReallocProc reallocProc, PivloFreeProc freeProc);

/* The same with libtiff's open options (handlers, allocation cap). */
OSTTIFF_API TIFF* TIFFClientOpenPivloExt(const char* name, const char* mode, void* clientData,
                                         PivloReadWriteProc readProc,
                                         PivloReadWriteProc writeProc, PivloSeekProc seekProc,
                                         PivloCloseProc closeProc, PivloSizeProc sizeProc,
                                         PivloMapProc mapProc, PivloUnmapProc unmapProc,
                                         PivloAllocProc allocProc, PivloReallocProc reallocProc,
                                         PivloFreeProc freeProc, TIFFOpenOptions* options);

/* Client data handed to TIFFClientOpenPivlo (TIFFClientdata returns the
 * layer's own record; never call TIFFSetClientdata on these objects). Null
 * for a codec object not opened through TIFFClientOpenPivlo. */
OSTTIFF_API void* TIFFClientdataPivlo(TIFF* tif);

/* Context slot of the codec object: the module stores its job here after
 * opening so that code holding only the codec object can find the job. */
OSTTIFF_API void TIFFSetContextPivlo(TIFF* tif, void* context);
OSTTIFF_API void* TIFFGetContextPivlo(TIFF* tif);

/* Nonzero once a client procedure failed, a short write happened or a
 * position beyond 32 bits was asked for. Sticky until the object is closed:
 * libtiff does not check every I/O result, so writers check this after
 * writing a directory. */
OSTTIFF_API int TIFFIOFailedPivlo(TIFF* tif);

/* Size of the source or destination as its client size procedure gives
 * it (0 when it has none). */
OSTTIFF_API uint64_t TIFFClientSizePivlo(TIFF* tif);

/* Forgets a failure that has been dealt with (a directory written on its
 * own that nothing links to), so that later writes are judged on their own. */
OSTTIFF_API void TIFFClearIOFailedPivlo(TIFF* tif);

/* 32-bit views of StripOffsets/TileOffsets and StripByteCounts/TileByteCounts
 * of the current directory: 1 and the value, or 0 when the index is out of
 * range or the value does not fit in 32 bits. */
OSTTIFF_API int TIFFGetStrileOffset32(TIFF* tif, uint32_t strile, uint32_t* offset);
OSTTIFF_API int TIFFGetStrileByteCount32(TIFF* tif, uint32_t strile, uint32_t* byteCount);

/* ---- field descriptions ----
 * The description of `tag` in the codec object's current field set, as the
 * libtiff 3.x record: tag, read and write counts, data type, pass-count flag
 * and name. 1 when the tag is known, 0 (and nothing reported) when not. */
OSTTIFF_API int TIFFFieldInfoPivlo(TIFF* tif, uint32_t tag, TIFFFieldInfo* info);

/* ---- directory as stored ----
 * libtiff completes ExtraSamples when a directory holds more samples than
 * its colour channels and ExtraSamples account for (it warns, and counts the
 * surplus as unspecified extra samples). This gives the count and values the
 * current directory stores itself (count 0 when it has no ExtraSamples), for
 * every kind of source: the completion is noted while libtiff reads the
 * directory. 1 on success. */
OSTTIFF_API int TIFFGetStoredExtraSamplesPivlo(TIFF* tif, uint16_t* count, const uint16_t** values);

/* ---- EXIF directories ----
 * Work on an EXIF directory is bracketed by zanBeginTiffEXIFDir and
 * zanEndTiffEXIFDir; the bracket records the image directory it started
 * from. Both return 1, 0 for a codec object not opened here or an End
 * without a Begin. */
OSTTIFF_API int zanBeginTiffEXIFDir(TIFF* tif);
OSTTIFF_API int zanEndTiffEXIFDir(TIFF* tif);
/* Nonzero between zanBeginTiffEXIFDir and zanEndTiffEXIFDir. */
OSTTIFF_API int TIFFInEXIFDirPivlo(TIFF* tif);
/* The image directory (index) current when the bracket began. */
OSTTIFF_API tdir_t TIFFEXIFBaseDirectoryPivlo(TIFF* tif);

/* Starts an empty EXIF directory (inside a zanBeginTiffEXIFDir bracket) for
 * TIFFSetField calls; the page's directory is given up, so it must have
 * been written. 1, or 0 outside a bracket or when libtiff refuses. */
OSTTIFF_API int zanCreateTiffEXIFDir(TIFF* tif);

/* Writes the EXIF directory made by zanCreateTiffEXIFDir at the end of the
 * file, outside the chain of pages, and records its offset. 1 or 0. */
OSTTIFF_API int TIFFWriteEXIFDirectoryPivlo(TIFF* tif);

/* Offset of the EXIF directory written last through this object; 0 when
 * none was written. */
OSTTIFF_API uint64_t TIFFLastEXIFOffsetPivlo(TIFF* tif);

/* ---- pages written ----
 * TIFFWritePageDirectoryPivlo writes the current directory as the next page
 * (TIFFWriteDirectory) and remembers where it went, so that the page can be
 * reached again without walking the chain (a walk for every page makes
 * writing many pages quadratic). Classic TIFF; 1 or 0. */
OSTTIFF_API int TIFFWritePageDirectoryPivlo(TIFF* tif);

/* Offset of the page written last by TIFFWritePageDirectoryPivlo; 0 when
 * none, or when it could not be learnt. */
OSTTIFF_API uint64_t TIFFLastPageOffsetPivlo(TIFF* tif);

/* Sets the ExifIFD entry of the page written last, which must hold one (a
 * placeholder 0 set before the page was written), to `exifOffset` in place.
 * Offset 0 takes the entry out instead: the directory keeps its place and
 * holds one entry fewer. 1, or 0 when the page or the entry cannot be
 * reached. */
OSTTIFF_API int TIFFSetLastPageEXIFPivlo(TIFF* tif, uint64_t exifOffset);

/* ---- image reading ---- */

/* TIFFRGBAImageGet, with libtiff 4.5's check of uncompressed tiles against
 * its rounded read buffer worked around (RGBA reads of such tiles from a
 * source that is not mapped into memory fail otherwise). */
OSTTIFF_API int TIFFRGBAImageGetPivlo(TIFFRGBAImage* image, uint32_t* raster, uint32_t width,
                                      uint32_t height);

/* The image reader with replaceable put routines: a strip-organised page's
 * own samples, decoded strip by strip and handed to the record's put
 * routine, which places them in the caller's raster. TIFFImageBegin fills
 * the record from the page (tiled pages and YCbCr samples stored in
 * subsampled blocks are refused, the reason in `message`) and chooses
 * putcontigcopy or putstripsepcopy; the caller may replace `put`, and set
 * `reduceTo8` to have 16-bit samples delivered as their high byte.
 * TIFFImageGet decodes the page's first `height` rows (width must be the
 * page's); the copying put routines place them bottom row first, rows of
 * `rowBytes` (a contiguous row of every sample, or for separate planes one
 * plane's row, the planes one after another). Without stop-on-error a strip
 * that cannot be read (the codec reports it) leaves its rows as they were.
 * TIFFImageEnd releases what Begin took. */
typedef struct TIFFImageRecord TIFFImageRecord;
typedef void (*TIFFImagePut)(TIFFImageRecord* image, uint8_t* raster, uint32_t row, uint32_t rows,
                             uint16_t plane, const uint8_t* data);
struct TIFFImageRecord {
    TIFF* tif;
    uint32_t width;
    uint32_t height;
    uint16_t bitsPerSample;
    uint16_t samplesPerPixel;
    uint16_t planarConfig;
    uint16_t reduceTo8;       /* set by the caller */
    int stopOnError;
    uint32_t rowsPerStrip;
    uint64_t storedRowBytes;  /* a decoded row as the codec gives it */
    uint64_t rowBytes;        /* a row as placed in the raster (set by TIFFImageGet) */
    uint32_t rasterHeight;    /* rows of the raster (set by TIFFImageGet) */
    TIFFImagePut put;
    void* strip;              /* one decoded strip */
    tmsize_t stripSize;
};
OSTTIFF_API int TIFFImageBegin(TIFFImageRecord* image, TIFF* tif, int stopOnError, char message[1024]);
OSTTIFF_API int TIFFImageGet(TIFFImageRecord* image, uint8_t* raster, uint32_t width, uint32_t height);
OSTTIFF_API void TIFFImageEnd(TIFF* tif, TIFFImageRecord* image);
OSTTIFF_API void putcontigcopy(TIFFImageRecord* image, uint8_t* raster, uint32_t row, uint32_t rows,
                               uint16_t plane, const uint8_t* data);
OSTTIFF_API void putstripsepcopy(TIFFImageRecord* image, uint8_t* raster, uint32_t row, uint32_t rows,
                                 uint16_t plane, const uint8_t* data);

/* RGBA reading. TIFFReadRGBAImagePivlo reads the page as 4 samples a pixel,
 * bottom row first (libtiff's TIFFReadRGBAImage): 8 bits each, or 16 bits
 * each once TIFFSet16BitOutput was called on the object (libtiff's own
 * reader has 8 bits only; 16-bit grey, grey with alpha, RGB, RGBA and
 * palette pages are read here, in strips or tiles, contiguous or planar). */
OSTTIFF_API int TIFFSet16BitOutput(TIFF* tif);
OSTTIFF_API int TIFFReadRGBAImagePivlo(TIFF* tif, uint32_t width, uint32_t height, void* raster,
                                       int stopOnError);

/* Packing routines: a bottom-up RGBA raster (of TIFFReadRGBAImagePivlo)
 * into a top-down frame in place, at the raster's start: RGB of 8 bits,
 * grey of 8 bits, bilevel (rows of whole bytes, first pixel in the high
 * bit, 1 = white unless minIsWhite), RGB of 16 bits, grey of 16 bits. Grey
 * and bilevel frames of a min-is-white page (minIsWhite 1) hold
 * min-is-white values. The context argument is the job's (unused here).
 * 1 on success. */
OSTTIFF_API int zanTIFFMirrorAndConvertRGBAToRGB(void* context, void* raster, uint32_t width, uint32_t height);
OSTTIFF_API int zanTIFFMirrorAndConvertRGBAToGRAY(void* context, void* raster, uint32_t width, uint32_t height,
                                                  int minIsWhite);
OSTTIFF_API int zanTIFFMirrorAndConvertRGBAToBW(void* context, void* raster, uint32_t width, uint32_t height,
                                                int minIsWhite);
OSTTIFF_API int zanTIFFMirrorRGBAW(void* context, void* raster, uint32_t width, uint32_t height, int unused);
OSTTIFF_API int zanTIFFMirrorRGBAToGRAYW(void* context, void* raster, uint32_t width, uint32_t height,
                                         int minIsWhite);

/* A whole frame through the RGBA reader: the raster (4 bytes a pixel, 8
 * for the 16-bit frames) ends up holding the top-down frame of `packing`
 * at its start, as TIFFReadRGBAImagePivlo and the packing routine give it.
 * 8-bit RGB and grey pages are written in the frame's form as they are
 * decoded, without the RGBA pass. 1 on success, 0 after the codec
 * reported. */
enum {
    TIFF_FRAME_RGB8 = 0,
    TIFF_FRAME_GREY8 = 1,
    TIFF_FRAME_BILEVEL = 2,
    TIFF_FRAME_RGB16 = 3,
    TIFF_FRAME_GREY16 = 4
};
OSTTIFF_API int TIFFReadRGBAFramePivlo(TIFF* tif, void* raster, uint32_t width, uint32_t height, int packing,
                                       int minIsWhite);

/* ---- push decoding ----
 * A TIFF that arrives in pieces, without a seekable source, decoded as it
 * comes: the host feeds each piece to TIFFStreamDecode and gets, piece by
 * piece, the first page's description, bands of decoded rows, and the end of
 * the page.
 *
 * Statuses of TIFFStreamDecode:
 *   TIFF_STREAM_ERROR (1)      an error, explained through the codec's message
 *                              handlers; it sticks: every later call gives 1
 *   TIFF_STREAM_NEED_INPUT (2) the input given has been taken and nothing is
 *                              ready: feed more (or call Complete)
 *   TIFF_STREAM_HEADER (3)     the first page's directory has arrived: the
 *                              page can be described through
 *                              TIFFStreamDecodeTIFF (given once)
 *   TIFF_STREAM_BAND (4)       a band is ready (TIFFStreamDecodeBand, or the
 *                              raw block in the context in raw delivery)
 *   TIFF_STREAM_PAGE_DONE (5)  every row of the page has been delivered
 *                              (given from then on)
 *   TIFF_STREAM_TRUNCATED (6)  the input ended (TIFFStreamDecodeComplete)
 *                              before the page was complete
 *
 * A call delivers at most one band, and takes only the input it needs to
 * make progress: `consumed` may be less than `length`, and the host passes
 * the rest again. While bands are ready, a call with length 0 delivers the
 * next one. A band stays valid until the next call.
 *
 * Bands hold whole rows, top row first. The rows are formed by the row
 * reader the caller installs (TIFFStreamDecodeSetRowReader); without one
 * they are the page's rows as TIFFReadScanline decodes them (strip pages).
 * A band's rows are those whose strips or tiles (of every plane) have fully
 * arrived, at most about 256 KiB of them.
 *
 * The context given to TIFFStreamDecodeInit is the job's ConversionContext:
 * the decoder allocates through its allocProc, reallocProc and freeProc, and
 * reads and writes its streamMode, rawBufferOutSize, rawOutput,
 * rawOutputSize, rowsDelivered and outputSamplesPerPixel:
 *   - streamMode 3 (raw delivery): once the header was given, the page's
 *     first strip or tile is handed out undecoded in pieces of at most
 *     rawBufferOutSize bytes (the whole of it when 0) through rawOutput and
 *     rawOutputSize, one piece per status 4, then status 5;
 *   - streamMode 4 (bypass): the page's single JPEG strip or tile is decoded
 *     with libjpeg directly into bands of outputSamplesPerPixel samples (1
 *     grey, 3 RGB, 4 CMYK); rowsDelivered counts the rows before the band.
 *
 * Memory is bounded by what has arrived and is not delivered yet: the
 * bytes of strips and tiles already decoded are let go, and a page whose
 * directory comes first is decoded holding a few strips. Before the
 * directory arrives every byte is held (a file written with its directory
 * last is held whole until then). More than 1 GiB held is an error. Input
 * beyond 4 GiB is an error (positions are 32-bit). */
enum {
    TIFF_STREAM_ERROR = 1,
    TIFF_STREAM_NEED_INPUT = 2,
    TIFF_STREAM_HEADER = 3,
    TIFF_STREAM_BAND = 4,
    TIFF_STREAM_PAGE_DONE = 5,
    TIFF_STREAM_TRUNCATED = 6
};
typedef struct TIFFStreamDecoder TIFFStreamDecoder;
/* The band delivered by the last status 4 (bypass: `rows` is also
 * `bypassRows`). `value` is the bytes of one band row. */
typedef struct TIFFStreamBand {
    void* data;
    uint32_t width;
    uint32_t rows;
    uint32_t value;
    uint32_t rowsRemaining;
    uint32_t bypassRows;
} TIFFStreamBand;
/* How the rows of bands are formed. `begin` is called once the page's first
 * rows can be read through `tif`, and gives the bytes of a delivered row and
 * in `written` the bytes a row read may write (at least the row's); `read`
 * forms the next row at `row` (room for `written` bytes); `end` is called
 * when reading is over. begin gives 0 and read 0 after a reported failure. */
typedef struct TIFFStreamRowReader {
    void* user;
    uint32_t (*begin)(void* user, TIFF* tif, uint32_t* written);
    int (*read)(void* user, TIFF* tif, uint8_t* row);
    void (*end)(void* user);
} TIFFStreamRowReader;
/* `hostValue` is kept for the caller (TIFFStreamDecodeHostValue); `context`
 * is the job. Null when the decoder cannot be made (without a message). */
OSTTIFF_API TIFFStreamDecoder* TIFFStreamDecodeInit(void* hostValue, void* context);
OSTTIFF_API void TIFFStreamDecodeSetRowReader(TIFFStreamDecoder* decoder, const TIFFStreamRowReader* reader);
OSTTIFF_API int TIFFStreamDecode(TIFFStreamDecoder* decoder, const void* input, uint32_t length,
                                 uint32_t* consumed);
/* No more input follows. */
OSTTIFF_API void TIFFStreamDecodeComplete(TIFFStreamDecoder* decoder);
/* Releases the decoder (its codec object included) and clears *decoder;
 * nothing for a null decoder. */
OSTTIFF_API void TIFFStreamDecodeEnd(void* context, TIFFStreamDecoder** decoder);
/* The codec object of the page (null before status 3). */
OSTTIFF_API TIFF* TIFFStreamDecodeTIFF(TIFFStreamDecoder* decoder);
/* Colour-space code of the page in the host's numbering: 1 bilevel, 2 grey,
 * 5 separated with four inks, 6 other separated, 8 otherwise. */
OSTTIFF_API uint32_t TIFFStreamDecodeColorSpace(TIFFStreamDecoder* decoder);
OSTTIFF_API const TIFFStreamBand* TIFFStreamDecodeBand(TIFFStreamDecoder* decoder);
OSTTIFF_API void* TIFFStreamDecodeHostValue(TIFFStreamDecoder* decoder);
/* Nonzero once the decoder delivered anything after the header (or asked
 * for input to do so): from then on the context's streamMode is not looked
 * at again. */
OSTTIFF_API int TIFFStreamDecodeStarted(TIFFStreamDecoder* decoder);

/* ---- writing helpers ---- */

/* Nonzero when the current directory holds `tag` (libtiff's presence flag;
 * the tag's value is fetched into scratch space and dropped). */
OSTTIFF_API int TIFFFieldIsSetPivlo(TIFF* tif, uint32_t tag);

/* Sets an ASCII field; one of a fixed count (EXIF's DateTimeOriginal,
 * ImageUniqueID and the like) is padded with spaces or cut to that count,
 * since readers drop such a field when its count differs. */
OSTTIFF_API int TIFFSetAsciiFieldPivlo(TIFF* tif, uint32_t tag, const char* text);

/* The first line of TIFFGetVersion(): "LIBTIFF, Version 4.5.0". */
OSTTIFF_API const char* TIFFGetVersionLinePivlo(void);

/* Blocks of this layer from the host allocator handed to the codec object
 * (the C heap when none was given). */
OSTTIFF_API void* PivloMalloc(TIFF* tif, uint32_t byteCount);
OSTTIFF_API void PivloFree(TIFF* tif, void* block);

#ifdef __cplusplus
}
#endif

#endif /* OSTTIFF_OSTTIFF_H */
