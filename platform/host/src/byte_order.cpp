// Byte-order accessors and the FillOrder bit reversal of the reference host.

#include <array>

#include "pivlo/pivlo.h"

namespace {

constexpr std::array<unsigned char, 256> MakeBitReversalTable() {
    std::array<unsigned char, 256> table{};
    for (unsigned value = 0; value < 256; ++value) {
        unsigned reversed = 0;
        for (unsigned bit = 0; bit < 8; ++bit)
            if (value & (1u << bit)) reversed |= 0x80u >> bit;
        table[value] = static_cast<unsigned char>(reversed);
    }
    return table;
}

constexpr auto kBitReversal = MakeBitReversalTable();

}  // namespace

extern "C" {

uint16_t zanGetUINT16Big(ConversionContext*, const unsigned char* b) {
    return static_cast<uint16_t>((b[0] << 8) | b[1]);
}

uint16_t zanGetUINT16Little(ConversionContext*, const unsigned char* b) {
    return static_cast<uint16_t>((b[1] << 8) | b[0]);
}

uint32_t zanGetUINT32Big(ConversionContext*, const unsigned char* b) {
    return (uint32_t{b[0]} << 24) | (uint32_t{b[1]} << 16) | (uint32_t{b[2]} << 8) | b[3];
}

uint32_t zanGetUINT32Little(ConversionContext*, const unsigned char* b) {
    return (uint32_t{b[3]} << 24) | (uint32_t{b[2]} << 16) | (uint32_t{b[1]} << 8) | b[0];
}

void zanMake2ByteIntBig(ConversionContext*, uint16_t value, unsigned char* b) {
    b[0] = static_cast<unsigned char>(value >> 8);
    b[1] = static_cast<unsigned char>(value);
}

void zanMake2ByteIntLittle(ConversionContext*, uint16_t value, unsigned char* b) {
    b[0] = static_cast<unsigned char>(value);
    b[1] = static_cast<unsigned char>(value >> 8);
}

void zanMake4ByteIntBig(ConversionContext*, uint32_t value, unsigned char* b) {
    for (int i = 0; i < 4; ++i) b[i] = static_cast<unsigned char>(value >> (24 - 8 * i));
}

void zanMake4ByteIntLittle(ConversionContext*, uint32_t value, unsigned char* b) {
    for (int i = 0; i < 4; ++i) b[i] = static_cast<unsigned char>(value >> (8 * i));
}

void zanByteReverseBuffer(ConversionContext*, void* buffer, uint32_t byteCount) {
    auto* bytes = static_cast<unsigned char*>(buffer);
    for (uint32_t i = 0; i < byteCount; ++i) bytes[i] = kBitReversal[bytes[i]];
}

}  // extern "C"
