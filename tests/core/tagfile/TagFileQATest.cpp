#include "TagFileQAFixture.h"
#include "kddlib/Limits.h"
#include "kddlib/items/TextDecoding.h"
#include "kddlib/items/TextEncoding.h"
#include "kddlib/tagfile/qa/QAEditor.h"

#include <QDate>
#include <QLocale>

#include <gmock/gmock.h>

namespace Kdd
{
namespace
{

struct Fault
{
    const char* name;
    QByteArray text;
    const char* message;
};

// ---- the XML of a job

TEST(QAJobXml, IsReadByTheNamesOfItsElements)
{
    QAData job;
    QString message;
    ASSERT_TRUE(job.parse("<?xml version='1.0'?>\n<Job><Extra><Value>lost</Value></Extra>"
                          "<Timestamp>20240131120000</Timestamp><Login>J\xc3\xbcrg</Login>"
                          "<Substitutions OldSUID='1.2'><Tag Group='0010' Element='10'/>"
                          "<Value>Doe^J&amp;J</Value><Tag Group='7fe0' Element='0010'/>"
                          "<Tag Group='0008' Element='103E'><Value/></Tag></Substitutions></Job>",
                          message))
        << message.toStdString();
    EXPECT_EQ(job.timestamp, "20240131120000");
    EXPECT_EQ(job.login, "J\xfcrg");
    EXPECT_EQ(job.oldStudyUID, "1.2");
    ASSERT_EQ(job.substitutions.size(), 3);
    EXPECT_EQ(job.substitutions.at(0).key, DCM_PatientName);
    EXPECT_EQ(job.substitutions.at(0).value, QStringLiteral("Doe^J&J"));
    EXPECT_TRUE(job.substitutions.at(1).value.isNull());
    EXPECT_EQ(job.substitutions.at(2).key, DCM_SeriesDescription);
    EXPECT_FALSE(job.substitutions.at(2).value.isNull()) << "empty, but a value";
}

TEST(QAJobXml, TimeAndLoginMayBeIndentedAndTheTimeHaveAFraction)
{
    QAData job;
    QString message;
    ASSERT_TRUE(job.parse("<Job>\n <Timestamp>\n  20240131120000.25+0100\n </Timestamp>\n"
                          " <Login>\n  anna b\n </Login>\n</Job>",
                          message))
        << message.toStdString();
    EXPECT_EQ(job.timestamp, "\n  20240131120000.25+0100\n ") << "as it stands";
    EXPECT_EQ(job.login, "anna b");
    QString time;
    EXPECT_TRUE(auditTime(job.timestamp, time));
    EXPECT_EQ(time, QStringLiteral("31/1/2024 12:00:00 PM"));
    EXPECT_TRUE(job.parse("<Timestamp> </Timestamp>", message)) << "now";
}

const Fault kJobFaults[] = {
    {"Empty", "", "Line 1"},
    {"Unclosed", "<a>\n<b>", "Line 2"},
    {"NoXml", QByteArray("\0\xff\xfe<a", 5), "Line 1"},
    {"Group", "<a>\n<Tag Group='00x0' Element='1'/></a>", "Line 2: Group \"00x0\" of a Tag"},
    {"Element", "<Tag Group='10' Element='10010'/>", "Element \"10010\""},
    {"NoElement", "<Tag Group='10'/>", "Element \"\""},
    {"NoValue", "<a><Tag Group='10' Element='10'/>\n</a>", "Line 2: Tag (0010,0010) has no Value"},
    {"NoValueBeforeTheNext",
     "<a><Tag Group='10' Element='10'/><Tag Group='10' Element='20'><Value>1</Value></Tag></a>",
     "(0010,0010) has no Value"},
    {"Twice",
     "<a><Tag Group='10' Element='10'><Value>1</Value></Tag><Tag Group='10' Element='10'><Value>2</Value>"
     "</Tag></a>",
     "(0010,0010) stands twice"},
    {"Timestamp", "<Timestamp>20240230120000</Timestamp>", "\"20240230120000\" is no time"},
    {"TimestampTooLong", "<Timestamp>202401311200001</Timestamp>", "is no time"},
    {"TimestampInTwoParts", "<Timestamp>20240131 120000</Timestamp>", "is no time"},
    {"Login", "<Login>\xd0\x96</Login>", "Latin-1"},
    {"LoginOfTwoLines", "<Login>a\nb</Login>", "one line"},
    {"TwoOldStudies", "<a><Substitutions OldSUID='1'/><Substitutions OldSUID='2'/></a>",
     "second study, \"2\""},
    {"Entities", "<!DOCTYPE a [<!ENTITY b 'bbbb'><!ENTITY c '&b;&b;'>]><Login>&c;</Login>", "document type"},
    {"TooLong", QByteArray(kMaxJobXml + 1, ' '), "longer than 1048576"},
};

TEST(QAJobXml, AFaultIsNamedAndLeavesTheJobAlone)
{
    for (const Fault& fault : kJobFaults) {
        QAData job;
        job.login = "before";
        QString message;
        EXPECT_FALSE(job.parse(fault.text, message)) << fault.name;
        EXPECT_THAT(message.toStdString(), testing::HasSubstr(fault.message)) << fault.name;
        EXPECT_EQ(job.login, "before") << fault.name;
    }
}

// ---- texts

struct WrittenText
{
    const char* name;
    const char* characterSet;
    const char* text;
    const char* bytes;  // null when it cannot be written
};

const WrittenText kTexts[] = {
    {"Undeclared", "", "M\xc3\xbcller", "M\xfcller"},
    {"UndeclaredThatLooksLikeUtf8", "", "\xc3\x83\xc2\xbc", nullptr},
    {"UndeclaredBeyondLatin1", "", "\xd0\x96", nullptr},
    {"Utf8", "ISO_IR 192", "\xd0\x96^\xf0\x9f\x98\x80", "\xd0\x96^\xf0\x9f\x98\x80"},
    {"Cyrillic", "ISO_IR 144", "\xd0\x96", "\xb6"},
    {"CyrillicInLatin1", "ISO_IR 100", "\xd0\x96", nullptr},
    {"Greek", "ISO_IR 126", "\xce\x94", "\xc4"},
    {"SecondSet", "ISO 2022 IR 100\\ISO 2022 IR 144", "\xc3\xbc^\xd0\x96", "\xfc^\x1b-L\xb6"},
    {"Japanese", "\\ISO 2022 IR 87", "Yamada=\xe5\xb1\xb1", "Yamada=\x1b$B;3\x1b(B"},
    {"Korean", "\\ISO 2022 IR 149", "\xea\xb9\x80", "\x1b$)C\xb1\xe8"},
    {"Chinese", "GB18030", "\xe7\x8e\x8b", "\xcd\xf5"},
    {"UnknownSet", "ISO_IR 999", "\xc3\xbc", nullptr},
    {"AsciiInUnknownSet", "ISO_IR 999", "a", "a"},
};

TEST(TextOfCharacterSet, IsWrittenOrRefused)
{
    for (const WrittenText& row : kTexts) {
        QByteArray bytes = "before";
        EXPECT_EQ(encodeText(QString::fromUtf8(row.text), row.characterSet, bytes), row.bytes != nullptr);
        EXPECT_EQ(bytes.toPercentEncoding(),
                  QByteArray(row.bytes != nullptr ? row.bytes : "before").toPercentEncoding())
            << row.name;
    }
}

TEST(AuditLogText, KeepsLinesInsideOfTexts)
{
    AuditLog log;
    const AuditEntry entry = {
        QStringLiteral("now J\u00fcrg"),
        {{DCM_ImageComments, QStringLiteral("a\nb\n\n\x1bn"), QStringLiteral("\x1b\u0416")},
         {DCM_PatientName, QString(), QString()}}};
    log.append(entry);
    log.append(entry);
    QVector<AuditEntry> entries;
    ASSERT_TRUE(log.decode(entries));
    ASSERT_EQ(entries.size(), 2);
    EXPECT_EQ(entries.at(1).time, entry.time);
    EXPECT_EQ(entries.at(1).changes, entry.changes);
}

// ---- edits

/// Image 1 and 2 in series 1.2.3, image 3 in series 1.2.4.
class TagFileQAEdit : public TagFileQATest
{
protected:
    TagFileQAEdit()
    {
        TagFile file;
        add(file,
            anImage("1").with(DCM_PatientName, "Doe^J").with(DCM_Rows, "7").with(DCM_ImageType, "A\\B"));
        add(file, anImage("2").with(DCM_PatientName, "Doe^J").with(DCM_InstanceNumber, "2"));
        add(file, anImage("3")
                      .inSeries("1.2.4")
                      .with(DCM_PatientName, "Doe^J")
                      .withItem(DCM_ReferencedStudySequence, anItem().with(DCM_PatientID, "x")));
        EXPECT_TRUE(file.writeCacheFile());
    }
};

TEST_F(TagFileQAEdit, IsToldInTheAuditLogAndChangesNothingElse)
{
    const std::string before = shownText(*stored()->findImage("2"));
    QAData job = edit({"1", "nobody"}, {{DCM_PatientName, text("Roe^J\xc3\xbcrg")}, {DCM_Rows, text("8")}});
    QString message;
    ASSERT_TRUE(TagFile::applyQA(job, message));
    EXPECT_EQ(job.outcome.changed, 1);
    EXPECT_EQ(job.outcome.notFound, Uids{"nobody"});
    EXPECT_EQ(shown("1.2", "1", DCM_PatientName), "Roe^J\xfcrg");
    EXPECT_EQ(shown("1.2", "1", DCM_Rows), "8");
    const auto file = stored();
    EXPECT_EQ(logOf(*file->findImage("1")).text(), "31/1/2024 12:00:00 PM anna\n"
                                                   "0010-0010\nDoe^J\nRoe^J\xc3\xbcrg\n"
                                                   "0028-0010\n7\n8\n\n");
    QByteArray time;
    EXPECT_TRUE(file->findImage("1")->findAndGetString({0x0071, 0x0022}, "Korvex", time));
    EXPECT_EQ(time, "20240131120000");
    EXPECT_EQ(shownText(*file->findImage("2")), before);
    const QByteArray once = content();
    EXPECT_TRUE(apply(job));
    EXPECT_EQ(content(), once) << "all of it is there already";
}

TEST_F(TagFileQAEdit, TellsEveryHourInTheSameWordsEverywhere)
{
    QLocale::setDefault(QLocale(QLocale::German));
    for (int hour = 0; hour < 24; ++hour) {
        QAData job = edit({"1"}, {{DCM_InstanceNumber, QString::number(hour + 50)}});
        job.timestamp =
            "20240331" + QByteArray::number(100 + hour).mid(1) + "3005";  // at half past two clocks go on
        EXPECT_TRUE(apply(job));
        const QByteArray expected = "31/3/2024 " + QByteArray::number((hour + 11) % 12 + 1) + ":30:05 " +
                                    (hour < 12 ? "AM" : "PM") + " anna\n0020-0013";
        EXPECT_TRUE(logOf(*stored()->findImage("1")).text().contains(expected)) << expected.toStdString();
    }
    QLocale::setDefault(QLocale::c());
}

TEST_F(TagFileQAEdit, WithoutTimestampTellsThePresentAndNoTimeOfTheJob)
{
    QAData job = edit({"1"}, {{DCM_PatientName, text("Roe")}});
    job.timestamp.clear();
    EXPECT_TRUE(apply(job));
    const auto file = stored();
    QVector<AuditEntry> entries;
    ASSERT_TRUE(logOf(*file->findImage("1")).decode(entries));
    EXPECT_TRUE(
        entries.first().time.contains(QLocale::c().toString(QDate::currentDate(), QStringLiteral("/yyyy"))));
    QByteArray time;
    EXPECT_FALSE(file->findImage("1")->findAndGetString({0x0071, 0x0022}, "Korvex", time));
}

struct Refused
{
    const char* name;
    QASubstitution substitution;
    const char* reason;
};

const Refused kRefused[] = {
    {"NoNumber", {DCM_Rows, QStringLiteral("eight")}, "\"eight\" is no number of VR US"},
    {"TooLargeANumber", {DCM_Rows, QStringLiteral("70000")}, "\"70000\" is no number"},
    {"NoDate",
     {DCM_StudyDate, QStringLiteral("20230229")},
     "Image 1: Tag (0008,0020): \"20230229\" is no date"},
    {"NoDateAmongDates",
     {DCM_DateOfLastCalibration, QStringLiteral("20240101\\202401")},
     "\"202401\" is no date"},
    {"RangeOfDates", {DCM_PatientBirthDate, QStringLiteral("19700101-19710101")}, "is no date of VR DA"},
    {"NoTime", {DCM_StudyTime, QStringLiteral("2460")}, "\"2460\" is no time"},
    {"NoTimeEither", {DCM_StudyTime, QStringLiteral("12:30:00")}, "is no time"},
    {"FractionOfAnHour", {DCM_StudyTime, QStringLiteral("12.5")}, "is no time"},
    {"NoDateAndTime", {DCM_AcquisitionDateTime, QStringLiteral("20241301")}, "is no date and time of VR DT"},
    {"NoZone", {DCM_AcquisitionDateTime, QStringLiteral("2024+1")}, "is no date and time"},
    {"NoAge", {DCM_PatientAge, QStringLiteral("40 years")}, "is no age of VR AS"},
    {"NoIntegerString", {DCM_InstanceNumber, QStringLiteral("1.5")}, "\"1.5\" is no number of VR IS"},
    {"NoDecimalString", {DCM_SliceThickness, QStringLiteral("1,5")}, "\"1,5\" is no number of VR DS"},
    {"NoFiniteNumber", {DCM_SliceThickness, QStringLiteral("inf")}, "\"inf\" is no number"},
    {"NoValue", {DCM_PatientID, QString()}, "(0010,0020) has no value"},
    {"Sequence", {DCM_ReferencedStudySequence, QStringLiteral("1")}, "(0008,1110): a value of VR SQ"},
    {"BinaryValue", {DCM_OverlayData, QStringLiteral("1")}, "cannot be replaced by a text"},
    {"UnknownAttribute", {DcmTagKey(0x0029, 0x1033), QStringLiteral("1")}, "VR UN cannot be replaced"},
    {"CharacterBeyondTheSet",
     {DCM_PatientID, QStringLiteral("a\u0416b")},
     "\"\u0416\" (U+0416) cannot be written"},
    {"CharacterInACode", {DCM_Modality, QStringLiteral("\u00fc")}, "other characters than its VR CS"},
    {"NoUid", {DCM_SeriesInstanceUID, QStringLiteral("1.2 3")}, "\"1.2 3\" is no UID"},
    {"OtherStudy", {DCM_StudyInstanceUID, QStringLiteral("1.7")}, "asks for study 1.7"},
    {"SameUidForAll", {DCM_SOPInstanceUID, QStringLiteral("77")}, "Image 3: there is another image 77"},
    {"UidOfAnother", {DCM_SOPInstanceUID, QStringLiteral("3")}, "there is another image 3"},
    {"OwnAttribute", {DcmTagKey(0x0006, 0x7100), QStringLiteral("/x")}, "no attribute of an image"},
    {"PrivateCreator", {DcmTagKey(0x0071, 0x0010), QStringLiteral("x")}, "reserves a private block"},
};

TEST_F(TagFileQAEdit, ThatIsRefusedChangesNoImageAtAll)
{
    const QByteArray before = content();
    for (const Refused& row : kRefused) {
        const QAData job = edit({"1", "3", "2"}, {{DCM_PatientName, text("Roe")}, row.substitution});
        EXPECT_THAT(refusal(job), testing::HasSubstr(row.reason)) << row.name;
        EXPECT_EQ(content(), before) << row.name;
    }
}

TEST_F(TagFileQAEdit, TakesEveryFormThatAValueMayHave)
{
    const QASubstitution values[] = {
        {DCM_StudyDate, text("20240229")},
        {DCM_StudyDate, text("")},
        {DCM_StudyTime, text("23")},
        {DCM_StudyTime, text("235960.123456")},
        {DCM_StudyTime, text("1200 ")},
        {DCM_AcquisitionDateTime, text("2024")},
        {DCM_AcquisitionDateTime, text("202402-0500")},
        {DCM_AcquisitionDateTime, text("20240229120000.5+1400")},
        {DCM_PatientAge, text("018M")},
        {DCM_InstanceNumber, text("-7")},
        {DCM_ImagePositionPatient, text("1.5\\-2e3\\ 0 ")},
    };
    for (const QASubstitution& value : values) {
        EXPECT_TRUE(apply(edit({"1"}, {value})));
        EXPECT_EQ(shown("1.2", "1", value.key), value.value.toLatin1());
    }
}

TEST_F(TagFileQAEdit, CannotTouchItsOwnAuditLog)
{
    EXPECT_TRUE(apply(edit({"1"}, {{DCM_PatientName, text("Roe")}})));
    EXPECT_THAT(refusal(edit({"1"}, {{DcmTagKey(0x0071, 0x1021), text("")}})),
                testing::HasSubstr("no attribute of an image"));
}

TEST_F(TagFileQAEdit, OfTheCharacterSetDecidesHowTextsAreWritten)
{
    EXPECT_TRUE(apply(
        edit({"1"}, {{DCM_PatientName, text("\xd0\x96")}, {DCM_SpecificCharacterSet, text("ISO_IR 192")}})));
    EXPECT_EQ(shown("1.2", "1", DCM_PatientName), "\xd0\x96");
    EXPECT_EQ(shown("1.2", "1", DCM_SpecificCharacterSet), "ISO_IR 192");
}

TEST_F(TagFileQAEdit, GivesAnImageAnotherUid)
{
    EXPECT_TRUE(apply(edit({"1"}, {{DCM_SOPInstanceUID, text("77")}})));
    const auto file = stored();
    EXPECT_EQ(file->imagesByUID().keys(), (Uids{"2", "3", "77"}));
    EXPECT_EQ(shown(*file->findImage("77"), DCM_ImageType), "A\\B");
}

TEST_F(TagFileQAEdit, OfPixelsIsNotedOnceAndDropsThePreview)
{
    const LogCapture quiet;
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy("1.2", true));
    file.findImage("1")->putAndInsertValue(kPreview, VrCode::OB, "jpeg");
    file.findImage("1")->putAndInsertValue(kFilePath, VrCode::LO, "/no/such/file");
    ASSERT_TRUE(file.writeCacheFile());
    const QAData job = edit({"1"}, {{DCM_PixelData, text("masked")}});
    EXPECT_TRUE(apply(job));
    EXPECT_TRUE(apply(job));
    const auto after = stored();
    EXPECT_EQ(logOf(*after->findImage("1")).text(), "31/1/2024 12:00:00 PM anna\n7fe0-0010\n\nmasked\n\n");
    EXPECT_EQ(after->findImage("1")->findElement(kPreview), nullptr);
}

TEST_F(TagFileQAEdit, OfAnUnknownStudyFindsNothing)
{
    QAData job = edit({"1"}, {{DCM_PatientName, text("Roe")}});
    job.studyUID = "1.9";
    QString message;
    EXPECT_TRUE(TagFile::applyQA(job, message));
    EXPECT_EQ(job.outcome.notFound, Uids{"1"});
    EXPECT_FALSE(QFile::exists(pathOf("1.9")));
}

}  // namespace
}  // namespace Kdd
