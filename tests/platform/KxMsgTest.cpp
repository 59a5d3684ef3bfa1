#include "platform/base/KxMsg.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

TEST(KxMsg, HoldsLittleEndianNumbersWithoutPadding)
{
    KxMsg out;
    out << quint8(0xfe) << quint16(0x0102) << qint32(-2) << quint32(0x01020304) << 1.0F << Vec3i{1, -2, 3};
    EXPECT_EQ(out.bytes().toHex(), "fe0201feffffff040302010000803f01000000feffffff03000000");
    out << Box3f{0, 1, 2, 3, 4, 5} << Mat4f{};
    KxMsg in(out.bytes());
    in.read(15);
    Vec3i vector;
    Box3f box;
    Mat4f matrix;
    in >> vector >> box >> matrix;
    EXPECT_EQ(vector.y, -2);
    EXPECT_EQ(box.xmax, 1);
    EXPECT_EQ(box.ymin, 2);
    EXPECT_EQ(matrix.m[15], 1);
    EXPECT_EQ(in.remaining(), 0);
    EXPECT_FALSE(in.failed());
}

TEST(KxMsg, FailsForGoodAtTheFirstReadPastItsEnd)
{
    KxMsg in("abc");
    quint32 number = 7;
    quint8 byte = 7;
    in >> number >> byte;
    EXPECT_EQ(number + byte, 0U);
    EXPECT_EQ(in.remaining(), 3);
    EXPECT_TRUE(in.failed());
    for (const qint64 count : {qint64(-1), qint64(5), qint64(0x7fffffff), qint64(0x100000002)}) {
        KxMsg bytes("four");
        EXPECT_EQ(bytes.read(count), QByteArray());
        EXPECT_TRUE(bytes.failed());
        KxMsg whole("four");
        EXPECT_TRUE(whole.readMessage(count).failed() && whole.failed());
    }
}

}  // namespace
