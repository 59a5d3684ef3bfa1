#include "server/access/Base64Url.h"

namespace Kdd::Access
{

bool decodeBase64Url(const QByteArray& text, QByteArray& bytes)
{
    constexpr auto kForm = QByteArray::Base64UrlEncoding | QByteArray::OmitTrailingEquals;
    const QByteArray decoded = QByteArray::fromBase64(text, kForm);
    // The decoder passes over what it does not know; written again that is missing.
    if (decoded.toBase64(kForm) != text)
        return false;
    bytes = decoded;
    return true;
}

}  // namespace Kdd::Access
