#include "kddlib/net/cloud/ServiceAccountKey.h"

#include "kddlib/Limits.h"
#include "kddlib/net/http/WebOrigin.h"
#include "platform/base/Result.h"
#include "platform/resources/ExResource.h"

#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>

#include <utility>

namespace Kdd
{
namespace
{

constexpr char kVariable[] = "GOOGLE_APPLICATION_CREDENTIALS";
constexpr char kType[] = "service_account";

std::string textOf(const QJsonObject& object, const char* field)
{
    return object.value(QLatin1String(field)).toString().toStdString();
}

/// The places of a message take texts, in order.
template <typename... Texts>
Result failure(const char* message, const Texts&... texts)
{
    return Result::failure(QString::fromLatin1(message).arg(QString::fromUtf8(texts)...));
}

}  // namespace

Result readServiceAccountKey(const QJsonObject& object, const char* source, ServiceAccountKey& key)
{
    const std::string type = textOf(object, "type");
    if (type != kType)
        return failure("Credential type is '%1' in %2, expected '%3'", type.c_str(), source, kType);
    // Read aside: a key that lacks something leaves the former one in force.
    ServiceAccountKey read;
    const std::pair<const char*, std::string&> required[] = {
        {"private_key_id", read.id}, {"private_key", read.privateKey}, {"client_email", read.clientEmail}};
    for (const auto& [field, text] : required) {
        text = textOf(object, field);
        if (text.empty())
            return failure("Field '%1' is missing in %2", field, source);
    }
    read.tokenUri = textOf(object, "token_uri");
    if (read.tokenUri.empty())
        read.tokenUri = ExResource::cloudTokenEndpoint().toStdString();
    // A place of the cloud storage itself would have to be authorised by the token that is asked for there.
    if (!originOf(read.tokenUri).isValid())
        return failure("Field 'token_uri' is '%1' in %2, which is no web address", read.tokenUri.c_str(),
                       source);
    key = std::move(read);
    return {};
}

Result readServiceAccountFile(ServiceAccountKey& key)
{
    const QByteArray path = qgetenv(kVariable);
    if (path.isEmpty())
        return failure("Environment variable %1 not defined", kVariable);
    QFile file(QFile::decodeName(path));
    if (!file.exists())
        return failure("ADC file %1 does not exist", path.constData());
    if (!file.open(QIODevice::ReadOnly))
        return failure("Could not open %1: %2", path.constData(), qUtf8Printable(file.errorString()));
    // One byte more than allowed tells that it is too long, without reading what may be endless.
    const QByteArray content = file.read(kMaxServiceAccountFile + 1);
    const QJsonDocument document =
        content.size() > kMaxServiceAccountFile ? QJsonDocument() : QJsonDocument::fromJson(content);
    if (document.isNull())
        return failure("Could not read Json document from %1", path.constData());
    if (document.object().isEmpty())
        return failure("Empty Json object in %1", path.constData());
    return readServiceAccountKey(document.object(), path.constData(), key);
}

}  // namespace Kdd
