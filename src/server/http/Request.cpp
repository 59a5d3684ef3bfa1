#include "server/http/Request.h"

namespace Kdd::Http
{

const char* nameOf(Method method)
{
    switch (method) {
    case Method::Get:
        return "GET";
    case Method::Head:
        return "HEAD";
    case Method::Options:
        return "OPTIONS";
    case Method::Post:
        return "POST";
    case Method::Delete:
        return "DELETE";
    default:
        return "other";
    }
}

QByteArray Request::header(const char* name) const
{
    QByteArray joined;
    for (const Field& field : headers) {
        if (field.name != name)
            continue;
        if (!joined.isNull())
            joined += ", ";
        // An empty header was sent all the same.
        joined += field.value.isNull() ? QByteArray("") : field.value;
    }
    return joined;
}

QByteArray Request::parameter(const char* name) const
{
    for (const Field& field : query)
        if (field.name == name)
            return field.value.isNull() ? QByteArray("") : field.value;
    return {};
}

QVector<QByteArray> Request::parameters(const char* name) const
{
    QVector<QByteArray> values;
    for (const Field& field : query)
        if (field.name == name)
            values.append(field.value);
    return values;
}

}  // namespace Kdd::Http
