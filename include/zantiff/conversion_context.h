/*
 * libzantiff - the per-job record shared by the host and the TIFF module.
 *
 * The host allocates one ConversionContext per conversion job, describes the
 * job in it and passes its address as the first argument of every call. The
 * module keeps all of its per-job state here and writes what it read or
 * produced back into it. Field order and widths are part of the interface.
 *
 * Plain C (C99 and C++17 or later).
 */
#ifndef ZANTIFF_CONVERSION_CONTEXT_H
#define ZANTIFF_CONVERSION_CONTEXT_H

#include <stdarg.h>
#include <stdint.h>
#include <stdio.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct ConversionContext ConversionContext;
struct MetadataList;
struct tiff; /* the codec object (TIFF of the codec library) */

/* Memory procedures of the host. Every block the module keeps for a job comes
 * from allocProc; reallocProc returns the moved block, or null leaving the
 * block as it was. */
typedef void* (*ZanAllocProc)(uint32_t byteCount);
typedef void* (*ZanReallocProc)(void* block, uint32_t byteCount);
typedef void (*ZanFreeProc)(void* block);

/* Message sinks for the codec library's messages: first style (code, text)
 * and second style (code, text, messageUserData). */
typedef void (*ZanMessageProc)(int code, const char* text);
typedef void (*ZanMessageProcEx)(int code, const char* text, void* userData);

/* Stream callbacks of the host. Reads and writes return the number of bytes
 * moved (negative on failure); seeks take whence 0 start, 1 current, 2 end
 * and return the new position, 0xFFFFFFFF on failure. */
typedef int32_t (*ZanStreamReadProc)(void* buffer, int32_t byteCount, void* userData);
typedef int32_t (*ZanStreamWriteProc)(const void* buffer, int32_t byteCount, void* userData);
typedef uint32_t (*ZanStreamSeekProc)(uint32_t offset, int whence, void* userData);

/* The codec library's process-wide message handler (libtiff's TIFFErrorHandler). */
typedef void (*ZanCodecHandler)(const char* module, const char* format, va_list args);

/* Message routing of the reference host: severity 0 error, 1 warning,
 * 2 trace (level is the trace level, 0 otherwise). */
typedef void (*ZanHostMessageProc)(ConversionContext* ctx, int severity, int level,
                                   const char* text);

/* Page state of a job (`state`). */
enum {
    ZAN_STATE_IDLE = 0,         /* nothing in progress; also after a whole-image decode */
    ZAN_STATE_PAGE_CLOSED = 1,  /* a written page was closed; the next may be set up */
    ZAN_STATE_DESCRIBED = 2,    /* a page was selected and described for reading */
    ZAN_STATE_READING = 3,      /* scanlines are being read */
    ZAN_STATE_WRITING = 4       /* scanlines are being written */
};

/* Kinds of read source (`sourceKind`). */
enum {
    ZAN_SOURCE_FILE = 1,   /* sourceFp + sourceBaseOffset */
    ZAN_SOURCE_STREAM = 2, /* host callbacks; the stream buffer service without a seek callback */
    ZAN_SOURCE_MEMORY = 4  /* sourceMemory + sourceMemorySize */
};

/* Kinds of destination (`destKind`). */
enum {
    ZAN_DEST_FILE = 1,         /* destFp / destPath + destBaseOffset */
    ZAN_DEST_CALLBACKS = 2,    /* destWriteProc + destSeekProc */
    ZAN_DEST_FIXED_BUFFER = 3, /* destMemory, destMemoryCapacity */
    ZAN_DEST_MEMORY = 4        /* growing block of the module, handed over through destMemory */
};

/* Bit of `destFileFlags`: use destFp as handed in instead of reopening destPath. */
#define ZAN_DEST_FILE_USE_AS_IS 0x01u

