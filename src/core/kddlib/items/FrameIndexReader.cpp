#include "kddlib/items/ElementWalk.h"
#include "kddlib/items/FrameIndexData.h"
#include "platform/volume/NativeFrame.h"
#include "platform/volume/StoredFrame.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdatset.h>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcvrobow.h>

#include <cstring>
#include <utility>

namespace Kdd
{

namespace
{

constexpr qint64 kPreamble = 128;
constexpr int kFragmentHead = 64;      // what is read for the head of a fragment [bytes]
constexpr qint64 kLongestValue = 256;  // of those that are looked at [bytes]

/// Whole slides have some 100,000 frames; what claims many more would take memory for nothing.
constexpr int kMaxFragments = 1000 * 1000;

using Element = ElementWalk::Element;

const DcmTagKey kExtendedOffsets(0x7fe0, 0x0001);

bool isPixelKey(const DcmTagKey& key)
{
    return key == DCM_PixelData || key == DCM_FloatPixelData || key == DCM_DoubleFloatPixelData;
}

/// Written in other ways than the walk understands: big endian, deflated as a whole, or both at once.
bool isOtherwise(const QByteArray& syntax)
{
    for (const char* uid : {"1.2.840.10008.1.2.2", "1.2.840.10008.1.2.1.99", "1.2.840.10008.1.2.4.95",
                            "1.2.840.10008.1.2.4.205", "1.2.840.113619.5.2"}) {
        if (syntax == uid)
            return true;
    }
    return syntax.isEmpty();
}

QByteArray trimmed(QByteArray text)
{
    while (text.endsWith('\0') || text.endsWith(' '))
        text.chop(1);
    return text;
}

class Reader
{
public:
    Reader(MediaSource& file, FrameIndex::Private& found)
        : mFile(file)
        , mBytes(file)
        , mFound(found)
    {
    }

    Result read()
    {
        if (!readMeta() || isOtherwise(mFound.transferSyntaxUID))
            return Result::failure(QStringLiteral("The file is not one of the usual form"));
        mFound.isExplicit = mFound.transferSyntaxUID != "1.2.840.10008.1.2";
        Result walked = readDataset();
        if (walked.bad())
            return walked;
        describeFrames();
        return {};
    }

private:
    bool readMeta()
    {
        const char* magic = mBytes.at(kPreamble, 4);
        if (magic == nullptr || std::memcmp(magic, "DICM", 4) != 0)
            return false;
        ElementWalk walk(mBytes, true);
        Element element;
        qint64 at = kPreamble + 4;
        while (walk.read(at, mBytes.size(), element) && element.key.getGroup() == 0x0002 && !element.isOpen) {
            if (element.key == DCM_TransferSyntaxUID)
                mFound.transferSyntaxUID = textOf(element);
            at = element.value + element.length;
        }
        mFound.dataset = at;
        return true;
    }

    Result readDataset()
    {
        ElementWalk walk(mBytes, mFound.isExplicit);
        Element element;
        DcmTagKey last(0x0002, 0xffff);
        mFound.element = {mBytes.size(), 0};
        for (qint64 at = mFound.dataset; at < mBytes.size();) {
            if (!walk.read(at, mBytes.size(), element) || !(last < element.key) || looksExplicit(element))
                return damaged(at);
            last = element.key;
            if (isPixelKey(element.key))
                return readPixels(element);
            if (DCM_PixelData < element.key)
                return {};
            at = walk.endOf(element, mBytes.size());
            if (at < 0)
                return damaged(element.offset);
            note(element);
        }
        return {};
    }

    static Result damaged(qint64 at)
    {
        return Result::failure(QStringLiteral("The file is damaged at byte %1").arg(at));
    }

    /// A dataset that is written with VRs though its meta header says without.
    bool looksExplicit(const Element& element)
    {
        const char* bytes = mFound.isExplicit ? nullptr : mBytes.at(element.offset + 4, 2);
        return bytes != nullptr && bytes[0] >= 'A' && bytes[0] <= 'Z' && bytes[1] >= 'A' && bytes[1] <= 'Z';
    }

    QByteArray textOf(const Element& element)
    {
        const bool isShort = !element.isOpen && element.length <= kLongestValue;
        const char* bytes = isShort ? mBytes.at(element.value, static_cast<int>(element.length)) : nullptr;
        return bytes == nullptr ? QByteArray() : trimmed(QByteArray(bytes, static_cast<int>(element.length)));
    }

