#include "sample/Kinds.h"
#include "sample/MrPhantom.h"
#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

#include <iterator>

namespace Kdd
{

namespace
{

constexpr double kSpacing = 3.4375;     // [mm] 220 mm in 64 pixels
constexpr double kSliceDistance = 4.4;  // [mm]
constexpr double kBase = -62;           // of the stack [mm]
// More than the bound up to which tag files keep a value, so that it is left out there.
constexpr int kProtocolBytes = 2000;

const SampleAttribute kScanner[] = {
    {DCM_Manufacturer, "Sample Imaging"},
    {DCM_ManufacturerModelName, "Sample MR 1.5"},
    {DCM_StationName, "MR01"},
    {DCM_DeviceSerialNumber, "15007"},
    {DCM_SoftwareVersions, "11.2\\Head\\Patch 4"},
    {DCM_BodyPartExamined, "HEAD"},
    {DCM_PatientPosition, "HFS"},
    {DCM_PositionReferenceIndicator, "NA"},
    {DCM_PhotometricInterpretation, "MONOCHROME2"},
    {DCM_MagneticFieldStrength, "1.5"},
    {DCM_ImagingFrequency, "63.676985"},
    {DCM_ImagedNucleus, "1H"},
    {DCM_TransmitCoilName, "Body"},
    {DCM_ReceiveCoilName, "Head 20"},
    {DCM_AngioFlag, "N"},
    {DCM_VariableFlipAngleFlag, "N"},
    {DCM_PercentSampling, "100"},
    {DCM_PercentPhaseFieldOfView, "100"},
    {DCM_NumberOfAverages, "1"},
    {DCM_EchoNumbers, "1"},
    {DCM_AcquisitionMatrix, "0\\64\\64\\0"},
    {DCM_InPlanePhaseEncodingDirection, "ROW"},
    {DCM_PixelSpacing, "3.4375\\3.4375"},
    // The dictionary leaves open whether it is signed.
    {DCM_SmallestPixelValueInSeries, "0", EVR_US},
    {DCM_PatientOrientation, ""},
    {DCM_BurnedInAnnotation, "NO"},
    {DCM_ImageComments, ""},
};

const SampleAttribute kGradientEcho[] = {
    {DCM_ImageType, "ORIGINAL\\PRIMARY\\M\\ND\\NORM"},
    {DCM_ScanningSequence, "GR"},
    {DCM_SequenceVariant, "SP\\OSP"},
    {DCM_ScanOptions, ""},
    {DCM_SequenceName, "gre2d"},
    {DCM_MRAcquisitionType, "2D"},
    {DCM_ProtocolName, "localizer"},
    {DCM_RepetitionTime, "8.6"},
    {DCM_EchoTime, "4"},
    {DCM_EchoTrainLength, "1"},
    {DCM_FlipAngle, "20"},
    {DCM_PixelBandwidth, "320"},
    {DCM_SliceThickness, "7"},
    {DCM_SpacingBetweenSlices, "10"},
    {DCM_NumberOfPhaseEncodingSteps, "64"},
    {DCM_AcquisitionNumber, "1"},
};

const SampleAttribute kTurboSpinEcho[] = {
    {DCM_ImageType, "ORIGINAL\\PRIMARY\\M\\ND"},
    {DCM_ScanningSequence, "SE"},
    {DCM_SequenceVariant, "SK\\SP\\OSP"},
    {DCM_ScanOptions, "PFP\\SAT1"},
    {DCM_SequenceName, "tse2d_15"},
    {DCM_MRAcquisitionType, "2D"},
    {DCM_ProtocolName, "T2 axial"},
    {DCM_RepetitionTime, "4800"},
    {DCM_EchoTime, "99"},
    {DCM_EchoTrainLength, "15"},
    {DCM_FlipAngle, "150"},
    {DCM_PixelBandwidth, "130"},
    {DCM_SliceThickness, "4"},
    {DCM_SpacingBetweenSlices, "4.4"},
    {DCM_NumberOfPhaseEncodingSteps, "57"},
    {DCM_AcquisitionNumber, "1"},
    {DCM_ImageOrientationPatient, "1\\0\\0\\0\\1\\0"},
    {DCM_BeatRejectionFlag, "N"},
    {DCM_TriggerTime, "0"},
    {DCM_NominalInterval, "0"},
    {DCM_CardiacNumberOfImages, "0"},
    {DCM_GradientEchoTrainLength, "0"},
    {DCM_RFEchoTrainLength, "15"},
    {DCM_SpecificAbsorptionRateDefinition, "IEC_HEAD"},
};

// Numbers at the limits of their representations.
const SamplePrivate kHeader[] = {
    {0x08, EVR_CS, "IMAGE NUMBER 4"},
    {0x09, EVR_LO, "1.0"},
    {0x0A, EVR_LO, "TX:1\\RX:20\\odd"},
    {0x0B, EVR_DS, "0.0125\\-0.5\\1e3"},
    {0x0C, EVR_FL, "0.1"},
    {0x0D, EVR_FD, "63.676985\\-0.000125"},
    {0x0E, EVR_SS, "-1\\-32768\\32767"},
    {0x0F, EVR_SL, "-2147483648"},
    {0x10, EVR_UL, "4294967295"},
    {0x11, EVR_US, "0\\65535"},
    {0x12, EVR_OF, "0.5\\0.25\\-0.125\\1"},
    {0x13, EVR_PN, "Physicist^Paula"},
};

struct Localizer
{
    SamplePlane plane;
    const char* orientation;
    // Of the centre of the first pixel.
    QVector<double> corner;  // [mm]
};

const Localizer kLocalizers[] = {
    {SamplePlane::Axial, "1\\0\\0\\0\\1\\0", {-108.28, -108.28, 0}},
    {SamplePlane::Coronal, "1\\0\\0\\0\\0\\-1", {-108.28, 0, 108.28}},
    {SamplePlane::Sagittal, "0\\1\\0\\0\\0\\-1", {0, -108.28, 108.28}},
};

// As scanners keep their protocol: a text of their own within bytes of no known meaning.
QByteArray protocolDump()
{
    QByteArray dump("### protocol ###\n");
    for (int line = 0; dump.size() < kProtocolBytes; ++line)
        dump += "slice[" + QByteArray::number(line) + "].thickness = 4.0\n";
    dump.truncate(kProtocolBytes);
    return dump;
}

void addPrivateBlocks(SampleObject& object, int instance)
{
    SampleDataset& dataset = object.dataset();
    dataset.withPrivate(0x0029, "SAMPLE MR HEADER", kHeader)
        .withBytes(SampleDataset::privateTag(0x0029, 0x20, EVR_OB), protocolDump())
        .with(DcmTag(0x0051, 0x0010, EVR_LO), "SAMPLE MR MEASURE")
        // Bytes that are no text, some that could be taken for one, and none at all.
        .withBytes(SampleDataset::privateTag(0x0051, 0x01, EVR_UN), QByteArray("\x01\x00\x7f\xff", 4))
        .withBytes(SampleDataset::privateTag(0x0051, 0x02, EVR_UN),
                   "t=" + QByteArray::number(object.random().between(1000, 99999)))
        .withBytes(SampleDataset::privateTag(0x0051, 0x03, EVR_UN), QByteArray());
    // A private sequence, whose items need the creator of their block again.
    dataset.item(SampleDataset::privateTag(0x0051, 0x04, EVR_SQ))
        .with(DcmTag(0x0051, 0x0010, EVR_LO), "SAMPLE MR MEASURE")
        .with(SampleDataset::privateTag(0x0051, 0x05, EVR_IS), instance % 5)
        .with(SampleDataset::privateTag(0x0051, 0x06, EVR_LT), "shim currents,\r\nsee the log");
}

// What localizers and slices have in common.
void describeImage(SampleObject& object, const SampleStudy& study, int instance)
{
    SampleDataset& dataset = object.dataset();
    dataset.withAll(kScanner)
        .with(DCM_FrameOfReferenceUID, study.uid("frame of reference"))
        .with(DCM_AcquisitionDate, kSampleDate)
        .with(DCM_SAR, decimal(0.0021 * object.random().between(10, 40), 6));
    study.describeRequest(dataset);
    addPrivateBlocks(object, instance);
}

void addPixels(SampleObject& object, SamplePicture picture)
{
    // Windows are chosen by the scanner for every image, so they differ.
    const int center = 420 + object.random().between(-30, 30);
    object.dataset()
        .with(DCM_WindowCenter, center)
        .with(DCM_WindowWidth, 2 * center + 60)
        .with(DCM_WindowCenterWidthExplanation, "AUTO");
    picture.addNoise(object.random(), 40).addUnsigned(object.dataset(), 0, 12);
}

void writeLocalizer(const SampleSeries& series, int instance, SampleFolder& folder)
{
    const Localizer& localizer = kLocalizers[instance - 1];
    SampleObject object(series, instance, instance * 1.1);
    describeImage(object, series.study, instance);
    object.dataset()
        .withAll(kGradientEcho)
        .with(DCM_AcquisitionTime, series.study.time(series.delay + instance * 1.1))
        .with(DCM_ImageOrientationPatient, localizer.orientation)
        .with(DCM_ImagePositionPatient, decimals(localizer.corner, 4))
        .with(DCM_SliceLocation, 0);
    addPixels(object, headThrough(localizer.plane));
    object.saveTo(folder);
}

void describePlace(SampleDataset& dataset, int instance)
{
    const double z = kBase + (instance - 1) * kSliceDistance;
    // From the first to the last pixel there are 63 distances, half of them on either side of the middle.
    const double corner = -kSpacing * 63 / 2;
    dataset.with(DCM_ImagePositionPatient, decimals({corner, corner, z}, 4))
        .with(DCM_SliceLocation, decimal(z, 4));
}

// A slice refers to the localizers it was planned on, which are not the same for every slice.
void describePlan(SampleDataset& dataset, const SampleSeries& localizers, int instance)
{
    localizers.refer(dataset, DCM_ReferencedImageSequence, 1 + instance % 3);
    if (instance % 2 == 0)
        localizers.refer(dataset, DCM_ReferencedImageSequence, 1 + (instance + 1) % 3);
}

void writeSlice(const SampleSeries& series, const SampleSeries& localizers, int instance,
                SampleFolder& folder)
{
    // First the odd slices, then the even ones, so that neighbours do not disturb each other.
    const double second = (instance % 2 == 0 ? 62.4 : 0) + instance * 0.24;
    SampleObject object(series, instance, second);
    describeImage(object, series.study, instance);
    object.dataset()
        .withAll(kTurboSpinEcho)
        .with(DCM_AcquisitionTime, series.study.time(series.delay + second));
    describePlan(object.dataset(), localizers, instance);
    describePlace(object.dataset(), instance);
    addPixels(object, headSection((instance - 1) * kSliceDistance));
    object.saveTo(folder);
}

}  // namespace

void writeMrStudy(const SampleStudy& study, SampleFolder& folder)
{
    const SampleSeries localizers = {
        study, 1, "MR", UID_MRImageStorage, "localizer", 15, SampleEncoding::ImplicitWithLengths};
    const SampleSeries slices = {study, 2, "MR", UID_MRImageStorage, "T2 axial", 80};
    const int planes = static_cast<int>(std::size(kLocalizers));

    for (int instance = 1; instance <= planes; ++instance)
        writeLocalizer(localizers, instance, folder);
    for (int instance = 1; instance <= study.images - planes; ++instance)
        writeSlice(slices, localizers, instance, folder);
}

}  // namespace Kdd
