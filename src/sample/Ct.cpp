#include "sample/CtPhantom.h"
#include "sample/Documents.h"
#include "sample/Kinds.h"
#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

namespace Kdd
{

namespace
{

// The table of the scout below tells it as well, as its rescale intercept.
constexpr int kOffset = 1024;         // of stored values, so that they need no sign
constexpr double kSpacing = 6.25;     // [mm] 400 mm in 64 pixels
constexpr double kTopOfStack = 64.5;  // [mm]

const SampleAttribute kScanner[] = {
    {DCM_Manufacturer, "Sample Imaging"},
    {DCM_ManufacturerModelName, "Sample CT 64"},
    {DCM_StationName, "CT01"},
    {DCM_DeviceSerialNumber, "64031"},
    {DCM_SoftwareVersions, "30.1\\Update 2\\2023-11"},
    {DCM_DateOfLastCalibration, "20240516\\20240517"},
    {DCM_TimeOfLastCalibration, "181500\\061000"},
    {DCM_BodyPartExamined, "CHEST"},
    {DCM_PatientPosition, "HFS"},
    {DCM_PositionReferenceIndicator, ""},
    {DCM_KVP, "120"},
    {DCM_DataCollectionDiameter, "500"},
    {DCM_ReconstructionDiameter, "400"},
    {DCM_DistanceSourceToDetector, "1085.6"},
    {DCM_DistanceSourceToPatient, "595"},
    {DCM_GantryDetectorTilt, "0"},
    {DCM_TableHeight, "142.5"},
    {DCM_RotationDirection, "CW"},
    {DCM_FilterType, "WEDGE"},
    {DCM_GeneratorPower, "60"},
    {DCM_FocalSpots, "0.7\\0.6"},
    {DCM_PhotometricInterpretation, "MONOCHROME2"},
    {DCM_BurnedInAnnotation, "NO"},
    {DCM_LossyImageCompression, "00"},
    {DCM_RescaleSlope, "1"},
    {DCM_RescaleType, "HU"},
    {DCM_ImageComments, ""},
};

const SampleAttribute kSpiral[] = {
    {DCM_ImageType, "ORIGINAL\\PRIMARY\\AXIAL\\SPIRAL"},
    {DCM_ScanOptions, "HELICAL MODE"},
    {DCM_ProtocolName, "Chest routine"},
    {DCM_ExposureTime, "500"},
    {DCM_ExposureTimeInms, "500"},
    {DCM_ExposureModulationType, "XYZ"},
    {DCM_RevolutionTime, "0.5"},
    {DCM_SingleCollimationWidth, "0.6"},
    {DCM_TotalCollimationWidth, "38.4"},
    {DCM_TableSpeed, "69.12"},
    {DCM_TableFeedPerRotation, "34.56"},
    {DCM_SpiralPitchFactor, "0.9"},
    {DCM_DataCollectionCenterPatient, "0\\-20.5\\-180"},
    {DCM_ReconstructionTargetCenterPatient, "0\\-20.5\\-180"},
    {DCM_ImageOrientationPatient, "1\\0\\0\\0\\1\\0"},
    {DCM_ContrastBolusAgent, ""},
    {DCM_AcquisitionType, "SPIRAL"},
};

const SampleAttribute kScout[] = {
    {DCM_ImageType, "ORIGINAL\\PRIMARY\\LOCALIZER"},
    {DCM_ScanOptions, "SCOUT MODE"},
    {DCM_ProtocolName, "Chest routine"},
    {DCM_AcquisitionNumber, "1"},
    {DCM_ExposureTime, "3200"},
    {DCM_XRayTubeCurrent, "35"},
    {DCM_Exposure, "112"},
    {DCM_ConvolutionKernel, "SCOUT"},
    {DCM_SliceThickness, "0.6"},
    {DCM_PixelSpacing, "6.25\\6.25"},
    {DCM_ImageOrientationPatient, "1\\0\\0\\0\\0\\-1"},
    {DCM_ImagePositionPatient, "-196.875\\0\\150"},
    {DCM_SliceLocation, "0"},
    {DCM_RescaleIntercept, "-1024"},
    {DCM_WindowCenter, "-100"},
    {DCM_WindowWidth, "900"},
};

// Many representations, odd lengths, negative numbers and no value at all: it all has to come back from a tag
// file byte by byte.
const SamplePrivate kAcquisition[] = {
    {0x01, EVR_LO, "Adult/Chest/Routine"},
    {0x02, EVR_DS, "0.9"},
    {0x03, EVR_IS, "64\\32"},
    {0x04, EVR_SS, "-3\\2"},
    {0x05, EVR_US, "736"},
    {0x06, EVR_SL, "-70000"},
    {0x07, EVR_FL, "0.6\\-0.25"},
    {0x08, EVR_AT, "(0018,0050)"},
    {0x09, EVR_OB, "1\\2\\fe\\ff\\7"},
    {0x0A, EVR_CS, ""},
    {0x0B, EVR_SH, "ODD"},
    {0x0C, EVR_OW, "12\\ff00\\8000"},
};

/// How one stack is computed from the raw data.
struct Reconstruction
{
    const char* kernel;
    const char* center;
    const char* width;
    const char* explanation;
    double thickness;  // and distance of the slices [mm]
    double noise;      // [HU]
    bool isSigned;     // whether the pixels are stored with a sign
};

// Two windows for one image, and both kinds of pixels, signed and unsigned, within one study.
const Reconstruction kSoftTissue = {"SOFT 30", "40\\60", "400\\350", "WINDOW1\\WINDOW2", 1.5, 24, false};
const Reconstruction kLung = {"LUNG 70", "-600", "1500", "LUNG", 3, 60, true};

void describeReconstruction(SampleDataset& dataset, const Reconstruction& reconstruction)
{
    dataset.with(DCM_ConvolutionKernel, reconstruction.kernel)
        .with(DCM_SliceThickness, decimal(reconstruction.thickness, 2))
        .with(DCM_PixelSpacing, decimals({kSpacing, kSpacing}, 4))
        .with(DCM_WindowCenter, reconstruction.center)
        .with(DCM_WindowWidth, reconstruction.width)
        .with(DCM_WindowCenterWidthExplanation, reconstruction.explanation)
        // Signed pixels need no offset, since they hold the Hounsfield units themselves.
        .with(DCM_RescaleIntercept, reconstruction.isSigned ? 0 : -kOffset);
}

// What the scanner measures anew for every slice.
void describeExposure(SampleObject& object, int instance, double depth)
{
    // Tubes give more current where the body is thicker.
    const int current = 170 + static_cast<int>(110 * swell(depth / 160)) + object.random().between(-4, 4);
    // A new acquisition after every 120 slices, so that a value is shared by many images and not by all.
    object.dataset()
        .with(DCM_AcquisitionNumber, 2 + (instance - 1) / 120)
        .with(DCM_AcquisitionDate, kSampleDate)
        .with(DCM_XRayTubeCurrent, current)
        .with(DCM_Exposure, current / 2)
        .with(DCM_CTDIvol, decimal(current * 0.034, 4))
        // The private block of the whole series goes on with what each slice has of its own.
        .with(SampleDataset::privateTag(0x0019, 0x10, EVR_UL), 4000000 + instance * 2304)
        .with(SampleDataset::privateTag(0x0019, 0x11, EVR_FD), decimal(kTopOfStack - depth + 0.0125, 4))
        // Bytes of no known representation, of even and of odd lengths.
        .withBytes(SampleDataset::privateTag(0x0019, 0x12, EVR_UN), "T" + QByteArray::number(instance * 7919))
        // A second creator in another group.
        .with(DcmTag(0x0021, 0x0010, EVR_LO), "SAMPLE CT RECON 2.0")
        .with(SampleDataset::privateTag(0x0021, 0x01, EVR_IS), instance)
        .with(SampleDataset::privateTag(0x0021, 0x02, EVR_UT), "pipeline=backprojection;pass=1");
}

void describePlace(SampleDataset& dataset, const SampleStudy& study, double depth)
{
    const double z = kTopOfStack - depth;
    // The position is that of the first pixel's centre.
    const double corner = -kSpacing * 63 / 2;
    dataset.with(DCM_FrameOfReferenceUID, study.uid("frame of reference"))
        .with(DCM_ImagePositionPatient, decimals({corner, corner - 20.5, z}, 4))
        .with(DCM_SliceLocation, decimal(z, 2));
}

void addPixels(SampleObject& object, const Reconstruction& reconstruction, double depth)
{
    SamplePicture picture = chestSection(depth);
    picture.addNoise(object.random(), reconstruction.noise);
    if (!reconstruction.isSigned)
        return picture.addUnsigned(object.dataset(), kOffset, 12);
    picture.addSigned(object.dataset());
    // Whether the padding has a sign is for the pixels to say, so the representation is named.
    object.dataset().with(DcmTag(DCM_PixelPaddingValue, EVR_SS), -2000);
}

void writeSlice(const SampleSeries& series, const SampleSeries& scout, const Reconstruction& reconstruction,
                int instance, SampleFolder& folder)
{
    const double depth = (instance - 1) * reconstruction.thickness;
    // Four rows of detectors record at once.
    const int turn = (instance - 1) / 4;
    const double second = turn * 0.25;
    SampleObject object(series, instance, second);
    SampleDataset& dataset = object.dataset();
    dataset.withAll(kScanner).withAll(kSpiral).withPrivate(0x0019, "SAMPLE CT ACQ 1.0", kAcquisition);
    dataset.with(DCM_AcquisitionTime, series.study.time(series.delay + second));
    series.study.describeRequest(dataset);
    // Only some slices were corrected, so that the sequence is not the same in all of them.
    if (instance % 7 == 0)
        series.study.describeCorrection(dataset);
    // The same reference in every slice: something that is stored once for the whole series.
    scout.refer(dataset, DCM_ReferencedImageSequence, 1);
    describeReconstruction(dataset, reconstruction);
    describeExposure(object, instance, depth);
    describePlace(dataset, series.study, depth);
    addPixels(object, reconstruction, depth);
    object.saveTo(folder);
}

void writeScout(const SampleSeries& series, SampleFolder& folder)
{
    SampleObject object(series, 1, 0);
    SampleDataset& dataset = object.dataset();
    dataset.withAll(kScanner).withAll(kScout).withPrivate(0x0019, "SAMPLE CT ACQ 1.0", kAcquisition);
    dataset.with(DCM_FrameOfReferenceUID, series.study.uid("frame of reference"));
    series.study.describeRequest(dataset);
    chestScout().addNoise(object.random(), 30).addUnsigned(dataset, kOffset, 12);
    object.saveTo(folder);
}

}  // namespace

void writeCtStudy(const SampleStudy& study, SampleFolder& folder)
{
    const SampleSeries scout = {study, 1, "CT", UID_CTImageStorage, "Scout", 20};
    const SampleSeries soft = {
        study, 2, "CT", UID_CTImageStorage, "Chest 1.5 soft", 95, SampleEncoding::ExplicitWithLengths};
    const SampleSeries lung = {study, 3, "CT", UID_CTImageStorage, "Chest 3.0 lung", 95};
    // What is left is shared two to one, because lung slices are twice as thick.
    const int slices = study.images - 3;  // the scout and the two documents
    const int lungSlices = slices / 3;

    writeScout(scout, folder);
    for (int instance = 1; instance <= slices - lungSlices; ++instance)
        writeSlice(soft, scout, kSoftTissue, instance, folder);
    for (int instance = 1; instance <= lungSlices; ++instance)
        writeSlice(lung, scout, kLung, instance, folder);
    writePresentationState(scout, soft, folder);
    writeReport(soft, folder);
}

}  // namespace Kdd
