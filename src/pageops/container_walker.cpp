// Copying TIFF directories between files at the file-structure level.
//
// A page is copied in two passes over its source directory. The first reads
// every entry, checks types and counts, checks that every value, directory
// and strip lies inside the source file, loads the strip offsets and byte
// counts, and works out an upper bound of the destination size; nothing is
// written unless the whole page can be copied. The second pass writes the
// directory, its values and sub-directories, the new offsets array and the
// image data, at the positions the layout gives:
//
//   P      the directory: N, N entries in source order, next-IFD offset 0
//          values stored outside their entries, in entry order (an EXIF, GPS
//          or Interoperability directory is laid out the same way at the
//          place of its pointer entry), each at an even offset
//          the new strip offsets array, when it does not fit in its entry
//          the strips (or tiles) in index order, each at an even offset
//
// Values and strips pass through one fixed copy buffer, so no image data is
// held in memory; the only blocks are the three arrays of strip numbers.

#include "pageops/container_walker.h"

#include <algorithm>
#include <cstring>
#include <limits>

#include "frame/file_stream.h"
#include "frame/host_memory.h"
#include "pivlo/pivlo.h"

namespace zan {

// ---------------------------------------------------------------- byte order

uint16_t ByteOrderAccess::Get16(const unsigned char* b) const {
    return order_ == ByteOrder::Little ? zanGetUINT16Little(ctx_, b) : zanGetUINT16Big(ctx_, b);
}
uint32_t ByteOrderAccess::Get32(const unsigned char* b) const {
    return order_ == ByteOrder::Little ? zanGetUINT32Little(ctx_, b) : zanGetUINT32Big(ctx_, b);
}
void ByteOrderAccess::Put16(uint16_t v, unsigned char* b) const {
    if (order_ == ByteOrder::Little) zanMake2ByteIntLittle(ctx_, v, b);
    else zanMake2ByteIntBig(ctx_, v, b);
}
void ByteOrderAccess::Put32(uint32_t v, unsigned char* b) const {
    if (order_ == ByteOrder::Little) zanMake4ByteIntLittle(ctx_, v, b);
    else zanMake4ByteIntBig(ctx_, v, b);
}

// ---------------------------------------------------------------- header, chain

namespace {

bool ReadAt(FILE* stream, uint64_t offset, void* buffer, size_t n) {
    return SeekStream(stream, static_cast<int64_t>(offset), SEEK_SET) == 0 &&
           std::fread(buffer, 1, n, stream) == n;
}

}  // namespace

HeaderResult readTiffHeader(ConversionContext* ctx, FILE* stream, ByteOrder* order,
                            uint32_t* firstIfd) {
    unsigned char header[8];
    if (std::fread(header, 1, sizeof header, stream) != sizeof header) return HeaderResult::NotTiff;
    if ((header[0] != 'I' && header[0] != 'M') || header[1] != header[0]) return HeaderResult::NotTiff;
    *order = header[0] == 'I' ? ByteOrder::Little : ByteOrder::Big;
    const ByteOrderAccess access(ctx, *order);
    if (access.Get16(header + 2) != 42) return HeaderResult::BadIdentifier;
    *firstIfd = access.Get32(header + 4);
    return HeaderResult::Ok;
}

bool skipIfd(ConversionContext* ctx, FILE* stream, uint32_t offset, ByteOrder order,
             uint64_t fileSize, uint32_t* next, uint32_t* nextField) {
    const ByteOrderAccess access(ctx, order);
    unsigned char count[2];
    if (uint64_t{offset} + 2 > fileSize || !ReadAt(stream, offset, count, 2)) return false;
    const uint32_t entryBytes = 12u * access.Get16(count);
    const uint64_t field = uint64_t{offset} + 2 + entryBytes;
    if (field + 4 > fileSize) return false;
    // The entries of a usual directory are read over rather than sought
    // past: they are in the stream's buffer already, and a seek would
    // empty it.
    unsigned char entries[4096];
    const bool skipped = entryBytes <= sizeof entries
                             ? std::fread(entries, 1, entryBytes, stream) == entryBytes
                             : SeekStream(stream, static_cast<int64_t>(field), SEEK_SET) == 0;
    unsigned char link[4];
    if (!skipped || std::fread(link, 1, 4, stream) != 4) return false;
    *next = access.Get32(link);
    if (nextField) *nextField = static_cast<uint32_t>(field);
    return true;
}

// ---------------------------------------------------------------- page copy

namespace {

// A file stream that knows its position, so that reads and writes which
// continue where the last one ended need no seek (a seek empties the stream's
// buffer). Strips stored one after another then copy as one stream.
class TrackedStream {
public:
    explicit TrackedStream(FILE* stream) : stream_(stream) {}

    bool Read(uint64_t at, void* buffer, size_t n) {
        return MoveTo(at) && Done(std::fread(buffer, 1, n, stream_), n);
    }
    bool Write(uint64_t at, const void* data, size_t n) {
        return MoveTo(at) && Done(std::fwrite(data, 1, n, stream_), n);
    }

private:
    static constexpr uint64_t kUnknown = ~uint64_t{0};

