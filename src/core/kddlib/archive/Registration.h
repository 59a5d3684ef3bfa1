#pragma once

#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

namespace Kdd
{

struct DicomInput;

/// Registers files in batches: one transaction for each file would make the database the slowest part by far. Files that
/// stand in each other's way, and those that a correction leads elsewhere, are warned about by name. Used by the
/// thread of its catalogue.
class KDD_EXPORT Registration
{
public:
    /// The catalogue must outlive the object.
    explicit Registration(Kxg::Catalogue& catalogue)
        : mCatalogue(catalogue)
    {
    }

    /// Registers, when there are enough for a batch, this one and those before it. Failure: that of the database.
    Result add(const DicomInput& input);

    /// Registers what is still waiting for a full batch. Where the site wants digests (`ExResource::takesFileDigests`), the
    /// files are read for them.
    Result flush();

    /// The same, but nothing is read: whoever took the bytes in has their digests.
    Result flushUndigested();

    /// The studies that registered files belong to or were taken from.
    QList<QByteArray> studies() const { return mRequests.keys(); }

    /// The requests that registering left for a study.
    QVector<qint64> requests(const QByteArray& studyUID) const { return mRequests.value(studyUID); }

    /// The paths of registered files that a correction shows as something else than they say.
    const QSet<QByteArray>& corrected() const { return mCorrected; }

    int images() const { return mImages; }
    int volumes() const { return mVolumes; }

private:
    Kxg::Catalogue& mCatalogue;
    Kxg::FileRecords mBatch;
    QHash<QByteArray, QVector<qint64>> mRequests;
    QSet<QByteArray> mCorrected;
    int mImages = 0;
    int mVolumes = 0;
};

}  // namespace Kdd
