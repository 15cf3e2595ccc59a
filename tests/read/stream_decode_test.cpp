// Push decoding: a TIFF fed in pieces gives the rows the scanline reader
// gives, whatever the pieces; the page's description and one-chunk pages;
// raw delivery and libjpeg's bypass; the ink stretch; input that ends early
// or runs away.

#include <gtest/gtest.h>

#include <tiffio.h>

#include <algorithm>

#include "read_support.h"
#include "support/corpus.h"
#include "support/jpeg_fixtures.h"

namespace {

using namespace zantest;

// What a stream decode gave: the rows of its bands, the statuses in order
// (repeats of 4 without output folded), the raw pieces.
struct Streamed {
    std::vector<Bytes> rows;
    std::vector<Bytes> raw;
    std::vector<int> statuses;
    int last = 0;
    uint32_t consumed = 0;
    uint32_t colorSpace = 0, streamMode = 0, chunkType = 0;
    std::vector<std::string> errors;
};

enum class Choice { Decode, Raw, Bypass };

// Feeds `tiff` in pieces of `piece` bytes (0: whole), ending with
// zanTIFFStreamDecodeComplete after `prefix` bytes (all when 0).
Streamed StreamDecode(const Bytes& tiff, uint32_t piece, Choice choice = Choice::Decode, size_t prefix = 0,
                      uint32_t rawPiece = 0) {
    Streamed out;
    TestHost host;
    host->outputBitsPerSample = 16;
    if (zanTIFFStreamDecodeInit(host.ctx(), nullptr) != 2) {
        out.errors = host.Errors();
        return out;
    }
    const size_t total = prefix ? prefix : tiff.size();
    size_t at = 0;
    bool ended = false;
    StreamChunk chunk{};
    for (int guard = 0; guard < 10'000'000; ++guard) {
        if (chunk.inputLength == 0 && at < total) {
            const size_t n = piece ? std::min<size_t>(piece, total - at) : total - at;
            chunk.input = tiff.data() + at;
            chunk.inputLength = static_cast<uint32_t>(n);
            at += n;
        } else if (chunk.inputLength == 0 && !ended) {
            zanTIFFStreamDecodeComplete(host.ctx());
            ended = true;
        }
        const int status = zanTIFFStreamDecode(host.ctx(), &chunk);
        if (out.statuses.empty() || status != out.statuses.back() || chunk.output) out.statuses.push_back(status);
        if (status == ZAN_STREAM_PAGE_DESCRIBED) {
            out.colorSpace = host->colorSpace;
            out.streamMode = host->streamMode;
            out.chunkType = host->chunkType;
            if (choice == Choice::Raw) {
                zanTIFFStreamDecodeSetRawBufferOutSize(host.ctx(), rawPiece);
                EXPECT_EQ(zanTIFFStreamDecodeSetNoDecompression(host.ctx()), 1);
            }
            if (choice == Choice::Bypass) {
                EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), 1);
            }
        }
        if (status == ZAN_STREAM_CONTINUE && chunk.output) {
            const auto* data = static_cast<const uint8_t*>(chunk.output);
            if (host->streamMode == ZAN_STREAM_NO_DECOMPRESSION) {
                out.raw.emplace_back(data, data + chunk.rawSize);
            } else {
                const uint32_t stride = chunk.bandValue ? chunk.bandValue : chunk.bandWidth * host->outputSamplesPerPixel;
                for (uint32_t r = 0; r < chunk.bandRows; ++r) out.rows.emplace_back(data + r * stride, data + (r + 1) * stride);
            }
        }
        if (status == ZAN_STREAM_ERROR || status == ZAN_STREAM_STATUS_5 || status == ZAN_STREAM_STATUS_6) {
            out.last = status;
            break;
        }
    }
    out.consumed = chunk.inputConsumed;
    out.errors = host.Errors();
    for (const CodecMessage& m : host.codecErrors) out.errors.push_back(m.text);
    EXPECT_EQ(zanTIFFStreamDecodeEnd(host.ctx()), 1);
    EXPECT_EQ(host->streamDecoder, nullptr);
    return out;
}

