// The EXIF directory of a written page. The page's directory has already
// been written, with an ExifIFD entry of 0 as a placeholder, when this runs:
// the EXIF directory is written on its own at the end of the file and the
// placeholder is set to it in place. Nothing walks the chain of pages, so
// writing many pages with EXIF costs the same for every page, and the codec
// never goes back to a written page (whose directory the next page's set-up
// would otherwise rewrite).

#include "metadata/metadata_writer.h"

#include "frame/report.h"
#include "metadata/entry_forms.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "zantiff/metadata.h"

namespace zan {
namespace {

bool IsExif(const MetadataEntry* e) { return (e->group & ZAN_METADATA_EXIF) != 0; }

const MetadataEntry* FirstExifEntry(const MetadataList* list) {
    for (const MetadataEntry* e = list->head; e; e = e->next)
        if (IsExif(e)) return e;
    return nullptr;
}

// Passes one EXIF entry to the codec; a tag the codec refuses is simply
// absent from the directory.
void SetExifEntry(ConversionContext* ctx, TIFF* tif, const MetadataEntry& e) {
    const bool known = e.type == ZAN_METADATA_BLOCK || e.type == ZAN_METADATA_U8 || e.type == ZAN_METADATA_U16 ||
                       e.type == ZAN_METADATA_U32 || e.type == ZAN_METADATA_F32 || e.type == ZAN_METADATA_F64;
    if (!known) {
        zanWarning(ctx, "Unknown TIFF EXIF type");
        return;
    }
    // An entry whose form does not suit its tag's field is not passed: the
    // codec would read an argument of another kind.
    const TIFFField* field = TIFFFindField(tif, e.tag, TIFF_ANY);
    if (!EntryFitsField(field, e)) return;
    switch (e.type) {
    case ZAN_METADATA_BLOCK:
        // A fixed-length text is padded to its length (readers drop it
        // otherwise); any other block goes as the field takes it.
        if (TIFFFieldDataType(field) == TIFF_ASCII && !TIFFFieldPassCount(field))
            TIFFSetAsciiFieldPivlo(tif, e.tag, static_cast<const char*>(e.value.block));
        else
            SetBlockEntry(tif, field, e);
        break;
    case ZAN_METADATA_U8: TIFFSetField(tif, e.tag, static_cast<int>(e.value.u8)); break;
    case ZAN_METADATA_U16: TIFFSetField(tif, e.tag, static_cast<int>(e.value.u16[0])); break;
    case ZAN_METADATA_U32: TIFFSetField(tif, e.tag, e.value.u32); break;
    case ZAN_METADATA_F32: TIFFSetField(tif, e.tag, static_cast<double>(e.value.f32)); break;
    case ZAN_METADATA_F64: TIFFSetField(tif, e.tag, e.value.f64); break;
    default: zanWarning(ctx, "Unknown TIFF EXIF type"); break;
    }
}

}  // namespace

bool HasExifEntries(const ConversionContext* ctx) {
    return ctx->writeMetadataList && FirstExifEntry(ctx->writeMetadataList);
}

int WriteTIFFMetadata(ConversionContext* ctx) {
    TIFF* tif = ctx->tiff;
    if (!tif || !HasExifEntries(ctx)) return 1;
    zanBeginTiffEXIFDir(tif);
    const bool created = zanCreateTiffEXIFDir(tif) != 0;
    if (created)
        for (const MetadataEntry* e = FirstExifEntry(ctx->writeMetadataList); e; e = e->next)
            if (IsExif(e)) SetExifEntry(ctx, tif, *e);
    // libtiff cannot write an EXIF directory without entries (it fails, or
    // worse): when the codec took none of them, the page goes without one.
    const bool anything = created && TIFFGetTagListCount(tif) > 0;
    const bool written = anything && TIFFWriteEXIFDirectoryPivlo(tif) != 0;
    // A fresh image directory for the next page, whatever happened.
    TIFFFreeDirectory(tif);
    TIFFCreateDirectory(tif);
    zanEndTiffEXIFDir(tif);
    if (!created || !anything || !written) {
        // The page goes without an EXIF link; a directory that failed to be
        // written is linked from nowhere, so its failure is the EXIF
        // directory's alone.
        const bool unlinked = TIFFSetLastPageEXIFPivlo(tif, 0) != 0;
        if (unlinked) TIFFClearIOFailedPivlo(tif);
        if (!created) return ReportError(ctx, "Cannot create EXIF entry in the TIFF directory");
        if (anything) return ReportError(ctx, "TIFF EXIF write error");
        if (!unlinked) return ReportError(ctx, "Cannot create EXIF entry in the TIFF directory");
        return 1;
    }
    if (!TIFFSetLastPageEXIFPivlo(tif, TIFFLastEXIFOffsetPivlo(tif)))
        return ReportError(ctx, "Cannot create EXIF entry in the TIFF directory");
    if (TIFFIOFailedPivlo(tif)) return ReportError(ctx, "TIFF EXIF write error");
    return 1;
}

}  // namespace zan
