// The EXIF directory of a written page. The page's directory has already
// been written when this runs, so the EXIF directory is written on its own
// at the end of the file, the page is made current again, and its directory
// is rewritten with the ExifIFD link (the sequence libtiff 4.5 handles for
// every page of a multi-page file; the page's first directory becomes
// unused space).

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

int WriteTIFFMetadata(ConversionContext* ctx) {
    TIFF* tif = ctx->tiff;
    const MetadataList* list = ctx->writeMetadataList;
    if (!tif || !list) return 1;
    const MetadataEntry* first = FirstExifEntry(list);
    if (!first) return 1;
    // The page just written is the last of the chain. libtiff's own count
    // of the current directory goes wrong once a directory was rewritten,
    // so the chain is counted.
    const tdir_t pages = TIFFNumberOfDirectories(tif);
    if (pages == 0) return ReportError(ctx, "Cannot set TIFF directory");
    const tdir_t page = pages - 1;
    zanBeginTiffEXIFDir(tif);
    if (!zanCreateTiffEXIFDir(tif)) {
        zanEndTiffEXIFDir(tif);
        return ReportError(ctx, "Cannot create EXIF entry in the TIFF directory");
    }
    for (const MetadataEntry* e = first; e; e = e->next)
        if (IsExif(e)) SetExifEntry(ctx, tif, *e);
    // libtiff cannot write an EXIF directory without entries (it fails, or
    // worse): when the codec took none of them, the page stays without one.
    // The empty EXIF directory gives way to a fresh image directory for the
    // next page (the page itself is written and linked already).
    if (TIFFGetTagListCount(tif) == 0) {
        TIFFFreeDirectory(tif);
        TIFFCreateDirectory(tif);
        zanEndTiffEXIFDir(tif);
        return 1;
    }
    const bool written = TIFFWriteEXIFDirectoryPivlo(tif) != 0;
    // Back to the page, whatever happened to the EXIF directory.
    const bool pageAgain = TIFFSetDirectory(tif, page) != 0;
    zanEndTiffEXIFDir(tif);
    if (!written) return ReportError(ctx, "TIFF EXIF write error");
    if (!pageAgain) return ReportError(ctx, "Cannot set TIFF directory");
    if (!TIFFSetField(tif, TIFFTAG_EXIFIFD, TIFFLastEXIFOffsetPivlo(tif)))
        return ReportError(ctx, "Cannot create EXIF entry in the TIFF directory");
    if (!TIFFRewriteDirectory(tif) || TIFFIOFailedPivlo(tif)) return ReportError(ctx, "TIFF EXIF write error");
    return 1;
}

}  // namespace zan
