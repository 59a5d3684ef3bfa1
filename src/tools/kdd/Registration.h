#pragma once

#include "platform/database/Catalogue.h"

namespace Kdd
{

struct DicomInput;

/// Registers files in batches: one transaction for each file would make the database the slowest part by far.
class Registration
{
public:
    explicit Registration(Kxg::Catalogue& database)
        : mDatabase(database)
    {
    }

    /// False when the database failed, which is logged.
    bool add(const DicomInput& input);

    /// Registers what is still waiting for a full batch.
    bool flush();

    /// The requests left in the queue so far, by study; the caller takes those of a study that he has built.
    QMap<QByteArray, QVector<qint64>>& requests() { return mRequests; }

    int images() const { return mImages; }
    int volumes() const { return mVolumes; }

private:
    Kxg::Catalogue& mDatabase;
    Kxg::FileRecords mBatch;
    QMap<QByteArray, QVector<qint64>> mRequests;
    int mImages = 0;
    int mVolumes = 0;
};

}  // namespace Kdd