    bool MoveTo(uint64_t at) {
        if (at == position_) return true;
        position_ = kUnknown;
        if (SeekStream(stream_, static_cast<int64_t>(at), SEEK_SET) != 0) return false;
        position_ = at;
        return true;
    }
    bool Done(size_t moved, size_t n) {
        if (moved != n) {
            position_ = kUnknown;
            return false;
        }
        position_ += n;
        return true;
    }

    FILE* stream_;
    uint64_t position_ = kUnknown;
};

constexpr uint16_t kNewSubfileType = 254, kPageNumber = 297;
constexpr uint16_t kBitsPerSample = 258, kCompression = 259;
constexpr uint16_t kJpegInterchange = 513, kJpegInterchangeLength = 514;
constexpr uint16_t kJpegQTables = 519, kJpegDcTables = 520, kJpegAcTables = 521;
constexpr uint16_t kShort = 3, kLong = 4, kDouble = 12, kIfd = 13;
constexpr uint32_t kMaxOffset = std::numeric_limits<uint32_t>::max();

// Values and strips pass through a buffer of this size (a multiple of every
// value size, so that a chunk never splits a value).
constexpr size_t kCopyBufferSize = 64 * 1024;

// Strips that lie in ascending order with gaps of at most kRunGap bytes
// are read together, up to this many bytes a run.
constexpr uint32_t kRunBufferSize = 1024 * 1024;
constexpr uint32_t kRunGap = 4096;

// Kind of directory being copied: the page itself, or one its pointer
// entries lead to (EXIF and GPS from the page, Interoperability from EXIF).
enum class DirKind { Page, Exif, Gps, Interop };

// EXIF, GPS and Interoperability directories a page may have: a real page
// has one of each at most; repeated pointers to one directory share it.
constexpr uint32_t kMostSubDirectories = 64;

constexpr char kUnmovableTables[] =
    "Old-style JPEG tables outside the JPEG interchange data cannot be copied.";

uint64_t Even(uint64_t position) { return position + (position & 1); }


// Width of the numbers a type's values are converted by: 2 or 4 bytes (a
// RATIONAL is two 4-byte numbers); 0 for bytes, which need no conversion.
uint32_t ConversionUnit(uint16_t type) {
    switch (type) {
    case 3: case 8: return 2;
    case 4: case 5: case 9: case 10: case 11: case 13: return 4;
    default: return 0;
    }
}

struct Entry {
    unsigned char raw[12];
    uint16_t tag = 0;
    uint16_t type = 0;
    uint32_t count = 0;
    uint64_t byteSize = 0;  // count x type size
    uint32_t value = 0;     // the value field as a number (an offset when byteSize > 4)
};

// An array of `T` from the job's allocator, taken once by Allocate and
// given back when the array goes.
template <typename T>
class HostArray {
public:
    explicit HostArray(ConversionContext* ctx) : ctx_(ctx) {}
    HostArray(const HostArray&) = delete;
    HostArray& operator=(const HostArray&) = delete;
    ~HostArray() { ReleaseBlock(ctx_, data_); }
    bool Allocate(uint32_t count) {
        if (data_ || count > kMaxOffset / sizeof(T)) return false;
        data_ = static_cast<T*>(AllocateBlock(ctx_, static_cast<uint32_t>((count ? count : 1) * sizeof(T))));
        size_ = data_ ? count : 0;
        return data_ != nullptr;
    }
    bool present() const { return data_ != nullptr; }
    T* data() const { return data_; }
    uint32_t size() const { return size_; }
    T& operator[](uint32_t i) { return data_[i]; }
    T operator[](uint32_t i) const { return data_[i]; }

private:
    ConversionContext* ctx_;
    T* data_ = nullptr;
    uint32_t size_ = 0;
};

using NumberArray = HostArray<uint32_t>;
using ByteBuffer = HostArray<unsigned char>;

class PageCopier {
public:
    PageCopier(ConversionContext* ctx, FILE* source, uint64_t sourceSize, ByteOrder sourceOrder,
               FILE* dest, ByteOrder destOrder, const PageCopyOptions& options)
        : ctx_(ctx), source_(source), sourceSize_(sourceSize), in_(ctx, sourceOrder),
          destFile_(dest), dest_(dest), out_(ctx, destOrder), options_(options), offsets_(ctx),
          byteCounts_(ctx), newOffsets_(ctx), runIn_(ctx), runOut_(ctx) {}

