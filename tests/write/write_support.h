// A writing job to any destination kind, and what libtiff reads back.
#pragma once

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "support/memory_stream.h"
#include "support/test_host.h"
#include "support/tiff_fixtures.h"
#include "zantiff/zantiff.h"

namespace zantest {

enum class Dest { File, Callbacks, FixedBuffer, Memory };

class WriteJob {
public:
    explicit WriteJob(Dest dest = Dest::Memory, uint32_t fixedCapacity = 8 << 20) : dest_(dest) {
        ConversionContext* ctx = host_.ctx();
        switch (dest) {
        case Dest::File:
            WriteFileBytes(file_.path(), {});
            ctx->destKind = ZAN_DEST_FILE;
            ctx->destPath = file_.c_str();
            ctx->destFp = std::fopen(file_.c_str(), "rb");
            break;
        case Dest::Callbacks:
            ctx->destKind = ZAN_DEST_CALLBACKS;
            ctx->destWriteProc = MemoryStream::Write;
            ctx->destSeekProc = MemoryStream::Seek;
            ctx->destUserData = &stream_;
            ctx->sourceReadProc = MemoryStream::Read;
            ctx->sourceUserData = &stream_;
            break;
        case Dest::FixedBuffer:
            fixed_.assign(fixedCapacity, 0);
            ctx->destKind = ZAN_DEST_FIXED_BUFFER;
            ctx->destMemory = fixed_.data();
            ctx->destMemoryCapacity = fixedCapacity;
            ctx->destSizeOut = &size_;
            break;
        case Dest::Memory:
            ctx->destKind = ZAN_DEST_MEMORY;
            ctx->destMemory = &block_;
            ctx->destSizeOut = &size_;
            break;
        }
    }
    ~WriteJob() {
        host_.EndJob();
        if (host_->destFp) std::fclose(host_->destFp);
        TestAllocator::Free(block_);
    }

    // Describes the image of the scanline writer.
    void Describe(uint32_t colorSpace, uint32_t width, uint32_t height, uint32_t compression,
                  uint32_t bits = 8, uint32_t outputBits = 8) {
        host_->outputColorSpace = colorSpace;
        host_->imageWidth = width;
        host_->imageHeight = height;
        host_->outputCompression = compression;
        host_->bitsPerSample = bits;
        host_->outputBitsPerSample = outputBits;
    }

    // Writes every row of `rows`; false at the first refused line.
    bool WriteRows(std::vector<Bytes> rows) {
        for (Bytes& row : rows)
            if (zanTIFFWriteNextScanLine(host_.ctx(), row.data(), static_cast<uint32_t>(row.size())) == 0) return false;
        return true;
    }

    // Ends the job and gives the bytes the destination holds.
    Bytes Finish() {
        host_.EndJob();
        if (host_->destFp) std::fflush(host_->destFp);
        switch (dest_) {
        case Dest::File: return ReadFileBytes(file_.path());
        case Dest::Callbacks: return stream_.data;
        case Dest::FixedBuffer: return Bytes(fixed_.begin(), fixed_.begin() + size_);
        case Dest::Memory:
            return block_ ? Bytes(static_cast<uint8_t*>(block_), static_cast<uint8_t*>(block_) + size_) : Bytes();
        }
        return {};
    }

    TestHost& host() { return host_; }
    ConversionContext* operator->() { return host_.ctx(); }
    uint32_t size() const { return size_; }

private:
    Dest dest_;
    TestHost host_;
    TempFile file_;
    MemoryStream stream_;
    Bytes fixed_;
    void* block_ = nullptr;
    uint32_t size_ = 0;
};

// Rows of `height` lines of `rowBytes` deterministic bytes.
inline std::vector<Bytes> PatternRows(uint32_t height, uint64_t rowBytes, uint32_t seed = 0) {
    std::vector<Bytes> rows(height, Bytes(static_cast<size_t>(rowBytes)));
    for (uint32_t y = 0; y < height; ++y)
        for (size_t i = 0; i < rows[y].size(); ++i) rows[y][i] = static_cast<uint8_t>(i * 7 + y * 13 + seed + (i * y) % 5);
    return rows;
}

// A tag of a page as libtiff reads it back, through TIFFGetField's usual
// shapes. Opens the bytes on every call: simple, and the files are small.
class PageReader {
public:
    PageReader(const Bytes& tiff, uint32_t page = 0) : file_() {
        WriteFileBytes(file_.path(), tiff);
        previous_ = TIFFSetErrorHandler(nullptr);
        previousWarning_ = TIFFSetWarningHandler(nullptr);
        tif_ = TIFFOpen(file_.c_str(), "r");
        if (tif_ && page) TIFFSetDirectory(tif_, page);
    }
    ~PageReader() {
        if (tif_) TIFFClose(tif_);
        TIFFSetErrorHandler(previous_);
        TIFFSetWarningHandler(previousWarning_);
    }
    TIFF* operator->() { return tif_; }
    TIFF* get() { return tif_; }
    uint32_t U16(uint32_t tag) {
        uint16_t v = 0;
        return TIFFGetField(tif_, tag, &v) ? v : 0xFFFFFFFFu;
    }
    uint32_t U32(uint32_t tag) {
        uint32_t v = 0;
        return TIFFGetField(tif_, tag, &v) ? v : 0xFFFFFFFFu;
    }
    float F32(uint32_t tag) {
        float v = 0;
        return TIFFGetField(tif_, tag, &v) ? v : -1.0f;
    }
    std::string Text(uint32_t tag) {
        char* v = nullptr;
        return TIFFGetField(tif_, tag, &v) && v ? v : "";
    }
    // Makes the page's EXIF directory current; false when it has none.
    bool OpenExif() {
        uint64_t offset = 0;
        return TIFFGetField(tif_, TIFFTAG_EXIFIFD, &offset) && TIFFReadEXIFDirectory(tif_, offset);
    }

private:
    TempFile file_;
    TIFF* tif_ = nullptr;
    TIFFErrorHandler previous_ = nullptr, previousWarning_ = nullptr;
};

}  // namespace zantest
