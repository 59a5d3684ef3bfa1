#include "platform/volumefile/OrlanMesh.h"

#include "platform/volumefile/VolumeFileBuilder.h"
#include "support/BytesRead.h"
#include "support/Process.h"
#include "support/Threads.h"

#include <gtest/gtest.h>

#include <limits>

using namespace Kdd;

namespace
{

ParamBundle parametersOfEachKind()
{
    ParamBundle below;
    below.insert("", {});
    ParamBundle dicom;
    dicom.insert("G0020-000E", Parameter::ofText("UI:1.2.3"));
    dicom.insert("Empty", Parameter::ofText(""));
    ParamBundle all;
    all.insert("DataMinMax", Parameter::ofIntegers({std::numeric_limits<qint64>::min(), 7}));
    all.insert("None", Parameter::ofIntegers({}));
    all.insert("DataWindowScale", Parameter::ofReals({0.1}));
    // Tens of thousands of UIDs, for example.
    all.insert("LongText", Parameter::ofText(QByteArray("1.2.276.0.7230010\\").repeated(12'000)));
    all.insert("LongIntegers", Parameter::ofIntegers(QVector<qint64>(40'000, -5)));
    all.insert("LongReals", Parameter::ofReals(QVector<double>(4'001, 1e300)));
    all.insertBundle("DICOM", dicom);
    return all;
}

void expectEqual(const ParamBundle& left, const ParamBundle& right)
{
    ASSERT_EQ(left.parameters().keys(), right.parameters().keys());
    for (const QByteArray& name : left.parameters().keys()) {
        const Parameter& a = left.parameters()[name];
        const Parameter& b = right.parameters()[name];
        EXPECT_TRUE(a.kind == b.kind && a.text == b.text && a.integers == b.integers && a.reals == b.reals)
            << name.constData();
    }
    ASSERT_EQ(left.bundles().keys(), right.bundles().keys());
    for (const QByteArray& name : left.bundles().keys())
        expectEqual(left.bundle(name), right.bundle(name));
}

void expectAllSlices(const OrlanMesh& mesh, const Lattice& lattice)
{
    const Lattice* found = mesh.findLattice("Level", 3);
    ASSERT_TRUE(found != nullptr && found->dims == lattice.dims && found->type == lattice.type &&
                found->components == lattice.components);
    for (int i = 0; i < lattice.dims.at(2); ++i) {
        TypedData2D pixels;
        const Result result = mesh.readSlice(*found, i, pixels);
        ASSERT_TRUE(result.good()) << qPrintable(result.text());
        EXPECT_TRUE(pixels.width == 20 && pixels.height == 10 && pixels.pixels == sliceOf(lattice, i).pixels);
    }
    TypedData2D pixels;
    EXPECT_TRUE(mesh.readSlice(*found, -1, pixels).bad() &&
                mesh.readSlice(*found, lattice.dims.at(2), pixels).bad());
}

TEST(OrlanMesh, GivesBackSlicesOfEveryTypeFromPathAndMemory)
{
    for (int type = 0; type < 8; ++type) {
        for (const int components : {1, 3}) {
            const VolumeFileBuilder file;
            const Lattice lattice = aLattice(static_cast<PrimitiveType>(type), components);
            ASSERT_TRUE(file.write(lattice).good());
            expectAllSlices(*file.open(), lattice);
            expectAllSlices(*file.openInMemory(), lattice);
        }
    }
}

TEST(OrlanMesh, GivesBackParametersAndCounts)
{
    const VolumeFileBuilder file;
    ASSERT_TRUE(file.write(aLattice(), parametersOfEachKind()).good());
    const auto mesh = file.open();
    expectEqual(mesh->parameters(), parametersOfEachKind());
    QVector<quint64> counts;
    EXPECT_TRUE(mesh->hasDataSection("Histogram") && mesh->readDataSection("Histogram", counts).good());
    EXPECT_EQ(counts, (QVector<quint64>{1, 0, ~quint64(0)}));
    EXPECT_TRUE(mesh->readDataSection("Absent", counts).bad());
}

TEST(ParamBundle, CountsNumbersOutOfRangeAsAbsent)
{
    ParamBundle bundle;
    bundle.insert("Large", Parameter::ofIntegers({1LL << 31}));
    bundle.insert("NaN", Parameter::ofReals({std::numeric_limits<double>::quiet_NaN()}));
    bundle.insert("Text", Parameter::ofText("7"));
    bundle.insert("Real", Parameter::ofReals({-7.0, 1}));
    for (const char* name : {"Large", "NaN", "Text", "Absent"})
        EXPECT_EQ(bundle.integer(name, 3), 3) << name;
    EXPECT_EQ(bundle.integer("Real", 3), -7);
}

TEST(OrlanMesh, ReadsOneSliceWithoutTheOthers)
{
    const VolumeFileBuilder file;
    const Lattice lattice = aLattice(PrimitiveType::UInt8, 1, 5'000);
    ASSERT_TRUE(file.write(lattice).good());
    const qint64 size = file.bytes().size();
    const qint64 before = bytesRead();
    TypedData2D pixels;
    EXPECT_TRUE(file.open()->readSlice(lattice, 4'321, pixels).good());
    EXPECT_EQ(pixels.pixels, sliceOf(lattice, 4'321).pixels);
    EXPECT_LT(bytesRead() - before, size / 20);
}

TEST(OrlanMesh, IsReadOnSeveralThreads)
{
    const VolumeFileBuilder file;
    const Lattice lattice = aLattice();
    ASSERT_TRUE(file.write(lattice).good());
    onThreads(2, [&](int) {
        for (int i = 0; i < 20; ++i)
            expectAllSlices(*(i % 2 != 0 ? file.openInMemory() : file.open()), lattice);
    });
}

TEST(OrlanMeshWriter, LeavesNothingWhenItIsNotFinished)
{
    const VolumeFileBuilder file;
    Result result;
    auto writer = OrlanMeshWriter::create(file.path(), aLattice(), result);
    ASSERT_TRUE(writer) << qPrintable(result.text());
    EXPECT_TRUE(writer->writeSlice(0, sliceOf(aLattice(), 0)).good());
    EXPECT_TRUE(writer->writeSlice(1, sliceOf(aLattice(PrimitiveType::Int16), 1)).bad());
    EXPECT_TRUE(writer->writeSlice(3, sliceOf(aLattice(), 3)).bad());
    EXPECT_TRUE(writer->finish().bad());  // slices are missing
    EXPECT_FALSE(OrlanMesh::isVolumeFile(file.path()));
    writer.reset();
    EXPECT_EQ(file.files(), QStringList());
}

TEST(OrlanMeshWriter, ReportsAFullDiskAndKeepsTheFormerFile)
{
    const VolumeFileBuilder file;
    ASSERT_TRUE(file.write(aLattice()).good());
    const QByteArray former = file.bytes();
    Result result;
    {
        const FullDisk full(8'000);
        result = file.write(aLattice(PrimitiveType::Float64, 3, 20));
    }
    EXPECT_TRUE(result.text().contains(QLatin1String("a.vol"))) << qPrintable(result.text());
    EXPECT_EQ(file.files(), QStringList(QStringLiteral("a.vol")));
    EXPECT_EQ(file.bytes(), former);
}

}  // namespace
