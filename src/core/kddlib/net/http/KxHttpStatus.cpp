#include "kddlib/net/http/KxHttpStatus.h"

namespace Kdd
{

const KxHttpStatus& KxHttpStatus::empty()
{
    static const KxHttpStatus none;
    return none;
}

}  // namespace Kdd
