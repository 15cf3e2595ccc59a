// The reference host's FillOrder bit reversal. (Its byte-order accessors are
// checked through the pages the page operations convert between orders.)

#include <gtest/gtest.h>

#include <cstring>

#include "pivlo/pivlo.h"

namespace {

// Every byte of the count has its bits reversed; bytes past it stay.
TEST(ByteReverse, ReversesTheBitsOfEveryByte) {
    unsigned char data[] = {0x01, 0x80, 0xF0, 0xA5, 0x00, 0xFF, 0x12};
    zanByteReverseBuffer(nullptr, data, sizeof data - 1);
    const unsigned char expected[] = {0x80, 0x01, 0x0F, 0xA5, 0x00, 0xFF, 0x12};
    EXPECT_EQ(0, std::memcmp(data, expected, sizeof data)) << "the last byte is outside the count";
    zanByteReverseBuffer(nullptr, data, 0);
}

}  // namespace
