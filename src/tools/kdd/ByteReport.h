#pragma once

#include "tools/kdd/Commands.h"

namespace Kdd
{

class ByteMap;

/// How many attributes are listed where not all are asked for.
constexpr int kDearestAttributes = 20;

/// Writes where bytes go: the parts of the files, which add up to them, and the attributes, the dearest first.
void printBytes(const GlobalOptions& options, const ByteMap& map, int failed, bool all);

}  // namespace Kdd
