#include "server/access/AccessRules.h"

#include "server/access/HostName.h"
#include "server/http/StrictJson.h"

#include <QFile>
#include <QJsonArray>

#include <kddlib/PathName.h>

#include <algorithm>

namespace Kdd::Access
{
namespace
{

constexpr qint64 kLongestFile = 1024 * 1024;  // [bytes]; some ten thousand names

/// One object of the file. Whatever is asked of it is taken as known; what is left then nobody knows. The first fault
/// counts.
class Section
{
public:
    Section(const QJsonValue& value, QString name, Result& result)
        : mObject(value.toObject())
        , mName(std::move(name))
        , mResult(result)
    {
        if (!value.isObject())
            fail({}, "is no object");
    }

    bool has(const char* name) const { return mObject.contains(QLatin1String(name)); }

    QJsonValue take(const char* name) { return mObject.take(QLatin1String(name)); }

    QString text(const char* name, const QString& standard = {})
    {
        const QJsonValue value = take(name);
        if (value.isUndefined() && !standard.isNull())
            return standard;
        if (value.toString().isEmpty())
            fail(name, "is no text, or empty");
        return value.toString();
    }

    /// A list, or what is one of a single text.
    QVector<QString> texts(const char* name)
    {
        const QJsonValue value = take(name);
        QVector<QString> list;
        const QJsonArray items = value.isArray() ? value.toArray() : QJsonArray{value};
        for (const QJsonValue item : items) {
            list.append(item.toString());
            if (item.toString().isEmpty())
                fail(name, "has something that is no text, or empty");
        }
        if (list.isEmpty())
            fail(name, "is empty");
        return list;
    }

    std::chrono::seconds seconds(const char* name, std::chrono::seconds standard, int least, int most)
    {
        const QJsonValue value = take(name);
        if (value.isUndefined())
            return standard;
        const int number = value.toInt(-1);
        if (number < least || number > most)
            fail(name, "is no number of seconds that makes sense there");
        return std::chrono::seconds(number);
    }

    Rights rights(const char* name) { return rightsOf(take(name), name); }

    NamedRights named(const char* name)
    {
        const QJsonValue value = take(name);
        const QJsonObject object = value.toObject();
        NamedRights made;
        for (auto member = object.begin(); member != object.end(); ++member)
            made.insert(member.key().toUtf8(), rightsOf(member.value(), name));
        if (made.isEmpty())
            fail(name, "names nobody");
        return made;
    }

    Section section(const char* name) { return {take(name), path(name), mResult}; }
    QString path(const char* name) const
    {
        return mName.isEmpty() ? QLatin1String(name) : mName + QLatin1Char('.') + QLatin1String(name);
    }

    void fail(const char* name, const char* reason)
    {
        if (mResult.good())
            mResult = Result::failure(QStringLiteral("%1 %2").arg(
                name == nullptr || *name == '\0' ? mName : path(name), QLatin1String(reason)));
    }

    void end()
    {
        if (!mObject.isEmpty())
            fail(mObject.begin().key().toUtf8().constData(), "is nothing that stands there");
    }

private:
    Rights rightsOf(const QJsonValue& value, const char* name)
    {
        Rights rights;
        const QJsonArray items = value.toArray();
        for (const QJsonValue item : items) {
            const auto* const found =
                std::find_if(std::begin(kRightNames), std::end(kRightNames),
                             [&](const auto& each) { return item.toString() == QLatin1String(each.name); });
            if (found == std::end(kRightNames))
                fail(name, "has a right that is none: there are read, store, correct and delete");
            else
                rights |= found->right;
        }
        if (!value.isArray())
            fail(name, "is no list of rights");
        return rights;
    }

