// The buffers the scanline reader keeps for a page.
#pragma once

#include "zantiff/conversion_context.h"

namespace zan {

// Releases the reader's strip buffer, its work line (when set-up took one)
// and its palette copy.
void ReleaseReaderBuffers(ConversionContext* ctx);

}  // namespace zan
