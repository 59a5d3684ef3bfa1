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

/// Without a lattice of three dimensions there is no geometry, and the
/// volume counts as one of which nothing is known.
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

/// A value that is not there is no 0, which might be a measured one.
boost::optional<qint32> optionalInteger(const ParamBundle& parameters, const char* name)
{
    if (!parameters.contains(name))
        return boost::none;
    return parameters.integer(name, 0);
}

/// A tag file has no room for a bin for each of 65,536 values, and a volume with more bins than there is room for loses
/// its suffix there: two values share a bin then.
QVector<quint64> inPairs(const QVector<quint64>& counts)
{
    QVector<quint64> pairs;
    pairs.reserve(counts.size() / 2);
    for (int i = 0; i + 1 < counts.size(); i += 2)
        pairs.append(counts.at(i) + counts.at(i + 1));
    return pairs;
}

/// Without a range the bins can be understood when there is one for every value that the pixels can have; else there are
/// none.
KxHistogram ofEveryValue(const QVector<quint64>& counts, PrimitiveType type)
{
    const int values = sizeOf(type) <= 2 ? 1 << (8 * sizeOf(type)) : 0;
    if (counts.size() != values)
        return {};
    const bool isSigned = type == PrimitiveType::Int8 || type == PrimitiveType::Int16;
    const int least = isSigned ? -values / 2 : 0;
    return {sizeOf(type) == 2 ? inPairs(counts) : counts, double(least), double(least + values - 1)};
}

KxHistogram histogramOf(const OrlanMesh& mesh, const QByteArray& path)
{
    QVector<quint64> counts;
    if (!mesh.hasDataSection(kHistogram))
        return {};
    const Result result = mesh.readDataSection(kHistogram, counts);
    const QVector<double> range = mesh.parameters().numbers("DataMinMax");
    if (result.good() && range.size() == 2)
        return {counts, range.at(0), range.at(1)};
    const Lattice* lattice = mesh.findLattice(kLevel0, 3);
    // A range that is there but is none is not guessed at; one that is missing may follow from the type.
    if (result.good() && range.isEmpty() && lattice != nullptr) {
        KxHistogram histogram = ofEveryValue(counts, lattice->type);
        if (histogram.numBins() > 0)
            return histogram;
    }
    const QString reason = result.bad()
                               ? result.text()
                               : QStringLiteral("nothing tells the range of its %1 bins").arg(counts.size());
    LogFile::warnf("3D volume %s has no usable histogram: %s", path.constData(), qUtf8Printable(reason));
    return {};
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
        // A range takes the place of the single value.
        paddingValue = optionalInteger(parameters, "PaddingRangeMin");
        paddingRangeLimit = optionalInteger(parameters, "PaddingRangeMax");
    }
    histogram = histogramOf(mesh, path);
    // Told and taken all the same, for the images are known.
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
        // Each image once, in the order of its first frame.
        if (seen.insert(uid).second)
            imageUIDs.push_back(uid);
    }
}

}  // namespace Kdd
