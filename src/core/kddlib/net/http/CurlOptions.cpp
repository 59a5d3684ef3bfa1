#include "kddlib/net/http/CurlOptions.h"

#include "kddlib/net/http/CurlShare.h"
#include "kddlib/net/http/KxCurlHandleFactory.h"
#include "platform/os/SocketBuffers.h"
#include "platform/resources/ExResource.h"

#include <stdexcept>

namespace Kdd
{
namespace
{

constexpr int kSocketBuffer = 256 * 1024;  // [bytes]
constexpr long kLowSpeed = 1;              // [bytes per second]
constexpr long kLowSpeedTime = 120;        // [s], also the longest time to connect

int prepareSocket(void* /*data*/, curl_socket_t socket, curlsocktype purpose)
{
    if (purpose == CURLSOCKTYPE_IPCXN)
        setSocketBuffers(socket, kSocketBuffer);
    return CURL_SOCKOPT_OK;
}

}  // namespace

void CurlOptions::setVerification()
{
    const bool verifies = ExResource::verifiesTls();
    set(CURLOPT_SSL_VERIFYPEER, verifies ? 1L : 0L);
    // 2 demands that the certificate names the host.
    set(CURLOPT_SSL_VERIFYHOST, verifies ? 2L : 0L);
    const QByteArray caFile = ExResource::tlsCaFile();
    // A path that leads nowhere must not break a site that does not verify at all.
    if (verifies && !caFile.isEmpty())
        set(CURLOPT_CAINFO, caFile.constData());
}

void CurlOptions::setTransport(const std::string& url, const CurlShare& share,
                               const KxCurlHandleFactory& factory)
{
    set(CURLOPT_SHARE, share.handle());
    setVerification();
    // Curl would take what comes before it for the whole.
    if (url.find('\0') != std::string::npos)
        throw CurlError(CURLE_URL_MALFORMAT, "The address has a zero byte in it");
    set(CURLOPT_URL, url.c_str());
    // The server is asked for what the address says: with "." and ".." resolved that might be another object.
    set(CURLOPT_PATH_AS_IS, 1L);
    // An address comes from outside and must not lead to local files or to other services.
    set(CURLOPT_PROTOCOLS_STR, "http,https");
    // Else curl may end slow look-ups of names by a signal, which would meet any thread.
    set(CURLOPT_NOSIGNAL, 1L);
    // What a proxy says when it opens a tunnel is not the server's answer.
    set(CURLOPT_SUPPRESS_CONNECT_HEADERS, 1L);
    if (!factory.cipherList().empty())
        set(CURLOPT_SSL_CIPHER_LIST, factory.cipherList().c_str());
    // Without it each easy handle would trim the connections to curl's own five.
    set(CURLOPT_MAXCONNECTS, factory.connectionLimit());
    set(CURLOPT_SOCKOPTFUNCTION, &prepareSocket);
    set(CURLOPT_LOW_SPEED_LIMIT, kLowSpeed);
    set(CURLOPT_LOW_SPEED_TIME, kLowSpeedTime);
    set(CURLOPT_CONNECTTIMEOUT, kLowSpeedTime);
}

void HeaderLines::add(const std::string& line)
{
    const bool isOneLine = line.find_first_of("\r\n") == std::string::npos;
    curl_slist* longer = isOneLine ? curl_slist_append(mList.get(), line.c_str()) : nullptr;
    if (!longer)
        throw std::runtime_error("Failed to add curl request header");
    // The list was extended in place, so that its first node stays the same unless it was empty.
    static_cast<void>(mList.release());
    mList.reset(longer);
}

}  // namespace Kdd
