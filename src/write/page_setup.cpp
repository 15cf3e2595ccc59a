// zanTIFFSetField, zanTIFFNextImage and ApplyPageMetadata.

#include "write/page_setup.h"

#include <algorithm>
#include <array>
#include <cstdarg>

#include "frame/job_finishers.h"
#include "frame/tiff_open.h"
#include "metadata/entry_forms.h"
#include "metadata/metadata_writer.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

// Tags the metadata does not overwrite when the page already holds them.
constexpr std::array<uint32_t, 28> kGuardedTags = {
    254, 263, 266, 269, 270, 271, 272, 280, 281, 282, 283, 285, 286, 287,
    296, 305, 306, 315, 316, 321, 332, 333, 336, 337, 339, 340, 341, 33432};

bool IsGuarded(uint32_t tag) {
    return std::find(kGuardedTags.begin(), kGuardedTags.end(), tag) != kGuardedTags.end();
}

// Passes an entry to the codec in the form its type says; -1 for entries
// of types that are passed over. An entry whose form does not suit the
// tag's field is refused (0) before the codec could misread it.
int SetEntry(TIFF* tif, const MetadataEntry& e) {
    if (e.type != ZAN_METADATA_BLOCK && e.type != ZAN_METADATA_U16 && e.type != ZAN_METADATA_U32 &&
        e.type != ZAN_METADATA_AS_CODEC && e.type != ZAN_METADATA_F32 && e.type != ZAN_METADATA_F64)
        return -1;
    const TIFFField* field = TIFFFindField(tif, e.tag, TIFF_ANY);
    if (!field) return TIFFSetField(tif, e.tag, 0);  // unknown: the codec refuses and says so
    if (e.tag == TIFFTAG_ICCPROFILE)
        return e.type == ZAN_METADATA_BLOCK && e.value.block ? TIFFSetField(tif, e.tag, e.size, e.value.block) : 0;
    if (!EntryFitsField(field, e)) return 0;
    switch (e.type) {
    case ZAN_METADATA_BLOCK:
        return SetBlockEntry(tif, field, e);
    case ZAN_METADATA_U16:
        return TIFFSetField(tif, e.tag, static_cast<int>(e.value.u16[0]), static_cast<int>(e.value.u16[1]));
    case ZAN_METADATA_U32: return TIFFSetField(tif, e.tag, e.value.u32);
    case ZAN_METADATA_AS_CODEC:
        // As the codec delivered it: a double for fields that hold doubles
        // (SMinSampleValue, SMaxSampleValue), a 32-bit integer otherwise.
        if (TIFFFieldSetGetSize(field) == 8) return TIFFSetField(tif, e.tag, e.value.f64);
        return TIFFSetField(tif, e.tag, e.value.u32);
    case ZAN_METADATA_F32: return TIFFSetField(tif, e.tag, static_cast<double>(e.value.f32));
    case ZAN_METADATA_F64: return TIFFSetField(tif, e.tag, e.value.f64);
    default: return -1;
    }
}

}  // namespace

int ApplyPageMetadata(ConversionContext* ctx, TIFF* tif) {
    const MetadataList* list = ctx->writeMetadataList;
    if (!list) return 1;
    // The resolution pair shares one presence flag: noted once, so that both
    // halves from the metadata are written when the page had none.
    const bool hadResolution = TIFFFieldIsSetPivlo(tif, TIFFTAG_XRESOLUTION);
    for (const MetadataEntry* e = list->head; e; e = e->next) {
        if (!(e->group & ZAN_METADATA_IMAGE)) continue;
        if (e->tag == TIFFTAG_XRESOLUTION || e->tag == TIFFTAG_YRESOLUTION) {
            if (hadResolution) continue;
        } else if (e->tag == TIFFTAG_XPOSITION || e->tag == TIFFTAG_YPOSITION) {
            if (TIFFFieldIsSetPivlo(tif, TIFFTAG_XPOSITION) || TIFFFieldIsSetPivlo(tif, TIFFTAG_YPOSITION)) continue;
        } else if (IsGuarded(e->tag) && TIFFFieldIsSetPivlo(tif, e->tag)) {
            continue;
        }
        if (SetEntry(tif, *e) == 0) {
            zanError(ctx, "Error in saving metadata");
            return 0;
        }
    }
    return 1;
}

namespace {

// A job torn down while writing a page finishes it as zanTIFFNextImage would.
const bool kWritingFinisher = RegisterJobFinisher(ZAN_STATE_WRITING, [](ConversionContext* ctx) {
    if (ctx->tiff) FinishPage(ctx);
});

}  // namespace

bool FinishPage(ConversionContext* ctx) {
    TIFF* tif = ctx->tiff;
    // The EXIF link is set in place once the EXIF directory is written; the
    // placeholder gives the page's directory its final size now.
    if (HasExifEntries(ctx)) TIFFSetField(tif, TIFFTAG_EXIFIFD, uint64_t{0});
    if (!TIFFWritePageDirectoryPivlo(tif)) return false;
    if (TIFFIOFailedPivlo(tif)) {
        zanError(ctx, "Unable to write the page to the destination.");
        return false;
    }
    WriteTIFFMetadata(ctx);
    return true;
}

}  // namespace zan

extern "C" ZAN_API int zanTIFFSetField(ConversionContext* ctx, uint32_t tag, ...) {
    using namespace zan;
    if (!ctx) return 0;
    if (ctx->state == ZAN_STATE_IDLE) {
        if (!OpenTIFFForWriting(ctx)) return 0;
    } else if (ctx->state != ZAN_STATE_PAGE_CLOSED) {
        zanWarning(ctx, "Can't set tiff fields at this state.");
        return 0;
    }
    va_list args;
    va_start(args, tag);
    const int result = TIFFVSetField(ctx->tiff, tag, args);
    va_end(args);
    return result;
}

extern "C" ZAN_API int zanTIFFNextImage(ConversionContext* ctx) {
    using namespace zan;
    if (!ctx) return 0;
    // Only a page that has taken lines can be ended: a second call in a row
    // would write an empty directory that readers reject.
    if (!ctx->tiff || ctx->state != ZAN_STATE_WRITING) {
        zanError(ctx, "No page is being written.");
        return 0;
    }
    if (!FinishPage(ctx)) return 0;
    ctx->state = ZAN_STATE_PAGE_CLOSED;
    return 1;
}
