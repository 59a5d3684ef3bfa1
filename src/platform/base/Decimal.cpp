#include "platform/base/Decimal.h"

#include <locale.h>

#include <clocale>
#include <cstdlib>

namespace Kdd
{

double decimalNumber(const char* text)
{
    // Made once and never freed; without it, out of memory, the process's own is asked as before.
    static const locale_t plain = ::newlocale(LC_ALL_MASK, "C", nullptr);
    return plain != nullptr ? ::strtod_l(text, nullptr, plain) : std::strtod(text, nullptr);
}

}  // namespace Kdd
