#include "metadata/entry_forms.h"

#include <cstring>

namespace zan {
namespace {

bool IsIntegerType(TIFFDataType type) {
    switch (type) {
    case TIFF_BYTE: case TIFF_SBYTE: case TIFF_SHORT: case TIFF_SSHORT: case TIFF_LONG: case TIFF_SLONG:
    case TIFF_IFD: case TIFF_UNDEFINED:
        return true;
    default:
        return false;
    }
}

bool IsRealType(TIFFDataType type) {
    return type == TIFF_RATIONAL || type == TIFF_SRATIONAL || type == TIFF_FLOAT || type == TIFF_DOUBLE;
}

// The codec takes the field's value through a pointer (a text, an array,
// a counted block) rather than as a number.
bool TakesPointer(const TIFFField* field) {
    if (IsOneValueForAllSamples(TIFFFieldTag(field))) return false;
    const int count = TIFFFieldWriteCount(field);
    return TIFFFieldDataType(field) == TIFF_ASCII || TIFFFieldPassCount(field) || count == TIFF_VARIABLE ||
           count == TIFF_VARIABLE2 || count == TIFF_SPP || (count > 1 && !IsPairTag(TIFFFieldTag(field)));
}

bool BlockFits(const TIFFField* field, const MetadataEntry& e) {
    if (!e.value.block) return false;
    if (TIFFFieldDataType(field) == TIFF_ASCII) return e.size > 0 && std::memchr(e.value.block, 0, e.size);
    const int element = TIFFFieldSetGetSize(field);
    const int count = TIFFFieldWriteCount(field);
    if (element < 1) return false;
    if (TIFFFieldPassCount(field))
        return static_cast<uint64_t>(PassedValueCount(field, e)) * static_cast<uint64_t>(element) <= e.size;
    if (count > 1) return static_cast<uint64_t>(count) * static_cast<uint64_t>(element) <= e.size;
    return false;  // a variable count the codec does not pass: its length is unknown
}

}  // namespace

bool IsOneValueForAllSamples(uint32_t tag) {
    return tag == TIFFTAG_MINSAMPLEVALUE || tag == TIFFTAG_MAXSAMPLEVALUE || tag == TIFFTAG_SAMPLEFORMAT ||
           tag == TIFFTAG_SMINSAMPLEVALUE || tag == TIFFTAG_SMAXSAMPLEVALUE || tag == TIFFTAG_DATATYPE;
}

bool IsPairTag(uint32_t tag) {
    return tag == TIFFTAG_PAGENUMBER || tag == TIFFTAG_HALFTONEHINTS || tag == TIFFTAG_DOTRANGE ||
           tag == TIFFTAG_YCBCRSUBSAMPLING;
}

uint32_t PassedValueCount(const TIFFField* field, const MetadataEntry& e) {
    if (e.count) return e.count;
    const int element = TIFFFieldSetGetSize(field);
    return element > 0 ? e.size / static_cast<uint32_t>(element) : 0;
}

int SetBlockEntry(TIFF* tif, const TIFFField* field, const MetadataEntry& e) {
    if (TIFFFieldPassCount(field)) return TIFFSetField(tif, e.tag, PassedValueCount(field, e), e.value.block);
    return TIFFSetField(tif, e.tag, e.value.block);
}

bool EntryFitsField(const TIFFField* field, const MetadataEntry& e) {
    if (!field) return false;
    if (TakesPointer(field)) return e.type == ZAN_METADATA_BLOCK && BlockFits(field, e);
    // SMinSampleValue and SMaxSampleValue take a double whatever type the
    // file stores them in.
    const TIFFDataType type = TIFFFieldSetGetSize(field) == 8 && IsOneValueForAllSamples(TIFFFieldTag(field))
                                  ? TIFF_DOUBLE
                                  : TIFFFieldDataType(field);
    switch (e.type) {
    case ZAN_METADATA_U8: case ZAN_METADATA_U16: case ZAN_METADATA_U32: return IsIntegerType(type);
    case ZAN_METADATA_F32: case ZAN_METADATA_F64: return IsRealType(type);
    case ZAN_METADATA_AS_CODEC: return IsIntegerType(type) || IsRealType(type);
    default: return false;
    }
}

}  // namespace zan
