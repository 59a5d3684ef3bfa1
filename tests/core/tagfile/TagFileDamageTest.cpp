#include "kddlib/Limits.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/KxMsg.h"
#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/TreeText.h"

#include <QDataStream>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <new>

using namespace Kdd;

namespace
{

using Mode = TagFile::CompressionMode;

constexpr int kHeaderSize = 12;
constexpr int kRefused = -1;
constexpr Mode kModes[] = {Mode::None, Mode::Zlib, Mode::Lzma};

bool read(TagFile& file, const QByteArray& content)
{
    QDataStream in(content);
    return file.readCacheFile(in, nullptr);
}

QByteArray written(TagFile& file, Mode mode)
{
    TagFile::setCompressionMode(mode);
    QByteArray content;
    QDataStream out(&content, QIODevice::WriteOnly);
    EXPECT_TRUE(file.writeCacheFile(out));
    TagFile::setCompressionMode(Mode::Zlib);
    return content;
}

/// Reads the content; what came out is looked at, optimised and written, as a server would. The number of images.
int imagesRead(const QByteArray& content)
{
    TagFile file;
    if (!read(file, content)) {
        EXPECT_TRUE(file.isEmpty() && file.seriesByUID().isEmpty() && file.imagesByUID().isEmpty());
        EXPECT_FALSE(file.failure().isEmpty());
        return kRefused;
    }
    const int images = file.imagesByUID().size();
    const std::string shown = imagesText(file);
    file.optimizeAll();
    EXPECT_EQ(imagesText(file), shown);
    TagFile again;
    EXPECT_TRUE(read(again, written(file, Mode::None)) || file.isEmpty());
    return images;
}

void fill(TagFile& file)
{
    for (const char* uid : {"1", "2"}) {
        const DatasetBuilder image =
            anImage(uid).withItem(DCM_RequestAttributesSequence, anItem().with(DCM_CodeValue, uid));
        file.addTagMap(image.map(), nullptr, false)->putAndInsertValue({0x0006, 0x7105}, VrCode::OB, "jpeg");
    }
}

QByteArray framed(const QByteArray& stored, Mode mode)
{
    QByteArray content("TaCa\0\0\2", 7);
    QDataStream out(&content, QIODevice::WriteOnly | QIODevice::Append);
    out << static_cast<quint8>(mode) << stored << qint32(0);
    return content;
}

QByteArray zlibFramed(const QByteArray& body)
{
    return framed(qxCompress(reinterpret_cast<const unsigned char*>(body.constData()), body.size()),
                  Mode::Zlib);
}

// The parts of a body. A length may be a lie.

QByteArray length(int value)
{
    KxMsg message;
    TagMap::writeLength(message, value);
    return message.bytes();
}

const QByteArray kNegative = QByteArray::fromHex("ffff ffffffff");
const QByteArray kHuge = QByteArray::fromHex("ffff ffffff7f");

QByteArray head(const DcmTagKey& key, VrCode vr)
{
    KxMsg message;
    message << quint16(key.getGroup()) << quint16(key.getElement()) << static_cast<quint8>(vr);
    return message.bytes();
}

QByteArray element(const DcmTagKey& key, const QByteArray& value)
{
    return head(key, VrCode::UI) + length(value.size()) + value;
}

QByteArray record(char marker, const QByteArray& payload)
{
    return QByteArray(1, marker) + length(payload.size()) + payload;
}

QByteArray study(const QByteArray& more = {}, const char* uid = "1.2")
{
    return record(0, element(DCM_StudyInstanceUID, uid) + more);
}

QByteArray series(const char* uid)
{
    return record(1, element(DCM_SeriesInstanceUID, uid));
}

QByteArray image(const char* uid, const QByteArray& more = {})
{
    return record(2, element(DCM_SOPInstanceUID, uid) + more);
}

/// A sequence of `count` items, as it says.
QByteArray sequence(const QByteArray& count, const QByteArray& items)
{
    return head(DCM_RequestAttributesSequence, VrCode::SQ) + count + items;
}

QByteArray nested(int depth)
{
    QByteArray inner;
    for (int i = 0; i < depth; ++i)
        inner = sequence(length(1), length(inner.size()) + inner);
    return inner;
}

struct Body
{
    const char* name;
    QByteArray bytes;
    int images;
};

void PrintTo(const Body& body, std::ostream* out)
{
    *out << body.name;
}

const QByteArray kBelow = study() + series("s");

const Body kBodies[] = {
    {"Empty", "", kRefused},
    {"OnlyAStudy", study(), 0},
    {"RecordCutInItsLength", kBelow + QByteArray("\2\1", 2), kRefused},
    {"RecordLongerThanTheBody", kBelow + QByteArray("\2\7\0", 3) + "123456", kRefused},
    {"RecordOfHugeLength", kBelow + '\2' + kHuge, kRefused},
    {"RecordOfNegativeLength", kBelow + '\2' + kNegative, kRefused},
    {"ElementCutInItsHead", kBelow + image("1", "\x10\x00\x10"), kRefused},
    {"ValueLongerThanItsRecord", kBelow + image("1", head(DCM_PatientID, VrCode::LO) + length(5) + "four"),
     kRefused},
    {"ValueOfHugeLength", kBelow + image("1", head(DCM_PatientID, VrCode::LO) + kHuge), kRefused},
    {"ValueOfNegativeLength", kBelow + image("1", head(DCM_PatientID, VrCode::LO) + kNegative), kRefused},
    {"MoreItemsThanBytes", kBelow + image("1", sequence(length(3), length(0) + length(0))), kRefused},
    {"HugeItemCount", kBelow + image("1", sequence(kHuge, {})), kRefused},
    {"NegativeItemCount", kBelow + image("1", sequence(kNegative, {})), kRefused},
    {"ItemLongerThanItsSequence", kBelow + image("1", sequence(length(1), length(9) + "123456")), kRefused},
    {"ItemOfNegativeLength", kBelow + image("1", sequence(length(1), kNegative)), kRefused},
    {"NestedAsDeepAsAllowed", kBelow + image("1", nested(kMaxItemDepth)), 1},
    {"NestedTooDeep", kBelow + image("1", nested(kMaxItemDepth + 1)), kRefused},
    {"NestedFarTooDeep", kBelow + image("1", nested(5000)), kRefused},
    {"NestedTooDeepInTheStudy", study(nested(kMaxItemDepth + 1)), kRefused},
    {"TwoSeriesOfOneUid", kBelow + image("1") + series("s") + image("2"), kRefused},
    {"TwoImagesOfOneUid", kBelow + image("1") + image("2") + image("1"), 2},
    {"OneImageInTwoSeries", kBelow + image("1") + series("t") + image("1"), 1},
    {"ImageBeforeItsSeries", study() + image("1") + series("s") + image("2"), 1},
    {"SeriesBeforeItsStudy", series("s") + image("1") + kBelow + image("2"), 1},
    {"VolumesBeforeTheirSeries", study() + record(3, length(1)) + series("s") + image("1"), 1},
    {"VolumesThatAreNotThere", kBelow + record(3, length(2)), kRefused},
    {"NegativeNumberOfVolumes", kBelow + record(3, kNegative), kRefused},
    {"TwoStudies", kBelow + image("1") + study({}, "1.3") + series("t") + image("2"), 1},
    {"DamageInAStudyThatIsPassedOver", kBelow + study({}, "1.3") + series("t") + image("2", "x"), 0},
    {"OneKeyTwice", kBelow + image("1", nested(3) + nested(3) + element(DCM_RequestAttributesSequence, "x")),
     1},
};

class HostileBody : public testing::TestWithParam<Body>
{
};

/// `imagesRead` in a process that has 64 MiB left to take; another negative number when it dies.
int imagesReadInSmallMemory(const QByteArray& content)
{
    int status = -1;
    const pid_t pid = ::fork();
    if (pid == 0) {
        ::alarm(20);  // a sanitizer that finds no memory for its report waits for ever
        unsigned long pages = 0;
        FILE* statm = std::fopen("/proc/self/statm", "r");
        if (statm == nullptr || std::fscanf(statm, "%lu", &pages) != 1)
            ::_exit(100);
        const rlim_t all = pages * static_cast<rlim_t>(::sysconf(_SC_PAGESIZE)) + (64U << 20U);
        const rlimit limit = {all, all};
        ::setrlimit(RLIMIT_AS, &limit);
        try {
            ::_exit(imagesRead(content) + 1);
        } catch (const std::bad_alloc&) {
            ::_exit(101);
        }
    }
    ::waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) - 1 : -2;
}

