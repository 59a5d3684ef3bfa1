#include "kddlib/volumes/StackFrame.h"

#include "kddlib/tagmodel/TagMap.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <cmath>

namespace Kdd
{

namespace
{

// Nothing that is imaged is larger; what goes beyond would lose its millimetres as a float.
constexpr double kMaxPosition = 1e6;
constexpr double kMaxSpacing = 1e4;

// Cosines are often written with three digits.
constexpr double kDirectionTolerance = 2e-3;

int integerOf(const TagMap& image, const DcmTagKey& key, int fallback)
{
    int value = 0;
    return image.findAndGetInt(key, value) ? value : fallback;
}

QString named(const char* attribute, const QByteArray& value)
{
    if (value.isEmpty())
        return QStringLiteral("%1 is missing").arg(QLatin1String(attribute));
    return QStringLiteral("%1 is \"%2\"").arg(QLatin1String(attribute), QString::fromLatin1(value));
}

QString named(const char* attribute, int value)
{
    return named(attribute, QByteArray::number(value));
}

/// Localizers are not stacked although some lie parallel: nobody reads them as a volume. A mosaic shows many slices in
/// one image. The frames of a segmentation are masks of several things in the same planes.
QString whyTypeIsNoSlice(const FrameTags& at)
{
    const QByteArray type = at.text(DCM_ImageType);
    const QByteArray modality = at.text(DCM_Modality);
    if (modality == "SEG")
        return named("Modality", modality);
    const QList<QByteArray> words = type.split('\\');
    for (const QByteArray& word : words) {
        if (word.trimmed() == "LOCALIZER" || word.trimmed() == "MOSAIC")
            return named("Image Type", type);
    }
    return {};
}

QString whyPixelsAreNoSlice(const FrameTags& at)
{
    const TagMap& image = at.image();
    const QByteArray photometric = at.text(DCM_PhotometricInterpretation);
    const int samples = integerOf(image, DCM_SamplesPerPixel, 1);
    const int bits = integerOf(image, DCM_BitsStored, 0);
    if (image.findElement(DCM_PixelData) == nullptr)
        return named("Pixel Data", QByteArray());
    if (photometric != "MONOCHROME1" && photometric != "MONOCHROME2")
        return named("Photometric Interpretation", photometric);
    if (samples != 1)
        return named("Samples per Pixel", samples);
    // What has more bits is a dose, a parameter map or a calculation, not an image that viewers stack.
    if (bits < 1 || bits > 16)
        return named("Bits Stored", bits);
    if (image.findElement(DCM_ModalityLUTSequence) != nullptr)
        return QStringLiteral("It has a Modality LUT Sequence instead of a rescale");
    return {};
}

QString whySizeIsNoSlice(const FrameTags& at, int frames)
{
    const TagMap& image = at.image();
    const int columns = integerOf(image, DCM_Columns, 0);
    const int rows = integerOf(image, DCM_Rows, 0);
    const int groups = FrameTags::numFrameGroups(image);
    if (columns < 1 || columns > 65535)
        return named("Columns", columns);
    if (rows < 1 || rows > 65535)
        return named("Rows", rows);
    if (frames > 1 && groups != frames)
        return QStringLiteral("Number of Frames is %1, but %2 frames have a position")
            .arg(frames)
            .arg(groups);
    return {};
}

QString whyNoSlice(const FrameTags& at, int frames)
{
    QString reason = whyPixelsAreNoSlice(at);
    if (reason.isEmpty())
        reason = whyTypeIsNoSlice(at);
    return reason.isEmpty() ? whySizeIsNoSlice(at, frames) : reason;
}

/// What all frames have in common.
void readImage(StackFrame& frame)
{
    const FrameTags& at = frame.tags;
    frame.columns = integerOf(at.image(), DCM_Columns, 0);
    frame.rows = integerOf(at.image(), DCM_Rows, 0);
    frame.bitsStored = integerOf(at.image(), DCM_BitsStored, 0);
    frame.isSigned = integerOf(at.image(), DCM_PixelRepresentation, 0) == 1;
    frame.photometric = at.text(DCM_PhotometricInterpretation);
    frame.frameOfReference = at.text(DCM_FrameOfReferenceUID);
}

/// A padding value has the pixels' sign, whatever VR a writer gave it.
int asStored(int value, bool isSigned)
{
    return isSigned ? static_cast<qint16>(value) : static_cast<quint16>(value);
}

void readPadding(StackFrame& frame)
{
    int value = 0;
    int limit = 0;
    const TagMap& image = frame.tags.image();
    frame.hasPadding = image.findAndGetInt(DCM_PixelPaddingValue, value);
    frame.hasPaddingRange = frame.hasPadding && image.findAndGetInt(DCM_PixelPaddingRangeLimit, limit);
    if (!frame.hasPadding)
        return;
    value = asStored(value, frame.isSigned);
    limit = frame.hasPaddingRange ? asStored(limit, frame.isSigned) : value;
    frame.paddingMin = qMin(value, limit);
    frame.paddingMax = qMax(value, limit);
}

QString readPosition(StackFrame& frame)
{
    const QByteArray text = frame.tags.text(DCM_PlanePositionSequence, DCM_ImagePositionPatient);
    const QVector<double> p = numbersOf(text);
    if (p.size() != 3)
        return named("Image Position (Patient)", text);
    for (const double value : p) {
        if (std::fabs(value) > kMaxPosition)
            return named("Image Position (Patient)", text);
    }
    frame.position = {p[0], p[1], p[2]};
    return {};
}

bool isUnit(const Vec3d& direction)
{
    return std::fabs(length(direction) - 1) <= kDirectionTolerance;
}

/// Directions are made exactly orthonormal, so that rounded cosines do not shear the stack.
QString readOrientation(StackFrame& frame)
{
    const QByteArray text = frame.tags.text(DCM_PlaneOrientationSequence, DCM_ImageOrientationPatient);
    const QVector<double> c = numbersOf(text);
    if (c.size() != 6)
        return named("Image Orientation (Patient)", text);
    const Vec3d row{c[0], c[1], c[2]};
    const Vec3d column{c[3], c[4], c[5]};
    if (!isUnit(row) || !isUnit(column) || std::fabs(dot(row, column)) > kDirectionTolerance)
        return named("Image Orientation (Patient)", text) +
               QStringLiteral(", which are no right-angled directions");
    frame.alongRow = row * (1 / length(row));
    const Vec3d straight = column - frame.alongRow * dot(frame.alongRow, column);
    frame.alongColumn = straight * (1 / length(straight));
    return {};
}

QString readSpacing(StackFrame& frame)
{
    const QByteArray text = frame.tags.text(DCM_PixelMeasuresSequence, DCM_PixelSpacing);
    const QVector<double> spacing = numbersOf(text);
    if (spacing.size() != 2)
        return named("Pixel Spacing", text);
    for (const double value : spacing) {
        if (value < 1 / kMaxSpacing || value > kMaxSpacing)
            return named("Pixel Spacing", text);
    }
    frame.rowSpacing = spacing[0];
    frame.columnSpacing = spacing[1];
    return {};
}

/// A number that the frame need not have; it must be one that floats can hold.
bool readNumber(const QByteArray& text, double& number)
{
    if (text.isEmpty())
        return true;
    const QVector<double> numbers = numbersOf(text);
    if (numbers.size() != 1 || !std::isfinite(static_cast<float>(numbers[0])))
        return false;
    number = numbers[0];
    return true;
}

QString readRescale(StackFrame& frame)
{
    const DcmTagKey group = DCM_PixelValueTransformationSequence;
    const QByteArray slope = frame.tags.text(group, DCM_RescaleSlope);
    const QByteArray intercept = frame.tags.text(group, DCM_RescaleIntercept);
    if (!readNumber(slope, frame.slope) || static_cast<float>(frame.slope) == 0)
        return named("Rescale Slope", slope);
    return readNumber(intercept, frame.intercept) ? QString() : named("Rescale Intercept", intercept);
}

QString readFrame(StackFrame& frame)
{
    for (const auto read : {readPosition, readOrientation, readSpacing, readRescale}) {
        QString reason = read(frame);
        if (!reason.isEmpty())
            return reason;
    }
    return {};
}

}  // namespace

LeftOutFrame leftOutFrame(const StackFrame& frame, const QString& reason)
{
    return {frame.imageUID, frame.isMultiFrame ? frame.frame : -1, reason};
}

QVector<StackFrame> stackFramesOf(const TagMap& image, QVector<LeftOutFrame>& leftOut)
{
    const int count = qMax(1, integerOf(image, DCM_NumberOfFrames, 1));
    const QByteArray uid = image.uid(TagMap::ImageLevel);
    const QString reason = whyNoSlice(FrameTags(image, 0), count);
    if (!reason.isEmpty()) {
        leftOut.append({uid, -1, reason});
        return {};
    }

    // Read once for all: a frame's own part takes a look-up in nested items, and there may be thousands.
    QVector<StackFrame> frames;
    StackFrame common(image);
    common.imageUID = uid;
    common.isMultiFrame = count > 1;
    readImage(common);
    readPadding(common);
    for (int i = 0; i < count; ++i) {
        StackFrame frame = common;
        frame.tags = FrameTags(image, i);
        frame.frame = i;
        const QString fault = readFrame(frame);
        if (fault.isEmpty())
            frames.append(frame);
        else
            leftOut.append(leftOutFrame(frame, fault));
    }
    return frames;
}

}  // namespace Kdd
