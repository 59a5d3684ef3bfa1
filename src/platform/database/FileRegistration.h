#pragma once

#include "platform/database/Catalogue.h"
#include "platform/database/FileKind.h"
#include "platform/database/StudyContent.h"

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

    /// Throws DatabaseError. `outcome` is complete when it returns.
    void run(const FileRecords& files, RegistrationOutcome& outcome);

private:
    struct Entry;

    /// An image of a study, by the study's id and the image's SOP Instance UID.
    using Image = QPair<qint64, QByteArray>;

    static std::vector<Entry> inOrder(const FileRecords& files);
    void followCorrections(std::vector<Entry>& entries);
    void put(std::vector<Entry> entries);
    void place(Entry& entry);
    KeptNode& knownStudy(const QByteArray& uid);
    KeptNode& knownSeries(qint64 studyId, const QByteArray& uid);
    QHash<QByteArray, Image> formerImages(const std::vector<Entry>& entries);
    void settleConflicts(std::vector<Entry>& entries);
    void tellConflict(const Entry& entry, const Entry& other);
    void write(const std::vector<Entry>& entries);
    void remember(const std::vector<Entry>& entries);

    SqlConnection& mConnection;
    RegistrationOutcome* mOutcome = nullptr;
    bool mHasForgotten = false;            // any file at all
    qint64 mNumber = 0;                    // of the next file
    QHash<QByteArray, KeptNode> mStudies;  // that were met in this transaction
    QHash<QPair<qint64, QByteArray>, KeptNode> mSeries;
    QSet<qint64> mTouched;
    QSet<qint64> mChanged;  // of these the ones of which something was known before
    QSet<Image> mLeft;      // images whose shown file may be another one now
};

}  // namespace Kxg
