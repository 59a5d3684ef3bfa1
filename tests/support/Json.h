#pragma once

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <string>

namespace Kdd
{

/// What stands at a place: keys, and numbers in lists, parted by "/". Undefined where nothing stands.
inline QJsonValue jsonAt(QJsonValue value, const QByteArray& place)
{
    for (const QByteArray& step : place.split('/'))
        if (!step.isEmpty())
            value = value.isArray() ? value[step.toInt()] : value[QLatin1String(step)];
    return value;
}

/// The same of a text, which holds an object or a list.
inline QJsonValue jsonAt(const QByteArray& text, const QByteArray& place = {})
{
    const QJsonDocument document = QJsonDocument::fromJson(text);
    return jsonAt(document.isArray() ? QJsonValue(document.array()) : QJsonValue(document.object()), place);
}

/// A text or a number.
template <typename Json>
std::string textAt(const Json& json, const QByteArray& place)
{
    return jsonAt(json, place).toVariant().toString().toStdString();
}

}  // namespace Kdd
