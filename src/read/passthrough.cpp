// Compressed strips delivered as they are, and JPEG strips joined into one
// JPEG stream without decoding a byte.

#include "read/passthrough.h"

#include <algorithm>
#include <cstring>

#include "frame/host_memory.h"
#include "frame/report.h"
#include "osttiff/osttiff.h"
#include "pivlo/pivlo.h"
#include "read/raw_delivery.h"
#include "zantiff/conversion_context.h"

namespace zan {
namespace {

// Adobe APP14, version 100, no flags, transform 0: the three components
// are RGB, not YCbCr.
constexpr uint8_t kAdobeSegment[16] = {0xFF, 0xEE, 0x00, 0x0E, 'A', 'd', 'o', 'b', 'e', 0x00, 0x64, 0x00, 0x00, 0x00, 0x00, 0x00};

ConversionContext* JobOf(TIFF* tif) { return static_cast<ConversionContext*>(TIFFGetContextPivlo(tif)); }

// The strip buffer: grown with the job's reallocProc to the largest strip
// seen, released with the object.
class StripBuffer {
public:
    explicit StripBuffer(ConversionContext* ctx) : ctx_(ctx) {}
    StripBuffer(const StripBuffer&) = delete;
    StripBuffer& operator=(const StripBuffer&) = delete;
    ~StripBuffer() { ReleaseBlock(ctx_, data_); }

    // Reads strip `strip` of `size` bytes. False after a reported failure
    // (the codec reports a failed read).
    bool Read(TIFF* tif, uint32_t strip, uint32_t size) {
        if (size > capacity_) {
            void* grown = !data_ ? AllocateBlock(ctx_, size)
                                 : ctx_->reallocProc ? ctx_->reallocProc(data_, size) : nullptr;
            if (!grown) return ReportError(ctx_, "Memory realloc error.");
            data_ = static_cast<uint8_t*>(grown);
            capacity_ = size;
        }
        return size == 0 || TIFFReadRawStrip(tif, strip, data_, size) == static_cast<tmsize_t>(size);
    }
    uint8_t* data() const { return data_; }

private:
    ConversionContext* ctx_;
    uint8_t* data_ = nullptr;
    uint32_t capacity_ = 0;
};

// The byte counts of every strip, each no larger than the source (a strip
// that claims more is not in the file), and their sum.
bool StripSizes(ConversionContext* ctx, TIFF* tif, uint32_t strips, uint64_t* total) {
    const uint64_t source = TIFFClientSizePivlo(tif);
    *total = 0;
    for (uint32_t i = 0; i < strips; ++i) {
        uint32_t count = 0;
        if (!TIFFGetStrileByteCount32(tif, i, &count) || (source && count > source))
            return ReportError(ctx, "Source strip data lie beyond the end of the file.");
        *total += count;
    }
    return true;
}

uint32_t StripSize(TIFF* tif, uint32_t strip) {
    uint32_t count = 0;
    TIFFGetStrileByteCount32(tif, strip, &count);
    return count;
}

uint16_t Big16(const uint8_t* p) { return static_cast<uint16_t>(p[0] << 8 | p[1]); }

// True when the stream's headers (from SOI up to SOS) hold an Adobe APP14.
bool HasAdobeSegment(const uint8_t* data, uint32_t size) {
    for (uint32_t at = 2; at + 4 <= size && data[at] == 0xFF;) {
        const uint8_t marker = data[at + 1];
        if (marker == 0xDA || marker == 0xD9) break;
        const uint32_t length = Big16(data + at + 2);
        if (marker == 0xEE && length >= 7 && at + 9 <= size && std::memcmp(data + at + 4, "Adobe", 5) == 0) return true;
        at += 2 + length;
    }
    return false;
}

}  // namespace

int extractSingleStrip(TIFF* tif, uint32_t reverse, bool adobeSegment) {
    ConversionContext* ctx = JobOf(tif);
    const uint32_t strips = TIFFNumberOfStrips(tif);
    uint64_t total = 0;
    if (!StripSizes(ctx, tif, strips, &total)) return 0;
    // The first strip is read before the destination is prepared, so that
    // a memory block is exactly the size delivered.
    StripBuffer buffer(ctx);
    const uint32_t first = strips ? StripSize(tif, 0) : 0;
    if (strips && !buffer.Read(tif, 0, first)) return 0;
    if (reverse) zanByteReverseBuffer(ctx, buffer.data(), first);
    const bool insertAdobe = adobeSegment && first >= 2 && !HasAdobeSegment(buffer.data(), first);
    RawDelivery out(ctx);
    if (!out.Begin(total + (insertAdobe ? sizeof kAdobeSegment : 0), "Memory allocation error.")) return 0;
    for (uint32_t i = 0; i < strips; ++i) {
        const uint32_t size = StripSize(tif, i);
        if (i > 0) {
            if (!buffer.Read(tif, i, size)) return 0;
            if (reverse) zanByteReverseBuffer(ctx, buffer.data(), size);
        }
        uint32_t from = 0;
        if (i == 0 && insertAdobe) {
            if (!out.Write(buffer.data(), 2) || !out.Write(kAdobeSegment, sizeof kAdobeSegment)) return 0;
            from = 2;
        }
        if (!out.Write(buffer.data() + from, size - from)) return 0;
    }
    out.Finish();
    zanTrace(ctx, "Converted w/o decompression; single strip.", 1);
    return 1;
}

namespace {

// The join of one page, strip by strip.
class JpegJoin {
public:
    JpegJoin(TIFF* tif, uint32_t* directConversion)
        : tif_(tif), ctx_(JobOf(tif)), direct_(directConversion), out_(ctx_), strip_(ctx_) {}

