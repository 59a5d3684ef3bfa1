#pragma once

#include "sample/Studies.h"

#include <QSet>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcxfer.h>

class DcmFileFormat;

namespace Kdd
{

/// Where a file belongs below the folder.
struct SamplePlace
{
    QString study;
    QString series;
    QString file;
};

/// How a file is encoded.
enum class SampleEncoding {
    Explicit,             // sequences end at a delimiter
    ExplicitWithLengths,  // sequences give their length
    ImplicitWithLengths,  // groups give theirs too, as old equipment does
};

/// The folder that is being filled, and the account of what lies there.
class SampleFolder
{
public:
    using Progress = std::function<void(int done, int total)>;

    SampleFolder(QString path, Progress progress);

    /// Tells how many files there will be, for the progress.
    void expect(int total) { mTotal = total; }

    /// Writes the file, complete or not at all. SampleFault: it could not be written.
    void save(DcmFileFormat& object, const SamplePlace& place, SampleEncoding encoding);

    const SampleSummary& summary() const { return mSummary; }

private:
    void count(const SamplePlace& place, qint64 bytes);

    QString mPath;
    Progress mProgress;
    int mTotal = 0;
    QSet<QString> mStudies;
    QSet<QString> mSeries;
    SampleSummary mSummary;
};

}  // namespace Kdd
