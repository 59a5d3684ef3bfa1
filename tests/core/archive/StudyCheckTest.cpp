#include "kddlib/archive/StudyCheck.h"

#include "core/tagfile/ArchiveFixture.h"
#include "kddlib/archive/WorkObserver.h"
#include "support/LogCapture.h"

#include <gmock/gmock.h>

namespace Kdd
{
namespace
{

class CheckedArchive;

/// How an archive comes to contradict itself, and what is told of it.
using Contradiction = std::pair<void (*)(CheckedArchive&), const char*>;

/// Study 1 of two series with a volume each, the two of one suffix, and study 2 of one that is corrected.
class CheckedArchive : public ArchiveTest, public testing::WithParamInterface<Contradiction>
{
public:
    CheckedArchive()
    {
        for (const char* uid : {"a", "b"}) {
            const QByteArray series = *uid == 'a' ? "1.1" : "1.2";
            ArchiveTest::save(picture(uid), uid);
            writeVolume(series + "-s.vol", {uid}, {{"G0020-000E", "UI:" + series}});
            addVolume(series + "-s.vol", series);
        }
        ArchiveTest::save("z", "2");
        buildAll();
        correct(edit({"z"}, {{DCM_PatientName, QStringLiteral("Roe^R")}}, "2"));
    }

    using ArchiveTest::damageRecord;
    using ArchiveTest::image;
    using ArchiveTest::path;
    static QString tags(const char* study = "1") { return TagFile::cacheFilePathForStudy(study); }
    static DatasetBuilder picture(const char* uid)
    {
        return image(uid, "1")
            .inSeries(*uid == 'b' ? "1.2" : "1.1")
            .asPicture(kSize, kSize, 8)
            .bytes(std::vector<Uint8>(kSize * kSize, 9));
    }
    QString file(const char* name) const { return QFile::decodeName(path(name)); }
    void addVolume(const QByteArray& name, const QByteArray& series)
    {
        registerFiles({{}, {{path(name), {}, "1", series}}, {}});
    }
    void add(const DatasetBuilder& image, const char* name) { ArchiveTest::save(image, name); }

    /// Has the database take the tag file for one that shows all that it knows.
    void accept(const char* study = "1")
    {
        TagFile file;
        std::unique_ptr<Kxg::StudyClaim> claim;
        ASSERT_TRUE(file.readCacheFileForStudy(study, true) && file.writeCacheFile());
        ASSERT_TRUE(mCatalogue->claim(study, 0, claim).good() && claim->finish(builtStudy(file)).good());
    }
    void forget(const char* name) { ASSERT_TRUE(mCatalogue->removeFiles({path(name)}).good()); }
    void forgetStudy()
    {
        std::unique_ptr<Kxg::StudyClaim> claim;
        ASSERT_TRUE(mCatalogue->removeStudy("1").good() && mCatalogue->claim("1", 0, claim).good());
        ASSERT_TRUE(claim->finishRemoved().good());
    }

    /// How many faults are counted, and what is told of them.
    std::string checked()
    {
        QString told;
        WorkObserver observer;
        StudyCheck check(*mCatalogue, observer, [&](const QString& line) { told += line + u'\n'; });
        check.checkAll();
        told.replace(tags(), QStringLiteral("TAGS")).replace(tags("9"), QStringLiteral("TAGS9"));
        told.replace(file(""), QString());
        return std::to_string(check.findings().differences + check.findings().unreadable) + ": " +
               told.toStdString();
    }
};

using T = CheckedArchive;

const Contradiction kContradictions[] = {
    {[](T&) {}, "0: "},
    {[](T& t) { t.add(T::picture("c"), "c"); }, "1: Study 1 waits to be built\n"},
    {[](T& t) { t.add(T::picture("c"), "c"), QFile::remove(T::tags()); }, "1: Study 1 waits to be built\n"},
    {[](T&) { QFile::remove(T::tags()); }, "1: Study 1 has no tag file\n"},
    {[](T&) { putFile(T::tags(), ""); }, "1: Study 1 has an empty tag file, TAGS\n"},
    {[](T&) { putFile(T::tags(), "?"); }, "1: Study 1 has a tag file, TAGS, that cannot be read: .*"},
    {[](T&) { putFile(T::tags(), fileContent(T::tags("2"))); },
     "1: Study 1 has a tag file, TAGS, that holds study 2\n"},
    {[](T&) { QFile::resize(T::tags(), QFile(T::tags()).size() - 1); },
     "2: .*The tag file of study 1 ends early: 1 previews are missing\n"},
    {[](T& t) { t.add(T::picture("c"), "c"), t.accept(); },
     "1: Image c of study 1, c, is not in the tag file\n"},
    {[](T& t) { t.addVolume("1.1-t.vol", "1.1"), t.forget("b"), t.accept(); },
     "2: Image b of study 1 is not registered\nVolume file 1.1-t.vol of study 1 is not in the tag file\n"},
    {[](T& t) { t.forget("1.1-s.vol"), t.accept(); }, "1: Volume \"s\" of study 1 is not registered\n"},
    {[](T& t) { t.add(T::picture("b"), "b2"), t.accept(); },
     "1: Image b of study 1 is taken from b, but b2 is registered\n"},
    {[](T& t) { t.add(T::picture("b").inSeries("1.7"), "b"), t.accept(); },
     "2: Image b of study 1 stands in series 1.2, but is registered in series 1.7\nImage b: .0020,000e. .*"},
    {[](T& t) { QFile::remove(t.file("b")); }, "1: Could not load b: .*"},
    {[](T& t) { T::image("z", "2").with(DCM_PatientSex, "O").save(t.file("z")); },
     "1: Image z: .0010,0040. .*"},
    {[](T& t) { t.damageRecord("2", "z"), t.accept("2"); }, "1: "},
    {[](T& t) { t.forgetStudy(); }, "1: Study 1 has a tag file, TAGS, but is not registered\n"},
    {[](T&) { putFile(T::tags("9"), fileContent(T::tags())); },
     "1: The tag file TAGS9 holds study 1, whose place is another one\n"},
    {[](T&) { putFile(T::tags("9"), ""); }, "1: The tag file TAGS9 is empty\n"},
    {[](T&) { putFile(T::tags("9"), "?"); }, "1: The tag file TAGS9 cannot be read: .*"},
};

TEST_P(CheckedArchive, TellsOfTheContradictionAndNothingElse)
{
    const LogCapture quiet;
    GetParam().first(*this);
    EXPECT_THAT(checked(), testing::MatchesRegex(GetParam().second));
}

INSTANTIATE_TEST_SUITE_P(Each, CheckedArchive, testing::ValuesIn(kContradictions));

}  // namespace
}  // namespace Kdd
