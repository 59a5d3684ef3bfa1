#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

namespace
{

/// UIDs and everything random are made of these two names, so another wording would change all of them.
QByteArray seriesPart(int series)
{
    return "series " + QByteArray::number(series);
}

QByteArray instancePart(int series, int instance)
{
    return "object " + QByteArray::number(instance) + " in " + seriesPart(series);
}

// "IM0001.dcm", and "PR0001.dcm" or "SR0001.dcm" for what is no image.
QString fileName(const QString& modality, int instance)
{
    const bool isImage = modality != QLatin1String("PR") && modality != QLatin1String("SR");
    const QString prefix = isImage ? QStringLiteral("IM") : modality;
    return QStringLiteral("%1%2.dcm").arg(prefix).arg(instance, 4, 10, QLatin1Char('0'));
}

}  // namespace

QByteArray SampleSeries::uid() const
{
    return study.uid(seriesPart(number));
}

QByteArray SampleSeries::instanceUid(int instance) const
{
    return study.uid(instancePart(number, instance));
}

void SampleSeries::describe(SampleDataset& dataset) const
{
    study.describe(dataset);
    dataset.with(DCM_SOPClassUID, sopClass)
        .with(DCM_Modality, modality)
        .with(DCM_SeriesInstanceUID, uid())
        .with(DCM_SeriesNumber, number)
        .with(DCM_SeriesDate, kSampleDate)
        .with(DCM_SeriesTime, study.time(delay))
        .with(DCM_SeriesDescription, description);
}

void SampleSeries::refer(SampleDataset& dataset, const DcmTag& sequence, int instance) const
{
    dataset.item(sequence)
        .with(DCM_ReferencedSOPClassUID, sopClass)
        .with(DCM_ReferencedSOPInstanceUID, instanceUid(instance));
}

void SampleSeries::referWithSeries(SampleDataset& dataset, const DcmTag& sequence,
                                   const QVector<int>& instances) const
{
    SampleDataset series = dataset.item(sequence);
    series.with(DCM_SeriesInstanceUID, uid());
    for (const int instance : instances)
        refer(series, DCM_ReferencedImageSequence, instance);
}

SampleObject::SampleObject(const SampleSeries& series, int instance, double second)
    : mSeries(series)
    , mInstance(instance)
    , mDataset(*mFile.getDataset())
    // Named after its place in the study, so that it draws the same numbers whatever else is written.
    , mRandom(series.study.name(instancePart(series.number, instance)))
{
    const QByteArray time = series.study.time(series.delay + second);
    series.describe(mDataset);
    mDataset.with(DCM_SOPInstanceUID, series.instanceUid(instance))
        .with(DCM_InstanceNumber, instance)
        .with(DCM_InstanceCreationDate, kSampleDate)
        // A scanner needs its time to make the object of what it has recorded.
        .with(DCM_InstanceCreationTime, series.study.time(series.delay + second + 2.5))
        .with(DCM_ContentDate, kSampleDate)
        .with(DCM_ContentTime, time);
}

void SampleObject::saveTo(SampleFolder& folder)
{
    const SamplePlace place = {mSeries.study.directory, QString::number(mSeries.number),
                               fileName(QString::fromLatin1(mSeries.modality), mInstance)};
    folder.save(mFile, place, mSeries.encoding);
}

}  // namespace Kdd
