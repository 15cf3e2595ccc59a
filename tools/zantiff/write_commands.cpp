// Commands that write pages: encode (PNG files to a multi-page TIFF, through
// the scanline writer or the frame writer), copy (every page of a TIFF
// re-encoded through the reader and the writer, with metadata and EXIF), and
// wrap and wrap-g4 (a JPEG or Group 4 stream stored as a page unchanged).

#include <cstdio>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include "commands.h"
#include "job.h"
#include "page_copy.h"
#include "png_reader.h"

namespace zantool {
namespace {

// Host compression codes by name.
const std::map<std::string, uint32_t> kCompressions = {
    {"none", ZAN_COMPRESSION_NONE}, {"packbits", ZAN_COMPRESSION_PACKBITS}, {"g3", ZAN_COMPRESSION_CCITT_G3},
    {"g4", ZAN_COMPRESSION_CCITT_G4}, {"jpeg", ZAN_COMPRESSION_JPEG},       {"lzw", ZAN_COMPRESSION_LZW},
    {"deflate", ZAN_COMPRESSION_DEFLATE}};

// A file destination for a job: created empty, reopened by the module.
bool UseFileDestination(Job& job, const std::string& path, bool append) {
    if (!append) {
        File created = OpenFile(path, "wb");
        if (!created) return false;
    }
    job->destKind = ZAN_DEST_FILE;
    job->destPath = path.c_str();
    job->destFp = nullptr;
    job->appendPages = append ? 1 : 0;
    return true;
}

// After the job: the module leaves the reopened stream to the host.
void CloseDestination(Job& job) {
    if (job->destFp) std::fclose(job->destFp);
    job->destFp = nullptr;
}

bool EncodeLines(Job& job, PngImage& image, uint32_t compression) {
    job->outputColorSpace = image.colorSpace;
    job->imageWidth = image.width;
    job->imageHeight = image.height;
    job->bitsPerSample = image.bitsPerSample == 16 ? 16 : 8;
    job->outputBitsPerSample = job->bitsPerSample;
    job->outputCompression = compression;
    for (uint32_t y = 0; y < image.height; ++y)
        if (!zanTIFFWriteNextScanLine(job.get(), image.pixels.data() + y * image.rowBytes,
                                      static_cast<uint32_t>(image.rowBytes)))
            return false;
    return zanTIFFNextImage(job.get()) != 0;
}

// One frame as a page of its own job (the frame writer closes its codec
// object), appended after the first page.
bool EncodeFrame(const std::string& out, PngImage& image, bool append, float dpi) {
    Job job;
    if (!UseFileDestination(job, out, append)) return false;
    job->colorSpace = image.colorSpace;
    job->frameWidth = image.width;
    job->frameHeight = image.height;
    job->bitsPerSample = image.bitsPerSample == 16 ? 16 : image.bitsPerSample;
    job->outputBitsPerSample = image.bitsPerSample == 16 ? 16 : 8;
    job->outputXResolution = job->outputYResolution = dpi;
    job->frameData = image.pixels.data();
    job->frameBufferSize = static_cast<uint32_t>(image.pixels.size());
    const int written = zanFrameBufferToTIFF(job.get());
    job->frameData = nullptr;  // the image's own memory, not the job's
    CloseDestination(job);
    return written != 0;
}

struct WriteArguments {
    std::vector<std::string> inputs;
    std::string input, output, compression = "lzw";
    bool predictor = false, frame = false, append = false, whiteIsZero = false;
    float dpi = 0;
    uint32_t width = 0, height = 0;
    std::string copyCompression;
};

// The stream file as the job's source, from its first byte.
File UseStreamSource(Job& job, const std::string& path) {
    File source = OpenFile(path, "rb");
    job->sourceKind = ZAN_SOURCE_FILE;
    job->sourceFp = source.get();
    job->sourceBaseOffset = 0;
    return source;
}

// A JPEG file as a page of its own, its stream unchanged; a stream TIFF
// cannot hold as it is is refused with the module's reason, never
// re-encoded.
int Wrap(const WriteArguments& args) {
    Job job;
    const File source = UseStreamSource(job, args.input);
    if (!source || !UseFileDestination(job, args.output, args.append)) return 1;
    job->outputXResolution = job->outputYResolution = args.dpi;
    uint32_t direct = 1;
    const int result = zanJPEGToTIFF(job.get(), &direct);
    CloseDestination(job);
    if (result && !direct) {
        const std::string why = job.traces().empty() ? "no reason given" : job.traces().back();
        std::fprintf(stderr, "zantiff: %s cannot be stored without re-encoding (%s)\n", args.input.c_str(), why.c_str());
        return 2;
    }
    if (!result) return 1;
    std::printf("%ux%u JPEG stored as a page of %s\n", job->outputWidth, job->outputHeight, args.output.c_str());
    return 0;
}

// A bare Group 4 stream of the given size as a page of its own.
int WrapG4(const WriteArguments& args) {
    Job job;
    const File source = UseStreamSource(job, args.input);
    if (!source || !UseFileDestination(job, args.output, args.append)) return 1;
    job->imageWidth = args.width;
    job->imageHeight = args.height;
    job->whiteIsZero = args.whiteIsZero ? 1 : 0;
    job->outputXResolution = job->outputYResolution = args.dpi;
    const int result = zanG4ToTIFF(job.get());
    CloseDestination(job);
    return result ? 0 : 1;
}

int Encode(const WriteArguments& args) {
    const auto compression = kCompressions.find(args.compression);
    if (compression == kCompressions.end()) {
        std::fprintf(stderr, "zantiff: unknown compression %s\n", args.compression.c_str());
        return 1;
    }
    Progress progress("encode: page");
    if (args.frame) {
        for (size_t i = 0; i < args.inputs.size(); ++i) {
            PngImage image;
            if (!ReadPng(args.inputs[i], &image) || !EncodeFrame(args.output, image, i > 0, args.dpi)) return 1;
            progress.Update(static_cast<unsigned>(i + 1), static_cast<unsigned>(args.inputs.size()));
        }
        return 0;
    }
    Job job;
    if (!UseFileDestination(job, args.output, false)) return 1;
    job->lzwPredictor = args.predictor ? 2 : 0;
    job->outputXResolution = job->outputYResolution = args.dpi;
    bool ok = true;
    for (size_t i = 0; i < args.inputs.size() && ok; ++i) {
        PngImage image;
        ok = ReadPng(args.inputs[i], &image) && EncodeLines(job, image, compression->second);
        progress.Update(static_cast<unsigned>(i + 1), static_cast<unsigned>(args.inputs.size()));
    }
    zanDestroyTIFF(job.get());
    CloseDestination(job);
    return ok ? 0 : 1;
}

int Copy(const WriteArguments& args) {
    CopyOptions options;
    if (!args.copyCompression.empty()) {
        const auto compression = kCompressions.find(args.copyCompression);
        if (compression == kCompressions.end()) {
            std::fprintf(stderr, "zantiff: unknown compression %s\n", args.copyCompression.c_str());
            return 1;
        }
        options.compression = compression->second;
    }
    options.lzwPredictor = args.predictor ? 2 : 0;
    Job job;
    if (!UseFileDestination(job, args.output, false)) return 1;
    bool failed = false;
    Progress progress("copy: page");
    const uint32_t pages = CopyPages(args.input, job.get(), options, &failed,
                                     [&progress](uint32_t done, uint32_t total) { progress.Update(done, total); });
    zanDestroyTIFF(job.get());
    CloseDestination(job);
    if (!failed) std::printf("%u page(s) copied\n", pages);
    return failed ? 1 : 0;
}

}  // namespace

void AddWriteCommands(CLI::App& app, int& status) {
    static WriteArguments args;
    auto* encode = app.add_subcommand("encode", "Write PNG images as the pages of a TIFF file");
    encode->add_option("IN", args.inputs, "PNG files, one page each")->required();
    encode->add_option("-o,--output", args.output, "TIFF file to write")->required();
    encode->add_option("-c,--compression", args.compression, "none, packbits, g3, g4, jpeg, lzw or deflate");
    encode->add_flag("--predictor", args.predictor, "horizontal predictor for LZW");
    encode->add_option("--dpi", args.dpi, "resolution in pixels per inch");
    encode->add_flag("--frame", args.frame, "write each image in one call through the frame writer");
    encode->callback([&status] { status = Encode(args); });

    auto* copy = app.add_subcommand("copy", "Re-encode every page of a TIFF file, with its metadata and EXIF");
    copy->add_option("IN", args.input, "TIFF file")->required();
    copy->add_option("-o,--output", args.output, "TIFF file to write")->required();
    copy->add_option("-c,--compression", args.copyCompression, "as for encode; default: the source's");
    copy->add_flag("--predictor", args.predictor, "horizontal predictor for LZW");
    copy->callback([&status] { status = Copy(args); });

    auto* wrap = app.add_subcommand("wrap", "Store a JPEG file as a TIFF page without re-encoding it");
    wrap->add_option("IN", args.input, "JPEG file")->required();
    wrap->add_option("-o,--output", args.output, "TIFF file to write")->required();
    wrap->add_flag("--append", args.append, "add the page to the TIFF file instead of replacing it");
    wrap->add_option("--dpi", args.dpi, "resolution in pixels per inch; default: the JPEG's own");
    wrap->footer("Exit status 2: the JPEG's layout cannot be stored as it is (the reason is printed).");
    wrap->callback([&status] { status = Wrap(args); });

    auto* wrapG4 = app.add_subcommand("wrap-g4", "Store a bare CCITT Group 4 stream as a TIFF page");
    wrapG4->add_option("IN", args.input, "Group 4 (T.6) data")->required();
    wrapG4->add_option("--width", args.width, "pixels a row")->required()->check(CLI::PositiveNumber);
    wrapG4->add_option("--height", args.height, "rows")->required()->check(CLI::PositiveNumber);
    wrapG4->add_flag("--white-is-zero", args.whiteIsZero, "0 bits are white (PhotometricInterpretation 0)");
    wrapG4->add_option("-o,--output", args.output, "TIFF file to write")->required();
    wrapG4->add_flag("--append", args.append, "add the page to the TIFF file instead of replacing it");
    wrapG4->add_option("--dpi", args.dpi, "resolution in pixels per inch");
    wrapG4->callback([&status] { status = WrapG4(args); });
}

}  // namespace zantool
