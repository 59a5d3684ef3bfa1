#include "kddlib/Limits.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"

#include <QFile>

#include <dcmtk/dcmdata/dcpixel.h>
#include <dcmtk/dcmdata/dcpixseq.h>
#include <gtest/gtest.h>

#include <algorithm>

using namespace Kdd;

namespace
{

const E_TransferSyntax kSyntaxes[] = {EXS_LittleEndianImplicit, EXS_LittleEndianExplicit,
                                      EXS_BigEndianExplicit, EXS_DeflatedLittleEndianExplicit};

struct Sample
{
    std::vector<DcmEVR> vrs;
    const char* one;  // of odd length where the representation has any
    const char* several;
};

const Sample kSamples[] = {
    {{EVR_AT}, "(0008,0018)", "(0008,0018)\\(7fe0,0010)"},
    {{EVR_FL, EVR_OF, EVR_FD, EVR_OD}, "-0.1", "1e-30\\inf"},
    {{EVR_OB, EVR_UN}, "01\\ff\\80", "01\\ff\\80\\00"},
    {{EVR_OW, EVR_ox, EVR_lt}, "ff01", "ff01\\0002\\8003"},
    {{EVR_SS, EVR_SL, EVR_SV}, "-2", "-32768\\7"},
    {{EVR_US, EVR_xs, EVR_UL, EVR_up, EVR_OL, EVR_OV, EVR_UV}, "65535", "1\\65534"},
};
const Sample kTextSample = {{}, "M\xfcl", " a\\\\b \xfc"};

const Sample& sampleOf(DcmEVR vr)
{
    for (const Sample& sample : kSamples) {
        if (std::count(sample.vrs.begin(), sample.vrs.end(), vr) > 0)
            return sample;
    }
    return kTextSample;
}

/// No value, one, or several in turn.
DcmElement* newElement(const DcmTag& tag, int turn)
{
    DcmElement* element = nullptr;
    const Sample& sample = sampleOf(tag.getEVR());
    const char* const values[] = {"", sample.one, sample.several};
    EXPECT_TRUE(DcmItem::newDicomElementWithVR(element, tag).good());
    EXPECT_TRUE(element->putString(values[turn % 3]).good()) << tag.getVRName();
    EXPECT_EQ(element->getLengthField() == 0, turn % 3 == 0) << tag.getVRName();
    return element;
}

DcmElement* newSequence(const DcmTag& tag, int turn)
{
    auto* sequence = new DcmSequenceOfItems(tag);
    for (int i = 0; i < turn % 3; ++i) {
        auto* item = new DcmItem;
        item->insert(newElement(DCM_PatientID, i));
        item->insert(newElement(DcmTag(0x0009, 0x1001, EVR_UT), 1));
        item->insert(newSequence(DCM_ReferencedImageSequence, i));
        sequence->append(item);
    }
    return sequence;
}

/// Every public attribute of the dictionary, with its representation there.
std::vector<DcmTag> publicTags()
{
    std::vector<DcmTag> tags;
    const auto collect = [&tags](const DcmDictEntry& entry) {
        const DcmEVR vr = entry.getEVR() == EVR_px ? EVR_OW : entry.getEVR();
        const DcmTagKey key = entry.getKey();
        if (entry.getPrivateCreator() == nullptr && key.getGroup() >= 8 && key.getElement() != 0 &&
            vr != EVR_na)
            tags.emplace_back(key, DcmVR(vr));
    };
    DcmDataDictionary& dictionary = dcmDataDict.wrlock();
    for (auto it = dictionary.normalBegin(); it != dictionary.normalEnd(); ++it)
        collect(**it);
    for (auto it = dictionary.repeatingBegin(); it != dictionary.repeatingEnd(); ++it)
        collect(**it);
    dcmDataDict.wrunlock();
    return tags;
}

std::vector<DcmTag> privateTags()
{
    std::vector<DcmTag> tags{{0x0009, 0x10ff, EVR_UN}};
    for (int vr = EVR_AE; vr <= EVR_UV; ++vr)
        tags.emplace_back(0x0009, static_cast<Uint16>(0x1000 + vr), DcmVR(static_cast<DcmEVR>(vr)));
    return tags;
}

/// What a dataset holds, value by value, so that the first difference can be read. Codes stand for VRs because private
/// values of younger ones come back as what they are stored as.
std::string contentOf(DcmItem& item, const std::string& indent = {})
{
    std::string text;
    for (DcmObject* object = item.nextInContainer(nullptr); object != nullptr;
         object = item.nextInContainer(object)) {
        if (object->getETag() == 0)
            continue;  // a group length
        text += indent + object->getTag().toString().c_str() + ' ' + vrName(vrCodeOf(object->getVR())) + ' ';
        if (object->ident() == EVR_SQ) {
            auto& sequence = static_cast<DcmSequenceOfItems&>(*object);
            for (unsigned long i = 0; i < sequence.card(); ++i)
                text += "\n" + indent + " item\n" + contentOf(*sequence.getItem(i), indent + "  ");
        } else if (auto& element = static_cast<DcmElement&>(*object); element.getLengthField() > 0) {
            QByteArray bytes(static_cast<int>(element.getLengthField()), 0);
            element.getPartialValue(bytes.data(), 0, element.getLengthField(), nullptr, gLocalByteOrder);
            text += bytes.toHex().toStdString();
        }
        text += '\n';
    }
    return text;
}

class DatasetRoundTrip : public FileTest
{
protected:
    void SetUp() override { OFLog::configure(OFLogger::OFF_LOG_LEVEL); }

