#include "tools/kdd/AttributeText.h"

#include "tools/kdd/Report.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dctag.h>
#include <kddlib/TagMap.h>
#include <kddlib/TextDecoding.h>

#include <cstring>

namespace Kdd
{

QByteArray keyText(const DcmTagKey& key)
{
    return QString::asprintf("(%04x,%04x)", unsigned(key.getGroup()), unsigned(key.getElement())).toLatin1();
}

QByteArray keywordOf(const TagMap& node, const DcmTagKey& key)
{
    // A private attribute has its name by its creator.
    DcmTag tag(key, node.privateCreator(key));
    const char* name = tag.getTagName();
    // For a key that it does not know the dictionary has a name that is none.
    return std::strcmp(name, DcmTag_ERROR_TagName) == 0 ? QByteArray() : QByteArray(name);
}

QString displayText(const TagMap& node, const QByteArray& bytes)
{
    QByteArray characterSet;
    // As the node shows it, so that an inherited character set counts too.
    node.findAndGetString(DCM_SpecificCharacterSet, characterSet);
    return withoutControls(decodeText(bytes, characterSet));
}

QString displayValue(const TagMap& node, const DcmTagKey& key)
{
    QByteArray text;
    node.findAndGetString(key, text);
    return displayText(node, text);
}

}  // namespace Kdd
