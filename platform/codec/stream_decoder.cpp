// The push decoder: a TIFF's first page decoded from input that arrives in
// pieces. The input is held (HeldInput) until libtiff can read the first
// directory from it; libtiff then reads the page through client procedures
// that serve the held bytes, and rows are formed once every strip or tile
// they come from has arrived. Bytes of rows already delivered are let go.

#include <algorithm>
#include <cstring>
#include <limits>
#include <memory>
#include <new>
#include <utility>

#include "osttiff/osttiff.h"
#include "stream_input.h"
#include "stream_jpeg.h"
#include "zantiff/conversion_context.h"

namespace osttiff {
namespace {

constexpr char kModule[] = "TIFFStreamDecode";
// Bands hold about this many bytes (at least one row).
constexpr uint64_t kBandBytes = 256u << 10;
// Block rows beyond this many are not tracked one by one: the input of
// such a page is held until the page is done.
constexpr uint64_t kMostTrackedBlocks = uint64_t{1} << 24;

// Where a row's data lies: the page's rows in blocks (a strip's rows, or a
// row of tiles), each block made of chunks (a strip or tile of each plane).
struct PageLayout {
    uint32_t width = 0, height = 0;
    uint32_t blockRows = 1;  // rows of a block
    uint32_t blocks = 0;     // blocks down the page
    uint32_t across = 1;     // chunks across a block (tiles)
    uint32_t planes = 1;
    uint32_t chunksPerPlane = 0;
    bool ojpeg = false;      // old-style JPEG reads tables from anywhere in the file

    uint32_t BlockOf(uint32_t row) const { return row / blockRows; }
    uint32_t Chunk(uint32_t block, uint32_t column, uint32_t plane) const {
        return plane * chunksPerPlane + block * across + column;
    }
};

}  // namespace
}  // namespace osttiff

struct TIFFStreamDecoder {
    explicit TIFFStreamDecoder(void* host, ConversionContext* job) : hostValue(host), ctx(job), input(job) {}
    ~TIFFStreamDecoder();

    void* hostValue;
    ConversionContext* ctx;
    osttiff::HeldInput input;
    TIFF* tif = nullptr;
    uint64_t position = 0;    // libtiff's position in the stream
    uint64_t openedSize = 0;  // the stream's size as known when the page was opened
    bool ended = false;       // no more input follows
    bool failed = false;      // an error was reported: it sticks
    bool done = false;        // every row was delivered
    bool started = false;     // something after the header was delivered
    bool cutShort = false;    // a row could not be formed after the input ended
    uint32_t mode = 0;        // the context's streamMode when delivery started
    uint32_t colorSpace = 8;
    osttiff::PageLayout layout;
    uint64_t* floorFrom = nullptr;  // per block: the lowest data offset of it and the blocks after it
    uint64_t keepUntil = std::numeric_limits<uint64_t>::max();
    uint64_t directoryNeeds = 0;  // input the directory needs before it is scanned again

    // Bands.
    TIFFStreamRowReader reader{};
    bool readerSet = false, reading = false;
    uint32_t rowBytes = 0, rowWritten = 0, bandRows = 0;
    uint8_t* band = nullptr;
    uint32_t nextRow = 0;
    uint64_t pendingDrop = 0;  // bytes before this are let go at the next call
    TIFFStreamBand delivered{};

    // Raw delivery and bypass: the page's single chunk.
    uint64_t chunkOffset = 0, chunkSize = 0, chunkDelivered = 0;
    std::unique_ptr<osttiff::JpegBypass> jpeg;
};

