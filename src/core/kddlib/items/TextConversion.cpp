#include "kddlib/items/TextConversion.h"

#include "kddlib/items/TextDecoding.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcelem.h>

#include <memory>

namespace Kdd
{

namespace
{

const char* const kUtf8 = "ISO_IR 192";

QByteArray declaredBy(const TagElement* element)
{
    if (element == nullptr || element->isSequence())
        return {};
    const std::unique_ptr<DcmElement> rebuilt(element->createDcmElement(DCM_SpecificCharacterSet));
    OFString text;
    if (rebuilt == nullptr || rebuilt->getOFStringArray(text).bad())
        return {};
    return {text.c_str(), static_cast<int>(text.size())};
}

/// Where code extensions end.
const char* delimitersOf(DcmEVR vr)
{
    switch (vr) {
    case EVR_PN:
        return "\\^=";
    case EVR_LO:
    case EVR_SH:
    case EVR_UC:
        return "\\";
    default:
        return "";
    }
}

QByteArray storedIn(const TagMap& node)
{
    const TagElement* element = node.findElement(DCM_SpecificCharacterSet);
    return element != nullptr ? element->value() : QByteArray();
}

}  // namespace

TextConversion::TextConversion(const TagMap& image)
    : mStored(storedIn(image))
    , mCharacterSet(declaredBy(image.findElement(DCM_SpecificCharacterSet)))
{
    mIsUtf8 = mCharacterSet == kUtf8;
    mIsSelected = mIsUtf8 || mConverter.selectCharacterSet(mCharacterSet.constData()).good();
    // The one set of DICOM whose lower half is not ASCII throughout.
    mReplacesAscii = mCharacterSet.contains("IR 13");
}

bool TextConversion::isFor(const TagMap& image) const
{
    return storedIn(image) == mStored;
}

bool TextConversion::nextWay(unsigned int findings)
{
    switch (mWay) {
    case Way::Together:
        if (mHasTriedTogether || (findings & (kUnexplained | kItemDeclares)) == 0)
            return false;
        mHasTriedTogether = true;
        mTogether = findings;
        mWay = Way::Each;
        return true;
    case Way::Each:
        if ((findings & kChanged) != 0)
            return false;
        mWay = (mTogether & kUnexplained) != 0 ? Way::AsStored : Way::Together;
        return true;
    case Way::AsStored:
        return false;
    }
    return false;
}

QByteArray TextConversion::characterSetOf(const TagMap& item, const QByteArray& above) const
{
    if (mWay == Way::Together)
        return above;
    const QByteArray own = declaredBy(item.findElement(DCM_SpecificCharacterSet));
    return own.isEmpty() ? above : own;
}

bool TextConversion::concerns(DcmEVR vr)
{
    switch (vr) {
    case EVR_LO:
    case EVR_LT:
    case EVR_PN:
    case EVR_SH:
    case EVR_ST:
    case EVR_UC:
    case EVR_UT:
        return true;
    default:
        return false;
    }
}

bool TextConversion::keepsAscii(const QByteArray& characterSet) const
{
    switch (mWay) {
    case Way::Together:
        return !mReplacesAscii;
    case Way::Each:
        return !replacesTilde(characterSet);
    case Way::AsStored:
        return true;
    }
    return true;
}

/// False when the declared set does not explain the value.
bool TextConversion::convertTogether(QByteArray& value, DcmEVR vr)
{
    if (mIsUtf8)
        return true;
    if (!mIsSelected)
        return false;
    if (!concerns(vr) || value.isEmpty())
        return true;
    OFString converted;
    if (mConverter
            .convertString(value.constData(), static_cast<std::size_t>(value.size()), converted,
                           delimitersOf(vr))
            .bad())
        return false;
    value = QByteArray(converted.data(), static_cast<int>(converted.size()));
    return true;
}

unsigned int TextConversion::convert(QByteArray& value, DcmEVR vr, const QByteArray& characterSet)
{
    if (mWay == Way::Together && !convertTogether(value, vr))
        return kUnexplained;
    // What is not subject to the declared set, or declares itself as UTF-8, was not looked at so far; as is the declaration
    // where texts are as stored.
    const QByteArray converted =
        utf8Of(value, mWay == Way::Together ? QByteArray(kUtf8) : characterSet, concerns(vr));
    const bool hasChanged = converted != value;
    value = converted;
    return mWay == Way::Each && hasChanged ? kChanged : 0;
}

}  // namespace Kdd
