#include "ArchiveFixture.h"
#include "kddlib/tagfile/qa/ImageOverlay.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "support/LogCapture.h"
#include "support/PostgresServer.h"
#include "support/Process.h"

#include <thread>

namespace Kdd
{
namespace
{

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
    correct(move({"a"}, "1", "2", {{DCM_PatientName, QStringLiteral("Roe^R")}}));
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
    correct(edit({"a"}, {{DCM_PatientName, QStringLiteral("Roe^R")}}));
    putBack(mAll, before);
    const QAData next = edit({"a"}, {{DCM_ImageComments, QStringLiteral("next")}});
    EXPECT_NE(refusal(next).find("study 1 is to be built first"), std::string::npos);
    EXPECT_EQ(waiting(), 1);
    build("1");
    correct(next);
    EXPECT_EQ(value("1", "a", DCM_PatientName), "Roe^R");
    expectSurvival(mAll);
}

TEST_F(RebuiltCorrections, WhatCannotBeWrittenIsNotKeptEither)
{
    constexpr int kLarge = 3000000;
    const LogCapture quiet;
    const QByteArray pixels(kLarge, '\x5a');
    DatasetBuilder large = image("large", "1");
    large.dataset().putAndInsertUint8Array(DcmTagKey(0x6000, 0x3000),
                                           reinterpret_cast<const Uint8*>(pixels.constData()), kLarge);
    save(large, "large");
    TagFile::setCompressionMode(TagFile::CompressionMode::None);
    buildAll();
    correct(edit({"b"}, {{DCM_PatientName, QStringLiteral("Roe^R")}}));
    const std::string before = shown(mAll);
    {
        const FullDisk disk(2000000);
        EXPECT_NE(refusal(edit({"a", "b"}, {{DCM_PatientName, QStringLiteral("Poe^P")}})), "");
        EXPECT_NE(refusal(move({"a", "b"}, "1", "3", {{DCM_SOPInstanceUID, QStringLiteral("x")}})), "")
            << "two of one UID";
        EXPECT_NE(refusal(move({"a", "b"}, "1", "3")), "") << "which leaves the large one";
        EXPECT_NE(refusal(move({"large"}, "1", "2")), "") << "which brings it";
    }
    EXPECT_EQ(shown(mAll), before);
    EXPECT_EQ(waiting(), 0);
    EXPECT_EQ(studies(), (Uids{"1", "2"}));
    expectSurvival(mAll);
    TagFile::setCompressionMode(TagFile::CompressionMode::Zlib);
}

TEST_F(RebuiltCorrections, WithoutItsDatabaseACorrectionIsRefused)
{
    const std::string before = shown(mAll);
    Kxg::SetDatabaseServer("sqlite:/proc/none/catalogue.db");
    EXPECT_NE(refusal(edit({"a"}, {{DCM_PatientName, QStringLiteral("Roe^R")}})).find("could not be kept"),
              std::string::npos);
    Kxg::SetDatabaseServer(mAddress);
    std::unique_ptr<Kxg::StudyClaim> claim;
    ASSERT_TRUE(mCatalogue->claim("2", 0, claim).good() && claim != nullptr);
    QAData job = move({"a"}, "1", "2");
    QString message;
    EXPECT_FALSE(TagFile::applyQA(job, message));
    EXPECT_TRUE(job.outcome.isLockedOut) << message.toStdString();
    EXPECT_EQ(shown(mAll), before);
}

TEST_F(RebuiltCorrections, WhatWaitedBeforeGoesOnWaiting)
{
    save("d", "1");
    correct(edit({"a"}, {{DCM_PatientName, QStringLiteral("Roe^R")}}));
    correct(move({"a", "b", "c"}, "1", "2"));
    EXPECT_EQ(imagesIn("1"), Uids());
    EXPECT_EQ(waiting(), 1);
    buildAll();
    EXPECT_EQ(imagesIn("1"), Uids{"d"});
}

TEST_F(RebuiltCorrections, AJobOnWhatIsNotAdoptedYetKeepsAllOfIt)
{
    Kxg::SetDatabaseServer(QByteArray());
    correct(edit({"a"}, {{DCM_PatientName, QStringLiteral("Roe^R")}}));
    correct(move({"c"}, "1", "2", {{DCM_SOPInstanceUID, QStringLiteral("c2")}}));
    Kxg::SetDatabaseServer(mAddress);
    correct(edit({"a"}, {{DCM_ImageComments, QStringLiteral("next")}}));
    correct(edit({"c2"}, {{DCM_ImageComments, QStringLiteral("next")}}, "2"));
    expectSurvival(mAll);
    EXPECT_EQ(imagesIn("1") + imagesIn("2"), (Uids{"a", "b", "c2", "z"}));
}

TEST_F(RebuiltCorrections, MovesInOppositeDirectionsAtOnceLoseNothing)
{
    const LogCapture quiet;
    const auto moveAll = [](const char* from, const char* to) {
        for (const char* uid : {"a", "b", "c", "z"}) {
            QAData job = move({uid}, from, to);
            QString message;
            while (!TagFile::applyQA(job, message) && job.outcome.isLockedOut) {
            }
            EXPECT_EQ(message, QString());
        }
    };
    // What is moved without database the database learns only when the study that has it now is built: not before the
    // other one is.
    for (const QByteArray& database : {mAddress, QByteArray()}) {
        Kxg::SetDatabaseServer(database);
        std::thread there(moveAll, "1", "2");
        std::thread back(moveAll, "2", "1");
        there.join();
        back.join();
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
};

TEST_F(RebuiltCorrectionsOnServer, StayWithTheirLogs)
{
    for (const char* uid : {"a", "b"})
        save(uid, "1");
    buildAll();
    correct(edit({"a", "b"}, {{DCM_PatientName, QStringLiteral("Roe^R")}}));
    correct(move({"a"}, "1", "2", {{DCM_SOPInstanceUID, QStringLiteral("a2")}}));
    correct(move({"b"}, "1", "2"));
    EXPECT_EQ(waiting(), 0);
    EXPECT_EQ(studies(), Uids{"2"}) << "nothing is left of the first one";
    std::vector<Kxg::StudySummary> list;
    ASSERT_TRUE(mCatalogue->listStudies(list).good());
    EXPECT_EQ(list.front().patientName, "Roe^R");
    expectSurvival({"1", "2"});
    correct(move({"a2"}, "2", "1", {{DCM_SOPInstanceUID, QStringLiteral("a")}}));
    expectSurvival({"1", "2"});
    EXPECT_EQ(value("1", "a", DCM_PatientName), "Roe^R");
    EXPECT_EQ(imagesIn("2"), Uids{"b"});
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
