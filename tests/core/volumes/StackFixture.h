#pragma once

#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/StackPlanner.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"

#include <QFile>

#include <list>
#include <string>
#include <vector>

namespace Kdd
{

/// An axial image of 4 x 3 pixels of 16 bits, half a millimetre wide and 0.25 mm high, at (x, y, z) [mm].
inline DatasetBuilder aSlice(int number, double z, double y = 0, double x = 0)
{
    const std::string position = QString::asprintf("%g\\%g\\%g", x, y, z).toStdString();
    const std::string text = std::to_string(number);
    DatasetBuilder slice = anImage(text.c_str());
    slice.with(DCM_InstanceNumber, text.c_str()).with(DCM_ImagePositionPatient, position.c_str());
    slice.with(DCM_ImageOrientationPatient, "1\\0\\0\\0\\1\\0").with(DCM_PixelSpacing, "0.25\\0.5");
    slice.with(DCM_Columns, "4").with(DCM_Rows, "3").with(DCM_PhotometricInterpretation, "MONOCHROME2");
    slice.with(DCM_SamplesPerPixel, "1").with(DCM_BitsAllocated, "16").with(DCM_BitsStored, "16");
    slice.with(DCM_HighBit, "15").with(DCM_PixelRepresentation, "0");
    const Uint16 pixels[12] = {0, 1, 2, 3, 1000, 2000, 3000, 4000, 4095, 5, 6, 7};
    slice.dataset().putAndInsertUint16Array(DCM_PixelData, pixels, 12);
    return slice;
}

using Images = std::vector<DatasetBuilder>;

inline Vec3d patientPoint(const Mat4f& matrix, double column, double row, double slice)
{
    const auto along = [&](std::size_t i) {
        const std::array<float, 16>& m = matrix.m;
        return double(m[i]) * column + double(m[i + 1]) * row + double(m[i + 2]) * slice + double(m[i + 3]);
    };
    return {along(0), along(4), along(8)};
}

/// Where the matrix puts the slices farthest from where their images say they are [mm].
inline double farthestOff(const Stack& stack)
{
    double most = 0;
    for (int i = 0; i < stack.slices.size(); ++i)
        most = qMax(most, length(patientPoint(stack.transformation, 0, 0, i) - stack.slices.at(i).position));
    return most;
}

/// Slices numbered from 1, and others.
inline Images atZ(const std::vector<double>& positions, const Images& others = {})
{
    Images images;
    for (const double z : positions)
        images.push_back(aSlice(int(images.size()) + 1, z));
    images.insert(images.end(), others.begin(), others.end());
    return images;
}

/// Image 1: two frames of different type in each of three planes, the highest first; a frame's pixels are its number.
inline DatasetBuilder enhanced()
{
    DatasetBuilder image = aSlice(1, 0).with(DCM_NumberOfFrames, "6").without(DCM_ImagePositionPatient);
    Uint16 pixels[72];
    for (int i = 0; i < 72; ++i)
        pixels[i] = static_cast<Uint16>(i / 12);
    image.dataset().putAndInsertUint16Array(DCM_PixelData, pixels, 72);
    const DatasetBuilder spacing = anItem().with(DCM_PixelSpacing, "1\\1");
    image.without(DCM_PixelSpacing)
        .withItem(DCM_SharedFunctionalGroupsSequence, anItem().withItem(DCM_PixelMeasuresSequence, spacing));
    for (int i = 0; i < 6; ++i) {
        const std::string position = "0\\0\\" + std::to_string(9 - i / 2);
        const DatasetBuilder plane = anItem().with(DCM_ImagePositionPatient, position.c_str());
        const DatasetBuilder type = anItem().with(DCM_FrameType, i % 2 == 0 ? "ORIGINAL" : "DERIVED");
        image.withItem(
            DCM_PerFrameFunctionalGroupsSequence,
            anItem().withItem(DCM_PlanePositionSequence, plane).withItem(DCM_MRImageFrameTypeSequence, type));
    }
    return image;
}

/// Images in tag files, one for each study.
class StackSeries
{
public:
    explicit StackSeries(const Images& images)
    {
        for (const DatasetBuilder& image : images)
            mStudies.back().addTagMap(image.map(), nullptr, false);
    }

    /// Images that know their paths.
    explicit StackSeries(const QStringList& files)
    {
        for (const QString& path : files)
            addFile(QFile::encodeName(path));
    }

    /// One for each series.
    std::vector<StackPlan> plans(FrameOfReference reference = FrameOfReference::Shared) const
    {
        std::vector<StackPlan> plans;
        for (const TagFile& study : mStudies) {
            for (const TagMap* series : study.seriesByUID())
                plans.push_back(planStacks(*series, reference));
        }
        return plans;
    }

private:
    void addFile(const QByteArray& path)
    {
        const LogCapture refusal;  // of an image of another study
        TagMap* image = mStudies.back().addDicomFile(path.constData(), nullptr, false);
        if (image == nullptr)
            image = mStudies.emplace_back().addDicomFile(path.constData(), nullptr, false);
        if (image != nullptr)
            image->putAndInsertValue(kFilePath, VrCode::LO, path);
    }

    std::list<TagFile> mStudies = std::list<TagFile>(1);
};

}  // namespace Kdd
