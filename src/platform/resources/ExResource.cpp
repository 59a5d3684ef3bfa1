#include "platform/resources/ExResource.h"

#include "platform/resources/Setting.h"

#include <limits>

namespace Kdd
{
namespace
{

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
constexpr Setting kDecoder = {"KDD_DECODER", "decoder/place", ""};
constexpr Setting kSettleSeconds = {"KDD_SETTLE_SECONDS", "archive/settleseconds", "300"};
constexpr Setting kReadPatience = {"KDD_READ_PATIENCE", "tagfiles/readpatience", "2000"};
constexpr Setting kDatabasePatience = {"KDD_DATABASE_PATIENCE", "database/patience", "20"};
constexpr Setting kSessionHosts = {"KDD_SESSION_HOSTS", "web/sessionhosts", ""};
constexpr Setting kShareConnections = {"KDD_SHARE_CONNECTIONS", "web/shareconnections", "0"};
constexpr Setting kObjectsFolder = {"KDD_OBJECTS", "folders/objects", ""};
constexpr Setting kSameUid = {"KDD_SAME_UID", "archive/sameuid", "refuse"};
constexpr Setting kFreeSpace = {"KDD_FREE_SPACE", "archive/freespace", "1024"};
constexpr Setting kObjectSize = {"KDD_OBJECT_SIZE", "archive/objectsize", "4096"};
constexpr Setting kFileDigests = {"KDD_FILE_DIGESTS", "archive/filedigests", "0"};
constexpr Setting kCheckRate = {"KDD_CHECK_RATE", "archive/checkrate", "0"};
constexpr Setting kCheckHours = {"KDD_CHECK_HOURS", "archive/checkhours", "168"};
constexpr Setting kCheckHeals = {"KDD_CHECK_HEALS", "archive/checkheals", "0"};
constexpr Setting kServerCorrections = {"KDD_SERVER_CORRECTIONS", "server/corrections", "0"};
constexpr Setting kServerDeletions = {"KDD_SERVER_DELETIONS", "server/deletions", "0"};
constexpr Setting kServerStow = {"KDD_SERVER_STOW", "server/stow", "0"};
constexpr Setting kServerProves = {"KDD_SERVER_PROVES", "server/proves", "0"};
constexpr Setting kServerRequestSize = {"KDD_SERVER_REQUEST_SIZE", "server/requestsize", "65536"};
constexpr Setting kServerListen = {"KDD_SERVER_LISTEN", "server/listen", "127.0.0.1:8042"};
constexpr Setting kServerStatus = {"KDD_SERVER_STATUS", "server/status", ""};
constexpr Setting kServerAccess = {"KDD_SERVER_ACCESS", "server/access", ""};
constexpr Setting kServerPrefix = {"KDD_SERVER_PREFIX", "server/prefix", "/dicom-web"};
constexpr Setting kServerCertificate = {"KDD_SERVER_CERTIFICATE", "server/certificate", ""};
constexpr Setting kServerKey = {"KDD_SERVER_KEY", "server/key", ""};
constexpr Setting kServerViewer = {"KDD_SERVER_VIEWER", "server/viewer", ""};
constexpr Setting kServerPublic = {"KDD_SERVER_PUBLIC", "server/public", ""};
constexpr Setting kServerHosts = {"KDD_SERVER_HOSTS", "server/hosts", ""};
constexpr Setting kServerProxies = {"KDD_SERVER_PROXIES", "server/proxies", ""};
constexpr Setting kServerThreads = {"KDD_SERVER_THREADS", "server/threads", "0"};
constexpr Setting kServerConnections = {"KDD_SERVER_CONNECTIONS", "server/connections", "10000"};
constexpr Setting kServerRequests = {"KDD_SERVER_REQUESTS", "server/requests", "256"};
constexpr Setting kServerPatience = {"KDD_SERVER_PATIENCE", "server/patience", "30"};
constexpr Setting kServerStop = {"KDD_SERVER_STOP", "server/stop", "30"};
constexpr Setting kServerSlow = {"KDD_SERVER_SLOW", "server/slow", "2000"};
constexpr Setting kDicomListen = {"KDD_DICOM_LISTEN", "dicom/listen", ""};
constexpr Setting kDicomTitle = {"KDD_DICOM_TITLE", "dicom/title", "KDD"};
constexpr Setting kDicomPeers = {"KDD_DICOM_PEERS", "dicom/peers", ""};
constexpr Setting kDicomAssociations = {"KDD_DICOM_ASSOCIATIONS", "dicom/associations", "64"};
constexpr Setting kDicomAnswers = {"KDD_DICOM_ANSWERS", "dicom/answers", "10000"};
constexpr Setting kDicomIdle = {"KDD_DICOM_IDLE", "dicom/idle", "300"};

QByteArray endpoint(const Setting& setting)
{
    // The bucket's name is put directly behind.
    const QByteArray address = valueOf(setting);
    return address.endsWith('/') ? address : address + '/';
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
    return numberOf(kAnswersSize, 0, 1024 * 1024);
}

bool ExResource::verifiesTls()
{
    return valueOf(kTlsVerify) != "0";
}

QByteArray ExResource::tlsCaFile()
{
    return valueOf(kTlsCaFile);
}

QByteArray ExResource::decoder()
{
    return valueOf(kDecoder);
}

int ExResource::readPatience()
{
    // Ten minutes [ms].
    return numberOf(kReadPatience, 0, 600000);
}

int ExResource::databasePatience()
{
    // The driver rounds less than two seconds up; ten minutes.
    return numberOf(kDatabasePatience, 2, 600);
}

QByteArray ExResource::sessionHosts()
{
    return valueOf(kSessionHosts);
}

int ExResource::settleSeconds()
{
    return numberOf(kSettleSeconds, 0, std::numeric_limits<int>::max());
}

bool ExResource::sharesConnections()
{
    return valueOf(kShareConnections) == "1";
}

QByteArray ExResource::objectsFolder()
{
    return valueOf(kObjectsFolder);
}

QByteArray ExResource::sameUid()
{
    return valueOf(kSameUid);
}

int ExResource::freeSpace()
{
    return numberOf(kFreeSpace, 0, 1'000'000'000);
}

int ExResource::objectSize()
{
    return numberOf(kObjectSize, 1, 1024 * 1024);
}

bool ExResource::takesFileDigests()
{
    return valueOf(kFileDigests) == "1";
}

int ExResource::checkRate()
{
    return numberOf(kCheckRate, 0, 100'000);
}

int ExResource::checkHours()
{
    // Ten years.
    return numberOf(kCheckHours, 0, 87'600);
}

bool ExResource::checkHeals()
{
    return valueOf(kCheckHeals) == "1";
}

bool ExResource::serverTakesObjects()
{
    return valueOf(kServerStow) == "1";
}

bool ExResource::serverTakesCorrections()
{
    return valueOf(kServerCorrections) == "1";
}

bool ExResource::serverDeletes()
{
    return valueOf(kServerDeletions) == "1";
}

bool ExResource::serverProvesTagFiles()
{
    return valueOf(kServerProves) == "1";
}

int ExResource::serverRequestSize()
{
    return numberOf(kServerRequestSize, 1, 16 * 1024 * 1024);
}

QByteArray ExResource::serverListen()
{
    return valueOf(kServerListen);
}

QByteArray ExResource::serverStatus()
{
    return valueOf(kServerStatus);
}

QByteArray ExResource::serverAccess()
{
    return valueOf(kServerAccess);
}

QByteArray ExResource::serverPrefix()
{
    return valueOf(kServerPrefix);
}

QByteArray ExResource::serverCertificate()
{
    return valueOf(kServerCertificate);
}

QByteArray ExResource::serverKey()
{
    return valueOf(kServerKey);
}

QByteArray ExResource::serverViewer()
{
    return valueOf(kServerViewer);
}

QByteArray ExResource::serverPublicAddress()
{
    return valueOf(kServerPublic);
}

QByteArray ExResource::serverHosts()
{
    return valueOf(kServerHosts);
}

QByteArray ExResource::serverProxies()
{
    return valueOf(kServerProxies);
}

int ExResource::serverThreads()
{
    return numberOf(kServerThreads, 0, 1000);
}

int ExResource::serverConnections()
{
    return numberOf(kServerConnections, 1, 1000000);
}

int ExResource::serverRequests()
{
    return numberOf(kServerRequests, 1, 100000);
}

int ExResource::serverPatience()
{
    return numberOf(kServerPatience, 1, 3600);
}

int ExResource::serverStop()
{
    return numberOf(kServerStop, 0, 3600);
}

int ExResource::serverSlow()
{
    return numberOf(kServerSlow, 0, std::numeric_limits<int>::max());
}

QByteArray ExResource::dicomListen()
{
    return valueOf(kDicomListen);
}

QByteArray ExResource::dicomTitle()
{
    return valueOf(kDicomTitle);
}

QByteArray ExResource::dicomPeers()
{
    return valueOf(kDicomPeers);
}

int ExResource::dicomAssociations()
{
    return numberOf(kDicomAssociations, 1, 1000);
}

int ExResource::dicomAnswers()
{
    return numberOf(kDicomAnswers, 1, 100000);
}

int ExResource::dicomIdle()
{
    return numberOf(kDicomIdle, 1, 86400);
}

}  // namespace Kdd