    int Copy(uint32_t ifd, uint32_t position, PageCopyResult* result) {
        // What a page copy writes comes from the source, a few pad bytes and
        // widened offsets aside: a page that would write much more than the
        // source holds refers to the same data over and over.
        budget_ = std::min<uint64_t>(kMaxOffset, uint64_t{position} + 3 * sourceSize_ + 65536);
        uint64_t bound = position;
        if (!Inspect(ifd, DirKind::Page, &bound)) return 0;
        data_ = position;
        if (!WriteDirectory(ifd, position, DirKind::Page, result)) return 0;
        if (std::fflush(destFile_) != 0) return Fail("Unable to write to destination file.");
        result->dataEnd = static_cast<uint32_t>(data_);
        return 1;
    }

private:
    // ------------------------------------------------------------ checking

    int Fail(const char* message) {
        zanError(ctx_, message);
        return 0;
    }

    // Reads the directory at `ifd` at once: its entry count into `count`,
    // its entries and next-directory link into `image`. Reports `beyond`
    // when the directory does not lie wholly inside the source.
    bool LoadDirectory(uint32_t ifd, ByteBuffer& image, uint16_t* count, const char* beyond) {
        unsigned char bytes[2];
        if (uint64_t{ifd} + 2 > sourceSize_ || !source_.Read(ifd, bytes, 2)) return Fail(beyond);
        *count = in_.Get16(bytes);
        const uint32_t size = 12u * *count + 4;
        if (uint64_t{ifd} + 2 + size > sourceSize_) return Fail(beyond);
        if (!image.Allocate(size)) return Fail("Memory allocation error.");
        return source_.Read(uint64_t{ifd} + 2, image.data(), size) || Fail(beyond);
    }

    // Entry `index` of a directory loaded by LoadDirectory.
    Entry EntryAt(const ByteBuffer& image, uint32_t index) const {
        Entry e;
        std::memcpy(e.raw, image.data() + 12u * index, 12);
        e.tag = in_.Get16(e.raw);
        e.type = in_.Get16(e.raw + 2);
        e.count = in_.Get32(e.raw + 4);
        e.byteSize = uint64_t{e.count} * TiffTypeSize(e.type);
        e.value = in_.Get32(e.raw + 8);
        return e;
    }

    static bool IsOffsets(const Entry& e) { return e.tag == kStripOffsets || e.tag == kTileOffsets; }
    static bool IsByteCounts(const Entry& e) {
        return e.tag == kStripByteCounts || e.tag == kTileByteCounts;
    }

    // The directory an entry of a `kind` directory points to, if the entry
    // is such a pointer.
    bool SubDirectoryOf(DirKind kind, const Entry& e, DirKind* sub) const {
        if (e.count != 1 || (e.type != kLong && e.type != kIfd) || e.value == 0) return false;
        if (kind == DirKind::Page && e.tag == kExifIfd) *sub = DirKind::Exif;
        else if (kind == DirKind::Page && e.tag == kGpsIfd) *sub = DirKind::Gps;
        else if (kind == DirKind::Exif && e.tag == kInteropIfd) *sub = DirKind::Interop;
        else return false;
        return true;
    }

    // Loads the SHORT or LONG numbers of `e` (strip offsets, byte counts,
    // ...) into `array`: from the entry when they fit in it, else from the
    // source, widened to 32 bits; adds them to `total` when given.
    bool LoadNumbers(const Entry& e, NumberArray& array, uint64_t* total = nullptr) {
        // The numbers must be in the file before memory is taken for them.
        if (e.byteSize > 4 && uint64_t{e.value} + e.byteSize > sourceSize_)
            return Fail("Source value lies beyond the end of the file.");
        if (!array.Allocate(e.count)) return Fail("Memory allocation error.");
        const uint32_t width = e.type == kShort ? 2 : 4;
        if (e.byteSize <= 4) {
            for (uint32_t i = 0; i < e.count && i < 4 / width; ++i)
                array[i] = width == 2 ? in_.Get16(e.raw + 8 + 2 * i) : in_.Get32(e.raw + 8);
        } else {
            unsigned char chunk[kCopyBufferSize];
            for (uint32_t i = 0; i < e.count;) {
                const uint32_t n = std::min<uint32_t>(e.count - i, kCopyBufferSize / width);
                if (!source_.Read(uint64_t{e.value} + uint64_t{i} * width, chunk, n * width))
                    return Fail("Source value lies beyond the end of the file.");
                for (uint32_t k = 0; k < n; ++k, ++i)
                    array[i] = width == 2 ? in_.Get16(chunk + 2 * k) : in_.Get32(chunk + 4 * k);
            }
        }
        if (total)
            for (uint32_t i = 0; i < e.count; ++i) *total += array[i];
        return true;
    }

    // The strip-count rule shared by offsets and byte counts: the first of
    // the two entries sets the count, the second must agree.
    bool TakeStripCount(const Entry& e, const char* mismatch) {
        if (stripCountKnown_ && e.count != stripCount_) return Fail(mismatch);
        stripCount_ = e.count;
        stripCountKnown_ = true;
        if (e.type != kShort && e.type != kLong) return Fail("Unhandled TIFF value type.");
        return true;
    }

