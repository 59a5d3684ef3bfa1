#include "platform/database/StudyMarks.h"

#include "platform/database/SearchRecord.h"

#include <QCryptographicHash>
#include <QList>

#include <algorithm>
#include <iterator>

namespace Kxg
{
namespace
{

/// Institution Name, Referring Physician's Name, Institutional Department Name, Issuer of Patient ID, Requesting Service.
constexpr const char* kMarked[] = {"00080080", "00080090", "00081040", "00100021", "00321033"};

constexpr int kKey = 8;   // [bytes] of a line
constexpr int kMark = 8;  // [bytes]
constexpr int kMost =
    40;  // of a study: a server takes no more than 2,700 bytes into an index, names included

void addMarks(const QByteArray& attributes, QList<QByteArray>& marks)
{
    for (const QByteArray& line : attributes.split('\n')) {
        const QByteArray mark = isMarked(line.left(kKey)) ? markOf(line) : QByteArray();
        if (!mark.isEmpty() && !marks.contains(mark))
            marks << mark;
        // Each is looked for among the former ones: so they stay few whatever the study says.
        if (marks.size() > kMost)
            return;
    }
}

}  // namespace

bool isMarked(const QByteArray& attribute)
{
    return std::find(std::begin(kMarked), std::end(kMarked), attribute) != std::end(kMarked);
}

QByteArray markOf(const QByteArray& line)
{
    return QCryptographicHash::hash(line, QCryptographicHash::Md5).toHex().left(kMark);
}

QByteArray marksOf(const StudySearchRecord& study)
{
    QList<QByteArray> marks;
    addMarks(study.attributes, marks);
    for (const SeriesSearchRecord& series : study.series)
        addMarks(series.attributes, marks);
    return marks.size() > kMost ? QByteArray(kAnyMark) : marks.join(' ');
}

}  // namespace Kxg
