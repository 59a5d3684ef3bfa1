#pragma once

#include "server/http/Request.h"

namespace Kdd::Http
{

/// What a body is, as its header Content-Type says.
struct ContentType
{
    QByteArray name;            ///< "multipart/related", in small letters; empty when it says nothing sound
    QVector<Field> parameters;  ///< names in small letters

    static ContentType parse(const QByteArray& header);

    /// Empty when there is none.
    QByteArray parameter(const char* parameterName) const;
};

}  // namespace Kdd::Http
