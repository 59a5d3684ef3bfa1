#include "sample/Kinds.h"
#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

namespace Kdd
{

namespace
{

// Also in the table below, which knows texts only.
constexpr int kColumns = 96;
constexpr int kRows = 128;
constexpr int kLineHeight = 6;  // [pixels]
constexpr int kMargin = 8;      // [pixels]

const SampleAttribute kScan[] = {
    {DCM_ImageType, "DERIVED\\SECONDARY"},
    {DCM_ConversionType, "SD"},
    {DCM_SecondaryCaptureDeviceID, "DESK-2"},
    {DCM_SecondaryCaptureDeviceManufacturer, "Sample Office"},
    {DCM_SecondaryCaptureDeviceManufacturerModelName, "Flatbed"},
    {DCM_SecondaryCaptureDeviceSoftwareVersions, "7"},
    {DCM_DateOfSecondaryCapture, "20240517"},
    {DCM_Laterality, ""},
    {DCM_PatientOrientation, ""},
    {DCM_BurnedInAnnotation, "YES"},
    {DCM_SamplesPerPixel, "1"},
    {DCM_PhotometricInterpretation, "MONOCHROME2"},
    {DCM_Rows, "128"},
    {DCM_Columns, "96"},
    {DCM_PixelAspectRatio, "1\\1"},
    {DCM_BitsAllocated, "8"},
    {DCM_BitsStored, "8"},
    {DCM_HighBit, "7"},
    {DCM_PixelRepresentation, "0"},
};

void writeWord(QByteArray& page, int row, int from, int to)
{
    for (int y = row; y < row + 3; ++y) {
        for (int x = from; x < to; ++x)
            page[y * kColumns + x] = static_cast<char>(40);
    }
}

// Bars of grey on white: lines of writing too small to read.
QByteArray requestForm(SampleRandom& random)
{
    QByteArray page(kRows * kColumns, static_cast<char>(245));
    for (int row = kMargin; row < kRows - kMargin; row += kLineHeight) {
        int from = kMargin;
        for (int to = from + random.between(4, 16); to < kColumns - kMargin;
             to = from + random.between(4, 16)) {
            writeWord(page, row, from, to);
            from = to + 2;
        }
    }
    return page;
}

}  // namespace

void writeCaptureStudy(const SampleStudy& study, SampleFolder& folder)
{
    // The old way of writing: implicit, with lengths of sequences and groups.
    const SampleSeries series = {study,
                                 1,
                                 "OT",
                                 UID_SecondaryCaptureImageStorage,
                                 "Request form",
                                 5,
                                 SampleEncoding::ImplicitWithLengths};
    SampleObject object(series, 1, 3);
    object.dataset()
        .withAll(kScan)
        .with(DCM_TimeOfSecondaryCapture, study.time(8))
        .withBytes(DcmTag(DCM_PixelData, EVR_OB), requestForm(object.random()));
    object.saveTo(folder);
}

}  // namespace Kdd
