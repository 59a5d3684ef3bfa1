#include "platform/database/SearchRows.h"

#include "platform/database/SearchText.h"
#include "platform/database/SqlConnection.h"
#include "platform/database/StudyMarks.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QSet>

#include <algorithm>
#include <limits>

namespace Kxg
{
namespace
{

/// A series without number comes last.
constexpr qint64 kNoNumber = std::numeric_limits<qint32>::max();

// A server takes no more than 2,700 bytes into an index, all columns together. What is longer than DICOM allows by far is
// found by its beginning, instead of keeping its study out of the archive.
constexpr int kMostIndexed = 1000;  // [bytes]

QVariant indexedValue(const QByteArray& text)
{
    return textValue(text.left(kMostIndexed));
}

QByteArray words(const QByteArray& text)
{
    return searchText(QString::fromUtf8(text));
}

QByteArray names(const QByteArray& text)
{
    return searchName(QString::fromUtf8(text));
}

qint64 numberOf(const QByteArray& text)
{
    bool isNumber = false;
    const int number = text.trimmed().toInt(&isNumber);
    return isNumber ? number : kNoNumber;
}

/// "007" is the number 7.
QByteArray numberText(const QByteArray& text)
{
    const qint64 number = numberOf(text);
    return number == kNoNumber ? QByteArray() : QByteArray::number(number);
}

QList<QByteArray> modalitiesOf(const StudySearchRecord& study)
{
    QSet<QByteArray> found;
    // A series that names several is of each: answers list them one by one.
    for (const SeriesSearchRecord& series : study.series) {
        for (const QByteArray& each : series.modality.split('\\')) {
            if (!each.trimmed().isEmpty())
                found.insert(each.trimmed().left(kMostIndexed));
        }
    }
    QList<QByteArray> sorted = found.values();
    std::sort(sorted.begin(), sorted.end());
    return sorted;
}

void putSeries(SqlConnection& connection, qint64 studyId, const SeriesSearchRecord& series)
{
    connection.change("INSERT INTO series_search (study_id, uid, modality, series_number, number_text,"
                      " description, performed_date, performed_time, instance_count, attributes)"
                      " VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
                      {studyId, textValue(series.uid), textValue(series.modality), numberOf(series.number),
                       textValue(numberText(series.number)), textValue(words(series.description)),
                       textValue(series.performedDate), textValue(series.performedTime), series.instances,
                       bytesValue(series.attributes)});
    for (const auto& request : series.requests)
        connection.change(
            "INSERT INTO series_request (study_id, uid, scheduled_step, requested_procedure)"
            " VALUES (?, ?, ?, ?)",
            {studyId, textValue(series.uid), indexedValue(request.first), indexedValue(request.second)});
}

void put(SqlConnection& connection, qint64 studyId, const StudySearchRecord& study,
         const TagFileStamp& tagFile, bool isBuilt)
{
    removeSearchRows(connection, studyId);
    const QList<QByteArray> modalities = modalitiesOf(study);
    qint64 instances = 0;
    for (const SeriesSearchRecord& series : study.series)
        instances += series.instances;
    if (connection.change(
            "INSERT INTO study_search (study_id, uid, is_built, file_size, file_modified, digest,"
            " study_date, study_time, accession_number, patient_id, patient_birth_date,"
            " patient_sex, study_code, sort_name, name_words, modalities, marks,"
            " series_count, instance_count)"
            " SELECT id, uid, CAST(? AS SMALLINT), CAST(? AS BIGINT), CAST(? AS BIGINT), ?, ?, ?,"
            " ?, ?, ?, ?, ?, ?, ?, ?, ?, CAST(? AS BIGINT), CAST(? AS BIGINT) FROM study WHERE id = ?",
            {isBuilt ? 1 : 0, tagFile.fileSize, tagFile.modified, bytesValue(tagFile.digest),
             textValue(study.date), textValue(study.time), indexedValue(study.accessionNumber),
             indexedValue(study.patientID), textValue(study.patientBirthDate), textValue(study.patientSex),
             indexedValue(study.studyID), indexedValue(sortName(QString::fromUtf8(study.patientName))),
             indexedValue(names(study.patientName)), textValue(modalities.join('\\')),
             textValue(marksOf(study)), static_cast<qint64>(study.series.size()), instances, studyId}) == 0)
        return;
    connection.change("INSERT INTO study_answer (study_id, attributes) VALUES (?, ?)",
                      {studyId, bytesValue(study.attributes)});
    connection.change(
        "INSERT INTO study_words (study_id, patient_name, referring_physician, description, patient_id,"
        " accession_number, study_code) VALUES (?, ?, ?, ?, ?, ?, ?)",
        {studyId, textValue(names(study.patientName)), textValue(names(study.referringPhysician)),
         textValue(words(study.description)), textValue(words(study.patientID)),
         textValue(words(study.accessionNumber)), textValue(words(study.studyID))});
    for (const QByteArray& modality : modalities)
        connection.change(
            "INSERT INTO study_modality (modality, study_date, study_time, uid, study_id, name_words, marks)"
            " SELECT CAST(? AS TEXT), study_date, study_time, uid, study_id, name_words, marks"
            " FROM study_search WHERE study_id = ?",
            {textValue(modality), studyId});
    for (const SeriesSearchRecord& series : study.series)
        putSeries(connection, studyId, series);
}

// ---- studies that are registered only

/// Attributes of one level as answers show them, from texts.
class Lines
{
public:
    void add(const char* key, const char* vr, const QByteArray& value)
    {
        if (value.isEmpty())
            return;
        QJsonArray values;
        const QString text = QString::fromUtf8(value);
        if (qstrcmp(vr, "PN") == 0)
            values.append(nameOf(text));
        else if (qstrcmp(vr, "IS") == 0)
            values.append(text.toInt());
        else
            values.append(text);
        const QJsonObject element{{QStringLiteral("vr"), QLatin1String(vr)},
                                  {QStringLiteral("Value"), values}};
        mText += key + QJsonDocument(element).toJson(QJsonDocument::Compact) + '\n';
    }

