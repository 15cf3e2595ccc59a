// The writers on fuzzed descriptions and data: the first bytes describe the
// job (colour space, size, compression, depths, destination, options,
// metadata entries), the rest are the lines. Pages are written through the
// scanline writer or the frame writer, to a growing memory image, a fixed
// buffer or host callbacks; a job that reports success must have produced a
// TIFF the module reads back. Nothing may crash, hang or leak.

#include <cstddef>
#include <cstdint>
#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "fuzz_support.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace {

// Reads description bytes, giving 0 once they run out.
struct Bytes {
    const uint8_t* data;
    size_t size;
    size_t at = 0;
    uint8_t Next() { return at < size ? data[at++] : 0; }
};

struct Sink {
    std::vector<uint8_t> data;
    size_t position = 0;
    static int32_t Write(const void* buffer, int32_t n, void* user) {
        auto* s = static_cast<Sink*>(user);
        if (n <= 0 || s->position + static_cast<size_t>(n) > (16u << 20)) return -1;
        if (s->data.size() < s->position + n) s->data.resize(s->position + n);
        std::memcpy(s->data.data() + s->position, buffer, static_cast<size_t>(n));
        s->position += static_cast<size_t>(n);
        return n;
    }
    static int32_t Read(void* buffer, int32_t n, void* user) {
        auto* s = static_cast<Sink*>(user);
        if (n <= 0 || s->position >= s->data.size()) return 0;
        const size_t count = std::min(static_cast<size_t>(n), s->data.size() - s->position);
        std::memcpy(buffer, s->data.data() + s->position, count);
        s->position += count;
        return static_cast<int32_t>(count);
    }
    static uint32_t Seek(uint32_t offset, int whence, void* user) {
        auto* s = static_cast<Sink*>(user);
        const int64_t base = whence == 0 ? 0 : whence == 1 ? static_cast<int64_t>(s->position)
                                                           : static_cast<int64_t>(s->data.size());
        const int64_t target = base + (whence == 0 ? int64_t{offset} : int64_t{static_cast<int32_t>(offset)});
        if (target < 0 || target > (16 << 20)) return 0xFFFFFFFFu;
        s->position = static_cast<size_t>(target);
        return static_cast<uint32_t>(target);
    }
};

