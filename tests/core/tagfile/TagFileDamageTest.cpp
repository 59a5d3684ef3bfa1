#include "TagFileFixture.h"
#include "kddlib/Limits.h"
#include "platform/base/KxMsg.h"
#include "platform/compression/QxCompress.h"
#include "support/Process.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <fstream>
#include <new>

using namespace Kdd;

namespace
{

constexpr int kRefused = -1;

// The parts of a body. A length may be a lie.

QByteArray length(int value)
{
    KxMsg message;
    TagMap::writeLength(message, value);
    return message.bytes();
}

QByteArray head(const DcmTagKey& key, VrCode vr)
{
    KxMsg message;
    message << quint16(key.getGroup()) << quint16(key.getElement()) << static_cast<quint8>(vr);
    return message.bytes();
}

QByteArray record(char marker, const QByteArray& payload)
{
    return QByteArray(1, marker) + length(payload.size()) + payload;
}

QByteArray node(char marker, const DcmTagKey& key, const QByteArray& uid, const QByteArray& more)
{
    return record(marker, head(key, VrCode::UI) + length(uid.size()) + uid + more);
}

QByteArray study(const QByteArray& more = {}, const char* uid = "1.2")
{
    return node(0, DCM_StudyInstanceUID, uid, more);
}

QByteArray series(const char* uid)
{
    return node(1, DCM_SeriesInstanceUID, uid, {});
}

QByteArray image(const char* uid, const QByteArray& more = {})
{
    return node(2, DCM_SOPInstanceUID, uid, more);
}

/// A sequence of as many items as `count` says.
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

const QByteArray kNegative = QByteArray::fromHex("ffff ffffffff");
const QByteArray kHuge = QByteArray::fromHex("ffff ffffff7f");
const QByteArray kBelow = study() + series("s");
const QByteArray kText = head(DCM_PatientID, VrCode::LO);

const Body kBodies[] = {
    {"Empty", "", kRefused},
    {"OnlyAStudy", study(), 0},
    {"RecordCutInItsLength", kBelow + QByteArray("\2\1", 2), kRefused},
    {"RecordLongerThanTheBody", kBelow + QByteArray("\2\7\0", 3) + "123456", kRefused},
    {"RecordOfHugeLength", kBelow + '\2' + kHuge, kRefused},
    {"RecordOfNegativeLength", kBelow + '\2' + kNegative, kRefused},
    {"ElementCutInItsHead", kBelow + image("1", "\x10\x10\x10"), kRefused},
    {"ValueLongerThanItsRecord", kBelow + image("1", kText + length(5) + "four"), kRefused},
    {"ValueOfHugeLength", kBelow + image("1", kText + kHuge), kRefused},
    {"ValueOfNegativeLength", kBelow + image("1", kText + kNegative), kRefused},
    {"MoreItemsThanBytes", kBelow + image("1", sequence(length(3), length(0) + length(0))), kRefused},
    {"HugeItemCount", kBelow + image("1", sequence(kHuge, {})), kRefused},
    {"NegativeItemCount", kBelow + image("1", sequence(kNegative, {})), kRefused},
    {"ItemLongerThanItsSequence", kBelow + image("1", sequence(length(1), length(9) + "123456")), kRefused},
    {"ItemOfNegativeLength", kBelow + image("1", sequence(length(1), kNegative)), kRefused},
    {"NestedAsDeepAsAllowed", kBelow + image("1", nested(kMaxItemDepth)), 1},
    {"NestedTooDeep", kBelow + image("1", nested(kMaxItemDepth + 1)), kRefused},
    {"NestedFarTooDeep", study(nested(5000)), kRefused},
    {"TwoSeriesOfOneUid", kBelow + image("1") + series("s") + image("2"), kRefused},
    {"TwoImagesOfOneUid", kBelow + image("1") + image("2") + image("1"), 2},
    {"AsManyReplacedAsAllowed", kBelow + image("1").repeated(kMaxReplacedImages + 1), 1},
    {"TooManyReplaced", kBelow + image("1").repeated(kMaxReplacedImages + 2), kRefused},
    {"OneImageInTwoSeries", kBelow + image("1") + series("t") + image("1"), 1},
    {"ImageBeforeItsSeries", study() + image("1") + series("s") + image("2"), 1},
    {"SeriesBeforeItsStudy", series("s") + image("1") + kBelow + image("2"), 1},
    {"VolumesBeforeTheirSeries", study() + record(3, length(1)) + series("s") + image("1"), 1},
    {"VolumesThatAreNotThere", kBelow + record(3, length(2)), kRefused},
    {"NegativeNumberOfVolumes", kBelow + record(3, kNegative), kRefused},
    {"TwoStudies", kBelow + image("1") + study({}, "1.3") + series("t") + image("2", "x"), 1},
    {"OneKeyTwice", kBelow + image("1", nested(3) + nested(3) + kText + length(0)), 1},
};

class TagFileDamage : public TagFileTest
{
protected:
    /// Reads the content; what came out is looked at, optimised and written. The number of images.
    static int imagesRead(const QByteArray& content)
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
        EXPECT_TRUE(read(again, written(file)) || file.isEmpty());
        return images;
    }

