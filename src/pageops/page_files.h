// Files the file-level page operations work on, and their shared checks.
#pragma once

#include <cstdint>
#include <cstdio>

#include "frame/report.h"
#include "pageops/container_walker.h"
#include "zantiff/conversion_context.h"

namespace zan {

// A TIFF file stream with what its header says.
struct PageFile {
    FILE* stream = nullptr;
    uint64_t size = 0;
    ByteOrder order = ByteOrder::Little;
    uint32_t firstIfd = 0;

    // Learns the file's size; false when the stream cannot be positioned.
    bool Measure();
};

// True when both streams are the same open file.
bool SameFile(FILE* a, FILE* b);

// Reports a chain walk that did not end normally ("<who> directory chain
// loops." or "<who> directory chain is damaged."); true when it ended.
bool CheckChain(ConversionContext* ctx, ChainResult result, const char* who);

// Counts the directories of the file's chain, checking that it ends.
bool CountPages(ConversionContext* ctx, PageFile& file, const char* who, uint32_t* pages);

}  // namespace zan
