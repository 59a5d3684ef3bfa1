#include "server/faults/Served.h"

#include <QCryptographicHash>
#include <QHash>

#include <kddlib/TagFile.h>

#include <atomic>
#include <mutex>

using namespace Kdd;

namespace
{

/// The server and what changes its studies, each in processes of their own.
class StudyFaults : public Served
{
protected:
    static constexpr int kImages = 12;

    StudyFaults() { TagFile::setMetaFolder(path("store/meta").toLocal8Bit().constData()); }

    static QString tagFile() { return TagFile::cacheFilePathForStudy("1.2"); }

    void saveImage(int number) const
    {
        const QByteArray uid = "1.2.3." + QByteArray::number(number);
        save(uid.constData(), anImage(uid)
                                  .inSeries(number % 2 == 0 ? "1.2.3" : "1.2.4")
                                  .with(DCM_PatientName, "0")
                                  .withLong(DCM_ImageComments, 900));
    }

    void addStudy() const
    {
        for (int i = 1; i <= kImages; ++i)
            saveImage(i);
        ASSERT_EQ(addImages().exitCode, 0);
    }

    /// Gives all images of the study another name.
    void rename(int name) const
    {
        QByteArray arguments = "qa " + job(DCM_PatientName, QByteArray::number(name)) + " --study 1.2";
        for (int i = 1; i <= kImages; ++i)
            arguments += " --image 1.2.3." + QByteArray::number(i);
        const Answer answer = kdd(arguments);
        ASSERT_EQ(answer.exitCode, 0) << answer.err.toStdString();
    }

    /// What the images of an answer are called, each name once.
    static QStringList namesIn(const QByteArray& json)
    {
        QStringList names;
        for (const QJsonValue& image : jsonAt(json).toArray())
            names.append(jsonAt(image, "00100010/Value/0/Alphabetic").toString());
        names.removeDuplicates();
        return names;
    }

    /// Asks until it is told to end; holds each answer against all the others.
    void ask(const std::atomic<bool>& isDone)
    {
        static const char* const kForms[] = {"", "Accept-Encoding: gzip\r\n"};
        for (int i = 0, last = 0; !isDone; ++i) {
            const Reply reply =
                get(i % 3 == 2 ? "studies/1.2/series/1.2.3/metadata" : "studies/1.2/metadata", kForms[i % 2]);
            ASSERT_TRUE(reply.isWhole && (reply.status == 200 || reply.status == 503)) << reply.status;
            if (reply.status == 503)
                continue;
            if (i % 2 == 0) {
                const QStringList names = namesIn(reply.body);
                EXPECT_EQ(names.size(), 1) << "a mixture: " << names.join(QLatin1Char(' ')).toStdString();
                EXPECT_GE(names.value(0).toInt(), last) << "an older state";
                last = names.value(0).toInt();
            }
            const QByteArray digest = QCryptographicHash::hash(reply.body, QCryptographicHash::Sha1);
            const std::lock_guard<std::mutex> lock(mMutex);
            const QByteArray known = mSeen.value(reply.header("ETag"), digest);
            mSeen.insert(reply.header("ETag"), digest);
            EXPECT_TRUE(known == digest) << "one name for two contents";
        }
    }

    std::mutex mMutex;
    QHash<QByteArray, QByteArray> mSeen;  // content by ETag
};

TEST_F(StudyFaults, EachAnswerIsOneStateWhileOthersChangeTheStudy)
{
    addStudy();
    serve("--threads 4");
    std::atomic<bool> isDone{false};
    onThreads(4, [&](int thread) {
        if (thread != 0)
            return ask(isDone);
        for (int round = 1; round <= 4; ++round) {
            rename(round);
            EXPECT_EQ(kdd("delete 1.2 --image 1.2.3.1").exitCode, 0);
            EXPECT_EQ(addImages().exitCode, 0);
            EXPECT_EQ(kdd("build --again 1.2").exitCode, 0);
            EXPECT_EQ(kdd("sync 1.2").exitCode, 0);
        }
        isDone = true;
    });
    EXPECT_EQ(namesIn(get("studies/1.2/metadata").body), QStringList(QStringLiteral("4")));
    EXPECT_GT(mSeen.size(), 4);
}

TEST_F(StudyFaults, AStudyThatWaitsForItsFirstBuildIsNotSaidToBeAbsent)
{
    saveImage(1);
    ASSERT_EQ(kdd("index @").exitCode, 0);
    serve("--corrections");
    EXPECT_TRUE(get("studies").body.contains("\"1.2\""));
    const QByteArrayList targets = {"studies/1.2/metadata", "studies/1.2/instances",
                                    "studies/1.2/corrections", "studies/1.2/series/1.2.4/instances/1.2.3.1"};
    for (const int status : {503, 200}) {
        for (const QByteArray& target : targets)
            EXPECT_EQ(get(target).status, status) << target.constData();
        EXPECT_EQ(get("studies/1.3/metadata").status, 404);
        EXPECT_EQ(kdd("build").exitCode, 0);
    }
}

TEST_F(StudyFaults, WhatBecomesOfATagFileShowsAtOnce)
{
    addStudy();
    serve();
    const QByteArray older = fileContent(tagFile());
    const Reply first = get("studies/1.2/metadata");
    rename(1);
    const Reply second = get("studies/1.2/metadata");
    EXPECT_EQ(namesIn(second.body), QStringList(QStringLiteral("1")));
    EXPECT_NE(second.header("ETag"), first.header("ETag"));
    putFile(tagFile(), older);
    const Reply restored = get("studies/1.2/metadata");
    EXPECT_TRUE(restored.body == first.body && restored.header("ETag") == first.header("ETag"));
    const std::pair<QByteArray, int> kFaults[] = {
        {older.left(older.size() / 2), 500}, {"nonsense", 500}, {QByteArray(), 503}};
    for (const auto& [content, status] : kFaults) {
        putFile(tagFile(), content);
        EXPECT_EQ(get("studies/1.2/metadata").status, status) << content.size();
        EXPECT_EQ(get("studies/1.2/series/1.2.3/instances/1.2.3.2/frames/1").status, status);
        EXPECT_EQ(get("studies").status, 200) << "the list stays";
    }
    QFile::remove(tagFile());
    // Of what is registered nobody is told that there is none.
    for (const char* path : {"metadata", "instances", "corrections", "series/1.2.3/instances/1.2.3.2"})
        EXPECT_EQ(get(QByteArray("studies/1.2/") + path).status, 500) << path;
    EXPECT_TRUE(get("instances?PatientName=1").header("Warning").contains("299")) << "found without it";
    EXPECT_EQ(kdd("build --all").exitCode, 0);
    EXPECT_TRUE(get("studies/1.2/metadata").body == second.body) << "with its corrections";
    EXPECT_EQ(kdd("delete 1.2").exitCode, 0);
    EXPECT_EQ(get("studies/1.2/metadata").status, 404);
}

}  // namespace
