#pragma once

#include "kddlib/volumes/StackFrame.h"

#include <QVector>

namespace Kdd
{

// How frames that can be slices are read from an image.

/// The numbers of a multi-valued text; none when one of them is no number or not finite.
QVector<double> numbersOf(const QByteArray& text);

LeftOutFrame leftOutFrame(const StackFrame& frame, const QString& reason);

/// The frames of an image that can be slices; the others go to `leftOut`.
QVector<StackFrame> stackFramesOf(const TagMap& image, QVector<LeftOutFrame>& leftOut);

}  // namespace Kdd
