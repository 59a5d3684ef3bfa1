#include "kddlib/tagmodel/TagElement.h"

#include <dcmtk/dcmdata/dcovlay.h>
#include <dcmtk/dcmdata/dcpixel.h>
#include <dcmtk/dcmdata/dctk.h>

namespace Kdd
{

namespace
{

// The base tag of a repeating group: DCMTK folds 6002, 6004 and so on into it.
const DcmTagKey kOverlayData(0x6000, 0x3000);

template <typename T>
const T* arrayOf(const QByteArray& bytes)
{
    return reinterpret_cast<const T*>(bytes.constData());
}

/// An incomplete number at the end is not counted.
template <typename T>
unsigned long countOf(const QByteArray& bytes)
{
    return static_cast<unsigned long>(bytes.size()) / sizeof(T);
}

template <typename Element>
std::unique_ptr<DcmElement> textElement(const DcmTag& tag, const QByteArray& text)
{
    auto element = std::make_unique<Element>(tag);
    element->putString(text.constData(), static_cast<Uint32>(text.size()));
    return element;
}

/// `put` is the element's own operation for arrays of T.
template <typename Element, typename T, auto put>
std::unique_ptr<DcmElement> arrayElement(const DcmTag& tag, const QByteArray& bytes)
{
    auto element = std::make_unique<Element>(tag);
    (element.get()->*put)(arrayOf<T>(bytes), countOf<T>(bytes));
    return element;
}

/// Value by value: DCMTK's array operation for tags reads twice as far as its count says.
std::unique_ptr<DcmElement> tagElement(const DcmTag& tag, const QByteArray& bytes)
{
    auto element = std::make_unique<DcmAttributeTag>(tag);
    const auto* words = arrayOf<Uint16>(bytes);
    for (unsigned long i = 0; i < countOf<Uint32>(bytes); ++i)
        element->putTagVal(DcmTagKey(words[2 * i], words[2 * i + 1]), i);
    return element;
}

/// OB or OW as the tag says: the class refuses bytes under a tag of words and the reverse.
std::unique_ptr<DcmElement> otherElement(const DcmTag& tag, const QByteArray& bytes)
{
    auto element = std::make_unique<DcmOtherByteOtherWord>(tag);
    if (tag.getEVR() == EVR_OW || tag.getEVR() == EVR_lt)
        element->putUint16Array(arrayOf<Uint16>(bytes), countOf<Uint16>(bytes));
    else
        element->putUint8Array(arrayOf<Uint8>(bytes), countOf<Uint8>(bytes));
    return element;
}

template <typename Element>
std::unique_ptr<DcmElement> pixelElement(const DcmTag& tag, const QByteArray& bytes)
{
    auto element = std::make_unique<Element>(tag);
    element->putUint8Array(arrayOf<Uint8>(bytes), countOf<Uint8>(bytes));
    return element;
}

/// Elements of the VRs that are stored under an older code; null when the tag asks for none of them.
std::unique_ptr<DcmElement> youngerElement(VrCode vr, const DcmTag& tag, const QByteArray& bytes)
{
    if (vr == VrCode::UT) {
        switch (tag.getEVR()) {
        case EVR_UC:
            return textElement<DcmUnlimitedCharacters>(tag, bytes);
        case EVR_UR:
            return textElement<DcmUniversalResourceIdentifierOrLocator>(tag, bytes);
        default:
            return nullptr;
        }
    }
    if (vr != VrCode::UN)
        return nullptr;
    switch (tag.getEVR()) {
    case EVR_OD:
        return arrayElement<DcmOtherDouble, Float64, &DcmOtherDouble::putFloat64Array>(tag, bytes);
    case EVR_OL:
        return arrayElement<DcmOtherLong, Uint32, &DcmOtherLong::putUint32Array>(tag, bytes);
    case EVR_OV:
        return arrayElement<DcmOther64bitVeryLong, Uint64, &DcmOther64bitVeryLong::putUint64Array>(tag,
                                                                                                   bytes);
    case EVR_SV:
        return arrayElement<DcmSigned64bitVeryLong, Sint64, &DcmSigned64bitVeryLong::putSint64Array>(tag,
                                                                                                     bytes);
    case EVR_UV:
        return arrayElement<DcmUnsigned64bitVeryLong, Uint64, &DcmUnsigned64bitVeryLong::putUint64Array>(
            tag, bytes);
    default:
        return nullptr;
    }
}

std::unique_ptr<DcmElement> bytesElement(VrCode vr, const DcmTag& tag, const QByteArray& bytes)
{
    // These two have classes of their own, which take words as bytes too, whatever VR the tag has.
    if (tag == DCM_PixelData)
        return pixelElement<DcmPixelData>(tag, bytes);
    if (tag.getBaseTag() == kOverlayData)
        return pixelElement<DcmOverlayData>(tag, bytes);
    // A value stored as UN may be of a younger VR, which only the tag tells.
    if (auto younger = youngerElement(vr, tag, bytes))
        return younger;
    return otherElement(tag, bytes);
}

}  // namespace

/// An unknown tag would have DCMTK write words as nothing and sequences as bytes.
DcmTag TagElement::tagFor(const DcmTagKey& key) const
{
    return DcmTag(key, evrOf(mVr, key));
}

DcmElement* TagElement::createDcmElement(const DcmTagKey& key) const
{
    return newDcmElement(tagFor(key)).release();
}

// NOLINTNEXTLINE(readability-function-size): a table
std::unique_ptr<DcmElement> TagElement::newDcmElement(const DcmTag& tag) const
{
    switch (mVr) {
    case VrCode::AE:
        return textElement<DcmApplicationEntity>(tag, mValue);
    case VrCode::AS:
        return textElement<DcmAgeString>(tag, mValue);
    case VrCode::AT:
        return tagElement(tag, mValue);
    case VrCode::CS:
        return textElement<DcmCodeString>(tag, mValue);
    case VrCode::DA:
        return textElement<DcmDate>(tag, mValue);
    case VrCode::DS:
        return textElement<DcmDecimalString>(tag, mValue);
    case VrCode::DT:
        return textElement<DcmDateTime>(tag, mValue);
    case VrCode::FL:
        return arrayElement<DcmFloatingPointSingle, Float32, &DcmFloatingPointSingle::putFloat32Array>(
            tag, mValue);
    case VrCode::FD:
        return arrayElement<DcmFloatingPointDouble, Float64, &DcmFloatingPointDouble::putFloat64Array>(
            tag, mValue);
    case VrCode::IS:
        return textElement<DcmIntegerString>(tag, mValue);
    case VrCode::LO:
        return textElement<DcmLongString>(tag, mValue);
    case VrCode::LT:
        return textElement<DcmLongText>(tag, mValue);
    case VrCode::OB:
    case VrCode::OW:
    case VrCode::Ox:
    case VrCode::Lt:
    case VrCode::UN:
        return bytesElement(mVr, tag, mValue);
    case VrCode::OF:
        return arrayElement<DcmOtherFloat, Float32, &DcmOtherFloat::putFloat32Array>(tag, mValue);
    case VrCode::PN:
        return textElement<DcmPersonName>(tag, mValue);
    case VrCode::SH:
        return textElement<DcmShortString>(tag, mValue);
    case VrCode::SL:
        return arrayElement<DcmSignedLong, Sint32, &DcmSignedLong::putSint32Array>(tag, mValue);
    case VrCode::SS:
        return arrayElement<DcmSignedShort, Sint16, &DcmSignedShort::putSint16Array>(tag, mValue);
    case VrCode::ST:
        return textElement<DcmShortText>(tag, mValue);
    case VrCode::TM:
        return textElement<DcmTime>(tag, mValue);
    case VrCode::UI:
        return textElement<DcmUniqueIdentifier>(tag, mValue);
    case VrCode::UL:
    case VrCode::Up:
        return arrayElement<DcmUnsignedLong, Uint32, &DcmUnsignedLong::putUint32Array>(tag, mValue);
    case VrCode::US:
    // Nobody told whether these words are signed; as words they are the same.
    case VrCode::Xs:
        return arrayElement<DcmUnsignedShort, Uint16, &DcmUnsignedShort::putUint16Array>(tag, mValue);
    case VrCode::UT:
        if (auto younger = youngerElement(mVr, tag, mValue))
            return younger;
        return textElement<DcmUnlimitedText>(tag, mValue);
    default:
        return nullptr;
    }
}

}  // namespace Kdd
