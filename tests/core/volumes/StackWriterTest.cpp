#include "kddlib/volumes/StackWriter.h"

#include "core/volumes/StackFixture.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/volume/PixelTypes.h"
#include "platform/volume/StoredFrame.h"
#include "platform/volumefile/OrlanMesh.h"

#include <QDir>
#include <QTemporaryDir>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>

using namespace Kdd;

namespace
{

std::vector<double> numbersIn(const TypedData2D& pixels)
{
    return visitPixelType(pixels.type, [&](auto zero) {
        const auto* values = valuesOf<decltype(zero)>(pixels);
        return std::vector<double>(values, values + numValues(pixels));
    });
}

/// What the file of a single-frame image says that its pixels are.
std::vector<double> physicalValues(const QByteArray& path)
{
    DcmFileFormat file;
    StoredFrame stored;
    EXPECT_TRUE(readDicomFile(path.constData(), file).good());
    EXPECT_TRUE(readStoredFrame(*file.getDataset(), 0, 0, stored).good());
    std::vector<double> values = numbersIn(stored.pixels);
    Float64 slope = 0;
    Float64 intercept = 0;
    if (file.getDataset()->findAndGetFloat64(DCM_RescaleSlope, slope).bad())
        return values;
    file.getDataset()->findAndGetFloat64(DCM_RescaleIntercept, intercept);
    for (double& value : values)
        value = value * slope + intercept;
    return values;
}

class StackWriter : public testing::Test
{
protected:
    /// Saves the images as "1.dcm" and so on, and plans them as one stack.
    Stack saved(const Images& images)
    {
        QStringList files;
        for (const DatasetBuilder& image : images) {
            const QByteArray file = path(QByteArray::number(files.size() + 1) + ".dcm");
            files.append(QFile::decodeName(file));
            image.save(files.last());
        }
        mSeries = std::make_unique<StackSeries>(files);
        return mSeries->plans().front().stacks.first();
    }

    /// Writes and opens the volume.
    const OrlanMesh& written(const Stack& stack)
    {
        Result result = writeStack(stack, filePathOf, path("1-volume.vol"));
        if (result.good())
            mMesh = OrlanMesh::read(path("1-volume.vol"), result);
        if (result.bad())
            throw std::runtime_error(result.text().toStdString());
        return *mMesh;
    }

    QByteArray path(const QByteArray& name) const
    {
        return QFile::encodeName(mFolder.filePath(QString::fromLatin1(name)));
    }

    std::vector<double> slice(int z) const
    {
        TypedData2D pixels;
        EXPECT_TRUE(mMesh->readSlice(*mMesh->findLattice("Level0", 3), z, pixels).good());
        return numbersIn(pixels);
    }

    /// Writes, and gives the largest difference of a voxel from its image's physical value in steps of the lattice.
    double worstError(const Stack& stack)
    {
        const ParamBundle& parameters = written(stack).parameters();
        const double scale = parameters.real("DataWindowScale", 0);
        const double bias = parameters.real("DataWindowBias", 0);
        double worst = 0;
        for (int z = 0; z < stack.slices.size(); ++z) {
            const std::vector<double> voxels = slice(z);
            const std::vector<double> expected = physicalValues(filePathOf(stack.slices.at(z).tags.image()));
            EXPECT_EQ(voxels.size(), expected.size());
            for (std::size_t i = 0; i < voxels.size(); ++i)
                worst = qMax(worst, std::fabs((voxels[i] * scale + bias - expected[i]) / scale));
        }
        return worst;
    }

    QTemporaryDir mFolder;
    std::unique_ptr<StackSeries> mSeries;
    std::unique_ptr<OrlanMesh> mMesh;
};

struct RescaleCase
{
    const char* rescale[3][3];  ///< slope, intercept and sign of each slice
    PrimitiveType type;
    double worstError;
};

TEST_F(StackWriter, KeepsThePhysicalValueOfEveryVoxel)
{
    const RescaleCase rows[] = {
        {{{"-2", "5", "1"}, {"-2", "5", "1"}, {"-2", "5", "1"}}, PrimitiveType::Int16, 1e-9},
        {{{"0.5", "-1", "0"}, {"0.7", "3", "0"}, {"9", "0", "0"}}, PrimitiveType::UInt16, 0.51},
        {{{"1", "0", "0"}, {"0.01", "0", "0"}, {"0.01", "0", "0"}}, PrimitiveType::UInt16, 0.51},
        {{{"1", "0", "0"}, {"1", "0", "1"}, {"1", "0", "0"}}, PrimitiveType::UInt16, 0.51},
        {{{"2", "0", "0"}, {"-2", "0", "0"}, {"2", "0", "0"}}, PrimitiveType::UInt16, 0.51},
    };
    for (const auto& [rescale, type, error] : rows) {
        Images images = atZ({0, 1, 2});
        for (std::size_t i = 0; i < 3; ++i) {
            images[i].with(DCM_RescaleSlope, rescale[i][0]).with(DCM_RescaleIntercept, rescale[i][1]);
            images[i].with(DCM_PixelRepresentation, rescale[i][2]);
        }
        EXPECT_LE(worstError(saved(images)), error) << rescale[1][0];
        EXPECT_EQ(mMesh->findLattice("Level0", 3)->type, type) << rescale[1][0];
    }
}

TEST_F(StackWriter, KeepsThePhysicalValuesOfRealSeries)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA is not set";
    const std::pair<const char*, double> folders[] = {{"series/geometry", 0.51},
                                                      {"series/ct-phantom-rtstruct", 1e-9},
                                                      {"series/pet-seg", 1e-9},
                                                      {"series/mr-philips-asl-pr", 0.51},
                                                      {"series/mr-jpeg-lossless", 1e-9}};
    for (const auto& [folder, error] : folders) {
        const StackSeries series(realFiles(folder));
        for (const StackPlan& plan : series.plans()) {
            for (const Stack& stack : plan.stacks) {
                EXPECT_LE(worstError(stack), error) << folder;
                EXPECT_LT(farthestOff(stack), 0.02) << folder;
            }
        }
    }
}

