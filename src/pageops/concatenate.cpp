// zanConcatenateTIFF: appends every page of the source TIFF file to the
// destination TIFF file, in the destination's byte order, without decoding.

#include <algorithm>
#include <cstdio>
#include <cstring>

#include "frame/file_stream.h"
#include "pageops/container_walker.h"
#include "pageops/page_files.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

// Reads both headers; reports and returns false when either is no TIFF.
bool ReadHeaders(ConversionContext* ctx, PageFile& source, PageFile& dest) {
    static const char kBadIdentifier[] = "Error in second 2 bytes (TIFF id).\n";
    switch (readTiffHeader(ctx, source.stream, &source.order, &source.firstIfd)) {
    case HeaderResult::NotTiff: return ReportError(ctx, "Source is not TIFF.");
    case HeaderResult::BadIdentifier: return ReportError(ctx, kBadIdentifier);
    case HeaderResult::Ok: break;
    }
    switch (readTiffHeader(ctx, dest.stream, &dest.order, &dest.firstIfd)) {
    case HeaderResult::NotTiff: return ReportError(ctx, "Destination is not TIFF.");
    case HeaderResult::BadIdentifier: return ReportError(ctx, kBadIdentifier);
    case HeaderResult::Ok: break;
    }
    return true;
}

// Writes 12 bytes at the destination's end to learn that it takes writes;
// the first appended directory covers them.
bool WriteTestAtEnd(FILE* dest, int64_t end) {
    static const unsigned char kTest[12] = {0};
    return SeekStream(dest, end, SEEK_SET) == 0 && std::fwrite(kTest, 1, 12, dest) == 12 &&
           std::fflush(dest) == 0;
}

// The offset of the 4-byte field that must point at the first appended
// directory: the last directory's next-IFD field, or the header's.
bool FindLink(ConversionContext* ctx, PageFile& dest, uint32_t* link) {
    *link = 4;
    const ChainResult walked = WalkChain(ctx, dest.stream, dest.order, dest.size, dest.firstIfd,
                                         [&](uint32_t, uint32_t nextField) {
                                             *link = nextField;
                                             return true;
                                         });
    return CheckChain(ctx, walked, "Destination");
}

bool WriteLink(ConversionContext* ctx, FILE* dest, ByteOrder order, uint32_t link, uint32_t value) {
    unsigned char bytes[4];
    ByteOrderAccess(ctx, order).Put32(value, bytes);
    if (SeekStream(dest, link, SEEK_SET) == 0 && std::fwrite(bytes, 1, 4, dest) == 4) return true;
    return ReportError(ctx, "Unable to write to destination file.");
}

}  // namespace
}  // namespace zan

extern "C" ZAN_API int zanConcatenateTIFF(ConversionContext* ctx) {
    using namespace zan;
    if (!ctx) return 0;
    if (ctx->sourceKind != ZAN_SOURCE_FILE || ctx->destKind != ZAN_DEST_FILE || !ctx->sourceFp ||
        !ctx->destFp)
        return ReportError(ctx, "Source and destination must be files.");
    if (SameFile(ctx->sourceFp, ctx->destFp))
        return ReportError(ctx, "Source and destination must be different files.");
    PageFile source{ctx->sourceFp}, dest{ctx->destFp};
    if (!source.Measure() || !dest.Measure() || SeekStream(source.stream, 0, SEEK_SET) != 0 ||
        SeekStream(dest.stream, 0, SEEK_SET) != 0)
        return ReportError(ctx, "Unable to access the source or destination file.");
    if (!ReadHeaders(ctx, source, dest)) return 0;
    const int64_t end = static_cast<int64_t>(dest.size);
    if (!WriteTestAtEnd(dest.stream, end)) return ReportError(ctx, "Unable to write to destination file.");
    dest.size = std::max<uint64_t>(dest.size, static_cast<uint64_t>(end) + 12);

    uint32_t link = 0;
    if (!FindLink(ctx, dest, &link)) return 0;
    if (source.firstIfd == 0) return 1;
    uint32_t pages = 0;
    if (!CountPages(ctx, source, "Source", &pages)) return 0;
    if (end + (end & 1) > 0xFFFFFFFFll) return ReportError(ctx, "Destination would exceed 4 GiB.");

    PageCopyOptions options;
    options.convertByteOrder = true;
    uint32_t position = static_cast<uint32_t>(end + (end & 1));
    uint32_t ifd = source.firstIfd;
    // Each page is written whole first and linked last, so that the
    // destination never points at a page that is not all there.
    for (uint32_t page = 0; page < pages && ifd != 0; ++page) {
        PageCopyResult copied;
        if (!copyTiffPage(ctx, source.stream, source.size, ifd, source.order, dest.stream, position,
                          dest.order, options, &copied))
            return 0;
        if (!WriteLink(ctx, dest.stream, dest.order, link, position)) return 0;
        if (std::fflush(dest.stream) != 0) return ReportError(ctx, "Unable to write to destination file.");
        link = copied.nextIfdField;
        position = copied.dataEnd;
        ifd = copied.nextIfd;
    }
    return std::fflush(dest.stream) == 0 ? 1 : ReportError(ctx, "Unable to write to destination file.");
}
