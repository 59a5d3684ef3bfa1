#pragma once

#include "sample/Dataset.h"
#include "sample/Folder.h"
#include "sample/Random.h"
#include "sample/Study.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcfilefo.h>

namespace Kdd
{

/// One series of a study; the study must outlive it.
struct SampleSeries
{
    const SampleStudy& study;
    int number;
    const char* modality;
    const char* sopClass;
    const char* description;
    int delay = 0;  // [s] from the start of the study to that of the series
    SampleEncoding encoding = SampleEncoding::Explicit;

    QByteArray uid() const;
    QByteArray instanceUid(int instance) const;

    /// Adds what all objects of the series share, the study included.
    void describe(SampleDataset& dataset) const;

    /// Appends an item to `sequence` that refers to one of the objects.
    void refer(SampleDataset& dataset, const DcmTag& sequence, int instance) const;

    /// Appends an item to `sequence` that refers to the series and, within it, to `instances`.
    void referWithSeries(SampleDataset& dataset, const DcmTag& sequence, const QVector<int>& instances) const;
};

/// One object on its way into a file: what every object has is there from the start.
class SampleObject
{
public:
    /// `instance` counts from 1; `second` is when the object was made [s after the series began].
    SampleObject(const SampleSeries& series, int instance, double second);

    SampleDataset& dataset() { return mDataset; }
    SampleRandom& random() { return mRandom; }

    void saveTo(SampleFolder& folder);

private:
    const SampleSeries& mSeries;
    int mInstance;
    DcmFileFormat mFile;
    SampleDataset mDataset;
    SampleRandom mRandom;
};

}  // namespace Kdd
