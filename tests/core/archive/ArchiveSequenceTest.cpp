#include "core/archive/ArchiveOperations.h"
#include "support/PostgresServer.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <numeric>

using namespace Kdd;

namespace
{

/// Random operations, with the archive held against its model after each.
class Sequence : public ArchiveOperations
{
public:
    using ArchiveOperations::ArchiveOperations;

    /// Until the first difference. Which steps these are does not depend on those before them, so that some can be left out.
    void run(unsigned seed, const std::vector<unsigned>& steps)
    {
        for (auto it = steps.begin(); it != steps.end() && mFault.empty(); ++it) {
            std::seed_seq numbers{seed, *it};
            mRandom.seed(numbers);
            step();
            compare();
            noteWritten();
        }
        if (mFault.empty())
            compareWithFreshBuild();
    }

protected:
    void step()
    {
        const unsigned what = pick(100);
        if (what < 24)
            write(pickPath());
        else if (what < 26)
            rewrite(pickPath());
        else if (what < 28)
            touch(pickPath());
        else if (what < 33)
            removeFile(pickPath());
        else if (what < 49)
            add(pickFolder());
        else if (what < 56)
            index(pickFolder());
        else if (what < 61)
            buildWaiting();
        else if (what < 67)
            buildAll(false);
        else if (what < 71)
            buildAll(true);
        else if (what < 75)
            settle();
        else if (what < 85)
            remove();
        else if (what < 89)
            sync(pickStudy());
        else if (what < 92)
            edit(pickStudy(), "9." + std::to_string(pick(10)), "Roe^" + std::to_string(pick(3)));
        else
            spoil(pickStudy());
    }

    // ---- comparison

    static std::string keyed(const ModelStudy& study)
    {
        std::string text;
        for (const auto& image : study)
            text += "  " + image.first + " from " + image.second.path + ": " + image.second.shows.study +
                    ' ' + image.second.shows.series + ' ' + image.second.shows.patient + ' ' +
                    image.second.shows.number + '\n';
        return text;
    }

    static ModelStudy contentOf(const TagFile& file)
    {
        ModelStudy study;
        for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it) {
            const TagMap& image = *it.value();
            QByteArray patient;
            QByteArray number;
            image.findAndGetString(DCM_PatientName, patient);
            image.findAndGetString(DCM_InstanceNumber, number);
            study[it.key().toStdString()] = {
                filePathOf(image).toStdString(),
                {image.uid(TagMap::StudyLevel).toStdString(), image.uid(TagMap::SeriesLevel).toStdString(),
                 image.uid(TagMap::ImageLevel).toStdString(), patient.toStdString(), number.toStdString()}};
        }
        return study;
    }

    void compare()
    {
        for (const char* study : kStudies) {
            compareTagFile(study);
            compareListing(study);
        }
        compareList();
        compareCheck();
    }

    void compareTagFile(const std::string& study)
    {
        TagFile file;
        const bool isRead = file.readCacheFileForStudy(study.c_str(), false);
        const ModelStudy* wanted = mModel.tagFile(study);
        expect(isRead == (wanted != nullptr), "study " + study + (isRead ? " has" : " has no") + " tag file");
        const std::string got = keyed(contentOf(file));
        const std::string expected = wanted != nullptr ? keyed(*wanted) : "";
        expect(got == expected, "study " + study + " shows\n" + got + "instead of\n" + expected);
        expect(QFile::exists(tagFilePath(study)) == mModel.hasTagFile(study),
               "a tag file too many or too few");
    }

    void compareListing(const std::string& study)
    {
        Kxg::StudyContents contents;
        expect(mCatalogue->studyContents(QByteArray::fromStdString(study), contents).good(), "no contents");
        ModelStudy got;
        for (const Kxg::ListedImage& image : contents.images) {
            const QByteArray& key = image.sopInstanceUID.isEmpty() ? image.path : image.sopInstanceUID;
            got[key.toStdString()] = {image.path.toStdString(),
                                      {study, image.seriesInstanceUID.toStdString(), "", "", ""}};
        }
        ModelStudy wanted = mModel.listedImages(study);
        for (auto& image : wanted)
            image.second.shows = {study, image.second.shows.series, "", "", ""};
        expect(keyed(got) == keyed(wanted),
               "of study " + study + " is listed\n" + keyed(got) + "instead of\n" + keyed(wanted));
        expect(contents.isWaiting == mModel.isWaiting(study),
               "study " + study + (contents.isWaiting ? " waits" : " does not wait"));
    }

