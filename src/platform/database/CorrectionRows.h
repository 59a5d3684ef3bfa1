#pragma once

#include "platform/database/Catalogue.h"

namespace Kxg
{

class SqlConnection;

// Corrections of images in the database. Call within a transaction; failures throw DatabaseError.

/// Keeps one correction and lists the files of its image where it is shown now. `touched` receives the ids of the
/// studies that change.
void recordCorrection(SqlConnection& connection, const ImageCorrection& correction, QSet<qint64>& touched);

/// Of images that are or were in the study.
std::vector<ImageCorrection> correctionsOf(SqlConnection& connection, const QByteArray& studyUID);

/// A correction with the number under which it is kept.
struct KeptCorrection
{
    ImageCorrection correction;
    qint64 id = 0;
};

/// Of images by what their files say of them: SOP Instance UIDs, or paths where there is none.
std::vector<KeptCorrection> correctionsOfImages(SqlConnection& connection, const QList<QByteArray>& images);

/// Whether there is any correction at all: in most archives there are none or few.
bool hasCorrections(SqlConnection& connection);

}  // namespace Kxg
