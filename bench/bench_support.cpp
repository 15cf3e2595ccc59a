#include "bench_support.h"

#include <cstdio>
#include <cstring>
#include <fstream>
#include <map>
#include <stdexcept>
#include <tuple>

namespace zanbench {
namespace {

struct MemoryFile {
    const Bytes* bytes;
    uint64_t position;
};

tmsize_t Read(thandle_t h, void* buffer, tmsize_t n) {
    auto* f = static_cast<MemoryFile*>(h);
    if (f->position >= f->bytes->size()) return 0;
    const tmsize_t count = std::min<tmsize_t>(n, static_cast<tmsize_t>(f->bytes->size() - f->position));
    std::memcpy(buffer, f->bytes->data() + f->position, static_cast<size_t>(count));
    f->position += static_cast<uint64_t>(count);
    return count;
}
tmsize_t Write(thandle_t, void*, tmsize_t) { return -1; }
toff_t Seek(thandle_t h, toff_t offset, int whence) {
    auto* f = static_cast<MemoryFile*>(h);
    if (whence == SEEK_SET) f->position = offset;
    else if (whence == SEEK_CUR) f->position += offset;
    else f->position = f->bytes->size() + offset;
    return f->position;
}
int Close(thandle_t h) {
    delete static_cast<MemoryFile*>(h);
    return 0;
}
toff_t Size(thandle_t h) { return static_cast<MemoryFile*>(h)->bytes->size(); }
int Map(thandle_t, void**, toff_t*) { return 0; }
void Unmap(thandle_t, void*, toff_t) {}

}  // namespace

const Bytes& GeneratedTiff(uint32_t pages, uint32_t width, uint32_t height, uint16_t compression) {
    static std::map<std::tuple<uint32_t, uint32_t, uint32_t, uint16_t>, Bytes> cache;
    auto key = std::make_tuple(pages, width, height, compression);
    auto found = cache.find(key);
    if (found != cache.end()) return found->second;
    const std::string path = "/tmp/zantiff-bench-generated.tif";
    TIFF* tif = TIFFOpen(path.c_str(), "w");
    if (!tif) throw std::runtime_error("cannot write " + path);
    std::vector<uint8_t> row(width);
    for (uint32_t p = 0; p < pages; ++p) {
        TIFFSetField(tif, TIFFTAG_IMAGEWIDTH, width);
        TIFFSetField(tif, TIFFTAG_IMAGELENGTH, height);
        TIFFSetField(tif, TIFFTAG_BITSPERSAMPLE, 8);
        TIFFSetField(tif, TIFFTAG_SAMPLESPERPIXEL, 1);
        TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
        TIFFSetField(tif, TIFFTAG_COMPRESSION, compression);
        TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, TIFFDefaultStripSize(tif, 0));
        for (uint32_t y = 0; y < height; ++y) {
            for (uint32_t x = 0; x < width; ++x) row[x] = static_cast<uint8_t>((x ^ y) + p);
            TIFFWriteScanline(tif, row.data(), y, 0);
        }
        TIFFWriteDirectory(tif);
    }
    TIFFClose(tif);
    std::ifstream in(path, std::ios::binary);
    Bytes bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::remove(path.c_str());
    return cache.emplace(key, std::move(bytes)).first->second;
}

std::string WriteTemporary(const Bytes& bytes, const std::string& name) {
    const std::string path = "/tmp/zantiff-bench-" + name;
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    return path;
}

TIFF* OpenMemoryWithLibtiff(const Bytes& bytes, const char* mode) {
    auto* file = new MemoryFile{&bytes, 0};
    TIFF* tif = TIFFClientOpen("memory", mode, file, Read, Write, Seek, Close, Size, Map, Unmap);
    if (!tif) delete file;
    return tif;
}

namespace {
void DropMessage(ConversionContext*, int, int, const char*) {}
}  // namespace

void InitQuietJob(ConversionContext* ctx) {
    pivloInitContext(ctx);
    ctx->hostMessageProc = DropMessage;
}

void ReadRowsAndRelease(benchmark::State& state, ConversionContext* ctx, Bytes& line, uint32_t rows) {
    for (uint32_t y = 0; y < rows; ++y)
        if (!zanTIFFReadNextScanLine(ctx, line.data(), static_cast<uint32_t>(line.size()))) {
            state.SkipWithError("read failed");
            break;
        }
    benchmark::DoNotOptimize(line.data());
    zanDestroyTIFF(ctx);
    pivloReleaseContext(ctx);
}

}  // namespace zanbench
