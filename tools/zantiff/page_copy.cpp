#include "page_copy.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <memory>
#include <vector>

#include "pivlo/pivlo.h"

namespace zantool {
namespace {

// A reading job for one page whose messages go where the writer's go.
class PageReader {
public:
    PageReader(const ConversionContext* writer, FILE* file, int32_t page, bool dropExtras) {
        pivloInitContext(&ctx_);
        ctx_.hostMessageProc = writer->hostMessageProc;
        ctx_.hostUserData = writer->hostUserData;
        ctx_.errorProc = writer->errorProc;
        ctx_.warningProc = writer->warningProc;
        ctx_.errorProcEx = writer->errorProcEx;
        ctx_.warningProcEx = writer->warningProcEx;
        ctx_.messageUserData = writer->messageUserData;
        ctx_.useExMessageProcs = writer->useExMessageProcs;
        ctx_.sourceKind = ZAN_SOURCE_FILE;
        ctx_.sourceFp = file;
        ctx_.pageNumber = page;
        ctx_.outputBitsPerSample = 16;
        ctx_.dropExtraSamples = dropExtras;
        ctx_.metadataList = list_ = pivloCreateMetadataList(nullptr, nullptr);
    }
    ~PageReader() {
        zanDestroyTIFF(&ctx_);
        pivloReleaseContext(&ctx_);
        pivloDestroyMetadataList(list_);
    }
    ConversionContext* get() { return &ctx_; }
    ConversionContext* operator->() { return &ctx_; }
    MetadataList* metadata() { return list_; }

private:
    ConversionContext ctx_{};
    MetadataList* list_ = nullptr;
};

// The writer's colour space for the lines the reader delivers; 0 when the
// writer has none for them.
uint32_t ColourSpaceOf(const ConversionContext* page) {
    const uint32_t samples = page->samplesPerPixel;
    switch (page->imageType) {
    case ZAN_IMAGE_BILEVEL_WHITE_IS_ZERO:
    case ZAN_IMAGE_BILEVEL_BLACK_IS_ZERO:
        return samples == 1 ? ZAN_COLORSPACE_BILEVEL : 0;
    case ZAN_IMAGE_GREY_WHITE_IS_ZERO:
    case ZAN_IMAGE_GREY_BLACK_IS_ZERO:
        return samples == 1 ? ZAN_COLORSPACE_GREY : samples == 2 ? ZAN_COLORSPACE_GREY_ALPHA : 0;
    case ZAN_IMAGE_PALETTE: return ZAN_COLORSPACE_RGB;
    case ZAN_IMAGE_RGB:
        return samples == 3 ? ZAN_COLORSPACE_RGB : samples == 4 ? ZAN_COLORSPACE_RGB_ALPHA : 0;
    case ZAN_IMAGE_YCBCR:  // JPEG pages come as RGB
        return page->compression == ZAN_COMPRESSION_JPEG && samples == 3 ? ZAN_COLORSPACE_RGB : 0;
    case ZAN_IMAGE_CMYK: return samples == 4 ? ZAN_COLORSPACE_CMYK : 0;
    case ZAN_IMAGE_SEPARATED: return ZAN_COLORSPACE_SEPARATED;
    default: return 0;
    }
}

// The compression the copy is written with: the caller's, else the
// source's where the writer has it for the page, else LZW (Group 4 for
// bi-level pages).
uint32_t CompressionFor(const ConversionContext* page, uint32_t colourSpace, uint32_t wanted) {
    if (wanted) return wanted;
    const uint32_t source = page->compression;
    const bool bilevel = colourSpace == ZAN_COLORSPACE_BILEVEL;
    if (bilevel) {
        const bool fax = source == ZAN_COMPRESSION_CCITT_G3 || source == ZAN_COMPRESSION_CCITT_G4;
        return fax || source == ZAN_COMPRESSION_NONE ? source : uint32_t{ZAN_COMPRESSION_CCITT_G4};
    }
    switch (source) {
    case ZAN_COMPRESSION_NONE:
    case ZAN_COMPRESSION_PACKBITS:
    case ZAN_COMPRESSION_LZW:
        return source;
    case ZAN_COMPRESSION_JPEG:
        return page->bitsPerSample == 8 && (colourSpace == ZAN_COLORSPACE_RGB || colourSpace == ZAN_COLORSPACE_GREY)
                   ? source
                   : uint32_t{ZAN_COMPRESSION_LZW};
    default:
        return ZAN_COMPRESSION_LZW;
    }
}

void Describe(ConversionContext* writer, ConversionContext* page, uint32_t colourSpace, const CopyOptions& options) {
    const bool sixteen = page->bitsPerSample == 16;
    writer->outputColorSpace = colourSpace;
    writer->imageWidth = page->imageWidth;
    writer->imageHeight = page->imageHeight;
    writer->bitsPerSample = sixteen ? 16 : 8;
    writer->outputBitsPerSample = sixteen ? 16 : 8;
    writer->whiteIsZero = page->imageType == ZAN_IMAGE_BILEVEL_WHITE_IS_ZERO;
    writer->componentCount = page->samplesPerPixel;
    writer->outputCompression = CompressionFor(page, colourSpace, options.compression);
    writer->lzwPredictor = options.lzwPredictor;
    writer->outputXResolution = page->xResolution;
    writer->outputYResolution = page->yResolution;
    writer->outputOrientation = page->orientation;
    writer->writeMetadataList = page->metadataList;
}

// Puts the planes of a separate-planes line pixel by pixel.
void Interleave(const std::vector<uint8_t>& line, std::vector<uint8_t>& out, uint32_t width, uint32_t samples,
                size_t sampleBytes) {
    for (uint32_t x = 0; x < width; ++x)
        for (uint32_t s = 0; s < samples; ++s)
            std::memcpy(&out[(static_cast<size_t>(x) * samples + s) * sampleBytes],
                        &line[(static_cast<size_t>(s) * width + x) * sampleBytes], sampleBytes);
}

bool CopyRows(ConversionContext* writer, ConversionContext* page) {
    const uint64_t room = uint64_t{page->imageWidth} * std::max<uint32_t>(page->samplesPerPixel, 3) * 2 + 16;
    if (room > 0xFFFFFFFFu) return false;
    std::vector<uint8_t> line(static_cast<size_t>(room)), interleaved(static_cast<size_t>(room));
    for (uint32_t row = 0; row < page->imageHeight; ++row) {
        const uint32_t got = zanTIFFReadNextScanLine(page, line.data(), static_cast<uint32_t>(line.size()));
        if (!got) return false;
        std::vector<uint8_t>* out = &line;
        if (page->planarConfig == 2 && page->samplesPerPixel > 1 && page->bitsPerSample >= 8) {
            Interleave(line, interleaved, page->imageWidth, page->samplesPerPixel, page->bitsPerSample == 16 ? 2 : 1);
            out = &interleaved;
        }
        if (!zanTIFFWriteNextScanLine(writer, out->data(), got)) return false;
    }
    return true;
}

}  // namespace

uint32_t CopyPages(const std::string& source, ConversionContext* writer, const CopyOptions& options,
                   bool* failed, const std::function<void(uint32_t, uint32_t)>& progress) {
    *failed = false;
    FILE* file = std::fopen(source.c_str(), "rb");
    if (!file) {
        zanError(writer, ("cannot open " + source).c_str());
        *failed = true;
        return 0;
    }
    uint32_t copied = 0, pages = 1;
    for (uint32_t p = 1; p <= pages; ++p) {
        auto page = std::make_unique<PageReader>(writer, file, static_cast<int32_t>(p), false);
        if (!zanTIFFGetInfo(page->get())) break;
        pages = (*page)->pageCount;
        uint32_t colourSpace = ColourSpaceOf(page->get());
        if (colourSpace == 0 && (*page)->extraSamples) {
            // Extra samples the writer has no layout for are left out.
            page = std::make_unique<PageReader>(writer, file, static_cast<int32_t>(p), true);
            if (!zanTIFFGetInfo(page->get())) break;
            colourSpace = ColourSpaceOf(page->get());
        }
        if (colourSpace == 0) {
            zanError(writer, "This page's kind of image cannot be written.");
            break;
        }
        Describe(writer, page->get(), colourSpace, options);
        const bool ok = CopyRows(writer, page->get()) && zanTIFFNextImage(writer);
        writer->writeMetadataList = nullptr;
        if (!ok) break;
        ++copied;
        if (progress) progress(copied, pages);
    }
    std::fclose(file);
    *failed = copied < pages;
    return copied;
}

}  // namespace zantool
