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

/// Named by its number.
inline DatasetBuilder aSlice(int number, double z, double y = 0, double x = 0)
{
    return aSlice(QByteArray::number(number), number, z, y, x);
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
