#include "bench/Workload.h"

#include "kddlib/Limits.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/Result.h"
#include "sample/Studies.h"

#include <QFileInfo>

#include <dcmtk/dcmdata/dctk.h>

#include <stdexcept>

namespace Kdd
{

namespace
{

qint64 headerBytesOf(DcmDataset& dataset, const std::string& path)
{
    DcmElement* pixels = nullptr;
    dataset.findAndGetElement(DCM_PixelData, pixels);
    return QFileInfo(QString::fromStdString(path)).size() -
           (pixels != nullptr ? qint64(pixels->getLengthField()) : 0);
}

/// What differs from slice to slice of a stack, as texts.
struct Slice
{
    explicit Slice(int index)
        : number(QByteArray::number(index))
        , location(QByteArray::number(index * 0.7))
        , time(QByteArray::number(101500 + index * 0.25, 'f', 3))
        , current(QByteArray::number(180 + (index * 7) % 60))
    {
    }

    QByteArray sopUID() const { return "2.25.4711." + number; }
    QByteArray position() const { return "-120\\-120\\" + location; }

    QByteArray number;
    QByteArray location;
    QByteArray time;
    QByteArray current;
};

/// A further slice of the stack that `image` is one of.
TagMap* nextSlice(const TagMap& image, const Slice& slice)
{
    TagMap* next = image.clone();
    next->putAndInsertString(DCM_SOPInstanceUID, slice.sopUID());
    next->putAndInsertString(DCM_InstanceNumber, slice.number);
    next->putAndInsertString(DCM_SliceLocation, slice.location);
    next->putAndInsertString(DCM_ImagePositionPatient, slice.position());
    next->putAndInsertString(DCM_ContentTime, slice.time);
    next->putAndInsertString(DCM_XRayTubeCurrent, slice.current);
    return next;
}

void makeSlice(DcmDataset& dataset, const Slice& slice)
{
    dataset.putAndInsertString(DCM_SOPInstanceUID, slice.sopUID().constData());
    dataset.putAndInsertString(DCM_InstanceNumber, slice.number.constData());
    dataset.putAndInsertString(DCM_SliceLocation, slice.location.constData());
    dataset.putAndInsertString(DCM_ImagePositionPatient, slice.position().constData());
    dataset.putAndInsertString(DCM_ContentTime, slice.time.constData());
    dataset.putAndInsertString(DCM_XRayTubeCurrent, slice.current.constData());
}

}  // namespace

Workload::Workload(int images)
{
    SampleSummary summary;
    const Result result = writeSampleStudies(mFolder.path(), {40, 1}, {}, summary);
    DcmFileFormat pattern;
    const QString first = mFolder.filePath(QStringLiteral("CT-1/2/IM0001.dcm"));
    if (result.bad() || pattern.loadFile(first.toLocal8Bit().constData()).bad())
        throw std::runtime_error("the sample studies cannot be made");
    pattern.loadAllDataIntoMemory();
    for (int i = 1; i <= images; ++i) {
        makeSlice(*pattern.getDataset(), Slice(i));
        mFiles.push_back(mFolder.filePath(QStringLiteral("slice_%1.dcm").arg(i)).toStdString());
        if (pattern.saveFile(mFiles.back().c_str(), EXS_LittleEndianExplicit).bad())
            throw std::runtime_error("the workload cannot be written");
        mHeaderBytes += headerBytesOf(*pattern.getDataset(), mFiles.back());
    }
}

std::unique_ptr<TagFile> Workload::study(int count) const
{
    auto file = std::make_unique<TagFile>();
    const int loaded = qMin(count, static_cast<int>(mFiles.size()));
    const TagMap* last = nullptr;
    for (int i = 0; i < loaded; ++i) {
        const char* path = mFiles[static_cast<std::size_t>(i)].c_str();
        if (const TagMap* image = file->addDicomFile(path, path, false))
            last = image;
    }
    for (int i = loaded; i < count; ++i)
        file->addTagMap(nextSlice(*last, Slice(i + 1)), "/archive/slice_0.dcm", false);
    return file;
}

const Workload& thousandImages()
{
    static const Workload workload(1000);
    return workload;
}

}  // namespace Kdd
