#pragma once

#include <QByteArray>

namespace Kdd
{

/// The number after "_part" in a volume file's name, 0 when no digits follow; -1 when there is no "_part".
int partNumberOf(const QByteArray& name);

/// The order of the volume files of a series, given their paths: by part number, the file without one first, and then
/// by the bytes of the paths. The bytes alone would put part 10 before part 2.
bool isEarlierPart(const QByteArray& left, const QByteArray& right);

}  // namespace Kdd