namespace osttiff {
namespace {

using Decoder = TIFFStreamDecoder;

int Fail(Decoder* d, const char* message) {
    if (message) TIFFErrorExt(nullptr, kModule, "%s", message);
    d->failed = true;
    return TIFF_STREAM_ERROR;
}

void* Allocate(Decoder* d, uint64_t bytes) {
    if (bytes == 0 || bytes > std::numeric_limits<uint32_t>::max() || !d->ctx->allocProc) return nullptr;
    return d->ctx->allocProc(static_cast<uint32_t>(bytes));
}

void Release(Decoder* d, void* block) {
    if (block && d->ctx->freeProc) d->ctx->freeProc(block);
}

// ---- client procedures of the codec object: the held bytes ----

int32_t ReadHeld(void* client, void* buffer, int32_t count) {
    auto* d = static_cast<Decoder*>(client);
    if (count <= 0) return 0;
    const uint32_t got = d->input.Read(d->position, buffer, static_cast<uint32_t>(count));
    d->position += got;
    return static_cast<int32_t>(got);
}

int32_t WriteNothing(void*, void*, int32_t) { return -1; }

uint32_t SeekHeld(void* client, uint32_t offset, int whence) {
    auto* d = static_cast<Decoder*>(client);
    uint64_t base = 0;
    if (whence == SEEK_CUR) base = d->position;
    else if (whence == SEEK_END) base = std::max(d->openedSize, d->input.arrived());
    const uint64_t to = base + offset;
    if (to >= PIVLO_SEEK_FAILED) return PIVLO_SEEK_FAILED;
    d->position = to;
    return static_cast<uint32_t>(to);
}

int CloseNothing(void*) { return 0; }

// While input arrives, the stream is as long as the page's data says (so that
// libtiff's checks of strip sizes against the file see the whole page); once
// it has ended, exactly as long as it was.
uint32_t SizeHeld(void* client) {
    auto* d = static_cast<Decoder*>(client);
    const uint64_t size = d->ended ? d->input.arrived() : std::max(d->openedSize, d->input.arrived());
    return static_cast<uint32_t>(std::min<uint64_t>(size, PIVLO_SEEK_FAILED - 1));
}

// ---- the page ----

// Rows of `rowBytes` bytes in a band: as many as fit in kBandBytes, at least
// one, at most the page's `height`.
uint32_t BandRowsFor(uint64_t rowBytes, uint32_t height) {
    const auto rows = static_cast<uint32_t>(std::max<uint64_t>(1, kBandBytes / rowBytes));
    return std::min(rows, std::max<uint32_t>(height, 1));
}

uint32_t ColourSpaceOf(TIFF* tif) {
    uint16_t photometric = PHOTOMETRIC_RGB, bits = 1, samples = 1, extra = 0;
    const uint16_t* kinds = nullptr;
    TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric);
    TIFFGetFieldDefaulted(tif, TIFFTAG_BITSPERSAMPLE, &bits);
    TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLESPERPIXEL, &samples);
    TIFFGetStoredExtraSamplesPivlo(tif, &extra, &kinds);
    switch (photometric) {
    case PHOTOMETRIC_MINISWHITE:
    case PHOTOMETRIC_MINISBLACK: return bits == 1 ? 1 : 2;
    case PHOTOMETRIC_SEPARATED: return samples - std::min(extra, samples) == 4 ? 5 : 6;
    default: return 8;
    }
}

bool DescribeLayout(TIFF* tif, PageLayout* page) {
    uint16_t planar = PLANARCONFIG_CONTIG, samples = 1, compression = COMPRESSION_NONE;
    if (!TIFFGetField(tif, TIFFTAG_IMAGEWIDTH, &page->width) || !TIFFGetField(tif, TIFFTAG_IMAGELENGTH, &page->height))
        return false;
    TIFFGetFieldDefaulted(tif, TIFFTAG_PLANARCONFIG, &planar);
    TIFFGetFieldDefaulted(tif, TIFFTAG_SAMPLESPERPIXEL, &samples);
    TIFFGetFieldDefaulted(tif, TIFFTAG_COMPRESSION, &compression);
    page->ojpeg = compression == COMPRESSION_OJPEG;
    page->planes = planar == PLANARCONFIG_SEPARATE ? std::max<uint16_t>(samples, 1) : 1;
    const uint32_t chunks = TIFFIsTiled(tif) ? TIFFNumberOfTiles(tif) : TIFFNumberOfStrips(tif);
    page->chunksPerPlane = chunks / page->planes;
    if (TIFFIsTiled(tif)) {
        uint32_t tileWidth = 0, tileLength = 0;
        TIFFGetField(tif, TIFFTAG_TILEWIDTH, &tileWidth);
        TIFFGetField(tif, TIFFTAG_TILELENGTH, &tileLength);
        if (tileWidth == 0 || tileLength == 0) return false;
        page->blockRows = tileLength;
        page->across = static_cast<uint32_t>((uint64_t{page->width} + tileWidth - 1) / tileWidth);
    } else {
        uint32_t rows = 0;
        TIFFGetFieldDefaulted(tif, TIFFTAG_ROWSPERSTRIP, &rows);
        page->blockRows = std::max<uint32_t>(1, std::min(rows, std::max<uint32_t>(page->height, 1)));
        page->across = 1;
    }
    page->blocks = static_cast<uint32_t>((uint64_t{page->height} + page->blockRows - 1) / page->blockRows);
    return true;
}