// The scanline reader's rows of the first page (16-bit lines kept).
std::vector<Bytes> ReaderRows(const Bytes& tiff, bool* complete = nullptr) {
    ReadJob job(tiff);
    job->outputBitsPerSample = 16;
    job->pageNumber = 1;
    std::vector<Bytes> rows;
    if (job.GetInfo()) rows = job.ReadAll();
    if (complete) *complete = !rows.empty() && rows.size() == job->imageHeight;
    return rows;
}

TEST(StreamDecode, AnySplitGivesTheReadersRows) {
    FileSpec rgb;
    rgb.pages[0].width = 37;
    rgb.pages[0].height = 29;
    rgb.pages[0].samplesPerPixel = 3;
    rgb.pages[0].photometric = PHOTOMETRIC_RGB;
    rgb.pages[0].compression = COMPRESSION_LZW;
    rgb.pages[0].rowsPerStrip = 4;
    FileSpec palette = rgb;
    palette.pages[0].photometric = PHOTOMETRIC_PALETTE;
    palette.pages[0].samplesPerPixel = 1;
    palette.pages[0].bitsPerSample = 4;
    for (int i = 0; i < 48; ++i) palette.pages[0].colorMap.push_back(static_cast<uint16_t>(i * 1361));
    FileSpec tiled = rgb;
    tiled.pages[0].tileWidth = tiled.pages[0].tileHeight = 16;
    FileSpec deep = rgb;
    deep.pages[0].bitsPerSample = 16;
    deep.pages[0].compression = COMPRESSION_ADOBE_DEFLATE;
    FileSpec planar = rgb;
    planar.pages[0].compression = COMPRESSION_NONE;
    planar.pages[0].planar = PLANARCONFIG_SEPARATE;
    JpegPageSpec jpeg;
    const struct Case {
        const char* what;
        Bytes tiff;
    } cases[] = {{"RGB LZW, directory last", MakeTiff(rgb)},
                 {"4-bit palette", MakeTiff(palette)},
                 {"tiled", MakeTiff(tiled)},
                 {"16-bit Deflate", MakeTiff(deep)},
                 {"separate planes", MakeTiff(planar)},
                 {"JPEG 4:2:0", MakeJpegTiff(jpeg)}};
    for (const Case& c : cases) {
        const std::vector<Bytes> want = ReaderRows(c.tiff);
        ASSERT_FALSE(want.empty()) << c.what;
        for (uint32_t piece : {1u, 7u, 4096u, 0u}) {
            SCOPED_TRACE(::testing::Message() << c.what << ", pieces of " << piece);
            const Streamed got = StreamDecode(c.tiff, piece);
            EXPECT_EQ(got.last, ZAN_STREAM_STATUS_5) << ::testing::PrintToString(got.errors);
            EXPECT_TRUE(got.rows == want);
            EXPECT_EQ(std::count(got.statuses.begin(), got.statuses.end(), ZAN_STREAM_PAGE_DESCRIBED), 1);
        }
    }
}

// Every corpus file the scanline reader reads: the same rows from any split
// (pieces of a byte only for the smaller files); files it cannot read end
// with a status, never a crash.
TEST(StreamDecode, CorpusFilesGiveTheReadersRows) {
    int compared = 0;
    std::vector<std::string> differing;
    for (const CorpusFile& file : CorpusFiles()) {
        const Bytes tiff = ReadFileBytes(file.path);
        bool complete = false;
        const std::vector<Bytes> want = ReaderRows(tiff, &complete);
        for (uint32_t piece : {1u, 7u, 4096u, 0u}) {
            if (piece == 1 && tiff.size() > (64u << 10)) continue;
            const Streamed got = StreamDecode(tiff, piece);
            EXPECT_TRUE(got.last == ZAN_STREAM_STATUS_5 || got.last == ZAN_STREAM_STATUS_6 || !got.errors.empty())
                << file.relpath << " ended with " << got.last << " and no message";
            if (!complete) continue;
            if (got.rows != want || got.last != ZAN_STREAM_STATUS_5) {
                differing.push_back(file.relpath + " (pieces of " + std::to_string(piece) + ", status " +
                                    std::to_string(got.last) + ", " + std::to_string(got.rows.size()) + "/" +
                                    std::to_string(want.size()) + " rows)");
                break;
            }
        }
        compared += complete;
    }
    EXPECT_TRUE(differing.empty()) << ::testing::PrintToString(differing);
    if (!CorpusDir().empty()) {
        EXPECT_GT(compared, 100);
    }
}

