#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"

#include <QFile>
#include <QtEndian>

#include <gtest/gtest.h>
#include <lzma.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <new>
#include <random>
#include <string>

namespace
{

QByteArray qxCompressed(const QByteArray& content)
{
    return qxCompress(reinterpret_cast<const unsigned char*>(content.constData()), content.size());
}

QByteArray noise(int size)
{
    std::mt19937 source(1);
    QByteArray bytes(size, '\0');
    for (char& byte : bytes)
        byte = static_cast<char>(source());
    return bytes;
}

QByteArray text()
{
    return QByteArray("Series Description; ").repeated(9) + noise(20);
}

[[noreturn]] void exitAfter(const std::function<bool()>& refuses)
{
    QFile statm(QStringLiteral("/proc/self/statm"));
    if (!statm.open(QIODevice::ReadOnly))
        ::_exit(2);
    const rlim_t pages = statm.readAll().split(' ').first().toULong();
    const rlim_t all = pages * static_cast<rlim_t>(::sysconf(_SC_PAGESIZE)) + (64U << 20U);
    const rlimit limit = {all, all};
    try {
        ::_exit(::setrlimit(RLIMIT_AS, &limit) == 0 && refuses() ? 0 : 1);
    } catch (const std::bad_alloc&) {
        ::_exit(3);
    }
}

/// Whether the bytes are refused by a process that has 64 MiB left to take.
bool isRefusedInSmallMemory(const std::function<bool()>& refuses)
{
    const pid_t pid = ::fork();
    if (pid == 0)
        exitAfter(refuses);
    int status = -1;
    ::waitpid(pid, &status, 0);
    return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

struct Codec
{
    const char* name;
    QByteArray (*compress)(const QByteArray&);
    QByteArray (*uncompress)(const QByteArray&, qint64 limit);
};

constexpr qint64 kLimit = 256 << 20;

class CompressionTest : public testing::TestWithParam<Codec>
{
protected:
    static QByteArray compressed(const QByteArray& content) { return GetParam().compress(content); }
    static QByteArray content(const QByteArray& bytes, qint64 limit = kLimit)
    {
        return GetParam().uncompress(bytes, limit);
    }
};

TEST_P(CompressionTest, GivesBackWhatItTook)
{
    const QByteArray contents[] = {QByteArray(""), QByteArray(1, '\0'), text(), noise(100000),
                                   QByteArray(5000000, 'z')};
    for (const QByteArray& each : contents) {
        const QByteArray again = content(compressed(each));
        EXPECT_FALSE(again.isNull());
        EXPECT_TRUE(again == each) << each.size() << " bytes";
    }
}

TEST_P(CompressionTest, NothingIsAContentAndNoFailure)
{
    EXPECT_FALSE(compressed({}).isNull());
    EXPECT_FALSE(content(compressed({}), 0).isNull());
    EXPECT_TRUE(content("12345678901234567890123456789012").isNull());
}

TEST_P(CompressionTest, EveryTruncationFails)
{
    const QByteArray whole = compressed(text());
    for (int size = 1; size < whole.size(); ++size)
        EXPECT_TRUE(content(whole.left(size)).isNull()) << size;
}

TEST_P(CompressionTest, AFlippedByteNeverChangesTheContent)
{
    const QByteArray whole = compressed(text());
    for (int at = 0; at < whole.size(); ++at) {
        for (const int flip : {0x01, 0x10, 0x80, 0xFF}) {
            QByteArray damaged = whole;
            damaged[at] = static_cast<char>(whole.at(at) ^ flip);
            const QByteArray read = content(damaged);
            EXPECT_TRUE(read.isNull() || read == text()) << at;
        }
    }
}

TEST_P(CompressionTest, AContentLongerThanTheLimitIsRefused)
{
    const QByteArray whole = compressed(text());
    EXPECT_TRUE(content(whole, text().size()) == text());
    EXPECT_TRUE(content(whole, text().size() - 1).isNull());
    EXPECT_TRUE(content(whole, -1).isNull());
}

const Codec kCodecs[] = {{"Qx", qxCompressed, qxUncompress},
                         {"Lzma", Kdd::lzmaCompress, Kdd::lzmaUncompress}};
INSTANTIATE_TEST_SUITE_P(Codecs, CompressionTest, testing::ValuesIn(kCodecs),
                         [](const auto& row) { return std::string(row.param.name); });

QByteArray claiming(quint32 length, QByteArray compressed)
{
    qToBigEndian(length, compressed.data());
    return compressed;
}

TEST(QxCompress, IsTheFrameThatQtKnows)
{
    const QByteArray whole = qxCompressed(text());
    EXPECT_EQ(qFromBigEndian<quint32>(whole.constData()), static_cast<quint32>(text().size()));
    EXPECT_EQ(whole.mid(4, 2), QByteArray("\x78\x9C"));
    EXPECT_EQ(qUncompress(whole), text());
    EXPECT_EQ(qxUncompress(qCompress(text())), text());
}

TEST(QxCompress, TheAnnouncedLengthMustBeExact)
{
    const auto size = static_cast<quint32>(text().size());
    const QByteArray nothing = qxCompress(nullptr, 0);
    EXPECT_TRUE(qxUncompress(claiming(size - 1, qxCompressed(text()))).isNull());
    EXPECT_TRUE(qxUncompress(claiming(size + 1, qxCompressed(text()))).isNull());
    EXPECT_TRUE(qxUncompress(claiming(0, qxCompressed("x"))).isNull());
    EXPECT_TRUE(qxUncompress(claiming(1, nothing)).isNull());
    EXPECT_TRUE(qxUncompress(nothing.left(4)).isNull());
    EXPECT_TRUE(qxCompress(nullptr, -1).isNull());
}

TEST(QxCompress, AnImpossibleLengthTakesNoMemory)
{
    for (const quint32 claim : {200U << 20U, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFFFU}) {
        const QByteArray bomb = claiming(claim, qxCompressed(text()));
        for (const qint64 limit : {kLimit, qint64{1} << 40})
            EXPECT_TRUE(isRefusedInSmallMemory([&] { return qxUncompress(bomb, limit).isNull(); })) << claim;
    }
    const QByteArray possible = claiming(0x80000000U, qxCompressed(noise(2200000)));  // but for no QByteArray
    EXPECT_TRUE(isRefusedInSmallMemory([&] { return qxUncompress(possible, qint64{1} << 40).isNull(); }));
}

/// A stream whose index, checks and all, announces `claimed` bytes for one block of `text()`.
QByteArray xzClaiming(quint64 claimed, lzma_check check = LZMA_CHECK_CRC32)
{
    const QByteArray plain = text();
    QByteArray out(4096, '\0');
    auto* bytes = reinterpret_cast<uint8_t*>(out.data());
    size_t at = LZMA_STREAM_HEADER_SIZE;
    lzma_stream_flags flags = {};
    flags.check = check;
    lzma_options_lzma options = {};
    lzma_lzma_preset(&options, 6);
    lzma_filter filters[] = {{LZMA_FILTER_LZMA2, &options}, {LZMA_VLI_UNKNOWN, nullptr}};
    lzma_block block = {};
    block.check = check;
    block.filters = filters;
    EXPECT_EQ(lzma_block_buffer_encode(&block, nullptr, reinterpret_cast<const uint8_t*>(plain.constData()),
                                       static_cast<size_t>(plain.size()), bytes, &at, 4096),
              LZMA_OK);
    lzma_index* index = lzma_index_init(nullptr);
    EXPECT_EQ(lzma_index_append(index, nullptr, lzma_block_unpadded_size(&block), claimed), LZMA_OK);
    flags.backward_size = lzma_index_size(index);
    EXPECT_EQ(lzma_index_buffer_encode(index, bytes, &at, 4096), LZMA_OK);
    lzma_index_end(index, nullptr);
    EXPECT_EQ(lzma_stream_header_encode(&flags, bytes), LZMA_OK);
    EXPECT_EQ(lzma_stream_footer_encode(&flags, bytes + at), LZMA_OK);
    return out.left(static_cast<int>(at) + LZMA_STREAM_HEADER_SIZE);
}

TEST(LzmaCompress, TheAnnouncedLengthMustBeExact)
{
    const auto size = static_cast<quint64>(text().size());
    EXPECT_EQ(Kdd::lzmaUncompress(xzClaiming(size)), text());
    for (const quint64 claim : {quint64{0}, size - 1, size + 1})
        EXPECT_TRUE(Kdd::lzmaUncompress(xzClaiming(claim)).isNull()) << claim;
}

TEST(LzmaCompress, AnImpossibleLengthTakesNoMemory)
{
    for (const quint64 claim : {quint64{200} << 20, quint64{1} << 32, quint64{1} << 61}) {
        const QByteArray bomb = xzClaiming(claim);
        for (const qint64 limit : {kLimit, qint64{1} << 62})
            EXPECT_TRUE(isRefusedInSmallMemory([&] { return Kdd::lzmaUncompress(bomb, limit).isNull(); }))
                << claim;
    }
}

TEST(LzmaCompress, TheDensestContentIsNotTakenForImpossible)
{
    const QByteArray dense(64 << 20, '\0');
    EXPECT_TRUE(Kdd::lzmaUncompress(Kdd::lzmaCompress(dense)) == dense);
}

TEST(LzmaCompress, OnlyOneWholeCheckedStreamIsTaken)
{
    const QByteArray whole = Kdd::lzmaCompress(text());
    EXPECT_TRUE(Kdd::lzmaUncompress(whole + whole).isNull());
    EXPECT_TRUE(Kdd::lzmaUncompress(whole + QByteArray(4, '\0')).isNull());
    EXPECT_TRUE(Kdd::lzmaUncompress('x' + whole).isNull());
    const auto size = static_cast<quint64>(text().size());
    EXPECT_TRUE(Kdd::lzmaUncompress(xzClaiming(size, LZMA_CHECK_NONE)).isNull());
}

}  // namespace
