#include "platform/database/SqlCatalogue.h"

#include "platform/database/CorrectionRows.h"
#include "platform/database/FileRegistration.h"
#include "platform/database/FormerDatabases.h"
#include "platform/database/Schema.h"
#include "platform/database/StudyContent.h"
#include "platform/database/StudyListing.h"
#include "platform/volumefile/VolumeFileName.h"

#include <algorithm>
#include <utility>

namespace Kxg
{
namespace
{

QByteArray joined(const QSet<QByteArray>& texts)
{
    // A set has no order, and lists are to be the same each time.
    QList<QByteArray> sorted = texts.values();
    std::sort(sorted.begin(), sorted.end());
    return sorted.join(' ');
}

/// The root becomes an empty text, so that everything lies below it as below any folder.
QByteArray withoutSlash(QByteArray path)
{
    while (path.endsWith('/'))
        path.chop(1);
    return path;
}

/// One row for each series, the series of a study together.
const char kListSeries[] =
    "SELECT study.id, study.uid, study.patient_name, study.patient_id, study.study_date,"
    " EXISTS (SELECT 1 FROM build_request WHERE build_request.study_id = study.id AND due <= ?),"
    " series.modality, SUM(CASE WHEN file.kind = 1 AND file.is_shown = 1 THEN 1 ELSE 0 END),"
    " SUM(CASE WHEN file.kind = 2 THEN 1 ELSE 0 END), study.tag_file_size, study.tag_file_digest"
    // Joined with the files, so that a study that lost its last one is not listed.
    " FROM study JOIN series ON series.study_id = study.id JOIN file ON file.series_id = series.id"
    " GROUP BY study.id, series.id ORDER BY study.uid, series.id";

StudySummary summaryOf(const SqlRows& rows)
{
    StudySummary study;
    study.id = static_cast<int>(rows.number(0));
    study.studyInstanceUID = rows.text(1);
    study.patientName = rows.text(2);
    study.patientID = rows.text(3);
    study.studyDate = rows.text(4);
    study.isWaiting = rows.truth(5);
    study.tagFile = {rows.number(9), rows.bytes(10)};
    return study;
}

std::unique_ptr<Catalogue> openWith(const QByteArray& address, SqlConnection::IfAbsent ifAbsent,
                                    Kdd::Result& result)
{
    std::unique_ptr<Catalogue> catalogue;
    DatabaseAddress parsed;
    result = DatabaseAddress::parse(address, parsed);
    if (result.bad())
        return nullptr;
    if (FormerDatabases::has(parsed))
        ifAbsent = SqlConnection::IfAbsent::Fail;
    result = attempt(parsed, [&] { catalogue = std::make_unique<SqlCatalogue>(parsed, ifAbsent); });
    if (result.good())
        FormerDatabases::add(parsed);
    return catalogue;
}

}  // namespace

std::unique_ptr<Catalogue> Catalogue::open(const QByteArray& address, Kdd::Result& result)
{
    return openWith(address, SqlConnection::IfAbsent::Create, result);
}

std::unique_ptr<Catalogue> Catalogue::openExisting(const QByteArray& address, Kdd::Result& result)
{
    return openWith(address, SqlConnection::IfAbsent::Fail, result);
}

SqlCatalogue::SqlCatalogue(const DatabaseAddress& address, SqlConnection::IfAbsent ifAbsent)
    : mConnection(address, ifAbsent)
{
    // An empty file, or one of something else, is not made into a database that should be there already.
    if (ifAbsent == SqlConnection::IfAbsent::Fail)
        requireSchema(mConnection);
    // Also in a database that was there: tables of an older program are changed, those of a newer one refused.
    bringSchemaUpToDate(mConnection);
}

Kdd::Result SqlCatalogue::transact(Access access, const std::function<void()>& work)
{
    return attempt(mConnection.address(), [&] { mConnection.transact(access, work); });
}

// ---- files

Kdd::Result SqlCatalogue::knownFiles(const QByteArray& path, QHash<QByteArray, FileStamp>& stamps)
{
    const QByteArray folder = withoutSlash(path);
    return transact(Access::Read, [&] {
        QHash<QByteArray, FileStamp> found;
        // What lies below a folder is one range, since '0' is the byte after '/'.
        SqlRows rows = mConnection.ask("SELECT path, size, modified FROM file WHERE path = ? UNION ALL"
                                       " SELECT path, size, modified FROM file WHERE path >= ? AND path < ?",
                                       {bytesValue(folder), folder + '/', folder + '0'});
        while (rows.next())
            found.insert(rows.bytes(0), {rows.number(1), rows.number(2)});
        stamps.swap(found);
    });
}

Kdd::Result Catalogue::registerFiles(const FileRecords& files, QMap<QByteArray, qint64>& requests)
{
    RegistrationOutcome outcome;
    Kdd::Result result = registerFiles(files, outcome);
    if (result.good())
        requests.swap(outcome.requests);
    return result;
}

Kdd::Result SqlCatalogue::registerFiles(const FileRecords& files, RegistrationOutcome& outcome)
{
    RegistrationOutcome made;
    // Filled aside: of a transaction that fails nothing is told.
    Kdd::Result result = transact(Access::Write, [&] { FileRegistration(mConnection).run(files, made); });
    if (result.good())
        outcome = std::move(made);
    return result;
}

Kdd::Result SqlCatalogue::removeFiles(const QVector<QByteArray>& paths)
{
    return transact(Access::Write, [&] {
        QSet<qint64> touched;
        for (const QByteArray& path : paths) {
            {
                SqlRows rows = mConnection.ask("SELECT series.study_id FROM file JOIN series"
                                               " ON series.id = file.series_id WHERE file.path = ?",
                                               {bytesValue(path)});
                if (rows.next())
                    touched.insert(rows.number(0));
            }
            mConnection.change("INSERT INTO forgotten_file (path) SELECT path FROM file WHERE path = ?"
                               " ON CONFLICT (path) DO NOTHING",
                               {bytesValue(path)});
            mConnection.change("DELETE FROM file WHERE path = ?", {bytesValue(path)});
        }
        QMap<QByteArray, qint64> requests;
        for (const qint64 studyId : qAsConst(touched)) {
            // Another file of the same image may take the place of the one that went.
            showNewestOfAll(mConnection, studyId);
            concludeChange(mConnection, studyId, requests);
        }
    });
}

Kdd::Result SqlCatalogue::removeFiles(const QByteArray& studyUID, const QByteArray& condition,
                                      const QVariantList& values)
{
    return transact(Access::Write, [&] {
        const qint64 studyId = findStudyId(mConnection, studyUID);
        const QByteArray meant = " WHERE series_id IN (SELECT id FROM series WHERE study_id = ?" + condition;
        QMap<QByteArray, qint64> requests;
        mConnection.change("INSERT INTO forgotten_file (path) SELECT path FROM file" + meant +
                               " ON CONFLICT (path) DO NOTHING",
                           QVariantList{studyId} + values);
        // Nothing was listed there, so there is nothing to build.
        if (mConnection.change("DELETE FROM file" + meant, QVariantList{studyId} + values) == 0)
            return;
        showNewestOfAll(mConnection, studyId);
        concludeChange(mConnection, studyId, requests);
    });
}

Kdd::Result SqlCatalogue::removeStudy(const QByteArray& studyUID)
{
    return removeFiles(studyUID, ")", {});
}

Kdd::Result SqlCatalogue::removeSeries(const QByteArray& studyUID, const QByteArray& seriesUID)
{
    return removeFiles(studyUID, " AND uid = ?)", {textValue(seriesUID)});
}

Kdd::Result SqlCatalogue::removeImage(const QByteArray& studyUID, const QByteArray& sopUID)
{
    return removeFiles(studyUID,
                       // An image without UID is named by its path.
                       ") AND kind = 1 AND ((sop_uid = ? AND sop_uid <> '') OR (sop_uid = '' AND path = ?))",
                       {textValue(sopUID), bytesValue(sopUID)});
}

// ---- corrections

Kdd::Result SqlCatalogue::recordCorrections(const std::vector<ImageCorrection>& corrections,
                                            QMap<QByteArray, qint64>& requests)
{
    QMap<QByteArray, qint64> left;
    Kdd::Result result = transact(Access::Write, [&] {
        QSet<qint64> touched;
        for (const ImageCorrection& correction : corrections)
            recordCorrection(mConnection, correction, touched);
        for (const qint64 studyId : qAsConst(touched))
            concludeChange(mConnection, studyId, left);
    });
    if (result.good())
        requests.swap(left);
    return result;
}

Kdd::Result SqlCatalogue::corrections(const QByteArray& studyUID, std::vector<ImageCorrection>& corrections)
{
    return transact(Access::Read, [&] { corrections = correctionsOf(mConnection, studyUID); });
}

// ---- studies

Kdd::Result SqlCatalogue::studyContents(const QByteArray& studyUID, StudyContents& contents)
{
    return transact(Access::Read, [&] {
        StudyContents found;
        const qint64 studyId = findStudyId(mConnection, studyUID);
        found.id = static_cast<int>(studyId);
        found.images = listImages(mConnection, studyId);
        found.volumes = pathsOf(listVolumes(mConnection, studyId));
        found.isCorrected = !correctionsOf(mConnection, studyUID).empty();
        SqlRows rows =
            mConnection.ask("SELECT tag_file_size, tag_file_digest,"
                            " EXISTS (SELECT 1 FROM build_request WHERE study_id = study.id AND due <= ?)"
                            " FROM study WHERE id = ?",
                            {presentMs(), studyId});
        if (rows.next()) {
            found.tagFile = {rows.number(0), rows.bytes(1)};
            found.isWaiting = rows.truth(2);
        }
        // What waits to settle is due at a time and not at 0.
        SqlRows changes = mConnection.ask(
            "SELECT id FROM build_request WHERE study_id = ? AND due = 0 ORDER BY id", {studyId});
        while (changes.next())
            found.changes.push_back(changes.number(0));
        contents = std::move(found);
    });
}

Kdd::Result SqlCatalogue::listStudies(std::vector<StudySummary>& studies)
{
    return transact(Access::Read, [&] {
        std::vector<StudySummary> list;
        QSet<QByteArray> modalities;
        SqlRows rows = mConnection.ask(kListSeries, {presentMs()});
        while (rows.next()) {
            // The series of one study come one after the other.
            if (list.empty() || list.back().id != rows.number(0)) {
                list.push_back(summaryOf(rows));
                modalities.clear();
            }
            StudySummary& study = list.back();
            if (!rows.text(6).isEmpty())
                modalities.insert(rows.text(6));
            // Put together again with each series, since the last row of a study does not show that it is the
            // last.
            study.modalities = joined(modalities);
            study.images += static_cast<int>(rows.number(7));
            study.volumes += static_cast<int>(rows.number(8));
            ++study.series;
        }
        studies.swap(list);
    });
}

Kdd::Result SqlCatalogue::findStudies(const QByteArray& prefix, int limit, QVector<QByteArray>& studyUIDs)
{
    return transact(Access::Read, [&] {
        QVector<QByteArray> found;
        // No text that begins with the prefix comes after the prefix and the last of all characters.
        const QVariant last = textValue(prefix + "\xF4\x8F\xBF\xBF");
        SqlRows rows =
            mConnection.ask("SELECT uid FROM study WHERE uid >= ? AND uid <= ? ORDER BY uid LIMIT ?",
                            {textValue(prefix), last, std::max(0, limit)});
        while (rows.next())
            found.push_back(rows.text(0));
        studyUIDs.swap(found);
    });
}

Kdd::Result SqlCatalogue::findStudy(const QByteArray& studyUID, bool& isThere)
{
    return transact(Access::Read, [&] {
        SqlRows rows = mConnection.ask("SELECT 1 FROM study WHERE uid = ?", {textValue(studyUID)});
        isThere = rows.next();
    });
}

Kdd::Result SqlCatalogue::volumeFiles(const QByteArray& studyUID, QVector<QByteArray>& paths)
{
    return transact(Access::Read, [&] {
        QVector<QByteArray> found;
        SqlRows rows = mConnection.ask("SELECT file.path FROM study JOIN series ON series.study_id = study.id"
                                       " JOIN file ON file.series_id = series.id"
                                       " WHERE study.uid = ? AND file.kind = 2 ORDER BY file.path",
                                       {textValue(studyUID)});
        while (rows.next())
            found.push_back(rows.bytes(0));
        // The database knows nothing of part numbers.
        std::sort(found.begin(), found.end(), Kdd::isEarlierPart);
        paths.swap(found);
    });
}

// ---- the queue; what concerns claims stands with them

Kdd::Result SqlCatalogue::waitingStudies(const QByteArray& path, QVector<QByteArray>& studyUIDs)
{
    const QByteArray folder = withoutSlash(path);
    return transact(Access::Read, [&] {
        QVector<QByteArray> found;
        SqlRows rows = mConnection.ask(
            "SELECT DISTINCT study.uid FROM file JOIN series ON series.id = file.series_id"
            " JOIN study ON study.id = series.study_id"
            " JOIN build_request ON build_request.study_id = study.id"
            " WHERE (file.path = ? OR (file.path >= ? AND file.path < ?))"
            " AND build_request.due <= ? ORDER BY study.uid",
            {bytesValue(folder), bytesValue(folder + '/'), bytesValue(folder + '0'), presentMs()});
        while (rows.next())
            found.push_back(rows.text(0));
        studyUIDs.swap(found);
    });
}

// ---- configuration

Kdd::Result SqlCatalogue::setConfig(const QByteArray& section, const QByteArray& key, const QByteArray& value)
{
    return transact(Access::Write, [&] {
        mConnection.change("INSERT INTO config (section, name, value) VALUES (?, ?, ?)"
                           " ON CONFLICT (section, name) DO UPDATE SET value = excluded.value",
                           {textValue(section), textValue(key), bytesValue(value)});
    });
}

// ---- single images

Kdd::Result SqlCatalogue::imageFiles(const QByteArray& studyUID, const QByteArray& sopUID,
                                     QVector<KeptFile>& files)
{
    return transact(Access::Read, [&] {
        QVector<KeptFile> found;
        // One that follows a correction is shown under other UIDs; and what is shown under these may be another image.
        // Two questions, so that each goes by an index.
        const QByteArray select = "SELECT file.path, file.is_shown, study.uid, series.uid, file.sop_uid,"
                                  " file.registered FROM file JOIN series ON series.id = file.series_id"
                                  " JOIN study ON study.id = series.study_id WHERE file.kind = 1 AND ";
        SqlRows rows = mConnection.ask(
            select + "file.sop_uid = ? AND study.uid = ? AND file.correction_id IS NULL UNION ALL " + select +
                "file.correction_id IN (SELECT id FROM correction WHERE study_uid = ? AND image = ?)"
                " ORDER BY 6 DESC, 1 DESC",
            {textValue(sopUID), textValue(studyUID), textValue(studyUID), bytesValue(sopUID)});
        while (rows.next())
            found.append({rows.bytes(0), rows.truth(1), rows.text(2), rows.text(3), rows.text(4)});
        files.swap(found);
    });
}

}  // namespace Kxg
