#include "DatabaseFixture.h"
#include "platform/database/StudyProofs.h"

#include <QThread>

using namespace Kxg;

namespace
{

class ProofsTest : public DatabaseTest
{
protected:
    void SetUp() override
    {
        DatabaseTest::SetUp();
        DicomFileRecord file = dicom("/d/a", "1", "1.1", "x");
        file.stamp = {5, 7};
        add({file});
    }

    TagFileProofs proofs(const char* study = "1")
    {
        TagFileProofs found;
        EXPECT_EQ(catalogue().tagFileProofs(study, found).text().toStdString(), "");
        return found;
    }

    std::vector<FileDigest> files(const char* study = "1")
    {
        std::vector<FileDigest> found;
        EXPECT_EQ(catalogue().fileDigests(study, found).text().toStdString(), "");
        return found;
    }

    void build(const QByteArray& digest)
    {
        std::unique_ptr<StudyClaim> claim;
        // A server gives the former claim back some time after its connection is closed.
        ASSERT_TRUE(catalogue().claim("1", 10000, claim).good());
        ASSERT_NE(claim, nullptr);
        BuiltStudy built;
        built.tagFile = {10, digest, 12, 99};
        built.search.series.emplace_back();
        ASSERT_EQ(claim->finish(built).text().toStdString(), "");
    }

    CheckedStudy next(qint64 before)
    {
        CheckedStudy study;
        EXPECT_EQ(catalogue().nextToCheck(before, study).text().toStdString(), "");
        return study;
    }

    void note(const CheckedStudy& study, bool isDone)
    {
        EXPECT_EQ(catalogue().noteCheck(study, isDone).text().toStdString(), "");
    }
};

INSTANTIATE_TEST_SUITE_P(Engines, ProofsTest, kBothEngines, engineName);

TEST_P(ProofsTest, FormerTagFilesAreKeptUpToABound)
{
    EXPECT_TRUE(proofs().isWaiting);
    for (int i = 0; i < kMostFormerTagFiles + 5; ++i)
        build(QByteArray::number(i));
    build(QByteArray::number(kMostFormerTagFiles + 4));
    const TagFileProofs found = proofs();
    EXPECT_FALSE(found.isWaiting);
    EXPECT_EQ(found.last.digest, QByteArray::number(kMostFormerTagFiles + 4));
    EXPECT_EQ(found.last.fileSize, 12);
    EXPECT_EQ(found.last.modified, 99);
    ASSERT_EQ(found.former.size(), static_cast<std::size_t>(kMostFormerTagFiles));
    EXPECT_EQ(found.former.front().digest, QByteArray::number(kMostFormerTagFiles + 3));
    EXPECT_EQ(found.former.back().digest, "4");
    std::unique_ptr<StudyClaim> claim;
    ASSERT_TRUE(catalogue().removeStudy("1").good());
    ASSERT_TRUE(catalogue().claim("1", 10000, claim).good());
    ASSERT_EQ(claim->finishRemoved().text().toStdString(), "");
    EXPECT_FALSE(proofs().isThere);
}

TEST_P(ProofsTest, DigestsAreThoseOfTheFileThatIsRegistered)
{
    const QByteArray digest("\0\xff digest", 9);
    ASSERT_TRUE(catalogue().recordDigests({{"/d/a", {5, 8}, digest}, {"/d/b", {5, 7}, digest}}).good());
    EXPECT_TRUE(files().at(0).digest.isEmpty()) << "of another file";
    ASSERT_TRUE(catalogue().recordDigests({{"/d/a", {5, 7}, digest}}).good());
    correct({{"1", "x", "2", "2.1", "y", "changes"}});
    ASSERT_EQ(files("2").size(), 1U);
    EXPECT_EQ(files("2").at(0).digest, digest) << "moved, and the same file";
    EXPECT_TRUE(proofs("2").hasImages);
    DicomFileRecord file = dicom("/d/a", "1", "1.1", "x");
    file.stamp = {5, 7};
    add({file});
    EXPECT_TRUE(files("2").at(0).digest.isEmpty()) << "read anew";
}

TEST_P(ProofsTest, WhatWasLookedAtTheLongestAgoIsNext)
{
    add({dicom("/d/b", "2", "2.1", "y")});
    const qint64 ever = std::numeric_limits<qint64>::max();
    EXPECT_EQ(next(1).studyInstanceUID, "1");
    note({"1", "/d/a", 3}, false);
    EXPECT_EQ(next(1).position, "/d/a");
    EXPECT_EQ(next(1).faults, 3);
    note({"1", {}, 2}, true);
    EXPECT_EQ(next(ever).studyInstanceUID, "2");
    note({"2", {}, 0}, true);
    EXPECT_EQ(next(1).studyInstanceUID, "");
    EXPECT_EQ(next(ever).position, "");
    EXPECT_EQ(next(ever).faults, 0) << "those of the look before";
    int faulty = 0;
    ASSERT_TRUE(catalogue().countFaulty(faulty).good());
    EXPECT_EQ(faulty, 1);
}

TEST_P(ProofsTest, OneAtATimeHasTheTurn)
{
    const auto other = open();
    std::unique_ptr<CheckTurn> first;
    std::unique_ptr<CheckTurn> second;
    ASSERT_TRUE(catalogue().takeCheckTurn(first).good());
    ASSERT_NE(first, nullptr);
    EXPECT_TRUE(first->confirm().good());
    ASSERT_TRUE(other->takeCheckTurn(second).good());
    EXPECT_EQ(second, nullptr);
    std::unique_ptr<StudyClaim> claim;
    ASSERT_TRUE(other->claim("1", 10000, claim).good());
    EXPECT_NE(claim, nullptr) << "studies are free";
    first.reset();
    for (int i = 0; i < 1000 && second == nullptr; ++i) {
        ASSERT_TRUE(other->takeCheckTurn(second).good());
        QThread::msleep(10);
    }
    EXPECT_NE(second, nullptr);
}

}  // namespace
