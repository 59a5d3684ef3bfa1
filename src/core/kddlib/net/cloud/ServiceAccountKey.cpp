#include "kddlib/net/cloud/ServiceAccountKey.h"

#include "kddlib/Limits.h"
#include "kddlib/net/http/WebOrigin.h"
#include "platform/base/LogFile.h"
#include "platform/resources/ExResource.h"

#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>

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

bool readField(const QJsonObject& object, const char* field, const char* source, std::string& text)
{
    text = textOf(object, field);
    if (text.empty())
        LogFile::errorf("Field '%s' is missing in %s", field, source);
    return !text.empty();
}

/// A place of the cloud storage itself would have to be authorised by the token that is asked for there.
bool readTokenUri(const QJsonObject& object, const char* source, std::string& uri)
{
    uri = textOf(object, "token_uri");
    if (uri.empty())
        uri = ExResource::cloudTokenEndpoint().toStdString();
    const bool isUsable = originOf(uri).isValid();
    if (!isUsable)
        LogFile::errorf("Field 'token_uri' is '%s' in %s, which is no web address", uri.c_str(), source);
    return isUsable;
}

}  // namespace

bool readServiceAccountKey(const QJsonObject& object, const char* source, ServiceAccountKey& key)
{
    const std::string type = textOf(object, "type");
    if (type != kType) {
        LogFile::errorf("Credential type is '%s' in %s, expected '%s'", type.c_str(), source, kType);
        return false;
    }
    ServiceAccountKey read;
    if (!readField(object, "private_key_id", source, read.id) ||
        !readField(object, "private_key", source, read.privateKey) ||
        !readField(object, "client_email", source, read.clientEmail) ||
        !readTokenUri(object, source, read.tokenUri))
        return false;
    key = std::move(read);
    return true;
}

bool readServiceAccountFile(ServiceAccountKey& key)
{
    const QByteArray path = qgetenv(kVariable);
    if (path.isEmpty()) {
        LogFile::errorf("Environment variable %s not defined", kVariable);
        return false;
    }
    QFile file(QFile::decodeName(path));
    if (!file.exists()) {
        LogFile::errorf("ADC file %s does not exist", path.constData());
        return false;
    }
    if (!file.open(QIODevice::ReadOnly)) {
        LogFile::errorf("Could not open %s: %s", path.constData(), qUtf8Printable(file.errorString()));
        return false;
    }
    const QByteArray content = file.read(kMaxServiceAccountFile + 1);
    const QJsonDocument document =
        content.size() > kMaxServiceAccountFile ? QJsonDocument() : QJsonDocument::fromJson(content);
    if (document.isNull()) {
        LogFile::errorf("Could not read Json document from %s", path.constData());
        return false;
    }
    if (document.object().isEmpty()) {
        LogFile::errorf("Empty Json object in %s", path.constData());
        return false;
    }
    return readServiceAccountKey(document.object(), path.constData(), key);
}

}  // namespace Kdd
