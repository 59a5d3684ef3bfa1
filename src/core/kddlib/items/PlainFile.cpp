#include "kddlib/items/PlainFile.h"

#include "kddlib/Limits.h"
#include "kddlib/items/PlainElement.h"
#include "kddlib/tagmodel/KeptValues.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <QtEndian>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdatset.h>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>
#include <dcmtk/dcmdata/dcvr.h>
#include <dcmtk/dcmdata/dcxfer.h>

#include <algorithm>
#include <cstring>
#include <limits>

namespace Kdd
{

namespace
{

// Bytes of any content that stand before the prefix.
constexpr qint64 kPreamble = 128;
constexpr char kVolumeFileByte = '\x89';
constexpr quint32 kHead = 8;          // of an element without VR, of an item and of a delimiter [bytes]
constexpr qint64 kFragmentHead = 64;  // what is read for the head of a fragment [bytes]
constexpr Uint16 kFirstGroup =
    0x0008;  // before it are messages, media directories and what no dataset may have
constexpr Uint16 kDelimiters = 0xfffe;

/// A program may have told the parser to read otherwise.
bool isParserAsUsual()
{
    return dcmEnableAutomaticInputDataCorrection.get() && !dcmPreferVRFromDataDictionary.get() &&
           !dcmPreferLengthFieldSizeFromDataDictionary.get() && !dcmEnableUnknownVRConversion.get() &&
           !dcmAutoDetectDatasetXfer.get() && !dcmIgnoreFileMetaInformationGroupLength.get() &&
           dcmStopParsingAfterElement.get() == DCM_UndefinedTagKey;
}

/// What a UID has when nobody has to correct it.
bool isUidCharacter(char c)
{
    return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || c == '.' ||
           c == '-' || c == '_' || c == '\\';
}

/// The text without its padding; false where more than that would have to be decided.
bool stripPadding(const char* text, VrCode vr, qint64& size)
{
    if (vr == VrCode::UI) {
        while (size > 0 && text[size - 1] == '\0')
            --size;
        return std::all_of(text, text + size, isUidCharacter);
    }
    // A zero byte is how some writers pad all texts. Blanks before it would stay.
    if (size > 1 && text[size - 1] == '\0' && text[size - 2] != ' ')
        --size;
    else
        while (size > 0 && text[size - 1] == ' ')
            --size;
    return std::memchr(text, '\0', static_cast<std::size_t>(size)) == nullptr;
}

bool isPixelKey(const DcmTagKey& key)
{
    return key == DCM_PixelData || key == DCM_FloatPixelData || key == DCM_DoubleFloatPixelData;
}

class PlainReader
{
public:
    explicit PlainReader(PlainSource& file)
        : mBytes(file)
        , mHeads(mBytes)
    {
    }

    bool read(unsigned int maxLength, PlainImage& image)
    {
        qint64 at = 0;
        image.map = std::make_unique<TagMap>();
        Span dataset{mBytes.size(), false, 0};
        // Of a dataset without anything the parser guesses the syntax.
        if (!readMeta(at) || at == mBytes.size() || !readElements(dataset, maxLength, at, *image.map) ||
            !mBytes.isOfOnePiece())
            return false;
        image.map->putAndInsertValue(kTransferSyntax, VrCode::OB,
                                     QByteArray(1, static_cast<char>(mSyntax.getXfer())));
        image.pixelBytes = mPixelBytes;
        return true;
    }

private:
    /// Where elements stand: those of the dataset or of an item.
    struct Span
    {
        qint64 end = 0;       ///< where they end, at the latest when that is told by a delimiter
        bool isOpen = false;  ///< a delimiter tells it
        int depth = 0;
        /// What they take when they are written without VRs and lengths, by which private sequences are measured.
        qint64 length = 0;
    };

    bool readMeta(qint64& at);
    bool readMetaElement(const PlainHead& head);
    bool readElements(Span& span, unsigned int maxLength, qint64& at, TagMap& map);
    bool readElement(const PlainHead& head, Span& span, unsigned int maxLength, qint64& at, TagMap& map);
    bool readText(const PlainHead& head, unsigned int maxLength, Span& span, TagElement& element);
    bool readBytes(const PlainHead& head, unsigned int maxLength, Span& span, TagElement& element);
    bool readSequence(const PlainHead& head, Span& span, unsigned int maxLength, qint64& at, TagMap& map);
    bool readItems(const PlainHead& head, Span& items, unsigned int maxLength, qint64& at,
                   TagSequence& sequence);
    bool readFragments(const PlainHead& head, const Span& span, qint64& at);

