#include "platform/os/PathName.h"

#include <gtest/gtest.h>

namespace Kdd
{
namespace
{

TEST(PathName, GivesEveryNameBack)
{
    const QByteArray names[] = {"",         "/a/b.tc",      "/m\xc3\xa9ta/x",       "/m\xe9ta/x",
                                "\xff\xfe", "\xed\xb2\x80", "/\xf0\x9f\x98\x80\xe9"};
    for (const QByteArray& name : names) {
        EXPECT_EQ(pathBytes(pathText(name)), name) << name.toHex().constData();
        EXPECT_EQ(pathBytes(pathText(name) + QStringLiteral(".journal")), name + ".journal");
    }
    EXPECT_EQ(pathText("/a/b"), QStringLiteral("/a/b"));
    EXPECT_FALSE(isPlainText("/m\xe9ta"));
}

}  // namespace
}  // namespace Kdd