    void store(DcmDataset& dataset, E_TransferSyntax xfer, DcmFileFormat& read)
    {
        const OFCondition written = DcmFileFormat(&dataset).saveFile(path().toLocal8Bit().constData(), xfer);
        EXPECT_TRUE(written.good()) << written.text();
        EXPECT_TRUE(read.loadFile(path().toLocal8Bit().constData()).good());
    }

    /// Whether a file of the dataset is the same after it has gone through the cache.
    void expectKept(DcmDataset& dataset, E_TransferSyntax xfer, const QString& name = {})
    {
        DcmFileFormat file;
        store(dataset, xfer, file);
        const std::string expected = contentOf(*file.getDataset());
        const std::unique_ptr<TagMap> map(TagMap::createTagMap(file.getDataset(), kLargeValueBound));
        EXPECT_TRUE(map->deleteElement(kTransferSyntax));
        DcmDataset rebuilt;
        map->insertInto(rebuilt);
        store(rebuilt, xfer, file);
        EXPECT_EQ(contentOf(*file.getDataset()), expected) << DcmXfer(xfer).getXferName() << qPrintable(name);
    }

    void expectKept(const std::vector<DcmTag>& tags)
    {
        for (int turn = 0; turn < 3; ++turn) {
            DatasetBuilder image = anImage();
            int number = turn;
            for (const DcmTag& tag : tags)
                image.with(tag.getEVR() == EVR_SQ ? newSequence(tag, number++) : newElement(tag, number++));
            image.with(DCM_SOPClassUID, UID_SecondaryCaptureImageStorage).with(DCM_SOPInstanceUID, "1.2.3");
            image.withLong(DCM_TextValue, 5001);
            for (const E_TransferSyntax xfer : kSyntaxes)
                expectKept(image.dataset(), xfer);
        }
    }
};

TEST_F(DatasetRoundTrip, KeepsEveryByteOfEveryAttributeAndRepresentation)
{
    expectKept(publicTags());
    expectKept(privateTags());
}

TEST_F(DatasetRoundTrip, KeepsTheRepresentationThatADatasetChose)
{
    // Where the dictionary leaves a choice, where it knows better, and bytes in the place of a sequence.
    const DcmTag choices[] = {{DCM_SmallestImagePixelValue, EVR_SS},
                              {DCM_LUTDescriptor, EVR_SS},
                              {DCM_LUTDescriptor, EVR_US},
                              {DCM_LUTData, EVR_US},
                              {DCM_LUTData, EVR_OW},
                              {DCM_PixelData, EVR_OB},
                              {DCM_PixelData, EVR_OW},
                              {DcmTagKey(0x6002, 0x3000), EVR_OB},
                              {DcmTagKey(0x6002, 0x3000), EVR_OW},
                              {DCM_PatientWeight, EVR_FL},
                              {DCM_Rows, EVR_UN},
                              {DCM_ReferencedImageSequence, EVR_UN}};
    for (const DcmTag& tag : choices) {
        for (const E_TransferSyntax xfer : {EXS_LittleEndianExplicit, EXS_BigEndianExplicit})
            expectKept(anImage().with(newElement(tag, 2)).dataset(), xfer);
    }
}

TEST_F(DatasetRoundTrip, KeepsEveryByteOfRealFiles)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of real files";
    for (const char* folder :
         {"modalities", "multiframe", "charsets", "series", "odd", "transfer-syntaxes"}) {
        for (const QString& name : realFiles(folder)) {
            DcmFileFormat file;
            // One file nests so deep that DCMTK's own reading would end the process.
            if (name.contains(QLatin1String("Deeply-Nested")) ||
                file.loadFile(name.toLocal8Bit().constData()).bad())
                continue;
            const E_TransferSyntax xfer = file.getDataset()->getOriginalXfer();
            file.getDataset()->findAndDeleteElement(DCM_PixelData, OFTrue, OFTrue);
            expectKept(*file.getDataset(), DcmXfer(xfer).isEncapsulated() ? EXS_LittleEndianExplicit : xfer,
                       name);
        }
    }
}

