#include "ArchiveFixture.h"
#include "kddlib/tagfile/qa/ImageOverlay.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "support/LogCapture.h"
#include "support/PostgresServer.h"
#include "support/Process.h"
#include "support/Threads.h"

namespace Kdd
{
namespace
{

const QVector<QASubstitution> kRoe = {{DCM_PatientName, QStringLiteral("Roe^R")}};
const QVector<QASubstitution> kNext = {{DCM_ImageComments, QStringLiteral("next")}};

/// Corrections of studies that are built again afterwards.
class RebuiltCorrections : public ArchiveTest
{
protected:
    RebuiltCorrections()
    {
        for (const char* uid : {"a", "b", "c"})
            save(uid, "1");
        save("z", "2");
        buildAll();
        EXPECT_EQ(waiting(), 0);
    }

    /// What stands for its audit log in an image of a tag file.
    static void setLog(const char* study, const char* uid, const QByteArray& stored)
    {
        TagFile file;
        ASSERT_TRUE(file.readCacheFileForStudy(study, true));
        file.findImage(uid)->putAndInsertValue({0x0071, 0x0021}, kOurPrivateCreator, VrCode::UT, stored);
        ASSERT_TRUE(file.writeCacheFile());
    }

    const Uids mAll = {"1", "2", "3"};
};

TEST_F(RebuiltCorrections, AMoveOntoAnImageOfTheSameUidTakesItsPlace)
{
    const LogCapture quiet;
    save(image("a", "2").with(DCM_ImageComments, "of 2"), "a-of-2");
    buildAll();
    correct(edit({"a"}, {{DCM_PatientName, QStringLiteral("Two")}}, "2"));
    correct(move({"a"}, "1", "2"));
    correct(edit({"a"}, {{DCM_PatientName, QStringLiteral("One")}}, "2"));
    EXPECT_EQ(value("2", "a", DCM_ImageComments), "none");
    expectSurvival(mAll);
    EXPECT_EQ(imagesIn("2"), (Uids{"a", "z"}));
    EXPECT_EQ(value("2", "a", DCM_PatientName), "One");
}

TEST_F(RebuiltCorrections, WhatWasMovedAndDeletedDoesNotComeBack)
{
    correct(move({"a"}, "1", "2"));
    ASSERT_TRUE(mCatalogue->removeImage("2", "a").good());
    buildAll();
    EXPECT_EQ(imagesIn("1") + imagesIn("2"), (Uids{"b", "c", "z"}));
}

TEST_F(RebuiltCorrections, AFileThatArrivesAgainUnderItsFormerStudyFollows)
{
    correct(move({"a"}, "1", "2", kRoe));
    const DcmTag creator(0x0071, 0x0010, EVR_LO);  // of the block that the log had
    const DcmTag theirs(0x0071, 0x1021, EVR_LO);
    save(image("a", "1").with(DCM_ImageComments, "sent again").with(creator, "Other").with(theirs, "theirs"),
         "again");
    buildAll();
    EXPECT_EQ(imagesIn("1") + imagesIn("2"), (Uids{"b", "c", "a", "z"}));
    EXPECT_EQ(value("2", "a", DCM_PatientName), "Roe^R");
    EXPECT_EQ(value("2", "a", DCM_ImageComments) + value("2", "a", theirs), "sent againtheirs");
    EXPECT_EQ(value("2", "a", {0x0071, 0x1122}), "20240131120000");
}

TEST_F(RebuiltCorrections, AnotherJobWaitsUntilTheInterruptedOneIsBuilt)
{
    const Files before = tagFiles(mAll);
    correct(edit({"a"}, kRoe));
    putBack(mAll, before);
    const QAData next = edit({"a"}, kNext);
    EXPECT_NE(refusal(next).find("study 1 is to be built first"), std::string::npos);
    EXPECT_EQ(waiting(), 1);
    build("1");
    correct(next);
    EXPECT_EQ(value("1", "a", DCM_PatientName), "Roe^R");
    expectSurvival(mAll);
}

TEST_F(RebuiltCorrections, WhatCannotBeWrittenIsNotKeptEither)
{
    const LogCapture quiet;
    save(largeImage("large", "1"), "large");
    TagFile::setCompressionMode(TagFile::CompressionMode::None);
    buildAll();
    correct(edit({"b"}, kRoe));
    const std::string before = shown(mAll);
    {
        const FullDisk disk(2'000'000);
        EXPECT_NE(
            refusal(edit({"a", "b"}, {{DCM_PatientName, QStringLiteral("Poe^P")}}), ChangeFault::Failed), "");
        EXPECT_NE(refusal(move({"a", "b"}, "1", "3", {{DCM_SOPInstanceUID, QStringLiteral("x")}})), "")
            << "two of one UID";
        EXPECT_NE(refusal(move({"a", "b"}, "1", "3"), ChangeFault::Failed), "")
            << "which leaves the large one";
        EXPECT_NE(refusal(move({"large"}, "1", "2"), ChangeFault::Failed), "") << "which brings it";
    }
    EXPECT_EQ(shown(mAll), before);
    EXPECT_EQ(waiting(), 0);
    EXPECT_EQ(studies(), (Uids{"1", "2"}));
    expectSurvival(mAll);
    TagFile::setCompressionMode(TagFile::CompressionMode::Zlib);
}

TEST_F(RebuiltCorrections, OfAStudyThatOthersWorkOnAreRefused)
{
    const std::string before = shown(mAll);
    std::unique_ptr<Kxg::StudyClaim> claim;
    ASSERT_TRUE(mCatalogue->claim("2", 0, claim).good() && claim != nullptr);
    refusal(move({"a"}, "1", "2"), ChangeFault::LockedOut);
    EXPECT_EQ(shown(mAll), before);
}

TEST_F(RebuiltCorrections, WhatWaitedBeforeGoesOnWaiting)
{
    save("d", "1");
    correct(edit({"a"}, kRoe));
    correct(move({"a", "b", "c"}, "1", "2"));
    EXPECT_EQ(imagesIn("1"), Uids());
    EXPECT_EQ(waiting(), 1);
    buildAll();
    EXPECT_EQ(imagesIn("1"), Uids{"d"});
}

TEST_F(RebuiltCorrections, AJobOnWhatIsNotAdoptedYetKeepsAllOfIt)
{
    Kxg::SetDatabaseServer(QByteArray());
    correct(edit({"a"}, kRoe));
    correct(move({"c"}, "1", "2", {{DCM_SOPInstanceUID, QStringLiteral("c2")}}));
    Kxg::SetDatabaseServer(mAddress);
    correct(edit({"a"}, kNext));
    correct(edit({"c2"}, kNext, "2"));
    expectSurvival(mAll);
    EXPECT_EQ(imagesIn("1") + imagesIn("2"), (Uids{"a", "b", "c2", "z"}));
}

TEST_F(RebuiltCorrections, ADamagedLogIsToldAndNothingElseSuffers)
{
    const LogCapture log;
    Kxg::SetDatabaseServer(QByteArray());
    correct(edit({"a", "b"}, kRoe));
    correct(edit({"z"}, kRoe, "2"));
    correct(move({"c"}, "1", "2"));
    Kxg::SetDatabaseServer(mAddress);
    setLog("1", "a", "no base64!");
    setLog("2", "c", QByteArray("now\n0010-0010\n").toBase64());
    EXPECT_NE(refusal(edit({"a"}, kNext)), "");
    EXPECT_NE(refusal(edit({"c"}, kNext, "2")), "");
    buildAll();
    for (const char* told : {"image a of study 1", "image c of study 2"})
        EXPECT_EQ(log.count("The corrections of " + std::string(told) + " cannot be kept"), 1);
    EXPECT_EQ(imagesIn("1") + imagesIn("2"), (Uids{"a", "b", "c", "z"})) << "c is where its file says";
    EXPECT_EQ(value("1", "a", DCM_PatientName), "Roe^R") << "as the tag file has it";
    putBack(mAll, {});
    buildAll();
    EXPECT_EQ(value("1", "a", DCM_PatientName), "Doe^J");
    EXPECT_EQ(value("1", "b", DCM_PatientName) + value("2", "z", DCM_PatientName), "Roe^RRoe^R");
}

TEST_F(RebuiltCorrections, WhatATagFileAloneTellsIsTakenUnlessTheDatabaseKnowsBetter)
{
    const LogCapture log;
    const Files before = tagFiles(mAll);
    correct(edit({"a"}, kRoe));
    putBack(mAll, before);
    Kxg::SetDatabaseServer(QByteArray());
    correct(edit({"a"}, {{DCM_PatientName, QStringLiteral("Poe^P")}}));
    correct(move({"b", "c"}, "1", "2"));
    Kxg::SetDatabaseServer(mAddress);
    QFile::remove(QFile::decodeName(path("b")));
    ASSERT_TRUE(mCatalogue->removeImage("1", "c").good());
    build("2");
    build("1");
    EXPECT_EQ(log.count("Image a of study 1 was corrected otherwise"), 1);
    EXPECT_EQ(value("1", "a", DCM_PatientName), "Roe^R");
    EXPECT_EQ(log.count("image c of study 2 cannot be kept"), 1);
    EXPECT_EQ(imagesIn("1") + imagesIn("2"), (Uids{"a", "b", "c", "z"}));
    expectSurvival(mAll);
}

TEST_F(RebuiltCorrections, ADamagedRecordIsMadeAnewFromTheLogOrToldAndTheRestIsBuilt)
{
    const LogCapture log;
    correct(edit({"a", "b"}, kRoe));
    damageRecord("1", "a");
    EXPECT_NE(refusal(edit({"a"}, kNext), ChangeFault::Failed).find("of image a is damaged"),
              std::string::npos);
    expectSurvival(mAll);
    correct(edit({"a"}, kNext));
    damageRecord("1", "a");
    putBack(mAll, {});
    buildAll();
    EXPECT_EQ(log.count("of the corrections of image a of study 1 is damaged"), 1);
    EXPECT_EQ(imagesIn("1"), (Uids{"b", "c"}));
    EXPECT_EQ(value("1", "b", DCM_PatientName), "Roe^R");
}

TEST_F(RebuiltCorrections, MovesInOppositeDirectionsAtOnceLoseNothing)
{
    const LogCapture quiet;
    const auto moveAll = [](const char* from, const char* to) {
        for (const char* uid : {"a", "b", "c", "z"}) {
            QAData job = move({uid}, from, to);
            QString message;
            while (!TagFile::applyQA(job, message) && job.outcome.fault == ChangeFault::LockedOut) {
            }
            EXPECT_EQ(message, QString());
        }
    };
    // What is moved without database the database learns only when the study that has it now is built: not before the
    // other one is.
    for (const QByteArray& database : {mAddress, QByteArray()}) {
        Kxg::SetDatabaseServer(database);
        onThreads(2, [&](int thread) { thread == 0 ? moveAll("1", "2") : moveAll("2", "1"); });
        EXPECT_EQ(imagesIn("1").size() + imagesIn("2").size(), 4);
        if (!database.isEmpty())
            expectSurvival(mAll);
    }
}

/// On a server.
class RebuiltCorrectionsOnServer : public ArchiveTest
{
protected:
    RebuiltCorrectionsOnServer()
        : ArchiveTest(newPostgresDatabase())
    {
    }