    void noteNumber(const Element& element)
    {
        const char* bytes = element.length >= 2 && !element.isOpen ? mBytes.at(element.value, 2) : nullptr;
        if (bytes != nullptr)
            mAttributes.putAndInsertUint16(element.key, qFromLittleEndian<quint16>(bytes));
    }

    void note(const Element& element)
    {
        const DcmTagKey& key = element.key;
        if (key == DCM_SOPInstanceUID)
            mFound.sopInstanceUID = textOf(element);
        else if (key == DCM_StudyInstanceUID)
            mFound.studyInstanceUID = textOf(element);
        else if (key == DCM_NumberOfFrames || key == DCM_PhotometricInterpretation)
            mAttributes.putAndInsertString(key, textOf(element).constData());
        else if (key == DCM_Rows || key == DCM_Columns || key == DCM_SamplesPerPixel ||
                 key == DCM_BitsAllocated || key == DCM_BitsStored || key == DCM_HighBit ||
                 key == DCM_PixelRepresentation || key == DCM_PlanarConfiguration)
            noteNumber(element);
        else if (key == kExtendedOffsets && !element.isOpen)
            mExtendedTable = {element.value, element.length};
    }

    Result readPixels(const Element& element)
    {
        mFound.pixelKey = element.key;
        mFound.pixelVr = mFound.isExplicit ? QByteArray(element.vr, 2) : QByteArray("OW");
        mFound.isEncapsulated = element.isOpen;
        // Bytes under the name of a compression that they do not have would mislead whoever gets them.
        const bool isNative = !mFound.isExplicit || mFound.transferSyntaxUID == "1.2.840.10008.1.2.1";
        if (element.isOpen == isNative)
            return Result::failure(QStringLiteral("The pixel data are not what their transfer syntax says"));
        mBytes.setSpan(kFragmentHead);
        const qint64 end = element.isOpen ? readFragments(element.value) : element.value + element.length;
        if (end < 0)
            return Result::failure(QStringLiteral("The fragments of the pixel data are damaged or cut off"));
        mFound.element = {element.offset, end - element.offset};
        mFound.value = {element.value, end - element.value};
        return {};
    }

    /// From the offset table on; where the delimiter behind the last fragment ends, -1 when it is not reached.
    qint64 readFragments(qint64 at)
    {
        ElementWalk walk(mBytes, mFound.isExplicit);
        Element item;
        for (int i = 0; walk.read(at, mBytes.size(), item) && !item.isOpen; ++i) {
            if (item.key == DCM_SequenceDelimitationItem)
                return i > 0 ? item.value : -1;
            if (item.key != DCM_Item || i > kMaxFragments)
                return -1;
            const FileStretch value{item.value, item.length};
            if (i == 0)
                mBasicTable = value;
            else
                mFound.fragments.append(value);
            at = value.end();
        }
        return -1;
    }

    void describeFrames()
    {
        if (mFound.element.length == 0)
            return;
        // Only which of them is there counts. As what it is by the dictionary DCMTK would refuse it.
        if (mAttributes.insert(new DcmOtherByteOtherWord(DcmTag(mFound.pixelKey, EVR_OB))).bad())
            return;
        mFound.layoutFault = readFrameLayout(mAttributes, mFound.layout);
        mFound.frames = isVideoSyntax(mFound.transferSyntaxUID) ? 1 : numberOfFrames(mAttributes);
        if (mFound.isEncapsulated)
            assignFragments(mFile, mBasicTable, mExtendedTable, mFound);
        else if (mFound.layoutFault.good())
            mFound.sharesChroma = sharesChroma(mFound.layout, mFound.value.length);
    }

    MediaSource& mFile;
    ByteWindow mBytes;
    FrameIndex::Private& mFound;
    DcmDataset mAttributes;  // those that describe the pixels
    FileStretch mBasicTable;
    FileStretch mExtendedTable;
};

}  // namespace

Result FrameIndex::read(MediaSource& file)
{
    auto found = std::make_shared<Private>();
    Result result = Reader(file, *found).read();
    if (result.good())
        d = std::move(found);
    return result;
}

}  // namespace Kdd