TEST_P(HostileBody, IsReadOrRefusedButNeverBelieved)
{
    const LogCapture log;
    const QByteArray content = framed(GetParam().bytes, Mode::None);
    EXPECT_EQ(imagesReadInSmallMemory(content), GetParam().images);
    EXPECT_EQ(imagesRead(content), GetParam().images);
    EXPECT_EQ(imagesRead(zlibFramed(GetParam().bytes)), GetParam().images);
}

INSTANTIATE_TEST_SUITE_P(Bodies, HostileBody, testing::ValuesIn(kBodies),
                         [](const auto& row) { return std::string(row.param.name); });

TEST(TagFileDamage, AFileCutAnywhereIsRefusedOrHasLostPreviewsOnly)
{
    const LogCapture log;
    TagFile file;
    fill(file);
    for (const Mode mode : kModes) {
        const QByteArray content = written(file, mode);
        const int endOfBody =
            kHeaderSize + QByteArray(content.mid(kHeaderSize - 4, 4)).toHex().toInt(nullptr, 16);
        for (int size = 0; size < content.size(); ++size)
            ASSERT_EQ(imagesRead(content.left(size)), size < endOfBody ? kRefused : 2) << size;
    }
}

TEST(TagFileDamage, AFlippedByteIsNoticedOrHarmless)
{
    const LogCapture log;
    TagFile file;
    fill(file);
    for (const Mode mode : kModes) {
        const QByteArray content = written(file, mode);
        const int endOfBody = content.size() - 4 - 2 * 8;
        for (int at = 0; at < content.size(); ++at) {
            for (const char flip : {'\x01', '\x80', '\xff'}) {
                QByteArray damaged = content;
                damaged[at] = static_cast<char>(damaged.at(at) ^ flip);
                imagesRead(damaged);
                // What is compressed carries a checksum; only bits that mean nothing may change.
                TagFile again;
                if (mode != Mode::None && at >= kHeaderSize && at < endOfBody && read(again, damaged)) {
                    ASSERT_EQ(imagesText(again), imagesText(file)) << at;
                }
            }
        }
    }
}

