#include "kddlib/items/DicomJson.h"

#include "core/items/DatasetJson.h"
#include "kddlib/Limits.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/DatasetBuilder.h"
#include "support/RealFiles.h"

#include <QJsonDocument>

#include <dcmtk/dcmdata/dcjson.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <array>
#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>
#include <memory>
#include <random>
#include <sstream>

using namespace Kdd;

namespace
{

std::string jsonOf(const TagMap& map)
{
    std::ostringstream out;
    writeDicomJson(out, map, "root");
    return out.str();
}

std::string jsonOf(const DatasetBuilder& dataset)
{
    return jsonOf(*std::unique_ptr<TagMap>(dataset.map()));
}

/// What DCMTK writes of a dataset in UTF-8; empty when it cannot convert it.
std::string jsonByDcmtk(DcmDataset& dataset)
{
    DcmJsonFormatCompact format(OFFalse);
    std::ostringstream out;
    if (dataset.convertToUTF8().bad())
        return {};
    dataset.writeJson(out, format);
    return '{' + out.str() + '}';
}

/// A character set, a name, and how it is shown in UTF-8.
const std::array<const char*, 3> kEncoded[] = {
    {{"ISO_IR 100", "M\xfcller", "Müller"}},
    {{"ISO_IR 144", "\xbb\xee\xda\x63\x65\xdc\xd1\xe3\xe0", "Люкceмбур"}},
    {{"ISO_IR 192", "M\xc3\xbcller", "Müller"}},
    {{"GB18030", "\xcd\xf5^\xd0\xa1\xb6\xab", "王^小东"}},
    // Halves of characters that look like delimiters.
    {{"GB18030", "\x81\x5c^\x81\x5e\x81\x30\x84\x36", "乗^乛¥"}},
    {{"GBK", "\x81\x5c\\\x81\x5e", "乗\",\"乛"}},
    {{"\\ISO 2022 IR 87", "\x1b$B5\x5cK\x5c\x1b(B^A", "宮本^A"}},
    {{"ISO_IR 13", "\x83\x5c^\x95\x5c", "ソ^表"}},  // in Shift JIS
    {{"ISO_IR 138", "\xe0^\xe1", "א^ב"}},
    {{"\\ISO 2022 IR 87", "Yamada^Tarou=\x1b$B;3ED\x1b(B^\x1b$BB@O:\x1b(B", "Yamada^Tarou=山田^太郎"}},
    {{"ISO 2022 IR 13\\ISO 2022 IR 87", "\xd4\xcf\xc0\xde^\xc0\xdb\xb3", "ﾔﾏﾀﾞ^ﾀﾛｳ"}},
    {{"\\ISO 2022 IR 149", "Hong^Gildong=\x1b$)C\xfb\xf3^\x1b$)C\xd1\xce\xd4\xd7", "Hong^Gildong=洪^吉洞"}},
    {{"ISO_IR 192", "M\xfcller", "Müller"}},  // not what it declares
    {{nullptr, "M\xfcller", "Müller"}},
    {{nullptr, "M\xc3\xbcller", "Müller"}},
    {{"no such set", "M\xfcller", "Müller"}},
    {{"ISO_IR 100", "A\\M\xfc", "A\",\"Mü"}},
};

TEST(DicomJson, DecodesTextsByTheirCharacterSet)
{
    for (const auto& [characterSet, name, shown] : kEncoded) {
        DatasetBuilder image = anImage().with(DCM_StudyDescription, name);
        if (characterSet != nullptr)
            image.with(DCM_SpecificCharacterSet, characterSet);
        const std::string json = R"("00081030":{"vr":"LO","Value":[")" + std::string(shown) + R"("]})";
        EXPECT_THAT(jsonOf(image), testing::HasSubstr(json));
        // Value by value.
        image.withItem(DCM_ReferencedImageSequence, anItem().with(DCM_SpecificCharacterSet, "ISO_IR 109"));
        EXPECT_THAT(jsonOf(image), testing::HasSubstr(json));
    }
}

TEST(DicomJson, IsValidWhateverBytesTextsHold)
{
    std::mt19937 random(1);
    const char* const characterSets[] = {"",        "ISO_IR 192",       "ISO_IR 100",
                                         "GB18030", "\\ISO 2022 IR 87", "ISO 2022 IR 13\\ISO 2022 IR 149"};
    const char pieces[] = "a^=\\\"\n\x1b$B(J)CE\x80\xc3\xbc\xe3\xff\xfe\xed\xa0\x7f\x01";
    for (int i = 0; i < 2000; ++i) {
        QByteArray text;
        for (auto left = random() % 12; left > 0; --left)
            text.append(pieces[random() % (sizeof pieces - 1)]);
        DatasetBuilder image = anItem().with(DCM_SpecificCharacterSet, characterSets[random() % 6]);
        image.with(DCM_PatientName, text).with(DCM_PatientComments, text);
        const QByteArray json = QByteArray::fromStdString(jsonOf(image));
        ASSERT_EQ(QString::fromUtf8(json).toUtf8(), json) << text.toHex().constData();
        ASSERT_TRUE(QJsonDocument::fromJson(json).isObject()) << text.toHex().constData();
    }
}

TEST(DicomJson, HasNumbersForDecimalsAndTextsForWhatIsNone)
{
    const std::pair<const char*, const char*> kDecimals[] = {
        {"1.", "1"},
        {"1.e3", "1e3"},
        {"-.5", "-0.5"},
        {"+007.50", "7.50"},
        {"1\\\\0e3", "1,null,0e3"},
        {"e3", R"("e3")"},
        {"1e", R"("1e")"},
        {".", R"(".")"},
        {"1 2", R"("1 2")"},
        {"1e999", R"("1e999")"},
    };
    for (const auto& [text, json] : kDecimals) {
        const DatasetBuilder image = anItem().with(DCM_PixelSpacing, text);
        EXPECT_THAT(jsonOf(image),
                    testing::HasSubstr(R"("00280030":{"vr":"DS","Value":[)" + std::string(json) + "]}"));
    }
}

TEST(DicomJson, HasWordsForWhatIsNoNumber)
{
    const double infinity = std::numeric_limits<double>::infinity();
    const double wide[] = {1.5, std::numeric_limits<double>::quiet_NaN(), infinity, -infinity};
    const float narrow[] = {static_cast<float>(wide[1]), 0.5F, static_cast<float>(infinity)};
    TagMap map;
    map.putElement(DCM_PatientSize,
                   new TagElement(VrCode::FL, {reinterpret_cast<const char*>(narrow), sizeof narrow}));
    map.putElement(DCM_PatientWeight,
                   new TagElement(VrCode::FD, {reinterpret_cast<const char*>(wide), sizeof wide}));
    EXPECT_THAT(jsonOf(map),
                testing::HasSubstr(R"("00101020":{"vr":"FL","Value":["NaN",0.5,"Infinity"]},)"
                                   R"("00101030":{"vr":"FD","Value":[1.5,"NaN","Infinity","-Infinity"]}})"));
    QByteArray xml;
    DicomImageWriter(MetadataForm::Xml).append(xml, map, "");
    EXPECT_TRUE(xml.contains(R"(<Value number="1">NaN</Value><Value number="2">0.5</Value>)"))
        << xml.constData();
}

/// Reads back as the very number, in every locale.
template <typename Real>
void expectDigitsOf(VrCode vr, Real value)
{
    TagMap map;
    map.putElement(DCM_PatientWeight,
                   new TagElement(vr, {reinterpret_cast<const char*>(&value), sizeof value}));
    QByteArray xml;
    DicomImageWriter(MetadataForm::Xml).append(xml, map, "");
    const std::string json = jsonOf(map);
    const QByteArray opening = R"(<Value number="1">)";
    for (const char* digits :
         {json.c_str() + json.rfind('[') + 1, xml.constData() + xml.lastIndexOf(opening) + opening.size()}) {
        Real read = 0;
        std::from_chars(digits, digits + std::strlen(digits), read);
        ASSERT_EQ(read, value) << digits;
    }
}

TEST(DicomJson, HasTheVeryNumbersOfReals)
{
    std::mt19937_64 random(1);
    for (int i = 0; i < 5000; ++i) {
        const int exponent =
            i % 2 == 0 ? -static_cast<int>(random() % 80) : static_cast<int>(random() % 1200) - 700;
        const double value = std::ldexp(static_cast<double>(static_cast<qint64>(random())), exponent);
        expectDigitsOf(VrCode::FD, value);
        if (std::fabs(value) < std::numeric_limits<float>::max() &&
            std::fabs(value) >= std::numeric_limits<float>::min())
            expectDigitsOf(VrCode::FL, static_cast<float>(value));
    }
}

TEST(DicomJson, EqualsThatOfRealFiles)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of real files";
    int compared = 0;
    int notConverted = 0;
    for (const char* folder : {"series", "multiframe", "modalities", "charsets"}) {
        for (const QString& name : realFiles(folder)) {
            DcmFileFormat file;
            if (readDicomFile(name.toLocal8Bit().constData(), file).bad())
                continue;
            file.getDataset()->findAndDeleteElement(DCM_PixelData, OFTrue, OFTrue);
            const std::unique_ptr<TagMap> map(TagMap::createTagMap(file.getDataset(), kLargeValueBound));
            const std::string ours = jsonOf(*map);
            const std::string theirs = jsonByDcmtk(*file.getDataset());
            ++(theirs.empty() ? notConverted : compared);
            EXPECT_EQ(comparable(ours), comparable(theirs.empty() ? ours : theirs)) << qPrintable(name);
        }
    }
    EXPECT_GT(compared, 20 * notConverted);
}

}  // namespace