// Metadata entries of fuzzed tags and types (the list owns the blocks).
MetadataList* FuzzedMetadata(Bytes& d) {
    MetadataList* list = pivloCreateMetadataList(nullptr, nullptr);
    const int entries = d.Next() % 6;
    for (int i = 0; i < entries; ++i) {
        MetadataEntry e{};
        e.group = (d.Next() & 1) ? ZAN_METADATA_EXIF : ZAN_METADATA_IMAGE;
        static const uint32_t kTags[] = {270, 282, 283, 296, 305, 306, 315, 321, 336, 340, 34675,
                                         33434, 33437, 34855, 36864, 36867, 37378, 42016, 65000};
        e.tag = kTags[d.Next() % (sizeof kTags / sizeof *kTags)];
        e.type = 1 + d.Next() % 8;
        e.count = d.Next() % 4;
        e.size = d.Next() % 40;
        if (e.type == ZAN_METADATA_BLOCK) {
            e.value.block = list->allocProc(e.size + 1);
            for (uint32_t k = 0; k < e.size; ++k) static_cast<uint8_t*>(e.value.block)[k] = d.Next() | 0x20;
            static_cast<uint8_t*>(e.value.block)[e.size] = 0;
            // Counts never promise more values than the block holds.
            if (e.count * 8u > e.size) e.count = 0;
        } else {
            for (uint8_t& b : e.value.bytes) b = d.Next();
        }
        if (!zanAddToMetadataList(nullptr, list, &e) && e.type == ZAN_METADATA_BLOCK) list->freeProc(e.value.block);
    }
    return list;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    Bytes d{data, size};
    ConversionContext ctx;
    zanfuzz::InitQuietJob(&ctx);
    const uint8_t destination = d.Next() % 3;
    void* image = nullptr;
    uint32_t imageSize = 0;
    std::vector<uint8_t> fixed(64 * 1024);
    Sink sink;
    if (destination == 0) {
        ctx.destKind = ZAN_DEST_MEMORY;
        ctx.destMemory = &image;
    } else if (destination == 1) {
        ctx.destKind = ZAN_DEST_FIXED_BUFFER;
        ctx.destMemory = fixed.data();
        ctx.destMemoryCapacity = static_cast<uint32_t>(fixed.size());
    } else {
        ctx.destKind = ZAN_DEST_CALLBACKS;
        ctx.destWriteProc = Sink::Write;
        ctx.destSeekProc = Sink::Seek;
        ctx.sourceReadProc = Sink::Read;
        ctx.destUserData = ctx.sourceUserData = &sink;
    }
    ctx.destSizeOut = &imageSize;
    const bool frame = d.Next() & 1;
    const int pages = 1 + d.Next() % 3;
    bool ok = true;
    for (int page = 0; page < pages && ok; ++page) {
        ctx.outputColorSpace = ctx.colorSpace = d.Next() % 10;
        ctx.imageWidth = ctx.frameWidth = d.Next() % 65;
        ctx.imageHeight = ctx.frameHeight = d.Next() % 33;
        ctx.outputCompression = d.Next() % 14;
        static const uint32_t kBits[] = {1, 8, 16, 0};
        ctx.bitsPerSample = kBits[d.Next() % 4];
        ctx.outputBitsPerSample = kBits[d.Next() % 4];
        ctx.whiteIsZero = ctx.frameWhiteIsZero = d.Next() & 1;
        ctx.componentCount = d.Next() % 6;
        ctx.outputSamplingCount = d.Next() % 4;
        for (int k = 0; k < 3; ++k) {
            ctx.outputHorizontalSampling[k] = d.Next() % 5;
            ctx.outputVerticalSampling[k] = d.Next() % 5;
        }
        ctx.t6OptionsSet = d.Next() & 1;
        ctx.lzwPredictor = d.Next() % 3;
        ctx.outputXResolution = ctx.outputYResolution = static_cast<float>(d.Next());
        MetadataList* metadata = (d.Next() & 1) ? FuzzedMetadata(d) : nullptr;
        ctx.writeMetadataList = metadata;
        // Lines and frames are cut from the remaining input, repeated.
        const size_t row = static_cast<size_t>(ctx.imageWidth) * 8 * 2 + 16;
        std::vector<uint8_t> lines(row * (ctx.imageHeight + 1));
        for (size_t i = 0; i < lines.size(); ++i) lines[i] = d.size > d.at ? d.data[d.at + i % (d.size - d.at)] : 0;
        if (frame) {
            // Each frame is a job of its own: a memory result of an earlier
            // page is the host's to release.
            std::free(image);
            image = nullptr;
            ctx.frameData = lines.data();
            ctx.frameBufferSize = static_cast<uint32_t>(lines.size());
            ok = zanFrameBufferToTIFF(&ctx) != 0;
            ctx.frameData = nullptr;
            ctx.appendPages = 1;
        } else {
            for (uint32_t y = 0; y < ctx.imageHeight && ok; ++y)
                ok = zanTIFFWriteNextScanLine(&ctx, lines.data() + (y % 4) * row, static_cast<uint32_t>(row)) != 0;
            ok = ok && zanTIFFNextImage(&ctx);
        }
        ctx.writeMetadataList = nullptr;
        pivloDestroyMetadataList(metadata);
    }
    zanDestroyTIFF(&ctx);
    pivloReleaseContext(&ctx);
    // What was written reads back through the module.
    const uint8_t* written = destination == 0 ? static_cast<uint8_t*>(image)
                             : destination == 1 ? fixed.data()
                                                : sink.data.data();
    const size_t writtenSize = destination == 2 ? sink.data.size() : imageSize;
    if (written && writtenSize) {
        ConversionContext reader;
        zanfuzz::InitQuietJob(&reader);
        reader.sourceKind = ZAN_SOURCE_MEMORY;
        reader.sourceMemory = written;
        reader.sourceMemorySize = static_cast<uint32_t>(writtenSize);
        if (zanTIFFGetInfo(&reader)) {
            std::vector<uint8_t> line(static_cast<size_t>(reader.imageWidth) * 16 + 64);
            for (uint32_t y = 0; y < reader.imageHeight && y < 64; ++y)
                if (!zanTIFFReadNextScanLine(&reader, line.data(), static_cast<uint32_t>(line.size()))) break;
        }
        zanDestroyTIFF(&reader);
        pivloReleaseContext(&reader);
    }
    std::free(image);
    return 0;
}
