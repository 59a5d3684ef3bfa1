#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"

#include <QFile>
#include <QtEndian>

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include <random>
#include <string>

namespace
{

QByteArray noise(int size)
{
    std::mt19937 source(1);
    QByteArray bytes(size, '\0');
    for (char& byte : bytes)
        byte = static_cast<char>(source());
    return bytes;
}

const QByteArray kText = QByteArray("Series Description; ").repeated(9) + noise(20);

QByteArray qxCompressed(const QByteArray& content)
{
    return qxCompress(reinterpret_cast<const unsigned char*>(content.constData()), content.size());
}

struct Codec
{
    const char* name;
    QByteArray (*compressed)(const QByteArray&);
    QByteArray (*content)(const QByteArray&, qint64 limit);
};

constexpr qint64 kLimit = 256 << 20;

class CompressionTest : public testing::TestWithParam<Codec>
{
};

TEST_P(CompressionTest, GivesBackWhatItTook)
{
    for (const QByteArray& each : {QByteArray(""), kText, noise(100000), QByteArray(8 << 20, '\0')}) {
        const QByteArray again = GetParam().content(GetParam().compressed(each), kLimit);
        EXPECT_TRUE(!again.isNull() && again == each) << each.size() << " bytes";
    }
}

TEST_P(CompressionTest, NoTruncationOrFlippedByteChangesTheContent)
{
    const QByteArray whole = GetParam().compressed(kText);
    for (int size = 1; size < whole.size(); ++size)
        EXPECT_TRUE(GetParam().content(whole.left(size), kLimit).isNull()) << size;
    for (int at = 0; at < whole.size(); ++at) {
        for (const int flip : {0x01, 0x10, 0x80, 0xFF}) {
            QByteArray damaged = whole;
            damaged[at] = static_cast<char>(whole.at(at) ^ flip);
            const QByteArray read = GetParam().content(damaged, kLimit);
            EXPECT_TRUE(read.isNull() || read == kText) << at;
        }
    }
}

/// In a process of its own, which has 64 MiB left to take.
[[noreturn]] void readInSmallMemory(const Codec& codec, const QByteArray& bomb, qint64 limit)
{
    QFile statm(QStringLiteral("/proc/self/statm"));
    const bool isKnown = statm.open(QIODevice::ReadOnly);
    const rlim_t taken = statm.readAll().split(' ').first().toULong() * static_cast<rlim_t>(::getpagesize());
    const rlimit all = {taken + (64U << 20U), taken + (64U << 20U)};
    ::_exit(isKnown && ::setrlimit(RLIMIT_AS, &all) == 0 && codec.content(bomb, limit).isNull() ? 0 : 1);
}

TEST_P(CompressionTest, ALengthBeyondTheLimitIsRefusedAndAnImpossibleOneTakesNoMemory)
{
    EXPECT_EQ(GetParam().content(GetParam().compressed(kText), kText.size()), kText);
    EXPECT_TRUE(GetParam().content(GetParam().compressed(kText), kText.size() - 1).isNull());
    // One announces the length at its head, the other at its end.
    const QByteArray whole = GetParam().compressed(QByteArray(100 << 20, '\0'));
    for (const qint64 limit : {kLimit, qint64{1} << 62})
        EXPECT_EXIT(readInSmallMemory(GetParam(), whole.left(500) + whole.right(500), limit),
                    testing::ExitedWithCode(0), "");
}

const Codec kCodecs[] = {{"Qx", qxCompressed, qxUncompress},
                         {"Lzma", Kdd::lzmaCompress, Kdd::lzmaUncompress}};
INSTANTIATE_TEST_SUITE_P(Codecs, CompressionTest, testing::ValuesIn(kCodecs),
                         [](const auto& row) { return std::string(row.param.name); });

TEST(QxCompress, IsTheFrameThatQtKnowsWithItsExactLength)
{
    EXPECT_EQ(qUncompress(qxCompressed(kText)), kText);
    EXPECT_EQ(qxUncompress(qCompress(kText)), kText);
    const auto size = static_cast<quint32>(kText.size());
    for (const quint32 claim : {0U, size - 1, size + 1, 0x80000000U, 0xFFFFFFFFU}) {
        QByteArray damaged = qxCompressed(kText);
        qToBigEndian(claim, damaged.data());
        EXPECT_TRUE(qxUncompress(damaged, qint64{1} << 40).isNull()) << claim;
    }
}

}  // namespace