    bool InspectStripEntry(const Entry& e) {
        if (IsOffsets(e)) {
            if (!TakeStripCount(e, "Source num of strips and num of strip size do not match."))
                return false;
            if (offsets_.present()) return Fail("Strip and Tile offsets both present.");
            offsetsType_ = e.type;
            offsetsByteSize_ = e.byteSize;
            return LoadNumbers(e, offsets_);
        }
        if (!TakeStripCount(e, "Source num of strips and num of stripsize do not match."))
            return false;
        if (byteCounts_.present()) return Fail("Strip and Tile byte counts both present.");
        return LoadNumbers(e, byteCounts_, &totalBytes_);
    }

    // Checks the strips once both arrays are known, and adds the offsets
    // array and the image data to the size bound.
    bool InspectStrips(uint64_t* bound) {
        if (offsets_.present() != byteCounts_.present())
            return Fail(offsets_.present() ? "Source page has strip offsets but no byte counts."
                                           : "Source page has strip byte counts but no offsets.");
        if (!offsets_.present()) return true;
        for (uint32_t i = 0; i < stripCount_; ++i)
            if (uint64_t{offsets_[i]} + byteCounts_[i] > sourceSize_)
                return Fail("Source strip data lie beyond the end of the file.");
        // The run buffers need hold no more than the page's data with a pad
        // byte a strip.
        const auto runSize = static_cast<uint32_t>(
            std::min<uint64_t>(kRunBufferSize, totalBytes_ + uint64_t{stripCount_} + 1));
        if (!newOffsets_.Allocate(stripCount_) || !runIn_.Allocate(runSize) || !runOut_.Allocate(runSize))
            return Fail("Memory allocation error.");
        return Grow(bound, 4 * uint64_t{stripCount_} + 1 + totalBytes_ + stripCount_);
    }

    // Adds `bytes` (at an even offset) to the destination's size bound;
    // false (reported) once the bound passes what the page may write.
    bool Grow(uint64_t* bound, uint64_t bytes) {
        *bound = Even(*bound) + bytes;
        if (*bound <= budget_) return true;
        return Fail(*bound > kMaxOffset ? "Destination would exceed 4 GiB."
                                        : "Source page refers to the same data too many times.");
    }

    // The sub-directory `offset` of `kind` met before in this page, or null.
    // Each is inspected and written once, whatever number of entries point
    // at it.
    struct SubDirectory {
        uint32_t source;
        DirKind kind;
        uint32_t dest;  // 0 until written
    };
    SubDirectory* FindSubDirectory(uint32_t offset, DirKind kind) {
        for (uint32_t i = 0; i < subDirectoryCount_; ++i)
            if (subDirectories_[i].source == offset && subDirectories_[i].kind == kind) return &subDirectories_[i];
        return nullptr;
    }

    bool InspectSubDirectory(uint32_t offset, DirKind kind, uint64_t* bound) {
        if (FindSubDirectory(offset, kind)) return true;
        if (subDirectoryCount_ == kMostSubDirectories)
            return Fail("Source page has too many EXIF, GPS or Interoperability directories.");
        subDirectories_[subDirectoryCount_++] = SubDirectory{offset, kind, 0};
        return Inspect(offset, kind, bound);
    }

    // Types the copy can take: every known type, and IFD (13) for the
    // pointers it relocates, or anywhere when asked to (extraction copies
    // other IFD fields as the numbers they are).
    bool TypeAccepted(DirKind kind, const Entry& e) const {
        if (TiffTypeSize(e.type) == 0) return false;
        DirKind sub;
        return e.type != kIfd || options_.acceptIfdType || SubDirectoryOf(kind, e, &sub);
    }

    // Fields that hold file offsets the copy does not relocate would point
    // into the wrong place of the destination: such pages are refused.
    bool CheckOffsetFields(const Entry& e) {
        if (e.tag == kSubIfds) return Fail("Pages with SubIFDs cannot be copied.");
        if (e.tag == kJpegInterchange) {
            if (e.count != 1 || (e.type != kLong && e.type != kIfd) || e.value == 0 || e.value >= sourceSize_)
                return Fail("Source value lies beyond the end of the file.");
            jpegBlockAt_ = e.value;
        } else if (e.tag == kJpegInterchangeLength && e.count == 1 && (e.type == kLong || e.type == kShort)) {
            jpegBlockLength_ = e.type == kLong ? e.value : in_.Get16(e.raw + 8);
        } else if (e.tag == kJpegQTables || e.tag == kJpegDcTables || e.tag == kJpegAcTables) {
            if (e.type != kLong || e.count == 0 || tableEntryCount_ == 3) return Fail(kUnmovableTables);
            tableEntries_[tableEntryCount_++] = e;
        }
        return true;
    }

