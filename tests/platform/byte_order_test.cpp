#include <gtest/gtest.h>

#include <cstring>

#include "pivlo/pivlo.h"

namespace {

TEST(ByteOrder, ReadsAndStoresBothOrders) {
    const unsigned char bytes[4] = {0x12, 0x34, 0x56, 0x78};
    EXPECT_EQ(zanGetUINT16Big(nullptr, bytes), 0x1234);
    EXPECT_EQ(zanGetUINT16Little(nullptr, bytes), 0x3412);
    EXPECT_EQ(zanGetUINT32Big(nullptr, bytes), 0x12345678u);
    EXPECT_EQ(zanGetUINT32Little(nullptr, bytes), 0x78563412u);
    unsigned char out[4] = {};
    zanMake2ByteIntBig(nullptr, 0xA1B2, out);
    EXPECT_EQ(zanGetUINT16Big(nullptr, out), 0xA1B2);
    zanMake2ByteIntLittle(nullptr, 0xA1B2, out);
    EXPECT_EQ(out[0], 0xB2);
    zanMake4ByteIntBig(nullptr, 0xCAFEF00Du, out);
    EXPECT_EQ(zanGetUINT32Big(nullptr, out), 0xCAFEF00Du);
    EXPECT_EQ(out[0], 0xCA);
    zanMake4ByteIntLittle(nullptr, 0xCAFEF00Du, out);
    EXPECT_EQ(zanGetUINT32Little(nullptr, out), 0xCAFEF00Du);
    EXPECT_EQ(out[0], 0x0D);
}

TEST(ByteReverse, ReversesTheBitsOfEveryByte) {
    unsigned char data[] = {0x01, 0x80, 0xF0, 0xA5, 0x00, 0xFF, 0x12};
    zanByteReverseBuffer(nullptr, data, sizeof data - 1);
    const unsigned char expected[] = {0x80, 0x01, 0x0F, 0xA5, 0x00, 0xFF, 0x12};
    EXPECT_EQ(0, std::memcmp(data, expected, sizeof data)) << "the last byte is outside the count";
    zanByteReverseBuffer(nullptr, data, 0);
}

}  // namespace
