#include "server/http/StrictJson.h"

#include <QJsonArray>
#include <QJsonDocument>

namespace Kdd::Http
{
namespace
{

int membersOf(const QJsonValue& value)
{
    int count = 0;
    if (value.isObject()) {
        const QJsonObject object = value.toObject();
        for (auto member = object.begin(); member != object.end(); ++member)
            count += 1 + membersOf(member.value());
    } else if (value.isArray()) {
        const QJsonArray items = value.toArray();
        for (const QJsonValue item : items)
            count += membersOf(item);
    }
    return count;
}

/// Members that a text has which is known to be JSON: outside of strings a colon stands for nothing else.
int colonsOf(const QByteArray& text)
{
    int count = 0;
    bool isString = false;
    for (int i = 0; i < text.size(); ++i) {
        if (isString && text[i] == '\\')
            ++i;
        else if (text[i] == '"')
            isString = !isString;
        else if (!isString && text[i] == ':')
            ++count;
    }
    return count;
}

}  // namespace

bool parseObject(const QByteArray& text, QJsonObject& object)
{
    QJsonParseError fault = {};
    const QJsonDocument document = QJsonDocument::fromJson(text, &fault);
    if (fault.error != QJsonParseError::NoError || !document.isObject())
        return false;
    // Of members of one name the parser keeps one.
    if (membersOf(document.object()) != colonsOf(text))
        return false;
    object = document.object();
    return true;
}

}  // namespace Kdd::Http
