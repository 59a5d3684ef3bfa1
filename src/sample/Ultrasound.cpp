#include "sample/Kinds.h"
#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

#include <algorithm>

namespace Kdd
{

namespace
{

// These three also stand in the tables below, which know texts only.
constexpr int kColumns = 64;
constexpr int kRows = 48;
constexpr int kFrames = 4;
constexpr int kDeepest = 46;  // [pixels] reach of the beam below the top

const SampleAttribute kMachine[] = {
    {DCM_ImageType, "ORIGINAL\\PRIMARY\\ABDOMINAL\\0001"},
    {DCM_Manufacturer, "Sample Imaging"},
    {DCM_ManufacturerModelName, "Sample US"},
    {DCM_StationName, "US01"},
    {DCM_SoftwareVersions, "5.5.1"},
    {DCM_TransducerData, "C5-1\\GEN"},
    {DCM_TransducerType, "CURVED LINEAR"},
    {DCM_ProcessingFunction, "ABD_GENERAL"},
    {DCM_HeartRate, "71"},
    {DCM_MechanicalIndex, "1.1"},
    {DCM_BoneThermalIndex, "0.4"},
    {DCM_SoftTissueThermalIndex, "0.3"},
    {DCM_DepthOfScanField, "160"},
    {DCM_PatientOrientation, ""},
    {DCM_BurnedInAnnotation, "NO"},
    {DCM_LossyImageCompression, "00"},
    // The increments stand in the attribute that is pointed to, one for each frame.
    {DCM_FrameIncrementPointer, "(0018,1065)"},
    {DCM_FrameTimeVector, "0\\33.3\\33.3\\33.4"},
    {DCM_CineRate, "30"},
    {DCM_EffectiveDuration, "0.1"},
    {DCM_PreferredPlaybackSequencing, "0"},
    {DCM_StartTrim, "1"},
    {DCM_StopTrim, "4"},
    {DCM_SamplesPerPixel, "3"},
    {DCM_PhotometricInterpretation, "RGB"},
    {DCM_PlanarConfiguration, "0"},
    {DCM_NumberOfFrames, "4"},
    {DCM_Rows, "48"},
    {DCM_Columns, "64"},
    {DCM_BitsAllocated, "8"},
    {DCM_BitsStored, "8"},
    {DCM_HighBit, "7"},
    {DCM_PixelRepresentation, "0"},
    {DCM_UltrasoundColorDataPresent, "1"},
};

const SampleAttribute kRegion[] = {
    {DCM_RegionSpatialFormat, "1"},
    {DCM_RegionDataType, "1"},
    {DCM_RegionFlags, "3"},
    {DCM_RegionLocationMinX0, "0"},
    {DCM_RegionLocationMinY0, "0"},
    {DCM_RegionLocationMaxX1, "63"},
    {DCM_RegionLocationMaxY1, "47"},
    {DCM_ReferencePixelX0, "32"},
    {DCM_ReferencePixelY0, "-2"},
    {DCM_PhysicalUnitsXDirection, "3"},
    {DCM_PhysicalUnitsYDirection, "3"},
    {DCM_ReferencePixelPhysicalValueX, "0"},
    {DCM_ReferencePixelPhysicalValueY, "0"},
    {DCM_PhysicalDeltaX, "0.333333"},
    {DCM_PhysicalDeltaY, "0.333333"},
    {DCM_TransducerFrequency, "3500"},
};

enum class Flow { Hidden, Coloured };

struct Colour
{
    int red;
    int green;
    int blue;
};

bool isWithin(int x, int y, int centreX, int centreY, int radius)
{
    return (x - centreX) * (x - centreX) + (y - centreY) * (y - centreY) <= radius * radius;
}

// What the beam meets `x` pixels beside the middle and `y` below the top; it fades with the depth.
Colour echo(int x, int y, int frame, Flow flow, SampleRandom& random)
{
    // Counted from the tip of the beam, which lies above the picture.
    const int squared = x * x + (y + 6) * (y + 6);
    if (5 * std::abs(x) > 4 * (y + 6) || squared > (kDeepest + 6) * (kDeepest + 6) || squared < 64)
        return {0, 0, 0};
    // The vessel moves from frame to frame, and its flow turns.
    if (flow == Flow::Coloured && isWithin(x, y, 9 + frame, 26, 4))
        return frame % 2 == 0 ? Colour{210, 40 + 10 * frame, 20} : Colour{30, 60, 220};
    int grey = 150 - 2 * y + random.between(-45, 45);
    if (isWithin(x, y, -8, 22 + frame, 7))  // a cyst that moves with the breath
        grey /= 8;
    grey = std::clamp(grey, 0, 255);
    return {grey, grey, grey};
}

QByteArray clip(Flow flow, SampleRandom& random)
{
    QByteArray pixels;
    // Red, green and blue of each pixel side by side, frame after frame.
    pixels.reserve(kFrames * kRows * kColumns * 3);
    for (int frame = 0; frame < kFrames; ++frame) {
        for (int y = 0; y < kRows; ++y) {
            for (int column = 0; column < kColumns; ++column) {
                const Colour colour = echo(column - kColumns / 2, y, frame, flow, random);
                for (const int part : {colour.red, colour.green, colour.blue})
                    pixels.append(static_cast<char>(part));
            }
        }
    }
    return pixels;
}

void writeClip(const SampleSeries& series, int instance, Flow flow, SampleFolder& folder)
{
    SampleObject object(series, instance, instance * 21);
    SampleDataset& dataset = object.dataset();
    dataset.withAll(kMachine)
        .with(DCM_AcquisitionDateTime,
              QByteArray(kSampleDate) + series.study.time(series.delay + instance * 21))
        .with(DCM_StageName, flow == Flow::Hidden ? "Grey" : "Flow")
        // In place of what the table says, because the grey clip has none.
        .with(DCM_UltrasoundColorDataPresent, flow == Flow::Hidden ? 0 : 1);
    dataset.item(DCM_SequenceOfUltrasoundRegions).withAll(kRegion);
    dataset.withBytes(DcmTag(DCM_PixelData, EVR_OB), clip(flow, object.random()));
    object.saveTo(folder);
}

}  // namespace

void writeUltrasoundStudy(const SampleStudy& study, SampleFolder& folder)
{
    const SampleSeries series = {study, 1, "US", UID_UltrasoundMultiframeImageStorage, "Abdomen", 60};
    writeClip(series, 1, Flow::Hidden, folder);
    writeClip(series, 2, Flow::Coloured, folder);
}

}  // namespace Kdd