    FileWindow mBytes;
    PlainHeadReader mHeads;
    DcmXfer mSyntax{EXS_Unknown};
    qint64 mPixelBytes = 0;
    const TagMap mNothing;
};

/// Leaves `at` where the dataset begins.
bool PlainReader::readMeta(qint64& at)
{
    const char* prefix = mBytes.at(0, kPreamble + 4);
    if (prefix == nullptr || std::memcmp(prefix + kPreamble, "DICM", 4) != 0 || *prefix == kVolumeFileByte)
        return false;
    PlainHead head;
    QByteArray groupLength;
    if (!mHeads.read(kPreamble + 4, mBytes.size(), mNothing, head) || head.vr != VrCode::UL ||
        head.length != 4 || head.key != DCM_FileMetaInformationGroupLength ||
        !mBytes.copy(head.value, 4, groupLength))
        return false;
    at = head.value + 4;
    const qint64 end = at + qFromLittleEndian<quint32>(groupLength.constData());
    for (DcmTagKey last = head.key; at < end && end <= mBytes.size(); last = head.key) {
        if (!mHeads.read(at, end, mNothing, head) || head.key.getGroup() != 0x0002 || !(last < head.key) ||
            !readMetaElement(head))
            return false;
        at = head.value + head.length;
    }
    const bool isPlain = mSyntax.getStreamCompression() == ESC_none &&
                         mSyntax.getByteOrder() == EBO_LittleEndian &&
                         mSyntax.getPixelDataByteOrder() == EBO_LittleEndian;
    mHeads.setVrsWritten(mSyntax.isExplicitVR());
    return at == end && isPlain && mSyntax.getXfer() != EXS_Unknown;
}

bool PlainReader::readMetaElement(const PlainHead& head)
{
    if (head.isOpen() || head.vr == VrCode::SQ || head.vr == VrCode::UN)
        return false;
    if (head.key != DCM_TransferSyntaxUID && head.key != DCM_MediaStorageSOPClassUID)
        return true;
    QByteArray text;
    if (head.vr != VrCode::UI || head.length > FileWindow::kLongest ||
        !mBytes.copy(head.value, head.length, text))
        return false;
    qint64 size = text.size();
    if (!stripPadding(text.constData(), VrCode::UI, size))
        return false;
    text.truncate(static_cast<int>(size));
    if (head.key == DCM_MediaStorageSOPClassUID)
        return text != UID_MediaStorageDirectoryStorage;
    mSyntax = DcmXfer(text.constData());
    return true;
}

/// From `at` on to the end of the span, where `at` stands then, behind the delimiter if there is one.
bool PlainReader::readElements(Span& span, unsigned int maxLength, qint64& at, TagMap& map)
{
    PlainHead head;
    DcmTagKey last(kFirstGroup, 0);
    for (bool isFirst = true; at < span.end; isFirst = false) {
        if (!mHeads.read(at, span.end, map, head))
            return false;
        at = head.value;
        if (head.key == DCM_ItemDelimitationItem)
            return span.isOpen && head.length == 0;
        // Of two elements of one key the parser takes one, and warns of that and of any other order.
        if (head.key.getGroup() >= kDelimiters || head.key < last || (!isFirst && head.key == last) ||
            !readElement(head, span, maxLength, at, map))
            return false;
        last = head.key;
    }
    return !span.isOpen;
}

bool PlainReader::readElement(const PlainHead& head, Span& span, unsigned int maxLength, qint64& at,
                              TagMap& map)
{
    if (head.vr == VrCode::SQ)
        return readSequence(head, span, maxLength, at, map);
    const bool isPixelData = head.key == DCM_PixelData;
    const bool isOfBytes = head.vr == VrCode::OB || head.vr == VrCode::OW;
    // Fragments where the syntax has them and nowhere else, and no bytes in place of a sequence.
    if ((isPixelData && (!isOfBytes || mSyntax.isEncapsulated() != head.isOpen())) ||
        (!isPixelData && (head.isOpen() || isLookupTableSequence(head.key))) ||
        (isOfBytes && head.key == DCM_ModalityLUTSequence))
        return false;
    if (head.isOpen()) {
        map.markAsOmitted(head.key);
        return span.depth == 0 && readFragments(head, span, at);
    }
    at = head.value + head.length;
    if (isPixelKey(head.key) && span.depth == 0)
        mPixelBytes += head.length;
    auto element = std::make_unique<TagElement>(head.vr, QByteArray());
    const unsigned int bound = hasLargeBound(head.key) ? kLargeValueBound : maxLength;
    if (!(isTextVr(head.vr) ? readText(head, bound, span, *element) : readBytes(head, bound, span, *element)))
        return false;
    // Group lengths are wrong as soon as one value of the group is left out.
    if (head.key.getElement() != 0)
        map.putElement(head.key, element.release());
    return true;
}

bool PlainReader::readText(const PlainHead& head, unsigned int maxLength, Span& span, TagElement& element)
{
    qint64 size = head.length;
    const char* text = mBytes.at(head.value, size);
    if (text == nullptr || !stripPadding(text, head.vr, size))
        return false;
    const qint64 padded = size + size % 2;
    span.length += kHead + padded;
    if (padded > maxLength)
        element.setVr(VrCode::Omitted);
    else if (head.length > 0)
        element.putValue(QByteArray(text, static_cast<int>(size)));
    return true;
}

bool PlainReader::readBytes(const PlainHead& head, unsigned int maxLength, Span& span, TagElement& element)
{
    span.length += kHead + qint64(head.length);
    if (head.length > maxLength) {
        element.setVr(VrCode::Omitted);
        return true;
    }
    return mBytes.copy(head.value, head.length, element.value());
}

bool PlainReader::readSequence(const PlainHead& head, Span& span, unsigned int maxLength, qint64& at,
                               TagMap& map)
{
    auto sequence = std::make_unique<TagSequence>();
    Span items{head.isOpen() ? span.end : head.value + head.length, head.isOpen(), span.depth + 1, 0};
    // How deep is too deep the parser decides.
    if (items.depth >= kMaxItemDepth ||
        !readItems(head, items, isLookupTableSequence(head.key) ? kLargeValueBound : maxLength, at,
                   *sequence))
        return false;
    span.length += 2 * kHead + items.length;
    if (items.length > std::numeric_limits<int>::max())
        return false;
    const bool isPrivate = (head.key.getGroup() & 1) != 0;
    // A private sequence is measured as a whole.
    if (isPrivate && items.length > maxLength)
        map.markAsOmitted(head.key);
    else
        map.putElement(head.key, sequence.release());
    return true;
}

bool PlainReader::readItems(const PlainHead& head, Span& items, unsigned int maxLength, qint64& at,
                            TagSequence& sequence)
{
    PlainHead item;
    for (at = head.value; items.isOpen || at < items.end;) {
        if (!mHeads.read(at, items.end, mNothing, item))
            return false;
        at = item.value;
        if (item.key == DCM_SequenceDelimitationItem)
            return items.isOpen && item.length == 0;
        if (item.key != DCM_Item)
            return false;
        auto map = std::make_unique<TagMap>();
        Span elements{item.isOpen() ? items.end : item.value + item.length, item.isOpen(), items.depth, 0};
        if (!readElements(elements, maxLength, at, *map))
            return false;
        items.length += 2 * kHead + elements.length;
        sequence.addItem(map.release());
    }
    return true;
}

bool PlainReader::readFragments(const PlainHead& head, const Span& span, qint64& at)
{
    PlainHead fragment;
    mBytes.setSpan(kFragmentHead);
    for (at = head.value; mHeads.read(at, span.end, mNothing, fragment) && !fragment.isOpen();) {
        at = fragment.value + fragment.length;
        if (fragment.key == DCM_SequenceDelimitationItem)
            return fragment.length == 0;
        if (fragment.key != DCM_Item)
            return false;
        mPixelBytes += kHead + qint64(fragment.length);
    }
    return false;
}

}  // namespace

PlainImage::PlainImage() = default;
PlainImage::PlainImage(PlainImage&&) noexcept = default;
PlainImage& PlainImage::operator=(PlainImage&&) noexcept = default;
PlainImage::~PlainImage() = default;

bool readPlainFile(PlainSource& file, unsigned int maxLength, PlainImage& image)
{
    return isParserAsUsual() && PlainReader(file).read(maxLength, image);
}

}  // namespace Kdd
