// zanExtractTIFFPage: copies one page of a TIFF file into a one-page TIFF
// file of its own, in the source's byte order, without decoding.

#include <cstdio>

#include "frame/file_stream.h"
#include "pageops/container_walker.h"
#include "pageops/page_files.h"
#include "pivlo/pivlo.h"
#include "zantiff/zantiff.h"

namespace zan {
namespace {

constexpr char kBeyond[] = "Specified page beyond that of the source tiff file.";

// The directory offset of page `page` (from 1); 0 after a reported failure.
uint32_t FindPage(ConversionContext* ctx, PageFile& source, uint32_t page) {
    uint32_t found = 0, index = 0;
    const ChainResult walked = WalkChain(ctx, source.stream, source.order, source.size,
                                         source.firstIfd, [&](uint32_t ifd, uint32_t) {
                                             if (++index < page) return true;
                                             found = ifd;
                                             return false;
                                         });
    if (!CheckChain(ctx, walked, "Source")) return 0;
    if (!found) ReportError(ctx, kBeyond);
    return found;
}

// The header of a one-page file in the source's byte order: first IFD at 8.
bool WriteHeader(ConversionContext* ctx, FILE* dest, ByteOrder order) {
    unsigned char header[8] = {0, 0, 0, 0, 0, 0, 0, 0};
    header[0] = header[1] = order == ByteOrder::Little ? 'I' : 'M';
    const ByteOrderAccess access(ctx, order);
    access.Put16(42, header + 2);
    access.Put32(8, header + 4);
    return SeekStream(dest, 0, SEEK_SET) == 0 && std::fwrite(header, 1, 8, dest) == 8;
}

}  // namespace
}  // namespace zan

extern "C" ZAN_API int zanExtractTIFFPage(ConversionContext* ctx, int32_t pageNumber) {
    using namespace zan;
    if (!ctx) return 0;
    if (ctx->sourceKind != ZAN_SOURCE_FILE || ctx->destKind != ZAN_DEST_FILE || !ctx->sourceFp ||
        !ctx->destFp)
        return ReportError(ctx, "Source and destinationf must be files.");
    const auto page = static_cast<uint32_t>(pageNumber);
    if (page == 0) return ReportError(ctx, "Page starts at 1.");
    if (SameFile(ctx->sourceFp, ctx->destFp))
        return ReportError(ctx, "Source and destination must be different files.");
    PageFile source{ctx->sourceFp};
    if (!source.Measure() || SeekStream(source.stream, 0, SEEK_SET) != 0)
        return ReportError(ctx, "Unable to access the source file.");
    switch (readTiffHeader(ctx, source.stream, &source.order, &source.firstIfd)) {
    case HeaderResult::NotTiff: return ReportError(ctx, "Source not a tiff file.\n");
    case HeaderResult::BadIdentifier: return ReportError(ctx, "Error in second 2 bytes (TIFF id).\n");
    case HeaderResult::Ok: break;
    }
    if (source.firstIfd == 0) return ReportError(ctx, kBeyond);
    const uint32_t ifd = FindPage(ctx, source, page);
    if (!ifd) return 0;
    // The offsets written assume the header at offset 0 of the destination.
    if (!WriteHeader(ctx, ctx->destFp, source.order))
        return ReportError(ctx, "Unable to write to destination file.");
    PageCopyOptions options;
    options.acceptIfdType = true;
    options.markStandalone = true;
    PageCopyResult copied;
    return copyTiffPage(ctx, source.stream, source.size, ifd, source.order, ctx->destFp, 8,
                        source.order, options, &copied);
}
