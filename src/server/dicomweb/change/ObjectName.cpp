#include "server/dicomweb/change/ObjectName.h"

#include "server/dicomweb/ResourcePath.h"

#include <QCryptographicHash>

#include <dcmtk/dcmdata/dctag.h>

#include <cstring>

namespace Kdd::DicomWeb
{
namespace
{

constexpr int kDigestDigits = 32;

}  // namespace

QByteArray publicKey(const QByteArray& key)
{
    if (isUID(key))
        return key;
    return "object-" + QCryptographicHash::hash(key, QCryptographicHash::Sha256).toHex().left(kDigestDigits);
}

QString keyDigits(const DcmTagKey& key)
{
    return QString::asprintf("%04X%04X", unsigned(key.getGroup()), unsigned(key.getElement()));
}

QString keywordOf(const DcmTagKey& key)
{
    DcmTag tag(key);
    const char* name = tag.getTagName();
    // For a key that it does not know the dictionary has a name that is none.
    return std::strcmp(name, DcmTag_ERROR_TagName) == 0 ? QString() : QString::fromLatin1(name);
}

}  // namespace Kdd::DicomWeb
