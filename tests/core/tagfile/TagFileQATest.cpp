#include "ArchiveFixture.h"
#include "kddlib/Limits.h"
#include "kddlib/items/TextEncoding.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagfile/qa/QAEditor.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"

#include <QLocale>

#include <gmock/gmock.h>

namespace Kdd
{
namespace
{

// ---- the XML of a job

TEST(QAJobXml, IsReadByTheNamesOfItsElements)
{
    QAData job;
    QString message;
    ASSERT_TRUE(job.parse("<?xml version='1.0'?>\n<Job><Extra><Value>lost</Value></Extra>"
                          "<Timestamp>\n 20240131120000.25+0100 </Timestamp><Login>\n J\xc3\xbcrg B </Login>"
                          "<Substitutions OldSUID='1.2'><Tag Group='0010' Element='10'/>"
                          "<Value>Doe^J&amp;J</Value><Tag Group='7fe0' Element='0010'/>"
                          "<Tag Group='0008' Element='103E'><Value/></Tag></Substitutions></Job>",
                          message))
        << message.toStdString();
    EXPECT_EQ(job.timestamp, "\n 20240131120000.25+0100 ") << "as it stands";
    EXPECT_EQ(job.login, "J\xfcrg B");
    EXPECT_EQ(job.oldStudyUID, "1.2");
    ASSERT_EQ(job.substitutions.size(), 3);
    EXPECT_EQ(job.substitutions.at(0).key, DCM_PatientName);
    EXPECT_EQ(job.substitutions.at(0).value, QStringLiteral("Doe^J&J"));
    EXPECT_TRUE(job.substitutions.at(1).value.isNull());
    EXPECT_EQ(job.substitutions.at(2).key, DCM_SeriesDescription);
    EXPECT_FALSE(job.substitutions.at(2).value.isNull()) << "empty, but a value";
    EXPECT_TRUE(job.parse("<Timestamp> </Timestamp>", message)) << "now";
}

QByteArray tooManyTags()
{
    QByteArray tags;
    for (int i = 0; i <= kMaxSubstitutions; ++i)
        tags +=
            "<Tag Group='0018' Element='" + QByteArray::number(0x1000 + i, 16) + "'><Value>a</Value></Tag>";
    return "<Substitutions>" + tags + "</Substitutions>";
}

const std::pair<QByteArray, const char*> kJobFaults[] = {
    {"", "Line 1"},
    {"<a>\n<b>", "Line 2"},
    {QByteArray("\0\xff\xfe<a", 5), "Line 1"},
    {"<a>\n<Tag Group='00x0' Element='1'/></a>", "Line 2: Group \"00x0\" of a Tag"},
    {"<Tag Group='10' Element='10010'/>", "Element \"10010\""},
    {"<Tag Group='10'/>", "Element \"\""},
    {"<a><Tag Group='10' Element='10'/>\n</a>", "Line 2: Tag (0010,0010) has no Value"},
    {"<a><Tag Group='10' Element='10'/><Tag Group='10' Element='20'><Value>1</Value></Tag></a>",
     "(0010,0010) has no Value"},
    {"<a><Tag Group='10' Element='10'><Value>1</Value></Tag><Tag Group='10' Element='10'/></a>",
     "(0010,0010) stands twice"},
    {"<Timestamp>20240230120000</Timestamp>", "\"20240230120000\" is no time"},
    {"<Timestamp>202401311200001</Timestamp>", "is no time"},
    {"<Timestamp>20240131 120000</Timestamp>", "is no time"},
    {"<Login>\xd0\x96</Login>", "Latin-1"},
    {"<Login>a\nb</Login>", "one line"},
    {"<a><Substitutions OldSUID='1'/><Substitutions OldSUID='2'/></a>", "second study, \"2\""},
    {"<!DOCTYPE a [<!ENTITY b 'bbbb'><!ENTITY c '&b;&b;'>]><Login>&c;</Login>", "document type"},
    {tooManyTags(), "More than 1000 Tags"},
    {QByteArray(kMaxJobXml + 1, ' '), "longer than 1048576"},
};

TEST(QAJobXml, AFaultIsNamedAndLeavesTheJobAlone)
{
    for (const auto& [text, fault] : kJobFaults) {
        QAData job;
        job.login = "before";
        QString message;
        EXPECT_FALSE(job.parse(text, message)) << fault;
        EXPECT_THAT(message.toStdString(), testing::HasSubstr(fault));
        EXPECT_EQ(job.login, "before") << fault;
    }
}

// ---- texts

/// Character set, text, and its bytes there: null when it cannot be written.
const std::array<const char*, 3> kTexts[] = {
    {{"", "M\xc3\xbcller", "M\xfcller"}},
    {{"", "\xc3\x83\xc2\xbc", nullptr}},  // would be taken for UTF-8
    {{"", "\xd0\x96", nullptr}},
    {{"ISO_IR 192", "\xd0\x96^\xf0\x9f\x98\x80", "\xd0\x96^\xf0\x9f\x98\x80"}},
    {{"ISO_IR 144", "\xd0\x96", "\xb6"}},
    {{"ISO_IR 100", "\xd0\x96", nullptr}},
    {{"ISO_IR 126", "\xce\x94", "\xc4"}},
    {{"ISO 2022 IR 100\\ISO 2022 IR 144", "\xc3\xbc^\xd0\x96", "\xfc^\x1b-L\xb6"}},
    {{"\\ISO 2022 IR 87", "Yamada=\xe5\xb1\xb1", "Yamada=\x1b$B;3\x1b(B"}},
    {{"\\ISO 2022 IR 149", "\xea\xb9\x80", "\x1b$)C\xb1\xe8"}},
    {{"GB18030", "\xe7\x8e\x8b^\xe4\xb9\x97", "\xcd\xf5^\x81\x5c"}},
    {{"ISO_IR 999", "\xc3\xbc", nullptr}},
    {{"ISO_IR 999", "a", "a"}},
};

TEST(TextOfCharacterSet, IsWrittenOrRefused)
{
    for (const auto& [characterSet, text, written] : kTexts) {
        QByteArray bytes = "before";
        EXPECT_EQ(encodeText(QString::fromUtf8(text), characterSet, bytes), written != nullptr);
        EXPECT_EQ(bytes.toPercentEncoding(),
                  QByteArray(written != nullptr ? written : "before").toPercentEncoding())
            << characterSet << ' ' << text;
    }
}

TEST(AuditTime, IsToldInTheSameWordsEverywhere)
{
    QLocale::setDefault(QLocale(QLocale::German));
    // At half past two clocks go on.
    for (const auto& [time, told] : {std::pair("20240331003005", "31/3/2024 12:30:05 AM"),
                                     {"20240331023005", "31/3/2024 2:30:05 AM"},
                                     {"20240331123005", "31/3/2024 12:30:05 PM"},
                                     {"20240331233005", "31/3/2024 11:30:05 PM"}}) {
        QString text;
        EXPECT_TRUE(auditTime(time, text));
        EXPECT_EQ(text, QLatin1String(told));
    }
    QLocale::setDefault(QLocale::c());
}

// ---- jobs where there is no database

/// Image 1 and 2 in series 1.1, image 3 in series 1.2.
class TagFileQA : public ArchiveTest
{
protected:
    TagFileQA()
    {
        Kxg::SetDatabaseServer(QByteArray());
        TagFile file;
        const auto add = [&](const DatasetBuilder& image) { file.addTagMap(image.map(), nullptr, true); };
        add(image("1", "1").with(DCM_Rows, "7").with(DCM_ImageType, "A\\B"));
        add(image("2", "1").with(DCM_InstanceNumber, "2"));
        add(image("3", "1").inSeries("1.2").withItem(DCM_ReferencedStudySequence, anItem()));
        EXPECT_TRUE(file.writeCacheFile());
    }

