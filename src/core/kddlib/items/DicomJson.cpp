#include "kddlib/items/DicomJson.h"

#include "kddlib/items/TextDecoding.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <QString>

#include <dcmtk/dcmdata/dcjson.h>
#include <dcmtk/dcmdata/dctk.h>

#include <memory>
#include <ostream>

namespace Kdd
{

namespace
{

/// The VR that an element had in its dataset. Two stored codes stand for younger VRs as well, and the dictionary
/// tells which one it was.
DcmTag tagOf(const DcmTagKey& key, const TagElement& element)
{
    if (element.vr() == VrCode::UT || element.vr() == VrCode::UN || element.markedAsOmitted()) {
        const DcmTag known(key);
        if (element.markedAsOmitted())
            return known.getEVR() == EVR_UNKNOWN ? DcmTag(key, EVR_UN) : known;
        switch (known.getEVR()) {
        case EVR_UC:
        case EVR_UR:
        case EVR_OD:
        case EVR_OL:
        case EVR_OV:
        case EVR_SV:
        case EVR_UV:
            if (vrCodeOf(known.getEVR()) == element.vr())
                return known;
            break;
        default:
            break;
        }
    }
    return {key, evrOf(element.vr())};
}

void fill(DcmItem& item, const TagMap& map);

std::unique_ptr<DcmElement> newSequence(const DcmTagKey& key, const TagSequence& source)
{
    auto sequence = std::make_unique<DcmSequenceOfItems>(DcmTag(key, EVR_SQ));
    for (int i = 0; i < source.numItems(); ++i) {
        auto* item = new DcmItem;
        sequence->append(item);
        fill(*item, *source.item(i));
    }
    return sequence;
}

bool isWritten(const DcmTagKey& key)
{
    return key.getGroup() != 0x0006;
}

/// Rebuilds the dataset with the VRs it had, without what was omitted.
void fill(DcmItem& item, const TagMap& map)
{
    const TagMap::iterator end = map.end();
    for (TagMap::iterator it = map.begin(); it != end; ++it) {
        const TagElement& source = *it.value();
        if (source.markedAsOmitted() || !isWritten(it.key()))
            continue;
        std::unique_ptr<DcmElement> element =
            source.isSequence() ? newSequence(it.key(), static_cast<const TagSequence&>(source))
                                : source.newDcmElement(tagOf(it.key(), source));
        if (element != nullptr && item.insert(element.get()).good())
            static_cast<void>(element.release());
    }
}

std::unique_ptr<DcmDataset> rebuilt(const TagMap& map)
{
    auto dataset = std::make_unique<DcmDataset>();
    fill(*dataset, map);
    return dataset;
}

std::unique_ptr<DcmDataset> utf8Dataset(const TagMap& map)
{
    std::unique_ptr<DcmDataset> dataset = rebuilt(map);
    if (!convertToUtf8(*dataset))
        dataset = rebuilt(map);
    // What declares itself as UTF-8 was not looked at, and JSON is UTF-8 by definition.
    convertValuesToUtf8(*dataset);
    return dataset;
}

/// Writes a dataset beside the map it was made from: the dataset has the converted values, the map knows what was
/// left out.
class JsonWriter
{
public:
    explicit JsonWriter(std::ostream& out)
        : mOut(out)
        , mFormat(OFFalse)
    {
    }

    void object(DcmItem& item, const TagMap& map, const std::string& address)
    {
        mOut << '{';
        bool isFirst = true;
        const TagMap::iterator end = map.end();
        TagMap::iterator source = map.begin();
        for (DcmObject* next = item.nextInContainer(nullptr); next != nullptr;
             next = item.nextInContainer(next)) {
            const DcmTagKey key(next->getGTag(), next->getETag());
            for (; source != end && source.key() < key; ++source)
                omitted(source, address, isFirst);
            const bool isFromMap = source != end && source.key() == key;
            separate(isFirst);
            if (isFromMap && source.value()->isSequence())
                sequence(static_cast<DcmSequenceOfItems&>(*next),
                         static_cast<const TagSequence&>(*source.value()), address + '/' + name(key));
            else
                next->writeJson(mOut, mFormat);
            if (isFromMap)
                ++source;
        }
        for (; source != end; ++source)
            omitted(source, address, isFirst);
        mOut << '}';
    }

private:
    static std::string name(const DcmTagKey& key)
    {
        return QString::asprintf("%04X%04X", unsigned(key.getGroup()), unsigned(key.getElement()))
            .toStdString();
    }

    void separate(bool& isFirst)
    {
        if (!isFirst)
            mOut << ',';
        isFirst = false;
    }

    void omitted(const TagMap::iterator& source, const std::string& address, bool& isFirst)
    {
        if (!source.value()->markedAsOmitted() || !isWritten(source.key()))
            return;
        separate(isFirst);
        const std::string key = name(source.key());
        DcmVR vr(tagOf(source.key(), *source.value()).getEVR());
        mOut << '"' << key << "\":{\"vr\":\"" << vr.getValidVRName() << "\",\"BulkDataURI\":";
        DcmJsonFormat::printString(mOut, address + '/' + key);
        mOut << '}';
    }

    void sequence(DcmSequenceOfItems& sequence, const TagSequence& source, const std::string& address)
    {
        mOut << '"' << name(sequence.getTag()) << "\":{\"vr\":\"SQ\"";
        int i = 0;
        for (DcmObject* item = sequence.nextInContainer(nullptr); item != nullptr;
             item = sequence.nextInContainer(item), ++i) {
            mOut << (i == 0 ? ",\"Value\":[" : ",");
            object(static_cast<DcmItem&>(*item), *source.item(i), address + '/' + std::to_string(i));
        }
        mOut << (i > 0 ? "]}" : "}");
    }

    std::ostream& mOut;
    DcmJsonFormatCompact mFormat;
};

}  // namespace

void writeDicomJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot)
{
    const std::unique_ptr<DcmDataset> dataset = utf8Dataset(map);
    JsonWriter(out).object(*dataset, map, bulkDataRoot);
}

}  // namespace Kdd
