#include "platform/compression/CompressedCosts.h"
#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"
#include "support/ObjectServer.h"
#include "support/Process.h"

#include <QFile>
#include <QtEndian>

#include <gtest/gtest.h>

#include <array>

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

struct CostCodec
{
    const char* name;
    QByteArray (*compressed)(const QByteArray&);
    bool (*costs)(const QByteArray&, const CostReceiver&);
    int end;  // of the stream, which holds no content [bytes]
};

const CostCodec kCostCodecs[] = {{"Qx", qxCompressed, qxCosts, 4}, {"Lzma", lzmaCompress, lzmaCosts, 0}};

TEST(CompressedCosts, AreThoseOfEachStretchAndAddUpToTheWhole)
{
    // Noise, what says nothing, and noise that was there before: where the bits are is plain.
    const QByteArray noise = someObject(20000);
    const QByteArray mixed = noise + QByteArray(10000, 'a') + noise;
    for (const CostCodec& codec : kCostCodecs) {
        SCOPED_TRACE(codec.name);
        qint64 at = 0;
        std::array<double, 3> bits = {};
        const auto tell = [&](qint64 bytes, qint64 cost) {
            bits.at(at < 20000 ? 0 : at < 30000 ? 1 : 2) += static_cast<double>(cost);
            at += bytes;
        };
        EXPECT_TRUE(codec.costs(codec.compressed(mixed), tell));
        EXPECT_EQ(at, mixed.size());
        EXPECT_NEAR(bits[0], 160000, 6000);
        EXPECT_LT(bits[1], 2000);
        EXPECT_LT(bits[2], 8000);
        // Of the few forms that a stream can have, with codes of its own, without, and not compressed at all.
        for (const QByteArray& each :
             {QByteArray("a"), kText, someObject(100000), QByteArray(1 << 20, '\0')}) {
            const QByteArray whole = codec.compressed(each);
            qint64 bytes = 0;
            qint64 cost = 0;
            const auto add = [&](qint64 more, qint64 moreCost) { bytes += more, cost += moreCost; };
            EXPECT_TRUE(codec.costs(whole, add));
            EXPECT_EQ(bytes, each.size());
            EXPECT_LE(cost, whole.size() * 8);
            EXPECT_GT(cost, (whole.size() - 11) * 8);
        }
    }
}

TEST(CompressedCosts, StopWhereAStreamIsCutOrDamaged)
{
    for (const CostCodec& codec : kCostCodecs) {
        const QByteArray whole = codec.compressed(kText);
        const auto ignore = [](qint64 /*bytes*/, qint64 /*bits*/) {};
        for (int at = 0; at < whole.size(); ++at) {
            EXPECT_TRUE(at >= whole.size() - codec.end || !codec.costs(whole.left(at), ignore)) << at;
            for (const int flip : {0x01, 0x10, 0x80, 0xFF}) {
                QByteArray damaged = whole;
                damaged[at] = static_cast<char>(whole.at(at) ^ flip);
                codec.costs(damaged, ignore);  // whatever it says, it comes to an end
            }
        }
    }
}

}  // namespace