    // The old-style JPEG data (JPEGInterchangeFormat) is copied as one
    // block: its length, or up to the first strip behind it when the page
    // gives none (libtiff then reads to the end of the file, and only as far
    // as the scan header). Its tables must lie inside it, so that they move
    // with it.
    bool InspectJpegBlock(uint64_t* bound) {
        if (jpegBlockAt_ == 0) return tableEntryCount_ == 0 || Fail(kUnmovableTables);
        uint64_t end = sourceSize_;
        if (jpegBlockLength_ != 0) end = std::min<uint64_t>(end, uint64_t{jpegBlockAt_} + jpegBlockLength_);
        else
            for (uint32_t i = 0; i < stripCount_ && offsets_.present(); ++i)
                if (offsets_[i] > jpegBlockAt_) end = std::min<uint64_t>(end, offsets_[i]);
        jpegBlockLength_ = static_cast<uint32_t>(end - jpegBlockAt_);
        for (uint32_t t = 0; t < tableEntryCount_; ++t) {
            NumberArray tables(ctx_);
            if (!LoadNumbers(tableEntries_[t], tables)) return false;
            for (uint32_t i = 0; i < tables.size(); ++i)
                if (tables[i] < jpegBlockAt_ || tables[i] >= end) return Fail(kUnmovableTables);
        }
        return Grow(bound, jpegBlockLength_);
    }

    // First pass over a directory: every check, no writing.
    bool Inspect(uint32_t ifd, DirKind kind, uint64_t* bound) {
        uint16_t count = 0;
        ByteBuffer directory(ctx_);
        if (!LoadDirectory(ifd, directory, &count, "Source directory lies beyond the end of the file."))
            return false;
        if (!Grow(bound, 2 + 12u * uint64_t{count} + 4)) return false;
        for (uint32_t i = 0; i < count; ++i) {
            const Entry e = EntryAt(directory, i);
            if (!TypeAccepted(kind, e)) return Fail("Unhandled TIFF TYPE.");
            if (kind == DirKind::Page && (IsOffsets(e) || IsByteCounts(e)) && !InspectStripEntry(e))
                return false;
            if (kind == DirKind::Page && (!NoteSampleLayout(e) || !CheckOffsetFields(e))) return false;
            DirKind sub;
            if (e.byteSize <= 4 && SubDirectoryOf(kind, e, &sub)) {
                if (!InspectSubDirectory(e.value, sub, bound)) return false;
            } else if (e.byteSize > 4 && !(kind == DirKind::Page && IsOffsets(e))) {
                if (uint64_t{e.value} + e.byteSize > sourceSize_)
                    return Fail("Source value lies beyond the end of the file.");
                if (options_.convertByteOrder && e.type == kDouble) return Fail("Unhandled type.");
                if (!Grow(bound, e.byteSize)) return false;
            }
        }
        return kind != DirKind::Page || (InspectStrips(bound) && InspectJpegBlock(bound) && ChooseSampleSwap());
    }

    // Remembers the page's BitsPerSample (all values must agree when they
    // are wide) and Compression.
    // Both may be stored as SHORT or as LONG.
    bool NoteSampleLayout(const Entry& e) {
        const bool number = e.type == kShort || e.type == kLong;
        if (e.tag == kCompression && number && e.count == 1) {
            compression_ = e.type == kShort ? in_.Get16(e.raw + 8) : e.value;
        } else if (e.tag == kBitsPerSample && number && e.count > 0) {
            NumberArray bits(ctx_);
            if (!LoadNumbers(e, bits)) return false;
            bitsPerSample_ = bits[0];
            for (uint32_t i = 1; i < e.count; ++i)
                if (bits[i] != bits[0]) mixedBits_ = true;
        }
        return true;
    }

    // Samples of 16, 24, 32 and 64 bits (and 128-bit complex samples, as two
    // 64-bit halves) are stored in the file's byte order, as readers swap
    // them. Changing the order swaps them in uncompressed data; compressed
    // data would have to be decoded, so such a page is refused.
    bool ChooseSampleSwap() {
        if (!options_.convertByteOrder || in_.order() == out_.order()) return true;
        uint32_t unit = 0;
        switch (bitsPerSample_) {
        case 16: unit = 2; break;
        case 24: unit = 3; break;
        case 32: unit = 4; break;
        case 64: case 128: unit = 8; break;
        default: return true;
        }
        if (compression_ != 1 || mixedBits_)
            return Fail("Page samples of more than 8 bits cannot change byte order without decoding.");
        sampleSwapUnit_ = unit;
        return true;
    }

    // ------------------------------------------------------------ writing

    bool WriteAt(uint64_t position, const void* data, size_t n) {
        if (!dest_.Write(position, data, n)) return Fail("Unable to write to destination file.");
        return true;
    }

    // Converts whole values of `type` in `bytes` from the source order into
    // the destination order.
    void ConvertValues(uint16_t type, unsigned char* bytes, size_t n) const {
        const uint32_t unit = ConversionUnit(type);
        if (!options_.convertByteOrder || unit == 0 || in_.order() == out_.order()) return;
        for (size_t i = 0; i + unit <= n; i += unit) {
            if (unit == 2) out_.Put16(in_.Get16(bytes + i), bytes + i);
            else out_.Put32(in_.Get32(bytes + i), bytes + i);
        }
    }