/* Host compression codes (`compression`, `outputCompression`). */
enum {
    ZAN_COMPRESSION_OTHER = 0,
    ZAN_COMPRESSION_NONE = 1,
    ZAN_COMPRESSION_PACKBITS = 2,
    ZAN_COMPRESSION_CCITT_G3 = 3,
    ZAN_COMPRESSION_CCITT_G4 = 4,
    ZAN_COMPRESSION_JPEG = 5,
    ZAN_COMPRESSION_CCITT_RLE = 6,
    ZAN_COMPRESSION_LZW = 7,
    ZAN_COMPRESSION_NEXT = 8,
    ZAN_COMPRESSION_CCITT_RLEW = 9,
    ZAN_COMPRESSION_THUNDERSCAN = 10,
    ZAN_COMPRESSION_OJPEG = 11,
    ZAN_COMPRESSION_DEFLATE = 12
};

/* Host image-type codes (`imageType`, frame formats). */
enum {
    ZAN_IMAGE_BILEVEL_WHITE_IS_ZERO = 11,
    ZAN_IMAGE_BILEVEL_BLACK_IS_ZERO = 12,
    ZAN_IMAGE_GREY_WHITE_IS_ZERO = 13,
    ZAN_IMAGE_GREY_BLACK_IS_ZERO = 14,
    ZAN_IMAGE_RGB = 17,
    ZAN_IMAGE_PALETTE = 19,
    ZAN_IMAGE_MASK = 20,
    ZAN_IMAGE_SEPARATED = 21,
    ZAN_IMAGE_YCBCR = 22,
    ZAN_IMAGE_CIELAB = 24,
    ZAN_IMAGE_LOGL = 25,
    ZAN_IMAGE_LOGLUV = 26,
    ZAN_IMAGE_CMYK = 28
};

/* Host colour-space codes (`colorSpace`, `outputColorSpace`). */
enum {
    ZAN_COLORSPACE_BILEVEL = 1,
    ZAN_COLORSPACE_GREY = 2,
    ZAN_COLORSPACE_GREY_ALPHA = 3,
    ZAN_COLORSPACE_CMYK_1BIT = 4,
    ZAN_COLORSPACE_CMYK = 5,
    ZAN_COLORSPACE_SEPARATED = 6,
    ZAN_COLORSPACE_RGB_ALPHA = 7,
    ZAN_COLORSPACE_RGB = 8
};

/* Forms of whole-page delivery (`destFormat`). */
enum {
    ZAN_DEST_FORMAT_JPEG = 3,
    ZAN_DEST_FORMAT_G4 = 5
};

/* Stream decoding modes (`streamMode`). */
enum {
    ZAN_STREAM_NOTHING = 0,
    ZAN_STREAM_DESCRIBED = 1,
    ZAN_STREAM_ONE_CHUNK = 2,
    ZAN_STREAM_NO_DECOMPRESSION = 3,
    ZAN_STREAM_BYPASS = 4
};

struct ConversionContext {
    /* ---- source and image description ---- */
    uint32_t sourceKind;
    uint32_t imageType;
    FILE* sourceFp;
    uint32_t sourceBaseOffset;
    const void* sourceMemory;
    ZanStreamReadProc sourceReadProc;
    ZanStreamSeekProc sourceSeekProc;
    void* sourceUserData;
    uint32_t sourceStreamParam;
    uint32_t sourceMemorySize;
    uint32_t imageWidth;
    uint32_t imageHeight;
    uint32_t tileWidth;
    uint32_t tileHeight;
    uint32_t whiteIsZero;
    uint32_t componentCount;
    uint32_t bitsPerSample;
    uint32_t fileSamplesPerPixel;
    uint32_t samplesPerPixel;
    uint32_t planarConfig;
    float xResolution;
    float yResolution;
    float fileXResolution;
    float fileYResolution;
    uint32_t resolutionUnit;
    int32_t horizontalSampling[3];
    int32_t verticalSampling[3];
    int32_t pageNumber;
    uint32_t pageCount;
    uint32_t compression;
    uint32_t orientation;
    void* iccProfile;
    uint32_t iccProfileSize;

