#pragma once

#include "kddlib/volumes/StackFrame.h"

#include <QVector>

#include <functional>

namespace Kdd
{

/// Frames by pointer; whoever planned them owns them.
using StackFrames = QVector<const StackFrame*>;

/// Parts frames of one geometry, given in the order of their images, so that no two of a part lie in one plane. What
/// cannot be parted goes to `leftOut`.
QVector<StackFrames> splitByPlane(const StackFrames& frames, QVector<LeftOutFrame>& leftOut);

/// Frames of equal value together, in the order of first appearance.
QVector<StackFrames> partedBy(const StackFrames& frames,
                              const std::function<QByteArray(const StackFrame&)>& valueOf);

/// Where a frame lies along the normal of `like` [mm].
double positionAlong(const StackFrame& like, const StackFrame& frame);

}  // namespace Kdd