    // Reverses the bytes of every `unit`-byte sample.
    static void SwapSamples(unsigned char* bytes, size_t n, uint32_t unit) {
        for (size_t i = 0; i + unit <= n; i += unit) std::reverse(bytes + i, bytes + i + unit);
    }

    // Copies n bytes from `from` in the source to the data position,
    // converted as values of `type` (bytes when type is 0), or as image
    // samples of `sampleUnit` bytes (0: copied as they are).
    bool CopyData(uint64_t from, uint64_t n, uint16_t type, uint32_t sampleUnit = 0) {
        unsigned char buffer[kCopyBufferSize];
        // A chunk holds whole samples, so that none is split between chunks.
        const size_t chunkSize = sampleUnit > 1 ? sizeof buffer / sampleUnit * sampleUnit : sizeof buffer;
        for (uint64_t done = 0; done < n;) {
            const size_t chunk = static_cast<size_t>(std::min<uint64_t>(n - done, chunkSize));
            if (!source_.Read(from + done, buffer, chunk)) return Fail("Error reading the source file.");
            ConvertValues(type, buffer, chunk);
            if (sampleUnit > 1) SwapSamples(buffer, chunk, sampleUnit);
            if (!dest_.Write(data_ + done, buffer, chunk))
                return Fail("Unable to write to destination file.");
            done += chunk;
        }
        // The pad byte that keeps the next item on a word boundary is written
        // rather than skipped: a seek on the destination stream would flush
        // and refill its buffer for every odd-sized strip.
        if (n & 1) {
            static const unsigned char kPad = 0;
            if (!dest_.Write(data_ + n, &kPad, 1)) return Fail("Unable to write to destination file.");
        }
        data_ = Even(data_ + n);
        return true;
    }

    // Tag, type and count of an entry in the destination order.
    void PutEntryHead(const Entry& e, uint16_t type, unsigned char* raw) const {
        std::memcpy(raw, e.raw, 12);
        if (!options_.convertByteOrder) {
            if (type != e.type) out_.Put16(type, raw + 2);
            return;
        }
        out_.Put16(e.tag, raw);
        out_.Put16(type, raw + 2);
        out_.Put32(e.count, raw + 4);
    }

    // The entry of a value that lies inside it, as the destination gets it.
    void InlineEntry(const Entry& e, DirKind kind, unsigned char* raw) const {
        PutEntryHead(e, e.type, raw);
        if (kind == DirKind::Page && options_.markStandalone) {
            if (e.tag == kNewSubfileType) {
                std::memset(raw + 8, 0, 4);
                return;
            }
            if (e.tag == kPageNumber && e.type == kShort) {
                out_.Put16(0, raw + 8);
                out_.Put16(1, raw + 10);
                return;
            }
        }
        if (!options_.convertByteOrder) return;
        const uint32_t unit = ConversionUnit(e.type);
        if (unit == 2) {
            out_.Put16(in_.Get16(e.raw + 8), raw + 8);
            if (e.byteSize == 4) out_.Put16(in_.Get16(e.raw + 10), raw + 10);
        } else if (unit == 4 && e.byteSize == 4) {
            out_.Put32(e.value, raw + 8);
        }
    }

    // Writes the directory at `ifd` to `at` (even) with everything it holds;
    // data_ must lie at or behind the directory's end. The directory is
    // composed in memory and written last, in one piece, after its values,
    // the directories it points to and (for a page) the strips.
    bool WriteDirectory(uint32_t ifd, uint32_t at, DirKind kind, PageCopyResult* result) {
        uint16_t count = 0;
        ByteBuffer source(ctx_), image(ctx_);
        if (!LoadDirectory(ifd, source, &count, "Error reading the source file.")) return false;
        const uint32_t entriesSize = 12u * count;
        if (!image.Allocate(2 + entriesSize + 4)) return Fail("Memory allocation error.");
        unsigned char* const entries = image.data() + 2;
        out_.Put16(count, image.data());
        std::memset(entries + entriesSize, 0, 4);  // the copy ends its own chain
        data_ = std::max<uint64_t>(data_, uint64_t{at} + 2 + entriesSize + 4);
        Entry offsetsEntry;
        unsigned char* offsetsRaw = nullptr;
        // The old-style JPEG data goes first, so that the entries that point
        // into it know its new place.
        if (kind == DirKind::Page && jpegBlockAt_ != 0) {
            jpegBlockDest_ = static_cast<uint32_t>(data_);
            if (!CopyData(jpegBlockAt_, jpegBlockLength_, 0)) return false;
        }
        for (uint32_t i = 0; i < count; ++i) {
            const Entry e = EntryAt(source, i);
            unsigned char* const raw = entries + 12u * i;
            DirKind sub;
            if (kind == DirKind::Page && IsOffsets(e)) {
                offsetsEntry = e;
                offsetsRaw = raw;  // filled in once the strips have their places
            } else if (e.byteSize <= 4 && SubDirectoryOf(kind, e, &sub)) {
                uint32_t subAt = 0;
                if (!WriteSubDirectory(e.value, sub, &subAt)) return false;
                PutEntryHead(e, e.type, raw);
                out_.Put32(subAt, raw + 8);
            } else if (kind == DirKind::Page && IsJpegOffset(e)) {
                if (!WriteJpegOffsets(e, raw)) return false;
            } else if (e.byteSize <= 4) {
                InlineEntry(e, kind, raw);
            } else {
                const uint64_t valueAt = data_;
                if (!CopyData(e.value, e.byteSize, e.type)) return false;
                PutEntryHead(e, e.type, raw);
                out_.Put32(static_cast<uint32_t>(valueAt), raw + 8);
            }
        }
        if (kind == DirKind::Page) {
            result->nextIfd = in_.Get32(source.data() + entriesSize);
            result->nextIfdField = at + 2 + entriesSize;
            if (offsetsRaw && !WriteStrips(offsetsEntry, offsetsRaw)) return false;
        }
        return WriteAt(at, image.data(), 2 + entriesSize + 4);
    }