    /// Whoever comes to do this loses the connection.
    void loseAt(const char* event) const
    {
        runOnPostgres("CREATE OR REPLACE FUNCTION lose() RETURNS trigger LANGUAGE plpgsql AS"
                      " 'BEGIN PERFORM pg_terminate_backend(pg_backend_pid()); RETURN NULL; END';"
                      "CREATE TRIGGER lose BEFORE " +
                          QByteArray(event) + " FOR EACH ROW EXECUTE FUNCTION lose()",
                      mAddress);
    }
    void loseNoMore() const { runOnPostgres("DROP FUNCTION lose CASCADE", mAddress); }
};

TEST_F(RebuiltCorrectionsOnServer, AreMadeByTheBuildWhenTheDatabaseIsLostAtTheirEnd)
{
    const LogCapture log;
    save(largeImage("a", "1"), "a");
    save("b", "1");
    save(image("b", "2"), "b-of-2");
    TagFile::setCompressionMode(TagFile::CompressionMode::None);
    buildAll();
    const std::string before = shown({"1", "2"});
    loseAt("INSERT ON correction");
    EXPECT_NE(refusal(edit({"a"}, kRoe), ChangeFault::Unasked).find("could not be kept"), std::string::npos);
    EXPECT_EQ(waiting(), 0);
    loseNoMore();
    auto disk = std::make_unique<FullDisk>(2'000'000);
    loseAt("DELETE ON correction");
    EXPECT_NE(refusal(edit({"a"}, kRoe), ChangeFault::Kept).find("keeps the correction ("),
              std::string::npos);
    loseNoMore();
    EXPECT_EQ(shown({"1", "2"}), before);
    disk.reset();
    buildAll();
    EXPECT_EQ(value("1", "a", DCM_PatientName), "Roe^R");
    disk = std::make_unique<FullDisk>(2'000'000);
    EXPECT_NE(refusal(move({"b"}, "1", "2"), ChangeFault::Kept).find("keeps the correction, and"),
              std::string::npos)
        << "it cannot be taken back: files of the image that is replaced would go along";
    disk.reset();
    buildAll();
    EXPECT_EQ(imagesIn("1") + imagesIn("2"), (Uids{"a", "b"}));
    loseAt("DELETE ON build_request");
    correct(move({"a"}, "1", "2"));
    loseNoMore();
    EXPECT_EQ(log.count(" is built once more: "), 2);
    EXPECT_EQ(waiting(), 2);
    correct(move({"a"}, "1", "2"));
    expectSurvival({"1", "2"});
    EXPECT_EQ(imagesIn("2"), (Uids{"a", "b"}));
    EXPECT_EQ(studies(), Uids{"2"}) << "nothing is left of the first one";
    correct(move({"a"}, "2", "1", {{DCM_SOPInstanceUID, QStringLiteral("a2")}}));
    expectSurvival({"1", "2"});
    EXPECT_EQ(value("1", "a2", DCM_PatientName), "Roe^R");
    TagFile::setCompressionMode(TagFile::CompressionMode::Zlib);
}

// ---- overlays

ImageOverlay anOverlay()
{
    const std::unique_ptr<TagMap> image(anImage("1").with(DCM_PatientName, "Doe^J").map());
    AuditLog log;
    log.append({QStringLiteral("now"),
                {{DCM_PatientName, QStringLiteral("Roe^R"), QStringLiteral("Doe^J")},
                 {DCM_ImageComments, QStringLiteral("x"), QString()}}});
    EXPECT_TRUE(log.store(*image));
    ImageOverlay overlay;
    overlay.noteLogged(*image);
    return overlay;
}

TEST(ImageOverlay, IsReadBackAndDamageIsRefused)
{
    const QByteArray bytes = anOverlay().encode();
    ImageOverlay overlay;
    ASSERT_TRUE(overlay.decode(bytes));
    for (int length = 0; length < bytes.size(); ++length)
        EXPECT_FALSE(overlay.decode(bytes.left(length))) << length;
    EXPECT_FALSE(overlay.decode(bytes + '\0'));
    EXPECT_FALSE(overlay.decode('\2' + bytes.mid(1)));
    for (int i = 0; i < bytes.size(); ++i) {
        QByteArray damaged = bytes;
        damaged[i] = static_cast<char>(~damaged.at(i));
        ImageOverlay other;
        other.decode(damaged);
    }
    EXPECT_EQ(overlay.encode(), bytes);
}

}  // namespace
}  // namespace Kdd