    /// The same in a process that has 64 MiB left to take; another number when it dies.
    static int imagesReadInSmallMemory(const QByteArray& content)
    {
        const int images = inChild([&content] {
            ::alarm(20);  // a sanitizer that finds no memory for its report waits for ever
            const rlim_t all = addressSpace() + (128U << 20U);
            const rlimit limit = {all, all};
            ::setrlimit(RLIMIT_AS, &limit);
            try {
                return imagesRead(content) + 1;
            } catch (const std::bad_alloc&) {
                return 101;
            }
        });
        return images - 1;
    }

    static QByteArray zlibFramed(const QByteArray& body)
    {
        return framed(qxCompress(reinterpret_cast<const unsigned char*>(body.constData()), body.size()),
                      Mode::Zlib);
    }

    const LogCapture mLog;

private:
    /// The size of this process [bytes].
    static rlim_t addressSpace()
    {
        unsigned long pages = 0;
        std::ifstream("/proc/self/statm") >> pages;
        return pages * static_cast<rlim_t>(::sysconf(_SC_PAGESIZE));
    }
};

TEST_F(TagFileDamage, HostileBodiesAreReadOrRefusedButNeverBelieved)
{
    for (const Body& body : kBodies) {
        EXPECT_EQ(imagesReadInSmallMemory(framed(body.bytes)), body.images) << body.name;
        EXPECT_EQ(imagesRead(framed(body.bytes)), body.images) << body.name;
        EXPECT_EQ(imagesRead(zlibFramed(body.bytes)), body.images) << body.name;
    }
}

TEST_F(TagFileDamage, AFileCutAnywhereIsRefusedOrHasLostPreviewsOnly)
{
    TagFile file;
    fill(file);
    for (const Mode mode : kModes) {
        const QByteArray content = written(file, mode);
        for (int size = 0; size < content.size(); ++size)
            ASSERT_EQ(imagesRead(content.left(size)), size < kHeaderSize + bodySize(content) ? kRefused : 3)
                << size;
    }
}

TEST_F(TagFileDamage, AFlippedByteIsNoticedOrHarmless)
{
    TagFile file;
    fill(file);
    for (const Mode mode : kModes) {
        const QByteArray content = written(file, mode);
        for (int at = 0; at < 3 * content.size(); ++at) {
            QByteArray damaged = content;
            damaged[at / 3] = static_cast<char>(damaged.at(at / 3) ^ "\x01\x80\xff"[at % 3]);
            imagesRead(damaged);
            const bool isInBody = at / 3 >= kHeaderSize && at / 3 < kHeaderSize + bodySize(content);
            TagFile again;
            // What is compressed carries a checksum; only bits that mean nothing may change.
            if (mode != Mode::None && isInBody && read(again, damaged)) {
                ASSERT_EQ(imagesText(again), imagesText(file)) << at;
            }
        }
    }
}

TEST_F(TagFileDamage, LengthsOfTheFrameAreNotBelieved)
{
    const QByteArray whole = framed(kBelow + image("1"));
    for (const char* hex : {"7fffffff", "ffffffff", "80000000", "10000001"}) {
        const QByteArray lie = QByteArray::fromHex(hex);
        const QByteArray zlib = zlibFramed(kBelow + image("1")).mid(kHeaderSize + 4);
        EXPECT_EQ(imagesReadInSmallMemory(framed(lie + zlib, Mode::Zlib)), kRefused);
        EXPECT_EQ(imagesReadInSmallMemory(whole.left(8) + lie + whole.mid(kHeaderSize)), kRefused);
        EXPECT_EQ(imagesReadInSmallMemory(whole.chopped(4) + lie), 1);
        EXPECT_EQ(imagesReadInSmallMemory(whole.chopped(4) + QByteArray::fromHex("00000001") + lie), 1);
    }
}

TEST_F(TagFileDamage, MoreElementsOrItemsThanAnyStudyHasAreRefused)
{
#ifndef __SANITIZE_ADDRESS__  // which takes a minute for so many small pieces of memory
    const QByteArray markers = head(DCM_PatientID, VrCode::Missing).repeated(kMaxElements + 1);
    EXPECT_EQ(imagesRead(framed(study(markers))), kRefused);
#endif
    const QByteArray items = sequence(length(kMaxElements + 1), length(0).repeated(kMaxElements + 1));
    EXPECT_EQ(imagesReadInSmallMemory(framed(study(items))), kRefused);
}

}  // namespace
