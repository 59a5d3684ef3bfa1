#include "server/dicomweb/StudyShelf.h"

#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/Setting.h"
#include "support/TemporaryStore.h"
#include "support/Threads.h"

#include <QFile>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <kddlib/LogFile.h>
#include <kddlib/QAData.h>
#include <kddlib/TagMap.h>
#include <sys/stat.h>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

constexpr const char* kStudy = "1.2";
constexpr auto kAtOnce = std::chrono::nanoseconds(-1'000'000'000);  // times count however young they are

class StudyShelfTest : public testing::Test
{
protected:
    static QString path(const char* study = kStudy) { return TagFile::cacheFilePathForStudy(study); }

    static void write(const char* name, const char* study = kStudy)
    {
        TagFile file;
        const DatasetBuilder image = anImage("1").inStudy(study).with(DCM_PatientName, name);
        file.addTagMap(image.map(), nullptr, true);
        EXPECT_TRUE(file.writeCacheFile());
    }

    static QByteArray nameIn(const ServedStudy& study)
    {
        return study.look([](const TagFile& file) {
            QByteArray name;
            file.findImage("1")->findAndGetString(DCM_PatientName, name);
            return name;
        });
    }

    /// What is found under the study: the name, or what became of it.
    static QByteArray found(StudyShelf& shelf, const char* uid = kStudy)
    {
        std::shared_ptr<const ServedStudy> study;
        const Presence presence = shelf.find(uid, study);
        EXPECT_EQ(presence == Presence::Found, study != nullptr);
        const char* const words[] = {"found", "absent", "unbuilt", "held", "damaged"};
        return study != nullptr ? nameIn(*study) : QByteArray(words[static_cast<int>(presence)]);
    }

    static QByteArray versionIn(StudyShelf& shelf, const char* uid = kStudy)
    {
        QByteArray version;
        std::shared_ptr<const ServedStudy> study;
        const Presence presence = shelf.version(uid, version, study);
        EXPECT_EQ(presence == Presence::Found, !version.isEmpty());
        return version;
    }

    TemporaryStore mStore;
    Setting mPatience{"KDD_READ_PATIENCE", "0"};
    StudyShelf mShelf{1 << 30};
};

void correct()
{
    QAData job;
    job.studyUID = kStudy;
    job.images = {"1"};
    job.timestamp = "20240131120000";
    job.substitutions = {{DCM_PatientName, QStringLiteral("New")}};
    QString message;
    ASSERT_TRUE(TagFile::applyQA(job, message)) << qPrintable(message);
}

void addNew(TagFile& file)
{
    file.addTagMap(anImage("1").with(DCM_PatientName, "New").map(), nullptr, true);
}

void merge()
{
    TagFile file;
    addNew(file);
    ASSERT_TRUE(file.mergeIntoCacheFile());
}

/// Of the same length, with the times that the file had.
void rewriteWithFormerTimes()
{
    const QByteArray name = TagFile::cacheFilePathForStudy(kStudy).toLocal8Bit();
    struct stat former = {};
    ASSERT_EQ(::stat(name.constData(), &former), 0);
    TagFile file;
    addNew(file);
    ASSERT_TRUE(file.writeCacheFile());
    const timespec times[] = {former.st_atim, former.st_mtim};
    ASSERT_EQ(::utimensat(AT_FDCWD, name.constData(), times, 0), 0);
}

/// Another state of the study, in a file beside its own.
QByteArray other()
{
    const QByteArray name = TagFile::cacheFilePathForStudy(kStudy).toLocal8Bit() + ".other";
    TagFile file;
    addNew(file);
    EXPECT_TRUE(file.writeCacheFile(name.constData()));
    return name;
}

void replace()
{
    ASSERT_EQ(::rename(other().constData(), TagFile::cacheFilePathForStudy(kStudy).toLocal8Bit().constData()),
              0);
}

/// A writer that died before it touched the file.
void promise()
{
    const QByteArray content = fileContent(QFile::decodeName(other()));
    putFile(TagFile::cacheFilePathForStudy(kStudy) + QStringLiteral(".journal"), journalOf(content));
}

const std::pair<const char*, void (*)()> kChanges[] = {{"corrected", correct},
                                                       {"merged into", merge},
                                                       {"same length and time", rewriteWithFormerTimes},
                                                       {"replaced", replace},
                                                       {"journal of a dead writer", promise}};

TEST_F(StudyShelfTest, ShowsEveryChangeAtOnceAndLeavesWhatIsServed)
{
    for (const auto& [name, change] : kChanges) {
        write("Old");
        std::shared_ptr<const ServedStudy> before;
        std::shared_ptr<const ServedStudy> after;
        ASSERT_EQ(mShelf.find(kStudy, before), Presence::Found);
        EXPECT_EQ(versionIn(mShelf), before->version());
        change();
        EXPECT_NE(versionIn(mShelf), before->version()) << name;
        ASSERT_EQ(mShelf.find(kStudy, after), Presence::Found) << name;
        EXPECT_NE(after->version(), before->version()) << name;
        EXPECT_EQ(nameIn(*after), "New") << name;
        EXPECT_EQ(nameIn(*before), "Old") << name;
    }
}

TEST_F(StudyShelfTest, SeesAJournalBesideAFileThatDidNotChange)
{
    StudyShelf shelf(1 << 30, kAtOnce);
    EXPECT_EQ(found(shelf) + ' ' + found(shelf, "../../etc"), "absent absent");
    write("Old");
    EXPECT_EQ(found(shelf), "Old");
    promise();
    EXPECT_EQ(found(shelf), "New");
}

TEST_F(StudyShelfTest, GivesWhatItFindsThoughOthersNeedItsRoom)
{
    write("One");
    write("Other", "1.3");
    StudyShelf shelf(1, kAtOnce);
    onThreads(4, [&](int thread) {
        for (int i = 0; i < 2000; ++i)
            EXPECT_EQ(found(shelf, thread % 2 == 0 ? kStudy : "1.3"), thread % 2 == 0 ? "One" : "Other");
    });
}

TEST_F(StudyShelfTest, ReadsAgainOnlyWhatChangedOrHadToGo)
{
    StudyShelf shelf(1, kAtOnce);  // room for none but the last
    LogFile::setLevel(LogFile::Level::Timing);
    const LogCapture log;
    const auto reads = [&](const std::function<void()>& work) {
        const int before = log.count("Cache file read");
        work();
        return log.count("Cache file read") - before;
    };
    write("Doe");
    write("Roe", "1.3");
    EXPECT_EQ(reads([&] { EXPECT_EQ(found(shelf) + found(shelf), "DoeDoe"); }), 1);
    EXPECT_EQ(reads([&] { found(shelf, "1.3"); }), 1);
    EXPECT_EQ(reads([&] { versionIn(shelf); }), 0);
    EXPECT_EQ(shelf.count().misses.load(), 2);
    EXPECT_EQ(shelf.count().hits.load(), 2);
    EXPECT_EQ(reads([&] { found(shelf); }), 1);
    replace();
    EXPECT_EQ(reads([&] { EXPECT_EQ(found(shelf) + found(shelf), "NewNew"); }), 1);
    EXPECT_EQ(reads([&] { found(mShelf), found(mShelf); }), 2) << "too young to be believed";
    LogFile::setLevel(LogFile::Level::Information);
}

}  // namespace
