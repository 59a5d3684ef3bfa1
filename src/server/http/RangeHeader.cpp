#include "server/http/RangeHeader.h"

namespace Kdd::Http
{

namespace
{

/// Digits alone; a number beyond all bodies counts as just that.
bool readNumber(const QByteArray& digits, qint64& number)
{
    constexpr int kMostDigits = 18;  // of any 63-bit number
    number = 0;
    for (char digit : digits) {
        if (digit < '0' || digit > '9')
            return false;
        number = digits.size() > kMostDigits ? Q_INT64_C(0x3fffffffffffffff) : number * 10 + (digit - '0');
    }
    return !digits.isEmpty();
}

}  // namespace

WantedBytes wantedBytes(const Request& request, qint64 size, const QByteArray& etag)
{
    WantedBytes wanted;
    wanted.length = size;
    const QByteArray range = request.header("range").trimmed();
    const QByteArray condition = request.header("if-range").trimmed();
    if (!range.startsWith("bytes=") || range.contains(',') || (!condition.isEmpty() && condition != etag))
        return wanted;
    const int dash = range.indexOf('-');
    const QByteArray from = range.mid(6, dash - 6).trimmed();
    const QByteArray to = range.mid(dash + 1).trimmed();
    qint64 first = 0;
    qint64 last = size - 1;
    const bool isUnderstood = dash >= 6 &&
                              (from.isEmpty() ? readNumber(to, last) : readNumber(from, first)) &&
                              (from.isEmpty() || to.isEmpty() || readNumber(to, last)) &&
                              (from.isEmpty() || first <= last || to.isEmpty());
    if (!isUnderstood)
        return wanted;
    if (from.isEmpty()) {
        // The last so many bytes, of which there may be fewer.
        first = qMax<qint64>(0, size - last);
        last = last > 0 ? size - 1 : -1;
    }
    if (first >= size || last < first)
        return {WantedBytes::Kind::Impossible, 0, 0};
    return {WantedBytes::Kind::Part, first, qMin(last, size - 1) - first + 1};
}

}  // namespace Kdd::Http
