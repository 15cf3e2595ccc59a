// Metadata of the page read: a fixed selection of image-directory tags, the
// ICC profile and the whole EXIF directory, each as one MetadataEntry whose
// blocks come from the list's own allocator.

#include "metadata/metadata_reader.h"

#include <algorithm>
#include <array>
#include <cstring>

#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "read/page_description.h"
#include "zantiff/metadata.h"

namespace zan {
namespace {

// How a selected image-directory tag is read into an entry.
enum class Form { U32, U16, Text, F32, U16Pair, AsDelivered };

struct SelectedTag {
    uint32_t tag;
    Form form;
};

// The selection, in the codec's field-table order (ascending tags; the
// codec's pseudo-tags follow the real ones).
constexpr std::array<SelectedTag, 38> kImageTags = {{
    {254, Form::U32},         {263, Form::U16},  {266, Form::U16},  {269, Form::Text},
    {270, Form::Text},        {271, Form::Text}, {272, Form::Text}, {280, Form::U16},
    {281, Form::U16},         {282, Form::F32},  {283, Form::F32},  {285, Form::Text},
    {286, Form::F32},         {287, Form::F32},  {292, Form::U32},  {293, Form::U32},
    {296, Form::U16},         {305, Form::Text}, {306, Form::Text}, {315, Form::Text},
    {316, Form::Text},        {317, Form::U16},  {321, Form::U16Pair}, {326, Form::U32},
    {327, Form::U16},         {328, Form::U32},  {332, Form::U16},  {333, Form::Text},
    {336, Form::U16Pair},     {337, Form::Text}, {339, Form::U16},  {340, Form::AsDelivered},
    {341, Form::AsDelivered}, {32995, Form::U16}, {32996, Form::U16}, {33432, Form::Text},
    {65536, Form::AsDelivered}, {0, Form::U32},
}};

class MetadataReader {
public:
    MetadataReader(ConversionContext* ctx, TIFF* tif)
        : ctx_(ctx), tif_(tif), list_(ctx->metadataList) {}

    int Run() {
        if (!ReadImageTags() || !AddIccProfile()) return 0;
        return ReadExifDirectory();
    }

private:
    void* ListAlloc(uint32_t n) { return list_->allocProc ? list_->allocProc(n) : nullptr; }
    void ListFree(void* block) {
        if (block && list_->freeProc) list_->freeProc(block);
    }

    // Hands an entry to the list; a refused one gives its block back.
    bool Add(MetadataEntry& entry, const char* refusal) {
        entry.next = nullptr;
        if (zanAddToMetadataList(ctx_, list_, &entry)) return true;
        if (entry.type == ZAN_METADATA_BLOCK) ListFree(entry.value.block);
        zanError(ctx_, refusal);
        return false;
    }

    // A block entry holding a copy of n bytes; false (reported) when the
    // list has no memory.
    bool MakeBlock(MetadataEntry& entry, const void* data, uint32_t n, uint32_t count) {
        void* block = ListAlloc(n ? n : 1);
        if (!block) {
            zanError(ctx_, "Memory allocation error");
            return false;
        }
        if (n) std::memcpy(block, data, n);
        entry.type = ZAN_METADATA_BLOCK;
        entry.count = count;
        entry.size = n;
        entry.value.block = block;
        return true;
    }

    // Stage 1: the selected tags that the page holds, each once.
    bool ReadImageTags() {
        for (const SelectedTag& selected : kImageTags) {
            if (selected.tag == 0) break;
            if (!TIFFFindField(tif_, selected.tag, TIFF_ANY)) continue;
            MetadataEntry entry{};
            entry.group = ZAN_METADATA_IMAGE;
            entry.tag = selected.tag;
            bool present = false;
            if (!ReadImageTag(selected, entry, &present)) return false;
            if (present && !Add(entry, "Error in storing metadata")) return false;
        }
        return true;
    }

