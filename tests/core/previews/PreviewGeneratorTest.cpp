#include "kddlib/previews/PreviewGenerator.h"

#include "platform/volume/KxVolumeInfo.h"
#include "support/LogCapture.h"

#include <gtest/gtest.h>

#include <cmath>
#include <tuple>

namespace
{

using namespace Kdd;
using Code = KxVolumeInfo::ComponentCode;
using Type = PrimitiveType;
using Levels = QVector<int>;

/// How pixels are to be shown; the range is 0 to 200 unless set.
struct Shown
{
    float lowest = 0;
    float highest = 200;
    bool inverted = false;

    /// What becomes of a row of pixels: of grey ones the level, of others the channels.
    template <typename T>
    Levels of(const QVector<T>& values, Type type, Code code = Code::Grey, int components = 1)
    {
        const QByteArray bytes(reinterpret_cast<const char*>(values.constData()),
                               values.size() * int(sizeof(T)));
        const TypedData2D pixels{values.size() / components, 1, components, type, bytes};
        const KxVolumeInfo info(pixels, code, lowest, highest, 1, inverted);
        const QImage image = PreviewGenerator::convertToQImage(&info, 256, 256);
        Levels levels;
        for (int x = 0; x < image.width(); ++x)
            levels.append(int(image.pixel(x, 0) & (image.allGray() ? 0xff : 0xffffff)));
        return levels;
    }
};

TEST(PreviewGenerator, MapsTheRangeOfEveryTypeToTheLevels)
{
    Shown shown;
    EXPECT_EQ(shown.of<quint8>({0, 100, 200, 255}, Type::UInt8), (Levels{0, 128, 255, 255}));
    EXPECT_EQ(shown.of<qint8>({-1, 0, 100}, Type::Int8), (Levels{0, 0, 128}));
    EXPECT_EQ(shown.of<quint16>({0, 100, 65535}, Type::UInt16), (Levels{0, 128, 255}));
    EXPECT_EQ(shown.of<qint16>({-32768, 100, 200}, Type::Int16), (Levels{0, 128, 255}));
    EXPECT_EQ(shown.of<qint32>({INT32_MIN, 100, INT32_MAX}, Type::Int32), (Levels{0, 128, 255}));
    EXPECT_EQ(shown.of<float>({100, NAN, INFINITY, -1e30F}, Type::Float32), (Levels{128, 0, 255, 0}));
    EXPECT_EQ(shown.of<quint32>({100}, Type::UInt32), Levels());
    EXPECT_EQ(shown.of<double>({100}, Type::Float64), Levels());
    shown.inverted = true;
    EXPECT_EQ(shown.of<quint8>({0, 100, 200}, Type::UInt8), (Levels{254, 126, 0}));
    shown.lowest = shown.highest = 7;
    EXPECT_EQ(shown.of<quint8>({0, 7, 255}, Type::UInt8), (Levels{0, 0, 0}));
}

TEST(PreviewGenerator, ShowsColoursAndTensors)
{
    Shown shown{0, 255, false};
    const Levels colours{0x010203, 0x040506};
    EXPECT_EQ(shown.of<quint8>({1, 2, 3, 4, 5, 6}, Type::UInt8, Code::Colour, 3), colours);
    EXPECT_EQ(shown.of<quint8>({1, 2, 3, 9, 4, 5, 6, 9}, Type::UInt8, Code::ColourAlpha, 4), colours);
    EXPECT_EQ(shown.of<quint8>({1, 2}, Type::UInt8, Code::Colour, 2), Levels{0});
    const QVector<float> tensors{1,      9, 9, 1,  9, 1,  2, 9, 9, 2, 9, 3,
                                 0.001F, 9, 9, 90, 9, 90, 4, 9, 9, 4, 9, 3};
    EXPECT_EQ(shown.of(tensors, Type::Float32, Code::SixComponents, 6), (Levels{0, 128, 0, 255}));
    EXPECT_EQ(shown.of(tensors, Type::Float32, Code::SixComponents, 3), Levels(8, 0));
    shown.inverted = true;
    EXPECT_EQ(shown.of(tensors, Type::Float32, Code::SixComponents, 6), (Levels{254, 127, 0, 0}));
}

/// The size of the pixels, the aspect of each, the side of the square asked for and the size of the preview.
using Fit = std::tuple<QSize, float, int, QSize>;

const Fit kFits[] = {
    {{512, 512}, 1, 256, {256, 256}},     {{256, 200}, 1.02F, 256, {256, 200}},
    {{256, 200}, 0.95F, 256, {256, 200}}, {{200, 100}, 0.5F, 256, {100, 100}},
    {{200, 100}, 2, 256, {200, 50}},      {{512, 300}, 1, 256, {256, 150}},
    {{300, 512}, 1, 256, {150, 256}},     {{400, 100}, 0.25F, 256, {100, 100}},
    {{100, 1}, 3, 50, {100, 1}},          {{512, 512}, 1, -1, {512, 512}},
    {{90, 90}, NAN, 256, {90, 90}},
};

TEST(PreviewGenerator, FitsSquarePixelsIntoTheSize)
{
    for (const auto& [size, aspect, requested, fitted] : kFits) {
        const QByteArray bytes(size.width() * size.height(), 'x');
        const TypedData2D pixels{size.width(), size.height(), 1, Type::UInt8, bytes};
        const KxVolumeInfo info(pixels, Code::Grey, 0, 255, aspect, false);
        const QImage image = PreviewGenerator::convertToQImage(&info, requested, requested);
        EXPECT_EQ(image.size(), fitted) << size.width() << ' ' << aspect;
    }
}

}  // namespace
