#pragma once

namespace Kdd
{

/// Whether `loadDicomFile` finds the file of that name on this machine, in the present mode.
bool isReadLocally(const char* name);

}  // namespace Kdd
