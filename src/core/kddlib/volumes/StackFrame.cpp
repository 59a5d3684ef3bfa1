#include "kddlib/volumes/StackFrame.h"

#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/StackFrameReader.h"
#include "platform/base/Decimal.h"
#include "platform/base/Result.h"

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

/// An attribute with which there is no slice.
Result refuse(const char* attribute, const QByteArray& value)
{
    const QLatin1String name(attribute);
    return Result::failure(value.isEmpty()
                               ? QStringLiteral("%1 is missing").arg(name)
                               : QStringLiteral("%1 is \"%2\"").arg(name, QString::fromLatin1(value)));
}

Result refuse(const char* attribute, int value)
{
    return refuse(attribute, QByteArray::number(value));
}

/// Localizers are not stacked although some lie parallel: nobody reads them as a volume. A mosaic shows many slices in
/// one image. The frames of a segmentation are masks of several things in the same planes.
Result checkType(const FrameTags& at)
{
    const QByteArray type = at.text(DCM_ImageType);
    const QByteArray modality = at.text(DCM_Modality);
    if (modality == "SEG")
        return refuse("Modality", modality);
    const QList<QByteArray> words = type.split('\\');
    for (const QByteArray& word : words) {
        if (word.trimmed() == "LOCALIZER" || word.trimmed() == "MOSAIC")
            return refuse("Image Type", type);
    }
    return {};
}

Result checkPixels(const FrameTags& at)
{
    const TagMap& image = at.image();
    const QByteArray photometric = at.text(DCM_PhotometricInterpretation);
    const int samples = integerOf(image, DCM_SamplesPerPixel, 1);
    const int bits = integerOf(image, DCM_BitsStored, 0);
    // Mostly only the marker of pixels that are too long is kept, which is enough to know of them.
    if (image.findElement(DCM_PixelData) == nullptr)
        return refuse("Pixel Data", QByteArray());
    if (photometric != "MONOCHROME1" && photometric != "MONOCHROME2")
        return refuse("Photometric Interpretation", photometric);
    if (samples != 1)
        return refuse("Samples per Pixel", samples);
    // What has more bits is a dose, a parameter map or a calculation, not an image that viewers stack.
    if (bits < 1 || bits > 16)
        return refuse("Bits Stored", bits);
    if (image.findElement(DCM_ModalityLUTSequence) != nullptr)
        return Result::failure(QStringLiteral("It has a Modality LUT Sequence instead of a rescale"));
    return {};
}

Result checkSize(const FrameTags& at, int frames)
{
    const TagMap& image = at.image();
    const int columns = integerOf(image, DCM_Columns, 0);
    const int rows = integerOf(image, DCM_Rows, 0);
    const int groups = FrameTags::numFrameGroups(image);
    if (columns < 1 || columns > 65535)
        return refuse("Columns", columns);
    if (rows < 1 || rows > 65535)
        return refuse("Rows", rows);
    if (frames > 1 && groups != frames)
        return Result::failure(
            QStringLiteral("Number of Frames is %1, but %2 frames have a position").arg(frames).arg(groups));
    return {};
}

Result checkImage(const FrameTags& at, int frames)
{
    Result checked = checkPixels(at);
    if (checked.good())
        checked = checkType(at);
    return checked.good() ? checkSize(at, frames) : checked;
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
    // The limit may lie below the value as well as above it.
    frame.paddingMin = qMin(value, limit);
    frame.paddingMax = qMax(value, limit);
}

Result readPosition(StackFrame& frame)
{
    const QByteArray text = frame.tags.text(DCM_PlanePositionSequence, DCM_ImagePositionPatient);
    const QVector<double> p = numbersOf(text);
    if (p.size() != 3)
        return refuse("Image Position (Patient)", text);
    for (const double value : p) {
        if (std::fabs(value) > kMaxPosition)
            return refuse("Image Position (Patient)", text);
    }
    frame.position = {p[0], p[1], p[2]};
    return {};
}

bool isUnit(const Vec3d& direction)
{
    return std::fabs(length(direction) - 1) <= kDirectionTolerance;
}

/// Directions are made exactly orthonormal, so that rounded cosines do not shear the stack.
Result readOrientation(StackFrame& frame)
{
    const QByteArray text = frame.tags.text(DCM_PlaneOrientationSequence, DCM_ImageOrientationPatient);
    const QVector<double> c = numbersOf(text);
    if (c.size() != 6)
        return refuse("Image Orientation (Patient)", text);
    // The row's direction is only brought to length 1. The column's loses what it has of the row's.
    const Vec3d row{c[0], c[1], c[2]};
    const Vec3d column{c[3], c[4], c[5]};
    if (!isUnit(row) || !isUnit(column) || std::fabs(dot(row, column)) > kDirectionTolerance)
        return Result::failure(refuse("Image Orientation (Patient)", text).text() +
                               QStringLiteral(", which are no right-angled directions"));
    frame.alongRow = row * (1 / length(row));
    const Vec3d straight = column - frame.alongRow * dot(frame.alongRow, column);
    frame.alongColumn = straight * (1 / length(straight));
    return {};
}

Result readSpacing(StackFrame& frame)
{
    const QByteArray text = frame.tags.text(DCM_PixelMeasuresSequence, DCM_PixelSpacing);
    const QVector<double> spacing = numbersOf(text);
    if (spacing.size() != 2)
        return refuse("Pixel Spacing", text);
    for (const double value : spacing) {
        if (value < 1 / kMaxSpacing || value > kMaxSpacing)
            return refuse("Pixel Spacing", text);
    }
    // DICOM names the distance between rows first, which runs along the columns.
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

Result readRescale(StackFrame& frame)
{
    const DcmTagKey group = DCM_PixelValueTransformationSequence;
    const QByteArray slope = frame.tags.text(group, DCM_RescaleSlope);
    const QByteArray intercept = frame.tags.text(group, DCM_RescaleIntercept);
    if (!readNumber(slope, frame.slope) || static_cast<float>(frame.slope) == 0)
        return refuse("Rescale Slope", slope);
    return readNumber(intercept, frame.intercept) ? Result() : refuse("Rescale Intercept", intercept);
}

/// What a frame has of its own. Of several things that are missing the first is told.
Result readFrame(StackFrame& frame)
{
    for (const auto read : {readPosition, readOrientation, readSpacing, readRescale}) {
        Result result = read(frame);
        if (result.bad())
            return result;
    }
    return {};
}

}  // namespace

LeftOutFrame leftOutFrame(const StackFrame& frame, const QString& reason)
{
    return {frame.imageUID, frame.isMultiFrame ? frame.frame : -1, reason};
}

/// What speaks against the image speaks against all its frames, so it is asked once and told once.
QVector<StackFrame> stackFramesOf(const TagMap& image, QVector<LeftOutFrame>& leftOut)
{
    const int count = qMax(1, integerOf(image, DCM_NumberOfFrames, 1));
    const QByteArray uid = image.uid(TagMap::ImageLevel);
    const Result checked = checkImage(FrameTags(image, 0), count);
    if (checked.bad()) {
        leftOut.append({uid, -1, checked.text()});
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
        const Result read = readFrame(frame);
        if (read.good())
            frames.append(frame);
        else
            leftOut.append(leftOutFrame(frame, read.text()));
    }
    return frames;
}

}  // namespace Kdd