// A chunk's place in the stream; false for a chunk without data (libtiff
// judges such a chunk when it is read).
bool ChunkExtent(const Decoder* d, uint32_t chunk, uint64_t* offset, uint64_t* end) {
    int error = 0;
    const uint64_t at = TIFFGetStrileOffsetWithErr(d->tif, chunk, &error);
    const uint64_t count = error ? 0 : TIFFGetStrileByteCountWithErr(d->tif, chunk, &error);
    if (error || at == 0 || count == 0 || count > std::numeric_limits<uint64_t>::max() - at) return false;
    *offset = at;
    *end = at + count;
    return true;
}

// Calls `visit(offset, end)` for every chunk of `block` that has data.
template <typename Visit>
void ForEachChunk(const Decoder* d, uint32_t block, Visit visit) {
    const PageLayout& page = d->layout;
    for (uint32_t plane = 0; plane < page.planes; ++plane)
        for (uint32_t column = 0; column < page.across; ++column) {
            uint64_t offset = 0, end = 0;
            if (ChunkExtent(d, page.Chunk(block, column, plane), &offset, &end)) visit(offset, end);
        }
}

// The end of the last byte block `block` needs (0 when it needs none).
uint64_t BlockEnd(const Decoder* d, uint32_t block) {
    uint64_t furthest = 0;
    ForEachChunk(d, block, [&](uint64_t, uint64_t end) { furthest = std::max(furthest, end); });
    return furthest;
}

// For each block, the lowest offset of the data of it and of every block
// after it: what must still be held once the rows before it are delivered.
// Old-style JPEG pages and pages of too many blocks keep every byte.
bool TrackBlocks(Decoder* d) {
    const PageLayout& page = d->layout;
    if (page.ojpeg || page.blocks > kMostTrackedBlocks) return true;
    d->floorFrom = static_cast<uint64_t*>(Allocate(d, (uint64_t{page.blocks} + 1) * sizeof(uint64_t)));
    if (!d->floorFrom) return false;
    uint64_t lowest = std::numeric_limits<uint64_t>::max(), furthest = 0;
    d->floorFrom[page.blocks] = lowest;
    for (uint32_t b = page.blocks; b-- > 0;) {
        ForEachChunk(d, b, [&](uint64_t offset, uint64_t end) {
            lowest = std::min(lowest, offset);
            furthest = std::max(furthest, end);
        });
        d->floorFrom[b] = lowest;
    }
    d->keepUntil = furthest;
    return true;
}

void LetGoBefore(Decoder* d, uint64_t position) {
    if (!d->layout.ojpeg) d->input.DropBefore(position);
}

// Opens the page once its directory is held (or, the input having ended,
// with whatever arrived). Status 3, 2 while more is needed, or 1/6.
int OpenPage(Decoder* d) {
    // Nothing new is learnt from the directory before what it needs arrived.
    if (!d->ended && d->input.arrived() < d->directoryNeeds) return TIFF_STREAM_NEED_INPUT;
    const DirectoryScan scan = ScanFirstDirectory(d->input);
    d->directoryNeeds = scan.needed;
    if (scan.state == DirectoryScan::State::kNeedMore && !d->ended) return TIFF_STREAM_NEED_INPUT;
    d->openedSize = std::max(scan.dataEnd, d->input.arrived());
    d->position = 0;
    ConversionContext* ctx = d->ctx;
    d->tif = TIFFClientOpenPivlo("", "rm", d, ReadHeld, WriteNothing, SeekHeld, CloseNothing, SizeHeld, nullptr,
                                 nullptr, ctx->allocProc, ctx->reallocProc, ctx->freeProc);
    if (!d->tif) {
        // libtiff has said why; input that ended early is the likely cause.
        if (d->ended) return TIFF_STREAM_TRUNCATED;
        return Fail(d, nullptr);
    }
    if (!DescribeLayout(d->tif, &d->layout)) return Fail(d, "The page's size or layout cannot be read.");
    if (!TrackBlocks(d)) return Fail(d, "Out of memory for the page's layout.");
    d->colorSpace = ColourSpaceOf(d->tif);
    // The directory's bytes are libtiff's now; the page's data is what counts.
    if (d->floorFrom) LetGoBefore(d, d->floorFrom[0]);
    return TIFF_STREAM_HEADER;
}

