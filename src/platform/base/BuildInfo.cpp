#include "platform/base/BuildInfo.h"

namespace Kdd
{

const char* BuildInfo::text()
{
    return "kddlib " KDD_VERSION;
}

}  // namespace Kdd
