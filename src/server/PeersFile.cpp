#include "server/PeersFile.h"

#include "server/access/HostName.h"
#include "server/dicomweb/search/StudyRule.h"
#include "server/http/StrictJson.h"

#include <QFile>
#include <QJsonArray>

#include <kddlib/PathName.h>

#include <algorithm>

namespace Kdd
{
namespace
{

constexpr qint64 kLongestFile = 1024 * 1024;  // [bytes]; some ten thousand peers

constexpr int kLongestTitle = 16;  // of an application entity, as associations have it

const struct
{
    const char* name;
    Dimse::Right right;
} kRights[] = {
    {"store", Dimse::Right::Store}, {"query", Dimse::Right::Query}, {"retrieve", Dimse::Right::Retrieve}};

Result fault(const QString& where, const char* what)
{
    return Result::failure(QStringLiteral("%1 %2").arg(where, QLatin1String(what)));
}

/// One object of the file. What is taken out is known; what is left then nobody knows. The first fault counts.
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
    QJsonObject& object() { return mObject; }
    QJsonValue take(const char* name) { return mObject.take(QLatin1String(name)); }

    QByteArray text(const char* name)
    {
        const QString text = take(name).toString();
        if (text.isEmpty())
            fail(name, "is no text, or empty");
        return pathBytes(text);
    }

    bool flag(const char* name, bool standard)
    {
        const QJsonValue value = take(name);
        if (!value.isUndefined() && !value.isBool())
            fail(name, "is neither true nor false");
        return value.toBool(standard);
    }

    Dimse::Rights rights(const char* name)
    {
        Dimse::Rights rights;
        const QJsonValue value = take(name);
        const QJsonArray items = value.toArray();
        for (const QJsonValue item : items) {
            const auto* const found =
                std::find_if(std::begin(kRights), std::end(kRights),
                             [&](const auto& each) { return item.toString() == QLatin1String(each.name); });
            if (found == std::end(kRights))
                fail(name, "has a right that is none: there are store, query and retrieve");
            else
                rights |= found->right;
        }
        if (!value.isArray())
            fail(name, "is no list of rights");
        return rights;
    }

    /// By attributes of studies, the values of which each has to have one.
    std::shared_ptr<const Kxg::StudyLimits> limits(const char* name)
    {
        auto made = std::make_shared<Kxg::StudyLimits>();
        const QJsonValue value = take(name);
        const QJsonObject attributes = value.toObject();
        for (auto each = attributes.begin(); each != attributes.end(); ++each) {
            DicomWeb::StudyRule rule;
            if (!DicomWeb::StudyRule::resolve(each.key().toUtf8(), rule))
                fail(name, "has an attribute by which studies are not kept apart");
            made->all.push_back(rule.limit(texts(name, each.value())));
        }
        if (attributes.isEmpty())
            fail(name, "is no object with attributes, or empty");
        return made;
    }

    /// Numeric; a list, or one alone.
    QVector<QByteArray> addresses(const char* name)
    {
        QVector<QByteArray> made;
        const QJsonValue value = take(name);
        const QJsonArray items = value.isArray() ? value.toArray() : QJsonArray{value};
        for (const QJsonValue item : items) {
            made.append(Access::numericAddress(item.toString().toUtf8()));
            if (made.last().isEmpty())
                fail(name, "has something that is no numeric address");
        }
        if (made.isEmpty())
            fail(name, "is empty");
        return made;
    }

    void fail(const char* name, const char* reason)
    {
        const QString where = mName.isEmpty() || name == nullptr
                                  ? mName + QLatin1String(name)
                                  : mName + QLatin1Char('.') + QLatin1String(name);
        if (mResult.good())
            mResult = fault(where, reason);
    }

    void end()
    {
        if (!mObject.isEmpty())
            fail(mObject.begin().key().toUtf8().constData(), "is nothing that stands there");
    }

private:
    /// A list, or one alone.
    QStringList texts(const char* name, const QJsonValue& value)
    {
        QStringList made;
        for (const QJsonValue item : value.isArray() ? value.toArray() : QJsonArray{value}) {
            made.append(item.toString());
            if (made.last().isEmpty())
                fail(name, "has a value that is no text, or empty");
        }
        if (made.isEmpty())
            fail(name, "has an attribute without values");
        return made;
    }

