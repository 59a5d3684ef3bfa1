#include "sample/Documents.h"
#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

namespace Kdd
{

namespace
{

const SampleAttribute kState[] = {
    {DCM_Manufacturer, "Sample Imaging"},
    {DCM_StationName, "WS02"},
    {DCM_SoftwareVersions, "4.1"},
    {DCM_ContentLabel, "FINDINGS"},
    {DCM_ContentDescription, "Marked for the conference"},
    {DCM_ContentCreatorName, "Reader^First"},
    {DCM_RescaleIntercept, "-1024"},
    {DCM_RescaleSlope, "1"},
    {DCM_RescaleType, "HU"},
    {DCM_PresentationLUTShape, "IDENTITY"},
    {DCM_ImageRotation, "0"},
    {DCM_ImageHorizontalFlip, "N"},
};

const SampleAttribute kLayer[] = {
    {DCM_GraphicLayer, "MARKS"},
    {DCM_GraphicLayerOrder, "1"},
    {DCM_GraphicLayerRecommendedDisplayGrayscaleValue, "65535"},
    {DCM_GraphicLayerRecommendedDisplayCIELabValue, "65535\\32896\\32896"},
};

const SampleAttribute kText[] = {
    {DCM_BoundingBoxAnnotationUnits, "PIXEL"},
    {DCM_AnchorPointAnnotationUnits, "PIXEL"},
    {DCM_BoundingBoxTopLeftHandCorner, "40\\4"},
    {DCM_BoundingBoxBottomRightHandCorner, "62\\10"},
    {DCM_AnchorPoint, "44.5\\22.25"},
    {DCM_AnchorPointVisibility, "Y"},
    {DCM_BoundingBoxTextHorizontalJustification, "LEFT"},
};

// A closed line: its last point is its first. Reals that floats hold exactly.
const SampleAttribute kPolyline[] = {
    {DCM_GraphicAnnotationUnits, "PIXEL"}, {DCM_GraphicDimensions, "2"},
    {DCM_NumberOfGraphicPoints, "4"},      {DCM_GraphicData, "36\\24\\44.5\\22.25\\43.75\\31\\36\\24"},
    {DCM_GraphicType, "POLYLINE"},         {DCM_GraphicFilled, "N"},
};

const SampleAttribute kArea[] = {
    {DCM_DisplayedAreaTopLeftHandCorner, "1\\1"},
    {DCM_DisplayedAreaBottomRightHandCorner, "64\\64"},
    {DCM_PresentationSizeMode, "SCALE TO FIT"},
    {DCM_PresentationPixelAspectRatio, "1\\1"},
};

const SampleAttribute kWindow[] = {
    {DCM_WindowCenter, "30"},
    {DCM_WindowWidth, "320"},
};

void annotate(SampleDataset& dataset, const SampleSeries& series, int instance, const char* text)
{
    SampleDataset annotation = dataset.item(DCM_GraphicAnnotationSequence);
    series.refer(annotation, DCM_ReferencedImageSequence, instance);
    // By the name of the layer above.
    annotation.with(DCM_GraphicLayer, "MARKS");
    annotation.item(DCM_TextObjectSequence).withAll(kText).with(DCM_UnformattedTextValue, text);
    annotation.item(DCM_GraphicObjectSequence).withAll(kPolyline);
}

}  // namespace

void writePresentationState(const SampleSeries& scout, const SampleSeries& slices, SampleFolder& folder)
{
    const SampleSeries series = {slices.study, 900, "PR", UID_GrayscaleSoftcopyPresentationStateStorage,
                                 "Marks",      1800};
    SampleObject object(series, 1, 12);
    SampleDataset& dataset = object.dataset();
    dataset.withAll(kState)
        .with(DCM_PresentationCreationDate, kSampleDate)
        .with(DCM_PresentationCreationTime, series.study.time(series.delay + 12));
    scout.referWithSeries(dataset, DCM_ReferencedSeriesSequence, {1});
    slices.referWithSeries(dataset, DCM_ReferencedSeriesSequence, {1, 3});
    dataset.item(DCM_GraphicLayerSequence).withAll(kLayer);
    annotate(dataset, slices, 1, "Compare with the last study");
    annotate(dataset, slices, 3, "Nodule, 4 mm");
    annotate(dataset, scout, 1, "Level of the nodule");
    dataset.item(DCM_DisplayedAreaSelectionSequence).withAll(kArea);
    dataset.item(DCM_SoftcopyVOILUTSequence).withAll(kWindow);
    object.saveTo(folder);
}

}  // namespace Kdd
