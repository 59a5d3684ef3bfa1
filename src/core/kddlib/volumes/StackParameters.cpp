#include "kddlib/volumes/StackParameters.h"

#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/StackFrameReader.h"
#include "kddlib/volumes/StackPlanner.h"
#include "kddlib/volumes/StackValues.h"
#include "platform/base/Decimal.h"
#include "platform/volumefile/SOPInstanceUtility.h"

#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <string>
#include <vector>

namespace Kdd
{

namespace
{

// What a reader of the file alone needs to tell whose and what kind of volume it is.
const DcmTagKey kImageAttributes[] = {
    DCM_SpecificCharacterSet,
    DCM_ImageType,
    DCM_SOPClassUID,
    DCM_StudyDate,
    DCM_SeriesDate,
    DCM_AcquisitionDate,
    DCM_StudyTime,
    DCM_SeriesTime,
    DCM_AcquisitionTime,
    DCM_AccessionNumber,
    DCM_Modality,
    DCM_Manufacturer,
    DCM_InstitutionName,
    DCM_StationName,
    DCM_StudyDescription,
    DCM_SeriesDescription,
    DCM_ManufacturerModelName,
    DCM_PatientName,
    DCM_PatientID,
    DCM_PatientBirthDate,
    DCM_PatientSex,
    DCM_PatientAge,
    DCM_PatientSize,
    DCM_PatientWeight,
    DCM_ContrastBolusAgent,
    DCM_BodyPartExamined,
    DCM_KVP,
    DCM_SpacingBetweenSlices,
    DCM_ProtocolName,
    DCM_ConvolutionKernel,
    DCM_PatientPosition,
    DCM_ViewPosition,
    DCM_StudyInstanceUID,
    DCM_SeriesInstanceUID,
    DCM_StudyID,
    DCM_SeriesNumber,
    DCM_AcquisitionNumber,
    DCM_PatientOrientation,
    DCM_FrameOfReferenceUID,
    DCM_Laterality,
    DCM_ImageLaterality,
    DCM_PositionReferenceIndicator,
    DCM_SamplesPerPixel,
    DCM_PhotometricInterpretation,
    DCM_Rows,
    DCM_Columns,
    DCM_BitsAllocated,
    DCM_BitsStored,
    DCM_HighBit,
    DCM_PixelRepresentation,
    DCM_RescaleType,
    DCM_Units,
};

/// Decimal strings that enhanced images keep in functional groups.
struct FrameText
{
    DcmTagKey group;
    DcmTagKey key;
};

// Plain images have them as attributes, so they are asked for frame by frame and found in either place.
const FrameText kFrameTexts[] = {
    {DCM_PlanePositionSequence, DCM_ImagePositionPatient},
    {DCM_PlaneOrientationSequence, DCM_ImageOrientationPatient},
    {DCM_PixelMeasuresSequence, DCM_PixelSpacing},
    {DCM_PixelMeasuresSequence, DCM_SliceThickness},
};

QByteArray nameOf(const DcmTagKey& key)
{
    char name[16];
    std::snprintf(name, sizeof name, "G%04X-%04X", unsigned(key.getGroup()), unsigned(key.getElement()));
    return name;
}

void insertAttribute(ParamBundle& bundle, const TagMap& image, const DcmTagKey& key)
{
    QByteArray text;
    const TagElement* element = image.findElement(key);
    if (element != nullptr && !element->markedAsOmitted() && image.findAndGetString(key, text))
        bundle.insert(nameOf(key), Parameter::ofText(QByteArray(vrName(element->vr())) + ':' + text));
}

/// False when it was ignored: then that of one slice says nothing of the volume.
bool sharesFrameOfReference(const QVector<StackFrame>& slices)
{
    return std::all_of(slices.begin(), slices.end(), [&](const StackFrame& slice) {
        return slice.frameOfReference == slices.first().frameOfReference;
    });
}

ParamBundle dicomBundle(const QVector<StackFrame>& slices)
{
    const StackFrame& slice = slices.first();
    ParamBundle bundle;
    for (const DcmTagKey& key : kImageAttributes) {
        if (key != DCM_FrameOfReferenceUID || sharesFrameOfReference(slices))
            insertAttribute(bundle, slice.tags.image(), key);
    }
    for (const FrameText& entry : kFrameTexts) {
        const QByteArray text = slice.tags.text(entry.group, entry.key);
        if (!text.isEmpty())
            bundle.insert(nameOf(entry.key), Parameter::ofText("DS:" + text));
    }
    // Its presence says that the slices are named by image and frame.
    if (slice.isMultiFrame)
        insertAttribute(bundle, slice.tags.image(), DCM_NumberOfFrames);
    return bundle;
}

/// Names each slice by its image, and by its frame where the images have several.
ParamBundle sopInstances(const QVector<StackFrame>& slices)
{
    std::vector<std::string> names;
    for (const StackFrame& slice : slices) {
        const QByteArray frame = slice.isMultiFrame ? '.' + QByteArray::number(slice.frame) : QByteArray();
        names.push_back((slice.imageUID + frame).toStdString());
    }
    return SOPInstanceUtility::bundleOf(names);
}

/// Each image once, also when it has several slices.
QVector<const TagMap*> imagesOf(const QVector<StackFrame>& slices)
{
    QVector<const TagMap*> images;
    QSet<const TagMap*> known;
    for (const StackFrame& slice : slices) {
        const TagMap* image = &slice.tags.image();
        if (!known.contains(image))
            images.append(image);
        known.insert(image);
    }
    return images;
}

/// An image that was once compressed with loss says so for good, also when it is stored uncompressed now.
bool isLossy(const TagMap& image)
{
    QByteArray lossy;
    return image.findAndGetString(DCM_LossyImageCompression, lossy) && lossy.trimmed() == "01";
}

/// By Overlay Rows, which every plane has, also where its pixels are too long to be kept.
int overlayPlanesOf(const TagMap& image)
{
    int planes = 0;
    for (int group = 0x6000; group <= 0x601e; group += 2)
        planes += image.findElement(DcmTagKey(static_cast<Uint16>(group), 0x0010)) != nullptr ? 1 : 0;
    return planes;
}

void insertCounts(ParamBundle& parameters, const QVector<StackFrame>& slices)
{
    int lossy = 0;
    int planes = 0;
    const QVector<const TagMap*> images = imagesOf(slices);
    for (const TagMap* image : images) {
        lossy += isLossy(*image) ? 1 : 0;
        planes = qMax(planes, overlayPlanesOf(*image));
    }
    parameters.insert("NumLossyCompressedImages", Parameter::ofIntegers({lossy}));
    parameters.insert("NumberOfOverlayPlanes", Parameter::ofIntegers({planes}));
}

void insertGeometry(ParamBundle& parameters, const Stack& stack)
{
    const Box3f& box = stack.boundingBox;
    QVector<double> limits;
    for (const float limit : {box.xmin, box.xmax, box.ymin, box.ymax, box.zmin, box.zmax})
        limits.append(double(limit));
    QVector<double> matrix;
    for (const float entry : stack.transformation.m)
        matrix.append(double(entry));
    parameters.insert("BoundingBox", Parameter::ofReals(limits));
    parameters.insert("TransformationMatrix", Parameter::ofReals(matrix));
}

void insertValues(ParamBundle& parameters, const StackValues& values, const ValueCounts& counts)
{
    parameters.insert("DataWindowScale", Parameter::ofReals({values.scale()}));
    parameters.insert("DataWindowBias", Parameter::ofReals({values.bias()}));
    parameters.insert("PrecisionLossBits", Parameter::ofReals({values.bitLoss()}));
    // Beside a range, too: a reader that knows of no ranges has this one value.
    if (values.hasPadding())
        parameters.insert("PaddingValue", Parameter::ofIntegers({values.paddingMin()}));
    if (values.hasPaddingRange()) {
        parameters.insert("PaddingRangeMin", Parameter::ofIntegers({values.paddingMin()}));
        parameters.insert("PaddingRangeMax", Parameter::ofIntegers({values.paddingMax()}));
    }
    if (!counts.isEmpty())
        parameters.insert("DataMinMax", Parameter::ofIntegers({counts.minimum(), counts.maximum()}));
}

/// The first window of the slice, if it is a usable one.
void insertWindow(ParamBundle& parameters, const StackFrame& slice, const StackValues& values)
{
    const DcmTagKey group = DCM_FrameVOILUTSequence;
    const QVector<double> centers = numbersOf(slice.tags.text(group, DCM_WindowCenter));
    const QVector<double> widths = numbersOf(slice.tags.text(group, DCM_WindowWidth));
    if (centers.isEmpty() || widths.isEmpty() || widths.first() <= 0)
        return;
    // The image gives its window in physical values; the file counts in values of the lattice.
    const double center = (centers.first() - values.bias()) / values.scale();
    parameters.insert("WindowCenter", Parameter::ofReals({center}));
    // A negative scale exchanges the ends of the window, whose width stays one.
    parameters.insert("WindowWidth", Parameter::ofReals({widths.first() / std::fabs(values.scale())}));
}

}  // namespace

ParamBundle stackParameters(const Stack& stack, const StackValues& values, const ValueCounts& counts)
{
    ParamBundle parameters;
    insertGeometry(parameters, stack);
    insertValues(parameters, values, counts);
    insertCounts(parameters, stack.slices);
    insertWindow(parameters, stack.slices.at(stack.slices.size() / 2), values);
    parameters.insertBundle("DICOM", dicomBundle(stack.slices));
    parameters.insertBundle("SOPInstanceUIDs", sopInstances(stack.slices));
    return parameters;
}

}  // namespace Kdd
