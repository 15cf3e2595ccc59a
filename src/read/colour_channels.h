// Colour samples a PhotometricInterpretation value implies.
#pragma once

#include <cstdint>

namespace zan {

// 1 for min-is-white, min-is-black and mask; 3 for RGB, palette, YCbCr,
// CIELab, LogL and LogLuv; 0 for separated and any other value.
inline uint16_t colourChannelCount(uint32_t photometric) {
    switch (photometric) {
    case 0: case 1: case 4: return 1;
    case 2: case 3: case 6: case 8: case 32844: case 32845: return 3;
    default: return 0;
    }
}

// Samples beyond the colour channels of a page without an ExtraSamples tag,
// as a signed 16-bit difference; 0 when negative or when it is every sample.
inline uint16_t SurplusSamples(uint16_t samplesPerPixel, uint32_t photometric) {
    const auto surplus = static_cast<int16_t>(samplesPerPixel - colourChannelCount(photometric));
    return surplus < 0 || surplus == static_cast<int16_t>(samplesPerPixel) ? 0
                                                                           : static_cast<uint16_t>(surplus);
}

}  // namespace zan
