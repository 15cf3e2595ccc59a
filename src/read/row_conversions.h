// Turning a row as the codec delivers it into the host's line format.
#pragma once

#include <cstdint>

#include "zantiff/conversion_context.h"

namespace zan {

// Converts the row just read into `read` and leaves the result in `line`
// (lineBytes bytes): palette expansion, un-premultiplying of associated
// alpha, sample dropping, 16-to-8-bit reduction, widening of 1-, 2- and
// 4-bit samples. `read` is the work line when the reader set one up, else
// `line` itself. The set-up fields of the context say which steps apply.
void ConvertScanLine(ConversionContext* ctx, uint8_t* read, uint8_t* line);

}  // namespace zan
