#include "QueriedArchive.h"
#include "support/RealFiles.h"

#include <gmock/gmock.h>

using namespace Kdd;
using testing::HasSubstr;

namespace
{

using RetrieveObjects = QueriedArchive;

INSTANTIATE_TEST_SUITE_P(Engines, RetrieveObjects, testing::Values(Engine::Sqlite), engineName);

TEST_P(RetrieveObjects, GivesThemCorrectedAsOverHttp)
{
    fill();
    correct("1", "1.1.1", DCM_PatientName, "Right^Name");
    const QByteArray keys = onLevel("IMAGE", "StudyInstanceUID=1|SeriesInstanceUID=1.1|SOPInstanceUID=1.1.1");
    get(keys, "+B");
    const std::vector<QByteArray> expected = {retrieved("studies/1/series/1.1/instances/1.1.1")};
    EXPECT_EQ(takenDatasets(), expected);
    EXPECT_EQ(answered(DCM_PatientName), "Right^Name");
    move(keys, "+B");
    EXPECT_EQ(takenDatasets(), expected);
}

TEST_P(RetrieveObjects, GivesAMovedImageUnderItsNewStudyOnly)
{
    fill();
    correct("2", "1.1.1", DCM_StudyInstanceUID, "2", "1");
    getStudy("1");
    EXPECT_EQ(answered(DCM_SOPInstanceUID), "1.1.2 1.2.1");
    getStudy("2");
    EXPECT_EQ(answered(DCM_SOPInstanceUID), "1.1.1 2.1.1");
    EXPECT_EQ(answered(DCM_StudyInstanceUID), "2 2");
    find(onLevel("IMAGE", "SOPInstanceUID=1.1.1|StudyInstanceUID"));
    EXPECT_EQ(answered(DCM_StudyInstanceUID), "2");
}

const char* const kNotUnderstood[] = {
    "StudyInstanceUID=1",
    "QueryRetrieveLevel=STUDY",
    "QueryRetrieveLevel=STUDY|StudyInstanceUID=*",
    "QueryRetrieveLevel=STUDY|StudyInstanceUID=1|PatientID=P*",
    "QueryRetrieveLevel=PATIENT|PatientID=P1",
};

TEST_P(RetrieveObjects, RefusesWhatNamesNothing)
{
    fill();
    for (const char* keys : kNotUnderstood) {
        EXPECT_THAT(move(keys), HasSubstr("DataSetDoesNotMatchSOPClass")) << keys;
        EXPECT_THAT(get(keys), HasSubstr("DataSetDoesNotMatchSOPClass")) << keys;
        EXPECT_TRUE(answers().empty()) << keys;
    }
}

TEST_P(RetrieveObjects, TellsADestinationThatItCannotCall)
{
    fill();
    EXPECT_THAT(moveStudy("1", {}, "STRANGER"), HasSubstr("MoveDestinationUnknown"));
    EXPECT_THAT(moveStudy("1", {}, "UNCALLED"), HasSubstr("MoveDestinationUnknown"));
    const std::string said = moveStudy("1", "-d", "NOBODY");
    EXPECT_THAT(said, HasSubstr("OutOfResourcesSubOperations"));
    EXPECT_THAT(said, HasSubstr("Failed Suboperations          : 3"));
}

TEST_P(RetrieveObjects, TellsWhichOfThemCannotBeSent)
{
    fill();
    QFile::remove(path("images/b"));
    const std::string moved = moveStudy("1", "-d");
    EXPECT_EQ(answered(DCM_SOPInstanceUID), "1.1.1 1.2.1");
    EXPECT_THAT(moved, HasSubstr("Warning: SubOperationsCompleteOneOrMoreFailures"));
    EXPECT_THAT(moved, HasSubstr("(0008,0058) UI [1.1.2]"));
    EXPECT_THAT(moved, HasSubstr("Completed Suboperations       : 2"));
    const std::string got = getStudy("1");
    EXPECT_EQ(answered(DCM_SOPInstanceUID), "1.1.1 1.2.1");
    EXPECT_THAT(got, HasSubstr("Number of Failed Suboperations    : 1"));
}

/// Files of forms, and the option by which the tool takes each.
const std::tuple<const char*, E_TransferSyntax, const char*> kForms[] = {
    {"rle/MR_small_RLE.dcm", EXS_RLELossless, "+xr"},
    {"jpeg-ls-80/CT0012.fragmented_no_bot_jpeg_ls.80.dcm", EXS_JPEGLSLossless, "+xt"},
    {"jpeg2000-lossless-90/693_J2KR.dcm", EXS_JPEG2000LosslessOnly, "+xv"},
    {"jpeg-baseline-50/CTImage.dcm_JPEGProcess1TransferSyntax_1.2.840.10008.1.2.4.50.dcm", EXS_JPEGProcess1,
     "+xy"},
};

TEST_P(RetrieveObjects, GivesAsStoredWhatIsTakenSoAndDecodesTheRest)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA is not set";
    int number = 0;
    for (const auto& [name, syntax, option] : kForms)
        ASSERT_TRUE(
            QFile::copy(realFilesFolder() + QLatin1String("/transfer-syntaxes/") + QLatin1String(name),
                        path("images/") + QString::number(number++)));
    add();
    start();
    number = 0;
    for (const auto& [name, syntax, option] : kForms) {
        DcmFileFormat file;
        ASSERT_TRUE(file.loadFile((path("images/") + QString::number(number++)).toUtf8().constData()).good());
        const QByteArray uid = QByteArray::fromStdString(text(file, DCM_StudyInstanceUID));
        moveStudy(uid, option);
        ASSERT_EQ(answers().size(), 1U) << name;
        EXPECT_EQ(answers().front().getDataset()->getOriginalXfer(), syntax) << name;
        for (const bool isMoved : {true, false}) {
            const std::string said = isMoved ? moveStudy(uid, "+xi") : getStudy(uid);
            ASSERT_EQ(answers().size(), 1U) << name << said;
            EXPECT_FALSE(DcmXfer(answers().front().getDataset()->getOriginalXfer()).isEncapsulated()) << name;
        }
    }
}

