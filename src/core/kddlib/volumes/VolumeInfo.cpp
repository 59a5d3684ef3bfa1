#include "kddlib/volumes/VolumeInfo.h"

#include "platform/base/LogFile.h"
#include "platform/volumefile/OrlanMesh.h"
#include "platform/volumefile/SOPInstanceUtility.h"

#include <algorithm>
#include <set>

namespace Kdd
{

namespace
{

const char* const kLevel0 = "Level0";
const char* const kDicom = "DICOM";
const char* const kSopInstanceUIDs = "SOPInstanceUIDs";
const char* const kHistogram = "Histogram";
const char* const kNumberOfFrames = "G0028-0008";

Vec3i dimsOf(const OrlanMesh& mesh)
{
    const Lattice* lattice = mesh.findLattice(kLevel0, 3);
    return lattice != nullptr ? Vec3i{lattice->dims.at(0), lattice->dims.at(1), lattice->dims.at(2)}
                              : Vec3i();
}

Box3f boxOf(const ParamBundle& parameters)
{
    for (const char* name : {"BoundingBox", "BoundingBox0"}) {
        const QVector<double> limits = parameters.numbers(name);
        if (limits.size() != 6)
            continue;
        const auto limit = [&](int i) { return static_cast<float>(limits.at(i)); };
        return {limit(0), limit(1), limit(2), limit(3), limit(4), limit(5)};
    }
    return {};
}

Mat4f matrixOf(const ParamBundle& parameters)
{
    Mat4f matrix;
    const QVector<double> values = parameters.numbers("TransformationMatrix");
    if (values.size() == static_cast<int>(matrix.m.size()))
        std::transform(values.begin(), values.end(), matrix.m.begin(),
                       [](double value) { return static_cast<float>(value); });
    return matrix;
}

boost::optional<qint32> optionalInteger(const ParamBundle& parameters, const char* name)
{
    if (!parameters.contains(name))
        return boost::none;
    return parameters.integer(name, 0);
}

KxHistogram histogramOf(const OrlanMesh& mesh, const QByteArray& path)
{
    QVector<quint64> counts;
    if (!mesh.hasDataSection(kHistogram))
        return {};
    const Result result = mesh.readDataSection(kHistogram, counts);
    if (result.bad())
        LogFile::warnf("3D volume %s has no usable histogram: %s", path.constData(),
                       qUtf8Printable(result.text()));
    const QVector<double> range = mesh.parameters().numbers("DataMinMax");
    return result.bad() || range.size() != 2 ? KxHistogram() : KxHistogram(counts, range.at(0), range.at(1));
}

std::string withoutFrame(const std::string& identifier)
{
    return identifier.substr(0, identifier.rfind('.'));
}

}  // namespace

QByteArray dicomValue(const OrlanMesh& mesh, const QByteArray& name)
{
    const QByteArray text = mesh.parameters().bundle(kDicom).text(name);
    return text.mid(text.indexOf(':') + 1);
}

bool VolumeInfo::readHeader(const OrlanMesh& mesh, const QByteArray& path)
{
    const ParamBundle& parameters = mesh.parameters();
    frameIdentifiers = SOPInstanceUtility::sopUIDList(parameters.bundle(kSopInstanceUIDs));
    if (frameIdentifiers.empty()) {
        LogFile::errorf("Could not get SOP list for 3D volume %s", path.constData());
        return false;
    }
    name = path.mid(path.lastIndexOf('/') + 1);
    dims = dimsOf(mesh);
    boundingBox = boxOf(parameters);
    transformation = matrixOf(parameters);
    rescaleSlope = static_cast<float>(parameters.real("DataWindowScale", 1));
    rescaleIntercept = static_cast<float>(parameters.real("DataWindowBias", 0));
    precisionBitLoss = static_cast<float>(parameters.real("PrecisionLossBits", 0));
    numLossyCompressedImages = parameters.integer("NumLossyCompressedImages", 0);
    numOverlayPlanes = parameters.integer("NumberOfOverlayPlanes", 0);
    paddingValue = optionalInteger(parameters, "PaddingValue");
    if (parameters.contains("PaddingRangeMin") && parameters.contains("PaddingRangeMax")) {
        paddingValue = optionalInteger(parameters, "PaddingRangeMin");
        paddingRangeLimit = optionalInteger(parameters, "PaddingRangeMax");
    }
    histogram = histogramOf(mesh, path);
    if (dims.z != static_cast<int>(frameIdentifiers.size()))
        LogFile::warnf("Found %d UIDs but %d slices in 3D volume %s",
                       static_cast<int>(frameIdentifiers.size()), dims.z, path.constData());
    nameImages(dicomValue(mesh, kNumberOfFrames).trimmed().toInt() >= 2);
    return true;
}

/// What the file lists per slice are frames when its images have several; else they are the images.
void VolumeInfo::nameImages(bool haveFrames)
{
    if (!haveFrames) {
        imageUIDs.swap(frameIdentifiers);
        frameIdentifiers.clear();
        return;
    }
    std::set<std::string> seen;
    imageUIDs.clear();
    for (const std::string& identifier : frameIdentifiers) {
        const std::string uid = withoutFrame(identifier);
        if (seen.insert(uid).second)
            imageUIDs.push_back(uid);
    }
}

}  // namespace Kdd
