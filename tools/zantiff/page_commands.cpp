// Commands on the file structure: append, extract, split, set-tags.

#include <tiffio.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "commands.h"
#include "job.h"

namespace zantool {
namespace {

int Append(const std::string& dest, const std::vector<std::string>& sources) {
    Progress progress("append: file");
    unsigned done = 0;
    for (const std::string& source : sources) {
        File in = OpenFile(source, "rb");
        File out = OpenFile(dest, "r+b");
        if (!in || !out) return 1;
        Job job;
        job->sourceKind = ZAN_SOURCE_FILE;
        job->sourceFp = in.get();
        job->destKind = ZAN_DEST_FILE;
        job->destFp = out.get();
        if (!zanConcatenateTIFF(job.get())) {
            std::fprintf(stderr, "zantiff: appending %s to %s failed\n", source.c_str(), dest.c_str());
            return 1;
        }
        progress.Update(++done, static_cast<unsigned>(sources.size()));
    }
    return 0;
}

// Extracts `page` into `out`; 1 on success. With `quiet`, messages are kept
// in the job for the caller to show or drop.
int ExtractInto(const std::string& source, int page, const std::string& out, Job& job) {
    File in = OpenFile(source, "rb");
    if (!in) return 0;
    File dest = OpenFile(out, "w+b");
    if (!dest) return 0;
    job->sourceKind = ZAN_SOURCE_FILE;
    job->sourceFp = in.get();
    job->destKind = ZAN_DEST_FILE;
    job->destFp = dest.get();
    const int result = zanExtractTIFFPage(job.get(), page);
    job->sourceFp = job->destFp = nullptr;
    return result;
}

int Extract(const std::string& source, int page, const std::string& out) {
    Job job;
    if (ExtractInto(source, page, out, job)) return 0;
    std::remove(out.c_str());
    return 1;
}

std::string SplitName(const std::string& prefix, unsigned page) {
    char number[16];
    std::snprintf(number, sizeof number, "%04u", page);
    return prefix + number + ".tif";
}

// The pages of `source` as the module counts them; 0 after its messages.
unsigned CountPages(const std::string& source) {
    File in = OpenFile(source, "rb");
    if (!in) return 0;
    Job job;
    job.ReadPage(in.get(), 1);
    return zanTIFFGetInfo(job.get()) ? job->pageCount : 0;
}

// Every page of `source` into PREFIX0001.tif, PREFIX0002.tif, ...
bool SplitOne(const std::string& source, const std::string& prefix) {
    const unsigned pages = CountPages(source);
    if (pages == 0) return false;
    Progress progress("split: page");
    for (unsigned page = 1; page <= pages; ++page) {
        const std::string out = SplitName(prefix, page);
        Job job;
        if (!ExtractInto(source, static_cast<int>(page), out, job)) {
            std::remove(out.c_str());
            return false;
        }
        progress.Update(page, pages);
    }
    std::printf("%s: %u page(s) written as %s0001.tif ...\n", source.c_str(), pages, prefix.c_str());
    return true;
}

// The name of a file without its folders and its extension.
std::string Stem(const std::string& path) {
    const size_t slash = path.find_last_of('/');
    std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
    const size_t dot = name.find_last_of('.');
    return dot == std::string::npos || dot == 0 ? name : name.substr(0, dot);
}

// One source: PREFIX0001.tif, ...; several (or `byName`): PREFIX<stem>_0001.tif, ...
int Split(const std::vector<std::string>& sources, const std::string& prefix, bool byName) {
    std::vector<std::string> failed;
    const bool named = byName || sources.size() > 1;
    for (const std::string& source : sources)
        if (!SplitOne(source, named ? prefix + Stem(source) + "_" : prefix)) failed.push_back(source);
    return ReportFailures("split", failed, sources.size());
}

// ---- set-tags ----

// A tag's value in the form zanTIFFSetTIFFTags reads it.
struct TagValue {
    uint16_t tag = 0;
    uint32_t count = 0;
    std::vector<unsigned char> bytes;
};

template <typename T>
void Append(std::vector<unsigned char>& bytes, T value) {
    const auto* p = reinterpret_cast<const unsigned char*>(&value);
    bytes.insert(bytes.end(), p, p + sizeof value);
}

std::vector<std::string> SplitList(const std::string& text) {
    std::vector<std::string> items;
    size_t start = 0;
    for (size_t comma; (comma = text.find(',', start)) != std::string::npos; start = comma + 1)
        items.push_back(text.substr(start, comma - start));
    items.push_back(text.substr(start));
    return items;
}

bool IsPairTag(uint32_t tag) {
    return tag == TIFFTAG_PAGENUMBER || tag == TIFFTAG_HALFTONEHINTS || tag == TIFFTAG_DOTRANGE ||
           tag == TIFFTAG_YCBCRSUBSAMPLING;
}

// Encodes `text` for `field`: a text as it is; numbers separated by commas,
// one value as the 32-bit integer, float or double the module reads, several
// in the codec's element form.
bool EncodeValue(const TIFFField* field, const std::string& text, TagValue* value) {
    const TIFFDataType type = TIFFFieldDataType(field);
    value->tag = static_cast<uint16_t>(TIFFFieldTag(field));
    if (type == TIFF_ASCII) {
        value->bytes.assign(text.begin(), text.end());
        value->bytes.push_back(0);
        value->count = static_cast<uint32_t>(text.size() + 1);
        return true;
    }
    const std::vector<std::string> items = SplitList(text);
    value->count = static_cast<uint32_t>(items.size());
    const bool real = type == TIFF_RATIONAL || type == TIFF_SRATIONAL || type == TIFF_FLOAT ||
                      type == TIFF_DOUBLE;
    const bool single = items.size() == 1 && !TIFFFieldPassCount(field) &&
                        TIFFFieldWriteCount(field) != TIFF_VARIABLE2;
    int width = TIFFFieldSetGetSize(field);
    if (IsPairTag(value->tag)) width = type == TIFF_BYTE ? 1 : 2;
    for (const std::string& item : items) {
        char* end = nullptr;
        if (real) {
            const double v = std::strtod(item.c_str(), &end);
            if (single ? type == TIFF_DOUBLE : width == 8) Append(value->bytes, v);
            else Append(value->bytes, static_cast<float>(v));
        } else {
            const long long v = std::strtoll(item.c_str(), &end, 0);
            if (single || width == 4) Append(value->bytes, static_cast<int32_t>(v));
            else if (width == 1) Append(value->bytes, static_cast<uint8_t>(v));
            else if (width == 2) Append(value->bytes, static_cast<uint16_t>(v));
            else Append(value->bytes, static_cast<uint64_t>(v));
        }
        if (item.empty() || *end != '\0') return false;
    }
    return true;
}

// Parses TAG=VALUE with TAG a number or libtiff's name of the tag; the field
// descriptions come from the file itself, as the module will see them.
bool ParseAssignment(TIFF* tif, const std::string& assignment, TagValue* value) {
    const size_t equals = assignment.find('=');
    if (equals == std::string::npos || equals == 0) return false;
    const std::string name = assignment.substr(0, equals);
    char* end = nullptr;
    const unsigned long number = std::strtoul(name.c_str(), &end, 0);
    const TIFFField* field = *end == '\0' ? TIFFFindField(tif, static_cast<uint32_t>(number), TIFF_ANY)
                                          : TIFFFieldWithName(tif, name.c_str());
    if (!field) {
        std::fprintf(stderr, "zantiff: unknown tag %s\n", name.c_str());
        return false;
    }
    if (!EncodeValue(field, assignment.substr(equals + 1), value)) {
        std::fprintf(stderr, "zantiff: cannot read the value of %s\n", assignment.c_str());
        return false;
    }
    return true;
}

int SetTags(const std::string& path, const std::vector<std::string>& assignments) {
    std::vector<TagValue> values(assignments.size());
    {
        // libtiff is asked only for its field descriptions; its own
        // complaints about names it does not know are replaced by ours.
        const TIFFErrorHandler previous = TIFFSetErrorHandler(nullptr);
        TIFF* tif = TIFFOpen(path.c_str(), "r");
        if (!tif) {
            TIFFSetErrorHandler(previous);
            std::fprintf(stderr, "zantiff: %s is not a TIFF file libtiff can open\n", path.c_str());
            return 1;
        }
        bool parsed = true;
        for (size_t i = 0; i < assignments.size() && parsed; ++i)
            parsed = ParseAssignment(tif, assignments[i], &values[i]);
        TIFFClose(tif);
        TIFFSetErrorHandler(previous);
        if (!parsed) return 1;
    }
    std::vector<uint16_t> tags;
    std::vector<const void*> data;
    std::vector<uint32_t> counts;
    for (const TagValue& v : values) {
        tags.push_back(v.tag);
        data.push_back(v.bytes.data());
        counts.push_back(v.count);
    }
    Job job;
    static const int reserved = 0;
    return zanTIFFSetTIFFTags(job.get(), path.c_str(), static_cast<uint16_t>(tags.size()), tags.data(),
                              data.data(), counts.data(), &reserved)
               ? 0
               : 1;
}

// Arguments of the page commands, kept for the life of the program.
struct PageArguments {
    std::string dest, source, output;
    std::vector<std::string> sources, assignments;
    int page = 1;
    bool byName = false;
};

}  // namespace

void AddPageCommands(CLI::App& app, int& status) {
    static PageArguments args;

    auto* append = app.add_subcommand("append", "Append the pages of SRC files to DEST in place");
    append->add_option("DEST", args.dest, "TIFF file that receives the pages")->required();
    append->add_option("SRC", args.sources, "TIFF files whose pages are appended")->required();
    append->callback([&status] { status = Append(args.dest, args.sources); });

    auto* extract = app.add_subcommand("extract", "Copy one page into a TIFF file of its own");
    extract->add_option("SRC", args.source, "TIFF file")->required();
    extract->add_option("PAGE", args.page, "page number, from 1")->required();
    extract->add_option("-o,--output", args.output, "TIFF file to write")->required();
    extract->callback([&status] { status = Extract(args.source, args.page, args.output); });

    auto* split = app.add_subcommand("split", "Write every page into a file of its own");
    split->add_option("SRC", args.sources, "TIFF files")->required();
    split->add_option("-o,--output", args.output,
                      "prefix of the files: PREFIX0001.tif, ... (several sources: PREFIX<name>_0001.tif, ...)")
        ->required();
    split->add_flag("--by-name", args.byName, "name the files after their source even for one (batch jobs)");
    split->callback([&status] { status = Split(args.sources, args.output, args.byName); });

    auto* setTags = app.add_subcommand("set-tags", "Change tags of the first page in place");
    setTags->add_option("FILE", args.source, "TIFF file to change")->required();
    setTags->add_option("TAG=VALUE", args.assignments,
                        "tag by number or libtiff name; numbers separated by commas")
        ->required();
    setTags->callback([&status] { status = SetTags(args.source, args.assignments); });
}

}  // namespace zantool
