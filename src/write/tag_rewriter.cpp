// zanTIFFSetTIFFTags: changes or adds tags of the first directory of an
// existing TIFF file and rewrites that directory in place. The codec's own
// description of each tag decides how the caller's value is read and passed.

#include <cstdio>
#include <cstring>
#include <string>

#include "frame/codec_messages.h"
#include "frame/host_memory.h"
#include "frame/io_procs.h"
#include "metadata/entry_forms.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

enum class EntryResult { Applied, Skipped, Failed };

// Tags whose codec form is not one array (ColorMap takes three, and
// TransferFunction one per colour channel): a single array would make the
// codec read arguments that were never passed.
bool NeedsSeveralArrays(uint32_t tag) {
    return tag == TIFFTAG_COLORMAP || tag == TIFFTAG_TRANSFERFUNCTION;
}

class TagSetter {
public:
    TagSetter(ConversionContext* ctx, TIFF* tif) : ctx_(ctx), tif_(tif) {}

    EntryResult Apply(uint16_t tag, const void* value, uint32_t count) {
        if (!value) return Fail("Error in tag data.");
        const TIFFField* field = TIFFFindField(tif_, tag, TIFF_ANY);
        if (!field) {
            zanErrorV(ctx_, "Error getting field %d", static_cast<int>(tag));
            return EntryResult::Failed;
        }
        name_ = TIFFFieldName(field);
        if (TIFFFieldDataType(field) == TIFF_ASCII) return SetText(field, static_cast<const char*>(value));
        if (TIFFFieldWriteCount(field) == TIFF_VARIABLE2) {
            const int set = TIFFFieldPassCount(field) ? TIFFSetField(tif_, tag, count, value)
                                                      : TIFFSetField(tif_, tag, value);
            return Result(set);
        }
        int32_t expected = 0;
        if (!ExpectedCount(field, count, &expected)) return EntryResult::Skipped;
        if (expected != static_cast<int32_t>(count)) {
            zanErrorV(ctx_,
                      "Number of tag values is not enough. Expected %d values for %s tag, got %d\n",
                      static_cast<int>(expected), name_, static_cast<int>(static_cast<int32_t>(count)));
            return EntryResult::Failed;
        }
        // A field that takes a count takes it with its values, however many.
        if (TIFFFieldPassCount(field)) return Result(TIFFSetField(tif_, tag, static_cast<int>(expected), value));
        if (expected > 1 && IsOneValueForAllSamples(tag)) return SetFirstOfSamples(field, tag, value);
        if (expected > 1) return SetSeveral(field, tag, value);
        return SetOne(field, tag, value);
    }

private:
    EntryResult Fail(const char* message) {
        zanError(ctx_, message);
        return EntryResult::Failed;
    }

    EntryResult Result(int set) {
        if (set == 1) return EntryResult::Applied;
        zanErrorV(ctx_, "Failed to set %s\n", name_);
        return EntryResult::Failed;
    }

    // A text field; one that also takes a count (InkNames) gets the text's
    // byte length with the terminating zero.
    EntryResult SetText(const TIFFField* field, const char* text) {
        const uint32_t tag = TIFFFieldTag(field);
        const int set = TIFFFieldPassCount(field)
                            ? TIFFSetField(tif_, tag, static_cast<int>(std::strlen(text) + 1), text)
                            : TIFFSetField(tif_, tag, text);
        if (set == 1) return EntryResult::Applied;
        zanErrorV(ctx_, "Failed to set %s=%s\n", name_, text);
        return EntryResult::Failed;
    }

    // The number of values the field takes: its fixed write count, or for a
    // variable count the given one as a signed 16-bit number. False for
    // fields of any other write count, which are passed over.
    static bool ExpectedCount(const TIFFField* field, uint32_t count, int32_t* expected) {
        const int writeCount = TIFFFieldWriteCount(field);
        if (writeCount >= 1) *expected = writeCount;
        else if (writeCount == TIFF_VARIABLE) *expected = static_cast<int16_t>(count);
        else return false;
        return true;
    }

    EntryResult SetSeveral(const TIFFField* field, uint32_t tag, const void* value) {
        const TIFFDataType type = TIFFFieldDataType(field);
        if (IsPairTag(tag)) {
            if (type == TIFF_BYTE) {
                const auto* v = static_cast<const uint8_t*>(value);
                return Result(TIFFSetField(tif_, tag, int{v[0]}, int{v[1]}));
            }
            if (type == TIFF_SHORT) {
                const auto* v = static_cast<const uint16_t*>(value);
                return Result(TIFFSetField(tif_, tag, int{v[0]}, int{v[1]}));
            }
            return EntryResult::Skipped;
        }
        if (NeedsSeveralArrays(tag)) return Result(0);
        return Result(TIFFSetField(tif_, tag, value));
    }

