// Commands that read pages: info (description and metadata, text or JSON)
// and decode (the scanline reader's lines, or the stream decoder's bands, as
// PNG or PAM).

#include <tiffio.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "commands.h"
#include "image_writers.h"
#include "job.h"

namespace zantool {
namespace {

using nlohmann::ordered_json;

const char* ImageTypeName(uint32_t code) {
    switch (code) {
    case ZAN_IMAGE_BILEVEL_WHITE_IS_ZERO: return "bilevel, min-is-white";
    case ZAN_IMAGE_BILEVEL_BLACK_IS_ZERO: return "bilevel, min-is-black";
    case ZAN_IMAGE_GREY_WHITE_IS_ZERO: return "grey, min-is-white";
    case ZAN_IMAGE_GREY_BLACK_IS_ZERO: return "grey, min-is-black";
    case ZAN_IMAGE_RGB: return "RGB";
    case ZAN_IMAGE_PALETTE: return "palette";
    case ZAN_IMAGE_MASK: return "mask";
    case ZAN_IMAGE_SEPARATED: return "separated";
    case ZAN_IMAGE_CMYK: return "CMYK";
    case ZAN_IMAGE_YCBCR: return "YCbCr";
    case ZAN_IMAGE_CIELAB: return "CIELab";
    case ZAN_IMAGE_LOGL: return "LogL";
    case ZAN_IMAGE_LOGLUV: return "LogLuv";
    default: return "other";
    }
}

const char* CompressionName(uint32_t code) {
    static const char* const kNames[] = {"other", "none", "PackBits", "CCITT G3", "CCITT G4", "JPEG",
                                         "CCITT RLE", "LZW", "NeXT", "CCITT RLEW", "ThunderScan",
                                         "old-style JPEG"};
    return code < sizeof kNames / sizeof *kNames ? kNames[code] : "other";
}

// libtiff's names of tags, for the listing: image tags from a directory of
// the file, EXIF tags from its EXIF field set.
class TagNames {
public:
    explicit TagNames(const std::string& path) {
        const TIFFErrorHandler e = TIFFSetErrorHandler(nullptr), w = TIFFSetWarningHandler(nullptr);
        image_ = TIFFOpen(path.c_str(), "r");
        exif_ = TIFFOpen(path.c_str(), "r");
        uint64_t offset = 0;
        if (exif_ && !(TIFFGetField(exif_, TIFFTAG_EXIFIFD, &offset) && TIFFReadEXIFDirectory(exif_, offset))) {
            TIFFClose(exif_);
            exif_ = nullptr;
        }
        TIFFSetErrorHandler(e);
        TIFFSetWarningHandler(w);
    }
    ~TagNames() {
        if (image_) TIFFClose(image_);
        if (exif_) TIFFClose(exif_);
    }
    std::string Name(uint32_t group, uint32_t tag) const {
        TIFF* tif = group == ZAN_METADATA_EXIF ? exif_ : image_;
        const TIFFField* field = tif ? TIFFFindField(tif, tag, TIFF_ANY) : nullptr;
        return field ? TIFFFieldName(field) : "Tag " + std::to_string(tag);
    }

private:
    TIFF* image_ = nullptr;
    TIFF* exif_ = nullptr;
};

// A metadata value as JSON: text, a number, an array of numbers, or hex.
ordered_json EntryValue(const MetadataEntry& e) {
    switch (e.type) {
    case ZAN_METADATA_U8: return e.value.u8;
    case ZAN_METADATA_U16:
        // Image-directory pairs give their value count (2) as size; EXIF
        // entries give the byte size of one value.
        return e.group != ZAN_METADATA_EXIF && e.size == 2 ? ordered_json::array({e.value.u16[0], e.value.u16[1]})
                                                            : ordered_json(e.value.u16[0]);
    case ZAN_METADATA_U32: return e.value.u32;
    case ZAN_METADATA_F32: return e.value.f32;
    case ZAN_METADATA_F64: return e.value.f64;
    case ZAN_METADATA_BLOCK: {
        const auto* bytes = static_cast<const uint8_t*>(e.value.block);
        const bool text = e.size > 0 && bytes[e.size - 1] == 0 &&
                          std::all_of(bytes, bytes + e.size - 1, [](uint8_t c) { return std::isprint(c) || c == '\n'; });
        if (text) return std::string(reinterpret_cast<const char*>(bytes));
        std::string hex;
        char digits[3];
        for (uint32_t i = 0; i < e.size && i < 64; ++i) {
            std::snprintf(digits, sizeof digits, "%02x", bytes[i]);
            hex += digits;
        }
        if (e.size > 64) hex += "...";
        return hex;
    }
    default: {
        std::string hex;
        char digits[3];
        for (uint8_t b : e.value.bytes) {
            std::snprintf(digits, sizeof digits, "%02x", b);
            hex += digits;
        }
        return hex;
    }
    }
}

ordered_json Describe(ConversionContext* ctx, int page, const MetadataList* list, const TagNames& names) {
    ordered_json info;
    info["pages"] = ctx->pageCount;
    info["page"] = page;
    info["width"] = ctx->imageWidth;
    info["height"] = ctx->imageHeight;
    info["bitsPerSample"] = ctx->bitsPerSample;
    info["samplesPerPixel"] = ctx->samplesPerPixel;
    info["extraSamples"] = ctx->extraSamples;
    info["imageType"] = ImageTypeName(ctx->imageType);
    info["colorSpace"] = ctx->colorSpace;
    info["compression"] = CompressionName(ctx->compression);
    info["planarConfig"] = ctx->planarConfig == 1 ? "contiguous" : "separate";
    info["orientation"] = ctx->orientation;
    info["xResolution"] = ctx->xResolution;
    info["yResolution"] = ctx->yResolution;
    info["resolutionUnit"] = ctx->resolutionUnit == 0 ? "none" : ctx->resolutionUnit == 2 ? "centimetre" : "inch";
    if (ctx->tileWidth) info["tile"] = {ctx->tileWidth, ctx->tileHeight};
    info["fillOrder"] = ctx->fillOrder;
    info["iccProfileBytes"] = ctx->iccProfileSize;
    if (ctx->imageDescription) info["imageDescription"] = ctx->imageDescription;
    if (ctx->documentName) info["documentName"] = ctx->documentName;
    ordered_json entries = ordered_json::array();
    for (const MetadataEntry* e = pivloMetadataListFirst(list); e; e = e->next) {
        ordered_json entry;
        entry["group"] = e->group == ZAN_METADATA_EXIF ? "exif" : e->group == ZAN_METADATA_ICC ? "icc" : "image";
        entry["tag"] = e->tag;
        entry["name"] = names.Name(e->group, e->tag);
        if (e->count) entry["count"] = e->count;
        entry["value"] = EntryValue(*e);
        entries.push_back(entry);
    }
    info["metadata"] = entries;
    return info;
}

void PrintText(const ordered_json& info) {
    for (const auto& [key, value] : info.items()) {
        if (key == "metadata") continue;
        std::printf("%-18s %s\n", (key + ":").c_str(), value.is_string() ? value.get<std::string>().c_str() : value.dump().c_str());
    }
    for (const auto& e : info["metadata"]) {
        const std::string value = e["value"].is_string() ? e["value"].get<std::string>() : e["value"].dump();
        std::printf("  %-5s %-28s %s\n", e["group"].get<std::string>().c_str(), e["name"].get<std::string>().c_str(),
                    value.c_str());
    }
}

// One file's description: pretty JSON or text for a single file; for
// several (`several`), one JSON document a line ("file" naming it) or text
// under a "file:" line.
bool InfoOne(const std::string& path, int page, bool json, bool several) {
    File in = OpenFile(path, "rb");
    if (!in) return false;
    Job job;
    MetadataList* list = pivloCreateMetadataList(nullptr, nullptr);
    job.ReadPage(in.get(), page);
    job->metadataList = list;
    const int described = zanTIFFGetInfo(job.get());
    if (described) {
        ordered_json info = Describe(job.get(), page, list, TagNames(path));
        if (several && json) {
            ordered_json line = {{"file", path}};
            line.update(info);
            std::printf("%s\n", line.dump().c_str());
        } else if (json) {
            std::printf("%s\n", info.dump(2).c_str());
        } else {
            if (several) std::printf("file:              %s\n", path.c_str());
            PrintText(info);
        }
    }
    job->metadataList = nullptr;
    pivloDestroyMetadataList(list);
    return described != 0;
}

int Info(const std::vector<std::string>& paths, int page, bool json, bool lines) {
    std::vector<std::string> failed;
    for (const std::string& path : paths)
        if (!InfoOne(path, page, json || lines, lines || paths.size() > 1)) failed.push_back(path);
    return ReportFailures("info", failed, paths.size());
}

// ---- decode ----

// How the lines of the described page are laid out, and what to write them
// as. Lines of separate planes are interleaved before writing.
ImageLayout LayoutOf(const ConversionContext* ctx) {
    ImageLayout layout;
    layout.width = ctx->imageWidth;
    layout.height = ctx->imageHeight;
    layout.channels = ctx->samplesPerPixel;
    layout.bits = ctx->bitsPerSample == 16 ? 16 : ctx->bitsPerSample == 1 ? 1 : 8;
    switch (ctx->imageType) {
    case ZAN_IMAGE_PALETTE:
        layout.channels = 3;
        layout.bits = 8;
        layout.tupleType = "RGB";
        break;
    case ZAN_IMAGE_CMYK: layout.tupleType = "CMYK"; break;
    case ZAN_IMAGE_SEPARATED: layout.tupleType = "SEPARATED"; break;
    case ZAN_IMAGE_RGB: case ZAN_IMAGE_YCBCR: case ZAN_IMAGE_CIELAB:
        layout.tupleType = ctx->samplesPerPixel > 3 ? "RGB_ALPHA" : "RGB";
        break;
    default: layout.tupleType = ctx->samplesPerPixel > 1 ? "GRAYSCALE_ALPHA" : "GRAYSCALE"; break;
    }
    return layout;
}

bool NeedsPam(const ConversionContext* ctx, const ImageLayout& layout) {
    const bool separated = ctx->imageType == ZAN_IMAGE_CMYK || ctx->imageType == ZAN_IMAGE_SEPARATED;
    return separated || layout.channels > 4 || (layout.bits == 1 && layout.channels > 1);
}

// Puts the planes of a separate-planes line pixel by pixel.
void Interleave(const std::vector<uint8_t>& line, std::vector<uint8_t>& out, const ImageLayout& layout) {
    const size_t sampleBytes = layout.bits / 8;
    for (uint32_t x = 0; x < layout.width; ++x)
        for (uint32_t s = 0; s < layout.channels; ++s)
            std::memcpy(&out[(static_cast<size_t>(x) * layout.channels + s) * sampleBytes],
                        &line[(static_cast<size_t>(s) * layout.width + x) * sampleBytes], sampleBytes);
}

// Min-is-white grey becomes min-is-black, as PNG and PAM have it; extra
// samples (alpha) stay as they are.
void InvertGrey(std::vector<uint8_t>& line, uint32_t bytes, const ImageLayout& layout, bool planar) {
    if (layout.bits == 1 || layout.channels == 1) {
        for (uint32_t i = 0; i < bytes; ++i) line[i] = static_cast<uint8_t>(~line[i]);
        return;
    }
    const size_t sampleBytes = layout.bits / 8;
    for (uint32_t x = 0; x < layout.width; ++x) {
        const size_t at = (planar ? x : static_cast<size_t>(x) * layout.channels) * sampleBytes;
        for (size_t b = 0; b < sampleBytes; ++b) line[at + b] = static_cast<uint8_t>(~line[at + b]);
    }
}

// The lines of a described page, as the scanline reader forms them,
// written as PNG (or PAM): min-is-white grey turned min-is-black, separate
// planes interleaved.
class LineFile {
public:
    bool Start(const ConversionContext* ctx, const std::string& outPath) {
        layout_ = LayoutOf(ctx);
        whiteIsZero_ = ctx->imageType == ZAN_IMAGE_BILEVEL_WHITE_IS_ZERO || ctx->imageType == ZAN_IMAGE_GREY_WHITE_IS_ZERO;
        planar_ = ctx->planarConfig == 2 && layout_.channels > 1;
        out_ = OpenFile(outPath, "wb");
        if (!out_) return false;
        writer_ = NeedsPam(ctx, layout_) ? StartPam(out_.get(), layout_) : StartPng(out_.get(), layout_);
        if (!writer_) std::fprintf(stderr, "zantiff: no PNG or PAM form for this page's lines\n");
        return writer_ != nullptr;
    }
    bool Write(const uint8_t* line, uint32_t bytes) {
        line_.assign(line, line + bytes);
        if (whiteIsZero_) InvertGrey(line_, bytes, layout_, planar_);
        if (planar_) {
            interleaved_.resize(line_.size());
            Interleave(line_, interleaved_, layout_);
        }
        if (++rows_ % 256 == 0 || rows_ == layout_.height) progress_.Update(rows_, layout_.height);
        return writer_->WriteRow(planar_ ? interleaved_.data() : line_.data());
    }
    bool Finish() { return writer_->Finish(); }
    uint32_t rows() const { return rows_; }

private:
    ImageLayout layout_;
    bool whiteIsZero_ = false, planar_ = false;
    File out_;
    std::unique_ptr<ImageWriter> writer_;
    std::vector<uint8_t> line_, interleaved_;
    Progress progress_{"decode: row"};
    uint32_t rows_ = 0;
};

int Decode(const std::string& path, int page, const std::string& outPath) {
    File in = OpenFile(path, "rb");
    if (!in) return 1;
    Job job;
    job.ReadPage(in.get(), page);
    job->outputBitsPerSample = 16;
    if (!zanTIFFGetInfo(job.get())) return 1;
    // Room for the longest line any page kind gives: 16-bit samples, or
    // three bytes a pixel for palette and JPEG pages.
    const uint64_t room = uint64_t{job->imageWidth} * std::max<uint32_t>(job->samplesPerPixel, 3) * 2 + 16;
    if (room > 0xFFFFFFFFu) {
        std::fprintf(stderr, "zantiff: the page's lines are too long\n");
        return 1;
    }
    std::vector<uint8_t> line(static_cast<size_t>(room));
    uint32_t got = zanTIFFReadNextScanLine(job.get(), line.data(), static_cast<uint32_t>(line.size()));
    if (!got) return 1;
    LineFile file;
    if (!file.Start(job.get(), outPath)) return 1;
    for (uint32_t row = 0;; ++row) {
        if (!file.Write(line.data(), got)) return 1;
        if (row + 1 == job->imageHeight) break;
        got = zanTIFFReadNextScanLine(job.get(), line.data(), static_cast<uint32_t>(line.size()));
        if (!got) return 1;
    }
    return file.Finish() ? 0 : 1;
}

// The first page of a file (or of standard input, "-") fed to the stream
// decoder in pieces of `chunk` bytes, as a host receiving it over a pipe
// would: the same lines as the scanline reader's.
int DecodeStream(const std::string& path, uint32_t chunk, const std::string& outPath) {
    FILE* in = path == "-" ? stdin : std::fopen(path.c_str(), "rb");
    if (!in) {
        std::fprintf(stderr, "zantiff: cannot open %s: %s\n", path.c_str(), std::strerror(errno));
        return 1;
    }
    const File owned(in == stdin ? nullptr : in);
    Job job;
    job->outputBitsPerSample = 16;
    if (zanTIFFStreamDecodeInit(job.get(), nullptr) != 2) return 1;
    std::vector<uint8_t> piece(chunk);
    StreamChunk stream{};
    LineFile file;
    bool ended = false;
    int status = ZAN_STREAM_CONTINUE;
    while (status == ZAN_STREAM_CONTINUE || status == ZAN_STREAM_PAGE_DESCRIBED) {
        if (stream.inputLength == 0 && !ended) {
            const size_t n = std::fread(piece.data(), 1, piece.size(), in);
            stream.input = piece.data();
            stream.inputLength = static_cast<uint32_t>(n);
            if (n == 0) {
                ended = true;
                zanTIFFStreamDecodeComplete(job.get());
            }
        }
        status = zanTIFFStreamDecode(job.get(), &stream);
        if (status == ZAN_STREAM_PAGE_DESCRIBED && !file.Start(job.get(), outPath)) status = ZAN_STREAM_ERROR;
        const auto* band = static_cast<const uint8_t*>(stream.output);
        for (uint32_t r = 0; band && r < stream.bandRows && status != ZAN_STREAM_ERROR; ++r)
            if (!file.Write(band + uint64_t{r} * stream.bandValue, stream.bandValue)) status = ZAN_STREAM_ERROR;
    }
    zanTIFFStreamDecodeEnd(job.get());
    if (status == ZAN_STREAM_STATUS_6)
        std::fprintf(stderr, "zantiff: the input ended after %u of the page's rows\n", file.rows());
    return status == ZAN_STREAM_STATUS_5 && file.Finish() ? 0 : 1;
}

// ---- whole pages: decode --frame, jpeg, g4 ----

// A frame of zanTIFFToFrameBuffer's RGBA way as PNG: RGB or grey of 8 or
// 16 bits, or bilevel (min-is-white frames turned min-is-black, as PNG has
// them).
int WriteFrame(const ConversionContext* ctx, const std::string& outPath) {
    ImageLayout layout;
    layout.width = ctx->frameWidth;
    layout.height = ctx->frameHeight;
    layout.channels = ctx->outputSamplesPerPixel;
    layout.bits = ctx->outputBitsPerSample;
    const bool whiteIsZero = ctx->frameWhiteIsZero && layout.channels == 1;
    const uint64_t rowBytes = (uint64_t{layout.width} * layout.channels * layout.bits + 7) / 8;
    File out = OpenFile(outPath, "wb");
    if (!out) return 1;
    auto writer = StartPng(out.get(), layout);
    if (!writer) {
        std::fprintf(stderr, "zantiff: no PNG form for this frame\n");
        return 1;
    }
    const auto* frame = static_cast<const uint8_t*>(ctx->frameData);
    std::vector<uint8_t> row(static_cast<size_t>(rowBytes));
    for (uint32_t y = 0; y < layout.height; ++y) {
        std::memcpy(row.data(), frame + y * rowBytes, row.size());
        if (whiteIsZero) InvertGrey(row, static_cast<uint32_t>(rowBytes), layout, false);
        if (!writer->WriteRow(row.data())) return 1;
    }
    return writer->Finish() ? 0 : 1;
}

// The whole page in one call: 16-bit frames for pages deeper than 8 bits.
int DecodeFrame(const std::string& path, int page, const std::string& outPath) {
    File in = OpenFile(path, "rb");
    if (!in) return 1;
    Job job;
    job.ReadPage(in.get(), page);
    if (!zanTIFFGetInfo(job.get())) return 1;
    job->outputBitsPerSample = job->bitsPerSample > 8 ? 16 : 8;
    uint32_t direct = 0;
    if (!zanTIFFToFrameBuffer(job.get(), &direct)) return 1;
    return WriteFrame(job.get(), outPath);
}

// The page's compressed data as it is stored (Group 4), or as one JPEG
// stream (the strips joined), written to `outPath`. A page that cannot be
// passed through this way is reported with the module's reason.
int PassThrough(const std::string& path, int page, const std::string& outPath, uint32_t destFormat) {
    File in = OpenFile(path, "rb");
    if (!in) return 1;
    Job job;
    job.ReadPage(in.get(), page);
    job->destFormat = destFormat;
    job->destKind = ZAN_DEST_FILE;
    job->destPath = outPath.c_str();
    uint32_t direct = 0;
    const int result = zanTIFFToFrameBuffer(job.get(), &direct);
    const bool passed = result && direct == 1;
    if (job->destFp) std::fclose(job->destFp);
    job->destFp = nullptr;
    if (passed) return 0;
    std::remove(outPath.c_str());
    if (result) {
        const std::string reason = job.traces().empty() ? "it is not compressed that way" : job.traces().back();
        std::fprintf(stderr, "zantiff: page %d of %s cannot be passed through as %s: %s\n", page, path.c_str(),
                     destFormat == ZAN_DEST_FORMAT_JPEG ? "JPEG" : "Group 4", reason.c_str());
    }
    return 1;
}

struct ReadArguments {
    std::vector<std::string> files;
    std::string file, output;
    int page = 1;
    bool json = false;
    bool jsonLines = false;
    bool frame = false;
    bool stream = false;
    uint32_t chunk = 64 << 10;
};

}  // namespace

void AddReadCommands(CLI::App& app, int& status) {
    static ReadArguments args;
    auto* info = app.add_subcommand("info", "Describe a page and list its metadata and EXIF tags");
    info->add_option("FILE", args.files, "TIFF files")->required();
    info->add_option("-p,--page", args.page, "page number, from 1");
    info->add_flag("--json", args.json, "print JSON (several files: one document a line)");
    info->add_flag("--jsonl", args.jsonLines, "one JSON document a line, naming its file, even for one file");
    info->callback([&status] { status = Info(args.files, args.page, args.json, args.jsonLines); });

    auto* decode = app.add_subcommand("decode", "Write a page's lines as PNG (separated pages as PAM)");
    decode->add_option("FILE", args.file, "TIFF file")->required();
    decode->add_option("-p,--page", args.page, "page number, from 1");
    decode->add_option("-o,--output", args.output, "PNG (or PAM) file to write")->required();
    decode->add_flag("--frame", args.frame, "decode the whole page in one call (RGB, grey or bilevel PNG)");
    decode->add_flag("--stream", args.stream,
                     "feed the file (\"-\": standard input) to the stream decoder in pieces; first page only");
    decode->add_option("--chunk", args.chunk, "bytes a piece with --stream (default 65536)")
        ->check(CLI::Range(1u, 1u << 30));
    decode->callback([&status] {
        if (args.stream) status = DecodeStream(args.file, args.chunk, args.output);
        else if (args.frame) status = DecodeFrame(args.file, args.page, args.output);
        else status = Decode(args.file, args.page, args.output);
    });

    auto* jpeg = app.add_subcommand("jpeg", "Write a JPEG page's data as one JPEG file, without decoding it");
    jpeg->add_option("FILE", args.file, "TIFF file")->required();
    jpeg->add_option("-p,--page", args.page, "page number, from 1");
    jpeg->add_option("-o,--output", args.output, "JPEG file to write")->required();
    jpeg->callback([&status] { status = PassThrough(args.file, args.page, args.output, ZAN_DEST_FORMAT_JPEG); });

    auto* g4 = app.add_subcommand("g4", "Write a Group 4 page's data as a bare Group 4 stream");
    g4->add_option("FILE", args.file, "TIFF file")->required();
    g4->add_option("-p,--page", args.page, "page number, from 1");
    g4->add_option("-o,--output", args.output, "Group 4 file to write")->required();
    g4->callback([&status] { status = PassThrough(args.file, args.page, args.output, ZAN_DEST_FORMAT_G4); });
}

}  // namespace zantool
