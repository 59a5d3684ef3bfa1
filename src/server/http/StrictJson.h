#pragma once

#include <QByteArray>
#include <QJsonObject>

namespace Kdd::Http
{

/// A JSON object and nothing else. False when it is none, or says something twice: two readers of such a text may take
/// two different things from it.
bool parseObject(const QByteArray& text, QJsonObject& object);

}  // namespace Kdd::Http