TEST_F(StackWriter, TellsReadersAllOfTheVolume)
{
    Images images = atZ({0, 1, 2});
    for (DatasetBuilder& image : images) {
        image.with(DCM_RescaleSlope, "2").with(DCM_RescaleIntercept, "-1000");
        image.with(DCM_WindowCenter, "40\\300").with(DCM_WindowWidth, "400\\1500");
        image.with(DcmTag(DCM_PixelPaddingValue, EVR_US), "4000");
        image.with(DcmTag(DCM_PixelPaddingRangeLimit, EVR_US), "4095");
        image.withLong(DCM_SeriesDescription, 3000);
    }
    images[0].with(DCM_LossyImageCompression, "01");
    const Stack stack = saved(images);
    VolumeInfo info;
    ASSERT_TRUE(info.readHeader(written(stack), path("1-volume.vol")));
    EXPECT_EQ(info.imageUIDs, (std::vector<std::string>{"1", "2", "3"}));
    EXPECT_EQ(info.transformation.m, stack.transformation.m);
    EXPECT_EQ(info.rescaleIntercept, -1000.0F);
    EXPECT_EQ(info.numLossyCompressedImages, 1);
    EXPECT_EQ(info.paddingValue.value_or(0), 4000);
    EXPECT_EQ(info.paddingRangeLimit.value_or(0), 4095);
    EXPECT_EQ(info.histogram.total(), 30U);  // all but two padding values in each slice
    EXPECT_EQ(info.histogram.bins().at(2000), 3U);
    EXPECT_EQ(mMesh->parameters().real("WindowCenter", 0), 520);
    EXPECT_EQ(mMesh->parameters().real("WindowWidth", 0), 200);
    EXPECT_EQ(mMesh->parameters().bundle("DICOM").text("G0020-000E"), "UI:1.2.3");
    EXPECT_EQ(mMesh->parameters().bundle("DICOM").text("G0008-103E"), "")
        << "left out of the cache as too long";
}

TEST_F(StackWriter, NamesTheFramesOfAMultiFrameImage)
{
    VolumeInfo info;
    ASSERT_TRUE(info.readHeader(written(saved({enhanced()})), path("1-volume.vol")));
    EXPECT_EQ(info.imageUIDs, (std::vector<std::string>{"1"}));
    EXPECT_EQ(info.frameIdentifiers, (std::vector<std::string>{"1.4", "1.2", "1.0"}));
    EXPECT_THAT(slice(1), testing::Each(2));
}

TEST_F(StackWriter, KeepsMappedPaddingApartFromValues)
{
    const DcmTag padding(DCM_PixelPaddingValue, EVR_US);
    Images images = atZ({0, 1, 2});
    for (std::size_t i = 0; i < 3; ++i)
        images[i].with(DCM_RescaleSlope, i == 0 ? "1" : "2").with(padding, i == 0 ? "0" : "4095");
    EXPECT_EQ(written(saved(images)).parameters().integer("PaddingValue", -1), 0);
    EXPECT_THAT(slice(0), testing::Contains(0).Times(1));
    EXPECT_THAT(slice(1), testing::ElementsAre(1, 1, 2, 3, 1000, 2000, 3000, 4000, 0, 5, 6, 7));
}

TEST_F(StackWriter, LeavesNothingBehindWhenASliceFails)
{
    const Stack stack = saved(atZ({0, 1, 2}));
    QFile::remove(QFile::decodeName(path("2.dcm")));
    const std::pair<ImagePath, const char*> faults[] = {
        {filePathOf, "2.dcm"},
        {[&](const TagMap&) { return path("3.dcm"); }, "The file holds image 3 instead of 1"},
        {[&](const TagMap&) { return QByteArray(); }, "The image has no file"},
    };
    for (const auto& [pathOf, reason] : faults) {
        const Result result = writeStack(stack, pathOf, path("1-volume.vol"));
        EXPECT_THAT(result.text().toStdString(), testing::HasSubstr(reason));
        EXPECT_TRUE(QDir(QFile::decodeName(path("."))).entryList({QStringLiteral("1-volume*")}).isEmpty());
    }
}

TEST(VolumeFile, IsNamedAfterItsSeriesAndPart)
{
    EXPECT_EQ(volumeFileName("1.2.3", 0), "1.2.3-volume.vol");
    EXPECT_EQ(volumeFileName("1.2.3", 1), "1.2.3-volume_part002.vol");
    EXPECT_EQ(volumeFileName("../x-_part9", 1234), "..%2Fx%2D%5Fpart9-volume_part1235.vol");
}

}  // namespace
