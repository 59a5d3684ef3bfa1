#pragma once

#include "platform/volumefile/ParamBundle.h"

namespace Kdd
{

struct Stack;
class StackValues;
class ValueCounts;

/// All that a volume file says of a stack beside its pixels. Windows, padding and data range count in values of the
/// lattice; the attributes of the bundle "DICOM" are those of the first slice's image.
ParamBundle stackParameters(const Stack& stack, const StackValues& values, const ValueCounts& counts);

}  // namespace Kdd