    QJsonObject mObject;
    QString mName;
    Result& mResult;
};

ClaimRule readClaimRule(Section rule)
{
    ClaimRule made;
    if (rule.has("claim") || rule.has("value")) {
        made.claim = rule.text("claim");
        made.value = rule.text("value");
    }
    made.gives = rule.rights("gives");
    rule.end();
    return made;
}

TokenRules readTokens(Section section, Result& result)
{
    TokenRules made;
    made.issuer = section.text("issuer");
    made.audiences = section.texts("audience");
    made.keys = pathBytes(section.text("keys"));
    if (section.has("caFile"))
        made.caFile = pathBytes(section.text("caFile"));
    made.leeway = section.seconds("leeway", made.leeway, 0, 600);
    made.keysAge = section.seconds("keysAge", made.keysAge, 10, 86400);
    made.keysKept = section.seconds("keysKept", made.keysKept, 10, 30 * 86400);
    if (made.keysKept < made.keysAge)
        section.fail("keysKept", "is less than keysAge");
    made.subject = section.text("subject", made.subject);
    const QJsonArray rules = section.take("rights").toArray();
    for (const QJsonValue rule : rules)
        made.rights.append(readClaimRule(Section(rule, section.path("rights"), result)));
    if (rules.isEmpty())
        section.fail("rights", "is no list of rules: no token would give anything");
    section.end();
    return made;
}

HeaderRules readHeader(Section section)
{
    HeaderRules made;
    made.name = section.text("name").toLatin1().toLower();
    const bool isName = std::all_of(made.name.begin(), made.name.end(), [](char each) {
        return (each >= 'a' && each <= 'z') || (each >= '0' && each <= '9') || each == '-';
    });
    if (!isName)
        section.fail("name", "is no name of a header");
    for (const QString& peer : section.texts("peers")) {
        made.peers.append(numericAddress(peer.toUtf8()));
        if (made.peers.last().isEmpty())
            section.fail("peers", "has something that is no numeric address");
    }
    made.users = section.named("users");
    section.end();
    return made;
}

CertificateRules readCertificates(Section section)
{
    CertificateRules made;
    made.caFile = pathBytes(section.text("caFile"));
    made.subjects = section.named("subjects");
    section.end();
    return made;
}

OriginRules readOrigins(Section section)
{
    OriginRules made;
    for (const QString& origin : section.texts("origins")) {
        const QByteArray text = origin.toUtf8().toLower();
        const int start = text.indexOf("://") + 3;
        // With "*" or "null" every page of the world would be meant.
        if (!(text.startsWith("https://") || text.startsWith("http://")) || hostOf(text.mid(start)).isEmpty())
            section.fail("origins", "has something that is no origin: write https://HOST[:PORT]");
        made.origins.append(text);
    }
    made.maxAge = section.seconds("maxAge", made.maxAge, 0, 86400);
    section.end();
    return made;
}

}  // namespace

AccessRules AccessRules::open()
{
    AccessRules rules;
    rules.anyone = kAllRights;
    return rules;
}

Result AccessRules::parse(const QByteArray& text, AccessRules& rules)
{
    QJsonObject object;
    if (!Http::parseObject(text, object))
        return Result::failure(QStringLiteral("it is no JSON object, or says something twice"));
    Result result;
    AccessRules made;
    Section whole(object, {}, result);
    if (whole.has("anyone"))
        made.anyone = whole.rights("anyone");
    if (whole.has("tokens"))
        made.tokens = readTokens(whole.section("tokens"), result);
    if (whole.has("header"))
        made.header = readHeader(whole.section("header"));
    if (whole.has("certificates"))
        made.certificates = readCertificates(whole.section("certificates"));
    if (whole.has("cors"))
        made.origins = readOrigins(whole.section("cors"));
    if (whole.has("audit"))
        made.audit = pathBytes(whole.text("audit"));
    whole.end();
    if (result.good() && !made.anyone && !made.tokens && !made.header && !made.certificates)
        result = Result::failure(QStringLiteral("it lets nobody in: there are anyone, tokens, header and "
                                                "certificates"));
    if (result.good())
        rules = made;
    return result;
}

Result AccessRules::read(const QString& path, AccessRules& rules)
{
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly))
        return Result::failure(file.errorString()).within(path);
    const QByteArray text = file.read(kLongestFile + 1);
    if (text.size() > kLongestFile)
        return Result::failure(QStringLiteral("it is too large for an access file")).within(path);
    return parse(text, rules).within(path);
}

}  // namespace Kdd::Access