    // Writes the sub-directory at `offset` once: later entries pointing at
    // it get the place it was written to.
    bool WriteSubDirectory(uint32_t offset, DirKind kind, uint32_t* at) {
        SubDirectory* sub = FindSubDirectory(offset, kind);
        if (sub && sub->dest != 0) {
            *at = sub->dest;
            return true;
        }
        data_ = Even(data_);
        *at = static_cast<uint32_t>(data_);
        if (sub) sub->dest = *at;
        return WriteDirectory(offset, *at, kind, nullptr);
    }

    static bool IsJpegOffset(const Entry& e) {
        return e.tag == kJpegInterchange || e.tag == kJpegQTables || e.tag == kJpegDcTables ||
               e.tag == kJpegAcTables;
    }

    // JPEGInterchangeFormat and the old-style tables, moved with the JPEG
    // data: one offset in the entry, or an array of them at the data
    // position (all LONG).
    bool WriteJpegOffsets(const Entry& e, unsigned char* raw) {
        NumberArray numbers(ctx_);
        if (!LoadNumbers(e, numbers)) return false;
        for (uint32_t i = 0; i < numbers.size(); ++i) numbers[i] = numbers[i] - jpegBlockAt_ + jpegBlockDest_;
        PutEntryHead(e, e.type, raw);
        if (numbers.size() == 1) {
            out_.Put32(numbers[0], raw + 8);
            return true;
        }
        const uint64_t arrayAt = data_;
        out_.Put32(static_cast<uint32_t>(arrayAt), raw + 8);
        if (!WriteNumbers(arrayAt, numbers.data(), numbers.size(), 4)) return false;
        data_ = Even(data_ + 4 * uint64_t{numbers.size()});
        return true;
    }

    // Gives every strip its place behind the data position, each at an
    // even offset, writes the offsets (inline in `raw`, the offsets entry,
    // or as an array ahead of the strips) and copies the strips. SHORT
    // offsets become LONG when the new ones might not fit in 16 bits.
    bool WriteStrips(const Entry& e, unsigned char* raw) {
        uint16_t type = offsetsType_;
        uint64_t byteSize = offsetsByteSize_;
        if (type == kShort && data_ + 4 * (uint64_t{stripCount_} + 128) + totalBytes_ > 65535) {
            type = kLong;
            byteSize *= 2;
        }
        const uint64_t arrayAt = data_;
        uint64_t place = byteSize > 4 ? Even(data_ + byteSize) : data_;
        for (uint32_t i = 0; i < stripCount_; ++i) {
            newOffsets_[i] = static_cast<uint32_t>(place);
            place = Even(place + byteCounts_[i]);
        }
        PutEntryHead(e, type, raw);
        const uint32_t width = type == kShort ? 2 : 4;
        if (byteSize > 4) {
            out_.Put32(static_cast<uint32_t>(arrayAt), raw + 8);
            if (!WriteNumbers(arrayAt, newOffsets_.data(), stripCount_, width)) return false;
            data_ = Even(data_ + byteSize);
        } else {
            for (uint32_t i = 0; i < stripCount_ && i < 4 / width; ++i) {
                if (width == 2) out_.Put16(static_cast<uint16_t>(newOffsets_[i]), raw + 8 + 2 * i);
                else out_.Put32(newOffsets_[i], raw + 8);
            }
        }
        return CopyStrips();
    }