    const QByteArray& text() const { return mText; }

private:
    static QJsonObject nameOf(const QString& text)
    {
        static const char* const kGroups[] = {"Alphabetic", "Ideographic", "Phonetic"};
        const QStringList groups = text.split(QLatin1Char('='));
        QJsonObject name;
        for (int i = 0; i < qMin(groups.size(), 3); ++i) {
            if (!groups.at(i).isEmpty())
                name.insert(QLatin1String(kGroups[i]), groups.at(i));
        }
        return name;
    }

    QByteArray mText;
};

StudySearchRecord registeredStudy(SqlConnection& connection, qint64 studyId)
{
    StudySearchRecord study;
    SqlRows rows = connection.ask("SELECT uid, patient_name, patient_id, patient_birth_date, patient_sex,"
                                  " study_date, study_time, study_description, accession_number FROM study"
                                  " WHERE id = ?",
                                  {studyId});
    if (!rows.next())
        return study;
    study.patientName = rows.text(1);
    study.patientID = rows.text(2);
    study.patientBirthDate = searchDate(rows.text(3));
    study.patientSex = rows.text(4);
    study.date = searchDate(rows.text(5));
    study.time = searchTime(rows.text(6));
    study.description = rows.text(7);
    study.accessionNumber = rows.text(8);
    Lines lines;
    lines.add("00080020", "DA", rows.text(5));
    lines.add("00080030", "TM", rows.text(6));
    lines.add("00080050", "SH", study.accessionNumber);
    lines.add("00081030", "LO", study.description);
    lines.add("00100010", "PN", study.patientName);
    lines.add("00100020", "LO", study.patientID);
    lines.add("00100030", "DA", rows.text(3));
    lines.add("00100040", "CS", study.patientSex);
    lines.add("0020000D", "UI", rows.text(0));
    study.attributes = lines.text();
    return study;
}

void addRegisteredSeries(SqlConnection& connection, qint64 studyId, StudySearchRecord& study)
{
    SqlRows rows = connection.ask("SELECT series.uid, series.modality, series.series_number,"
                                  " series.series_description, series.series_date, series.series_time,"
                                  " (SELECT COUNT(*) FROM file WHERE file.series_id = series.id"
                                  " AND file.kind = 1 AND file.is_shown = 1), study.uid"
                                  " FROM series JOIN study ON study.id = series.study_id"
                                  " WHERE series.study_id = ? ORDER BY series.uid",
                                  {studyId});
    while (rows.next()) {
        SeriesSearchRecord series;
        series.uid = rows.text(0);
        series.modality = rows.text(1);
        series.number = rows.text(2);
        series.description = rows.text(3);
        series.instances = static_cast<int>(rows.number(6));
        Lines lines;
        lines.add("00080021", "DA", rows.text(4));
        lines.add("00080031", "TM", rows.text(5));
        lines.add("00080060", "CS", series.modality);
        lines.add("0008103E", "LO", series.description);
        lines.add("0020000D", "UI", rows.text(7));
        lines.add("0020000E", "UI", series.uid);
        if (numberOf(series.number) != kNoNumber)
            lines.add("00200011", "IS", series.number);
        series.attributes = lines.text();
        study.series.push_back(series);
    }
}

}  // namespace

SearchRowState searchRowOf(SqlConnection& connection, qint64 studyId)
{
    SqlRows rows = connection.ask("SELECT is_built, file_size, file_modified, digest, instance_count"
                                  " FROM study_search WHERE study_id = ?",
                                  {studyId});
    if (!rows.next())
        return {};
    SearchRowState state;
    state.isThere = true;
    state.isBuilt = rows.truth(0);
    state.tagFile.fileSize = rows.number(1);
    state.tagFile.modified = rows.number(2);
    state.tagFile.digest = rows.bytes(3);
    state.instances = static_cast<int>(rows.number(4));
    return state;
}

namespace
{

/// Whether the rows describe the study and the same series as the record does; counts apart.
bool isDescribedAs(SqlConnection& connection, qint64 studyId, const StudySearchRecord& study)
{
    {
        SqlRows answer = connection.ask("SELECT attributes FROM study_answer WHERE study_id = ?", {studyId});
        if (!answer.next() || answer.bytes(0) != study.attributes)
            return false;
    }
    std::size_t at = 0;
    SqlRows rows = connection.ask("SELECT uid, attributes FROM series_search WHERE study_id = ? ORDER BY uid",
                                  {studyId});
    while (rows.next()) {
        if (at == study.series.size() || rows.text(0) != study.series[at].uid ||
            rows.bytes(1) != study.series[at].attributes)
            return false;
        ++at;
    }
    return at == study.series.size();
}

void putCounts(SqlConnection& connection, qint64 studyId, const StudySearchRecord& study)
{
    qint64 instances = 0;
    for (const SeriesSearchRecord& series : study.series) {
        instances += series.instances;
        connection.change("UPDATE series_search SET instance_count = ? WHERE study_id = ? AND uid = ?"
                          " AND instance_count <> ?",
                          {series.instances, studyId, textValue(series.uid), series.instances});
    }
    connection.change("UPDATE study_search SET instance_count = ? WHERE study_id = ?", {instances, studyId});
}

}  // namespace

void putSearchRows(SqlConnection& connection, qint64 studyId, const StudySearchRecord& study,
                   const TagFileStamp& tagFile)
{
    put(connection, studyId, study, tagFile, true);
}

void putRegisteredRows(SqlConnection& connection, qint64 studyId)
{
    const SearchRowState state = searchRowOf(connection, studyId);
    if (state.isBuilt)
        return;
    StudySearchRecord study = registeredStudy(connection, studyId);
    addRegisteredSeries(connection, studyId, study);
    if (study.series.empty())
        removeSearchRows(connection, studyId);
    // Of a study that arrives image by image nothing else changes, and its words are the dearest part.
    else if (state.isThere && isDescribedAs(connection, studyId, study))
        putCounts(connection, studyId, study);
    else
        put(connection, studyId, study, {}, false);
}

void putMarks(SqlConnection& connection, qint64 studyId)
{
    StudySearchRecord study;
    {
        SqlRows answer = connection.ask("SELECT attributes FROM study_answer WHERE study_id = ?", {studyId});
        if (answer.next())
            study.attributes = answer.bytes(0);
    }
    {
        SqlRows rows = connection.ask("SELECT attributes FROM series_search WHERE study_id = ?", {studyId});
        while (rows.next()) {
            study.series.emplace_back();
            study.series.back().attributes = rows.bytes(0);
        }
    }
    const QVariant marks = textValue(marksOf(study));
    connection.change("UPDATE study_search SET marks = ? WHERE study_id = ?", {marks, studyId});
    connection.change("UPDATE study_modality SET marks = ? WHERE study_id = ?", {marks, studyId});
}

void removeSearchRows(SqlConnection& connection, qint64 studyId)
{
    // What hangs below goes with it, but for the words: of what goes that way the index of parts is not told.
    connection.change("DELETE FROM study_words WHERE study_id = ?", {studyId});
    connection.change("DELETE FROM study_search WHERE study_id = ?", {studyId});
}

}  // namespace Kxg