    // A per-sample field that libtiff keeps as one value for every sample
    // gets the first of the values given (an array of its element form).
    EntryResult SetFirstOfSamples(const TIFFField* field, uint32_t tag, const void* value) {
        if (TIFFFieldSetGetSize(field) == 8) {
            double v;
            std::memcpy(&v, value, sizeof v);
            return Result(TIFFSetField(tif_, tag, v));
        }
        uint16_t v;
        std::memcpy(&v, value, sizeof v);
        return Result(TIFFSetField(tif_, tag, int{v}));
    }

    EntryResult SetOne(const TIFFField* field, uint32_t tag, const void* value) {
        switch (TIFFFieldDataType(field)) {
        case TIFF_BYTE: case TIFF_SHORT: case TIFF_LONG: case TIFF_SBYTE: case TIFF_SSHORT:
        case TIFF_SLONG: case TIFF_IFD: {
            int32_t v;
            std::memcpy(&v, value, sizeof v);
            return Result(TIFFSetField(tif_, tag, v));
        }
        case TIFF_RATIONAL: case TIFF_SRATIONAL: case TIFF_FLOAT: {
            float v;
            std::memcpy(&v, value, sizeof v);
            return Result(TIFFSetField(tif_, tag, static_cast<double>(v)));
        }
        case TIFF_DOUBLE: {
            double v;
            std::memcpy(&v, value, sizeof v);
            return Result(TIFFSetField(tif_, tag, v));
        }
        default:
            return EntryResult::Skipped;
        }
    }

    ConversionContext* ctx_;
    TIFF* tif_;
    const char* name_ = "";
};

// Applies every entry in order; false at the first failure (reported).
bool ApplyEntries(ConversionContext* ctx, TIFF* tif, uint16_t count, const uint16_t* tags,
                  const void* const* values, const uint32_t* counts) {
    TagSetter setter(ctx, tif);
    for (uint16_t i = 0; i < count; ++i)
        if (setter.Apply(tags[i], values[i], counts[i]) == EntryResult::Failed) return false;
    return true;
}

// Runs the rewrite on an opened file; the file record is the job's for the
// length of the call.
int RewriteFirstDirectory(ConversionContext* ctx, uint16_t count, const uint16_t* tags,
                          const void* const* values, const uint32_t* counts) {
    const ClientProcs file = FileDestProcs();
    TIFF* tif = TIFFClientOpenPivlo("", "r+", ctx, file.read, file.write, file.seek, file.close,
                                    file.size, nullptr, nullptr, ctx->allocProc, ctx->reallocProc,
                                    ctx->freeProc);
    if (!tif) {
        zanError(ctx, "Unable to create a tiff object");
        return 0;
    }
    TIFFSetContextPivlo(tif, ctx);
    if (!ApplyEntries(ctx, tif, count, tags, values, counts)) {
        // Closing would write the changes made so far; reading the directory
        // again drops them, so a failed call leaves the file as it was.
        TIFFSetDirectory(tif, TIFFCurrentDirectory(tif));
        TIFFClose(tif);
        return 0;
    }
    int result = TIFFRewriteDirectory(tif) ? 1 : 0;
    if (result && TIFFIOFailedPivlo(tif)) {
        zanError(ctx, "Unable to write the directory to the file.");
        result = 0;
    }
    TIFFClose(tif);
    return result;
}

}  // namespace
}  // namespace zan

extern "C" ZAN_API int zanTIFFSetTIFFTags(ConversionContext* ctx, const char* fileName,
                                          uint16_t tagCount, const uint16_t* tags,
                                          const void* const* values, const uint32_t* counts,
                                          const void* reserved) {
    using namespace zan;
    if (!ctx || !fileName || !tags || !values || !counts || !reserved || tagCount == 0) return 0;
    RedirectCodecMessages(ctx);  // put back by zanDestroyTIFF
    HostBlock record(ctx, sizeof(FileHandleRecord));
    if (!record) {
        zanError(ctx, "Memory allocation");
        return 0;
    }
    FILE* stream = std::fopen(fileName, "rb+");
    if (!stream) {
        zanError(ctx, "Unable to open file.");
        return 0;
    }
    *record.Get<FileHandleRecord>() = FileHandleRecord{stream, 0};
    void* const jobFile = ctx->fileHandle;  // a job's own file record is kept aside
    ctx->fileHandle = record.Get();
    const int result = RewriteFirstDirectory(ctx, tagCount, tags, values, counts);
    ctx->fileHandle = jobFile;
    if (std::fclose(stream) != 0 && result) {
        zanError(ctx, "Unable to write the directory to the file.");
        return 0;
    }
    return result;
}
