// Row conversions of the scanline reader. Every step works in the buffers
// the set-up obtained: in place where the result is not larger than the
// row, and from the end back where it is.
//
// A row holds its samples pixel by pixel, or, for a page with separate
// planes, plane by plane; the steps address samples through RowLayout so that
// both arrangements convert alike (and separate planes stay separate).

#include "read/row_conversions.h"

#include <cmath>
#include <cstring>

namespace zan {
namespace {

uint16_t Load16(const uint8_t* p) {
    uint16_t v;
    std::memcpy(&v, p, 2);
    return v;
}

void Store16(uint8_t* p, uint16_t v) { std::memcpy(p, &v, 2); }

// Where sample s of pixel x lies in a row of whole-byte samples.
struct RowLayout {
    uint32_t samples;
    uint32_t width;
    bool planar;
    size_t sampleBytes;

    size_t Offset(uint32_t x, uint32_t s) const {
        const size_t index = planar ? static_cast<size_t>(s) * width + x : static_cast<size_t>(x) * samples + s;
        return index * sampleBytes;
    }
};

RowLayout LayoutOf(const ConversionContext* ctx, size_t sampleBytes) {
    return {ctx->fileSamplesPerPixel, ctx->imageWidth, ctx->planarConfig == 2, sampleBytes};
}

// Palette indices, most significant bits first, to RGB bytes.
void ExpandPalette(const ConversionContext* ctx, const uint8_t* row, uint8_t* line) {
    const uint32_t bits = ctx->bitsPerSample;
    const uint16_t *red = ctx->paletteRed, *green = ctx->paletteGreen, *blue = ctx->paletteBlue;
    const uint32_t width = ctx->imageWidth;
    if (bits == 8) {  // one index a byte: no unpacking
        for (uint32_t x = 0; x < width; ++x, line += 3) {
            const uint8_t index = row[x];
            line[0] = static_cast<uint8_t>(red[index]);
            line[1] = static_cast<uint8_t>(green[index]);
            line[2] = static_cast<uint8_t>(blue[index]);
        }
        return;
    }
    const uint32_t perByte = 8 / bits;
    const uint32_t mask = (1u << bits) - 1;
    for (uint32_t x = 0; x < width; ++x) {
        const uint32_t shift = 8 - bits * (x % perByte + 1);
        const uint32_t index = (row[x / perByte] >> shift) & mask;
        *line++ = static_cast<uint8_t>(red[index]);
        *line++ = static_cast<uint8_t>(green[index]);
        *line++ = static_cast<uint8_t>(blue[index]);
    }
}

// Divides the colour samples of every pixel by its associated alpha
// (rounded, in single precision; a colour above its alpha wraps, a zero
// alpha gives colour 0). The extra samples stay as they are.
void Unpremultiply(const ConversionContext* ctx, uint8_t* row) {
    const bool wide = ctx->bitsPerSample == 16;
    const RowLayout layout = LayoutOf(ctx, wide ? 2 : 1);
    const uint32_t colours = ctx->extraSampleCount < layout.samples ? layout.samples - ctx->extraSampleCount : 0;
    const double full = wide ? 65535.0 : 255.0;
    for (uint32_t x = 0; x < layout.width; ++x) {
        const uint8_t* alphaAt = row + layout.Offset(x, ctx->alphaSampleIndex);
        const uint32_t alpha = wide ? Load16(alphaAt) : *alphaAt;
        const float a = static_cast<float>(alpha / full);
        for (uint32_t s = 0; s < colours; ++s) {
            uint8_t* at = row + layout.Offset(x, s);
            const uint32_t sample = wide ? Load16(at) : *at;
            const auto value = alpha == 0 ? 0u
                                          : static_cast<uint32_t>(static_cast<int64_t>(
                                                std::trunc(static_cast<float>(sample) / a + 0.5f)));
            if (wide) Store16(at, static_cast<uint16_t>(value));
            else *at = static_cast<uint8_t>(value);
        }
    }
}

// Keeps the first S - E samples of every pixel: 8-bit samples (and narrower
// ones widened to bytes) as they are, 16-bit ones whole or, when reducing,
// as their high-order byte. Separate planes stay separate.
void DropSamples(const ConversionContext* ctx, const uint8_t* row, uint8_t* line) {
    const bool wide = ctx->bitsPerSample == 16;
    const RowLayout in = LayoutOf(ctx, wide ? 2 : 1);
    const uint32_t keep = in.samples - ctx->dropSampleCount;
    const bool reduce = wide && ctx->reduceTo8Bits;
    const size_t outBytes = wide && !reduce ? 2 : 1;
    const RowLayout out{keep, in.width, in.planar, outBytes};
    if (!wide && !in.planar) {
        for (uint32_t x = 0; x < in.width; ++x) std::memmove(line + out.Offset(x, 0), row + in.Offset(x, 0), keep);
        return;
    }
    for (uint32_t x = 0; x < in.width; ++x)
        for (uint32_t s = 0; s < keep; ++s) {
            const uint8_t* from = row + in.Offset(x, s);
            uint8_t* to = line + out.Offset(x, s);
            if (reduce) *to = static_cast<uint8_t>(Load16(from) >> 8);
            else std::memmove(to, from, outBytes);
        }
}

// The work line holding 16-bit samples comes from the job's allocator, so it
// is aligned for them; reading them as such lets the loop be vectorised.
void ReduceTo8(const ConversionContext* ctx, const uint8_t* row, uint8_t* line) {
    const size_t count = static_cast<size_t>(ctx->fileSamplesPerPixel) * ctx->imageWidth;
    const auto* samples = reinterpret_cast<const uint16_t*>(row);
    for (size_t i = 0; i < count; ++i) line[i] = static_cast<uint8_t>(samples[i] >> 8);
}

// Widens `count` packed samples of `bits` bits (1, 2 or 4) that start at
// `packed` to one byte each at `bytes` (at or after `packed`), from the last
// back to the first, so that it can work in place.
void WidenRun(const uint8_t* packed, uint8_t* bytes, size_t count, uint32_t bits) {
    const uint32_t perByte = 8 / bits;
    const uint32_t mask = (1u << bits) - 1;
    const uint32_t scale = 255 / mask;
    for (size_t k = count; k-- > 0;) {
        const uint32_t shift = 8 - bits * (static_cast<uint32_t>(k % perByte) + 1);
        bytes[k] = static_cast<uint8_t>(((packed[k / perByte] >> shift) & mask) * scale);
    }
}

// Widens the samples of a row of 1-, 2- or 4-bit samples to bytes in place.
// Separate planes are each packed on their own; they are widened last plane
// first, so that no plane is overwritten before it is read.
void WidenRow(const ConversionContext* ctx, uint8_t* row) {
    const uint32_t bits = ctx->bitsPerSample;
    const uint32_t width = ctx->imageWidth;
    if (ctx->planarConfig != 2) {
        WidenRun(row, row, static_cast<size_t>(ctx->fileSamplesPerPixel) * width, bits);
        return;
    }
    const size_t planeRow = (static_cast<size_t>(width) * bits + 7) / 8;
    for (uint32_t plane = ctx->fileSamplesPerPixel; plane-- > 0;)
        WidenRun(row + plane * planeRow, row + static_cast<size_t>(plane) * width, width, bits);
}

}  // namespace

void ConvertScanLine(ConversionContext* ctx, uint8_t* read, uint8_t* line) {
    if (ctx->paletteExpansion) {
        ExpandPalette(ctx, read, line);
        return;
    }
    const uint32_t bits = ctx->bitsPerSample;
    if (bits < 8) {
        // Narrow samples are widened to bytes (1-bit rows are delivered
        // packed unless extra samples are dropped from them).
        if (ctx->dropSampleCount) {
            WidenRow(ctx, read);
            DropSamples(ctx, read, line);
        } else if (bits != 1) {
            WidenRow(ctx, line);
        }
        return;
    }
    if (ctx->alphaSampleIndex && ctx->alphaSampleIndex < ctx->fileSamplesPerPixel) Unpremultiply(ctx, read);
    if (ctx->dropSampleCount) DropSamples(ctx, read, line);
    else if (ctx->reduceTo8Bits) ReduceTo8(ctx, read, line);
}

}  // namespace zan
