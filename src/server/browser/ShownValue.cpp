#include "server/browser/ShownValue.h"

#include "server/dicomweb/ResourcePath.h"

#include <QCryptographicHash>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dctag.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagMap.h>
#include <kddlib/TextDecoding.h>

#include <cstring>

namespace Kdd::Browser
{
namespace
{

// Names, dates, descriptions: what stands in one line of a page.
constexpr int kMaxShortLength = 200;

// Enough that no two images of a study meet.
constexpr int kDigestDigits = 24;

/// Not between the two halves of one character.
QString cut(const QString& text, int length)
{
    return text.left(length > 0 && length < text.size() && text.at(length).isLowSurrogate() ? length - 1
                                                                                            : length);
}

}  // namespace

QString keywordOf(const TagMap& node, const DcmTagKey& key)
{
    DcmTag tag(key, node.privateCreator(key));
    const char* name = tag.getTagName();
    // For a key that it does not know the dictionary has a name that is none.
    return std::strcmp(name, DcmTag_ERROR_TagName) == 0 ? QString() : QString::fromLatin1(name);
}

QString vrOf(const TagMap& node, const DcmTagKey& key, const TagElement& element)
{
    // With an omitted value its VR went too, so the dictionary's has to do.
    const DcmTag tag =
        element.markedAsOmitted() ? DcmTag(key, node.privateCreator(key)) : element.tagFor(key);
    return QString::fromLatin1(DcmVR(tag.getEVR()).getValidVRName());
}

QByteArray characterSetOf(const TagMap& node, const QByteArray& around)
{
    QByteArray characterSet;
    return node.findAndGetString(DCM_SpecificCharacterSet, characterSet) ? characterSet : around;
}

ShownValue shownValue(const TagMap& node, const DcmTagKey& key, const QByteArray& characterSet, int maxLength)
{
    QByteArray bytes;
    node.findAndGetString(key, bytes);
    const QString text = decodeText(bytes, characterSet);
    return {cut(text, maxLength), text.size()};
}

QString shortValue(const TagMap& node, const DcmTagKey& key)
{
    return shownValue(node, key, characterSetOf(node), kMaxShortLength).text;
}

}  // namespace Kdd::Browser