// ---- rows ----

uint32_t DefaultBegin(void*, TIFF* tif, uint32_t* written) {
    if (TIFFIsTiled(tif)) {
        TIFFErrorExt(nullptr, kModule, "Tiled pages need a row reader.");
        return 0;
    }
    uint16_t planar = PLANARCONFIG_CONTIG;
    TIFFGetFieldDefaulted(tif, TIFFTAG_PLANARCONFIG, &planar);
    const tmsize_t size = TIFFScanlineSize(tif);
    if (planar != PLANARCONFIG_CONTIG || size <= 0 || static_cast<uint64_t>(size) > std::numeric_limits<uint32_t>::max()) {
        TIFFErrorExt(nullptr, kModule, "Rows of this page need a row reader.");
        return 0;
    }
    *written = static_cast<uint32_t>(size);
    return *written;
}

int DefaultRead(void* user, TIFF* tif, uint8_t* row) {
    auto* d = static_cast<Decoder*>(user);
    return TIFFReadScanline(tif, row, d->nextRow, 0) != -1;
}

bool BeginRows(Decoder* d) {
    if (d->reading) return true;
    if (!d->readerSet) d->reader = TIFFStreamRowReader{d, DefaultBegin, DefaultRead, nullptr};
    d->rowBytes = d->reader.begin(d->reader.user, d->tif, &d->rowWritten);
    d->reading = true;  // from here `end` is owed, whatever follows
    if (d->rowBytes == 0) return false;
    d->rowWritten = std::max(d->rowWritten, d->rowBytes);
    // A row is held whole: no larger than the input the decoder may hold.
    if (d->rowWritten > kHeldInputLimit) {
        TIFFErrorExt(nullptr, kModule, "A row of the page is larger than 1 GiB.");
        return false;
    }
    d->bandRows = BandRowsFor(d->rowBytes, d->layout.height);
    d->band = static_cast<uint8_t*>(Allocate(d, uint64_t{d->bandRows - 1} * d->rowBytes + d->rowWritten));
    if (!d->band) {
        TIFFErrorExt(nullptr, kModule, "Out of memory for a band of rows.");
        return false;
    }
    return true;
}

void EndRows(Decoder* d) {
    if (!d->reading) return;
    d->reading = false;
    if (d->reader.end) d->reader.end(d->reader.user);
}

// Whether the data of the page's first rows is there (or will never come):
// reading is set up, and its buffers taken, only then.
bool FirstRowsArrived(const Decoder* d) {
    return d->ended || BlockEnd(d, d->layout.BlockOf(d->nextRow)) <= d->input.arrived();
}

// Rows from `nextRow` whose data has all arrived, at most a band's worth;
// with the input ended, every row left (a read then says what is missing).
uint32_t RowsReady(Decoder* d) {
    const PageLayout& page = d->layout;
    const uint32_t most = std::min(d->bandRows, page.height - d->nextRow);
    if (d->ended) return most;
    uint32_t ready = 0;
    for (uint32_t block = page.BlockOf(d->nextRow); block < page.blocks && ready < most; ++block) {
        if (BlockEnd(d, block) > d->input.arrived()) break;
        const uint32_t blockEnd = static_cast<uint32_t>(std::min<uint64_t>(uint64_t{block + 1} * page.blockRows, page.height));
        ready = std::min(most, blockEnd - d->nextRow);
    }
    return ready;
}

