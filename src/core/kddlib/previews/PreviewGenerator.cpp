#include "kddlib/previews/PreviewGenerator.h"

#include "platform/base/LogFile.h"
#include "platform/base/Result.h"
#include "platform/volume/KxCompressedDataMedia.h"
#include "platform/volume/KxVolumeInfo.h"
#include "platform/volumefile/OrlanMesh.h"

#include <QBuffer>
#include <QFileInfo>

#include <algorithm>
#include <cmath>
#include <limits>
#include <memory>

namespace Kdd
{

namespace
{

constexpr float kNoTensor = 0.001F;  // marks pixels of a tensor image where none was measured
// Six floats.
constexpr int kTensorBytes = 24;
constexpr float kVeryLarge = 1e10F;

/// What is too large for an int would wrap to a negative bound, which stands for none.
int toInt(unsigned long size)
{
    return static_cast<int>(std::min<unsigned long>(size, std::numeric_limits<int>::max()));
}

void say(QString* reason, const QString& text)
{
    if (reason != nullptr)
        *reason = text;
}

/// Whoever logs the reason names the file too.
QString withoutPath(const QString& text, const QString& path)
{
    const QString start = path + QStringLiteral(": ");
    return text.startsWith(start) ? text.mid(start.size()) : text;
}

/// Maps a range of values to the 256 levels of a display.
class Window
{
public:
    Window(float lowest, float highest)
        : mLowest(lowest)
        // A range of one value has no steps: all of it is black.
        , mScale(highest == lowest ? 0 : 255 / (highest - lowest))
    {
    }

    /// Of what is no number 0: the comparisons are false for it.
    int level(float value) const
    {
        const float level = (value - mLowest + 0.5F) * mScale;
        if (level >= 255)
            return 255;
        return level > 0 ? static_cast<int>(level) : 0;
    }