    bool ReadImageTag(const SelectedTag& selected, MetadataEntry& entry, bool* present) {
        entry.size = 1;
        switch (selected.form) {
        case Form::U32:
            entry.type = ZAN_METADATA_U32;
            *present = TIFFGetField(tif_, selected.tag, &entry.value.u32) != 0;
            return true;
        case Form::U16:
            entry.type = ZAN_METADATA_U16;
            *present = TIFFGetField(tif_, selected.tag, &entry.value.u16[0]) != 0;
            return true;
        case Form::F32:
            entry.type = ZAN_METADATA_F32;
            *present = TIFFGetField(tif_, selected.tag, &entry.value.f32) != 0;
            return true;
        case Form::U16Pair:
            entry.type = ZAN_METADATA_U16;
            entry.size = 2;
            *present = TIFFGetField(tif_, selected.tag, &entry.value.u16[0], &entry.value.u16[1]) != 0;
            return true;
        case Form::AsDelivered:
            entry.type = ZAN_METADATA_AS_CODEC;
            *present = TIFFGetField(tif_, selected.tag, entry.value.bytes) != 0;
            return true;
        case Form::Text: {
            char* text = nullptr;
            *present = TIFFGetField(tif_, selected.tag, &text) && text;
            if (!*present) return true;
            return MakeBlock(entry, text, static_cast<uint32_t>(std::strlen(text) + 1), 0);
        }
        }
        return true;
    }

    // Stage 2: the ICC profile copied by the page description.
    bool AddIccProfile() {
        if (!ctx_->iccProfile) return true;
        MetadataEntry entry{};
        entry.group = ZAN_METADATA_ICC;
        entry.tag = TIFFTAG_ICCPROFILE;
        if (!MakeBlock(entry, ctx_->iccProfile, ctx_->iccProfileSize, 0)) return false;
        entry.count = 0;
        return Add(entry, "Error in reading metadata");
    }

    // Stage 3: every tag of the EXIF directory; the image directory is made
    // current again on every path.
    int ReadExifDirectory() {
        uint64_t exifOffset = 0;
        if (!TIFFGetField(tif_, TIFFTAG_EXIFIFD, &exifOffset)) return 1;
        if (!SourceCanReread(ctx_)) {
            // Reading another directory of a stream source would release the
            // page's own directory; the page must stay readable.
            zanWarning(ctx_, "EXIF data of a stream source is not read.");
            return 1;
        }
        const tdir_t imageDirectory = TIFFCurrentDirectory(tif_);
        zanBeginTiffEXIFDir(tif_);
        const int read = TIFFReadEXIFDirectory(tif_, exifOffset);
        zanEndTiffEXIFDir(tif_);
        int result = 1;
        if (!read) {
            zanError(ctx_, "Error in reading EXIF dir");
            result = 0;
        } else {
            result = ReadExifTags();
        }
        TIFFSetDirectory(tif_, imageDirectory);
        return result;
    }

    int ReadExifTags() {
        const int count = TIFFGetTagListCount(tif_);
        for (int i = 0; i < count; ++i) {
            const uint32_t tag = TIFFGetTagListEntry(tif_, i);
            TIFFFieldInfo info;
            if (!TIFFFieldInfoPivlo(tif_, tag, &info)) {
                zanWarning(ctx_, "Could not find EXIF specific tag.");
                continue;
            }
            MetadataEntry entry{};
            entry.group = ZAN_METADATA_EXIF;
            entry.tag = tag;
            bool present = false;
            if (!ReadExifTag(tag, info, entry, &present)) return 0;
            if (present && !Add(entry, "Error in storing metadata")) return 0;
        }
        return 1;
    }

    // One EXIF tag in the form its description gives; *present is false for
    // tags that are skipped or not delivered. Fields that pass a count
    // (variable-length ones, and tags libtiff does not know) are read with
    // their count, whatever their type.
    bool ReadExifTag(uint32_t tag, const TIFFFieldInfo& info, MetadataEntry& entry, bool* present) {
        const TIFFField* field = TIFFFindField(tif_, tag, TIFF_ANY);
        const int elementSize = TIFFFieldSetGetSize(field);
        switch (info.field_type) {
        case TIFF_ASCII: {
            if (info.field_passcount) return ReadCountedText(tag, field, entry, present);
            char* text = nullptr;
            if (!TIFFGetField(tif_, tag, &text) || !text) return true;
            *present = true;
            return MakeBlock(entry, text, static_cast<uint32_t>(std::strlen(text) + 1), 0);
        }
        case TIFF_UNDEFINED: {
            void* data = nullptr;
            if (info.field_readcount < 2 || info.field_passcount || !TIFFGetField(tif_, tag, &data) || !data)
                return true;
            *present = true;
            return MakeBlock(entry, data, static_cast<uint32_t>(info.field_readcount), 0);
        }
        case TIFF_BYTE: case TIFF_SBYTE: case TIFF_SHORT: case TIFF_SSHORT: case TIFF_LONG:
        case TIFF_SLONG: case TIFF_RATIONAL: case TIFF_SRATIONAL: case TIFF_FLOAT: case TIFF_DOUBLE:
            if (info.field_readcount == 1 && !info.field_passcount) return ReadScalar(tag, info, elementSize, entry, present);
            return ReadArray(tag, info, field, elementSize, entry, present);
        default:
            zanWarning(ctx_, "Unknown TIFF Exif type");
            return true;
        }
    }

