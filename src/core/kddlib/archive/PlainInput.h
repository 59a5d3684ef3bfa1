#pragma once

#include "kddlib/items/PlainFiles.h"

#include <QByteArray>

namespace Kdd
{

enum class Damage;
struct DicomInput;

/// Turns what was read of the file at the path into what `readDicomInput` makes of it. False, with `input` as it was,
/// when that one has to tell what the file is.
bool takePlain(const QByteArray& path, PlainRead read, DicomInput& input);

/// What `readDicomInput` makes of a file of whatever form, by DCMTK's parser.
DicomInput parseInput(const QByteArray& path, Damage damage);

}  // namespace Kdd
