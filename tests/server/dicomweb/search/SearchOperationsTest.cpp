#include "SearchedArchive.h"
#include "support/Threads.h"

#include <QDateTime>
#include <QFile>

#include <atomic>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

constexpr const char* kName = "Group='0010' Element='0010'";
constexpr const char* kStudy = "Group='0020' Element='000d'";

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
        store(sop, anImage(sop)
                       .inStudy(study)
                       .inSeries(series)
                       .with(DCM_PatientName, name)
                       .with(DCM_Modality, "CT"));
    }

    /// UID, name and number of images of each study.
    std::string shown()
    {
        std::string text;
        QMap<QString, QStringList> named;
        for (const QJsonValue& each : list("studies?orderby=StudyInstanceUID")) {
            const QString uid = textOf(each.toObject(), "0020000D");
            const QString name = textOf(each.toObject(), "00100010");
            named[name.left(2)] << uid;
            text += (uid + QLatin1Char(' ') + name + QLatin1Char(' ') + textOf(each.toObject(), "00201208") +
                     QLatin1String("; "))
                        .toStdString();
        }
        // What is known of studies in several places is the same everywhere.
        for (auto it = named.cbegin(); it != named.cend(); ++it) {
            const QByteArray begin = it.key().toUtf8();
            for (const QByteArray& name : {begin + "*", "*" + begin.mid(1) + "*"}) {
                const std::string both = studies(("ModalitiesInStudy=CT&PatientName=" + name).constData());
                EXPECT_EQ(both, studies(("PatientName=" + name).constData()));
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
        const QByteArray target = "changefeed?after=" + QByteArray::number(mLast);
        const QJsonObject feed = QJsonDocument::fromJson(bodyOf(get(target.constData()))).object();
        mLast = feed.value(QLatin1String("last")).toInt();
        QStringList changes;
        for (const QJsonValue& each : feed.value(QLatin1String("changes")).toArray())
            changes << each.toObject().value(QLatin1String("change")).toString() + QLatin1Char(' ') +
                           each.toObject().value(QLatin1String("study")).toString();
        return changes.join(QLatin1String(", ")).toStdString();
    }

    QString tagFile(const char* study) const { return TagFile::cacheFilePathForStudy(study); }

    int mLast = 0;
};

INSTANTIATE_TEST_SUITE_P(Engines, SearchOperations, testing::Values(Engine::Sqlite, Engine::Postgres),
                         engineName);

TEST_P(SearchOperations, ArrivalsAndRemovals)
{
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; ");
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
    EXPECT_EQ(shown(), "1 Doe^John 2; ");
}

TEST_P(SearchOperations, WhatIsRegisteredOnlyAndWhatComesOfIt)
{
    told();
    storeImage("3.1", "3", "New^One");
    kdd({QStringLiteral("index"), path("images")});
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
    correct("1", "1.1", "", kName, "Poe^P");
    EXPECT_EQ(shown(), "1 Poe^P 2; 2 Roe^Jane 1; ");  // the study shows what its first image says
    EXPECT_EQ(studies("PatientName=poe"), "1");
    EXPECT_EQ(studies("PatientName=doe"), "");
    EXPECT_EQ(told(), "corrected 1");
    correct("2", "1.1", "1", kStudy, "2");
    EXPECT_EQ(shown(), "1 Doe^John 1; 2 Poe^P 2; ");
    EXPECT_EQ(told(), "moved 2, moved 1");
    EXPECT_EQ(list("instances?SOPInstanceUID=1.1").size(), 1);
    EXPECT_EQ(values("instances?SOPInstanceUID=1.1", "0020000D"), "2");
    correct("9", "1.2", "1", kStudy, "9");
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
    correct("1", "1.1", "", kName, "Poe^P");
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
    correct("1", "1.1", "", kName, "Poe^P");
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
    QFile file(tagFile("1"));
    ASSERT_TRUE(file.open(QIODevice::WriteOnly | QIODevice::Truncate) && file.write("no tag file") > 0);
    file.close();
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; ");  // what was known of it
    EXPECT_EQ(get("studies/1/instances").status, 500);
    const Http::Response all = get("instances?PatientName=*oe*");
    EXPECT_EQ(all.status, 200);
    EXPECT_TRUE(std::any_of(all.headers.begin(), all.headers.end(), [](const Http::Field& each) {
        return each.name == "Warning" && each.value.contains("1 study could not be read");
    }));
}

/// Each of several processes adds, corrects and deletes studies, while one reader follows the feed in small steps.
TEST_P(SearchOperations, TheFeedSkipsNothingOfWhatProcessesDoAtOnce)
{
    constexpr int kWriters = 3;
    told();
    for (int i = 0; i < kWriters; ++i) {
        QDir().mkpath(path("images") + QLatin1Char('/') + QString::number(i));
        for (int k = 0; k < 4; ++k) {
            const QByteArray study = "5." + QByteArray::number(i) + '.' + QByteArray::number(k);
            store((QByteArray::number(i) + '/' + study).constData(),
                  anImage(study + ".1.1").inStudy(study).inSeries(study + ".1"));
        }
    }
    std::atomic<int> writing{kWriters};
    std::vector<qint64> seen;
    const int first = mLast;
    onThreads(kWriters + 1, [&](int thread) {
        if (thread < kWriters) {
            const QString folder = path("images") + QLatin1Char('/') + QString::number(thread);
            kdd({QStringLiteral("add"), folder});
            for (int k = 0; k < 3; ++k)
                kdd({QStringLiteral("delete"), QStringLiteral("5.%1.%2").arg(thread).arg(k)});
            --writing;
            return;
        }
        for (bool isLast = false; !isLast;) {
            isLast = writing == 0;  // asked before, so that the last look comes after the last change
            for (bool isMore = true; isMore;) {
                const qint64 last = seen.empty() ? first : seen.back();
                const QByteArray target = "changefeed?limit=2&after=" + QByteArray::number(last);
                const QJsonArray changes = QJsonDocument::fromJson(bodyOf(get(target.constData())))
                                               .object()
                                               .value(QLatin1String("changes"))
                                               .toArray();
                for (const QJsonValue& each : changes)
                    seen.push_back(each.toObject().value(QLatin1String("position")).toInt());
                isMore = !changes.isEmpty();
            }
        }
    });
    ASSERT_EQ(seen.size(), kWriters * 7u);  // four arrived, three deleted
    for (std::size_t i = 0; i < seen.size(); ++i)
        EXPECT_EQ(seen[i], first + 1 + static_cast<qint64>(i));
}

TEST_P(SearchOperations, AnArchiveFromBeforeSearchesIsFilledOnce)
{
    kdd("sync 1");
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; ");
    kdd("build --search");
    EXPECT_EQ(shown(), "1 Doe^John 2; 2 Roe^Jane 1; ");
}

}  // namespace
