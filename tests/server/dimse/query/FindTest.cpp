#include "QueriedArchive.h"
#include "server/dicomweb/search/AnswerObject.h"
#include "server/dimse/QueryAnswer.h"
#include "server/dimse/QueryIdentifier.h"

#include <gmock/gmock.h>

using namespace Kdd;
using testing::HasSubstr;

namespace
{

class FindTest : public QueriedArchive
{
protected:
    /// Two studies of one patient with accents in his name, one of another.
    void fill()
    {
        const QByteArray muller = "SpecificCharacterSet=ISO_IR 192|PatientName=M\xC3\xBCller^Jos\xC3\xA9|"
                                  "PatientID=P1|StudyDate=20240131|StudyTime=2300|AccessionNumber=A7|";
        const QByteArray doe = "PatientName=Doe^Jane|PatientID=P2|StudyDate=20240301|Modality=MR|"
                               "StudyDescription=Head|";
        const std::tuple<const char*, const char*, QByteArray> kImages[] = {
            {"1.1", "1", muller + "Modality=CT|InstanceNumber=1|PatientWeight=70.5"},
            {"1.2", "1", muller + "Modality=SR|InstanceNumber=1000000"},
            {"2.1", "2", doe + "StudyTime=0100"},
            {"3.1", "3", doe + "StudyTime=1200|AccessionNumber=A7"},
        };
        for (const auto& [uid, study, attributes] : kImages)
            store(uid, anImage(uid).inStudy(study).inSeries(uid).with(attributes));
        add();
        start();
    }
};

INSTANTIATE_TEST_SUITE_P(Engines, FindTest, testing::Values(Engine::Sqlite), engineName);

const std::tuple<const char*, const char*, DcmTagKey, const char*> kQuestions[] = {
    {"STUDY", "StudyInstanceUID", DCM_StudyInstanceUID, "1 2 3"},
    {"STUDY", "StudyInstanceUID|PatientName=m\xC3\xBCl*|SpecificCharacterSet=ISO_IR 192",
     DCM_StudyInstanceUID, "1"},
    {"STUDY", "StudyInstanceUID|PatientName=doe^j?ne", DCM_StudyInstanceUID, "2 3"},
    {"STUDY", "StudyInstanceUID=1\\3", DCM_StudyInstanceUID, "1 3"},
    {"STUDY", "StudyInstanceUID|PatientID=P2|StudyDate=20240101-20240301", DCM_StudyInstanceUID, "2 3"},
    {"STUDY", "StudyInstanceUID|StudyDate=*", DCM_StudyInstanceUID, "1 2 3"},
    // A range of times is one for each day, and none with those of the days.
    {"STUDY", "StudyInstanceUID|StudyDate=20240131-20240301|StudyTime=0000-0200", DCM_StudyInstanceUID, "2"},
    {"STUDY", "ModalitiesInStudy=SR\\MR|StudyInstanceUID", DCM_ModalitiesInStudy, "CT\\SR MR MR"},
    {"STUDY", "StudyInstanceUID=1|NumberOfStudyRelatedInstances", DCM_NumberOfStudyRelatedInstances, "2"},
    {"STUDY", "StudyInstanceUID=1|NumberOfStudyRelatedSeries", DCM_NumberOfStudyRelatedSeries, "2"},
    {"STUDY", "StudyInstanceUID=1|RetrieveAETitle", DCM_RetrieveAETitle, "ANY-SCP"},
    {"STUDY", "StudyInstanceUID=1|PatientWeight", DCM_PatientWeight, "70.5"},
    {"SERIES", "StudyInstanceUID=1|SeriesInstanceUID", DCM_SeriesInstanceUID, "1.1 1.2"},
    {"SERIES", "PatientID=P2|Modality=MR|SeriesInstanceUID", DCM_SeriesInstanceUID, "2.1 3.1"},
    {"SERIES", "SeriesInstanceUID=1.1|StudyDate", DCM_StudyDate, "20240131"},
    {"IMAGE", "StudyInstanceUID=1|SeriesInstanceUID=1.1|SOPInstanceUID|Rows", DCM_SOPInstanceUID, "1.1"},
    {"IMAGE", "SOPInstanceUID=1.1\\2.1", DCM_SOPInstanceUID, "1.1 2.1"},
    {"IMAGE", "PatientName=*os\xC3\xA9|SpecificCharacterSet=ISO_IR 192|SOPInstanceUID", DCM_SOPInstanceUID,
     "1.1 1.2"},
    {"SERIES", "StudyDescription=*ead|AccessionNumber=A7|SeriesInstanceUID", DCM_SeriesInstanceUID, "3.1"},
    {"IMAGE", "SOPInstanceUID=1.1|InstanceNumber", DCM_InstanceNumber, "1"},
    {"IMAGE", "SOPInstanceUID=1.2|InstanceNumber", DCM_InstanceNumber, "1000000"},
    {"SERIES", "SeriesInstanceUID|Modality=CT", DCM_QueryRetrieveLevel, "SERIES"},
    {"STUDY", "StudyInstanceUID=9", DCM_StudyInstanceUID, ""},
};

TEST_P(FindTest, AnswersOnEveryLevel)
{
    fill();
    for (const auto& [level, keys, shown, answers] : kQuestions) {
        const std::string said = find(onLevel(level, keys));
        EXPECT_EQ(answered(shown), answers) << keys << "\n" << said;
        EXPECT_THAT(said, HasSubstr("Received Final Find Response (Success)")) << keys;
    }
}

TEST_P(FindTest, AnswersPatientsFromTheirRootAlone)
{
    fill();
    for (const char* name : {"PatientName=doe*", "PatientName=d?e*"}) {
        find(onLevel("PATIENT", name + QByteArray("|PatientID|NumberOfPatientRelatedStudies")), "-P");
        EXPECT_EQ(answered(DCM_PatientID), "P2") << name;
        EXPECT_EQ(answered(DCM_NumberOfPatientRelatedStudies), "2") << name;
    }
    EXPECT_THAT(find(onLevel("PATIENT", "PatientID")), HasSubstr("DataSetDoesNotMatchSOPClass"));
}

TEST_P(FindTest, TellsItsCharactersAndWhatItDoesNotShow)
{
    fill();
    const std::string said = find(onLevel("STUDY", "StudyInstanceUID=1|PatientName|SliceThickness"));
    EXPECT_EQ(answered(DCM_SpecificCharacterSet), "ISO_IR 192");
    EXPECT_EQ(answered(DCM_PatientName), "M\xC3\xBCller^Jos\xC3\xA9");
    EXPECT_EQ(answered(DCM_SliceThickness), "-");
    EXPECT_THAT(said, HasSubstr("Pending: WarningUnsupportedOptionalKeys"));
}

TEST_P(FindTest, ShowsOfItemsWhatIsAskedFor)
{
    store("e", anImage("4.1").inStudy("4").inSeries("4.1").withItem(
                   DCM_RequestAttributesSequence,
                   anItem().with("RequestedProcedureID=R7|ScheduledProcedureStepID=S7")));
    add();
    start();
    find(onLevel("SERIES", "RequestAttributesSequence[0].RequestedProcedureID=R7"));
    ASSERT_EQ(answers().size(), 1U);
    DcmItem* item = nullptr;
    OFString value;
    DcmFileFormat file = answers().front();
    ASSERT_TRUE(file.getDataset()->findAndGetSequenceItem(DCM_RequestAttributesSequence, item).good());
    item->findAndGetOFString(DCM_RequestedProcedureID, value);
    EXPECT_EQ(value, "R7");
    EXPECT_FALSE(item->tagExists(DCM_ScheduledProcedureStepID));
}

const char* const kMisunderstood[] = {
    "StudyInstanceUID=1",
    "QueryRetrieveLevel=PLANET|StudyInstanceUID=1",
    "QueryRetrieveLevel=STUDY|StudyDate=yesterday",
    "QueryRetrieveLevel=STUDY|TimezoneOffsetFromUTC=noon|StudyDate=20240131",
};

TEST_P(FindTest, RefusesWhatItCannotUnderstand)
{
    fill();
    for (const char* keys : kMisunderstood) {
        EXPECT_THAT(find(keys), HasSubstr("DataSetDoesNotMatchSOPClass")) << keys;
        EXPECT_TRUE(answers().empty()) << keys;
    }
}

TEST(QueryIdentifier, ReadsValuesInTheCharactersThatItNames)
{
    // Bytes of the second and third look like the backslash that parts values.
    const char* const rows[][3] = {
        {"ISO_IR 100", "M\xFCller*", "M\xC3\xBCller*"},
        {"GB18030", "\x81\x5C*", "\xE4\xB9\x97*"},
        {"\\ISO 2022 IR 87", "\x1B$B5\x5CK\x5C\x1B(B*", "\xE5\xAE\xAE\xE6\x9C\xAC*"},
    };
    for (const auto& row : rows) {
        DcmDataset dataset(anItem()
                               .with(DCM_SpecificCharacterSet, row[0])
                               .with(DCM_QueryRetrieveLevel, "STUDY")
                               .with(DCM_PatientName, row[1])
                               .build());
        Dimse::QueryIdentifier identifier;
        QString reason;
        EXPECT_TRUE(Dimse::QueryIdentifier::read(dataset, Dimse::QueryRoot::Study, identifier, reason));
        ASSERT_EQ(identifier.search.conditions.size(), 1U) << row[0];
        EXPECT_EQ(identifier.search.conditions[0].list, QVector<QString>{QString::fromUtf8(row[2])})
            << row[0];
    }
}

TEST(QueryIdentifier, ReadsNumbersAndTagsAsSearchesHaveThem)
{
    DcmDataset dataset(anItem().with(DCM_QueryRetrieveLevel, "STUDY").build());
    Dimse::QueryIdentifier identifier;
    QString reason;
    dataset.putAndInsertTagKey(DCM_FrameIncrementPointer, DCM_FrameTime);
    dataset.putAndInsertFloat64(DCM_SelectorFDValue, 6.02876349523266e+184);
    EXPECT_TRUE(Dimse::QueryIdentifier::read(dataset, Dimse::QueryRoot::Study, identifier, reason));
    ASSERT_EQ(identifier.search.conditions.size(), 2U);
    EXPECT_EQ(identifier.search.conditions[0].value, QStringLiteral("00181063"));
    EXPECT_EQ(identifier.search.conditions[1].value, QStringLiteral("6.02876349523266e+184"));
}

/// An attribute as it was found, and the VR and text of it in an answer.
const std::tuple<DcmTagKey, const char*, const char*, const char*> kFound[] = {
    {DCM_SeriesNumber, R"({"vr":"IS","Value":[1000000,2147483647]})", "IS", "1000000\\2147483647"},
    {DCM_PatientWeight, R"({"vr":"DS","Value":[70.5,1e+25]})", "DS", "70.5\\1e+25"},
    {DCM_FrameIncrementPointer, R"({"vr":"AT","Value":["00181063"]})", "AT", "(0018,1063)"},
    {DCM_PatientSize, R"({"vr":"FD","Value":[1.75]})", "DS", "1.75"},
    {{0x0009, 0x1001}, R"({"vr":"UL","Value":[4294967295]})", "UL", "4294967295"},
    {DCM_OtherPatientIDsSequence, R"({"vr":"FL","Value":[1,2]})", "SQ", ""},
};

TEST(QueryAnswer, GivesValuesAsTheyWereFound)
{
    for (const auto& [key, element, vr, text] : kFound) {
        Dimse::QueryIdentifier question;
        question.level = Dimse::QueryLevel::Image;
        question.keys = {{key, {}}, {DCM_SelectorFDValue, {}}};
        DcmDataset answer;
        fillAnswer(question,
                   "{\"" + DicomWeb::keyName(key) + "\":" + element +
                       R"(,"00720074":{"vr":"FD","Value":[5.35005485831951e+134,"-Infinity"]}})",
                   "SCP", answer);
        DcmElement* given = nullptr;
        OFString value;
        Float64 number = 0;
        ASSERT_TRUE(answer.findAndGetElement(key, given).good());
        EXPECT_STREQ(DcmVR(given->ident()).getVRName(), vr);
        if (given->ident() == EVR_SQ)
            EXPECT_EQ(static_cast<DcmSequenceOfItems*>(given)->card(), 0U);
        else
            EXPECT_TRUE(given->getOFStringArray(value).good());
        EXPECT_EQ(value, text);
        EXPECT_TRUE(answer.findAndGetFloat64(DCM_SelectorFDValue, number).good());
        EXPECT_EQ(number, 5.35005485831951e+134);
        EXPECT_TRUE(answer.findAndGetFloat64(DCM_SelectorFDValue, number, 1).good());
        EXPECT_EQ(number, -std::numeric_limits<double>::infinity());
    }
}

TEST(QueryIdentifier, AsksForNoMoreThanItMay)
{
    const auto reasonOf = [](const DatasetBuilder& keys) {
        DcmDataset dataset(keys.build());
        Dimse::QueryIdentifier identifier;
        QString reason;
        Dimse::QueryIdentifier::read(dataset, Dimse::QueryRoot::Study, identifier, reason);
        return reason.toStdString();
    };
    DatasetBuilder many = anItem().with(DCM_QueryRetrieveLevel, "STUDY");
    for (unsigned short i = 0; i < 1000; ++i)
        many.with(DcmTag(0x0018, static_cast<unsigned short>(0x9000 + i), EVR_LO), "");
    EXPECT_EQ(reasonOf(many), "");
    EXPECT_EQ(reasonOf(many.with(DCM_PatientID, "")), "Too many attributes are asked for");
    DatasetBuilder inner = anItem().with(DCM_CodeValue, "");
    for (int depth = 1; depth <= 8; ++depth) {
        inner = anItem().withItem(DCM_ConceptNameCodeSequence, inner);
        DatasetBuilder deep = inner;
        EXPECT_EQ(reasonOf(deep.with(DCM_QueryRetrieveLevel, "STUDY")),
                  depth <= 7 ? "" : "Sequences are nested too deep")
            << depth;
    }
}

TEST_P(FindTest, TellsWhenThereAreMoreAnswersThanItGives)
{
    fill();
    qputenv("KDD_DICOM_ANSWERS", "2");
    start();
    qunsetenv("KDD_DICOM_ANSWERS");
    EXPECT_THAT(find(onLevel("STUDY", "StudyInstanceUID")), HasSubstr("OutOfResources"));
    EXPECT_EQ(answers().size(), 2U);
}

TEST_P(FindTest, EndsWhenItIsCancelled)
{
    for (int i = 0; i < 300; ++i) {
        const QByteArray uid = "7." + QByteArray::number(i);
        store(uid.constData(), anImage(uid).inStudy("7").inSeries("7.0"));
    }
    add();
    start();
    EXPECT_THAT(find(onLevel("IMAGE", "StudyInstanceUID=7|SOPInstanceUID"), "-S --cancel 1"),
                HasSubstr("Cancel: MatchingTerminatedDueToCancelRequest"));
    EXPECT_LT(answers().size(), 300U);
}

}  // namespace
