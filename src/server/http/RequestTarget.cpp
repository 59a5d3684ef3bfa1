#include "server/http/RequestTarget.h"

#include <QList>

namespace Kdd::Http
{
namespace
{

/// The deepest path of ours has ten segments; a viewer's files lie a few folders deep.
constexpr int kMostSegments = 64;

/// A search names an attribute or two dozen; lists of UIDs are one parameter.
constexpr int kMostParameters = 1000;

int hexDigit(char letter)
{
    if (letter >= '0' && letter <= '9')
        return letter - '0';
    if (letter >= 'a' && letter <= 'f')
        return letter - 'a' + 10;
    return letter >= 'A' && letter <= 'F' ? letter - 'A' + 10 : -1;
}

enum class Plus { IsPlus, IsBlank };

bool decode(const QByteArray& text, Plus plus, QByteArray& decoded)
{
    decoded.clear();
    decoded.reserve(text.size());
    for (int i = 0; i < text.size(); ++i) {
        char letter = text[i];
        if (letter == '+' && plus == Plus::IsBlank) {
            letter = ' ';
        } else if (letter == '%') {
            const int high = i + 2 < text.size() ? hexDigit(text[i + 1]) : -1;
            const int low = high < 0 ? -1 : hexDigit(text[i + 2]);
            if (low < 0)
                return false;
            letter = static_cast<char>(high * 16 + low);
            i += 2;
        }
        // A name that ends earlier for the system than for us could be another one.
        if (letter == '\0')
            return false;
        decoded += letter;
    }
    return true;
}

bool decodePath(const QByteArray& text, QVector<QByteArray>& path)
{
    for (const QByteArray& raw : text.split('/')) {
        if (raw.isEmpty())
            continue;
        QByteArray segment;
        if (!decode(raw, Plus::IsPlus, segment) || segment == "." || segment == ".." ||
            segment.contains('/') || path.size() == kMostSegments)
            return false;
        path.append(segment);
    }
    return true;
}

/// Media types have a plus and never a blank, and many clients write it as it is.
Plus plusIn(const QByteArray& name)
{
    return name == "accept" || name == "contentType" ? Plus::IsPlus : Plus::IsBlank;
}

bool decodeQuery(const QByteArray& text, QVector<Field>& query)
{
    for (const QByteArray& raw : text.split('&')) {
        if (raw.isEmpty())
            continue;
        const int equals = raw.indexOf('=');
        Field field;
        if (query.size() == kMostParameters || !decode(raw.mid(0, equals), Plus::IsBlank, field.name) ||
            (equals >= 0 && !decode(raw.mid(equals + 1), plusIn(field.name), field.value)))
            return false;
        query.append(field);
    }
    return true;
}

/// Takes "http://host" away; what is left begins with "/" or is empty. False for any other beginning.
bool takeAuthority(QByteArray& target, QByteArray& authority)
{
    const QByteArray scheme = target.left(target.indexOf(':')).toLower();
    const int start = scheme.size() + 3;
    if ((scheme != "http" && scheme != "https") || target.mid(scheme.size(), 3) != "://")
        return false;
    int end = start;
    while (end < target.size() && target[end] != '/' && target[end] != '?')
        ++end;
    authority = target.mid(start, end - start);
    target.remove(0, end);
    return !authority.isEmpty();
}

bool parseInto(QByteArray target, RequestTarget& parsed)
{
    if (target == "*")
        return true;
    if (target.contains('#'))
        return false;
    if (!target.startsWith('/') && !takeAuthority(target, parsed.authority))
        return false;
    const int question = target.indexOf('?');
    return decodePath(target.mid(0, question), parsed.path) &&
           (question < 0 || decodeQuery(target.mid(question + 1), parsed.query));
}

}  // namespace

bool RequestTarget::parse(const QByteArray& target, RequestTarget& parsed)
{
    parsed = {};
    if (parseInto(target, parsed))
        return true;
    parsed = {};
    return false;
}

}  // namespace Kdd::Http
