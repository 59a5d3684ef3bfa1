#include "platform/base/Decimal.h"

#include <QList>

#include <locale.h>

#include <clocale>
#include <cmath>
#include <cstdlib>

namespace Kdd
{

double decimalNumber(const char* text)
{
    // Made once and never freed; without it, out of memory, the process's own is asked as before.
    static const locale_t plain = ::newlocale(LC_ALL_MASK, "C", nullptr);
    return plain != nullptr ? ::strtod_l(text, nullptr, plain) : std::strtod(text, nullptr);
}

QVector<double> numbersOf(const QByteArray& text)
{
    QVector<double> numbers;
    const QList<QByteArray> words = text.split('\\');
    for (const QByteArray& word : words) {
        bool ok = false;
        // Qt reads a byte array's number with a point, whatever locale the process has.
        numbers.append(word.trimmed().toDouble(&ok));
        // One that is no number spoils the list, because the others would move to wrong places.
        if (!ok || !std::isfinite(numbers.last()))
            return {};
    }
    return numbers;
}

}  // namespace Kdd
