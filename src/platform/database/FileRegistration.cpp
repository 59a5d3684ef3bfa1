#include "platform/database/FileRegistration.h"

#include "platform/database/SqlConnection.h"
#include "platform/database/StudyContent.h"

#include <algorithm>

namespace Kxg
{
namespace
{

// A server answers a statement for many files in nearly the time of one for a single file. Files that are too few for
// that are taken one by one, so that there are two texts of each statement and not one for every number of files.
constexpr int kFilesAtOnce = 100;

struct Attribute
{
    const char* column;
    QByteArray DicomFileRecord::*value;
};

const Attribute kStudyAttributes[] = {
    {"patient_name", &DicomFileRecord::patientName},
    {"patient_id", &DicomFileRecord::patientID},
    {"patient_birth_date", &DicomFileRecord::patientBirthDate},
    {"patient_sex", &DicomFileRecord::patientSex},
    {"study_date", &DicomFileRecord::studyDate},
    {"study_time", &DicomFileRecord::studyTime},
    {"study_description", &DicomFileRecord::studyDescription},
    {"accession_number", &DicomFileRecord::accessionNumber},
};

const Attribute kSeriesAttributes[] = {
    {"series_number", &DicomFileRecord::seriesNumber},
    {"series_description", &DicomFileRecord::seriesDescription},
    {"modality", &DicomFileRecord::modality},
    {"series_date", &DicomFileRecord::seriesDate},
    {"series_time", &DicomFileRecord::seriesTime},
    {"station_name", &DicomFileRecord::stationName},
};

template <size_t n>
QByteArray describing(const char* table, const Attribute (&attributes)[n])
{
    QByteArray sql = QByteArray("UPDATE ") + table + " SET is_described = 1";
    for (const Attribute& attribute : attributes)
        sql += QByteArray(", ") + attribute.column + " = ?";
    return sql + " WHERE id = ?";
}

template <size_t n>
QVariantList description(const DicomFileRecord& record, const Attribute (&attributes)[n], qint64 id)
{
    QVariantList values;
    for (const Attribute& attribute : attributes)
        values << textValue(record.*attribute.value);
    return values << id;
}

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

void FileRegistration::run(const FileRecords& files, QMap<QByteArray, qint64>& requests)
{
    const std::vector<Entry> entries = inOrder(files);
    for (auto from = entries.begin(); from != entries.end();) {
        const auto to = entries.end() - from >= kFilesAtOnce ? from + kFilesAtOnce : from + 1;
        put({from, to});
        from = to;
    }
    QList<qint64> touched = mTouched.values();
    std::sort(touched.begin(), touched.end());
    for (const qint64 studyId : qAsConst(touched))
        concludeChange(mConnection, studyId, requests);
}

void FileRegistration::put(const std::vector<Entry>& entries)
{
    noteFormerStudies(entries);
    QVariantList values;
    for (const Entry& entry : entries) {
        const QVariant series =
            entry.kind == FileKind::Other ? QVariant(QVariant::LongLong) : obtainSeries(entry);
        values << bytesValue(entry.path) << entry.stamp.size << entry.stamp.modified
               << static_cast<int>(entry.kind) << series << textValue(entry.sopUID)
               << static_cast<int>(entry.attributes && entry.attributes->isDamaged);
    }
    mConnection.change(
        "INSERT INTO file (path, size, modified, kind, series_id, sop_uid, is_damaged) VALUES " +
            repeated("(?, ?, ?, ?, ?, ?, ?)", static_cast<int>(entries.size())) +
            " ON CONFLICT (path) DO UPDATE SET size = excluded.size, modified = excluded.modified,"
            " kind = excluded.kind, series_id = excluded.series_id, sop_uid = excluded.sop_uid,"
            " is_damaged = excluded.is_damaged",
        values);
}

void FileRegistration::noteFormerStudies(const std::vector<Entry>& entries)
{
    QVariantList paths;
    for (const Entry& entry : entries)
        paths << bytesValue(entry.path);
    SqlRows rows =
        mConnection.ask("SELECT DISTINCT series.study_id FROM file JOIN series ON series.id = file.series_id"
                        " WHERE file.path IN (" +
                            repeated("?", paths.size()) + ")",
                        paths);
    while (rows.next())
        mTouched.insert(rows.number(0));
}

qint64 FileRegistration::obtainSeries(const Entry& entry)
{
    static const QByteArray kDescribeStudy = describing("study", kStudyAttributes);
    static const QByteArray kDescribeSeries = describing("series", kSeriesAttributes);
    Known& study = obtainStudy(entry.studyUID);
    Known& series = obtainSeries(study.id, entry.seriesUID);
    mTouched.insert(study.id);
    if (entry.attributes && !study.isDescribed) {
        mConnection.change(kDescribeStudy, description(*entry.attributes, kStudyAttributes, study.id));
        study.isDescribed = true;
    }
    if (entry.attributes && !series.isDescribed) {
        mConnection.change(kDescribeSeries, description(*entry.attributes, kSeriesAttributes, series.id));
        series.isDescribed = true;
    }
    return series.id;
}

FileRegistration::Known& FileRegistration::obtainStudy(const QByteArray& uid)
{
    Known& study = mStudies[uid];
    if (study.id != 0)
        return study;
    const QVariant text = textValue(uid);
    SqlRows found = mConnection.ask("SELECT id, is_described FROM study WHERE uid = ?", {text});
    if (found.next()) {
        study = {found.number(0), found.number(1) != 0};
    } else {
        SqlRows made = mConnection.ask("INSERT INTO study (uid) VALUES (?) RETURNING id", {text});
        if (made.next())
            study.id = made.number(0);
    }
    return study;
}

FileRegistration::Known& FileRegistration::obtainSeries(qint64 studyId, const QByteArray& uid)
{
    Known& series = mSeries[{studyId, uid}];
    if (series.id != 0)
        return series;
    const QVariantList key = {studyId, textValue(uid)};
    SqlRows found =
        mConnection.ask("SELECT id, is_described FROM series WHERE study_id = ? AND uid = ?", key);
    if (found.next()) {
        series = {found.number(0), found.number(1) != 0};
    } else {
        SqlRows made = mConnection.ask("INSERT INTO series (study_id, uid) VALUES (?, ?) RETURNING id", key);
        if (made.next())
            series.id = made.number(0);
    }
    return series;
}

}  // namespace Kxg