// A page that ends early: the rows that arrived, then 6 (or an error with
// its message), never a crash.
TEST(StreamDecode, InputThatEndsEarlyEndsTheDecode) {
    FileSpec spec;
    spec.pages[0].width = 40;
    spec.pages[0].height = 30;
    spec.pages[0].compression = COMPRESSION_LZW;
    spec.pages[0].rowsPerStrip = 5;
    const Bytes tiff = MakeTiff(spec);  // libtiff writes the directory last
    const std::vector<Bytes> all = ReaderRows(tiff);
    for (size_t prefix : {size_t{1}, size_t{8}, tiff.size() / 2, tiff.size() - 1}) {
        SCOPED_TRACE(prefix);
        const Streamed got = StreamDecode(tiff, 4096, Choice::Decode, prefix);
        EXPECT_TRUE(got.last == ZAN_STREAM_STATUS_6 || (got.last == ZAN_STREAM_ERROR && !got.errors.empty()));
        EXPECT_TRUE(got.rows.empty()) << "the directory comes last";
    }
    // Directory first: the rows whose strips arrived come out.
    const Bytes directoryFirst = ReadFileBytes(CorpusDir() + "/imagecodecs/gray.u1.tif");
    if (directoryFirst.empty()) GTEST_SKIP() << "no corpus";
    const std::vector<Bytes> want = ReaderRows(directoryFirst);
    const Streamed half = StreamDecode(directoryFirst, 7, Choice::Decode, directoryFirst.size() / 2);
    EXPECT_EQ(half.last, ZAN_STREAM_STATUS_6);
    ASSERT_FALSE(half.rows.empty());
    EXPECT_LT(half.rows.size(), want.size());
    EXPECT_TRUE(std::equal(half.rows.begin(), half.rows.end(), want.begin()));
}

// The calls around the decoder: no decoder, no chunk, and what a status of
// "needs more" looks like.
TEST(StreamDecode, CallsOutOfOrderAreRefused) {
    TestHost host;
    StreamChunk chunk{};
    EXPECT_EQ(zanTIFFStreamDecode(host.ctx(), &chunk), ZAN_STREAM_ERROR);
    EXPECT_EQ(host.Errors(), std::vector<std::string>{"The stream decoder has not been started."});
    uint32_t answer = 7;
    EXPECT_EQ(zanTIFFStreamDecodeIsOneChunkTIFF(host.ctx(), &answer), 0);
    EXPECT_EQ(answer, 0u);
    EXPECT_EQ(zanTIFFStreamDecodeSetNoDecompression(host.ctx()), 0);
    EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), 0);

    ASSERT_EQ(zanTIFFStreamDecodeInit(host.ctx(), nullptr), 2);
    const Bytes tiff = MakeTiff(FileSpec{});
    chunk.input = tiff.data();
    chunk.inputLength = 5;
    EXPECT_EQ(zanTIFFStreamDecode(host.ctx(), &chunk), ZAN_STREAM_CONTINUE);
    EXPECT_EQ(chunk.output, nullptr);
    EXPECT_EQ(chunk.inputConsumed, 5u);
    EXPECT_EQ(chunk.inputLength, 0u);
    EXPECT_EQ(chunk.input, tiff.data() + 5);
    // Not a TIFF: the codec says so, and the error sticks.
    TestHost other;
    ASSERT_EQ(zanTIFFStreamDecodeInit(other.ctx(), nullptr), 2);
    const Bytes garbage(64, 'x');
    StreamChunk bad{garbage.data(), 64, 0, nullptr, 0, 0, 0, 0, 0};
    EXPECT_EQ(zanTIFFStreamDecode(other.ctx(), &bad), ZAN_STREAM_ERROR);
    EXPECT_FALSE(other.codecErrors.empty());
    EXPECT_EQ(zanTIFFStreamDecode(other.ctx(), &bad), ZAN_STREAM_ERROR);
    zanTIFFStreamDecodeEnd(other.ctx());
    zanDestroyTIFF(host.ctx());  // the host's teardown ends a decoder left running
    EXPECT_EQ(host->streamDecoder, nullptr);
}

