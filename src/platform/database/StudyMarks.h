#pragma once

#include <QByteArray>

namespace Kxg
{

struct StudySearchRecord;

// Of the values by which somebody is kept to some studies a study has marks, short enough to stand in the index of the
// list: so the studies of others are passed over without a look at their attributes. A mark may be that of several values;
// whoever finds one has to look.

/// Of a study of which it is not known, or that has too many: it may be anybody's.
constexpr char kAnyMark[] = "*";

/// Whether studies have marks of the attribute's values.
bool isMarked(const QByteArray& attribute);

/// That of an element, a line of a StudySearchRecord's attributes.
QByteArray markOf(const QByteArray& line);

/// All of a study, one after the other.
QByteArray marksOf(const StudySearchRecord& study);

}  // namespace Kxg
