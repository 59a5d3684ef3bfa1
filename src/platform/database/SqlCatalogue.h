#pragma once

#include "platform/database/Catalogue.h"
#include "platform/database/SqlConnection.h"

namespace Kxg
{

/// The catalogue in an SQL database of either engine.
class SqlCatalogue : public Catalogue
{
public:
    /// Throws DatabaseError.
    SqlCatalogue(const DatabaseAddress& address, SqlConnection::IfAbsent ifAbsent);

    Kdd::Result knownFiles(const QByteArray& path, QHash<QByteArray, FileStamp>& stamps) override;
    Kdd::Result registerFiles(const FileRecords& files, RegistrationOutcome& outcome) override;
    Kdd::Result removeFiles(const QVector<QByteArray>& paths) override;
    Kdd::Result removeStudy(const QByteArray& studyUID) override;
    Kdd::Result removeSeries(const QByteArray& studyUID, const QByteArray& seriesUID) override;
    Kdd::Result removeImage(const QByteArray& studyUID, const QByteArray& sopUID) override;

    Kdd::Result recordCorrections(const std::vector<ImageCorrection>& corrections,
                                  QMap<QByteArray, qint64>& requests) override;
    Kdd::Result corrections(const QByteArray& studyUID, std::vector<ImageCorrection>& corrections) override;

    Kdd::Result studyContents(const QByteArray& studyUID, StudyContents& contents) override;
    Kdd::Result listStudies(std::vector<StudySummary>& studies) override;
    Kdd::Result findStudies(const QByteArray& prefix, int limit, QVector<QByteArray>& studyUIDs) override;
    Kdd::Result findStudy(const QByteArray& studyUID, bool& isThere) override;
    Kdd::Result volumeFiles(const QByteArray& studyUID, QVector<QByteArray>& paths) override;

    Kdd::Result requestBuild(const QVector<QByteArray>& studyUIDs, IfGone ifGone) override;
    Kdd::Result settleNow() override;
    Kdd::Result waitingStudies(const QByteArray& path, QVector<QByteArray>& studyUIDs) override;
    Kdd::Result countWaiting(int& studies) override;
    Kdd::Result claimNext(const QSet<int>& except, std::unique_ptr<StudyClaim>& claim) override;
    Kdd::Result claim(const QByteArray& studyUID, int patienceMs, std::unique_ptr<StudyClaim>& claim,
                      IfAbsent ifAbsent) override;
    Kdd::Result claimRested(const QSet<int>& except, int restMs, std::unique_ptr<StudyClaim>& claim) override;
    Kdd::Result additions(const QByteArray& studyUID, QVector<qint64>& requests) override;
    Kdd::Result awaitsObjects(const QByteArray& studyUID, const QByteArray& folder, bool& awaits) override;
    Kdd::Result dropKnown(QSet<QByteArray>& paths) override;
    Kdd::Result stampsOf(const QList<QByteArray>& paths, QHash<QByteArray, FileStamp>& stamps) override;
    Kdd::Result finishRequests(const QVector<qint64>& requests) override;

    Kdd::Result setConfig(const QByteArray& section, const QByteArray& key, const QByteArray& value) override;

    Kdd::Result imageFiles(const QByteArray& studyUID, const QByteArray& sopUID,
                           QVector<KeptFile>& files) override;

    Kdd::Result requestRewrite(const QByteArray& studyUID, qint64& request) override;
    Kdd::Result tagFileProofs(const QByteArray& studyUID, TagFileProofs& proofs) override;
    Kdd::Result fileDigests(const QByteArray& studyUID, std::vector<FileDigest>& files) override;
    Kdd::Result fileDigest(const QByteArray& path, FileDigest& file) override;
    Kdd::Result recordDigests(const std::vector<FileDigest>& digests) override;
    Kdd::Result nextToCheck(qint64 before, CheckedStudy& study) override;
    Kdd::Result noteCheck(const CheckedStudy& study, bool isDone) override;
    Kdd::Result countFaulty(int& studies) override;
    Kdd::Result takeCheckTurn(std::unique_ptr<CheckTurn>& turn) override;

private:
    using Access = SqlConnection::Access;

    Kdd::Result transact(Access access, const std::function<void()>& work);
    Kdd::Result removeFiles(const QByteArray& studyUID, const QByteArray& condition,
                            const QVariantList& values);

    SqlConnection mConnection;
};

}  // namespace Kxg
