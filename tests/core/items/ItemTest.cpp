#include "kddlib/items/kdditemof.h"
#include "kddlib/items/kdditemtm.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"

#include <QTemporaryDir>

#include <dcmtk/dcmdata/dcpixel.h>
#include <dcmtk/dcmdata/dcpixseq.h>
#include <gmock/gmock.h>

#include <set>
#include <sstream>

using namespace Kdd;

namespace
{

/// What an item answers, or its condition when that is an error.
template <typename T, OFCondition (Item::*get)(const DcmTagKey&, T&)>
std::string one(Item& item, const DcmTagKey& key)
{
    T value{};
    const OFCondition condition = (item.*get)(key, value);
    return condition.good() ? (std::ostringstream() << value).str() : condition.text();
}

template <typename T, OFCondition (Item::*get)(const DcmTagKey&, const T*&, unsigned long*)>
std::string array(Item& item, const DcmTagKey& key)
{
    const T* values = nullptr;
    unsigned long count = 0;
    const OFCondition condition = (item.*get)(key, values, &count);
    return condition.good() ? testing::PrintToString(std::vector<T>(values, values + count))
                            : condition.text();
}

using Ask = std::string (*)(Item& item, const DcmTagKey& key);

constexpr auto kText = one<OFString, &Item::findAndGetOFString>;
constexpr auto kTexts = one<OFString, &Item::findAndGetOFStringArray>;
constexpr auto kLong = one<long, &Item::findAndGetLongInt>;
constexpr auto kUint16 = one<Uint16, &Item::findAndGetUint16>;

/// The ways to ask an item, each for values of the representations named; texts for all that are not shortened.
const std::pair<Ask, std::set<DcmEVR>> kQueries[] = {
    {kText, {}},
    {kTexts, {}},
    {kLong, {EVR_SL, EVR_SS, EVR_UL, EVR_US, EVR_IS}},
    {kUint16, {EVR_SS, EVR_US, EVR_OW, EVR_xs, EVR_lt}},
    {array<Sint16, &Item::findAndGetSint16Array>, {EVR_SS}},
    {array<Uint16, &Item::findAndGetUint16Array>, {EVR_US, EVR_OW, EVR_xs, EVR_lt}},
    {array<Uint8, &Item::findAndGetUint8Array>, {EVR_OB}},
    {array<Float32, &Item::findAndGetFloat32Array>, {EVR_FL, EVR_OF}},
};
const std::set<DcmEVR> kShortened = {EVR_OB, EVR_OW, EVR_ox, EVR_lt, EVR_UN, EVR_SQ};

const DcmTag kWords(0x0009, 0x1001, EVR_OW);
const std::tuple<DcmTag, const char*, Ask, const char*> kRows[] = {
    {DCM_ImageType, "DERIVED \\PRIMARY", kText, "DERIVED"},
    {DCM_ImageType, "DERIVED \\PRIMARY", kTexts, "DERIVED\\PRIMARY"},
    {DCM_ImageComments, "a\\b", kText, "a\\b"},
    {DCM_PhysicalDeltaX, "862399761.111", kText, "862399761.11099994"},
    {kWords, "12ab\\0001", kText, "12ab"},
    {DCM_PatientID, "", kText, ""},
    {DCM_PatientName, nullptr, kTexts, "Tag not found"},
    {DCM_InstanceNumber, " -7", kLong, "-7"},
    {DCM_SimpleFrameList, "4294967295", kLong, "4294967295"},
    {DCM_TagAngleSecondAxis, "-1", kUint16, "65535"},
    {kWords, "12ab\\0001", array<Uint16, &Item::findAndGetUint16Array>, "{ 4779, 1 }"},
    {kWords, nullptr, array<Uint16, &Item::findAndGetUint16Array>, "Tag not found"},
};

TEST(BothItems, GiveTheAnswerOfDcmtk)
{
    for (const auto& [tag, value, ask, answer] : kRows) {
        DatasetBuilder image = anImage();
        if (value != nullptr)
            image.with(tag, value);
        const std::unique_ptr<TagMap> map(image.map());
        ItemOF itemOF(image.dataset());
        ItemTM itemTM(*map);
        EXPECT_EQ(ask(itemOF, tag), answer) << DcmTag(tag).getTagName();
        EXPECT_EQ(ask(itemTM, tag), answer) << DcmTag(tag).getTagName();
    }
}

TEST(BothItems, GiveTheSameSequences)
{
    const DcmTag key = DCM_ReferencedSeriesSequence;
    const DatasetBuilder deep =
        anItem().withItem(DCM_ReferencedSOPSequence, anItem().with(DCM_PatientID, "P"));
    DatasetBuilder image = anImage();
    image.withItem(key, anItem().with(DCM_SeriesInstanceUID, "1.3")).withItem(key, deep);
    DcmSequenceOfItems* original = nullptr;
    image.dataset().findAndGetSequence(key, original);
    const std::unique_ptr<TagMap> map(image.map());
    ItemOF itemOF(image.dataset());
    ItemTM itemTM(*map);
    for (Item* item : {static_cast<Item*>(&itemOF), static_cast<Item*>(&itemTM)}) {
        SequenceOfItems* sequence = nullptr;
        Item* second = nullptr;
        Item* other = nullptr;
        ASSERT_TRUE(item->findAndGetSequence(key, sequence).good());
        ASSERT_TRUE(item->findAndGetSequenceItem(key, second, 1).good());
        EXPECT_EQ(second, sequence->getItem(1));
        ASSERT_TRUE(second->findAndGetSequenceItem(DCM_ReferencedSOPSequence, other).good());
        EXPECT_EQ(kText(*other, DCM_PatientID), "P");
        for (const int index : {-1, 2}) {
            const OFCondition condition = item->findAndGetSequenceItem(key, other, index);
            EXPECT_STREQ(condition.text(), item == &itemOF ? EC_IllegalCall.theText : "index out of range");
            EXPECT_EQ(other, nullptr);
        }
        EXPECT_TRUE(item->findAndGetSequenceItem(DCM_SOPInstanceUID, other) == EC_InvalidVR);
        EXPECT_TRUE(item->findAndGetSequenceItem(DCM_VOILUTSequence, other) == EC_TagNotFound);
        const std::unique_ptr<DcmSequenceOfItems> copy(sequence->createDcmSequenceOfItems());
        EXPECT_EQ(copy->compare(*original), 0);
    }
}

TEST(ItemTM, SharesWhatItHandedOutWithItsCopies)
{
    const std::unique_ptr<TagMap> map(anImage().withItem(DCM_ReferencedSeriesSequence, anItem()).map());
    auto source = std::make_unique<ItemTM>(*map);
    Item* handedOut = nullptr;
    source->findAndGetSequenceItem(DCM_ReferencedSeriesSequence, handedOut, 0);
    ItemTM copy(*source);
    source.reset();
    Item* again = nullptr;
    copy.findAndGetSequenceItem(DCM_ReferencedSeriesSequence, again, 0);
    EXPECT_EQ(again, handedOut);
    EXPECT_EQ(kText(*again, DCM_PatientID), "Tag not found");
}

class ItemOfTagFile : public testing::Test
{
protected:
    ItemOfTagFile()
    {
        file.addTagMap(anImage("1").with(DCM_PatientID, "P").with(DCM_Rows, "512").map(), "1.2/1_s.dcm",
                       true);
        file.addTagMap(anImage("2").with(DCM_Rows, "512").map(), nullptr, true);
    }

