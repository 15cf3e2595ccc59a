// 64-bit positioning of the standard library's buffered file streams.
#pragma once

#include <cstdint>
#include <cstdio>

namespace zan {

#if defined(_WIN32)
inline int SeekStream(FILE* f, int64_t offset, int whence) { return _fseeki64(f, offset, whence); }
inline int64_t TellStream(FILE* f) { return _ftelli64(f); }
#else
inline int SeekStream(FILE* f, int64_t offset, int whence) {
    return fseeko(f, static_cast<off_t>(offset), whence);
}
inline int64_t TellStream(FILE* f) { return static_cast<int64_t>(ftello(f)); }
#endif

// Size of the stream's file in bytes, keeping its position; -1 when it
// cannot be learnt.
inline int64_t StreamSize(FILE* f) {
    const int64_t position = TellStream(f);
    if (position < 0 || SeekStream(f, 0, SEEK_END) != 0) return -1;
    const int64_t size = TellStream(f);
    SeekStream(f, position, SEEK_SET);
    return size;
}

}  // namespace zan
