#include "sample/Kinds.h"
#include "sample/Picture.h"
#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

#include <iterator>

namespace Kdd
{

namespace
{

constexpr int kColumns = 72;
constexpr int kRows = 96;

const SampleAttribute kMachine[] = {
    // Each view puts its own side in the last value.
    {DCM_ImageType, "DERIVED\\PRIMARY\\\\RIGHT"},
    {DCM_Manufacturer, "Sample Imaging"},
    {DCM_ManufacturerModelName, "Sample MG"},
    {DCM_StationName, "MG01"},
    {DCM_DeviceSerialNumber, "7719"},
    {DCM_SoftwareVersions, "1.4.2"},
    {DCM_BodyPartExamined, "BREAST"},
    {DCM_PresentationIntentType, "FOR PRESENTATION"},
    {DCM_PhotometricInterpretation, "MONOCHROME2"},
    {DCM_BurnedInAnnotation, "NO"},
    {DCM_LossyImageCompression, "00"},
    {DCM_KVP, "29"},
    {DCM_AnodeTargetMaterial, "MOLYBDENUM"},
    {DCM_FilterMaterial, "RHODIUM"},
    {DCM_FilterThicknessMinimum, "0.025"},
    {DCM_FocalSpots, "0.3"},
    {DCM_DistanceSourceToDetector, "660"},
    {DCM_DistanceSourceToPatient, "640"},
    {DCM_EstimatedRadiographicMagnificationFactor, "1"},
    {DCM_ExposureTime, "742"},
    {DCM_ExposureControlMode, "AUTOMATIC"},
    {DCM_Grid, "RECIPROCATING\\FOCUSED"},
    {DCM_DetectorType, "DIRECT"},
    {DCM_DetectorConfiguration, "AREA"},
    {DCM_DetectorID, "DET-07"},
    {DCM_DateOfLastDetectorCalibration, "20240510"},
    {DCM_DetectorTemperature, "29.6"},
    {DCM_FieldOfViewShape, "RECTANGLE"},
    {DCM_FieldOfViewDimensions, "240\\180"},
    {DCM_ImagerPixelSpacing, "2.5\\2.5"},
    {DCM_PixelIntensityRelationship, "LOG"},
    {DCM_PixelIntensityRelationshipSign, "-1"},
    {DCM_RescaleIntercept, "0"},
    {DCM_RescaleSlope, "1"},
    {DCM_RescaleType, "US"},
    {DCM_PresentationLUTShape, "IDENTITY"},
    {DCM_WindowCenter, "2100"},
    {DCM_WindowWidth, "3900"},
    {DCM_WindowCenterWidthExplanation, "NORMAL"},
    {DCM_VOILUTFunction, "SIGMOID"},
    {DCM_BreastImplantPresent, "NO"},
    {DCM_PartialView, "NO"},
    {DCM_QualityControlImage, "NO"},
};

const SamplePrivate kExposure[] = {
    {0x01, EVR_LO, "AEC\\FULL\\ODD"},
    {0x02, EVR_US, "3"},
    {0x03, EVR_SH, ""},
};

const SampleCode kBreast = {"T-04000", "SRT", "Breast"};
const SampleCode kCranioCaudal = {"R-10242", "SRT", "cranio-caudal"};
const SampleCode kMedioLateralOblique = {"R-10226", "SRT", "medio-lateral oblique"};

/// A view of one breast; the chest wall is at the right edge of a right breast, at the left edge of a left
/// one.
struct View
{
    const char* side;
    const char* position;
    const char* patientOrientation;
    const SampleCode& code;
    int angle;  // of the arm [degrees]
};

const View kViews[] = {
    {"R", "CC", "P\\L", kCranioCaudal, 0},
    {"L", "CC", "A\\R", kCranioCaudal, 0},
    {"R", "MLO", "P\\F", kMedioLateralOblique, 45},
    {"L", "MLO", "A\\F", kMedioLateralOblique, -45},
};

// Painted as a left breast, mirrored by `side` for a right one: 1 or -1.
SamplePicture breast(double side, bool isOblique)
{
    const double down = isOblique ? 0.22 : 0;
    SamplePicture picture(kColumns, kRows, 60);
    picture.paint({-1.0 * side, down, 1.55, 1.00, 900})
        .paint({-0.95 * side, down, 1.40, 0.88, 1250})
        .paint({-0.35 * side, down - 0.05, 0.62, 0.52, 1900})
        .paint({-0.15 * side, down + 0.10, 0.35, 0.20, 2450})
        .paint({-0.30 * side, down - 0.28, 0.30, 0.14, 2300})
        .paint({0.15 * side, down - 0.10, 0.07, 0.06, 3300})
        .paint({0.56 * side, down, 0.05, 0.06, 2200});
    // The oblique view also shows the muscle of the chest.
    if (isOblique)
        picture.paint({-1.15 * side, -1.05, 0.75, 1.25, 2900});
    return picture;
}

void describeView(SampleDataset& dataset, const View& view)
{
    dataset.withAll(kMachine)
        .with(DCM_ImageType, view.side[0] == 'R' ? "DERIVED\\PRIMARY\\\\RIGHT" : "DERIVED\\PRIMARY\\\\LEFT")
        .with(DCM_Laterality, view.side)
        .with(DCM_ImageLaterality, view.side)
        .with(DCM_ViewPosition, view.position)
        .with(DCM_PatientOrientation, view.patientOrientation)
        .with(DCM_PositionerType, "MAMMOGRAPHIC")
        .with(DCM_PositionerPrimaryAngle, view.angle)
        .withCode(DCM_AnatomicRegionSequence, kBreast)
        .withCode(DCM_ViewCodeSequence, view.code)
        .withPrivate(0x0019, "SAMPLE MG EXPOSURE", kExposure);
    // An item without anything in it, which has to be kept as well.
    dataset.item(DCM_AcquisitionContextSequence);
}

void describeExposure(SampleObject& object)
{
    SampleRandom& random = object.random();
    object.dataset()
        .with(DCM_BodyPartThickness, random.between(38, 66))
        .with(DCM_CompressionForce, random.between(80, 140))
        .with(DCM_XRayTubeCurrent, random.between(95, 105))
        .with(DCM_Exposure, random.between(60, 90))
        .with(DCM_OrganDose, decimal(random.between(110, 190) / 10000.0, 5))
        .with(DCM_EntranceDoseInmGy, decimal(random.between(500, 800) / 100.0, 2));
}

void writeView(const SampleStudy& study, int number, SampleFolder& folder)
{
    const View& view = kViews[number - 1];
    // Outlives the series, which keeps the pointer alone.
    const QByteArray description = QByteArray(view.side) + view.position;
    const SampleSeries series = {study,
                                 number,
                                 "MG",
                                 UID_DigitalMammographyXRayImageStorageForPresentation,
                                 description.constData(),
                                 40 * number};
    SampleObject object(series, 1, 5);
    describeView(object.dataset(), view);
    describeExposure(object);
    study.describeRequest(object.dataset());
    breast(view.side[0] == 'R' ? -1 : 1, view.angle != 0)
        .addNoise(object.random(), 70)
        .addUnsigned(object.dataset(), 0, 12);
    object.saveTo(folder);
}

}  // namespace

void writeMammogramStudy(const SampleStudy& study, SampleFolder& folder)
{
    for (int number = 1; number <= static_cast<int>(std::size(kViews)); ++number)
        writeView(study, number, folder);
}

}  // namespace Kdd
