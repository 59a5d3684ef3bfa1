#include "server/http/ListenAddress.h"

#include <arpa/inet.h>

namespace Kdd::Http
{

bool ListenAddress::parse(const QByteArray& text, ListenAddress& address)
{
    const int colon = text.lastIndexOf(':');
    bool isNumber = false;
    const ushort port = text.mid(colon + 1).toUShort(&isNumber);
    QByteArray host = text.left(colon);
    const bool isBracketed = host.startsWith('[') && host.endsWith(']');
    if (isBracketed)
        host = host.mid(1, host.size() - 2);
    if (host == "localhost")
        host = "127.0.0.1";
    in6_addr bytes = {};
    if (colon < 0 || !isNumber || host.contains(':') != isBracketed ||
        ::inet_pton(isBracketed ? AF_INET6 : AF_INET, host.constData(), &bytes) != 1)
        return false;
    address.host = host;
    address.port = port;
    return true;
}

bool ListenAddress::isLoopback() const
{
    in6_addr bytes = {};
    return host.startsWith("127.") ||
           (::inet_pton(AF_INET6, host.constData(), &bytes) == 1 && IN6_IS_ADDR_LOOPBACK(&bytes));
}

QByteArray ListenAddress::text() const
{
    const QByteArray shown = isIPv6() ? '[' + host + ']' : host;
    return shown + ':' + QByteArray::number(port);
}

}  // namespace Kdd::Http
