#pragma once

#include "platform/database/Catalogue.h"

namespace Kxg
{

class SqlConnection;

// The files of a study as they are listed. Call within a transaction; failures throw DatabaseError.

/// The images of a study, by path: of several files of one image the one that is shown.
std::vector<ListedImage> listImages(SqlConnection& connection, qint64 studyId);

struct ListedVolume
{
    QByteArray path;
    QByteArray seriesInstanceUID;
};

/// The volume files of a study's series, and those that hold images which a correction brought here, by path.
std::vector<ListedVolume> listVolumes(SqlConnection& connection, qint64 studyId);

/// Each file once, although several series may have it.
QVector<QByteArray> pathsOf(const std::vector<ListedVolume>& volumes);

}  // namespace Kxg
