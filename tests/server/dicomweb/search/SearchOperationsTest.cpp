#include "SearchedArchive.h"

#include <QDateTime>
#include <QFile>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

/// What operations do to a study shows at once in searches and in the feed of changes.
class SearchOperations : public SearchedArchive
{
protected:
    void SetUp() override
    {
        SearchedArchive::SetUp();
        storeImage("1.1", "1", "Doe^John");
        storeImage("1.2", "1", "Doe^John");
        storeImage("2.1", "2", "Roe^Jane");
        add();
    }

    void storeImage(const char* sop, const char* study, const char* name) const
    {
        const QByteArray series = study + QByteArray(".9");
        store(sop, anImage(sop).inStudy(study).inSeries(series).with("Modality=CT|PatientName=" +
                                                                     QByteArray(name)));
    }

    /// UID, name and number of images of each study.
    std::string shown()
    {
        std::string text;
        QMap<QString, QStringList> named;
        for (const QJsonValue& each : list("studies?orderby=StudyInstanceUID")) {
            const QString uid = textOf(each, "0020000D");
            const QString name = textOf(each, "00100010");
            named[name.left(2)] << uid;
            text += QStringLiteral("%1 %2 %3; ").arg(uid, name, textOf(each, "00201208")).toStdString();
        }
        // What is known of studies in several places is the same everywhere.
        for (auto it = named.cbegin(); it != named.cend(); ++it) {
            const QByteArray begin = it.key().toUtf8();
            for (const QByteArray& name : {begin + "*", "*" + begin.mid(1) + "*"}) {
                const std::string both = studies("ModalitiesInStudy=CT&PatientName=" + name);
                EXPECT_EQ(both, studies("PatientName=" + name));
                for (const QString& uid : *it)
                    EXPECT_NE((' ' + both + ' ').find(' ' + uid.toStdString() + ' '), std::string::npos)
                        << both;
            }
        }
        return text;
    }

    /// What was told since the last question.
    std::string told()
    {
        const QByteArray feed = bodyOf(get("changefeed?after=" + QByteArray::number(mLast)));
        mLast = jsonAt(feed, "last").toInt();
        std::string changes;
        for (const QJsonValue& each : jsonAt(feed, "changes").toArray())
            changes += (changes.empty() ? "" : ", ") + textAt(each, "change") + ' ' + textAt(each, "study");
        return changes;
    }

    QString tagFile(const char* study) const { return TagFile::cacheFilePathForStudy(study); }

    int mLast = 0;
};

INSTANTIATE_TEST_SUITE_P(Engines, SearchOperations, kBothEngines, engineName);

TEST_P(SearchOperations, ArrivalsAndRemovals)
{
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; ");
    EXPECT_EQ(jsonAt(bodyOf(get("changefeed?limit=1")), "changes").toArray().size(), 1);
    EXPECT_EQ(told(), "arrived 1, arrived 2");
    storeImage("1.3", "1", "Doe^John");
    add();
    EXPECT_EQ(shown(), "1 Doe^John 3; 2 Roe^Jane 1; ");
    EXPECT_EQ(told(), "arrived 1");
    kdd("build --settle");
    EXPECT_EQ(told(), "");  // only the order of the tag file has changed
    kdd("delete 1 --image 1.3");
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; ");
    EXPECT_EQ(told(), "deleted 1");
    kdd("delete 2");
    EXPECT_EQ(shown(), "1 Doe^John 2; ");
    EXPECT_EQ(told(), "deleted 2");
    kdd("build --all --again");
    kdd("build --search");
    EXPECT_EQ(shown(), "1 Doe^John 2; ");
    EXPECT_EQ(told(), "");
}

TEST_P(SearchOperations, WhatIsRegisteredOnlyAndWhatComesOfIt)
{
    told();
    storeImage("3.1", "3", "New^One");
    kdd("index " + path("images").toUtf8());
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; 3 New^One 1; ");
    EXPECT_EQ(told(), "");
    EXPECT_EQ(list("studies/3/instances").size(), 0);
    kdd("build");
    EXPECT_EQ(told(), "arrived 3");
    EXPECT_EQ(list("studies/3/instances").size(), 1);
}

