#include "platform/database/StudyListing.h"

#include "platform/database/SqlConnection.h"

namespace Kxg
{

std::vector<ListedImage> listImages(SqlConnection& connection, qint64 studyId)
{
    std::vector<ListedImage> images;
    SqlRows rows = connection.ask("SELECT file.path, series.uid, file.sop_uid FROM series"
                                  " JOIN file ON file.series_id = series.id"
                                  " WHERE series.study_id = ? AND file.kind = 1 AND file.is_shown = 1"
                                  " ORDER BY file.path",
                                  {studyId});
    while (rows.next())
        images.push_back({rows.bytes(0), rows.text(1), rows.text(2)});
    return images;
}

std::vector<ListedVolume> listVolumes(SqlConnection& connection, qint64 studyId)
{
    std::vector<ListedVolume> volumes;
    SqlRows rows = connection.ask("SELECT file.path AS path, series.uid FROM series"
                                  " JOIN file ON file.series_id = series.id"
                                  " WHERE series.study_id = ? AND file.kind = 2"
                                  // And what corrections brought along: volumes of other series with images
                                  // that stand here now.
                                  " UNION SELECT volume_share.path AS path, series.uid FROM series"
                                  " JOIN volume_share ON volume_share.series_id = series.id"
                                  " WHERE series.study_id = ? ORDER BY path",
                                  {studyId, studyId});
    while (rows.next())
        volumes.push_back({rows.bytes(0), rows.text(1)});
    return volumes;
}

QVector<QByteArray> pathsOf(const std::vector<ListedVolume>& volumes)
{
    QVector<QByteArray> paths;
    for (const ListedVolume& volume : volumes) {
        // A file that several series share is listed for each, in a row, since the order is by path.
        if (paths.isEmpty() || paths.last() != volume.path)
            paths.append(volume.path);
    }
    return paths;
}

}  // namespace Kxg
