// Push decoding: a TIFF fed in pieces gives the rows the scanline reader
// gives, whatever the pieces; the page's description and one-chunk pages;
// raw delivery and libjpeg's bypass; the ink stretch; input that ends early
// or runs away.

#include "read_support.h"

namespace {

using namespace zantest;

// What a stream decode gave: the rows of its bands, the raw pieces, the last
// status and how often the page was described.
struct Streamed {
    std::vector<Bytes> rows, raw;
    int last = 0, descriptions = 0;
    uint32_t streamMode = 0, chunkType = 0, colorSpace = 0, rawChunkSize = 0;
    std::vector<std::string> errors;
};

enum class Choice { Decode, Raw, Bypass };

// Feeds `tiff` in pieces of `piece` bytes (0: whole), ending with
// zanTIFFStreamDecodeComplete after `prefix` bytes (all when 0). Raw delivery
// or the bypass is asked for when the page is described; once rows were
// delivered, neither can be chosen any more.
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
        if (status == ZAN_STREAM_PAGE_DESCRIBED) {
            ++out.descriptions;
            out.colorSpace = host->colorSpace;
            out.streamMode = host->streamMode;
            out.chunkType = host->chunkType;
            if (choice == Choice::Raw) {
                zanTIFFStreamDecodeSetRawBufferOutSize(host.ctx(), rawPiece);
                EXPECT_EQ(zanTIFFStreamDecodeSetNoDecompression(host.ctx()), 1);
            } else if (choice == Choice::Bypass && host->chunkType == 5) {
                EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), 1);
                EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), 1) << "already chosen";
                EXPECT_EQ(zanTIFFStreamDecodeSetNoDecompression(host.ctx()), 0);
            } else if (choice == Choice::Bypass) {
                EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), 0) << "not a JPEG chunk";
            }
            out.rawChunkSize = host->rawChunkSize;
        }
        if (status == ZAN_STREAM_CONTINUE && chunk.output) {
            const auto* data = static_cast<const uint8_t*>(chunk.output);
            if (host->streamMode == ZAN_STREAM_NO_DECOMPRESSION) {
                out.raw.emplace_back(data, data + chunk.rawSize);
            } else {
                const uint32_t stride = chunk.bandValue ? chunk.bandValue : chunk.bandWidth * host->outputSamplesPerPixel;
                for (uint32_t r = 0; r < chunk.bandRows; ++r) out.rows.emplace_back(data + r * stride, data + (r + 1) * stride);
                EXPECT_EQ(zanTIFFStreamDecodeSetNoDecompression(host.ctx()), 0);
                EXPECT_EQ(zanTIFFStreamDecodeSetBypassLibTiff(host.ctx()), host->streamMode == ZAN_STREAM_BYPASS);
            }
        }
        if (status == ZAN_STREAM_ERROR || status == ZAN_STREAM_STATUS_5 || status == ZAN_STREAM_STATUS_6) {
            out.last = status;
            break;
        }
    }
    out.errors = host.Errors();
    for (const CodecMessage& m : host.codecErrors) out.errors.push_back(m.text);
    EXPECT_EQ(zanTIFFStreamDecodeEnd(host.ctx()), 1);
    EXPECT_EQ(host->streamDecoder, nullptr);
    return out;
}

// The scanline reader's rows of the first page (16-bit lines kept), or none
// when it cannot read them all.
std::vector<Bytes> ReaderRows(const Bytes& tiff) {
    ReadJob job(tiff);
    job->outputBitsPerSample = 16;
    job->pageNumber = 1;
    std::vector<Bytes> rows;
    if (job.GetInfo()) rows = job.ReadAll();
    return rows.size() == job->imageHeight ? rows : std::vector<Bytes>{};
}

TEST(StreamDecode, CorpusFilesGiveTheReadersRows) {
    // Every corpus file the scanline reader reads: the same rows, the end of
    // the page and one description from any split (pieces of a byte only for
    // the smaller files); files it cannot read end with a status, never a crash.
    int compared = 0;
    std::vector<std::string> differing;
    for (const CorpusFile& file : CorpusFiles()) {
        const Bytes tiff = ReadFileBytes(file.path);
        const std::vector<Bytes> want = ReaderRows(tiff);
        for (uint32_t piece : {1u, 7u, 4096u, 0u}) {
            if (piece == 1 && tiff.size() > (64u << 10)) continue;
            const Streamed got = StreamDecode(tiff, piece);
            EXPECT_TRUE(got.last == ZAN_STREAM_STATUS_5 || got.last == ZAN_STREAM_STATUS_6 || !got.errors.empty())
                << file.relpath << " ended with " << got.last << " and no message";
            if (!want.empty() && (got.rows != want || got.last != ZAN_STREAM_STATUS_5 || got.descriptions != 1)) {
                differing.push_back(file.relpath + " (pieces of " + std::to_string(piece) + ")");
                break;
            }
        }
        compared += !want.empty();
    }
    EXPECT_TRUE(differing.empty()) << ::testing::PrintToString(differing);
    if (!CorpusDir().empty()) {
        EXPECT_GT(compared, 100);
    }
}