    QRgb grey(float value) const
    {
        const int shown = level(value);
        return qRgb(shown, shown, shown);
    }

private:
    float mLowest;
    float mScale;
};

/// Calls `convert` with the numbers of each pixel and puts what it gives into the image.
template <typename T, typename Convert>
void convertPixels(const KxVolumeInfo& info, QImage& image, Convert convert)
{
    // By the bytes of a pixel, which may have more numbers than are shown.
    const int step = info.bytesPerPixel() / static_cast<int>(sizeof(T));
    for (int y = 0; y < image.height(); ++y) {
        const T* from = reinterpret_cast<const T*>(info.pixels() + y * info.rowStride());
        auto* to = reinterpret_cast<QRgb*>(image.scanLine(y));
        for (int x = 0; x < image.width(); ++x, from += step)
            to[x] = convert(from);
    }
}

/// The trace of a tensor of six components (xx, xy, xz, yy, yz, zz), which does not depend on how the patient lay. False
/// where none was measured.
template <typename T>
bool traceOf(const T* tensor, float& trace)
{
    const auto xx = static_cast<float>(tensor[0]);
    const auto yy = static_cast<float>(tensor[3]);
    const auto zz = static_cast<float>(tensor[5]);
    trace = xx + yy + zz;
    return xx != kNoTensor && yy != kNoTensor && zz != kNoTensor;
}

/// Tensors show as their trace, the smallest black and the largest white; the window is one of single numbers and says
/// nothing about it. The offset of half a step belongs to whole numbers and would brighten these small fractions, so
/// they are stretched to the levels first.
template <typename T>
void convertTensors(const KxVolumeInfo& info, QImage& image)
{
    float lowest = kVeryLarge;
    float highest = -kVeryLarge;
    convertPixels<T>(info, image, [&](const T* pixel) {
        float trace = 0;
        if (traceOf(pixel, trace)) {
            lowest = std::min(lowest, trace);
            highest = std::max(highest, trace);
        }
        return qRgb(0, 0, 0);
    });
    if (!(lowest < highest))
        return;
    const float scale = 255 / (highest - lowest);
    const Window levels = info.isInverted() ? Window(255, 0) : Window(0, 255);
    convertPixels<T>(info, image, [&](const T* pixel) {
        float trace = 0;
        return traceOf(pixel, trace) ? levels.grey((trace - lowest) * scale) : qRgb(0, 0, 0);
    });
}

template <typename T>
void convert(const KxVolumeInfo& info, const Window& window, QImage& image)
{
    const auto level = [&](T value) { return window.level(static_cast<float>(value)); };
    switch (info.componentCode()) {
    case KxVolumeInfo::Grey:
        convertPixels<T>(info, image,
                         [&](const T* pixel) { return window.grey(static_cast<float>(*pixel)); });
        break;
    case KxVolumeInfo::Colour:
    case KxVolumeInfo::ColourAlpha:
        if (info.bytesPerPixel() >= 3 * static_cast<int>(sizeof(T)))
            convertPixels<T>(info, image, [&](const T* pixel) {
                return qRgb(level(pixel[0]), level(pixel[1]), level(pixel[2]));
            });
        break;
    case KxVolumeInfo::SixComponents:
        if (info.bytesPerPixel() == kTensorBytes)
            convertTensors<T>(info, image);
        break;
    }
}

using Converter = void (*)(const KxVolumeInfo&, const Window&, QImage&);

/// Null for types that are not shown.
Converter converterFor(PrimitiveType type)
{
    switch (type) {
    case PrimitiveType::UInt8:
        return convert<quint8>;
    case PrimitiveType::Int8:
        return convert<qint8>;
    case PrimitiveType::UInt16:
        return convert<quint16>;
    case PrimitiveType::Int16:
        return convert<qint16>;
    case PrimitiveType::Int32:
        return convert<qint32>;
    case PrimitiveType::Float32:
        return convert<float>;
    case PrimitiveType::UInt32:
    case PrimitiveType::Float64:
        break;
    }
    return nullptr;
}

/// The size with square pixels; the longer side of a pixel stays, so that nothing is invented.
QSize squarePixels(const QSize& size, float aspect)
{
    if (aspect > 0 && aspect < 1)
        return {static_cast<int>(static_cast<float>(size.width()) * aspect), size.height()};
    if (aspect > 1)
        return {size.width(), static_cast<int>(static_cast<float>(size.height()) / aspect)};
    return size;
}

bool exceeds(const QSize& size, int width, int height)
{
    const bool isLimited = width >= 0 || height >= 0;
    return isLimited && (size.width() > width || size.height() > height);
}

/// Brings the longer side to what was asked for.
QSize reduced(const QSize& size, int width, int height)
{
    const double ratio = double(size.width()) / size.height();
    if (ratio <= 1)
        return {static_cast<int>(std::rint(height * ratio)), height};
    return {width, static_cast<int>(std::rint(width / ratio))};
}

QImage fitted(const QImage& image, float aspect, int width, int height)
{
    const QSize square = squarePixels(image.size(), aspect);
    if (square.isEmpty())
        return image;
    QSize target = square;
    if (exceeds(square, width, height))
        target = reduced(square, width, height);
    else if (aspect >= 0.95F && aspect <= 1.05F)
        return image;
    return image.scaled(target, Qt::IgnoreAspectRatio, Qt::SmoothTransformation);
}

}  // namespace

QImage PreviewGenerator::createPreviewImage(DcmDataset* dataset, unsigned long width, unsigned long height,
                                            const QString& path, QString* reason)
{
    if (dataset == nullptr) {
        say(reason, QStringLiteral("there is no dataset"));
        return {};
    }
    Result result;
    const auto info = KxVolumeInfo::readVolumeInfo(dataset, toInt(width), toInt(height), path, result);
    if (info == nullptr) {
        say(reason, withoutPath(result.text(), path));
        return {};
    }
    const QImage image = convertToQImage(info.get(), toInt(width), toInt(height));
    if (image.isNull())
        say(reason,
            QStringLiteral("pixels of type %1 are not shown").arg(static_cast<int>(info->primitiveType())));
    return image;
}

QImage PreviewGenerator::createPreviewImage(OrlanMesh* mesh, const char* path, unsigned long width,
                                            unsigned long height, int slice)
{
    if (mesh == nullptr || path == nullptr)
        return {};
    Result result;
    const auto info = KxVolumeInfo::readVolumeInfo(*mesh, toInt(width), toInt(height), slice, result);
    if (info == nullptr)
        LogFile::warnf("Could not create preview image of slice %d of %s: %s", slice, path,
                       qUtf8Printable(result.text()));
    return convertToQImage(info.get(), toInt(width), toInt(height));
}

TypedData2D PreviewGenerator::createPreviewImage(const QString& path, int width, int height)
{
    const QFileInfo file(path);
    if (!file.isFile())
        return {};
    return KxCompressedDataMedia::decodeRepresentativeFrame(path, 0, file.size(), width, height,
                                                            KxCompressedDataMedia::kRepresentative);
}

QImage PreviewGenerator::convertToQImage(const KxVolumeInfo* info, int width, int height)
{
    if (info == nullptr)
        return {};
    const float center = (info->lowestValue() + info->highestValue()) * 0.5F;
    const QImage image = convertToQImage(info, center, info->highestValue() - info->lowestValue());
    if (image.isNull())
        return image;
    return fitted(image, info->pixelAspectRatio(), width, height);
}

QImage PreviewGenerator::convertToQImage(const KxVolumeInfo* info, float center, float width)
{
    QImage image;
    const bool hasPixels = info != nullptr && info->previewHasPixels();
    const Converter converter = hasPixels ? converterFor(info->primitiveType()) : nullptr;
    if (converter != nullptr)
        image = QImage(info->width(), info->height(), QImage::Format_RGB32);
    if (image.isNull())
        return image;
    // Pixels of too few numbers are not converted and stay as they are here.
    image.fill(Qt::black);
    // A negative width has white at the low end.
    const float half = (info->isInverted() ? -width : width) * 0.5F;
    converter(*info, Window(center - half, center + half), image);
    return image;
}

QByteArray PreviewGenerator::createPreviewData(const QImage& image)
{
    QBuffer buffer;
    buffer.open(QIODevice::WriteOnly);
    if (!image.save(&buffer, "JPEG"))
        LogFile::warnf("Failed to compress preview image in JPEG format");
    return buffer.data();
}

}  // namespace Kdd
