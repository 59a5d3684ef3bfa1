#include "kddlib/tagmodel/TagElement.h"

#include <QDateTime>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcelem.h>
#include <gtest/gtest.h>

#include <memory>

using namespace Kdd;

namespace
{

QByteArray hex(const char* digits)
{
    return QByteArray::fromHex(digits);
}

std::string textOf(VrCode vr, const QByteArray& value)
{
    QByteArray text("what was there before");
    TagElement(vr, value).getValueAsString(text);
    return text.toStdString();
}

struct Text
{
    VrCode vr;
    QByteArray value;
    std::string text;
};

const std::string kTwelveWords = QByteArray("0001\\").repeated(11).toStdString() + "0001";
const std::string kManyBytes = QByteArray("0b\\").repeated(20).toStdString() + "0b";

const Text kTexts[] = {
    {VrCode::CS, "A\\B ", "A\\B "},
    {VrCode::AT, hex("08001800feff00e0"), "(0008,0018)\\(fffe,e000)"},
    {VrCode::FL, hex("0000803f0024744900"), "1\\1e+06"},
    {VrCode::OF, hex("000020c10000807f"), "-10\\inf"},
    {VrCode::FD, hex("182d4454fb210940"), "3.14159"},
    {VrCode::SL, hex("ffffffff00000080"), "-1\\-2147483648"},
    {VrCode::UL, hex("ffffffff00000080"), "4294967295\\2147483648"},
    {VrCode::SS, hex("ffff0080"), "-1\\-32768"},
    {VrCode::US, hex("ffff008001"), "65535\\32768"},
    {VrCode::Xs, hex("ffff"), "65535"},
    {VrCode::OB, hex("010203"), "01\\02\\03"},
    {VrCode::OW, hex("0100").repeated(12), kTwelveWords},
    {VrCode::OW, hex("0100").repeated(13), kTwelveWords + "\\0001..."},
    {VrCode::OW, hex("0100").repeated(20), kTwelveWords + "\\0001..."},
    {VrCode::UN, hex("0b").repeated(21), kManyBytes},
    {VrCode::Lt, hex("0b").repeated(22), kManyBytes + "\\0b..."},
    {static_cast<VrCode>(77), hex("0b").repeated(30), kManyBytes + "\\0b..."},
    {VrCode::UL, {}, ""},
};

TEST(TagElement, IsWrittenAsTextByItsRepresentation)
{
    for (const Text& row : kTexts)
        EXPECT_EQ(textOf(row.vr, row.value), row.text) << vrName(row.vr);
}

TEST(TagElement, BytesAreReadAsTheNumbersThatTheCallerWants)
{
    const TagElement element(VrCode::OB, hex("ffff803f0000f03f00"));
    QByteArray all;
    for (int type = -1; type < 6; ++type)
        element.getValueAsStringFromOBOW(all.append(' '), type);
    EXPECT_EQ(all, "  65535\\16256\\0\\16368 -1\\16256\\0\\16368 1.00781\\1.875 1 1065418751\\1072693248 ");
}

const Text kParsed[] = {
    {VrCode::UT, " as\\it is ", " as\\it is "},
    {VrCode::FL, hex("0000803f000020c1"), "1\\-10"},
    {VrCode::FD, hex("000000000000f03f00000000000000c0"), "\t1 \\ -2e0\n"},
    {VrCode::FD, hex("000000000000fc3f"), "1.75"},
    {VrCode::OF, hex("0000e03f"), "1.75"},
    {VrCode::SL, hex("ffffffffffffff7f"), "-1 2147483647"},
    {VrCode::SS, hex("ffff0080"), "-1\\\\-32768"},
    {VrCode::UL, hex("ffffffff"), "4294967295"},
    {VrCode::US, hex("ffff0a00"), "65535 10x"},
};

TEST(TagElement, TakesATextInItsOwnEncoding)
{
    for (const Text& row : kParsed) {
        TagElement element(row.vr, "old");
        EXPECT_TRUE(element.putValueAsString(QByteArray::fromStdString(row.text)));
        EXPECT_EQ(element.value().toHex(), row.value.toHex()) << row.text;
    }
    for (const VrCode vr : {VrCode::AT, VrCode::OB, VrCode::OW, VrCode::SQ, VrCode::UN, VrCode::Omitted}) {
        TagElement element(vr, "old");
        EXPECT_FALSE(element.putValueAsString("1"));
        EXPECT_EQ(element.value(), "old");
    }
}

TEST(TagElement, ANumberChoosesItsRepresentation)
{
    const std::pair<int, VrCode> rows[] = {{0, VrCode::OB},     {255, VrCode::OB},   {256, VrCode::US},
                                           {65535, VrCode::US}, {65536, VrCode::SL}, {-1, VrCode::SL}};
    for (const auto& [number, vr] : rows) {
        TagElement element(VrCode::PN, "Doe");
        element.putValue(number);
        EXPECT_EQ(element.vr(), vr);
        EXPECT_EQ(element.valueAsInt(nullptr, 0), number);
        EXPECT_EQ(element.numFields(), 1);
    }
}

struct Number
{
    VrCode vr;
    QByteArray value;
    int fields;
    int index;
    bool ok;
    int number;
};

const Number kNumbers[] = {
    {VrCode::DS, "1.5\\2.5", 2, 0, false, 0},       {VrCode::IS, "1\\ 2 ", 2, 1, true, 2},
    {VrCode::IS, "1\\2", 2, 2, false, 0},           {VrCode::AS, "", 1, 0, false, 0},
    {VrCode::CS, "1\\2", 0, 0, false, 0},           {VrCode::FD, QByteArray(16, 0), 2, 0, false, 0},
    {VrCode::OB, hex("00ff"), 2, 1, true, 255},     {VrCode::OB, hex("00ff"), 2, -1, false, 0},
    {VrCode::OW, hex("ffff01"), 1, 0, true, 65535}, {VrCode::US, hex("ffff01"), 1, 1, false, 0},
    {VrCode::SS, hex("0000feff"), 2, 1, true, -2},  {VrCode::UL, hex("feffffff"), 1, 0, true, -2},
    {VrCode::SL, hex("feffff"), 0, 0, false, 0},
};

TEST(TagElement, CountsAndGivesItsNumbersWithinItsBytes)
{
    for (const Number& row : kNumbers) {
        const TagElement element(row.vr, row.value);
        bool ok = !row.ok;
        EXPECT_EQ(element.numFields(), row.fields) << textOf(row.vr, row.value);
        EXPECT_EQ(element.valueAsInt(&ok, row.index), row.number) << textOf(row.vr, row.value);
        EXPECT_EQ(ok, row.ok) << textOf(row.vr, row.value);
    }
}

TEST(TagElement, GivesTypedValues)
{
    const QDate day(2020, 10, 11);
    const auto typed = [](VrCode vr, const char* value) { return TagElement(vr, value).valueAsVariant(); };
    EXPECT_EQ(typed(VrCode::DA, "20201011 "), QVariant(day));
    EXPECT_EQ(typed(VrCode::DA, "2020101"), QVariant());
    for (const auto& [vr, text] : {std::pair(VrCode::DA, "20201399"), std::pair(VrCode::TM, "250000"),
                                   std::pair(VrCode::DT, "20201399120000")})
        EXPECT_FALSE(typed(vr, text).isValid()) << text;
    EXPECT_EQ(typed(VrCode::DA, "20201011\\2020"), QVariant(QVariantList{day, QVariant()}));
    EXPECT_EQ(typed(VrCode::TM, "120304.123"), QVariant(QTime(12, 3, 4)));
    EXPECT_EQ(typed(VrCode::TM, "1203"), QVariant());
    EXPECT_EQ(typed(VrCode::DT, "20201011120304.5+0100"), QVariant(QDateTime(day, QTime(12, 3, 4))));
    EXPECT_EQ(typed(VrCode::DS, "1.5\\2.5"), QVariant(QVariantList{1.5, 2.5}));
    EXPECT_EQ(typed(VrCode::PN, "M\xfcller"), QVariant(QString::fromUtf8("Müller")));
    EXPECT_EQ(typed(VrCode::OB, "\1\2"), QVariant(QVariantList{QStringLiteral("01"), QStringLiteral("02")}));
}

TEST(TagElement, DiffersByItsBytesAndWhenAskedByItsRepresentation)
{
    const TagElement two(VrCode::US, hex("0200"));
    std::string diffs("before ");
    EXPECT_TRUE(two.compare(TagElement(VrCode::SS, hex("0200")), false, &diffs));
    EXPECT_FALSE(two.compare(TagElement(VrCode::SS, hex("0200")), true, &diffs));
    EXPECT_FALSE(TagElement(VrCode::Omitted, {}).compare(two, false, &diffs));
    EXPECT_FALSE(two.compare(TagElement(VrCode::US, hex("020000")), false, nullptr));
    EXPECT_EQ(diffs, "before US [2] <> [2]\n?? [] <> [2]\n");
}

TEST(TagElement, BecomesADicomElementOfItsCompleteNumbersOnly)
{
    const std::pair<VrCode, int> lengths[] = {{VrCode::OW, 6}, {VrCode::US, 6}, {VrCode::AT, 4},
                                              {VrCode::FD, 0}, {VrCode::UL, 4}, {VrCode::OF, 4}};
    for (const auto& [vr, length] : lengths) {
        const std::unique_ptr<DcmElement> made(TagElement(vr, "1234567").createDcmElement({0x0009, 0x1001}));
        ASSERT_NE(made, nullptr);
        EXPECT_EQ(static_cast<int>(made->getLengthField()), length) << vrName(vr);
    }
    for (const VrCode vr : {VrCode::SQ, VrCode::Missing, VrCode::Unknown, VrCode::Omitted, VrCode(1000)})
        EXPECT_EQ(TagElement(vr, "12").createDcmElement(DCM_PatientName), nullptr);
}

TEST(VrCode, NumbersAreThoseThatTagFilesHold)
{
    const DcmEVR inOrder[] = {EVR_AE, EVR_AS, EVR_AT, EVR_CS, EVR_DA, EVR_DS, EVR_DT, EVR_FL,
                              EVR_FD, EVR_IS, EVR_LO, EVR_LT, EVR_OB, EVR_OF, EVR_OW, EVR_PN,
                              EVR_SH, EVR_SL, EVR_SQ, EVR_SS, EVR_ST, EVR_TM, EVR_UI, EVR_UL,
                              EVR_US, EVR_UT, EVR_ox, EVR_xs, EVR_lt, EVR_na, EVR_up};
    for (quint32 number = 0; number < std::size(inOrder); ++number) {
        EXPECT_EQ(static_cast<quint32>(vrCodeOf(inOrder[number])), number);
        EXPECT_EQ(evrOf(static_cast<VrCode>(number)), inOrder[number]);
    }
    for (const DcmEVR evr : {EVR_UN, EVR_OD, EVR_OL, EVR_OV, EVR_SV, EVR_UV, EVR_UNKNOWN, EVR_UNKNOWN2B})
        EXPECT_EQ(static_cast<int>(vrCodeOf(evr)), 40);
    // Of every other code the VR is known without a look into the dictionary.
    for (int number = EVR_AE; number <= EVR_UNKNOWN2B; ++number) {
        const auto evr = static_cast<DcmEVR>(number);
        EXPECT_TRUE(evrOf(vrCodeOf(evr)) == evr || hasSeveralVrs(vrCodeOf(evr))) << number;
    }
    // Nor is it told otherwise than the dictionary tells, also where that is not asked.
    for (const DcmTagKey& key :
         {DcmTagKey(DCM_PixelData), DCM_PatientName, DCM_RedPaletteColorLookupTableData,
          DcmTagKey(0x0009, 0x0000), DcmTagKey(0x0009, 0x0010), DcmTagKey(0x0009, 0x00ff),
          DcmTagKey(0x0009, 0x1001), DcmTagKey(0x6002, 0x3000), DcmTagKey(0x4444, 0x0001)})
        EXPECT_EQ(dictionaryEvr(key), DcmTag(key).getEVR()) << key.toString();
    for (const quint32 none : {44U, 63U, 254U, 255U, 0xffffffffU})
        EXPECT_STREQ(vrName(static_cast<VrCode>(none)), "??");
}

}  // namespace
