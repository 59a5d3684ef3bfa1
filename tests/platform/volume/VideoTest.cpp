#include "platform/volume/KxCompressedDataMedia.h"
#include "support/BytesRead.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"

#include <QProcess>

#include <cstdlib>

using namespace Kdd;

namespace
{

/// Four seconds that fade from red to blue, with a green box in the upper left quarter: the colour tells the time, the
/// box which way up.
const char* const kFade =
    "color=red:s=320x240:r=25:d=4,fade=out:st=0:d=4:color=blue,drawbox=0:0:160:120:lime:fill";

class Video : public testing::Test
{
protected:
    QString make(const char* name, const char* encoder, const QString& picture = QLatin1String(kFade))
    {
        const QString path = mFolder.filePath(QLatin1String(name));
        QStringList arguments = {QStringLiteral("-loglevel"), QStringLiteral("error"), QStringLiteral("-f"),
                                 QStringLiteral("lavfi"),     QStringLiteral("-i"),    picture};
        arguments += QString::fromLatin1(encoder).split(QLatin1Char(' '));
        EXPECT_EQ(QProcess::execute(QStringLiteral("ffmpeg"), arguments << path), 0);
        return path;
    }

    QString write(const QByteArray& bytes)
    {
        putFile(mFolder.filePath(QStringLiteral("written")), bytes);
        return mFolder.filePath(QStringLiteral("written"));
    }

    static TypedData2D frameOf(const QString& path, double fraction)
    {
        return KxCompressedDataMedia::decodeRepresentativeFrame(path, 0, QFile(path).size(), 160, 160,
                                                                fraction);
    }

    static int colour(const TypedData2D& frame, int x, int y, int component)
    {
        return static_cast<unsigned char>(frame.pixels.at((y * frame.width + x) * 3 + component));
    }

    /// How much of the fade is over, by the blue in the lower right corner.
    static double timeOf(const TypedData2D& frame)
    {
        return frame.isEmpty() ? -1 : colour(frame, frame.width - 9, frame.height - 9, 2) / 255.0;
    }

    QTemporaryDir mFolder;
};

/// With the height, and the tolerance in time: without times in the container only bytes tell where a frame is.
const std::tuple<const char*, const char*, int, double> kFormats[] = {
    {"mpeg2.mpg", "-c:v mpeg2video", 120, 0.02},
    {"mpeg2.m2v", "-c:v mpeg2video -f mpeg2video", 120, 0.1},
    {"h264.mp4", "-c:v libx264 -pix_fmt yuv420p", 120, 0.02},
    {"h264.ts", "-c:v libx264 -pix_fmt yuv420p -x264-params keyint=infinite:scenecut=0", 120, 0.02},
    {"h264.h264", "-c:v libx264 -pix_fmt yuv420p -x264-params keyint=infinite:scenecut=0", 120, 0.1},
    {"hevc.mp4", "-c:v libx265 -pix_fmt yuv420p -x265-params log-level=none", 120, 0.02},
    {"hevc.hevc", "-c:v libx265 -pix_fmt yuv420p -x265-params log-level=none:keyint=10", 120, 0.1},
    {"anamorphic.mp4", "-c:v libx264 -pix_fmt yuv420p -vf setsar=2", 60, 0.02},
};

TEST_F(Video, OfEveryFormatGivesTheFrameAtTheWantedTime)
{
    for (const auto& [name, encoder, height, tolerance] : kFormats) {
        SCOPED_TRACE(name);
        const TypedData2D frame = frameOf(make(name, encoder), 0.3);
        ASSERT_EQ(std::make_pair(frame.width, frame.height), std::make_pair(160, height));
        EXPECT_NEAR(timeOf(frame), 0.3, tolerance);
        EXPECT_NEAR(colour(frame, 150, 9, 0), 255 * (1 - timeOf(frame)), 12);
        EXPECT_GT(colour(frame, 9, 9, 1), 240);
        EXPECT_LT(colour(frame, 9, height - 9, 1), 20);
    }
}

TEST_F(Video, EndsWithItsLastFrameAndIsNeverEnlarged)
{
    const TypedData2D frame = KxCompressedDataMedia::decodeRepresentativeFrame(
        make("end.mp4", "-c:v libx264 -pix_fmt yuv420p"), 0, 1 << 30, 1000, 1000, 1);
    EXPECT_EQ(std::make_pair(frame.width, frame.height), std::make_pair(320, 240));
    EXPECT_NEAR(timeOf(frame), 1, 0.02);
}

TEST_F(Video, MayLieInsideALargerFile)
{
    const QByteArray video = fileContent(make("inner.mp4", "-c:v libx264 -pix_fmt yuv420p"));
    const QString path = write(QByteArray(1001, 'x') + video + video);
    EXPECT_NEAR(
        timeOf(KxCompressedDataMedia::decodeRepresentativeFrame(path, 1001, video.size(), 99, 99, 0.3)), 0.3,
        0.02);
}

TEST_F(Video, CutOrDamagedNeverEndsTheProcess)
{
    const LogCapture log;
    const QByteArray video =
        fileContent(make("small.mp4", "-c:v libx264 -pix_fmt yuv420p -vf scale=64:48 -t 1"));
    int frames = 0;
    for (int at = 0; at < video.size(); at += 17) {
        QByteArray damaged = video;
        damaged[at] = static_cast<char>(~damaged.at(at));
        frames += frameOf(write(damaged), 0.5).isEmpty() ? 0 : 1;
        // The index of the frames is at the end.
        EXPECT_EQ(frameOf(write(video.left(at)), 0.5).isEmpty(), at < video.indexOf("udta")) << at;
    }
    EXPECT_GT(frames, video.size() / 17 / 2);
}

/// In a process of its own, which has not looked for the module yet.
[[noreturn]] void decodeWithoutModule()
{
    qputenv("KDD_MODULE_FOLDER", "/nowhere");
    KxCompressedDataMedia::decodeRepresentativeFrame(QStringLiteral("/proc/self/exe"), 0, 100, 9, 9, 0.3);
    std::exit(0);
}

TEST(VideoModule, ThatIsMissingIsNamed)
{
    testing::GTEST_FLAG(death_test_style) = "threadsafe";
    EXPECT_EXIT(decodeWithoutModule(), testing::ExitedWithCode(0),
                "kdd-video.so is not installed in /nowhere");
}

TEST_F(Video, IsReadOnlyAroundTheFrame)
{
    const QString path =
        make("long.mp4", "-c:v mpeg2video -q:v 2", QStringLiteral("testsrc2=s=320x240:d=30"));
    frameOf(path, 0.1);  // which loads the decoders
    const qint64 before = bytesRead();
    ASSERT_FALSE(frameOf(path, 0.3).isEmpty());
    EXPECT_LT(bytesRead() - before, QFile(path).size() / 10);
}

}  // namespace