// The next band through the row reader: status 4, 1 or 6.
int DeliverRows(Decoder* d, uint32_t rows) {
    if (d->cutShort) return TIFF_STREAM_TRUNCATED;
    uint32_t formed = 0;
    while (formed < rows && d->reader.read(d->reader.user, d->tif, d->band + uint64_t{formed} * d->rowBytes)) {
        ++formed;
        ++d->nextRow;
    }
    if (formed < rows) {
        // A row that cannot be formed once the input has ended marks the end
        // of what arrived; before that it is an error.
        if (!d->ended) return Fail(d, nullptr);
        d->cutShort = true;
        if (formed == 0) return TIFF_STREAM_TRUNCATED;
    }
    d->delivered = TIFFStreamBand{d->band, d->layout.width, formed, d->rowBytes, d->layout.height - d->nextRow, 0};
    if (d->floorFrom) d->pendingDrop = d->floorFrom[d->layout.BlockOf(d->nextRow)];
    return TIFF_STREAM_BAND;
}

// ---- raw delivery and bypass ----

// The page's single chunk, for raw delivery and the bypass; false (reported)
// when the page lists none with data.
bool TakeChunk(Decoder* d) {
    uint64_t offset = 0, end = 0;
    if (!ChunkExtent(d, 0, &offset, &end)) {
        TIFFErrorExt(nullptr, kModule, "The page's strip holds no data.");
        return false;
    }
    d->chunkOffset = offset;
    d->chunkSize = end - offset;
    d->keepUntil = end;
    d->pendingDrop = offset;
    return true;
}

// The held bytes of the chunk from `from` on (none when they are not held).
uint64_t ChunkBytesHeld(const Decoder* d, uint64_t from, const uint8_t** data) {
    const uint64_t end = std::min(d->input.end(), d->chunkOffset + d->chunkSize);
    *data = d->input.At(from);
    return *data && end > from ? end - from : 0;
}

// The next piece of the chunk as stored: status 4, 5, 6, or 2.
int DeliverRawPiece(Decoder* d) {
    if (d->chunkDelivered == d->chunkSize) return TIFF_STREAM_PAGE_DONE;
    const uint64_t piece = d->ctx->rawBufferOutSize ? d->ctx->rawBufferOutSize : d->chunkSize;
    const uint64_t from = d->chunkOffset + d->chunkDelivered;
    const uint64_t wanted = std::min(piece, d->chunkSize - d->chunkDelivered);
    const uint8_t* data = nullptr;
    const uint64_t held = ChunkBytesHeld(d, from, &data);
    if (held < wanted && !(d->ended && held > 0)) return d->ended ? TIFF_STREAM_TRUNCATED : TIFF_STREAM_NEED_INPUT;
    const uint64_t length = std::min(wanted, held);
    d->ctx->rawOutput = const_cast<uint8_t*>(data);
    d->ctx->rawOutputSize = static_cast<uint32_t>(length);
    d->chunkDelivered += length;
    d->pendingDrop = from + length;
    return TIFF_STREAM_BAND;
}

J_COLOR_SPACE StoredJpegColour(TIFF* tif) {
    uint16_t photometric = 0;
    TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric);
    switch (photometric) {
    case PHOTOMETRIC_MINISBLACK: return JCS_GRAYSCALE;
    case PHOTOMETRIC_RGB: return JCS_RGB;
    case PHOTOMETRIC_YCBCR: return JCS_YCbCr;
    default: return JCS_UNKNOWN;  // CMYK and the like: as the stream says
    }
}

J_COLOR_SPACE OutputJpegColour(uint32_t samples) {
    return samples == 1 ? JCS_GRAYSCALE : samples == 4 ? JCS_CMYK : JCS_RGB;
}

