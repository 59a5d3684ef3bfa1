#include "kddlib/volumes/StackWriter.h"

#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "kddlib/volumes/StackParameters.h"
#include "kddlib/volumes/StackPlanner.h"
#include "kddlib/volumes/StackValues.h"
#include "platform/volume/StoredFrame.h"
#include "platform/volumefile/OrlanMeshWriter.h"

#include <QFile>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>

#include <cmath>

namespace Kdd
{

namespace
{

/// Reads frames from the files of their images. The file read last stays open, for the next frame is often of the same
/// image.
class SliceReader
{
public:
    explicit SliceReader(const ImagePath& pathOf)
        : mPathOf(pathOf)
    {
    }

    Result read(const StackFrame& slice, TypedData2D& pixels)
    {
        StoredFrame stored;
        Result result = open(slice);
        if (result.good())
            result = readStoredFrame(*mFile.getDataset(), slice.frame, 0, stored);
        if (result.bad())
            return result;
        pixels = stored.pixels;
        return checkSize(slice, pixels);
    }

private:
    Result open(const StackFrame& slice)
    {
        if (slice.imageUID == mOpenUID && !mOpenUID.isEmpty())
            return {};
        // First of all: a file that fails on the way must not count as the open one.
        mOpenUID.clear();
        const QByteArray path = mPathOf(slice.tags.image());
        if (path.isEmpty())
            return Result::failure(QStringLiteral("The image has no file"));
        const OFCondition condition = loadDicomFile(path.constData(), mFile);
        if (condition.bad())
            return Result::failure(QString::fromLocal8Bit(condition.text()));
        return checkImage(slice.imageUID);
    }

    /// A file may have been replaced since its metadata was cached.
    Result checkImage(const QByteArray& planned)
    {
        OFString uid;
        mFile.getDataset()->findAndGetOFString(DCM_SOPInstanceUID, uid);
        if (planned != uid.c_str())
            return Result::failure(QStringLiteral("The file holds image %1 instead of %2")
                                       .arg(QString::fromLatin1(uid.c_str()), QString::fromLatin1(planned)));
        mOpenUID = planned;
        return {};
    }

    static Result checkSize(const StackFrame& planned, const TypedData2D& pixels)
    {
        if (pixels.width == planned.columns && pixels.height == planned.rows)
            return {};
        return Result::failure(QStringLiteral("The image has %1 x %2 pixels instead of %3 x %4")
                                   .arg(pixels.width)
                                   .arg(pixels.height)
                                   .arg(planned.columns)
                                   .arg(planned.rows));
    }

    const ImagePath& mPathOf;
    QByteArray mOpenUID;
    DcmFileFormat mFile;
};

/// For messages: the file where there is one, and the frame as people count, from 1.
QString nameOf(const StackFrame& slice, const ImagePath& pathOf)
{
    const QString path = QFile::decodeName(pathOf(slice.tags.image()));
    const QString name = path.isEmpty() ? QString::fromLatin1(slice.imageUID) : path;
    return slice.isMultiFrame ? QStringLiteral("%1, frame %2").arg(name).arg(slice.frame + 1) : name;
}

Result writeSlices(const Stack& stack, const ImagePath& pathOf, const StackValues& values,
                   OrlanMeshWriter& writer, ValueCounts& counts)
{
    SliceReader reader(pathOf);
    for (int i = 0; i < stack.slices.size(); ++i) {
        const StackFrame& slice = stack.slices.at(i);
        TypedData2D stored;
        TypedData2D lattice;
        Result result = reader.read(slice, stored);
        if (result.good())
            result = values.convert(slice, stored, lattice, counts);
        if (result.bad())
            // A fault of the image is told with its file; the writer names the volume file itself.
            return result.within(nameOf(slice, pathOf));
        result = writer.writeSlice(i, lattice);
        if (result.bad())
            return result;
    }
    return {};
}

/// Where the slices have no common range the scale is infinite or 0, by which nothing can be divided.
Result checkPlan(const Stack& stack, const StackValues& values)
{
    if (std::isfinite(values.scale()) && std::isfinite(values.bias()) && values.scale() != 0)
        return {};
    return Result::failure(
        QStringLiteral("The rescale values of image %1 and the others have no common range")
            .arg(QString::fromLatin1(stack.slices.first().imageUID)));
}

}  // namespace

Result writeStack(const Stack& stack, const ImagePath& pathOf, const QByteArray& volumePath)
{
    if (stack.slices.isEmpty())
        return Result::failure(QStringLiteral("The stack has no slices"));
    const StackValues values(stack.slices);
    Result result = checkPlan(stack, values);
    if (result.bad())
        return result;
    const Lattice lattice{"Level0", {stack.dims.x, stack.dims.y, stack.dims.z}, values.type(), 1};
    const std::unique_ptr<OrlanMeshWriter> writer = OrlanMeshWriter::create(volumePath, lattice, result);
    if (!writer)
        return result;

    // Range and histogram are known when all slices are written, so the parameters come after them. A
    // writer that is not finished leaves no file.
    ValueCounts counts;
    result = writeSlices(stack, pathOf, values, *writer, counts);
    if (result.good())
        result = writer->writeParameters(stackParameters(stack, values, counts));
    if (result.good() && !counts.isEmpty())
        result = writer->writeDataSection("Histogram", counts.histogram().bins());
    return result.good() ? writer->finish() : result;
}

QByteArray volumeFileName(const QByteArray& seriesUID, int index)
{
    const QByteArray name = seriesUID.toPercentEncoding(QByteArray(), "-_~") + "-volume";
    if (index < 1)
        return name + ".vol";
    return name + "_part" + QByteArray::number(index + 1).rightJustified(3, '0') + ".vol";
}

}  // namespace Kdd