    /* ---- output and destination description ---- */
    uint32_t outputColorSpace;
    uint32_t destFormat;
    uint32_t destKind;
    const char* destPath;
    FILE* destFp;
    uint32_t destBaseOffset;
    void* destMemory; /* kind 3: the buffer; kind 4: address of the host's void* */
    ZanStreamWriteProc destWriteProc;
    void* destUserData;
    ZanStreamSeekProc destSeekProc;
    uint32_t appendPages;
    uint32_t destMemoryCapacity;
    uint32_t* destSizeOut;
    uint32_t outputWidth;
    uint32_t outputHeight;
    uint32_t outputFormat;
    uint32_t outputSamplesPerPixel;
    uint32_t outputBitsPerSample;
    uint32_t outputPaletteBits;
    uint32_t outputPlanarConfig;
    uint32_t outputCompression;
    float outputXResolution;
    float outputYResolution;
    uint32_t outputOrientation;
    const void* outputIccProfile;
    uint32_t outputIccProfileSize;

    /* ---- memory image and frame buffer ---- */
    unsigned char* memBase;
    unsigned char* memPos;
    uint32_t memCapacity;
    uint32_t memSize;
    void* frameData;
    unsigned char* destMemPos;
    uint32_t frameBufferSize;
    uint32_t colorSpace;
    uint32_t frameWhiteIsZero;
    uint32_t frameWidth;
    uint32_t frameHeight;

    /* ---- allocator and message callbacks ---- */
    ZanAllocProc allocProc;
    ZanFreeProc freeProc;
    ZanReallocProc reallocProc;
    ZanMessageProc errorProc;
    ZanMessageProc warningProc;
    ZanMessageProcEx errorProcEx;
    ZanMessageProcEx warningProcEx;
    void* messageUserData;
    uint32_t useExMessageProcs;

    /* ---- module state and working fields ---- */
    struct tiff* tiff;
    void* fileHandle;
    void* streamBuffer;
    uint32_t state;
    uint32_t currentRow;
    uint32_t lineBytes;
    uint32_t dropExtraSamples;
    uint32_t dropSampleCount;
    uint32_t outputSamplingCount;
    int32_t outputHorizontalSampling[3];
    int32_t outputVerticalSampling[3];
    uint32_t keepFileLayout;
    uint32_t requestedFormat;
    uint32_t requestedBitsPerSample;
    uint32_t requestedPaletteBits;
    struct MetadataList* metadataList;
    struct MetadataList* writeMetadataList;
    ZanCodecHandler savedErrorHandler;
    ZanCodecHandler savedWarningHandler;
    uint32_t rowsPerStrip;
    uint32_t stripCount;
    char* imageDescription;
    uint32_t nextStrip;
    unsigned char* stripBuffer;
    uint32_t stripBufferSize;
    uint32_t readByStrip;
    void* streamDecoder;
    char* documentName;
    uint32_t reduceTo8Bits;
    uint32_t t6OptionsSet;
    uint32_t t6Options;
    uint32_t streamMode;
    uint32_t rawChunkOffset;
    uint32_t rawChunkSize;
    void* rawOutput;
    uint32_t rawBufferOutSize;
    uint32_t rawOutputSize;
    uint32_t rowsDelivered;
    uint32_t chunkType;
    uint16_t dotRangeLow;
    uint16_t dotRangeHigh;
    uint32_t inkFill;
    uint32_t alphaSampleIndex;
    uint32_t extraSampleCount;
    uint32_t paletteExpansion;
    uint16_t* paletteRed;
    uint16_t* paletteGreen;
    uint16_t* paletteBlue;
    uint32_t scanlineSize;
    uint32_t fillOrder;
    uint32_t extraSamples;
    uint32_t lzwPredictor;
    uint8_t destFileFlags;

    /* ---- host-owned fields of the reference host (libpivlo) ---- */
    ZanHostMessageProc hostMessageProc;
    void* hostUserData;
};

#ifdef __cplusplus
}
#endif

#endif /* ZANTIFF_CONVERSION_CONTEXT_H */
