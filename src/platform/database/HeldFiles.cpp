#include "platform/database/HeldFiles.h"

#include "platform/database/QuestionConnection.h"
#include "platform/database/SqlConnection.h"

namespace Kxg
{
namespace
{

/// Of whose files one question asks.
constexpr int kImagesAtOnce = 100;

const char kFrom[] = ", file.path, file.size, study.uid, file.sop_uid FROM file"
                     " JOIN series ON series.id = file.series_id JOIN study ON study.id = series.study_id ";

/// For so many images.
QByteArray questionFor(const char* ownUID, const char* condition)
{
    return "SELECT " + QByteArray(ownUID) + kFrom + condition + " IN (?" +
           QByteArray(", ?").repeated(kImagesAtOnce - 1) + ") AND file.kind = 1 AND file.is_shown = 1";
}

void ask(SqlConnection& connection, const QByteArray& question, const QVariantList& uids,
         std::vector<HeldFile>& found)
{
    SqlRows rows = connection.ask(question, uids);
    while (rows.next())
        found.push_back({rows.text(0), rows.bytes(1), rows.number(2), rows.text(3), rows.text(4)});
}

}  // namespace

Kdd::Result heldFiles(const QList<QByteArray>& sopUIDs, std::vector<HeldFile>& files)
{
    static const QByteArray kUncorrected =
        questionFor("file.sop_uid", "WHERE file.correction_id IS NULL AND file.sop_uid");
    static const QByteArray kCorrected = questionFor(
        "correction.image", "JOIN correction ON correction.id = file.correction_id WHERE correction.image");
    return askDatabase([&](SqlConnection& connection) {
        std::vector<HeldFile> found;
        for (int from = 0; from < sopUIDs.size(); from += kImagesAtOnce) {
            QVariantList texts;
            QVariantList bytes;
            for (int i = from; i < from + kImagesAtOnce; ++i) {
                const QByteArray& uid = sopUIDs.at(qMin(i, sopUIDs.size() - 1));
                texts << textValue(uid);
                bytes << bytesValue(uid);
            }
            ask(connection, kUncorrected, texts, found);
            ask(connection, kCorrected, bytes, found);
        }
        files.swap(found);
    });
}

}  // namespace Kxg