    void compareList()
    {
        std::vector<Kxg::StudySummary> list;
        expect(mCatalogue->listStudies(list).good(), "no list");
        std::set<std::string> names;
        for (const Kxg::StudySummary& each : list) {
            const std::string study = each.studyInstanceUID.toStdString();
            names.insert(study);
            expect(each.images == static_cast<int>(mModel.listedImages(study).size()),
                   "study " + study + " is said to have " + std::to_string(each.images) + " images");
            const ModelStudy* file = mModel.tagFile(study);
            if (mModel.isFaulty(study) || file == nullptr)
                continue;
            const bool isNamed = std::any_of(file->begin(), file->end(), [&](const auto& image) {
                return image.second.shows.patient == each.patientName.toStdString();
            });
            expect(isNamed, "study " + study + " is listed as of " + each.patientName.toStdString());
        }
        expect(names == mModel.listed(), "other studies are listed");
    }

    void compareCheck()
    {
        std::string told;
        StudyCheck check(*mCatalogue, mObserver,
                         [&](const QString& fault) { told += fault.toStdString() + '\n'; });
        check.checkAll();
        expect(told.empty() != mModel.isFaulty(),
               told.empty() ? "the check finds nothing" : "the check finds\n" + told);
    }

    /// What only grew must be what a build into an empty folder makes.
    void compareWithFreshBuild()
    {
        add(root());
        settle();
        buildAll(false);
        compare();
        std::map<std::string, Kxg::TagFileStamp> stamps = stampsOfSettled();
        QTemporaryDir fresh;
        TagFile::setMetaFolder(fresh.path().toLocal8Bit().constData());
        tell("build all into an empty folder");
        requestStale(*mCatalogue, true);
        buildQueue();
        for (const auto& stamp : stampsOfSettled())
            expect(stamps[stamp.first] == stamp.second,
                   "study " + stamp.first + " is not what a build makes of it");
    }

    std::map<std::string, Kxg::TagFileStamp> stampsOfSettled()
    {
        std::map<std::string, Kxg::TagFileStamp> stamps;
        for (const char* study : kStudies) {
            Kxg::StudyContents contents;
            if (mModel.isSettled(study) && mCatalogue->studyContents(study, contents).good())
                stamps[study] = contents.tagFile;
        }
        return stamps;
    }
};

/// More on request: KDD_ARCHIVE_STEPS steps in all, from seed KDD_ARCHIVE_SEED.
unsigned setting(const char* name, unsigned standard)
{
    const char* text = std::getenv(name);
    return text != nullptr ? static_cast<unsigned>(std::strtoul(text, nullptr, 10)) : standard;
}

constexpr unsigned kStepsOfSequence = 40;

using NewDatabase = QByteArray (*)();

/// What differed, and after which steps; empty when nothing did.
std::string faultOf(NewDatabase newDatabase, unsigned seed, const std::vector<unsigned>& steps)
{
    Sequence sequence(newDatabase(), seed);
    sequence.run(seed, steps);
    return sequence.fault().empty() ? "" : sequence.fault() + "\nafter\n" + sequence.story();
}

/// Leaves out step after step as long as something differs still.
std::string shortest(NewDatabase newDatabase, unsigned seed, std::vector<unsigned> steps, std::string fault)
{
    for (std::size_t i = steps.size(); i-- > 0;) {
        std::vector<unsigned> fewer = steps;
        fewer.erase(fewer.begin() + static_cast<std::ptrdiff_t>(i));
        const std::string found = faultOf(newDatabase, seed, fewer);
        if (found.empty())
            continue;
        steps.swap(fewer);
        fault = found;
    }
    return fault;
}

void expectAgreement(unsigned first, unsigned count, NewDatabase newDatabase)
{
    std::vector<unsigned> steps(kStepsOfSequence);
    std::iota(steps.begin(), steps.end(), 0U);
    for (unsigned seed = first; seed < first + count / kStepsOfSequence && !testing::Test::HasFailure();
         ++seed) {
        const std::string fault = faultOf(newDatabase, seed, steps);
        if (!fault.empty())
            ADD_FAILURE() << "seed " << seed << ": " << shortest(newDatabase, seed, steps, fault);
    }
}

TEST(ArchiveSequence, AgreesWithTheModelOnBothEngines)
{
    const unsigned first = setting("KDD_ARCHIVE_SEED", 1);
    const unsigned steps = setting("KDD_ARCHIVE_STEPS", 1200);
    std::printf("%u steps on SQLite from seed %u, and %u on PostgreSQL\n", steps, first, steps / 10);
    expectAgreement(first, steps, [] { return QByteArray(); });
    expectAgreement(first + 100000, steps / 10, newPostgresDatabase);
}

}  // namespace
