#include "ArchiveFixture.h"
#include "RandomJobs.h"
#include "support/LogCapture.h"

namespace Kdd
{
namespace
{

constexpr int kImages = 12;

/// Corrections and builds at random. What every image shows after a correction it shows after every build, and each
/// stands where the last correction put it.
class RebuiltCorrectionsRandom : public ArchiveTest
{
protected:
    RebuiltCorrectionsRandom()
    {
        for (int i = 0; i < kImages; ++i)
            place(QByteArray::number(100 + i), mJobs.anyStudy());
        // One image stays, for a study that only tag files know of is not built.
        for (const QByteArray& study : mAll)
            place("stays" + study, study);
        buildAll();
    }

    void place(const QByteArray& uid, const QByteArray& study)
    {
        save(uid.constData(), study.constData());
        mJobs.images()[uid] = {study, study + ".1", 0, {}};
    }

    RandomJobs mJobs{7};
    const Uids mAll = {"1.1", "1.2", "1.3"};
};

TEST_F(RebuiltCorrectionsRandom, NoBuildUndoesWhatWasCorrected)
{
    const LogCapture quiet;
    for (int i = 0; i < 60 && !HasFailure(); ++i) {
        const QAData job = mJobs.next();
        const Files before = tagFiles(mAll);
        // Some are made while there is no database, some end in the middle.
        const int accident = mJobs.any(5);
        if (accident == 0)
            Kxg::SetDatabaseServer(QByteArray());
        correct(job);
        Kxg::SetDatabaseServer(mAddress);
        mJobs.done(job);
        for (const QByteArray& study : mAll)
            EXPECT_EQ(imagesIn(study.constData()), mJobs.imagesIn(study)) << "study " << study.constData();
        const std::string after = shown(mAll);
        if (accident == 1)
            putBack(mAll, before);
        // The study that images came to is built first: the other one cannot know of moves that no database heard of.
        if (accident == 0)
            build(job.studyUID);
        if (accident <= 2)
            buildAll();
        EXPECT_EQ(shown(mAll), after) << "job " << i;
    }
}

}  // namespace
}  // namespace Kdd
