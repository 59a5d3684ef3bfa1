#include "kddlib/net/http/KxHttpStatus.h"

namespace Kdd
{

std::string KxHttpStatus::reason() const
{
    if (ok())
        return {};
    return failed ? failure : "HTTP response code " + std::to_string(code);
}

const KxHttpStatus& KxHttpStatus::empty()
{
    static const KxHttpStatus none;
    return none;
}

}  // namespace Kdd
