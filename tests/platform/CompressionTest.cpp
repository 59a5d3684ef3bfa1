#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"
#include "support/ObjectServer.h"
#include "support/Process.h"

#include <QFile>
#include <QtEndian>

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

const QByteArray kText = QByteArray("Series Description; ").repeated(9) + someObject(20);

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

const Codec kCodecs[] = {{"Qx", qxCompressed, qxUncompress}, {"Lzma", lzmaCompress, lzmaUncompress}};

constexpr qint64 kLimit = 256 << 20;

TEST(Compression, GivesBackWhatItTookAndNothingElseWhenItIsCutOrDamaged)
{
    for (const auto& [name, compressed, content] : kCodecs) {
        SCOPED_TRACE(name);
        for (const QByteArray& each : {QByteArray(""), someObject(100000), QByteArray(8 << 20, '\0')})
            EXPECT_TRUE(content(compressed(each), kLimit) == each) << each.size() << " bytes";
        const QByteArray whole = compressed(kText);
        for (int at = 0; at < whole.size(); ++at) {
            EXPECT_TRUE(at == 0 || content(whole.left(at), kLimit).isNull()) << at;
            for (const int flip : {0x00, 0x01, 0x10, 0x80, 0xFF}) {
                QByteArray damaged = whole;
                damaged[at] = static_cast<char>(whole.at(at) ^ flip);
                const QByteArray read = content(damaged, kLimit);
                EXPECT_TRUE((read.isNull() && flip != 0) || read == kText) << at;
            }
        }
    }
}

/// Of a process that has 64 MiB left to take.
bool isRefusedInSmallMemory(const Codec& codec, const QByteArray& bomb, qint64 limit)
{
    QFile statm(QStringLiteral("/proc/self/statm"));
    const bool isKnown = statm.open(QIODevice::ReadOnly);
    const rlim_t taken = statm.readAll().split(' ').first().toULong() * static_cast<rlim_t>(::getpagesize());
    const rlimit all = {taken + (64U << 20U), taken + (64U << 20U)};
    return isKnown && ::setrlimit(RLIMIT_AS, &all) == 0 && codec.content(bomb, limit).isNull();
}

TEST(Compression, ALengthBeyondTheLimitIsRefusedAndAnImpossibleOneTakesNoMemory)
{
    for (const Codec& codec : kCodecs) {
        EXPECT_EQ(codec.content(codec.compressed(kText), kText.size()), kText);
        EXPECT_TRUE(codec.content(codec.compressed(kText), kText.size() - 1).isNull());
        // One announces the length at its head, the other at its end.
        const QByteArray whole = codec.compressed(QByteArray(100 << 20, '\0'));
        const QByteArray bomb = whole.left(500) + whole.right(500);
        for (const qint64 limit : {kLimit, qint64{1} << 62})
            EXPECT_EQ(inChild([&] { return isRefusedInSmallMemory(codec, bomb, limit); }), 1) << codec.name;
    }
}

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
