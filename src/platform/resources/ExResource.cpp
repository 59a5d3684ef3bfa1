#include "platform/resources/ExResource.h"

#include "platform/base/LogFile.h"
#include "platform/os/PathName.h"

#include <QFile>
#include <QFileInfo>
#include <QHash>
#include <QSettings>
#include <QStandardPaths>
#include <QStringList>

#include <limits>

namespace Kdd
{
namespace
{

struct Setting
{
    const char* variable;
    const char* key;  ///< in the file
    const char* standard;
};

// Name in the environment, key in the file, and what counts without either.
constexpr Setting kWebHost = {"KDD_WEB_HOST", "web/host", "localhost"};
constexpr Setting kCloudDownload = {"KDD_CLOUD_DOWNLOAD", "cloud/download",
                                    "https://storage-download.googleapis.com/"};
constexpr Setting kCloudUpload = {"KDD_CLOUD_UPLOAD", "cloud/upload",
                                  "https://storage-upload.googleapis.com/"};
constexpr Setting kCloudApi = {"KDD_CLOUD_API", "cloud/api", "https://storage.googleapis.com/"};
constexpr Setting kCloudToken = {"KDD_CLOUD_TOKEN", "cloud/token", "https://oauth2.googleapis.com/token"};
constexpr Setting kDatabase = {"KDD_DATABASE", "database/address", ""};
constexpr Setting kMetaFolder = {"KDD_META_FOLDER", "folders/meta", ""};
constexpr Setting kFileCacheFolder = {"KDD_FILE_CACHE", "folders/filecache", ""};
constexpr Setting kAnswersFolder = {"KDD_ANSWERS", "folders/answers", ""};
constexpr Setting kAnswersSize = {"KDD_ANSWERS_SIZE", "folders/answerssize", "1024"};
constexpr Setting kTlsVerify = {"KDD_TLS_VERIFY", "tls/verify", "0"};
constexpr Setting kTlsCaFile = {"KDD_TLS_CA_FILE", "tls/cafile", ""};
constexpr Setting kSettleSeconds = {"KDD_SETTLE_SECONDS", "archive/settleseconds", "300"};
constexpr Setting kReadPatience = {"KDD_READ_PATIENCE", "tagfiles/readpatience", "2000"};
constexpr Setting kSessionHosts = {"KDD_SESSION_HOSTS", "web/sessionhosts", ""};
constexpr Setting kShareConnections = {"KDD_SHARE_CONNECTIONS", "web/shareconnections", "0"};

using Values = QHash<QString, QByteArray>;

QString filePath()
{
    QString named = QFile::decodeName(qgetenv("KDD_CONFIG"));
    if (!named.isEmpty())
        return named;
    return QStandardPaths::writableLocation(QStandardPaths::GenericConfigLocation) +
           QLatin1String("/kdd/kdd.ini");
}

Values readFile()
{
    const QString path = filePath();
    // Nothing is read then, because Qt would look for a file of another name.
    if (!isPlainText(qgetenv("KDD_CONFIG"))) {
        LogFile::warnf("The settings in %s cannot be read: the name is no text",
                       qgetenv("KDD_CONFIG").constData());
        return {};
    }
    // Nobody has to have a file, but one that is named is meant to be there.
    const bool isNamed = !qEnvironmentVariableIsEmpty("KDD_CONFIG");
    if (!QFileInfo::exists(path) && !isNamed)
        return {};
    QSettings file(path, QSettings::IniFormat);
    // Qt would take Latin-1 otherwise, whatever the locale is.
    file.setIniCodec("UTF-8");
    Values values;
    const QStringList keys = file.allKeys();
    // What looks like a list is a value with commas that nobody put in quotes.
    for (const QString& key : keys)
        values.insert(key, file.value(key).toStringList().join(QLatin1Char(',')).toUtf8());
    if (file.status() != QSettings::NoError || !QFileInfo(path).isReadable())
        LogFile::warnf("The settings in %s cannot be read", qUtf8Printable(path));
    return values;
}

QByteArray valueOf(const Setting& setting)
{
    // Asked anew each time, while the file is read once.
    QByteArray fromEnvironment = qgetenv(setting.variable);
    if (!fromEnvironment.isEmpty())
        return fromEnvironment;
    // A copy, because an object that reads settings must not be shared by threads.
    static const Values fromFile = readFile();
    return fromFile.value(QLatin1String(setting.key), setting.standard);
}

QByteArray endpoint(const Setting& setting)
{
    // The bucket's name is put directly behind.
    const QByteArray address = valueOf(setting);
    return address.endsWith('/') ? address : address + '/';
}

/// Of 0 to `most`; of anything else the standard, for a site's slip should not stop its server.
int numberOf(const Setting& setting, int most)
{
    const QByteArray text = valueOf(setting);
    bool isNumber = false;
    const int number = text.toInt(&isNumber);
    if (isNumber && number >= 0 && number <= most)
        return number;
    LogFile::warnf("%s is \"%s\", which is no number of 0 to %d; %s is taken", setting.variable,
                   text.constData(), most, setting.standard);
    return QByteArray(setting.standard).toInt();
}

}  // namespace

QByteArray ExResource::getWebServiceHostExternal()
{
    return valueOf(kWebHost);
}

QByteArray ExResource::cloudDownloadEndpoint()
{
    return endpoint(kCloudDownload);
}

QByteArray ExResource::cloudUploadEndpoint()
{
    return endpoint(kCloudUpload);
}

QByteArray ExResource::cloudApiEndpoint()
{
    return endpoint(kCloudApi);
}

QByteArray ExResource::cloudTokenEndpoint()
{
    return valueOf(kCloudToken);
}

QByteArray ExResource::databaseAddress()
{
    return valueOf(kDatabase);
}

QByteArray ExResource::metaFolder()
{
    return valueOf(kMetaFolder);
}

QByteArray ExResource::fileCacheFolder()
{
    return valueOf(kFileCacheFolder);
}

QByteArray ExResource::answersFolder()
{
    return valueOf(kAnswersFolder);
}

int ExResource::answersSize()
{
    return numberOf(kAnswersSize, 1024 * 1024);
}

bool ExResource::verifiesTls()
{
    return valueOf(kTlsVerify) != "0";
}

QByteArray ExResource::tlsCaFile()
{
    return valueOf(kTlsCaFile);
}

int ExResource::readPatience()
{
    // Ten minutes [ms].
    return numberOf(kReadPatience, 600000);
}

QByteArray ExResource::sessionHosts()
{
    return valueOf(kSessionHosts);
}

int ExResource::settleSeconds()
{
    return numberOf(kSettleSeconds, std::numeric_limits<int>::max());
}

bool ExResource::sharesConnections()
{
    return valueOf(kShareConnections) == "1";
}

}  // namespace Kdd