    static QByteArray content() { return fileContent(TagFile::cacheFilePathForStudy("1")); }

    /// What the image's log tells.
    static QByteArray logOf(const char* study, const char* uid)
    {
        TagFile file;
        AuditLog log;
        EXPECT_TRUE(file.readCacheFileForStudy(study, false) && log.read(*file.findImage(uid)));
        return log.text();
    }
};

TEST_F(TagFileQA, AnEditIsToldInTheAuditLogAndChangesNothingElse)
{
    QAData job = edit({"1", "nobody"},
                      {{DCM_PatientName, QStringLiteral("Roe^J\u00fcrg")}, {DCM_Rows, QStringLiteral("8")}});
    QString message;
    ASSERT_TRUE(TagFile::applyQA(job, message));
    EXPECT_EQ(job.outcome.changed, 1);
    EXPECT_EQ(job.outcome.notFound, Uids{"nobody"});
    EXPECT_EQ(value("1", "1", DCM_PatientName), "Roe^J\xfcrg");
    EXPECT_EQ(value("1", "2", DCM_PatientName), "Doe^J");
    EXPECT_EQ(logOf("1", "1"), "31/1/2024 12:00:00 PM anna\n"
                               "0010-0010\nDoe^J\nRoe^J\xc3\xbcrg\n0028-0010\n7\n8\n\n");
    const DcmTag time(0x0071, 0x1022);
    EXPECT_EQ(value("1", "1", time), "20240131120000");
    const QByteArray once = content();
    ASSERT_TRUE(TagFile::applyQA(job, message));
    EXPECT_EQ(content(), once) << "all of it is there already";
    EXPECT_NE(refusal(edit({"1"}, {{DcmTagKey(0x0071, 0x1021), QString()}})), "") << "the log itself";
    job = edit({"2"}, {{DCM_Rows, QStringLiteral("9")}});
    job.timestamp.clear();
    correct(job);
    EXPECT_EQ(value("1", "2", time), "none") << "the job tells no time";
}

struct Refused
{
    DcmTagKey key;
    const char* value;
    const char* reason;
};

const Refused kRefused[] = {
    {DCM_Rows, "eight", "\"eight\" is no number of VR US"},
    {DCM_Rows, "70000", "\"70000\" is no number"},
    {DCM_StudyDate, "20230229", "Image 1: Tag (0008,0020): \"20230229\" is no date"},
    {DCM_DateOfLastCalibration, "20240101\\202401", "\"202401\" is no date"},
    {DCM_PatientBirthDate, "19700101-19710101", "is no date of VR DA"},
    {DCM_StudyTime, "2460", "\"2460\" is no time"},
    {DCM_StudyTime, "12:30:00", "is no time"},
    {DCM_StudyTime, "12.5", "is no time"},
    {DCM_AcquisitionDateTime, "20241301", "is no date and time of VR DT"},
    {DCM_AcquisitionDateTime, "2024+1", "is no date and time"},
    {DCM_PatientAge, "40 years", "is no age of VR AS"},
    {DCM_InstanceNumber, "1.5", "\"1.5\" is no number of VR IS"},
    {DCM_SliceThickness, "1,5", "\"1,5\" is no number of VR DS"},
    {DCM_SliceThickness, "inf", "\"inf\" is no number"},
    {DCM_PatientID, nullptr, "(0010,0020) has no value"},
    {DCM_ReferencedStudySequence, "1", "(0008,1110): a value of VR SQ"},
    {DCM_OverlayData, "1", "cannot be replaced by a text"},
    {DcmTagKey(0x0029, 0x1033), "1", "VR UN cannot be replaced"},
    {DCM_PatientID, "a\u0416b", "\"\u0416\" (U+0416) cannot be written"},
    {DCM_Modality, "\u00fc", "other characters than its VR CS"},
    {DCM_SeriesInstanceUID, "1.2 3", "\"1.2 3\" is no UID"},
    {DCM_StudyInstanceUID, "1.7", "asks for study 1.7"},
    {DCM_SOPInstanceUID, "77", "Image 3: there is another image 77"},
    {DCM_SOPInstanceUID, "3", "there is another image 3"},
    {DcmTagKey(0x0006, 0x7100), "/x", "no attribute of an image"},
    {DcmTagKey(0x0071, 0x0010), "x", "reserves a private block"},
};

TEST_F(TagFileQA, AnEditThatIsRefusedChangesNoImageAtAll)
{
    const QByteArray before = content();
    for (const auto& [key, value, reason] : kRefused) {
        const QAData job = edit({"1", "3", "2"},
                                {{DCM_PatientName, QStringLiteral("Roe")}, {key, QString::fromUtf8(value)}});
        EXPECT_THAT(refusal(job), testing::HasSubstr(reason));
        EXPECT_EQ(content(), before) << reason;
    }
}

TEST_F(TagFileQA, AnEditTakesEveryFormThatAValueMayHave)
{
    const std::pair<DcmTagKey, std::vector<const char*>> forms[] = {
        {DCM_StudyDate, {"20240229", ""}},
        {DCM_StudyTime, {"23", "235960.123456", "1200 "}},
        {DCM_AcquisitionDateTime, {"2024", "202402-0500", "20240229120000.5+1400"}},
        {DCM_PatientAge, {"018M"}},
        {DCM_InstanceNumber, {"-7"}},
        {DCM_ImagePositionPatient, {"1.5\\-2e3\\ 0 "}},
    };
    for (const auto& [key, values] : forms) {
        for (const char* text : values) {
            correct(edit({"1"}, {{key, QString::fromLatin1(text)}}));
            EXPECT_EQ(value("1", "1", key), text);
        }
    }
    correct(edit({"1"}, {{DCM_PatientName, QStringLiteral("\u0416")},
                         {DCM_SpecificCharacterSet, QStringLiteral("ISO_IR 192")}}));
    EXPECT_EQ(value("1", "1", DCM_PatientName), "\xd0\x96") << "in the set that it gets";
}

TEST_F(TagFileQA, AnEditOfPixelsIsNotedOnceAndDropsThePreview)
{
    const LogCapture quiet;
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy("1", true));
    file.findImage("1")->putAndInsertValue(kPreview, VrCode::OB, "jpeg");
    file.findImage("1")->putAndInsertValue(kFilePath, VrCode::LO, "/no/such/file");
    ASSERT_TRUE(file.writeCacheFile());
    for (int i = 0; i < 2; ++i)
        correct(edit({"1"}, {{DCM_PixelData, QStringLiteral("masked")}}));
    EXPECT_EQ(logOf("1", "1"), "31/1/2024 12:00:00 PM anna\n7fe0-0010\n\nmasked\n\n");
    EXPECT_EQ(value("1", "1", kPreview), "none");
}

TEST_F(TagFileQA, AMoveThatEndedBetweenTheTwoWritesKeepsWhatWasEditedMeanwhile)
{
    const QByteArray before = content();
    correct(move({"1"}, "1", "9"));
    putFile(TagFile::cacheFilePathForStudy("1"), before);
    correct(edit({"1"}, {{DCM_PatientName, QStringLiteral("Meanwhile")}}, "9"));
    correct(move({"1", "2"}, "1", "9"));
    EXPECT_EQ(imagesIn("1"), Uids{"3"});
    EXPECT_EQ(value("9", "1", DCM_PatientName), "Meanwhile");
    EXPECT_EQ(logOf("9", "1"), "31/1/2024 12:00:00 PM anna\n0020-000e\n1.1\n9.5\n0020-000d\n1\n9\n\n"
                               "31/1/2024 12:00:00 PM anna\n0010-0010\nDoe^J\nMeanwhile\n\n");
    TagFile holder;
    ASSERT_TRUE(holder.readCacheFileForStudy("9", true));
    EXPECT_EQ(refusal(move({"3"}, "1", "9"), ChangeFault::LockedOut),
              "The tag file of study 9 cannot be changed: others hold it");
}

TEST_F(TagFileQA, AMoveRenewsTheLabelsOfBothStudies)
{
    TagFile file;
    for (const char* series : {"5.1", "5.2"}) {
        const DatasetBuilder image = anImage(series).inStudy("5").inSeries(series).with(DCM_Modality, "CT");
        file.addTagMap(image.map(), nullptr, true);
    }
    file.createAbstractTags();
    ASSERT_TRUE(file.writeCacheFile());
    EXPECT_EQ(value("5", "5.2", kAbstract), "CT (2)");
    correct(move({"5.1"}, "5", "6"));
    EXPECT_EQ(value("5", "5.2", kAbstract), "CT") << "it has to be told apart from none";
    EXPECT_EQ(value("6", "5.1", kAbstract), "CT");
}

}  // namespace
}  // namespace Kdd
