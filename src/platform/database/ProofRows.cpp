#include "platform/database/ProofRows.h"

#include "platform/database/SqlConnection.h"
#include "platform/database/StudyContent.h"
#include "platform/database/StudyProofs.h"

namespace Kxg
{

void keepFormerTagFile(SqlConnection& connection, qint64 studyId, const TagFileStamp& next)
{
    TagFileStamp last;
    {
        SqlRows rows =
            connection.ask("SELECT tag_file_size, tag_file_digest FROM study WHERE id = ?", {studyId});
        if (rows.next())
            last = {rows.number(0), rows.bytes(1)};
    }
    if (last.digest.isEmpty() || last == next)
        return;
    connection.change("INSERT INTO former_tag_file (study_id, size, digest) VALUES (?, ?, ?)",
                      {studyId, last.size, bytesValue(last.digest)});
    connection.change(
        "DELETE FROM former_tag_file WHERE study_id = ? AND id <= (SELECT id FROM former_tag_file"
        " WHERE study_id = ? ORDER BY id DESC LIMIT 1 OFFSET ?)",
        {studyId, studyId, kMostFormerTagFiles});
}

/// Size and time of the tag file are those of the rows that searches ask, as long as these speak of the same one.
qint64 readTagFileProofs(SqlConnection& connection, const QByteArray& studyUID, TagFileProofs& proofs)
{
    SqlRows rows = connection.ask(
        "SELECT study.id, tag_file_size, tag_file_digest,"
        " EXISTS (SELECT 1 FROM build_request WHERE study_id = study.id AND due <= ?),"
        " EXISTS (SELECT 1 FROM series JOIN file ON file.series_id = series.id"
        " WHERE series.study_id = study.id AND file.kind = 1),"
        " found.digest, found.file_size, found.file_modified"
        " FROM study LEFT JOIN study_search found ON found.study_id = study.id WHERE study.uid = ?",
        {presentMs(), textValue(studyUID)});
    proofs.isThere = rows.next();
    if (!proofs.isThere)
        return 0;
    proofs.last = {rows.number(1), rows.bytes(2)};
    proofs.isWaiting = rows.truth(3);
    proofs.hasImages = rows.truth(4);
    if (rows.bytes(5) == proofs.last.digest) {
        proofs.last.fileSize = rows.number(6);
        proofs.last.modified = rows.number(7);
    }
    return rows.number(0);
}

}  // namespace Kxg