TEST(StreamDecode, InputThatEndsEarlyEndsTheDecode) {
    // A page that ends early: the rows that arrived, then 6 (or an error with
    // its message), never a crash.
    const Bytes tiff = OnePage(Page(40, 30, 1, PHOTOMETRIC_MINISBLACK, 8, COMPRESSION_LZW, 1, 5));
    for (size_t prefix : {size_t{1}, size_t{8}, tiff.size() / 2, tiff.size() - 1}) {
        SCOPED_TRACE(prefix);
        const Streamed got = StreamDecode(tiff, 4096, Choice::Decode, prefix);
        EXPECT_TRUE(got.last == ZAN_STREAM_STATUS_6 || (got.last == ZAN_STREAM_ERROR && !got.errors.empty()));
        EXPECT_TRUE(got.rows.empty()) << "libtiff writes the directory last";
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

TEST(StreamDecode, CallsOutOfOrderAreRefused) {
    // No decoder, and what a status of "needs more" looks like; not a TIFF:
    // the codec says so, and the error sticks; the host's teardown ends a
    // decoder left running.
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
    const Bytes tiff = MakeTiff(FileLayout{});
    chunk.input = tiff.data();
    chunk.inputLength = 5;
    EXPECT_EQ(zanTIFFStreamDecode(host.ctx(), &chunk), ZAN_STREAM_CONTINUE);
    EXPECT_EQ(chunk.output, nullptr);
    EXPECT_EQ(chunk.inputConsumed, 5u);
    EXPECT_EQ(chunk.inputLength, 0u);
    EXPECT_EQ(chunk.input, tiff.data() + 5);
    TestHost other;
    ASSERT_EQ(zanTIFFStreamDecodeInit(other.ctx(), nullptr), 2);
    const Bytes garbage(64, 'x');
    StreamChunk bad{garbage.data(), 64, 0, nullptr, 0, 0, 0, 0, 0};
    EXPECT_EQ(zanTIFFStreamDecode(other.ctx(), &bad), ZAN_STREAM_ERROR);
    EXPECT_FALSE(other.codecErrors.empty());
    EXPECT_EQ(zanTIFFStreamDecode(other.ctx(), &bad), ZAN_STREAM_ERROR);
    zanTIFFStreamDecodeEnd(other.ctx());
    zanDestroyTIFF(host.ctx());
    EXPECT_EQ(host->streamDecoder, nullptr);
    // A row the decoder would have to hold beyond its limit is refused
    // before anything is sized from it.
    const Streamed huge = StreamDecode(HugePage(1200u << 20, 1, 1, 8, 1300u << 10), 0);
    EXPECT_EQ(huge.last, ZAN_STREAM_ERROR);
    EXPECT_NE(std::find(huge.errors.begin(), huge.errors.end(), "TIFFStreamDecode:A row of the page is larger than 1 GiB."),
              huge.errors.end())
        << ::testing::PrintToString(huge.errors);
}

TEST(StreamDecode, AnySplitGivesTheReadersRowsAndOneChunkPagesTheirChunk) {
    // From any pieces: the reader's rows, the end of the page, one
    // description, and the mode and chunk type the host sees. A one-chunk
    // page raw, as stored, in pieces of the size asked for; a JPEG chunk
    // through libjpeg as libjpeg decodes it (a Group 4 chunk cannot take that way).
    PageLayout palette = Page(37, 29, 1, PHOTOMETRIC_PALETTE, 4, COMPRESSION_LZW);
    for (int i = 0; i < 48; ++i) palette.colorMap.push_back(static_cast<uint16_t>(i * 1361));
    const struct Case {
        const char* what;
        Bytes tiff;
        uint32_t mode = ZAN_STREAM_DESCRIBED, type = 0;
    } cases[] = {
        {"RGB LZW, directory last", OnePage(Page(37, 29, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW))},
        {"4-bit palette", OnePage(palette)},
        {"tiled", OnePage(Tiled(Page(37, 29, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_LZW)))},
        {"16-bit Deflate", OnePage(Page(37, 29, 3, PHOTOMETRIC_RGB, 16, COMPRESSION_ADOBE_DEFLATE))},
        {"separate planes", OnePage(Page(37, 29, 3, PHOTOMETRIC_RGB, 8, COMPRESSION_NONE, PLANARCONFIG_SEPARATE))},
        {"JPEG, three strips", MakeJpegTiff({})},
        {"JPEG with JPEGTables, one strip", MakeJpegTiff({.rowsPerStrip = 48})},
        {"JPEG, one strip", MakeJpegTiff({.rowsPerStrip = 48, .tables = false}), ZAN_STREAM_ONE_CHUNK, 5},
        {"grey JPEG, one strip", MakeJpegTiff({.rowsPerStrip = 48, .components = 1, .h = 1, .v = 1, .tables = false}),
         ZAN_STREAM_ONE_CHUNK, 5},
        {"Group 4, one strip", G4Page(32, 32), ZAN_STREAM_ONE_CHUNK, 4},
        {"Group 4, one tile", G4Page(32, 32, PHOTOMETRIC_MINISWHITE, 0, 32), ZAN_STREAM_ONE_CHUNK, 4},
        {"Group 4, two strips", G4Page(32, 32, PHOTOMETRIC_MINISWHITE, 16)},
    };
    for (const Case& c : cases) {
        const std::vector<Bytes> want = ReaderRows(c.tiff);
        ASSERT_FALSE(want.empty()) << c.what;
        for (uint32_t piece : {1u, 7u, 100u, 4096u, 0u}) {
            SCOPED_TRACE(::testing::Message() << c.what << ", pieces of " << piece);
            const Streamed plain = StreamDecode(c.tiff, piece);
            EXPECT_EQ(plain.last, ZAN_STREAM_STATUS_5) << ::testing::PrintToString(plain.errors);
            EXPECT_EQ(plain.descriptions, 1);
            EXPECT_EQ(plain.streamMode, c.mode);
            EXPECT_EQ(plain.chunkType, c.type);
            EXPECT_TRUE(plain.rows == want);
        }
        SCOPED_TRACE(c.what);
        if (c.type == 0) continue;
        const Bytes chunk = RawChunk(c.tiff);
        for (uint32_t piece : {0u, 5u}) {
            const Streamed raw = StreamDecode(c.tiff, 100, Choice::Raw, 0, piece);
            EXPECT_EQ(raw.last, ZAN_STREAM_STATUS_5);
            EXPECT_EQ(raw.rawChunkSize, chunk.size());
            Bytes joined;
            for (const Bytes& p : raw.raw) {
                EXPECT_LE(p.size(), piece ? piece : chunk.size());
                joined.insert(joined.end(), p.begin(), p.end());
            }
            EXPECT_EQ(joined, chunk);
            EXPECT_EQ(raw.raw.size(), piece ? (chunk.size() + piece - 1) / piece : 1u);
        }
        const Streamed bypass = StreamDecode(c.tiff, 100, Choice::Bypass);
        EXPECT_EQ(bypass.last, ZAN_STREAM_STATUS_5) << ::testing::PrintToString(bypass.errors);
        Bytes rows;
        for (const Bytes& r : bypass.rows) rows.insert(rows.end(), r.begin(), r.end());
        if (c.type == 5) {
            EXPECT_EQ(bypass.rawChunkSize, chunk.size());
            EXPECT_EQ(rows, DecodeJpeg(chunk, false, true).pixels);
        } else {
            EXPECT_TRUE(bypass.rows == want);
        }
    }
}

TEST(StreamDecode, InksAreStretchedFromTheDotRange) {
    // CMYK bands spread from DotRange to 0..255.
    const Bytes inks = {16, 235, 126, 100, 0, 255, 101, 50};
    const struct Case {
        uint16_t low, high;
        Bytes want;
    } cases[] = {
        {0, 255, inks},
        {16, 235, {0, 255, 128, 97, 0, 255, 98, 39}},
        {100, 100, {0, 255, 255, 0, 0, 255, 255, 0}},      // equal bounds: a threshold
        {200, 100, {255, 0, 188, 255, 255, 0, 252, 255}},  // reversed: clamped
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(::testing::Message() << c.low << ".." << c.high);
        BuiltPage page;
        page.entries = {LongEntry(256, {2}), LongEntry(257, {1}), ShortEntry(258, {8, 8, 8, 8}),
                        ShortEntry(262, {PHOTOMETRIC_SEPARATED}), ShortEntry(277, {4}), ShortEntry(336, {c.low, c.high})};
        page.strips = {inks};
        const Streamed got = StreamDecode(BuildTiff({page}), 0);
        EXPECT_EQ(got.colorSpace, static_cast<uint32_t>(ZAN_COLORSPACE_CMYK));
        ASSERT_EQ(got.rows.size(), 1u);
        EXPECT_EQ(got.rows[0], c.want);
    }
}

TEST(StreamDecode, EveryAllocationCanFailCleanly) {
    // A decode that meets a failure ends with a message.
    PageLayout palette = Page(16, 8, 1, PHOTOMETRIC_PALETTE, 4);
    for (int i = 0; i < 48; ++i) palette.colorMap.push_back(static_cast<uint16_t>(i * 999));
    const Bytes tiff = OnePage(palette);
    FailEachAllocation([&](int n) {
        FailAllocation(n);
        const Streamed got = StreamDecode(tiff, 50);
        if (got.last != ZAN_STREAM_STATUS_5) {
            EXPECT_FALSE(got.errors.empty());
        }
        return got.last == ZAN_STREAM_STATUS_5;
    });
}

}  // namespace
