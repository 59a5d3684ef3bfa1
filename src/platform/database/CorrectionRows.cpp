#include "platform/database/CorrectionRows.h"

#include "platform/database/SqlConnection.h"
#include "platform/database/StudyContent.h"

namespace Kxg
{
namespace
{

// In the order in which correctionOf reads them.
const char kColumns[] =
    "SELECT study_uid, image, shown_study_uid, shown_series_uid, shown_image, changes, id FROM correction";

/// Images asked for at once; fewer are filled up, so that the statement has one text only.
constexpr int kImagesAtOnce = 100;

ImageCorrection correctionOf(const SqlRows& rows)
{
    return {rows.text(0), rows.bytes(1), rows.text(2), rows.text(3), rows.bytes(4), rows.bytes(5)};
}

/// Where an image is listed before a correction is kept: where an earlier one put it, else where its file says.
struct Place
{
    QByteArray studyUID;
    QByteArray image;
    qint64 correctionId = 0;  // of the earlier one; 0: there is none
};

Place placeBefore(SqlConnection& connection, const ImageCorrection& correction)
{
    SqlRows rows = connection.ask("SELECT shown_study_uid, shown_image, id FROM correction"
                                  " WHERE study_uid = ? AND image = ?",
                                  {textValue(correction.studyInstanceUID), bytesValue(correction.image)});
    if (rows.next())
        return {rows.text(0), rows.bytes(1), rows.number(2)};
    return {correction.studyInstanceUID, correction.image, 0};
}

struct FileRow
{
    QByteArray path;
    QByteArray sopUID;
    qint64 seriesId = 0;
};

/// The files of the image that a correction is of, in the order in which they were registered. Of others that are
/// listed under the same UID in the same study there may be some: images that stand there by themselves, or that other
/// corrections brought.
std::vector<FileRow> filesOf(SqlConnection& connection, const Place& place, const ImageCorrection& correction)
{
    std::vector<FileRow> files;
    // The first half finds what the earlier correction moved, the second what is listed where its file says.
    SqlRows rows =
        connection.ask("SELECT path, sop_uid, series_id, registered FROM file WHERE correction_id = ?"
                       " UNION ALL SELECT file.path, file.sop_uid, file.series_id, file.registered"
                       " FROM file JOIN series ON series.id = file.series_id"
                       " JOIN study ON study.id = series.study_id"
                       " WHERE study.uid = ? AND file.kind = 1 AND file.correction_id IS NULL"
                       " AND (file.sop_uid = ? OR (file.sop_uid = '' AND file.path = ?))"
                       " ORDER BY registered, path",
                       {place.correctionId, textValue(correction.studyInstanceUID),
                        textValue(correction.image), bytesValue(correction.image)});
    while (rows.next())
        files.push_back({rows.bytes(0), rows.text(1), rows.number(2)});
    return files;
}

QByteArray seriesUIDOf(SqlConnection& connection, qint64 seriesId)
{
    SqlRows rows = connection.ask("SELECT uid FROM series WHERE id = ?", {seriesId});
    return rows.next() ? rows.text(0) : QByteArray();
}

/// The volume files that hold a series' images hold them still when they stand in another series.
void shareVolumes(SqlConnection& connection, qint64 fromSeries, qint64 toSeries)
{
    // A server takes a bare value in a selection for a text, hence the casts. Several images of one series
    // share once.
    connection.change("INSERT INTO volume_share (path, series_id)"
                      " SELECT path, CAST(? AS BIGINT) FROM file WHERE series_id = ? AND kind = 2"
                      " UNION SELECT path, CAST(? AS BIGINT) FROM volume_share WHERE series_id = ?"
                      " ON CONFLICT DO NOTHING",
                      {toSeries, fromSeries, toSeries, fromSeries});
}

/// Where the files of an image are listed from now on.
struct NewPlace
{
    qint64 studyId = 0;
    qint64 seriesId = 0;
    QByteArray sopUID;
    QVariant correctionId;  // of the one that puts them there; null: they say so themselves
};

/// In the order in which they were registered, so that the newest of them goes on being the one that is shown; and
/// later than what the new place had already, which they replace there.
void moveFiles(SqlConnection& connection, const std::vector<FileRow>& files, const NewPlace& place)
{
    const QByteArray& sopUID = place.sopUID;
    // An image without UID stands by its path and replaces none.
    if (!sopUID.isEmpty())
        connection.change("UPDATE file SET is_shown = 0 WHERE sop_uid = ? AND kind = 1 AND series_id IN"
                          " (SELECT id FROM series WHERE study_id = ?)",
                          {textValue(sopUID), place.studyId});
    qint64 number = takeRegistrationNumbers(connection, static_cast<qint64>(files.size()));
    for (const FileRow& file : files) {
        connection.change("UPDATE file SET series_id = ?, sop_uid = ?, registered = ?, is_shown = ?,"
                          " correction_id = ? WHERE path = ?",
                          {place.seriesId, textValue(sopUID), number++,
                           &file == &files.back() || sopUID.isEmpty() ? 1 : 0, place.correctionId,
                           bytesValue(file.path)});
        if (file.seriesId != place.seriesId)
            shareVolumes(connection, file.seriesId, place.seriesId);
    }
}

/// The id of the correction, in place of an earlier one of the image; null when it takes that back.
QVariant keep(SqlConnection& connection, const ImageCorrection& correction)
{
    const QVariantList key = {textValue(correction.studyInstanceUID), bytesValue(correction.image)};
    if (correction.changes.isEmpty()) {
        connection.change("DELETE FROM correction WHERE study_uid = ? AND image = ?", key);
        return QVariant(QVariant::LongLong);
    }
    // The id stays when a correction is replaced: the files that it moved know it by that.
    SqlRows kept = connection.ask(
        "INSERT INTO correction"
        " (study_uid, image, shown_study_uid, shown_series_uid, shown_image, changes)"
        " VALUES (?, ?, ?, ?, ?, ?) ON CONFLICT (study_uid, image) DO UPDATE SET"
        " shown_study_uid = excluded.shown_study_uid,"
        " shown_series_uid = excluded.shown_series_uid,"
        " shown_image = excluded.shown_image, changes = excluded.changes"
        " RETURNING id",
        key + QVariantList{textValue(correction.shownStudyUID), textValue(correction.shownSeriesUID),
                           bytesValue(correction.shownImage), bytesValue(correction.changes)});
    return kept.next() ? QVariant(kept.number(0)) : QVariant(QVariant::LongLong);
}

}  // namespace

void recordCorrection(SqlConnection& connection, const ImageCorrection& correction, QSet<qint64>& touched)
{
    const Place before = placeBefore(connection, correction);
    const QVariant correctionId = keep(connection, correction);
    const qint64 oldStudy = findStudyId(connection, before.studyUID);
    const qint64 newStudy = obtainStudy(connection, correction.shownStudyUID).id;
    touched.insert(newStudy);
    // Nothing is registered of that study. What is kept counts for files that come later.
    if (oldStudy == 0)
        return;
    touched.insert(oldStudy);
    const std::vector<FileRow> files = filesOf(connection, before, correction);
    // The files may stay where they are, but no correction puts them there any more.
    if (correctionId.isNull())
        connection.change("UPDATE file SET correction_id = NULL WHERE correction_id = ?",
                          {before.correctionId});
    if (files.empty())
        return;
    // A correction without a series leaves the image in the series of the same UID, in the new study.
    const qint64 newSeries =
        obtainSeries(connection, newStudy,
                     correction.shownSeriesUID.isEmpty() ? seriesUIDOf(connection, files.back().seriesId)
                                                         : correction.shownSeriesUID)
            .id;
    // What has no UID is known by its path, which no correction changes, until one gives it a UID.
    const QByteArray sopUID =
        correction.shownImage == files.back().path ? QByteArray("") : correction.shownImage;
    const bool staysInPlace =
        oldStudy == newStudy && sopUID == files.back().sopUID && newSeries == files.back().seriesId;
    if (staysInPlace)
        return;
    moveFiles(connection, files, {newStudy, newSeries, sopUID, correctionId});
    // Another image may have stood behind the one that left.
    showNewest(connection, oldStudy, before.image);
}

std::vector<ImageCorrection> correctionsOf(SqlConnection& connection, const QByteArray& studyUID)
{
    const QVariant uid = textValue(studyUID);
    std::vector<ImageCorrection> found;
    SqlRows rows = connection.ask(QByteArray(kColumns) +
                                      " WHERE study_uid = ? OR shown_study_uid = ? ORDER BY study_uid, image",
                                  {uid, uid});
    while (rows.next())
        found.push_back(correctionOf(rows));
    return found;
}

std::vector<KeptCorrection> correctionsOfImages(SqlConnection& connection, const QList<QByteArray>& images)
{
    static const QByteArray kOfImages =
        QByteArray(kColumns) + " WHERE image IN (?" + QByteArray(", ?").repeated(kImagesAtOnce - 1) + ')';
    std::vector<KeptCorrection> found;
    for (int from = 0; from < images.size(); from += kImagesAtOnce) {
        QVariantList values;
        for (int i = from; i < from + kImagesAtOnce; ++i)
            values << bytesValue(images.at(qMin(i, images.size() - 1)));
        SqlRows rows = connection.ask(kOfImages, values);
        while (rows.next())
            found.push_back({correctionOf(rows), rows.number(6)});
    }
    return found;
}

bool hasCorrections(SqlConnection& connection)
{
    return connection.ask("SELECT 1 FROM correction LIMIT 1").next();
}

}  // namespace Kxg
