#pragma once

#include <QByteArray>

namespace Kdd
{

/// The number after "_part" in a volume file's name, 0 when no digits follow; -1 when there is no "_part".
int partNumberOf(const QByteArray& name);

}  // namespace Kdd
