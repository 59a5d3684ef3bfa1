#include "platform/base/KxMsg.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

TEST(KxMsg, FailsForGoodAtTheFirstReadPastItsEnd)
{
    KxMsg in("abc");
    quint32 number = 7;
    quint8 byte = 7;
    in >> number >> byte;
    EXPECT_EQ(number + byte, 0U);
    EXPECT_TRUE(in.failed());
    for (const qint64 count : {qint64(-1), qint64(5), qint64(0x7fffffff), qint64(0x100000002)}) {
        KxMsg bytes("four");
        EXPECT_TRUE(bytes.read(count).isEmpty() && bytes.failed());
        KxMsg whole("four");
        EXPECT_TRUE(whole.readMessage(count).failed() && whole.failed());
    }
}

}  // namespace
