#include "platform/volumefile/VolumeFileName.h"

#include <QtGlobal>

namespace Kdd
{

namespace
{

const char* const kPart = "_part";

/// Beyond every number of volumes, and far from what an int cannot hold.
constexpr int kTooMany = 100 * 1000 * 1000;

int partNumberOfFile(const QByteArray& path)
{
    // Behind the last separator of either kind: a folder's "_part" does not count.
    return partNumberOf(path.mid(qMax(path.lastIndexOf('/'), path.lastIndexOf('\\')) + 1));
}

}  // namespace

int partNumberOf(const QByteArray& name)
{
    const int part = name.indexOf(kPart);
    if (part < 0)
        return -1;
    int number = 0;
    // A number that gets too large stays where it is, so that a name of many digits cannot overflow.
    for (int i = part + static_cast<int>(qstrlen(kPart)); i < name.size() && number < kTooMany; ++i) {
        const char digit = name.at(i);
        if (digit < '0' || digit > '9')
            break;
        number = number * 10 + (digit - '0');
    }
    return number;
}

bool isEarlierPart(const QByteArray& left, const QByteArray& right)
{
    const int leftPart = partNumberOfFile(left);
    const int rightPart = partNumberOfFile(right);
    return leftPart != rightPart ? leftPart < rightPart : left < right;
}

}  // namespace Kdd
