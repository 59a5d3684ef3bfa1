#include "core/items/DatasetJson.h"

#include "kddlib/items/TextDecoding.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <QString>

#include <dcmtk/dcmdata/dcjson.h>
#include <dcmtk/dcmdata/dctk.h>

#include <charconv>
#include <limits>
#include <memory>
#include <regex>
#include <sstream>
#include <type_traits>

namespace Kdd
{

namespace
{

bool isWritten(const DcmTagKey& key)
{
    return key.getGroup() != 0x0006;
}

std::unique_ptr<DcmDataset> rebuilt(const TagMap& map)
{
    auto dataset = std::make_unique<DcmDataset>();
    map.insertInto(*dataset);
    return dataset;
}

std::unique_ptr<DcmDataset> utf8Dataset(const TagMap& map)
{
    std::unique_ptr<DcmDataset> dataset = rebuilt(map);
    const bool isConverted = convertToUtf8(*dataset);
    if (!isConverted)
        dataset = rebuilt(map);
    // What declares itself as UTF-8 was not looked at, and JSON is UTF-8 by definition.
    const bool hasChanged = convertValuesToUtf8(*dataset);
    if (!isConverted && !hasChanged)
        declareUtf8(*dataset);
    return dataset;
}

/// Writes a dataset beside the map it was made from: the dataset has the converted values, the map knows what was
/// left out.
class JsonWriter
{
public:
    JsonWriter(std::ostream& out, JsonEntries entries)
        : mOut(out)
        , mEntries(entries)
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
                omitted(map, source, address, isFirst);
            if (!isWanted(map, key))
                continue;
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
            omitted(map, source, address, isFirst);
        mOut << '}';
    }

private:
    static std::string name(const DcmTagKey& key)
    {
        return QString::asprintf("%04X%04X", unsigned(key.getGroup()), unsigned(key.getElement()))
            .toStdString();
    }

    bool isWanted(const TagMap& map, const DcmTagKey& key) const
    {
        return isWritten(key) && (mEntries == JsonEntries::Merged || map.tagsForLevel().contains(key));
    }

    void separate(bool& isFirst)
    {
        if (!isFirst)
            mOut << ',';
        isFirst = false;
    }

    void omitted(const TagMap& map, const TagMap::iterator& source, const std::string& address, bool& isFirst)
    {
        if (!source.value()->markedAsOmitted() || !isWanted(map, source.key()))
            return;
        separate(isFirst);
        const std::string key = name(source.key());
        // The value's own VR went with it.
        const DcmVR vr(DcmTag(source.key()).getEVR());
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
            object(static_cast<DcmItem&>(*item), source.itemToRead(i), address + '/' + std::to_string(i));
        }
        mOut << (i > 0 ? "]}" : "}");
    }

    std::ostream& mOut;
    JsonEntries mEntries;
    DcmJsonFormatCompact mFormat;
};

template <typename Real>
std::string comparableReal(Real value)
{
    // As certain as DCMTK gives them.
    constexpr int kDigits = std::is_same_v<Real, float> ? std::numeric_limits<float>::max_digits10 : 10;
    char digits[32];
    const auto written = std::to_chars(digits, digits + sizeof digits, value == 0 ? 0 : value,
                                       std::chars_format::general, kDigits);
    return {digits, written.ptr};
}

template <typename Real>
std::string withReals(const std::string& json)
{
    const std::string opening =
        std::is_same_v<Real, float> ? R"("vr":"FL","Value":[)" : R"("vr":"FD","Value":[)";
    std::string written;
    std::size_t at = 0;
    for (std::size_t found = json.find(opening); found != std::string::npos; found = json.find(opening, at)) {
        written.append(json, at, found + opening.size() - at);
        at = found + opening.size();
        while (json.at(at) != ']') {
            const std::size_t next = json.find_first_of(",]", at);
            const char* const end = json.data() + next;
            Real value = 0;
            // What is no number stays as it is.
            const bool isNumber = std::from_chars(json.data() + at, end, value).ptr == end;
            written += isNumber ? comparableReal(value) : json.substr(at, next - at);
            at = next + (json.at(next) == ',' ? 1 : 0);
            written += json.at(next) == ',' ? "," : "";
        }
    }
    return written + json.substr(at);
}

}  // namespace

std::string datasetJson(const TagMap& map, const std::string& bulkDataRoot, JsonEntries entries)
{
    std::ostringstream out;
    JsonWriter(out, entries).object(*utf8Dataset(map), map, bulkDataRoot);
    return out.str();
}

std::string comparable(const std::string& json)
{
    static const std::regex kNoValues(R"re(,"Value":\[null(,null)*\])re");
    return withReals<float>(withReals<double>(std::regex_replace(json, kNoValues, "")));
}

}  // namespace Kdd
