// Helpers shared by the frame tests: a probe of the codec's process-wide
// message handlers and a table of seeks for the client procedures.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <initializer_list>
#include <string>
#include <vector>

#include <tiffio.h>

namespace zantest {

using Texts = std::vector<std::string>;

constexpr uint32_t Back(uint32_t n) { return 0u - n; }  // a backward move as a wrapped offset

inline std::string Text(const void* bytes, size_t n) { return std::string(static_cast<const char*>(bytes), n); }

// Puts counting handlers of its own in force as the codec's process-wide
// ones for its lifetime; InForce() tells whether they are in force again.
struct HandlerProbe {
    inline static int errors = 0, warnings = 0;
    static void Error(const char*, const char*, va_list) { ++errors; }
    static void Warning(const char*, const char*, va_list) { ++warnings; }
    TIFFErrorHandler savedError = TIFFSetErrorHandler(Error);
    TIFFErrorHandler savedWarning = TIFFSetWarningHandler(Warning);
    HandlerProbe() { errors = warnings = 0; }
    ~HandlerProbe() {
        TIFFSetErrorHandler(savedError);
        TIFFSetWarningHandler(savedWarning);
    }
    static bool InForce() {  // and leaves the handlers in force as they are
        const TIFFErrorHandler error = TIFFSetErrorHandler(nullptr);
        const TIFFErrorHandler warning = TIFFSetWarningHandler(nullptr);
        TIFFSetErrorHandler(error);
        TIFFSetWarningHandler(warning);
        return error == Error && warning == Warning;
    }
};

// One call of a seek procedure and the position it must answer.
struct SeekStep {
    uint32_t offset;
    int whence;
    uint32_t answer;
};

inline void ExpectSeeks(uint32_t (*seek)(void*, uint32_t, int), void* client, std::initializer_list<SeekStep> steps) {
    for (const SeekStep& s : steps)
        EXPECT_EQ(seek(client, s.offset, s.whence), s.answer)
            << "seek " << static_cast<int32_t>(s.offset) << " whence " << s.whence;
}

}  // namespace zantest
