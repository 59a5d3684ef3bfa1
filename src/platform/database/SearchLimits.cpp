#include "platform/database/SearchLimits.h"

#include "platform/database/SqlConnection.h"

namespace Kxg
{
namespace
{

/// A line ends where no value of an attribute can: in a text there is no line feed, and no quote without its escape.
QVariantList linesOf(const StudyLimit& limit)
{
    QVariantList list;
    for (const QByteArray& line : limit.values)
        list << bytesValue(line + '\n');
    return list;
}

QVariantList textsOf(const StudyLimit& limit)
{
    QVariantList list;
    for (const QByteArray& value : limit.values)
        list << textValue(value);
    return list;
}

SearchSql limitSql(const SqlDialect& dialect, const StudyLimit& limit)
{
    if (limit.values.isEmpty())
        return {" AND 1 = 0", {}};
    const int further = limit.values.size() - 1;
    const QByteArray holds = dialect.holds.arg(QLatin1String("l.attributes")).toLatin1();
    const QByteArray holdsOne = '(' + holds + (" OR " + holds).repeated(further) + ')';
    const QByteArray ofStudy = " l WHERE l.study_id = s.study_id AND ";
    switch (limit.of) {
    case StudyLimit::Of::Uid:
        return {" AND s.uid IN (?" + QByteArray(", ?").repeated(further) + ')', textsOf(limit)};
    case StudyLimit::Of::Study:
        return {" AND EXISTS (SELECT 1 FROM study_answer" + ofStudy + holdsOne + ')', linesOf(limit)};
    case StudyLimit::Of::Series:
        break;
    }
    const QByteArray series = "EXISTS (SELECT 1 FROM series_search" + ofStudy;
    return {" AND " + series + holdsOne + ") AND NOT " + series + holds + " AND NOT " + holdsOne + ')',
            linesOf(limit) + QVariantList{bytesValue(limit.attribute + '{')} + linesOf(limit)};
}

}  // namespace

SearchSql limitsSql(const SqlDialect& dialect, const StudyLimits& limits)
{
    SearchSql all;
    for (const StudyLimit& limit : limits.all) {
        const SearchSql sql = limitSql(dialect, limit);
        all.text += sql.text;
        all.values += sql.values;
    }
    return all;
}

}  // namespace Kxg