TEST(TagFileDamage, LengthsOfTheFrameAreNotBelieved)
{
    const LogCapture log;
    const QByteArray body = kBelow + image("1");
    const QByteArray whole = framed(body, Mode::None);
    for (const char* hex : {"7fffffff", "ffffffff", "80000000"}) {
        const QByteArray lie = QByteArray::fromHex(hex);
        EXPECT_EQ(imagesReadInSmallMemory(whole.left(8) + lie + body), kRefused);
        EXPECT_EQ(imagesReadInSmallMemory(whole.chopped(4) + lie), 1);
        EXPECT_EQ(imagesReadInSmallMemory(whole.chopped(4) + QByteArray::fromHex("00000001") + lie), 1);
    }
}

TEST(TagFileDamage, CompressedBodiesThatAnnounceTooMuchAreRefused)
{
    const LogCapture log;
    const QByteArray zlib = zlibFramed(kBelow + image("1")).mid(kHeaderSize);
    for (const char* hex : {"ffffffff", "7fffffff", "10000001", "00000000"})
        EXPECT_EQ(imagesReadInSmallMemory(framed(QByteArray::fromHex(hex) + zlib.mid(4), Mode::Zlib)),
                  kRefused);
    const QByteArray bomb = lzmaCompress(QByteArray(static_cast<int>(kMaxBodySize) + 1, '\0'));
    ASSERT_FALSE(bomb.isEmpty());
    EXPECT_EQ(imagesReadInSmallMemory(framed(bomb, Mode::Lzma)), kRefused);
}

TEST(TagFileDamage, MoreElementsThanAnyStudyHasAreRefused)
{
    const LogCapture log;
    const QByteArray markers = head(DCM_PatientID, VrCode::Missing).repeated(kMaxElements + 1);
    EXPECT_EQ(imagesRead(zlibFramed(study(markers))), kRefused);
}

TEST(TagFileDamage, MoreItemsThanAnyStudyHasAreRefused)
{
    const LogCapture log;
    const QByteArray items = length(0).repeated(kMaxElements + 1);
    EXPECT_EQ(imagesReadInSmallMemory(framed(study(sequence(length(kMaxElements + 1), items)), Mode::None)),
              kRefused);
}

}  // namespace
