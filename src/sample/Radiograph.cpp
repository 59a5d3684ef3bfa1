#include "sample/Kinds.h"
#include "sample/Picture.h"
#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

namespace Kdd
{

namespace
{

constexpr int kColumns = 80;
constexpr int kRows = 96;
// One for each value of twelve bits.
constexpr int kLutEntries = 4096;

const SampleAttribute kMachine[] = {
    {DCM_ImageType, "DERIVED\\PRIMARY"},
    {DCM_Manufacturer, "Sample Imaging"},
    {DCM_ManufacturerModelName, "Sample DX Wall"},
    {DCM_StationName, "DX01"},
    {DCM_DeviceSerialNumber, "00421"},
    {DCM_SoftwareVersions, "2.0"},
    {DCM_BodyPartExamined, "CHEST"},
    {DCM_PresentationIntentType, "FOR PRESENTATION"},
    // High values are shown dark, as much radiation is on film.
    {DCM_PhotometricInterpretation, "MONOCHROME1"},
    {DCM_BurnedInAnnotation, "NO"},
    {DCM_LossyImageCompression, "00"},
    {DCM_KVP, "125"},
    {DCM_DistanceSourceToDetector, "1800"},
    {DCM_ExposureTime, "8"},
    {DCM_Grid, "FIXED"},
    {DCM_DetectorType, "SCINTILLATOR"},
    {DCM_DetectorID, "WALL-1"},
    {DCM_DetectorActiveShape, "RECTANGLE"},
    {DCM_ImagerPixelSpacing, "4.3\\4.3"},
    {DCM_PixelIntensityRelationship, "LOG"},
    {DCM_PixelIntensityRelationshipSign, "1"},
    {DCM_RescaleIntercept, "0"},
    {DCM_RescaleSlope, "1"},
    {DCM_RescaleType, "US"},
    {DCM_PresentationLUTShape, "INVERSE"},
    {DCM_ImageLaterality, "U"},
    {DCM_AcquisitionDeviceProcessingDescription, ""},
};

// High values are much radiation: the free beam, then the lungs.
const SampleEllipse kFromTheFront[] = {
    {0, 0.35, 0.86, 1.35, 1500},      {0, -1.05, 0.22, 0.40, 1500},    {-0.38, -0.02, 0.30, 0.72, 3100},
    {0.38, -0.02, 0.30, 0.72, 3100},  {0.12, 0.28, 0.30, 0.30, 1250},  {0, -0.10, 0.09, 1.30, 950},
    {-0.42, -0.72, 0.32, 0.04, 1700}, {0.42, -0.72, 0.32, 0.04, 1700}, {0, 1.00, 0.80, 0.32, 1000},
};

const SampleEllipse kFromTheSide[] = {
    {0, 0.30, 0.70, 1.35, 1400},     {-0.05, -1.05, 0.20, 0.40, 1500}, {0.02, -0.05, 0.45, 0.75, 2900},
    {-0.18, 0.32, 0.26, 0.26, 1300}, {0.55, 0.00, 0.09, 1.20, 900},    {0, 1.00, 0.64, 0.32, 1000},
};

// Rows, columns, description, type, origin, bits and position of the first overlay's plane.
const SampleAttribute kOverlay[] = {
    {DcmTagKey(0x6000, 0x0010), "16", EVR_US},    {DcmTagKey(0x6000, 0x0011), "16", EVR_US},
    {DcmTagKey(0x6000, 0x0022), "Side", EVR_LO},  {DcmTagKey(0x6000, 0x0040), "G", EVR_CS},
    {DcmTagKey(0x6000, 0x0050), "4\\62", EVR_SS}, {DcmTagKey(0x6000, 0x0100), "1", EVR_US},
    {DcmTagKey(0x6000, 0x0102), "0", EVR_US},
};

struct View
{
    const char* position;
    const char* patientOrientation;
};

// The letter L, the side marker of the film, as a bit for each pixel from the lowest bit on.
QVector<Uint16> sideMarker()
{
    QVector<Uint16> rows(16, 0);
    // The upright stroke; the foot of the letter follows.
    for (int row = 2; row < 12; ++row)
        rows[row] = 0x0018;
    rows[12] = rows[13] = 0x0FF8;
    return rows;
}

// A curve that is steep in the middle, as film is.
void addCurve(SampleDataset& dataset)
{
    QVector<Uint16> curve;
    for (int i = 0; i < kLutEntries; ++i) {
        const double x = i / (kLutEntries - 1.0);
        curve.append(static_cast<Uint16>(4095 * x * x * (3 - 2 * x)));
    }
    // The descriptor: number of entries, first value, bits of an entry.
    dataset.item(DCM_VOILUTSequence)
        .with(DcmTag(DCM_LUTDescriptor, EVR_US), QByteArray::number(kLutEntries) + "\\0\\12")
        .with(DCM_LUTExplanation, "Film")
        .withWords(DcmTag(DCM_LUTData, EVR_OW), curve);
}

void describeFilm(SampleObject& object, const SampleStudy& study, const View& view)
{
    SampleDataset& dataset = object.dataset();
    dataset.withAll(kMachine)
        .with(DCM_ViewPosition, view.position)
        .with(DCM_PatientOrientation, view.patientOrientation)
        .with(DCM_Exposure, object.random().between(2, 9))
        .with(DCM_DetectorTemperature, decimal(object.random().between(250, 330) / 10.0, 1))
        .with(DCM_AcquisitionDate, kSampleDate)
        .with(DCM_DerivationDescription, "Contrast raised");
    study.describeRequest(dataset);
    addCurve(dataset);
}

}  // namespace

void writeRadiographStudy(const SampleStudy& study, SampleFolder& folder)
{
    const SampleSeries series = {study,
                                 1,
                                 "DX",
                                 UID_DigitalXRayImageStorageForPresentation,
                                 "Chest",
                                 30,
                                 SampleEncoding::ExplicitWithLengths};
    SampleObject front(series, 1, 2);
    describeFilm(front, study, {"PA", "L\\F"});
    // Only the first of the two has an overlay, so it cannot be the study's.
    front.dataset().withAll(kOverlay).withWords(DcmTag(0x6000, 0x3000, EVR_OW), sideMarker());
    SamplePicture(kColumns, kRows, 3900)
        .paintAll(kFromTheFront)
        .addNoise(front.random(), 60)
        .addUnsigned(front.dataset(), 0, 12);
    front.saveTo(folder);

    SampleObject side(series, 2, 50);
    describeFilm(side, study, {"LL", "P\\F"});
    // The correction is told of one image only.
    study.describeCorrection(side.dataset());
    SamplePicture(kColumns, kRows, 3900)
        .paintAll(kFromTheSide)
        .addNoise(side.random(), 60)
        .addUnsigned(side.dataset(), 0, 12);
    side.saveTo(folder);
}

}  // namespace Kdd
