#include "server/http/ContentType.h"

#include <algorithm>

namespace Kdd::Http
{
namespace
{

constexpr int kMostParameters = 20;

/// The value from `at` on, which stands behind it afterwards. It may be quoted or not, and hold anything then.
QByteArray takeValue(const QByteArray& text, int& at)
{
    QByteArray value;
    if (text.mid(at, 1) != "\"") {
        const int end = text.indexOf(';', at);
        value = text.mid(at, end < 0 ? -1 : end - at).trimmed();
        at = end < 0 ? text.size() : end;
        return value;
    }
    for (++at; at < text.size() && text.at(at) != '"'; ++at) {
        if (text.at(at) == '\\' && at + 1 < text.size())
            ++at;
        value += text.at(at);
    }
    const int end = text.indexOf(';', at);
    at = end < 0 ? text.size() : end;
    return value;
}

}  // namespace

ContentType ContentType::parse(const QByteArray& header)
{
    ContentType type;
    int at = header.indexOf(';');
    at = at < 0 ? header.size() : at;
    const QByteArray name = header.left(at).trimmed().toLower();
    const int slash = name.indexOf('/');
    if (slash > 0 && slash + 1 < name.size())
        type.name = name;
    while (at < header.size() && type.parameters.size() < kMostParameters) {
        const int equals = header.indexOf('=', at);
        if (equals < 0)
            break;
        const QByteArray parameter = header.mid(at + 1, equals - at - 1).trimmed().toLower();
        at = equals + 1;
        while (at < header.size() && header.at(at) == ' ')
            ++at;
        const QByteArray value = takeValue(header, at);
        type.parameters.append({parameter, value});
    }
    return type;
}

QByteArray ContentType::parameter(const char* parameterName) const
{
    const auto found = std::find_if(parameters.begin(), parameters.end(),
                                    [&](const Field& each) { return each.name == parameterName; });
    return found == parameters.end() ? QByteArray() : found->value;
}

}  // namespace Kdd::Http
