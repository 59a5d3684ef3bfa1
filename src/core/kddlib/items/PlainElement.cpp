#include "kddlib/items/PlainElement.h"

#include "kddlib/tagmodel/KeptValues.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dctag.h>

#include <limits>

namespace Kdd
{

namespace
{

constexpr int kShortHead = 8;
constexpr int kLongHead = 12;
constexpr Uint16 kDelimiters = 0xfffe;

struct VrForm
{
    VrCode code = VrCode::Unknown;
    int width = 1;
    bool isLong = false;  // its length takes four bytes
};

constexpr int letters(const char* name)
{
    return static_cast<unsigned char>(name[0]) << 8 | static_cast<unsigned char>(name[1]);
}

/// Unknown for names that are none, and for the young VRs, which are too rare to be worth a way of their own.
// NOLINTNEXTLINE(readability-function-size): a table
VrForm formOf(const char* name)
{
    switch (letters(name)) {
    case letters("AE"):
        return {VrCode::AE};
    case letters("AS"):
        return {VrCode::AS};
    case letters("AT"):
        return {VrCode::AT, 4};
    case letters("CS"):
        return {VrCode::CS};
    case letters("DA"):
        return {VrCode::DA};
    case letters("DS"):
        return {VrCode::DS};
    case letters("DT"):
        return {VrCode::DT};
    case letters("FL"):
        return {VrCode::FL, 4};
    case letters("FD"):
        return {VrCode::FD, 8};
    case letters("IS"):
        return {VrCode::IS};
    case letters("LO"):
        return {VrCode::LO};
    case letters("LT"):
        return {VrCode::LT};
    case letters("OB"):
        return {VrCode::OB, 1, true};
    case letters("OF"):
        return {VrCode::OF, 4, true};
    case letters("OW"):
        return {VrCode::OW, 2, true};
    case letters("PN"):
        return {VrCode::PN};
    case letters("SH"):
        return {VrCode::SH};
    case letters("SL"):
        return {VrCode::SL, 4};
    case letters("SQ"):
        return {VrCode::SQ, 1, true};
    case letters("SS"):
        return {VrCode::SS, 2};
    case letters("ST"):
        return {VrCode::ST};
    case letters("TM"):
        return {VrCode::TM};
    case letters("UI"):
        return {VrCode::UI};
    case letters("UL"):
        return {VrCode::UL, 4};
    case letters("UN"):
        return {VrCode::UN, 1, true};
    case letters("US"):
        return {VrCode::US, 2};
    case letters("UT"):
        return {VrCode::UT, 1, true};
    default:
        return {};
    }
}

DcmTagKey keyAt(const char* bytes)
{
    return {qFromLittleEndian<quint16>(bytes), qFromLittleEndian<quint16>(bytes + 2)};
}

quint32 numberOf(const DcmTagKey& key)
{
    return quint32(key.getGroup()) << 16 | key.getElement();
}

/// Signed or not as the pixels are. The few that images have; others are left to the parser.
VrForm pixelValueForm(const DcmTagKey& key, const TagMap& item)
{
    if (key != DCM_SmallestImagePixelValue && key != DCM_LargestImagePixelValue &&
        key != DCM_PixelPaddingValue)
        return {};
    const TagElement* representation = item.tagsForLevel().value(DCM_PixelRepresentation, nullptr);
    if (representation == nullptr || representation->vr() != VrCode::US ||
        representation->value().size() != 2)
        return {};
    const bool isSigned = qFromLittleEndian<quint16>(representation->value().constData()) == 1;
    return {isSigned ? VrCode::SS : VrCode::US, 2};
}

}  // namespace

const char* FileWindow::fill(qint64 offset, qint64 count)
{
    if (offset < 0 || count < 0 || count > kLongest || count > size() - offset)
        return nullptr;
    mStart = offset;
    mCount = mFile.readAt(offset, mBytes, qMin(qMax(mSpan, count), size() - offset));
    ++mReads;
    return mCount >= count ? mBytes : nullptr;
}

bool FileWindow::copy(qint64 offset, qint64 count, QByteArray& bytes)
{
    if (count <= kLongest) {
        const char* from = at(offset, count);
        if (from != nullptr)
            bytes = QByteArray(from, static_cast<int>(count));
        return from != nullptr;
    }
    if (offset < 0 || count > size() - offset || count > std::numeric_limits<int>::max() / 2)
        return false;
    bytes = QByteArray(static_cast<int>(count), Qt::Uninitialized);
    ++mReads;
    return mFile.readAt(offset, bytes.data(), count) == count;
}

bool PlainHeadReader::read(qint64 at, qint64 end, const TagMap& item, PlainHead& head)
{
    const char* bytes = end - at >= kShortHead ? mBytes.at(at, kShortHead) : nullptr;
    if (bytes == nullptr)
        return false;
    head.key = keyAt(bytes);
    head.value = at + kShortHead;
    head.vr = VrCode::Unknown;
    head.width = 1;
    // Delimiters are written without VR everywhere.
    const bool isDelimiter = head.key.getGroup() == kDelimiters;
    if (isDelimiter || !mHasVrs)
        head.length = qFromLittleEndian<quint32>(bytes + 4);
    if (!isDelimiter && !(mHasVrs ? readVr(at, end, bytes, head) : findVr(item, head)))
        return false;
    return head.isOpen() || (head.length % 2 == 0 && head.length % quint32(head.width) == 0 &&
                             head.length <= end - head.value);
}

bool PlainHeadReader::readVr(qint64 at, qint64 end, const char* bytes, PlainHead& head)
{
    const VrForm form = formOf(bytes + 4);
    head.vr = form.code;
    head.width = form.width;
    head.length = qFromLittleEndian<quint16>(bytes + 6);
    if (form.isLong) {
        bytes = end - at >= kLongHead ? mBytes.at(at, kLongHead) : nullptr;
        if (bytes == nullptr)
            return false;
        head.length = qFromLittleEndian<quint32>(bytes + kShortHead);
        head.value = at + kLongHead;
    }
    return form.code != VrCode::Unknown;
}

bool PlainHeadReader::findVr(const TagMap& item, PlainHead& head)
{
    const DcmTagKey& key = head.key;
    QByteArray creator;
    if ((key.getGroup() & 1) != 0 && key.getElement() >= 0x1000) {
        const TagElement* reserved =
            item.tagsForLevel().value(DcmTagKey(key.getGroup(), key.getElement() >> 8), nullptr);
        // What reserves the block with anything but a name is left to the parser.
        if (reserved != nullptr && (reserved->vr() != VrCode::LO || reserved->value().isEmpty()))
            return false;
        creator = reserved != nullptr ? reserved->value() : QByteArray();
    }
    const auto vr = static_cast<DcmEVR>(dictionaryVr(key, creator));
    VrForm form = formOf(DcmVR(vr).getVRName());
    // An attribute that the dictionary does not have keeps its bytes.
    if (vr == EVR_UNKNOWN)
        form = {VrCode::UN};
    else if (vr == EVR_xs)
        form = pixelValueForm(key, item);
    else if (vr == EVR_lt)
        form = {VrCode::Lt, 2};
    else if (key == DCM_PixelData || (vr == EVR_ox && isRepeatingGroup(key, 0x6000)))
        form = {VrCode::OW, 2};
    head.vr = form.code;
    head.width = form.width;
    return form.code != VrCode::Unknown;
}

/// Asked once for each, because the dictionary is behind a lock that all threads share.
int PlainHeadReader::dictionaryVr(const DcmTagKey& key, const QByteArray& creator)
{
    if (creator.isEmpty()) {
        auto found = mPublicVrs.find(numberOf(key));
        if (found == mPublicVrs.end())
            found = mPublicVrs.insert(numberOf(key), DcmTag(key).getEVR());
        return found.value();
    }
    auto found = mPrivateVrs.find({numberOf(key), creator});
    if (found == mPrivateVrs.end()) {
        // In two steps as the parser asks: what the creator is not known for may be known without it.
        DcmTag tag(key);
        tag.setPrivateCreator(creator.constData());
        tag.lookupVRinDictionary();
        found = mPrivateVrs.insert({numberOf(key), creator}, tag.getEVR());
    }
    return found.value();
}

}  // namespace Kdd