// The next band of the JPEG chunk decoded by libjpeg: status 4, 5, 6, 2 or 1.
int DeliverBypassRows(Decoder* d) {
    ConversionContext* ctx = d->ctx;
    if (!d->jpeg) {
        d->jpeg.reset(new (std::nothrow)
                          JpegBypass(StoredJpegColour(d->tif), OutputJpegColour(ctx->outputSamplesPerPixel)));
        if (!d->jpeg) return Fail(d, "Out of memory for the JPEG decoder.");
        ctx->rowsDelivered = 0;
    }
    for (;;) {
        const uint8_t* data = nullptr;
        const uint64_t available = ChunkBytesHeld(d, d->chunkOffset + d->jpeg->consumed(), &data);
        uint32_t rows = 0;
        const uint32_t before = d->jpeg->rowsDecoded();
        const JpegBypass::Step step = d->jpeg->Run(data, static_cast<size_t>(available), d->ended, d->band,
                                                   d->band ? d->bandRows : 0, &rows);
        LetGoBefore(d, d->chunkOffset + d->jpeg->consumed());
        switch (step) {
        case JpegBypass::Step::kFailed: return Fail(d, nullptr);
        case JpegBypass::Step::kNeedInput: return d->ended ? TIFF_STREAM_TRUNCATED : TIFF_STREAM_NEED_INPUT;
        case JpegBypass::Step::kDone: return TIFF_STREAM_PAGE_DONE;
        case JpegBypass::Step::kStarted: {
            const uint64_t rowBytes = d->jpeg->rowBytes();
            if (rowBytes == 0 || rowBytes > kHeldInputLimit) return Fail(d, "The JPEG's rows are too long.");
            d->rowBytes = static_cast<uint32_t>(rowBytes);
            d->bandRows = BandRowsFor(rowBytes, d->jpeg->height());
            d->band = static_cast<uint8_t*>(Allocate(d, uint64_t{d->bandRows} * rowBytes));
            if (!d->band) return Fail(d, "Out of memory for a band of rows.");
            continue;
        }
        case JpegBypass::Step::kRows:
            ctx->rowsDelivered = before;
            d->delivered = TIFFStreamBand{d->band, d->jpeg->width(), rows, d->rowBytes,
                                          d->jpeg->height() - d->jpeg->rowsDecoded(), rows};
            return TIFF_STREAM_BAND;
        }
    }
}

// ---- the call ----

// What the page needs next: the end of the input that completes the next
// delivery (0 when anything that comes will do).
uint64_t NextNeed(const Decoder* d) {
    if (!d->tif) return d->directoryNeeds;
    if (d->mode == ZAN_STREAM_NO_DECOMPRESSION || d->mode == ZAN_STREAM_BYPASS) return 0;
    const PageLayout& page = d->layout;
    for (uint32_t block = page.BlockOf(d->nextRow); block < page.blocks; ++block) {
        const uint64_t end = BlockEnd(d, block);
        if (end > d->input.arrived()) return end;
    }
    return 0;
}

// Takes input up to what the next delivery needs (the rest is passed again).
int TakeInput(Decoder* d, const uint8_t*& input, uint32_t& length, uint32_t* consumed) {
    const uint64_t need = NextNeed(d);
    uint32_t take = length;
    if (need > d->input.arrived()) take = static_cast<uint32_t>(std::min<uint64_t>(length, need - d->input.arrived()));
    if (uint64_t{d->input.arrived()} + take > PIVLO_SEEK_FAILED - 1) return Fail(d, "The stream is longer than 4 GiB.");
    switch (d->input.Take(input, take, d->keepUntil)) {
    case HeldInput::Taken::kOk: break;
    case HeldInput::Taken::kOverLimit: return Fail(d, "The stream holds more than 1 GiB of data not yet decoded.");
    case HeldInput::Taken::kNoMemory: return Fail(d, "Out of memory for the stream's data.");
    case HeldInput::Taken::kOutOfOrder: return Fail(d, "The stream's data cannot be held in order.");
    }
    input += take;
    length -= take;
    *consumed += take;
    return 0;
}

// One delivery once the page is open, by the mode in force: a status, or 0
// when more input is needed.
int Deliver(Decoder* d) {
    if (!d->started) {
        d->started = true;
        d->mode = d->ctx->streamMode;
        if ((d->mode == ZAN_STREAM_NO_DECOMPRESSION || d->mode == ZAN_STREAM_BYPASS) && !TakeChunk(d))
            return Fail(d, nullptr);
    }
    int status = 0;
    if (d->mode == ZAN_STREAM_NO_DECOMPRESSION) {
        status = DeliverRawPiece(d);
    } else if (d->mode == ZAN_STREAM_BYPASS) {
        status = DeliverBypassRows(d);
    } else {
        if (d->nextRow >= d->layout.height) status = TIFF_STREAM_PAGE_DONE;
        else if (!d->reading && !FirstRowsArrived(d)) status = TIFF_STREAM_NEED_INPUT;
        else if (!BeginRows(d)) return Fail(d, nullptr);
        else if (const uint32_t rows = RowsReady(d)) status = DeliverRows(d, rows);
        else status = TIFF_STREAM_NEED_INPUT;
    }
    if (status == TIFF_STREAM_PAGE_DONE) {
        d->done = true;
        EndRows(d);
    }
    return status == TIFF_STREAM_NEED_INPUT ? 0 : status;
}

