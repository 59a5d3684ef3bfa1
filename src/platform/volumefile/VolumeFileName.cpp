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
    return partNumberOf(path.mid(qMax(path.lastIndexOf('/'), path.lastIndexOf('\\')) + 1));
}

}  // namespace

int partNumberOf(const QByteArray& name)
{
    const int part = name.indexOf(kPart);
    if (part < 0)
        return -1;
    int number = 0;
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
