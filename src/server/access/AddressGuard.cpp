#include "server/access/AddressGuard.h"

#include "server/access/HostName.h"

#include <QList>

#include <algorithm>

namespace Kdd::Access
{
namespace
{

QByteArray schemeOf(const QByteArray& address)
{
    const QByteArray scheme = address.mid(0, address.indexOf("://")).toLower();
    return scheme == "http" || scheme == "https" ? scheme : QByteArray();
}

QByteArray authorityOf(const QByteArray& address)
{
    const int start = address.indexOf("://") + 3;
    const int end = address.indexOf('/', start);
    return address.mid(start, end < 0 ? -1 : end - start);
}

/// "/a/b", or nothing: letters that need no escape and lead nowhere else.
bool isPrefix(const QByteArray& path)
{
    if (path.isEmpty())
        return true;
    return path.startsWith('/') && !path.contains("//") && !path.contains("/.") &&
           std::all_of(path.begin(), path.end(), [](char each) {
               return (each >= 'a' && each <= 'z') || (each >= 'A' && each <= 'Z') ||
                      (each >= '0' && each <= '9') || each == '/' || each == '-' || each == '_' ||
                      each == '.' || each == '~';
           });
}

QByteArray withoutSlash(QByteArray path)
{
    while (path.endsWith('/'))
        path.chop(1);
    return path;
}

/// What the nearest of several proxies says, for only that one is known to us.
QByteArray lastOf(const QByteArray& list)
{
    return list.mid(list.lastIndexOf(',') + 1).trimmed();
}

struct Forwarded
{
    QByteArray scheme;
    QByteArray authority;
    QByteArray prefix;
};

void readForwarded(const QByteArray& element, Forwarded& forwarded)
{
    for (const QByteArray& pair : element.split(';')) {
        const int equals = pair.indexOf('=');
        const QByteArray name = pair.mid(0, equals).trimmed().toLower();
        QByteArray value = pair.mid(equals + 1).trimmed();
        if (value.size() >= 2 && value.startsWith('"') && value.endsWith('"'))
            value = value.mid(1, value.size() - 2);
        if (name == "proto")
            forwarded.scheme = value.toLower();
        else if (name == "host")
            forwarded.authority = value;
    }
}

Forwarded forwardedBy(const Http::Request& request)
{
    Forwarded forwarded;
    forwarded.scheme = lastOf(request.header("x-forwarded-proto")).toLower();
    forwarded.authority = lastOf(request.header("x-forwarded-host"));
    forwarded.prefix = withoutSlash(lastOf(request.header("x-forwarded-prefix")));
    readForwarded(lastOf(request.header("forwarded")), forwarded);
    return forwarded;
}

}  // namespace

Result AddressRules::normalise()
{
    publicAddress = withoutSlash(publicAddress);
    if (!publicAddress.isEmpty()) {
        const QByteArray authority = authorityOf(publicAddress);
        const QByteArray scheme = schemeOf(publicAddress);
        if (scheme.isEmpty() || hostOf(authority).isEmpty() ||
            !isPrefix(publicAddress.mid(publicAddress.indexOf("://") + 3 + authority.size())))
            return Result::failure(QStringLiteral("%1 is no public address: write https://HOST[:PORT][/PATH]")
                                       .arg(QString::fromUtf8(publicAddress)));
        hosts.append(authority);
    }
    for (QByteArray& host : hosts) {
        const QByteArray name = hostOf(host);
        if (name.isEmpty())
            return Result::failure(QStringLiteral("%1 is no name of a host").arg(QString::fromUtf8(host)));
        host = name;
    }
    for (QByteArray& proxy : proxies) {
        const QByteArray address = numericAddress(proxy);
        if (address.isEmpty())
            return Result::failure(
                QStringLiteral("%1 is no numeric address of a proxy").arg(QString::fromUtf8(proxy)));
        proxy = address;
    }
    return {};
}

AddressGuard::AddressGuard(const AddressRules& rules, Http::Handler& inner)
    : mRules(rules)
    , mInner(inner)
{
}

bool AddressGuard::isMeant(const QByteArray& host) const
{
    return isLoopbackName(host) || (!host.isEmpty() && mRules.hosts.contains(host));
}

QByteArray AddressGuard::baseOf(const Http::Request& request) const
{
    if (!mRules.publicAddress.isEmpty())
        return mRules.publicAddress;
    if (!mRules.proxies.contains(request.peer))
        return request.base;
    const Forwarded forwarded = forwardedBy(request);
    const bool knowsScheme = forwarded.scheme == "http" || forwarded.scheme == "https";
    const bool knowsHost = !hostOf(forwarded.authority).isEmpty();
    return (knowsScheme ? forwarded.scheme : schemeOf(request.base)) + "://" +
           (knowsHost ? forwarded.authority : authorityOf(request.base)) +
           (isPrefix(forwarded.prefix) ? forwarded.prefix : QByteArray());
}

Http::Response AddressGuard::answer(const Http::Request& request)
{
    if (!isMeant(hostOf(authorityOf(request.base))))
        return Http::failure(421, QStringLiteral("This server is not asked under that name"));
    Http::Request known = request;
    known.base = baseOf(request);
    return mInner.answer(known);
}

}  // namespace Kdd::Access
