#include "platform/late/LateTable.h"

// Where all libraries are linked none is loaded late.

namespace Kdd
{

const LateTable* const kLateTables = nullptr;
const std::size_t kLateTableCount = 0;

}  // namespace Kdd

void* kddLateCalls[1] = {};