int Decode(Decoder* d, const uint8_t* input, uint32_t length, uint32_t* consumed) {
    if (d->failed) return TIFF_STREAM_ERROR;
    if (d->pendingDrop) LetGoBefore(d, std::exchange(d->pendingDrop, 0));
    for (;;) {
        if (d->done) {
            // Whatever follows the page is not needed.
            *consumed += length;
            return TIFF_STREAM_PAGE_DONE;
        }
        const bool more = length > 0;
        if (!d->tif) {
            if (d->input.arrived() > 0 || d->ended) {
                const int status = OpenPage(d);
                if (status != TIFF_STREAM_NEED_INPUT) return status;
            }
        } else if (const int status = Deliver(d)) {
            return status;
        }
        if (!more) return d->ended ? TIFF_STREAM_TRUNCATED : TIFF_STREAM_NEED_INPUT;
        if (TakeInput(d, input, length, consumed)) return TIFF_STREAM_ERROR;
    }
}

}  // namespace
}  // namespace osttiff

TIFFStreamDecoder::~TIFFStreamDecoder() {
    osttiff::EndRows(this);
    jpeg.reset();
    if (tif) TIFFClose(tif);
    osttiff::Release(this, band);
    osttiff::Release(this, floorFrom);
}

extern "C" {

TIFFStreamDecoder* TIFFStreamDecodeInit(void* hostValue, void* context) {
    auto* ctx = static_cast<ConversionContext*>(context);
    if (!ctx || !ctx->allocProc || !ctx->freeProc) return nullptr;
    void* block = ctx->allocProc(sizeof(TIFFStreamDecoder));
    if (!block) return nullptr;
    return new (block) TIFFStreamDecoder(hostValue, ctx);
}

void TIFFStreamDecodeSetRowReader(TIFFStreamDecoder* decoder, const TIFFStreamRowReader* reader) {
    if (!decoder || !reader || decoder->reading) return;
    decoder->reader = *reader;
    decoder->readerSet = reader->begin && reader->read;
}

int TIFFStreamDecode(TIFFStreamDecoder* decoder, const void* input, uint32_t length, uint32_t* consumed) {
    uint32_t unused = 0;
    if (!consumed) consumed = &unused;
    *consumed = 0;
    if (!decoder) return TIFF_STREAM_ERROR;
    if (!input) length = 0;
    return osttiff::Decode(decoder, static_cast<const uint8_t*>(input), length, consumed);
}

void TIFFStreamDecodeComplete(TIFFStreamDecoder* decoder) {
    if (decoder) decoder->ended = true;
}

void TIFFStreamDecodeEnd(void* context, TIFFStreamDecoder** decoder) {
    (void)context;
    if (!decoder || !*decoder) return;
    TIFFStreamDecoder* d = *decoder;
    *decoder = nullptr;
    ZanFreeProc release = d->ctx->freeProc;
    d->~TIFFStreamDecoder();
    release(d);
}

TIFF* TIFFStreamDecodeTIFF(TIFFStreamDecoder* decoder) { return decoder ? decoder->tif : nullptr; }

uint32_t TIFFStreamDecodeColorSpace(TIFFStreamDecoder* decoder) { return decoder ? decoder->colorSpace : 0; }

const TIFFStreamBand* TIFFStreamDecodeBand(TIFFStreamDecoder* decoder) {
    return decoder ? &decoder->delivered : nullptr;
}

void* TIFFStreamDecodeHostValue(TIFFStreamDecoder* decoder) { return decoder ? decoder->hostValue : nullptr; }

int TIFFStreamDecodeStarted(TIFFStreamDecoder* decoder) { return decoder && decoder->started; }

}  // extern "C"
