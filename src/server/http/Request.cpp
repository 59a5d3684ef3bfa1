#include "server/http/Request.h"

namespace Kdd::Http
{

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
