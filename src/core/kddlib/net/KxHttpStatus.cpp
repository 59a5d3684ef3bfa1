#include "kddlib/net/KxHttpStatus.h"

namespace Kdd
{

const KxHttpStatus& KxHttpStatus::empty()
{
    static const KxHttpStatus none;
    return none;
}

}  // namespace Kdd
