#pragma once

#include "platform/database/Catalogue.h"
#include "platform/database/FileKind.h"

#include <QPair>

namespace Kxg
{

class SqlConnection;

/// Registers a set of files within one transaction. An object serves for one.
class FileRegistration
{
public:
    /// The connection must outlive the object.
    explicit FileRegistration(SqlConnection& connection)
        : mConnection(connection)
    {
    }

    /// Throws DatabaseError. `requests` receives the request left for each study touched, by Study Instance UID.
    void run(const FileRecords& files, QMap<QByteArray, qint64>& requests);

private:
    struct Entry;

    /// A study or series that was met in this transaction.
    struct Known
    {
        qint64 id = 0;
        bool isDescribed = false;
    };

    static std::vector<Entry> inOrder(const FileRecords& files);
    void put(const std::vector<Entry>& entries);
    qint64 obtainSeries(const Entry& entry);
    Known& obtainStudy(const QByteArray& uid);
    Known& obtainSeries(qint64 studyId, const QByteArray& uid);
    void noteFormerStudies(const std::vector<Entry>& entries);

    SqlConnection& mConnection;
    QHash<QByteArray, Known> mStudies;
    QHash<QPair<qint64, QByteArray>, Known> mSeries;
    QSet<qint64> mTouched;
};

}  // namespace Kxg
