#include "server/access/HostName.h"

#include <arpa/inet.h>

#include <algorithm>

namespace Kdd::Access
{
namespace
{

bool isPort(const QByteArray& text)
{
    return text.size() <= 5 &&
           std::all_of(text.begin(), text.end(), [](char each) { return each >= '0' && each <= '9'; });
}

bool isName(const QByteArray& text)
{
    return !text.isEmpty() && std::all_of(text.begin(), text.end(), [](char each) {
        return (each >= 'a' && each <= 'z') || (each >= '0' && each <= '9') || each == '-' || each == '.' ||
               each == '_';
    });
}

}  // namespace

QByteArray hostOf(const QByteArray& authority)
{
    const QByteArray text = authority.toLower();
    if (text.startsWith('[')) {
        const int end = text.indexOf(']');
        const QByteArray rest = text.mid(end + 1);
        const bool endsWell = rest.isEmpty() || (rest.startsWith(':') && isPort(rest.mid(1)));
        const QByteArray address = end < 0 ? QByteArray() : numericAddress(text.mid(1, end - 1));
        return endsWell && !address.isEmpty() ? '[' + address + ']' : QByteArray();
    }
    const int colon = text.indexOf(':');
    const QByteArray name = text.mid(0, colon);
    return isName(name) && (colon < 0 || isPort(text.mid(colon + 1))) ? name : QByteArray();
}

bool isLoopbackName(const QByteArray& host)
{
    return host == "localhost" || host == "127.0.0.1" || host == "[::1]";
}

QByteArray numericAddress(const QByteArray& text)
{
    char written[INET6_ADDRSTRLEN] = "";
    in6_addr bytes = {};
    for (const int family : {AF_INET, AF_INET6})
        if (::inet_pton(family, text.constData(), &bytes) == 1)
            return ::inet_ntop(family, &bytes, written, sizeof written);
    return {};
}

}  // namespace Kdd::Access
