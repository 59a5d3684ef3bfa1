#include "kddlib/volumes/StackPlanner.h"

#include "core/volumes/StackFixture.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <tuple>

using namespace Kdd;

namespace
{

/// "every 2: 1 2 3; without 4;": distance and slices of each stack; frames of multi-frame images as "1.0".
std::string planText(const StackPlan& plan)
{
    QByteArray text;
    for (const Stack& stack : plan.stacks) {
        text += "every " + QByteArray::number(stack.sliceSpacing, 'g', 3) + ':';
        for (const StackFrame& slice : stack.slices)
            text += ' ' + slice.imageUID +
                    (slice.isMultiFrame ? '.' + QByteArray::number(slice.frame) : QByteArray());
        text += "; ";
    }
    for (const LeftOutFrame& image : plan.leftOut)
        text += "without " + image.imageUID + "; ";
    return text.toStdString();
}

DatasetBuilder sagittal(int number, double x)
{
    return aSlice(number, 0, 0, x).with(DCM_ImageOrientationPatient, "0\\1\\0\\0\\0\\-1");
}

/// Turned by 30 degrees about the left-right axis, `along` the normal and `down` the columns [mm].
DatasetBuilder oblique(int number, double along, double down = 0)
{
    const double c = std::sqrt(0.75);
    return aSlice(number, c * along + down / 2, -along / 2 + c * down)
        .with(DCM_ImageOrientationPatient, "1\\0\\0\\0\\0.8660254\\0.5");
}

/// Every plane at two times with two echoes each, which come in another order in the middle plane.
Images echoesAndTimes()
{
    Images images = atZ({0, 0, 1, 1, 2, 2, 0, 0, 1, 1, 2, 2});
    for (std::size_t i = 0; i < 12; ++i) {
        images[i].with(DCM_TemporalPositionIdentifier, i < 6 ? "1" : "2");
        images[i].with(DCM_EchoTime, i % 6 == 1 || i % 6 == 2 || i % 6 == 5 ? "9" : "2");
    }
    return images;
}

TEST(StackPlanner, FindsTheStacksOfASeriesAndTheirPlace)
{
    const std::tuple<const char*, Images, const char*> rows[] = {
        {"Shuffled", {aSlice(2, 1), aSlice(3, 0.5), aSlice(1, 1.5)}, "every 0.5: 3 2 1; "},
        {"Tilted", {oblique(1, 0), oblique(2, 4, 2), oblique(3, 8, 4)}, "every 4: 1 2 3; "},
        {"TwoOrientations", atZ({0, 1, 2}, {sagittal(4, 9), sagittal(5, 8), sagittal(6, 7)}),
         "every 1: 1 2 3; every 1: 4 5 6; "},
        {"MixedSizes", atZ({0, 1, 2}, {aSlice(4, 3).with(DCM_Rows, "2")}), "every 1: 1 2 3; without 4; "},
        {"Gap", atZ({0, 1, 2, 4, 5, 6, 9}), "every 1: 1 2 3; every 1: 4 5 6; without 7; "},
        {"GapAfterTheFirst", atZ({0, 3, 4, 5}), "every 1: 2 3 4; without 1; "},
        {"RoundedPositions", atZ({0, 1.2, 2.5, 3.7, 5}), "every 1.25: 1 2 3 4 5; "},
        {"ThinWithGap", atZ({0, 0.1, 0.2, 0.4}), "every 0.1: 1 2 3; without 4; "},
        {"Drifting", atZ({0, 1, 2.09, 3.23, 4.41}),
         "without 1; without 2; without 3; without 4; without 5; "},
        {"Duplicate", atZ({0, 1, 2, 1}), "every 1: 1 2 3; without 4; "},
        {"EchoesAndTimes", echoesAndTimes(),
         "every 1: 1 4 5; every 1: 2 3 6; every 1: 7 10 11; every 1: 8 9 12; "},
        {"OnlyTheOrderTells", atZ({0, 0, 1, 1, 2, 2}), "every 1: 1 3 5; every 1: 2 4 6; "},
        {"Enhanced", {enhanced()}, "every 1: 1.4 1.2 1.0; every 1: 1.5 1.3 1.1; "},
        {"Empty", {anImage("9")}, "without 9; "},
    };
    for (const auto& [name, images, expected] : rows) {
        const StackSeries series(images);
        const StackPlan plan = series.plans().front();
        EXPECT_EQ(planText(plan), expected) << name;
        for (const Stack& stack : plan.stacks)
            EXPECT_LT(farthestOff(stack), 0.11) << name;
    }
}

TEST(StackPlanner, PlacesEveryVoxelAndBoxesTheirCentres)
{
    const StackSeries series({oblique(1, 0), oblique(2, 4, 2), oblique(3, 8, 4)});
    const Stack stack = series.plans().front().stacks.first();
    const Vec3d last = patientPoint(stack.transformation, 3, 2, 2);
    // Three columns of 0.5 mm, and two slanted rows of 0.25 mm below the third slice.
    EXPECT_NEAR(last.x, 1.5, 1e-5);
    EXPECT_NEAR(last.y, -4 + std::sqrt(0.75) * 4.5, 1e-5);
    EXPECT_NEAR(last.z, std::sqrt(0.75) * 8 + 2.25, 1e-5);
    EXPECT_NEAR(stack.boundingBox.ymin, -4 + std::sqrt(0.75) * 4, 1e-5);
    EXPECT_NEAR(stack.boundingBox.zmax, last.z, 1e-5);
}

TEST(StackPlanner, SaysWhyAnImageIsLeftOut)
{
    // Without a value: without the attribute.
    const std::tuple<DcmTagKey, const char*, const char*> refusals[] = {
        {DCM_ImagePositionPatient, nullptr, "Image Position (Patient) is missing"},
        {DCM_ImagePositionPatient, "1\\2\\1e9", "1e9"},
        {DCM_ImageOrientationPatient, "1\\0\\0\\1\\0\\0", "no right-angled directions"},
        {DCM_ImageOrientationPatient, "0\\0\\0\\0\\0\\0", "no right-angled directions"},
        {DCM_PixelSpacing, "0\\1", "Pixel Spacing is \"0\\1\""},
        {DCM_RescaleSlope, "0", "Rescale Slope is \"0\""},
        {DCM_RescaleIntercept, "1e99", "Rescale Intercept is \"1e99\""},
        {DCM_PhotometricInterpretation, "RGB", "Photometric Interpretation is \"RGB\""},
        {DCM_BitsStored, "32", "Bits Stored is \"32\""},
        {DCM_PixelData, nullptr, "Pixel Data is missing"},
        {DCM_Modality, "SEG", "Modality is"},
        {DCM_ImageType, "ORIGINAL\\PRIMARY\\LOCALIZER", "LOCALIZER"},
        {DCM_ImageType, "ORIGINAL\\PRIMARY\\M\\MOSAIC", "MOSAIC"},
        {DCM_NumberOfFrames, "2000000000", "2000000000"},
    };
    for (const auto& [key, value, reason] : refusals) {
        DatasetBuilder odd = aSlice(4, 3);
        value != nullptr ? odd.with(key, value) : odd.without(key);
        const StackSeries series(atZ({0, 1, 2}, {odd}));
        const StackPlan plan = series.plans().front();
        ASSERT_EQ(planText(plan), "every 1: 1 2 3; without 4; ") << reason;
        EXPECT_THAT(plan.leftOut.first().reason.toStdString(), testing::HasSubstr(reason));
    }
}

TEST(StackPlanner, SlicesOfDifferentFramesOfReferenceAreStackedOnRequest)
{
    Images images = atZ({0, 1, 2, 3, 4, 5});
    for (std::size_t i = 0; i < 6; ++i)
        images[i].with(DCM_FrameOfReferenceUID, i < 3 ? "1.9" : i < 4 ? "1.8" : "1.7");
    const StackSeries series(images);
    const StackPlan plan = series.plans().front();
    EXPECT_EQ(planText(plan), "every 1: 1 2 3; without 4; without 5; without 6; ");
    for (const LeftOutFrame& left : plan.leftOut)
        EXPECT_THAT(left.reason.toStdString(), testing::HasSubstr("Frame of Reference"));
    EXPECT_EQ(planText(series.plans(FrameOfReference::Ignored).front()), "every 1: 1 2 3 4 5 6; ");
}

}  // namespace