    int Run();

private:
    // A soft failure: the page is decoded instead. What was delivered goes.
    int Decline(const char* reason) {
        *direct_ = 0;
        zanTrace(ctx_, reason, 1);
        return 1;
    }

    // Walks the headers of strip `index` (`data`, `size` bytes) up to its
    // scan; `*at` ends where the strip's output begins, `*scan` where its
    // entropy-coded data begins. Null, or the reason the join is not
    // possible.
    const char* WalkHeaders(uint32_t index, uint8_t* data, uint32_t size, uint32_t* at, uint32_t* scan);
    const char* CheckFrameHeader(uint32_t rowsPerStrip, uint32_t strips);
    bool WriteFrameHeader(uint32_t strips);
    void Renumber(uint8_t* data, uint32_t from, uint32_t size);

    TIFF* tif_;
    ConversionContext* ctx_;
    uint32_t* direct_;
    RawDelivery out_;
    StripBuffer strip_;
    uint8_t sof_[2 + 65535] = {};  // the first strip's frame header
    uint32_t sofLength_ = 0;       // its L (0: none seen)
    uint32_t pageInterval_ = 0;    // restart interval of the page
    uint32_t recentInterval_ = 0;  // of the last DRI segment seen
    bool stripHadDri_ = false;
    uint32_t counter_ = 0;         // restart markers so far, over all strips
    uint32_t imageWidth_ = 0, imageLength_ = 0;
};

constexpr char kUnexpectedMarker[] = "Conversion w/o decompression failed : unexpected jpeg marker.";
constexpr char kPastStrip[] = "Conversion w/o decompression failed: headers run past the strip.";
constexpr char kInvalidSof[] = "Conversion w/o decompression failed: invalid SOF.";

const char* JpegJoin::WalkHeaders(uint32_t index, uint8_t* data, uint32_t size, uint32_t* at, uint32_t* scan) {
    uint32_t cursor = 0;
    const bool first = index == 0;
    while (cursor < size && data[cursor] == 0xFF) {
        if (cursor + 2 > size) return kPastStrip;
        const uint8_t code = data[cursor + 1];
        if (code == 0xD8) {
            cursor += 2;
            continue;
        }
        if (code == 0x00) break;
        if (cursor + 4 > size) return kPastStrip;
        const uint32_t length = Big16(data + cursor + 2);
        if (length < 2 || cursor + 2 + length > size) return kPastStrip;
        if (code == 0xC0) {
            if (first) {
                sofLength_ = length;
                std::memcpy(sof_, data + cursor, 2 + length);
                const uint32_t components = length >= 8 ? sof_[9] : 0;
                if (components == 0 || length < 8 + 3 * components) return kInvalidSof;
            } else if (length != sofLength_) {
                return "Conversion w/o decompression failed: SOFs of different lengths. Will retry.";
            }
        } else if (code == 0xDD) {
            if (length != 4) return kPastStrip;
            recentInterval_ = Big16(data + cursor + 4);
            if (first) {
                pageInterval_ = recentInterval_;
                stripHadDri_ = true;
            } else if (recentInterval_ != pageInterval_) {
                return "Conversion w/o decompression failed: inconsistent DRI's.";
            }
        } else if (code == 0xDA) {
            // The scan must hold every component of the frame, interleaved.
            if (length < 3 || sofLength_ < 8 || data[cursor + 4] != sof_[9])
                return "Conversion w/o decompression failed: scan does not hold every component.";
            *at = first ? cursor : cursor + 2 + length;
            *scan = cursor + 2 + length;
            return nullptr;
        } else if (code < 0xE0 || code > 0xEF) {
            return kUnexpectedMarker;
        }
        cursor += 2 + length;
    }
    *at = *scan = cursor;
    return nullptr;
}

void JpegJoin::Renumber(uint8_t* data, uint32_t from, uint32_t size) {
    for (uint32_t i = from; i + 1 < size; ++i) {
        if (data[i] != 0xFF) continue;
        if (data[i + 1] >= 0xD0 && data[i + 1] <= 0xD7) data[i + 1] = static_cast<uint8_t>(0xD0 + counter_++ % 8);
        ++i;  // the byte after every FF is stepped over
    }
}

// Checks the first strip's frame header against the page and works out the
// restart interval: every strip must be a whole number of intervals. The
// MCU follows ITU-T T.81: 8 x 8 for one component, else 8 Hmax wide and
// 8 Vmax high.
const char* JpegJoin::CheckFrameHeader(uint32_t rowsPerStrip, uint32_t strips) {
    if (sofLength_ == 0) return "Conversion w/o decompression failed: no SOF.";
    const uint32_t components = sof_[9];
    if (Big16(sof_ + 7) != imageWidth_) return "Conversion w/o decompression failed: SOF width differs from the page's.";
    uint32_t hMax = 0, vMax = 0;
    for (uint32_t c = 0; c < components; ++c) {
        const uint8_t factors = sof_[10 + 3 * c + 1];
        const uint32_t h = factors >> 4, v = factors & 15;
        if (h == 0 || v == 0) return kInvalidSof;
        hMax = std::max(hMax, h);
        vMax = std::max(vMax, v);
    }
    const uint32_t mcuWidth = components == 1 ? 8 : 8 * hMax, mcuHeight = components == 1 ? 8 : 8 * vMax;
    const uint32_t rows = std::min(rowsPerStrip, imageLength_);
    const uint64_t mcus = uint64_t{(rows + mcuHeight - 1) / mcuHeight} * ((imageWidth_ + mcuWidth - 1) / mcuWidth);
    if (pageInterval_ != 0 && mcus % pageInterval_ != 0)
        return "Conversion w/o decompression failed: number of MDU in strip not multiple of restart interval.";
    if (pageInterval_ == 0) pageInterval_ = static_cast<uint32_t>(std::min<uint64_t>(mcus, 0x10000));
    if (strips > 1 && rowsPerStrip % mcuHeight != 0)
        return "Conversion w/o decompression failed: strip height not multiple of mcu height.";
    if ((strips > 1 || stripHadDri_) && pageInterval_ > 0xFFFF)
        return "Conversion w/o decompression failed: restart interval does not fit 16 bits.";
    return nullptr;
}

// The frame header with the page's height, then the restart interval (one
// strip without one of its own needs none).
bool JpegJoin::WriteFrameHeader(uint32_t strips) {
    sof_[5] = static_cast<uint8_t>(imageLength_ >> 8);
    sof_[6] = static_cast<uint8_t>(imageLength_);
    if (!out_.Write(sof_, 2 + sofLength_)) return false;
    if (strips == 1 && !stripHadDri_) return true;
    const uint8_t dri[6] = {0xFF, 0xDD, 0x00, 0x04, static_cast<uint8_t>(pageInterval_ >> 8),
                            static_cast<uint8_t>(pageInterval_)};
    return out_.Write(dri, sizeof dri);
}

int JpegJoin::Run() {
    *direct_ = 1;
    const uint32_t strips = TIFFNumberOfStrips(tif_);
    uint32_t tablesSize = 0;
    const uint8_t* tables = nullptr;
    if (!TIFFGetField(tif_, TIFFTAG_JPEGTABLES, &tablesSize, &tables) || !tables || tablesSize < 2 ||
        tables[0] != 0xFF || tables[1] != 0xD8)
        return Decline("Conversion without decompression failed: no jpeg table or no SOI at start.");
    uint16_t photometric = 0, samples = 1;
    uint32_t rowsPerStrip = 0;
    TIFFGetField(tif_, TIFFTAG_PHOTOMETRIC, &photometric);
    TIFFGetFieldDefaulted(tif_, TIFFTAG_SAMPLESPERPIXEL, &samples);
    TIFFGetField(tif_, TIFFTAG_IMAGELENGTH, &imageLength_);
    TIFFGetField(tif_, TIFFTAG_IMAGEWIDTH, &imageWidth_);
    TIFFGetFieldDefaulted(tif_, TIFFTAG_ROWSPERSTRIP, &rowsPerStrip);
    if (TIFFIsTiled(tif_)) return Decline("Conversion w/o decompression failed: the page is tiled.");
    if (imageLength_ == 0 || imageLength_ > 0xFFFF || imageWidth_ == 0 || imageWidth_ > 0xFFFF)
        return Decline("Conversion w/o decompression failed: image size does not fit a JPEG frame.");
    uint64_t total = 0;
    if (!StripSizes(ctx_, tif_, strips, &total)) return 0;
    if (!out_.Begin(uint64_t{tablesSize} + 512 + total, "Memory allocation")) return 0;
    const uint32_t tableBytes = tablesSize >= 4 && tables[tablesSize - 2] == 0xFF && tables[tablesSize - 1] == 0xD9
                                    ? tablesSize - 2
                                    : tablesSize;
    if (!out_.Write(tables, tableBytes)) return 0;
    if (samples == 3 && photometric == PHOTOMETRIC_RGB && !out_.Write(kAdobeSegment, sizeof kAdobeSegment)) return 0;
    for (uint32_t i = 0; i < strips; ++i) {
        const uint32_t size = StripSize(tif_, i);
        // A memory destination takes the strip where its data goes, and
        // the headers are dropped in place; others go through the strip
        // buffer.
        uint8_t* data = out_.Reserve(size);
        if (data ? TIFFReadRawStrip(tif_, i, data, size) != static_cast<tmsize_t>(size) : !strip_.Read(tif_, i, size))
            return 0;
        if (!data) data = strip_.data();
        uint32_t at = 0, scan = 0;
        if (size > 0 && data[0] == 0xFF)
            if (const char* reason = WalkHeaders(i, data, size, &at, &scan)) return Decline(reason);
        if (recentInterval_ != 0) Renumber(data, scan, size);
        if (size < at + 2 || data[size - 2] != 0xFF || data[size - 1] != 0xD9)
            return Decline("Conversion w/o decompression failed: missing expected end jpeg marker.");
        if (i + 1 < strips) data[size - 1] = static_cast<uint8_t>(0xD0 + counter_++ % 8);
        if (i == 0) {
            if (const char* reason = CheckFrameHeader(rowsPerStrip, strips)) return Decline(reason);
            if (data != strip_.data()) {
                // The frame header goes before the strip's data: the strip
                // moves aside in the block first.
                const uint32_t header = 2 + sofLength_ + (strips > 1 || stripHadDri_ ? 6 : 0);
                uint8_t* moved = out_.Reserve(header + size);
                if (!moved) return Decline("Conversion w/o decompression failed: no room for the frame header.");
                std::memmove(moved + header, data, size);
                data = moved + header;
            }
            if (!WriteFrameHeader(strips)) return 0;
        }
        if (data == strip_.data()) {
            if (!out_.Write(data + at, size - at)) return 0;
        } else {
            uint8_t* to = out_.Reserve(size - at);
            std::memmove(to, data + at, size - at);
            out_.Commit(size - at);
        }
    }
    out_.Finish();
    ctx_->outputWidth = imageWidth_;
    ctx_->outputHeight = imageLength_;
    ctx_->outputFormat = samples == 1 ? 2 : 8;
    zanTrace(ctx_, "Converted w/o decompression; multistrip.", 1);
    return 1;
}

}  // namespace

int extractMultistripJPEG(TIFF* tif, uint32_t* directConversion) {
    JpegJoin join(tif, directConversion);
    return join.Run();
}

}  // namespace zan
