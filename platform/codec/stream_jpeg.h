// A JPEG stream decoded with libjpeg as its bytes arrive (libjpeg's
// suspending input): the push decoder's way around libtiff for a page that
// is a single JPEG strip.
#pragma once

#include <cstddef>
#include <cstdint>
#include <csetjmp>
#include <cstdio>

#include <jpeglib.h>

namespace osttiff {

class JpegBypass {
public:
    enum class Step {
        kNeedInput,  // every byte given was used: more are needed
        kStarted,    // the output's size is known (width, components): rows follow
        kRows,       // rows were decoded into the band
        kDone,       // every row has been decoded
        kFailed      // libjpeg failed (reported through the codec's handlers)
    };

    // `stored`: the stream's colour space as the page describes it
    // (JCS_UNKNOWN: as libjpeg judges it); `out`: the rows' colour space.
    JpegBypass(J_COLOR_SPACE stored, J_COLOR_SPACE out);
    ~JpegBypass();
    JpegBypass(const JpegBypass&) = delete;
    JpegBypass& operator=(const JpegBypass&) = delete;

    // Decodes from `data` (the stream's bytes from consumed() on, `available`
    // of them; `ended` when no more will come), at most `maxRows` rows into
    // `band` (rows of rowBytes()). `rows` receives the rows decoded.
    Step Run(const uint8_t* data, size_t available, bool ended, uint8_t* band, uint32_t maxRows, uint32_t* rows);

    // Bytes of the stream libjpeg is done with.
    uint64_t consumed() const { return consumed_; }
    uint32_t width() const { return d_.output_width; }
    uint32_t height() const { return d_.output_height; }
    uint64_t rowBytes() const { return uint64_t{d_.output_width} * static_cast<unsigned>(d_.output_components); }
    uint32_t rowsDecoded() const { return d_.output_scanline; }

private:
    struct Source : jpeg_source_mgr {
        JpegBypass* owner;
    };
    struct Errors : jpeg_error_mgr {
        std::jmp_buf jump;
    };
    enum class Phase { kHeader, kStart, kRows, kDone };

    static void InitSource(j_decompress_ptr) {}
    static boolean FillInput(j_decompress_ptr d);
    static void SkipInput(j_decompress_ptr d, long count);
    static void TermSource(j_decompress_ptr) {}
    static void ErrorExit(j_common_ptr c);
    static void EmitMessage(j_common_ptr c, int level);

    Step Guarded(uint8_t* band, uint32_t maxRows, uint32_t* rows);
    Step Advance(uint8_t* band, uint32_t maxRows, uint32_t* rows);

    jpeg_decompress_struct d_{};
    Errors errors_{};
    Source source_{};
    J_COLOR_SPACE stored_, out_;
    Phase phase_ = Phase::kHeader;
    bool ended_ = false;
    bool insertedEnd_ = false;
    uint64_t consumed_ = 0;
    uint64_t pendingSkip_ = 0;
    static const JOCTET kEndOfImage[2];
};

}  // namespace osttiff
