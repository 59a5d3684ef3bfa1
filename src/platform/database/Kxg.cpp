#include "platform/database/Kxg.h"

#include "platform/base/LogFile.h"
#include "platform/database/CorrectionRows.h"
#include "platform/database/QuestionConnection.h"
#include "platform/database/SqlConnection.h"
#include "platform/database/StudyContent.h"
#include "platform/database/StudyListing.h"
#include "platform/os/FileStatus.h"
#include "platform/volumefile/VolumeFileName.h"

#include <QHash>

#include <algorithm>
#include <set>

namespace Kxg
{
namespace
{

struct StudyFiles
{
    std::vector<std::string> dicom;
    QVector<QByteArray> volumes;       // in the order of their parts
    std::set<std::string> withVolume;  // series, in the order of their bytes
};

/// All in the caller's transaction, so that the lists belong together whatever is registered meanwhile.
StudyFiles readFiles(SqlConnection& connection, int studyId)
{
    StudyFiles files;
    for (const ListedImage& image : listImages(connection, studyId))
        files.dicom.push_back(image.path.toStdString());
    const std::vector<ListedVolume> volumes = listVolumes(connection, studyId);
    files.volumes = pathsOf(volumes);
    for (const ListedVolume& volume : volumes)
        files.withVolume.insert(volume.seriesInstanceUID.toStdString());
    // The database orders by bytes and knows nothing of part numbers.
    std::sort(files.volumes.begin(), files.volumes.end(), Kdd::isEarlierPart);
    // Without files it is about to be forgotten.
    if (files.dicom.empty() && files.volumes.empty())
        throw DatabaseError(QStringLiteral("there is no study of id %1").arg(studyId));
    return files;
}

DicomDirectoryEntry seriesEntry(const SqlRows& rows, const QByteArray& studyUID)
{
    DicomDirectoryEntry series;
    series.type = DicomDirectoryEntry::SeriesEntry;
    series.studyInstanceUID = studyUID;
    series.seriesInstanceUID = rows.text(0);
    series.seriesNumber = rows.text(1);
    series.seriesDescription = rows.text(2);
    series.modality = rows.text(3);
    series.seriesDate = rows.text(4);
    series.seriesTime = rows.text(5);
    series.stationName = rows.text(6);
    return series;
}

DicomDirectoryEntry volumeEntry(const DicomDirectoryEntry& series, const QByteArray& path)
{
    DicomDirectoryEntry file;
    file.type = DicomDirectoryEntry::VolumeFile;
    file.flags = DicomDirectoryEntry::HasVolume;
    // The directory shows names; the path itself is asked for with the files of the study.
    file.name = path.mid(path.lastIndexOf('/') + 1);
    file.studyInstanceUID = series.studyInstanceUID;
    file.seriesInstanceUID = series.seriesInstanceUID;
    return file;
}

void readSeries(SqlConnection& connection, qint64 studyId, DicomDirectoryEntry& study)
{
    SqlRows rows =
        connection.ask("SELECT uid, series_number, series_description, modality, series_date, series_time,"
                       " station_name FROM series WHERE study_id = ? ORDER BY uid",
                       {studyId});
    while (rows.next())
        study.entries.push_back(seriesEntry(rows, study.studyInstanceUID));
}

void readVolumes(SqlConnection& connection, qint64 studyId, DicomDirectoryEntry& study)
{
    QHash<QByteArray, DicomDirectoryEntry*> bySeries;
    // The list of series does not grow from here on, so the places in it stay.
    for (DicomDirectoryEntry& series : study.entries)
        bySeries.insert(series.seriesInstanceUID, &series);
    for (const ListedVolume& volume : listVolumes(connection, studyId))
        if (DicomDirectoryEntry* series = bySeries.value(volume.seriesInstanceUID))
            series->entries.push_back(volumeEntry(*series, volume.path));
    // Equal names in different folders keep the order of their paths.
    for (DicomDirectoryEntry& series : study.entries)
        std::stable_sort(series.entries.begin(), series.entries.end(),
                         [](const auto& a, const auto& b) { return Kdd::isEarlierPart(a.name, b.name); });
}

}  // namespace

Kdd::Result GetAllFilesOfStudy(const QByteArray& user, int studyId, std::vector<std::string>& dicomFiles,
                               std::vector<std::string>& volumeFiles, std::vector<std::string>& seriesUIDs)
{
    return askDatabase([&](SqlConnection& connection) {
        noteUser(connection, user);
        StudyFiles files = readFiles(connection, studyId);
        dicomFiles.swap(files.dicom);
        volumeFiles.clear();
        for (const QByteArray& path : qAsConst(files.volumes))
            volumeFiles.push_back(path.toStdString());
        seriesUIDs.assign(files.withVolume.begin(), files.withVolume.end());
    });
}

Kdd::Result GetCorrections(int studyId, QByteArray& studyUID, std::vector<ImageCorrection>& corrections,
                           std::vector<std::string>& foreignVolumes)
{
    return askDatabase([&](SqlConnection& connection) {
        QByteArray uid;
        {
            // Read to its end before the next question is asked over the connection.
            SqlRows study = connection.ask("SELECT uid FROM study WHERE id = ?", {studyId});
            if (study.next())
                uid = study.text(0);
        }
        std::vector<std::string> foreign;
        // Shared with a series of this study, while its own series belongs to another one.
        SqlRows rows = connection.ask("SELECT DISTINCT file.path FROM series JOIN volume_share"
                                      " ON volume_share.series_id = series.id"
                                      " JOIN file ON file.path = volume_share.path"
                                      " JOIN series home ON home.id = file.series_id"
                                      " WHERE series.study_id = ? AND home.study_id <> ? ORDER BY file.path",
                                      {studyId, studyId});
        while (rows.next())
            foreign.push_back(rows.bytes(0).toStdString());
        corrections = uid.isEmpty() ? std::vector<ImageCorrection>() : correctionsOf(connection, uid);
        studyUID = uid;
        foreignVolumes.swap(foreign);
    });
}

Kdd::Result GetStudy(const QByteArray& studyUID, std::shared_ptr<DicomDirectoryEntry>& study)
{
    study.reset();
    return askDatabase([&](SqlConnection& connection) {
        const qint64 studyId = findStudyId(connection, studyUID);
        if (studyId == 0)
            return;
        const auto entry = std::make_shared<DicomDirectoryEntry>();
        entry->studyInstanceUID = studyUID;
        readSeries(connection, studyId, *entry);
        // Without files it is about to be forgotten.
        if (entry->entries.empty())
            return;
        readVolumes(connection, studyId, *entry);
        study = entry;
    });
}

Kdd::Result GetSeries(const QByteArray& studyUID, QMap<QByteArray, std::shared_ptr<SeriesInfo>>& series)
{
    return askDatabase([&](SqlConnection& connection) {
        QMap<QByteArray, std::shared_ptr<SeriesInfo>> found;
        for (const ListedImage& image : listImages(connection, findStudyId(connection, studyUID))) {
            std::shared_ptr<SeriesInfo>& info = found[image.seriesInstanceUID];
            if (!info) {
                info = std::make_shared<SeriesInfo>();
                info->seriesInstanceUID = image.seriesInstanceUID;
            }
            info->images.push_back({image.sopInstanceUID, image.path});
        }
        series.swap(found);
    });
}

bool IsDamagedFile(const char* path)
{
    Kdd::FileStatus status;
    // Without a database no file was taken with tolerance.
    if (DatabaseServer().isEmpty() || !Kdd::statusOf(path, status))
        return false;
    bool isDamaged = false;
    const Kdd::Result result = askDatabase([&](SqlConnection& connection) {
        // Size and time must be those of now, because a file that has changed is read strictly again.
        SqlRows rows = connection.ask(
            "SELECT 1 FROM file WHERE path = ? AND size = ? AND modified = ? AND is_damaged = 1",
            {bytesValue(path), status.size, status.modified});
        isDamaged = rows.next();
    });
    return result.good() && isDamaged;
}

QByteArray GetGlobalConfig(const QByteArray& section, const QByteArray& key, const QByteArray& fallback)
{
    QByteArray value = fallback;
    // A program that works without a database has nothing to be warned of.
    if (DatabaseServer().isEmpty())
        return value;
    const Kdd::Result result = askDatabase([&](SqlConnection& connection) {
        SqlRows rows = connection.ask("SELECT value FROM config WHERE section = ? AND name = ?",
                                      {textValue(section), textValue(key)});
        if (rows.next())
            value = rows.bytes(0);
    });
    if (result.bad())
        Kdd::LogFile::warnf("Cannot read configuration value %s/%s, \"%s\" is taken: %s", section.constData(),
                            key.constData(), fallback.constData(), qUtf8Printable(result.text()));
    return value;
}

}  // namespace Kxg