Bytes G4Page(uint32_t rowsPerStrip, uint32_t tile = 0) {
    FileSpec spec;
    PageSpec& p = spec.pages[0];
    p.width = p.height = 32;
    p.bitsPerSample = 1;
    p.photometric = PHOTOMETRIC_MINISWHITE;
    p.compression = COMPRESSION_CCITTFAX4;
    p.rowsPerStrip = rowsPerStrip;
    p.tileWidth = p.tileHeight = tile;
    return MakeTiff(spec);
}

// The strip (or tile) 0 of the first page as stored.
Bytes FirstChunk(const Bytes& tiff) {
    TempFile file;
    WriteFileBytes(file.path(), tiff);
    TIFF* tif = TIFFOpen(file.c_str(), "r");
    Bytes data(static_cast<size_t>(TIFFGetStrileByteCount(tif, 0)));
    const uint64_t offset = TIFFGetStrileOffset(tif, 0);
    TIFFClose(tif);
    std::copy_n(tiff.begin() + static_cast<std::ptrdiff_t>(offset), data.size(), data.begin());
    return data;
}

TEST(StreamDecode, OneChunkPagesAndHowTheyAreDelivered) {
    JpegPageSpec oneStrip;
    oneStrip.rowsPerStrip = oneStrip.height;
    oneStrip.tables = false;
    JpegPageSpec withTables = oneStrip;
    withTables.tables = true;
    JpegPageSpec grey = oneStrip;
    grey.components = 1;
    grey.h = grey.v = 1;
    const struct Case {
        const char* what;
        Bytes tiff;
        uint32_t mode, type;
    } cases[] = {
        {"JPEG, one strip", MakeJpegTiff(oneStrip), ZAN_STREAM_ONE_CHUNK, 5},
        {"grey JPEG, one strip", MakeJpegTiff(grey), ZAN_STREAM_ONE_CHUNK, 5},
        {"JPEG with JPEGTables", MakeJpegTiff(withTables), ZAN_STREAM_DESCRIBED, 0},
        {"Group 4, one strip", G4Page(32), ZAN_STREAM_ONE_CHUNK, 4},
        {"Group 4, one tile", G4Page(0, 32), ZAN_STREAM_ONE_CHUNK, 4},
        {"Group 4, two strips", G4Page(16), ZAN_STREAM_DESCRIBED, 0},
        {"uncompressed", MakeTiff(FileSpec{}), ZAN_STREAM_DESCRIBED, 0},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        const Streamed plain = StreamDecode(c.tiff, 100);
        EXPECT_EQ(plain.streamMode, c.mode);
        EXPECT_EQ(plain.chunkType, c.type);
        EXPECT_TRUE(plain.rows == ReaderRows(c.tiff));
        if (c.type == 0) continue;
        // Raw delivery: the chunk as stored, in pieces of the size asked for.
        const Bytes chunk = FirstChunk(c.tiff);
        for (uint32_t piece : {0u, 5u}) {
            const Streamed raw = StreamDecode(c.tiff, 100, Choice::Raw, 0, piece);
            EXPECT_EQ(raw.last, ZAN_STREAM_STATUS_5);
            Bytes joined;
            for (const Bytes& p : raw.raw) {
                EXPECT_LE(p.size(), piece ? piece : chunk.size());
                joined.insert(joined.end(), p.begin(), p.end());
            }
            EXPECT_EQ(joined, chunk);
            EXPECT_EQ(raw.raw.size(), piece ? (chunk.size() + piece - 1) / piece : 1u);
        }
        if (c.type != 5) continue;
        // Bypass: libjpeg's own rows of the strip.
        const Streamed bypass = StreamDecode(c.tiff, 100, Choice::Bypass);
        EXPECT_EQ(bypass.last, ZAN_STREAM_STATUS_5) << ::testing::PrintToString(bypass.errors);
        const DecodedJpeg own = DecodeJpeg(chunk, false, true);
        Bytes rows;
        for (const Bytes& r : bypass.rows) rows.insert(rows.end(), r.begin(), r.end());
        EXPECT_EQ(rows, own.pixels);
    }
}

