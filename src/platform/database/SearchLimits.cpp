#include "platform/database/SearchLimits.h"

#include "platform/database/SqlConnection.h"
#include "platform/database/StudyMarks.h"

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

/// Leaves out, without a look at what they say, most of the studies that are not meant.
SearchSql marksSql(SearchSelection& selection, const SqlDialect& dialect, const StudyLimit& limit)
{
    const QByteArray marks = selection.study("marks");
    SearchSql any{'(' + marks + " = ?", {textValue(kAnyMark)}};
    for (const QByteArray& line : limit.values) {
        any.text += " OR " + dialect.wordsOf.arg(QLatin1String(marks)).toLatin1();
        any.values << textValue(dialect.pattern('*' + markOf(line) + '*'));
    }
    any.text += ')';
    return any;
}

void addLimit(SearchSelection& selection, const SqlDialect& dialect, const StudyLimit& limit)
{
    if (limit.values.isEmpty())
        return selection.add({"1 = 0", {}});
    const int further = limit.values.size() - 1;
    if (limit.of == StudyLimit::Of::Uid)
        return selection.add(
            {selection.study("uid") + " IN (?" + QByteArray(", ?").repeated(further) + ')', textsOf(limit)});
    if (isMarked(limit.attribute))
        selection.add(marksSql(selection, dialect, limit));
    const QByteArray holds = dialect.holds.arg(QLatin1String("l.attributes")).toLatin1();
    const QByteArray holdsOne = '(' + holds + (" OR " + holds).repeated(further) + ')';
    const QByteArray ofStudy = " l WHERE l.study_id = " + selection.study("study_id") + " AND ";
    if (limit.of == StudyLimit::Of::Study)
        return selection.add(
            {"EXISTS (SELECT 1 FROM study_answer" + ofStudy + holdsOne + ')', linesOf(limit)});
    const QByteArray series = "EXISTS (SELECT 1 FROM series_search" + ofStudy;
    selection.add({series + holdsOne + ')', linesOf(limit)});
    selection.add({"NOT " + series + holds + " AND NOT " + holdsOne + ')',
                   QVariantList{bytesValue(limit.attribute + '{')} + linesOf(limit)});
}

}  // namespace

void addLimits(SearchSelection& selection, const SqlDialect& dialect, const StudyLimits& limits)
{
    for (const StudyLimit& limit : limits.all)
        addLimit(selection, dialect, limit);
}

}  // namespace Kxg
