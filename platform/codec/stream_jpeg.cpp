#include "stream_jpeg.h"

#include <algorithm>

#include <jerror.h>
#include <tiffio.h>

namespace osttiff {

const JOCTET JpegBypass::kEndOfImage[2] = {0xFF, JPEG_EOI};

JpegBypass::JpegBypass(J_COLOR_SPACE stored, J_COLOR_SPACE out) : stored_(stored), out_(out) {
    d_.err = jpeg_std_error(&errors_);
    errors_.error_exit = ErrorExit;
    errors_.emit_message = EmitMessage;
    jpeg_create_decompress(&d_);
    source_.init_source = InitSource;
    source_.fill_input_buffer = FillInput;
    source_.skip_input_data = SkipInput;
    source_.resync_to_restart = jpeg_resync_to_restart;
    source_.term_source = TermSource;
    source_.owner = this;
    d_.src = &source_;
}

JpegBypass::~JpegBypass() { jpeg_destroy_decompress(&d_); }

// No more bytes now: suspend, or at the end of the input end the image the
// way libjpeg's own sources do (a warning and an inserted EOI marker).
boolean JpegBypass::FillInput(j_decompress_ptr d) {
    auto* self = static_cast<Source*>(d->src)->owner;
    if (!self->ended_) return FALSE;
    WARNMS(d, JWRN_JPEG_EOF);
    self->insertedEnd_ = true;
    d->src->next_input_byte = kEndOfImage;
    d->src->bytes_in_buffer = 2;
    return TRUE;
}

void JpegBypass::SkipInput(j_decompress_ptr d, long count) {
    if (count <= 0) return;
    auto* self = static_cast<Source*>(d->src)->owner;
    const auto wanted = static_cast<size_t>(count);
    if (wanted <= d->src->bytes_in_buffer) {
        d->src->next_input_byte += wanted;
        d->src->bytes_in_buffer -= wanted;
        return;
    }
    // The rest is skipped as it arrives.
    self->pendingSkip_ += wanted - d->src->bytes_in_buffer;
    d->src->next_input_byte += d->src->bytes_in_buffer;
    d->src->bytes_in_buffer = 0;
}

void JpegBypass::ErrorExit(j_common_ptr c) {
    char text[JMSG_LENGTH_MAX];
    c->err->format_message(c, text);
    TIFFErrorExt(nullptr, "JPEGLib", "%s", text);
    std::longjmp(static_cast<Errors*>(c->err)->jump, 1);
}

void JpegBypass::EmitMessage(j_common_ptr c, int level) {
    if (level >= 0) return;  // trace messages
    char text[JMSG_LENGTH_MAX];
    c->err->format_message(c, text);
    TIFFWarningExt(nullptr, "JPEGLib", "%s", text);
}

JpegBypass::Step JpegBypass::Run(const uint8_t* data, size_t available, bool ended, uint8_t* band, uint32_t maxRows,
                                 uint32_t* rows) {
    *rows = 0;
    ended_ = ended;
    // Bytes libjpeg asked to skip before it saw them.
    const size_t skipped = static_cast<size_t>(std::min<uint64_t>(pendingSkip_, available));
    pendingSkip_ -= skipped;
    consumed_ += skipped;
    data += skipped;
    available -= skipped;
    if (pendingSkip_ > 0 && !ended) return Step::kNeedInput;
    source_.next_input_byte = data;
    source_.bytes_in_buffer = available;
    const Step step = Guarded(band, maxRows, rows);
    // After an inserted end marker every byte given has been used.
    consumed_ += insertedEnd_ ? available : static_cast<uint64_t>(source_.next_input_byte - data);
    return step;
}

// libjpeg's failures come back here through ErrorExit.
JpegBypass::Step JpegBypass::Guarded(uint8_t* band, uint32_t maxRows, uint32_t* rows) {
    if (setjmp(errors_.jump)) {
        phase_ = Phase::kDone;
        return Step::kFailed;
    }
    return Advance(band, maxRows, rows);
}

JpegBypass::Step JpegBypass::Advance(uint8_t* band, uint32_t maxRows, uint32_t* rows) {
    if (phase_ == Phase::kHeader) {
        const int header = jpeg_read_header(&d_, TRUE);
        if (header == JPEG_SUSPENDED) return Step::kNeedInput;
        if (stored_ != JCS_UNKNOWN) d_.jpeg_color_space = stored_;
        d_.out_color_space = out_;
        phase_ = Phase::kStart;
    }
    if (phase_ == Phase::kStart) {
        if (!jpeg_start_decompress(&d_)) return Step::kNeedInput;
        phase_ = Phase::kRows;
        return Step::kStarted;
    }
    if (phase_ == Phase::kDone) return Step::kDone;
    while (*rows < maxRows && d_.output_scanline < d_.output_height) {
        JSAMPROW row = band + *rows * rowBytes();
        if (jpeg_read_scanlines(&d_, &row, 1) != 1) break;
        ++*rows;
    }
    // The image's rows are all there; what follows them (the end marker) is
    // not waited for.
    if (d_.output_scanline >= d_.output_height) phase_ = Phase::kDone;
    if (*rows > 0) return Step::kRows;
    return phase_ == Phase::kDone ? Step::kDone : Step::kNeedInput;
}

}  // namespace osttiff