    QJsonObject mObject;
    QString mName;
    Result& mResult;
};

bool isTitle(const QByteArray& title)
{
    return !title.isEmpty() && title.size() <= kLongestTitle && title.trimmed() == title &&
           std::all_of(title.begin(), title.end(),
                       [](char letter) { return letter >= ' ' && letter <= '~' && letter != '\\'; });
}

Dimse::Peer readPeer(Section section)
{
    Dimse::Peer made;
    if (section.has("addresses"))
        made.addresses = section.addresses("addresses");
    if (section.has("host") || section.has("port")) {
        made.host = section.text("host");
        const int port = section.take("port").toInt();
        if (port < 1 || port > 65535)
            section.fail("port", "is no port");
        made.port = static_cast<quint16>(port);
        made.isSecure = section.flag("tls", false);
    }
    made.rights = section.rights("rights");
    if (section.has("studies"))
        made.studies = section.limits("studies");
    section.end();
    return made;
}

Dimse::TlsRules readTls(Section section)
{
    Dimse::TlsRules made;
    made.certificateFile = section.text("certificate");
    made.keyFile = section.text("key");
    if (section.has("caFile"))
        made.caFile = section.text("caFile");
    made.needsCertificate = section.flag("required", !made.caFile.isEmpty());
    if (made.needsCertificate && made.caFile.isEmpty())
        section.fail("caFile", "is needed to judge the certificates that are required");
    section.end();
    return made;
}

}  // namespace

Result PeersFile::parse(const QByteArray& text, PeersFile& file)
{
    QJsonObject object;
    if (!Http::parseObject(text, object))
        return Result::failure(QStringLiteral("it is no JSON object, or says something twice"));
    Result result;
    PeersFile made;
    Section whole(object, {}, result);
    if (whole.has("anyone"))
        made.rules.anyone = whole.rights("anyone");
    Section peers(whole.has("peers") ? whole.take("peers") : QJsonObject(), QStringLiteral("peers"), result);
    for (auto it = peers.object().constBegin(); it != peers.object().constEnd(); ++it) {
        const QByteArray title = it.key().toUtf8();
        if (!isTitle(title))
            peers.fail(title.constData(), "is no application entity title");
        made.rules.peers.insert(title, readPeer({it.value(), QStringLiteral("peers.") + it.key(), result}));
    }
    made.rules.takesUnknownClasses = whole.flag("unknownClasses", true);
    if (whole.has("tls"))
        made.tls = readTls({whole.take("tls"), QStringLiteral("tls"), result});
    if (whole.has("audit"))
        made.audit = whole.text("audit");
    whole.end();
    const bool isLimited = std::any_of(made.rules.peers.begin(), made.rules.peers.end(),
                                       [](const Dimse::Peer& peer) { return peer.studies != nullptr; });
    // One would only have to call oneself otherwise.
    if (result.good() && isLimited && made.rules.anyone)
        result = Result::failure(
            QStringLiteral("there can be no rights for anyone beside peers that are kept to some studies"));
    const bool isCalledSecurely = std::any_of(made.rules.peers.begin(), made.rules.peers.end(),
                                              [](const Dimse::Peer& peer) { return peer.isSecure; });
    if (result.good() && isCalledSecurely && (!made.tls || made.tls->caFile.isEmpty()))
        result = Result::failure(QStringLiteral(
            "tls.caFile is needed to judge the certificates of peers that are called over TLS"));
    if (result.good() && !made.rules.anyone && made.rules.peers.isEmpty())
        result = Result::failure(QStringLiteral("it lets nobody in: there are anyone and peers"));
    if (result.good())
        file = made;
    return result;
}

Result PeersFile::read(const QString& path, PeersFile& file)
{
    QFile opened(path);
    if (!opened.open(QIODevice::ReadOnly))
        return Result::failure(opened.errorString()).within(path);
    const QByteArray text = opened.read(kLongestFile + 1);
    if (text.size() > kLongestFile)
        return Result::failure(QStringLiteral("it is too large for a peers file")).within(path);
    return parse(text, file).within(path);
}

}  // namespace Kdd
