/*
 * libzantiff - metadata entries exchanged with the host.
 *
 * Reading a page fills a MetadataList with its image-directory tags, its ICC
 * profile and its EXIF tags; writing applies the entries of a list to the
 * pages written. Plain C (C99 and C++17 or later).
 */
#ifndef ZANTIFF_METADATA_H
#define ZANTIFF_METADATA_H

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* `group`: bit values that say where an entry belongs. */
enum {
    ZAN_METADATA_IMAGE = 1, /* a tag of the image directory */
    ZAN_METADATA_ICC = 3,   /* the ICC profile (has the image bit too) */
    ZAN_METADATA_EXIF = 4   /* a tag of the EXIF directory */
};

/* `type`: form of the value. */
enum {
    ZAN_METADATA_BLOCK = 1,   /* block of bytes addressed by value.block */
    ZAN_METADATA_U8 = 2,
    ZAN_METADATA_U16 = 3,     /* one u16, or two for the pair tags */
    ZAN_METADATA_U32 = 4,
    ZAN_METADATA_AS_CODEC = 6, /* the value exactly as the codec delivers it */
    ZAN_METADATA_F32 = 7,
    ZAN_METADATA_F64 = 8
};

/* The 64-bit value slot: scalars are stored from its start. */
typedef union MetadataValue {
    unsigned char bytes[8];
    uint8_t u8;
    uint16_t u16[2];
    uint32_t u32;
    float f32;
    double f64;
    uint64_t u64;
    void* block;
} MetadataValue;

typedef struct MetadataEntry MetadataEntry;
struct MetadataEntry {
    uint32_t group;
    uint32_t tag;
    uint32_t count; /* values in a numeric block; 0 otherwise */
    uint32_t type;
    uint32_t size;  /* block: byte length; scalars: see the reading documentation */
    MetadataValue value;
    MetadataEntry* next; /* null when handed to the list; the list links entries */
};

typedef void* (*MetadataAllocProc)(uint32_t byteCount);
typedef void (*MetadataFreeProc)(void* block);

/* Blocks addressed by entries come from the list's own allocation function;
 * once an entry is accepted the list owns its block. */
typedef struct MetadataList {
    MetadataAllocProc allocProc;
    MetadataFreeProc freeProc;
    void* reserved;
    MetadataEntry* head;
} MetadataList;

#ifdef __cplusplus
}
#endif

#endif /* ZANTIFF_METADATA_H */
