// Re-encoding the pages of a TIFF file through the module's reader and
// writer, with their metadata and EXIF directories.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "zantiff/zantiff.h"

namespace zantool {

struct CopyOptions {
    uint32_t compression = 0;  // host compression code; 0: the source's where it can be written
    uint32_t lzwPredictor = 0; // 2: LZW pages get Predictor 2
};

// Appends every page of the TIFF file at `source` to the pages being written
// through `writer` (a job whose destination is set up). Each page is read
// with its metadata, written line by line with it, and closed with
// zanTIFFNextImage. Messages go where the writer's go. Returns the number
// of pages copied; stops at the first page that fails (*failed is set).
// `progress`, when given, hears of each page copied (pages done, pages).
uint32_t CopyPages(const std::string& source, ConversionContext* writer, const CopyOptions& options,
                   bool* failed, const std::function<void(uint32_t, uint32_t)>& progress = {});

}  // namespace zantool