    // The count and address of a field that passes its count, read with a
    // count of the width the codec uses (16 or 32 bits; a 16-bit count is
    // taken as signed). False when the codec does not deliver it.
    bool GetCounted(uint32_t tag, const TIFFField* field, uint32_t* count, void** data) {
        if (TIFFFieldSetGetCountSize(field) == 4) return TIFFGetField(tif_, tag, count, data) != 0;
        uint16_t count16 = 0;
        if (!TIFFGetField(tif_, tag, &count16, data) || static_cast<int16_t>(count16) < 0) return false;
        *count = count16;
        return true;
    }

    // A text that comes with its count (libtiff's form for tags it does not
    // know); the block always ends with a terminating zero.
    bool ReadCountedText(uint32_t tag, const TIFFField* field, MetadataEntry& entry, bool* present) {
        uint32_t count = 0;
        void* data = nullptr;
        if (!GetCounted(tag, field, &count, &data) || !data) return true;
        const auto* text = static_cast<const char*>(data);
        const uint32_t length = static_cast<uint32_t>(strnlen(text, count));
        if (length == 0xFFFFFFFFu) return true;
        *present = true;
        if (!MakeBlock(entry, text, length + 1, 0)) return false;
        static_cast<char*>(entry.value.block)[length] = '\0';
        return true;
    }

    bool ReadScalar(uint32_t tag, const TIFFFieldInfo& info, int elementSize, MetadataEntry& entry,
                    bool* present) {
        if (elementSize < 1 || elementSize > 8 || !TIFFGetField(tif_, tag, entry.value.bytes)) return true;
        *present = true;
        entry.size = static_cast<uint32_t>(elementSize);
        switch (info.field_type) {
        case TIFF_BYTE: case TIFF_SBYTE: entry.type = ZAN_METADATA_U8; break;
        case TIFF_SHORT: case TIFF_SSHORT: entry.type = ZAN_METADATA_U16; break;
        case TIFF_LONG: case TIFF_SLONG: entry.type = ZAN_METADATA_U32; break;
        default: entry.type = elementSize == 8 ? ZAN_METADATA_F64 : ZAN_METADATA_F32; break;
        }
        return true;
    }

    // A block of n values: fields that pass a count are read with a count
    // of the width the codec uses (16 or 32 bits); fixed counts otherwise.
    bool ReadArray(uint32_t tag, const TIFFFieldInfo& info, const TIFFField* field, int elementSize,
                   MetadataEntry& entry, bool* present) {
        void* data = nullptr;
        uint32_t count = 0;
        if (info.field_passcount) {
            if (!GetCounted(tag, field, &count, &data)) return true;
        } else if (info.field_readcount > 1) {
            if (!TIFFGetField(tif_, tag, &data)) return true;
            count = static_cast<uint32_t>(info.field_readcount);
        } else {
            return true;
        }
        if (!data || elementSize < 1 || count > 0xFFFFFFFFu / static_cast<uint32_t>(elementSize)) return true;
        *present = true;
        return MakeBlock(entry, data, count * static_cast<uint32_t>(elementSize), count);
    }

    ConversionContext* ctx_;
    TIFF* tif_;
    MetadataList* list_;
};

}  // namespace

int ReadTIFFMetadata(ConversionContext* ctx, TIFF* tif) {
    if (!ctx->metadataList) return 1;
    return MetadataReader(ctx, tif).Run();
}

}  // namespace zan
