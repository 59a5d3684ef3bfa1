#include "platform/database/FileRegistration.h"

#include "platform/database/CorrectionRows.h"
#include "platform/database/SqlConnection.h"
#include "platform/database/StudyDescription.h"

#include <algorithm>

namespace Kxg
{
namespace
{

// A server answers a statement for many files in nearly the time of one for a single file. Files that are too few for
// that are taken one by one, so that there are two texts of each statement and not one for every number of files.
constexpr int kFilesAtOnce = 100;

QByteArray repeated(const QByteArray& text, int times)
{
    return text + (", " + text).repeated(times - 1);
}

}  // namespace

struct FileRegistration::Entry
{
    FileKind kind = FileKind::Other;
    QByteArray path;
    FileStamp stamp;
    QByteArray studyUID, seriesUID, sopUID;
    const DicomFileRecord* attributes = nullptr;  // null when the file says nothing of its study and series
    qint64 studyId = 0;
    QVariant seriesId = QVariant(QVariant::LongLong);      // null for what belongs to none
    QVariant correctionId = QVariant(QVariant::LongLong);  // of the one that it follows; null for none
    bool isShown = true;

    bool isNamedImage() const { return kind == FileKind::Dicom && !sopUID.isEmpty(); }

    void check() const
    {
        const char* reason = nullptr;
        if (path.isEmpty() || path.size() > kMaxPath)
            reason = "its path is too long or empty";
        else if (kind == FileKind::Volume && (studyUID.isEmpty() || seriesUID.isEmpty()))
            reason = "it names no study and series";
        else if (std::max({studyUID.size(), seriesUID.size(), sopUID.size()}) > kMaxUID)
            reason = "it has a UID that is too long";
        if (reason)
            throw DatabaseError(QStringLiteral("cannot register %1: %2")
                                    .arg(QString::fromUtf8(path), QString::fromLatin1(reason)));
    }
};

/// By path, so that which file describes a study does not depend on the order in which they were read, and with each
/// path once: the last one given.
std::vector<FileRegistration::Entry> FileRegistration::inOrder(const FileRecords& files)
{
    QMap<QByteArray, Entry> byPath;
    for (const DicomFileRecord& file : files.dicom)
        byPath[file.path] = {FileKind::Dicom,        file.path,           file.stamp, file.studyInstanceUID,
                             file.seriesInstanceUID, file.sopInstanceUID, &file};
    for (const VolumeFileRecord& file : files.volumes)
        byPath[file.path] = {FileKind::Volume,       file.path,    file.stamp, file.studyInstanceUID,
                             file.seriesInstanceUID, QByteArray(), nullptr};
    for (const OtherFileRecord& file : files.others)
        byPath[file.path] = {FileKind::Other, file.path, file.stamp, {}, {}, {}, nullptr};
    for (const Entry& entry : qAsConst(byPath))
        entry.check();
    return {byPath.cbegin(), byPath.cend()};
}

void FileRegistration::run(const FileRecords& files, RegistrationOutcome& outcome)
{
    mOutcome = &outcome;
    std::vector<Entry> entries = inOrder(files);
    mHasForgotten = mConnection.ask("SELECT 1 FROM forgotten_file LIMIT 1").next();
    // Without any, no file has to be looked up.
    if (hasCorrections(mConnection))
        followCorrections(entries);
    // From here on they are compared with those that are stored.
    for (Entry& entry : entries)
        entry.sopUID = textValue(entry.sopUID).toString().toUtf8();
    // Given out by path: of several new files of one image the last by path is the one that is shown.
    mNumber = takeRegistrationNumbers(mConnection, static_cast<qint64>(entries.size()));
    for (auto from = entries.begin(); from != entries.end();) {
        const auto to = entries.end() - from >= kFilesAtOnce ? from + kFilesAtOnce : from + 1;
        put({from, to});
        from = to;
    }
    // Only now, since a later portion may take away the file that would be next.
    for (const Image& image : qAsConst(mLeft))
        showNewest(mConnection, image.first, image.second);
    // A set has no order, and requests are served in the order in which they are left.
    QList<qint64> touched = mTouched.values();
    std::sort(touched.begin(), touched.end());
    for (const qint64 studyId : qAsConst(touched))
        concludeChange(mConnection, studyId, outcome.requests,
                       mChanged.contains(studyId) ? Reason::Changed : Reason::Added);
}

/// A file of an image that was corrected belongs where the correction put the image.
void FileRegistration::followCorrections(std::vector<Entry>& entries)
{
    QList<QByteArray> images;
    // By what the file says of itself, which is the key of a correction.
    for (const Entry& entry : entries)
        images.append(entry.sopUID.isEmpty() ? entry.path : entry.sopUID);
    QHash<QPair<QByteArray, QByteArray>, KeptCorrection> known;
    for (const KeptCorrection& kept : correctionsOfImages(mConnection, images))
        known.insert({kept.correction.studyInstanceUID, kept.correction.image}, kept);
    for (std::size_t i = 0; i < entries.size(); ++i) {
        Entry& entry = entries[i];
        const auto found = known.constFind({entry.studyUID, images.at(static_cast<int>(i))});
        if (entry.kind != FileKind::Dicom || found == known.cend())
            continue;
        const ImageCorrection& correction = found->correction;
        // Told only when the image went to another study, where nobody would look for the file.
        if (correction.shownStudyUID != entry.studyUID)
            mOutcome->conflicts.push_back({FileConflict::Kind::FollowsCorrection, entry.path, entry.sopUID,
                                           entry.studyUID, QByteArray(), correction.shownStudyUID});
        entry.studyUID = correction.shownStudyUID;
        if (!correction.shownSeriesUID.isEmpty())
            entry.seriesUID = correction.shownSeriesUID;
        // The path stands for an image without UID and must not become one.
        if (correction.shownImage != entry.path)
            entry.sopUID = correction.shownImage;
        entry.correctionId = found->id;
        mOutcome->corrected.insert(entry.path);
    }
}

void FileRegistration::put(std::vector<Entry> entries)
{
    // Before anything is written: afterwards only the new places are known.
    const QHash<QByteArray, Image> former = formerImages(entries);
    for (Entry& entry : entries) {
        if (entry.kind != FileKind::Other)
            place(entry);
        const Image before = former.value(entry.path);
        // It left an image of which another file may have to be shown now.
        if (before.first != 0 && before != Image(entry.studyId, entry.sopUID))
            mLeft.insert(before);
    }
    settleConflicts(entries);
    write(entries);
}

void FileRegistration::write(const std::vector<Entry>& entries)
{
    if (mHasForgotten)
        remember(entries);
    QVariantList values;
    for (const Entry& entry : entries)
        values << bytesValue(entry.path) << entry.stamp.size << entry.stamp.modified
               << static_cast<int>(entry.kind) << entry.seriesId << textValue(entry.sopUID) << mNumber++
               << (entry.isShown ? 1 : 0) << (entry.attributes && entry.attributes->isDamaged ? 1 : 0)
               << entry.correctionId;
    // A row that exists is changed and not replaced: what other series share of a volume would go with it.
    mConnection.change(
        "INSERT INTO file (path, size, modified, kind, series_id, sop_uid, registered, is_shown,"
        " is_damaged, correction_id) VALUES " +
            repeated("(?, ?, ?, ?, ?, ?, ?, ?, ?, ?)", static_cast<int>(entries.size())) +
            " ON CONFLICT (path) DO UPDATE SET size = excluded.size, modified = excluded.modified,"
            " kind = excluded.kind, series_id = excluded.series_id, sop_uid = excluded.sop_uid,"
            " registered = excluded.registered, is_shown = excluded.is_shown,"
            // It was of the bytes that were there before.
            " is_damaged = excluded.is_damaged, correction_id = excluded.correction_id, digest = NULL",
        values);
}

void FileRegistration::remember(const std::vector<Entry>& entries)
{
    QVariantList paths;
    for (const Entry& entry : entries)
        paths << bytesValue(entry.path);
    mConnection.change("DELETE FROM forgotten_file WHERE path IN (" + repeated("?", paths.size()) + ")",
                       paths);
}

/// The images that are known under the paths so far.
QHash<QByteArray, FileRegistration::Image> FileRegistration::formerImages(const std::vector<Entry>& entries)
{
    QVariantList paths;
    for (const Entry& entry : entries)
        paths << bytesValue(entry.path);
    QHash<QByteArray, Image> former;
    SqlRows rows = mConnection.ask("SELECT file.path, series.study_id, file.sop_uid, file.kind FROM file"
                                   " JOIN series ON series.id = file.series_id WHERE file.path IN (" +
                                       repeated("?", paths.size()) + ")",
                                   paths);
    while (rows.next()) {
        // The study that a file leaves changes too.
        mTouched.insert(rows.number(1));
        mChanged.insert(rows.number(1));
        if (rows.number(3) == static_cast<int>(FileKind::Dicom) && !rows.text(2).isEmpty())
            former.insert(rows.bytes(0), {rows.number(1), rows.text(2)});
    }
    return former;
}

/// The file registered last is the one that is shown of its image.
void FileRegistration::settleConflicts(std::vector<Entry>& entries)
{
    // First the files of this portion among each other, then against those that are registered.
    QHash<QByteArray, std::vector<Entry*>> byImage;
    for (Entry& entry : entries) {
        if (!entry.isNamedImage())
            continue;
        std::vector<Entry*>& same = byImage[entry.sopUID];
        for (Entry* other : same)
            tellConflict(entry, *other);
        // In different studies both are shown.
        for (Entry* other : same)
            other->isShown = other->isShown && other->studyId != entry.studyId;
        same.push_back(&entry);
    }
    if (byImage.isEmpty())
        return;
    QVariantList uids;
    // All entries, so that the statement has one number of values. What has no UID finds nothing.
    for (const Entry& entry : entries)
        uids << textValue(entry.sopUID);
    QList<QByteArray> replaced;
    // All rows are read before the next statement runs over the connection.
    {
        SqlRows rows = mConnection.ask("SELECT file.path, file.sop_uid, series.study_id, study.uid FROM file"
                                       " JOIN series ON series.id = file.series_id"
                                       " JOIN study ON study.id = series.study_id"
                                       " WHERE file.kind = 1 AND file.is_shown = 1 AND file.sop_uid <> ''"
                                       " AND file.sop_uid IN (" +
                                           repeated("?", uids.size()) + ") ORDER BY file.path",
                                       uids);
        while (rows.next()) {
            Entry other;
            other.path = rows.bytes(0);
            // Its row is about to be overwritten, so it counts as the entry of the same path and not as
            // another file.
            const bool isTakenAnew = std::any_of(entries.begin(), entries.end(),
                                                 [&](const Entry& each) { return each.path == other.path; });
            if (isTakenAnew)
                continue;
            other.studyUID = rows.text(3);
            other.studyId = rows.number(2);
            for (const Entry* entry : byImage.value(rows.text(1))) {
                tellConflict(*entry, other);
                if (entry->studyId == other.studyId)
                    replaced.append(other.path);
            }
        }
    }
    for (const QByteArray& path : qAsConst(replaced))
        mConnection.change("UPDATE file SET is_shown = 0 WHERE path = ?", {bytesValue(path)});
}

void FileRegistration::tellConflict(const Entry& entry, const Entry& other)
{
    const auto kind =
        entry.studyId == other.studyId ? FileConflict::Kind::Replaces : FileConflict::Kind::AlsoInOtherStudy;
    mOutcome->conflicts.push_back(
        {kind, entry.path, entry.sopUID, entry.studyUID, other.path, other.studyUID});
}

void FileRegistration::place(Entry& entry)
{
    KeptNode& study = knownStudy(entry.studyUID);
    KeptNode& series = knownSeries(study.id, entry.seriesUID);
    mTouched.insert(study.id);
    // The first file that says something of them; what the built tag file shows takes its place later.
    if (entry.attributes && !study.isDescribed) {
        describeStudy(mConnection, study.id, *entry.attributes);
        study.isDescribed = true;
    }
    if (entry.attributes && !series.isDescribed) {
        describeSeries(mConnection, series.id, *entry.attributes);
        series.isDescribed = true;
    }
    entry.studyId = study.id;
    entry.seriesId = series.id;
}

KeptNode& FileRegistration::knownStudy(const QByteArray& uid)
{
    KeptNode& study = mStudies[uid];
    if (study.id == 0)
        study = obtainStudy(mConnection, uid);
    return study;
}

KeptNode& FileRegistration::knownSeries(qint64 studyId, const QByteArray& uid)
{
    KeptNode& series = mSeries[{studyId, uid}];
    if (series.id == 0)
        series = obtainSeries(mConnection, studyId, uid);
    return series;
}

}  // namespace Kxg
