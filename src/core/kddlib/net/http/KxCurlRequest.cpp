#include "kddlib/net/http/KxCurlRequest.h"

#include "platform/base/BuildInfo.h"
#include "platform/resources/ExResource.h"

#include <algorithm>
#include <utility>

namespace Kdd
{
namespace
{

std::string userAgent()
{
    return std::string("Korvex ") + BuildInfo::text();
}

}  // namespace

KxCurlRequest::KxCurlRequest(std::shared_ptr<KxCurlHandleFactory> factory, const CurlShare& share,
                             const std::string& url, const std::string& method)
    : mFactory(std::move(factory))
    , mEasy(mFactory->takeEasy())
    , mOptions(mEasy.get(), mErrorText)
    , mHeaderReceiver(mStatus, mFault)
{
    mOptions.setTransport(url, share, *mFactory);
    mOptions.set(CURLOPT_USERAGENT, userAgent().c_str());
    mOptions.set(CURLOPT_CUSTOMREQUEST, method.c_str());
    mOptions.set(CURLOPT_WRITEFUNCTION, &receiveBody);
    mOptions.set(CURLOPT_WRITEDATA, this);
    mHeaderReceiver.attach(mEasy.get());
}

KxCurlRequest::~KxCurlRequest()
{
    mFactory->giveBack(std::move(mEasy));
}

void KxCurlRequest::demandProof(const QByteArray& caFile)
{
    mOptions.set(CURLOPT_SSL_VERIFYPEER, 1L);
    mOptions.set(CURLOPT_SSL_VERIFYHOST, 2L);
    mOptions.set(CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    // Who has to be trusted is asked with what the library offers, not with what suits one storage.
    mOptions.set(CURLOPT_SSL_CIPHER_LIST, static_cast<const char*>(nullptr));
    const QByteArray trusted = caFile.isEmpty() ? ExResource::tlsCaFile() : caFile;
    if (!trusted.isEmpty())
        mOptions.set(CURLOPT_CAINFO, trusted.constData());
}

void KxCurlRequest::setBounds(qint64 most, std::chrono::milliseconds time)
{
    mMost = std::min(most, kMaxResponseSize);
    mOptions.set(CURLOPT_TIMEOUT_MS, static_cast<long>(time.count()));
}

void KxCurlRequest::perform(const QByteArray& body)
{
    // Without a length curl would look for a zero byte. It keeps the pointer, and the bytes outlast the transfer.
    mOptions.set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
    mOptions.set(CURLOPT_POSTFIELDS, body.constData());
    perform();
}

void KxCurlRequest::perform()
{
    try {
        run();
    } catch (const std::exception& fault) {
        // For whoever asks the status when the exception is long caught.
        mStatus.failed = true;
        mStatus.failure = fault.what();
        throw;
    }
}

void KxCurlRequest::run()
{
    mOptions.set(CURLOPT_HTTPHEADER, mHeaders.list());
    const CURLcode code = curl_easy_perform(mEasy.get());
    // What a callback threw is the cause of curl's error, so it comes first.
    mFault.rethrow();
    if (code != CURLE_OK)
        throw CurlError(code, mErrorText.data());
}

std::size_t KxCurlRequest::receiveBody(char* bytes, std::size_t size, std::size_t count, void* request)
{
    auto& self = *static_cast<KxCurlRequest*>(request);
    const std::size_t length = size * count;
    return self.mFault.guard(length, [&] { self.takeBody(bytes, length); });
}

void KxCurlRequest::takeBody(const char* bytes, std::size_t length)
{
    // Held against what is left of the bound, because a sum could wrap.
    if (length > static_cast<std::size_t>(mMost - mResponse.size())) {
        const std::string text = mMost == kMaxResponseSize ? "1 GiB" : std::to_string(mMost) + " bytes";
        throw CurlError(CURLE_FILESIZE_EXCEEDED, ("The response has a body of more than " + text).c_str());
    }
    mResponse.append(bytes, static_cast<int>(length));
    mStatus.bytesReceived += length;
}

}  // namespace Kdd