TEST_F(DatasetRoundTrip, TakesAValueThatCannotBeReadAnyMoreForOmitted)
{
    DcmFileFormat file;
    store(anImage().withLong(DCM_TextValue, 5000).dataset(), EXS_LittleEndianExplicit, file);
    ASSERT_TRUE(QFile::remove(path()));
    const LogCapture log;
    const std::unique_ptr<TagMap> map(TagMap::createTagMap(file.getDataset(), 10000));
    EXPECT_TRUE(map->findElement(DCM_TextValue)->markedAsOmitted());
    EXPECT_EQ(log.count("Value of (0040,a160) cannot be read and is left out: "), 1);
}

struct Bounded
{
    DcmTag tag;
    int length;
    bool isKept;
};

const Bounded kBounded[] = {{DCM_PatientComments, 1024, true},      {DCM_PatientComments, 1026, false},
                            {DCM_GraphicData, 2000, true},          {DCM_GraphicData, 0x1000004, false},
                            {DCM_FrameTimeVector, 2000, true},      {DCM_PixelData, 2000, false},
                            {{0x0029, 0x1000, EVR_OB}, 2000, true}, {{0x0029, 0x1001, EVR_OB}, 2000, false},
                            {{0x0071, 0x1021, EVR_OB}, 2000, true}, {{0x0071, 0x1062, EVR_OB}, 2000, true},
                            {{0x0071, 0x1064, EVR_OB}, 2000, true}, {{0x0071, 0x1063, EVR_OB}, 2000, false},
                            {{0x501e, 0x3000, EVR_OB}, 2000, true}, {{0x5020, 0x3000, EVR_OB}, 2000, false},
                            {{0x601e, 0x3000, EVR_OB}, 2000, true}, {{0x6020, 0x3000, EVR_OB}, 2000, false}};

DcmElement* longElement(const DcmTag& tag, int length)
{
    return TagElement(vrCodeOf(tag.getEVR()), QByteArray(length, 'x')).newDcmElement(tag).release();
}

TEST(CreateTagMap, HasALargerBoundForWhatViewersNeedWhole)
{
    for (const Bounded& row : kBounded) {
        const std::unique_ptr<TagMap> map(anImage().with(longElement(row.tag, row.length)).map());
        const TagElement* element = map->findElement(row.tag.getXTag());
        EXPECT_EQ(element->markedAsOmitted(), !row.isKept) << row.tag.toString();
        EXPECT_EQ(element->value().size(), row.isKept ? row.length : 0) << row.tag.toString();
    }
}

TEST(CreateTagMap, OmitsLongPrivateSequencesAsAWholeAndOthersValueByValue)
{
    const DcmTagKey sequences[] = {DCM_ReferencedImageSequence, DCM_VOILUTSequence, {0x0009, 0x1001}};
    DatasetBuilder image = anImage();
    for (const DcmTagKey& key : sequences)
        image.withItem(DcmTag(key, EVR_SQ), anItem().with(longElement(DCM_LUTData, 1200)));
    const std::unique_ptr<TagMap> map(image.map());
    EXPECT_TRUE(map->findElement(sequences[2])->markedAsOmitted());
    for (const int i : {0, 1}) {
        const auto* sequence = static_cast<const TagSequence*>(map->findElement(sequences[i]));
        EXPECT_EQ(sequence->item(0)->findElement(DCM_LUTData)->markedAsOmitted(), i == 0);
    }
}

TEST(CreateTagMap, LeavesOutEncapsulatedPixelsAndNotesTheTransferSyntax)
{
    auto* pixels = new DcmPixelData(DCM_PixelData);
    auto* fragments = new DcmPixelSequence(DcmTag(DCM_PixelData, EVR_OB));
    pixels->putOriginalRepresentation(EXS_RLELossless, nullptr, fragments);
    const DatasetBuilder image = anImage().with(pixels);
    EXPECT_EQ(std::unique_ptr<TagMap>(image.map())->findElement(kTransferSyntax), nullptr);
    image.dataset().updateOriginalXfer();
    const std::unique_ptr<TagMap> map(image.map());
    EXPECT_TRUE(map->findElement(DCM_PixelData)->markedAsOmitted());
    EXPECT_EQ(map->findElement(kTransferSyntax)->value(), QByteArray(1, char(EXS_RLELossless)));
}

}  // namespace
