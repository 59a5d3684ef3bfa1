#include "kddlib/net/dicom/KxDcmFileLoader.h"

#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/dicom/DamagedFile.h"
#include "kddlib/net/dicom/DcmInputCurlStream.h"
#include "kddlib/net/dicom/DcmInputHttpStream.h"
#include "kddlib/net/dicom/DicomParse.h"
#include "kddlib/net/dicom/ForwardedStream.h"
#include "kddlib/net/dicom/LocalFileStream.h"
#include "kddlib/net/dicom/LocalFiles.h"
#include "kddlib/net/dicom/StoragePath.h"
#include "kddlib/net/http/CurlError.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"

#include <algorithm>
#include <mutex>
#include <utility>

namespace Kdd
{
namespace
{

using Mode = KxDcmFileLoader::Mode;

constexpr char kUsualPort[] = "8181";
constexpr Uint32 kReadAll = 0xffffffff;
// Longer values stay in the file; what the library keeps of an image is mostly shorter.
constexpr Uint32 kOwnBound = 4096;  // [bytes]

/// DCMTK's interfaces differ in the width of the bound.
Uint32 bound(unsigned long maxReadLength)
{
    return static_cast<Uint32>(std::min<unsigned long>(maxReadLength, kReadAll));
}

struct Settings
{
    std::mutex mutex;
    Mode mode = Mode::WholeLocal;
    bool isModeChosen = false;
    std::string port;
    std::string bearerToken;
};

Settings& settings()
{
    // Never destroyed: threads may still be loading when the process ends.
    static auto* const all = new Settings;
    return *all;
}

std::string bearerToken()
{
    const std::lock_guard lock(settings().mutex);
    return settings().bearerToken;
}

/// False, with the reason logged, when the server refuses or the transfer has failed already.
bool isAnswered(const char* name, KxCurlDownloadStream& stream)
{
    const KxHttpStatus& status = stream.httpStatus();
    if (!status.ok())
        LogFile::errorf("Reading %s failed: %s", shownAddress(name).constData(), status.reason().c_str());
    return status.ok();
}

/// The parser's verdict, with the reason logged when it is that the transfer broke off, which is all the parser knows.
OFCondition told(const char* name, KxCurlDownloadStream& stream, const OFCondition& condition)
{
    if (condition.bad() && stream.httpStatus().failed)
        isAnswered(name, stream);
    return condition;
}

OFCondition refuse(const char* name, const std::exception& fault)
{
    LogFile::write(LogFile::Severity::Error, "Reading " + LogFile::escaped(shownAddress(name).toStdString()) +
                                                 " failed: " + textForLog(fault));
    return EC_InvalidStream;
}

OFCondition loadUrl(const char* name, DcmFileFormat& file, const ParseOptions& options)
try {
    KxCurlDownloadStream download = KxCurlClient::instance().read(name, false);
    if (!isAnswered(name, download))
        return EC_InvalidStream;
    DepthLimited<DcmInputCurlStream> stream(std::move(download));
    return told(name, stream.curlStream(), parseDicom(stream, file, options));
} catch (const std::exception& fault) {
    return refuse(name, fault);
}

OFCondition loadFromStorage(const std::string& url, DcmFileFormat& file, const ParseOptions& options)
try {
    DepthLimited<DcmInputHttpStream> stream;
    stream.setBearerToken(bearerToken().c_str());
    stream.request(url.c_str());
    if (!isAnswered(url.c_str(), stream.curlStream()))
        return EC_InvalidStream;
    return told(url.c_str(), stream.curlStream(), parseDicom(stream, file, options));
} catch (const std::exception& fault) {
    return refuse(url.c_str(), fault);
}

/// How the library itself loads: what nobody asks for is not read, as long as nobody has chosen otherwise.
Mode ownMode()
{
    const std::lock_guard lock(settings().mutex);
    return settings().isModeChosen ? settings().mode : Mode::BoundedLocal;
}

OFCondition loadLocal(const char* name, DcmFileFormat& file, const ParseOptions& options)
{
    DepthLimited<LocalFileStream> stream(name);
    const OFCondition condition = parseDicom(stream, file, options);
    // A caller's own reader wants a part of the file, and only he knows whether he has got it.
    return condition.good() || options.reader ? condition : readAsRegistered(name, file, condition);
}

OFCondition load(const char* name, DcmFileFormat& file, Mode mode, ParseOptions options)
{
    const bool isUrl = KxCurlClient::isUrl(name);
    // Here, so that a change of the default holds for loaders that were made before.
    if (mode == Mode::Default)
        mode = KxDcmFileLoader::defaultMode();
    // A download cannot be read a second time, and the other modes are for callers who want all values.
    if (isUrl || mode != Mode::BoundedLocal)
        options.maxReadLength = kReadAll;
    if (isUrl)
        return loadUrl(name, file, options);
    std::string url = name ? name : "";
    if (mode == Mode::StorageServer && KxDcmFileLoader::convertPathToURL(url, nullptr))
        return loadFromStorage(url, file, options);
    return loadLocal(url.c_str(), file, options);
}

}  // namespace

KxDcmFileLoader::KxDcmFileLoader(Mode mode)
    : mMode(mode)
{
}

KxDcmFileLoader::KxDcmFileLoader(const KxDcmFileLoader& other) = default;
KxDcmFileLoader& KxDcmFileLoader::operator=(const KxDcmFileLoader& other) = default;
KxDcmFileLoader::~KxDcmFileLoader() = default;

OFCondition KxDcmFileLoader::loadFile(const OFFilename& name, E_TransferSyntax syntax,
                                      E_GrpLenEncoding groupLength, unsigned long maxReadLength,
                                      E_FileReadMode readMode, const Reader& reader)
{
    return load(name.getCharPointer(), mFile, mMode,
                {syntax, groupLength, bound(maxReadLength), readMode, reader});
}

OFCondition KxDcmFileLoader::loadFile(const char* name, DcmFileFormat& file, Mode mode,
                                      unsigned long maxReadLength)
{
    ParseOptions options;
    options.maxReadLength = bound(maxReadLength);
    return load(name, file, mode, options);
}

OFCondition KxDcmFileLoader::read(DcmInputStream& stream, E_TransferSyntax syntax,
                                  E_GrpLenEncoding groupLength, unsigned long maxReadLength)
{
    DepthLimited<ForwardedStream> limited(stream);
    return parseDicom(limited, mFile, {syntax, groupLength, bound(maxReadLength), ERM_autoDetect, {}});
}

OFCondition KxDcmFileLoader::validateMetaInfo(E_TransferSyntax syntax, E_FileWriteMode writeMode)
{
    return mFile.validateMetaInfo(syntax, writeMode);
}

OFCondition KxDcmFileLoader::readUntilEnd()
{
    return mFile.loadAllDataIntoMemory();
}

Mode KxDcmFileLoader::setDefaultMode(Mode mode)
{
    const std::lock_guard lock(settings().mutex);
    if (mode == Mode::Default)
        return settings().mode;
    settings().isModeChosen = true;
    return std::exchange(settings().mode, mode);
}

Mode KxDcmFileLoader::defaultMode()
{
    return setDefaultMode(Mode::Default);
}

void KxDcmFileLoader::setDefaultPort(const char* port)
{
    const std::lock_guard lock(settings().mutex);
    settings().port = port ? port : "";
}

const std::string& KxDcmFileLoader::defaultPort()
{
    const std::lock_guard lock(settings().mutex);
    std::string& port = settings().port;
    if (port.empty())
        port = Kxg::GetGlobalConfig("FFS2", "Port", QByteArray()).toStdString();
    if (port.empty()) {
        LogFile::warnf("ZPC parameter FFS2/Port is empty, using 8181 instead.");
        port = kUsualPort;
    }
    return port;
}

void KxDcmFileLoader::setBearerToken(const char* token)
{
    const std::lock_guard lock(settings().mutex);
    settings().bearerToken = token ? token : "";
}

bool KxDcmFileLoader::convertPathToURL(std::string& url, const char* port)
{
    const bool hasPort = port && *port;
    // Asking for the port may cost a question to the database, which other names are spared.
    if (storageUrl(url, "").empty())
        return false;
    url = storageUrl(url, hasPort ? port : defaultPort());
    return true;
}

std::string KxDcmFileLoader::convertPathToExternalURL(const char* path)
{
    return externalStorageUrl(path ? path : "");
}

bool isReadLocally(const char* name)
{
    return !KxCurlClient::isUrl(name) && (ownMode() != Mode::StorageServer || storageUrl(name, "").empty());
}

OFCondition loadDicomFile(const char* name, DcmFileFormat& file)
{
    return KxDcmFileLoader::loadFile(name, file, ownMode(), kOwnBound);
}

}  // namespace Kdd