TEST(StreamDecode, RawDeliveryAndBypassAreChosenOnce) {
    const Bytes g4 = G4Page(32);
    JpegPageSpec spec;
    spec.rowsPerStrip = spec.height;
    spec.tables = false;
    const Bytes jpeg = MakeJpegTiff(spec);
    for (const Bytes* tiff : {&g4, &jpeg}) {
        TestHost host;
        ASSERT_EQ(zanTIFFStreamDecodeInit(host.ctx(), nullptr), 2);
        StreamChunk chunk{tiff->data(), static_cast<uint32_t>(tiff->size()), 0, nullptr, 0, 0, 0, 0, 0};
        ASSERT_EQ(zanTIFFStreamDecode(host.ctx(), &chunk), ZAN_STREAM_PAGE_DESCRIBED);
        if (tiff == &g4) {
            EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), 0) << "Group 4 goes to libtiff";
            EXPECT_EQ(host->streamMode, static_cast<uint32_t>(ZAN_STREAM_ONE_CHUNK));
            // Once rows were delivered, the way is fixed.
            EXPECT_EQ(zanTIFFStreamDecode(host.ctx(), &chunk), ZAN_STREAM_CONTINUE);
            EXPECT_EQ(zanTIFFStreamDecodeSetNoDecompression(host.ctx()), 0);
        } else {
            EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), 1);
            EXPECT_EQ(host->outputSamplesPerPixel, 3u);
            EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), 1) << "already chosen";
            EXPECT_EQ(zanTIFFStreamDecodeSetNoDecompression(host.ctx()), 0);
            EXPECT_EQ(host->rawChunkSize, FirstChunk(*tiff).size());
        }
        zanTIFFStreamDecodeEnd(host.ctx());
    }
}

// A CMYK page of 8-bit inks with the given DotRange.
Bytes CmykPage(const Bytes& inks, uint16_t low, uint16_t high) {
    TempFile file;
    TIFF* tif = TIFFOpen(file.c_str(), "w");
    TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, static_cast<uint32_t>(inks.size() / 4));
    TIFFSetField(tif, TIFFTAG_IMAGELENGTH, 1u);
    TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 4);
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_SEPARATED);
    TIFFSetField(tif, TIFFTAG_DOTRANGE, low, high);
    TIFFWriteScanline(tif, const_cast<uint8_t*>(inks.data()), 0, 0);
    TIFFClose(tif);
    return ReadFileBytes(file.path());
}

TEST(StreamDecode, InksAreStretchedFromTheDotRange) {
    const Bytes inks = {16, 235, 126, 100, 0, 255, 101, 50};
    const struct Case {
        uint16_t low, high;
        Bytes want;
    } cases[] = {
        {0, 255, inks},
        {16, 235, {0, 255, 128, 97, 0, 255, 98, 39}},
        {100, 100, {0, 255, 255, 0, 0, 255, 255, 0}},  // equal bounds: a threshold
        {200, 100, {255, 0, 188, 255, 255, 0, 252, 255}},  // reversed: clamped
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(::testing::Message() << c.low << ".." << c.high);
        const Streamed got = StreamDecode(CmykPage(inks, c.low, c.high), 0);
        EXPECT_EQ(got.colorSpace, static_cast<uint32_t>(ZAN_COLORSPACE_CMYK));
        ASSERT_EQ(got.rows.size(), 1u);
        EXPECT_EQ(got.rows[0], c.want);
    }
}

TEST(StreamDecode, EveryAllocationCanFailCleanly) {
    FileSpec spec;
    spec.pages[0].photometric = PHOTOMETRIC_PALETTE;
    spec.pages[0].bitsPerSample = 4;
    for (int i = 0; i < 48; ++i) spec.pages[0].colorMap.push_back(static_cast<uint16_t>(i * 999));
    const Bytes tiff = MakeTiff(spec);
    for (int n = 1;; ++n) {
        int calls = 0;
        int last = 0;
        {
            TestAllocator::Reset();
            TestAllocator::FailNthCall(n);
            const Streamed got = StreamDecode(tiff, 50);
            calls = TestAllocator::Calls();
            last = got.last;
            if (last != ZAN_STREAM_STATUS_5) {
                EXPECT_FALSE(got.errors.empty()) << n;
            }
        }
        TestAllocator::Reset();
        EXPECT_EQ(TestAllocator::LiveBlocks(), 0u) << n;
        if (calls < n) {
            EXPECT_EQ(last, ZAN_STREAM_STATUS_5);
            break;
        }
    }
}

}  // namespace
