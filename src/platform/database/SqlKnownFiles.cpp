#include "platform/database/SqlCatalogue.h"

namespace Kxg
{
namespace
{

constexpr int kPathsAtOnce = 200;

QByteArray isOneOfPortion()
{
    return " WHERE path IN (?" + QByteArray(", ?").repeated(kPathsAtOnce - 1) + ')';
}

/// The last portion is filled up, for the text of a statement stays the same.
QVariantList portionOf(const QList<QByteArray>& paths, int from)
{
    QVariantList values;
    for (int i = from; i < from + kPathsAtOnce; ++i)
        values << bytesValue(paths.at(qMin(i, paths.size() - 1)));
    return values;
}

}  // namespace

Kdd::Result SqlCatalogue::dropKnown(QSet<QByteArray>& paths)
{
    const QList<QByteArray> asked = paths.values();
    return transact(Access::Read, [&] {
        QSet<QByteArray> unknown = paths;
        for (int from = 0; from < asked.size(); from += kPathsAtOnce) {
            const QVariantList values = portionOf(asked, from);
            SqlRows rows =
                mConnection.ask("SELECT path FROM file" + isOneOfPortion() +
                                    " UNION ALL SELECT path FROM forgotten_file" + isOneOfPortion(),
                                values + values);
            while (rows.next())
                unknown.remove(rows.bytes(0));
        }
        paths.swap(unknown);
    });
}

Kdd::Result SqlCatalogue::stampsOf(const QList<QByteArray>& paths, QHash<QByteArray, FileStamp>& stamps)
{
    return transact(Access::Read, [&] {
        QHash<QByteArray, FileStamp> found;
        for (int from = 0; from < paths.size(); from += kPathsAtOnce) {
            SqlRows rows = mConnection.ask("SELECT path, size, modified FROM file" + isOneOfPortion(),
                                           portionOf(paths, from));
            while (rows.next())
                found.insert(rows.bytes(0), {rows.number(1), rows.number(2)});
        }
        stamps.swap(found);
    });
}

}  // namespace Kxg