TEST_P(RetrieveObjects, EndsWhenItIsCancelled)
{
    for (int i = 0; i < 60; ++i) {
        const QByteArray uid = "7." + QByteArray::number(i);
        store(uid.constData(), anImage(uid).inStudy("7").inSeries("7.0"));
    }
    add();
    start();
    EXPECT_THAT(moveStudy("7", "--cancel 1"),
                HasSubstr("Cancel: SubOperationsTerminatedDueToCancelIndication"));
    EXPECT_LT(answers().size(), 60U);
}

TEST_P(RetrieveObjects, TellsWhatADestinationTookThatDied)
{
    const quint16 port = freePort();
    mSettings.dimse->rules.peers.insert("DYING", {{}, "127.0.0.1", port, false, Dimse::kAllRights});
    fill();
    QProcess destination;
    destination.start(QStringLiteral("storescp"),
                      words("-od " + path("images").toUtf8() + " -xs -xcr") +
                          QStringList{QStringLiteral("kill -9 $PPID"), QString::number(port)});
    while (!isListening(port))
        ASSERT_FALSE(destination.waitForFinished(20));
    const std::string said = moveStudy("1", "-d", "DYING");
    EXPECT_TRUE(destination.waitForFinished(60000));
    EXPECT_THAT(said, HasSubstr("Warning: SubOperationsCompleteOneOrMoreFailures"));
    EXPECT_THAT(said, HasSubstr("Completed Suboperations       : 1"));
    EXPECT_THAT(said, HasSubstr("Failed Suboperations          : 2"));
}

TEST_P(RetrieveObjects, OutlivesHostileIdentifiers)
{
    fill();
    DatasetBuilder deep = anItem().with(DCM_CodeValue, "deep");
    for (int i = 0; i < 1000; ++i)
        deep = anItem().withItem(DCM_ConceptNameCodeSequence, deep);
    const std::pair<const char*, DatasetBuilder> hostile[] = {
        {"deep", deep},
        {"nested",
         anItem().withItem(DCM_RequestAttributesSequence, anItem().with(DCM_RequestedProcedureID, "1"))},
        {"long", anItem().withLong(DCM_PatientComments, 9000)},
        {"huge", anItem().withLong(DCM_TextValue, 200000)},
        {"endless", anItem().withLong(DCM_TextValue, 3000000)},
    };
    for (const auto& [name, identifier] : hostile) {
        identifier.save(path(name), EXS_LittleEndianImplicit);
        for (const char* tool : {"findscu", "getscu", "movescu"}) {
            const auto process = begin(tool, "-S", onLevel("STUDY", "PatientName=*"), {path(name)});
            EXPECT_TRUE(process->waitForFinished(120000)) << tool << name;
        }
        EXPECT_THAT(find(onLevel("STUDY", "StudyInstanceUID=1")), HasSubstr("(Success)")) << name;
    }
}

TEST_P(RetrieveObjects, AnswersManyAtOnceThoughSomeAreKilled)
{
    fill();
    std::vector<std::unique_ptr<QProcess>> asking;
    std::vector<QString> folders;
    for (int i = 0; i < 24; ++i) {
        asking.push_back(
            i % 3 == 0 ? begin("findscu", "-S -X", onLevel("IMAGE", "StudyInstanceUID=1|SOPInstanceUID"))
                       : begin("getscu", "-S", onLevel("STUDY", "StudyInstanceUID=1")));
        folders.push_back(mAnswers);
    }
    for (std::size_t i = 0; i < asking.size(); ++i) {
        if (i % 4 == 1)
            asking[i]->kill();
        EXPECT_TRUE(asking[i]->waitForFinished(120000));
        mAnswers = folders[i];
        if (i % 4 != 1) {
            EXPECT_EQ(answered(DCM_SOPInstanceUID), "1.1.1 1.1.2 1.2.1") << i;
        }
    }
    moveStudy("2");
    EXPECT_EQ(answered(DCM_SOPInstanceUID), "2.1.1");
}

}  // namespace
