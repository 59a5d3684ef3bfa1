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

/// The term so many times, one of which has to hold. In groups, because engines take a chain of some hundred only.
QByteArray oneOf(const QByteArray& term, int count)
{
    constexpr int kGroup = 100;
    QByteArray groups;
    for (int left = count; left > 0; left -= kGroup)
        groups += (groups.isEmpty() ? "(" : " OR (") + term +
                  (" OR " + term).repeated(qMin(left, kGroup) - 1) + ')';
    return '(' + groups + ')';
}

/// Leaves out, without a look at what they say, most of the studies that are not meant.
SearchSql marksSql(SearchSelection& selection, const SqlDialect& dialect, const StudyLimit& limit)
{
    const QByteArray marks = selection.study("marks");
    const QByteArray isMarkedSo = dialect.wordsOf.arg(QLatin1String(marks)).toLatin1();
    SearchSql any{'(' + marks + " = ? OR " + oneOf(isMarkedSo, limit.values.size()) + ')',
                  {textValue(kAnyMark)}};
    for (const QByteArray& line : limit.values)
        any.values << textValue(dialect.pattern('*' + markOf(line) + '*'));
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
    const QByteArray holdsOne = oneOf(holds, limit.values.size());
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