    TagFile file;
};

TEST_F(ItemOfTagFile, SeesWhatItInheritsAndWhatIsOmittedButNotWhatIsMissing)
{
    const std::shared_ptr<Item> item = file.findImageEx("2", "s");
    EXPECT_EQ(file.findImageEx("1", "other"), nullptr);
    EXPECT_EQ(file.findImageEx("3", ""), nullptr);
    EXPECT_EQ(kUint16(*item, DCM_Rows), "512");
    EXPECT_EQ(kText(*item, DCM_PatientID), "Tag not found");
    EXPECT_EQ(kText(*file.findImageEx("1", "s"), DCM_PatientID), "P");
    file.findImage("2")->markAsOmitted(DCM_ImageComments);
    DcmEVR vr = EVR_na;
    EXPECT_TRUE(item->tagExists(DCM_ImageComments, vr) && vr == EVR_UNKNOWN);
    EXPECT_EQ(kText(*item, DCM_ImageComments), "");
    EXPECT_EQ(kUint16(*item, DCM_ImageComments), EC_ValueRepresentationViolated.theText);
    file.clear();
    EXPECT_EQ(kUint16(*item, DCM_Rows), "512") << "the study lives on";
}

TEST_F(ItemOfTagFile, ChangesAnInheritedValueForAllAndAddsANewOneToItself)
{
    const std::shared_ptr<Item> one = file.findImageEx("1", "");
    const std::shared_ptr<Item> two = file.findImageEx("2", "");
    const DcmTagKey unknown(0x0009, 0x1001);
    file.findImage("2")->markAsOmitted(DCM_Columns);
    for (const DcmTagKey& key : {DCM_Rows, DCM_Columns, DCM_SmallestImagePixelValue, unknown, DCM_PixelData})
        EXPECT_TRUE(two->putAndInsertStringArray(key, "7").good());
    EXPECT_EQ(kUint16(*one, DCM_Rows), "7");
    EXPECT_EQ(kUint16(*one, DCM_Columns), "Tag not found");
    EXPECT_EQ(kUint16(*two, DCM_Columns), "7");
    EXPECT_EQ(kUint16(*two, DCM_SmallestImagePixelValue), "7");
    EXPECT_EQ(kText(*two, unknown) + kText(*two, DCM_PixelData), "77");
}

TEST_F(ItemOfTagFile, LoadsItsFileOnceAndComplainsOnce)
{
    const QTemporaryDir folder;
    const QByteArray path = folder.filePath(QStringLiteral("1_s.dcm")).toLocal8Bit();
    anImage("1").withLong(DCM_ImageComments, 5000).save(QFile::decodeName(path));
    file.findImage("1")->putAndInsertValue(kFilePath, VrCode::LO, path);
    const std::shared_ptr<DcmDataset> loaded = file.findImageEx("1", "")->obtainDcmDataset();
    ASSERT_NE(loaded, nullptr);
    EXPECT_EQ(kText(*std::make_unique<ItemOF>(loaded), DCM_ImageComments).size(), 5000U);

    const LogCapture log;
    const std::shared_ptr<Item> other = file.findImageEx("2", "");
    EXPECT_EQ(other->obtainDcmDataset(), nullptr);
    file.findImage("2")->putAndInsertValue(kFilePath, VrCode::LO, "/no/such/file");
    for (int i = 0; i < 2; ++i)
        EXPECT_EQ(other->obtainDcmDataset(), nullptr);
    EXPECT_THAT(log.lines(), testing::ElementsAre("KDD_DicomFilePath undefined, cannot load DICOM file",
                                                  "Could not load /no/such/file: No such file or directory"));
}

TEST(ItemTM, TellsTheTransferSyntaxFromOneByte)
{
    const std::pair<QByteArray, E_TransferSyntax> rows[] = {{"\3", EXS_BigEndianExplicit},
                                                            {"\4", EXS_JPEGProcess1},
                                                            {"\xff", EXS_Unknown},
                                                            {"\4\4", EXS_Unknown}};
    for (const auto& [bytes, syntax] : rows) {
        TagMap map;
        ItemTM item(map);
        EXPECT_EQ(item.transferSyntax(), EXS_Unknown);
        map.putAndInsertValue(kTransferSyntax, VrCode::OB, bytes);
        EXPECT_EQ(item.isEncapsulated(), bytes == "\4" || bytes == "\xff") << bytes.toHex().constData();
        EXPECT_EQ(item.transferSyntax(), syntax) << bytes.toHex().constData();
    }
}

TEST(ItemOF, TellsTheTransferSyntaxFromThePixels)
{
    DatasetBuilder image = anImage().with(DcmTag(DCM_PixelData, EVR_OW), "0001");
    ItemOF item(image.dataset());
    EXPECT_FALSE(item.isEncapsulated());
    auto* pixels = new DcmPixelData(DCM_PixelData);
    pixels->putOriginalRepresentation(EXS_RLELossless, nullptr, new DcmPixelSequence(DCM_PixelSequenceTag));
    image.with(pixels);
    EXPECT_TRUE(item.isEncapsulated());
    EXPECT_EQ(item.transferSyntax(), EXS_RLELossless);
    image.without(DCM_PixelData);
    EXPECT_EQ(item.transferSyntax(), EXS_Unknown);
}

/// Asks both for all that the cache keeps; how many answers were held against each other.
int compare(Item& itemOF, ItemTM& itemTM, const std::string& where)
{
    int count = 0;
    const TagMap::iterator end = itemTM.tagMap().end();
    for (TagMap::iterator it = itemTM.tagMap().begin(); it != end; ++it) {
        const DcmTagKey key = it.key();
        const std::string at = where + key.toString().c_str();
        if (it.value()->markedAsOmitted() || key.getGroup() == 0x0006)
            continue;
        DcmEVR vrs[] = {EVR_na, EVR_na};
        EXPECT_TRUE(itemOF.tagExists(key, vrs[0]) && itemTM.tagExists(key, vrs[1])) << at;
        EXPECT_EQ(vrCodeOf(vrs[0]), vrCodeOf(vrs[1])) << at;
        SequenceOfItems* of = nullptr;
        SequenceOfItems* tm = nullptr;
        EXPECT_EQ(itemOF.findAndGetSequence(key, of), itemTM.findAndGetSequence(key, tm)) << at;
        EXPECT_EQ(of != nullptr ? of->card() : 0, tm != nullptr ? tm->card() : 0) << at;
        for (unsigned int i = 0; of != nullptr && i < of->card(); ++i)
            count += compare(*of->getItem(i), static_cast<ItemTM&>(*tm->getItem(i)), at + " item ");
        // An empty number is an error to a dataset and just empty to the cache; a text of several is none to the cache.
        const QByteArray& value = it.value()->value();
        bool isNumber = true;
        if (vrs[0] == EVR_IS)
            value.trimmed().toInt(&isNumber);
        for (const auto& [ask, asked] : kQueries) {
            const bool isText = asked.empty() && kShortened.count(evrOf(it.value()->vr())) == 0;
            if (value.isEmpty() || !(isText || (isNumber && asked.count(vrs[0]) > 0)))
                continue;
            EXPECT_EQ(ask(itemOF, key), ask(itemTM, key)) << at;
            ++count;
        }
    }
    return count;
}

TEST(BothItems, AnswerAlikeForRealFiles)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of real files";
    OFLog::configure(OFLogger::OFF_LOG_LEVEL);
    int count = 0;
    for (const QString& path : realFiles("")) {
        DcmFileFormat file;
        if (readDicomFile(path.toLocal8Bit().constData(), file).bad())
            continue;  // among the odd ones
        const std::unique_ptr<TagMap> map(TagMap::createTagMap(file.getDataset(), 1024));
        ItemOF itemOF(*file.getDataset());
        ItemTM itemTM(*map);
        count += compare(itemOF, itemTM, path.toStdString() + " ");
    }
    EXPECT_GT(count, 100000);
}

}  // namespace
