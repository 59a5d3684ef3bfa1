#include "kddlib/net/http/ObjectAddress.h"

#include <QList>

#include <algorithm>

namespace Kdd
{

namespace
{

constexpr char kHidden[] = "***";

/// By their names, for values have no form: signed addresses of the large storages, tokens, sessions. Rather one too many.
bool isSecret(const QByteArray& parameter)
{
    const QByteArray name = parameter.toLower();
    const char* const words[] = {"sig",    "token",  "credential", "key",   "secret", "password",
                                 "passwd", "auth",   "session",    "goog-", "amz-",   "policy",
                                 "ticket", "access", "jwt",        "bearer"};
    return name == "s" || name == "sv" || name == "se" || name == "code" ||
           std::any_of(std::begin(words), std::end(words),
                       [&](const char* word) { return name.contains(word); });
}

QByteArray shownQuery(const QByteArray& query)
{
    QList<QByteArray> parts = query.split('&');
    for (QByteArray& part : parts) {
        const int equals = part.indexOf('=');
        if (equals >= 0 && isSecret(part.left(equals)))
            part = part.left(equals + 1) + kHidden;
    }
    return parts.join('&');
}

}  // namespace

bool isObjectAddress(const QByteArray& name)
{
    return name.startsWith("http://") || name.startsWith("https://") || name.startsWith("gs://");
}

QByteArray shownAddress(const QByteArray& name)
{
    if (!isObjectAddress(name))
        return name;
    QByteArray shown = name;
    const int query = shown.indexOf('?');
    if (query >= 0)
        shown = shown.left(query + 1) + shownQuery(shown.mid(query + 1));
    const int host = shown.indexOf("//") + 2;
    const auto end =
        std::find_if(shown.cbegin() + host, shown.cend(), [](char c) { return c == '/' || c == '?'; });
    // The last one, for a password may have one in it.
    const int at = shown.left(static_cast<int>(end - shown.cbegin())).lastIndexOf('@');
    if (at >= host)
        shown.replace(host, at - host, kHidden);
    return shown;
}

}  // namespace Kdd