    // Copies the strips in index order to the places WriteStrips gave them
    // (from the data position on, each at an even offset). Strips that lie close together in ascending order are
    // read as one run and written, with their pad bytes, as one piece, so
    // that a page of many small strips costs a few large reads and writes
    // rather than several stream calls a strip. A strip too large for the
    // buffers goes through CopyData on its own.
    bool CopyStrips() {
        for (uint32_t i = 0; i < stripCount_;) {
            if (uint64_t{byteCounts_[i]} + 1 > runOut_.size()) {
                if (!CopyData(offsets_[i], byteCounts_[i], 0, sampleSwapUnit_)) return false;
                ++i;
                continue;
            }
            const uint32_t end = RunEnd(i);
            if (!CopyRun(i, end)) return false;
            i = end;
        }
        return true;
    }

    // The strip after the last of the run that starts at strip `first`.
    uint32_t RunEnd(uint32_t first) const {
        const uint64_t start = offsets_[first];
        uint64_t readEnd = start + byteCounts_[first];
        uint64_t written = Even(byteCounts_[first]);
        uint32_t next = first + 1;
        for (; next < stripCount_; ++next) {
            const uint64_t at = offsets_[next], size = byteCounts_[next];
            if (at < readEnd || at - readEnd > kRunGap) break;
            if (at + size - start > runIn_.size() || written + Even(size) > runOut_.size()) break;
            readEnd = at + size;
            written += Even(size);
        }
        return next;
    }

    bool CopyRun(uint32_t first, uint32_t end) {
        const uint64_t start = offsets_[first];
        const uint64_t readSize = uint64_t{offsets_[end - 1]} + byteCounts_[end - 1] - start;
        if (!source_.Read(start, runIn_.data(), static_cast<size_t>(readSize)))
            return Fail("Error reading the source file.");
        const uint64_t runAt = data_;
        unsigned char* out = runOut_.data();
        for (uint32_t i = first; i < end; ++i) {
            const uint32_t size = byteCounts_[i];
            std::memcpy(out, runIn_.data() + (offsets_[i] - start), size);
            if (sampleSwapUnit_ > 1) SwapSamples(out, size, sampleSwapUnit_);
            if (size & 1) out[size] = 0;  // the pad byte, written rather than skipped
            out += Even(size);
            data_ = Even(data_ + size);
        }
        return WriteAt(runAt, runOut_.data(), static_cast<size_t>(data_ - runAt));
    }

    // Writes `count` numbers at `at`, each `width` (2 or 4) bytes in the
    // destination order.
    bool WriteNumbers(uint64_t at, const uint32_t* numbers, uint32_t count, uint32_t width) {
        unsigned char buffer[kCopyBufferSize];
        for (uint32_t i = 0; i < count;) {
            const uint32_t n = std::min<uint32_t>(count - i, kCopyBufferSize / width);
            for (uint32_t k = 0; k < n; ++k) {
                if (width == 2) out_.Put16(static_cast<uint16_t>(numbers[i + k]), buffer + 2 * k);
                else out_.Put32(numbers[i + k], buffer + 4 * k);
            }
            if (!WriteAt(at + uint64_t{i} * width, buffer, n * width)) return false;
            i += n;
        }
        return true;
    }

    ConversionContext* ctx_;
    TrackedStream source_;
    uint64_t sourceSize_;
    ByteOrderAccess in_;
    FILE* destFile_;
    TrackedStream dest_;
    ByteOrderAccess out_;
    PageCopyOptions options_;

    NumberArray offsets_, byteCounts_, newOffsets_;
    ByteBuffer runIn_, runOut_;  // strip runs as read and as written
    uint32_t stripCount_ = 0;
    bool stripCountKnown_ = false;
    uint16_t offsetsType_ = 0;
    uint64_t offsetsByteSize_ = 0;
    uint64_t totalBytes_ = 0;
    uint64_t data_ = 0;  // next free destination offset (D)
    uint32_t compression_ = 1;      // Compression of the page (1 when absent)
    uint32_t bitsPerSample_ = 1;    // first BitsPerSample value (1 when absent)
    bool mixedBits_ = false;        // BitsPerSample values differ
    uint32_t sampleSwapUnit_ = 0;   // bytes per image sample to reverse (0: none)
    uint64_t budget_ = kMaxOffset;  // the most the destination may grow to for this page
    SubDirectory subDirectories_[kMostSubDirectories] = {};
    uint32_t subDirectoryCount_ = 0;
    uint32_t jpegBlockAt_ = 0;      // old-style JPEG data in the source (0: none)
    uint32_t jpegBlockLength_ = 0;
    uint32_t jpegBlockDest_ = 0;    // ... and in the destination
    Entry tableEntries_[3];         // old-style JPEG tables, which point into that data
    uint32_t tableEntryCount_ = 0;
};

}  // namespace

int copyTiffPage(ConversionContext* ctx, FILE* source, uint64_t sourceSize, uint32_t ifd,
                 ByteOrder sourceOrder, FILE* dest, uint32_t position, ByteOrder destOrder,
                 const PageCopyOptions& options, PageCopyResult* result) {
    PageCopier copier(ctx, source, sourceSize, sourceOrder, dest, destOrder, options);
    return copier.Copy(ifd, position, result);
}

}  // namespace zan