TEST_P(SearchOperations, CorrectionsAndMoves)
{
    told();
    correct("1", "1.1", DCM_PatientName, "Poe^P");
    EXPECT_EQ(shown(), "1 Poe^P 2; 2 Roe^Jane 1; ");  // the study shows what its first image says
    EXPECT_EQ(studies("PatientName=poe"), "1");
    EXPECT_EQ(studies("PatientName=doe"), "");
    EXPECT_EQ(told(), "corrected 1");
    correct("2", "1.1", DCM_StudyInstanceUID, "2", "1");
    EXPECT_EQ(shown(), "1 Doe^John 1; 2 Poe^P 2; ");
    EXPECT_EQ(told(), "moved 2, moved 1");
    EXPECT_EQ(list("instances?SOPInstanceUID=1.1").size(), 1);
    EXPECT_EQ(values("instances?SOPInstanceUID=1.1", "0020000D"), "2");
    correct("9", "1.2", DCM_StudyInstanceUID, "9", "1");
    EXPECT_EQ(shown(), "2 Poe^P 2; 9 Doe^John 1; ");
    EXPECT_EQ(told(), "moved 9, deleted 1");
    kdd("build --all --again");
    EXPECT_EQ(shown(), "2 Poe^P 2; 9 Doe^John 1; ");
}

TEST_P(SearchOperations, ACorrectionOfAnOldTagFileShowsAtOnce)
{
    const QString kept = path("kept");
    ASSERT_TRUE(QFile::copy(tagFile("1"), kept));
    storeImage("1.3", "1", "Doe^John");
    add();
    ASSERT_TRUE(QFile::remove(tagFile("1")) && QFile::copy(kept, tagFile("1")));
    correct("1", "1.1", DCM_PatientName, "Poe^P");
    EXPECT_EQ(studies("PatientName=poe"), "1");
    kdd("build");
    EXPECT_EQ(shown(), "1 Poe^P 3; 2 Roe^Jane 1; ");
}

TEST_P(SearchOperations, ATagFileOfAnotherTimeIsShownAsItIs)
{
    const QString kept = path("kept");
    ASSERT_TRUE(QFile::copy(tagFile("1"), kept));
    storeImage("1.3", "1", "Doe^John");
    add();
    EXPECT_EQ(shown(), "1 Doe^John 3; 2 Roe^Jane 1; ");
    told();
    ASSERT_TRUE(QFile::remove(tagFile("1")) && QFile::copy(kept, tagFile("1")));
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; ");
    EXPECT_EQ(told(), "corrected 1");
    EXPECT_EQ(list("studies/1/instances").size(), 2);
    kdd("build --all");
    EXPECT_EQ(shown(), "1 Doe^John 3; 2 Roe^Jane 1; ");
    EXPECT_EQ(told(), "arrived 1");
    // Without the file there is what was known of it.
    ASSERT_TRUE(QFile::remove(tagFile("1")));
    EXPECT_EQ(shown(), "1 Doe^John 3; 2 Roe^Jane 1; ");
    kdd("build --all");
    EXPECT_EQ(shown(), "1 Doe^John 3; 2 Roe^Jane 1; ");
}

TEST_P(SearchOperations, ATagFileFromABackupIsFoundByWhatItSaysOnceItWasLookedAt)
{
    QFile file(tagFile("1"));
    ASSERT_TRUE(file.open(QIODevice::ReadOnly));
    const QByteArray former = file.readAll();
    const QDateTime written = file.fileTime(QFileDevice::FileModificationTime);
    file.close();
    correct("1", "1.1", DCM_PatientName, "Poe^P");
    EXPECT_EQ(studies("PatientName=poe"), "1");
    ASSERT_TRUE(file.open(QIODevice::WriteOnly | QIODevice::Truncate) && file.write(former) == former.size());
    ASSERT_TRUE(file.flush() && file.setFileTime(written, QFileDevice::FileModificationTime));
    file.close();
    EXPECT_EQ(studies("PatientName=doe"), "");  // which nobody has looked at yet
    EXPECT_EQ(studies("PatientName=poe"), "");  // found, looked at and another one
    EXPECT_EQ(studies("PatientName=doe"), "1");
    EXPECT_EQ(values("studies/1/instances?includefield=PatientName", "00100010"), "Doe^John Doe^John");
    kdd("build --all");
    EXPECT_EQ(shown(), "1 Poe^P 2; 2 Roe^Jane 1; ");
}

TEST_P(SearchOperations, ADamagedTagFileIsToldOfWhereItIsNeeded)
{
    putFile(tagFile("1"), "no tag file");
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; ");  // what was known of it
    EXPECT_EQ(get("studies/1/instances").status, 500);
    const Http::Response all = get("instances?PatientName=*oe*");
    EXPECT_EQ(all.status, 200);
    EXPECT_TRUE(headerOf(all, "Warning").contains("1 study could not be read"));
}

}  // namespace
