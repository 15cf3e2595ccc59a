// The TIFF file structure, read and written without the codec: the header,
// the chain of image file directories, and copying one directory with its
// values and image data to another file with every offset relocated.
#pragma once

#include <cstdint>
#include <cstdio>

#include "frame/tiff_structure.h"
#include "zantiff/conversion_context.h"

namespace zan {

enum class ByteOrder { Little, Big };

// Reads and stores 16- and 32-bit numbers in one byte order through the
// host's accessors.
class ByteOrderAccess {
public:
    ByteOrderAccess(ConversionContext* ctx, ByteOrder order) : ctx_(ctx), order_(order) {}
    ByteOrder order() const { return order_; }
    uint16_t Get16(const unsigned char* bytes) const;
    uint32_t Get32(const unsigned char* bytes) const;
    void Put16(uint16_t value, unsigned char* bytes) const;
    void Put32(uint32_t value, unsigned char* bytes) const;

private:
    ConversionContext* ctx_;
    ByteOrder order_;
};

enum class HeaderResult { Ok, NotTiff, BadIdentifier };

// Reads the 8-byte header at the stream's position: byte order ("II" or
// "MM") and identifier 42; gives the order and the first IFD offset.
HeaderResult readTiffHeader(ConversionContext* ctx, FILE* stream, ByteOrder* order,
                            uint32_t* firstIfd);

// Steps over the directory at `offset`: gives its next-IFD offset and the
// offset of that field. False when the directory does not lie wholly within
// the file's `fileSize` bytes or cannot be read. Afterwards the stream stands
// behind the next-IFD field.
bool skipIfd(ConversionContext* ctx, FILE* stream, uint32_t offset, ByteOrder order,
             uint64_t fileSize, uint32_t* next, uint32_t* nextField = nullptr);

enum class ChainResult { End, Stopped, Loop, Damaged };

// Calls visit(directory offset, offset of its next-IFD field) for every
// directory of the chain from `first`, until the chain ends or visit returns
// false. A chain that returns to a directory already visited is reported as
// Loop (Brent's cycle detection: no memory, at most a few extra steps), one
// that leaves the file as Damaged.
template <typename Visit>
ChainResult WalkChain(ConversionContext* ctx, FILE* stream, ByteOrder order, uint64_t fileSize,
                      uint32_t first, Visit visit) {
    ChainResult stopped = ChainResult::Stopped;
    const ChainEnd end = FollowChain(first, [&](uint32_t current, uint32_t* next) {
        uint32_t nextField = 0;
        if (!skipIfd(ctx, stream, current, order, fileSize, next, &nextField)) {
            stopped = ChainResult::Damaged;
            return false;
        }
        return visit(current, nextField);
    });
    return end == ChainEnd::End ? ChainResult::End : end == ChainEnd::Loop ? ChainResult::Loop : stopped;
}

struct PageCopyOptions {
    bool convertByteOrder = false;  // rewrite entries and values in the destination's order
    bool acceptIfdType = false;     // take field type 13 (IFD) as a 4-byte number
    bool markStandalone = false;    // NewSubfileType 0, PageNumber (0, 1)
};

struct PageCopyResult {
    uint32_t dataEnd = 0;        // first free even offset behind the copied page
    uint32_t nextIfd = 0;        // the source directory's next-IFD offset
    uint32_t nextIfdField = 0;   // destination offset of the new directory's next-IFD field
};

// Copies the directory at `ifd` of `source` (byte order `sourceOrder`, size
// `sourceSize`) with its values, its EXIF, GPS and Interoperability
// directories and its strips or tiles to `dest` at the even offset
// `position`, relocating every offset. The page is checked completely before
// anything of it is written: 0 (message sent) with the destination untouched
// when it cannot be copied; 0 after a read or write failure while copying.
int copyTiffPage(ConversionContext* ctx, FILE* source, uint64_t sourceSize, uint32_t ifd,
                 ByteOrder sourceOrder, FILE* dest, uint32_t position, ByteOrder destOrder,
                 const PageCopyOptions& options, PageCopyResult* result);

}  // namespace zan
