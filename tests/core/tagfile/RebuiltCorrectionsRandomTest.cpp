#include "ArchiveFixture.h"
#include "support/LogCapture.h"

#include <random>

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
    int any(int count) { return static_cast<int>(mRandom() % static_cast<unsigned>(count)); }

    QByteArray anyStudy() { return QByteArray::number(1 + any(3)); }

    QAData anyJob()
    {
        QAData job = edit({}, {}, anyStudy().constData());
        if (any(2) == 0)
            job.oldStudyUID = anyStudy();
        const QByteArray from = job.oldStudyUID.isEmpty() ? job.studyUID : job.oldStudyUID;
        for (const auto& each : mStudyOf) {
            // One image stays, for a study that only tag files know of is not built.
            if (each.second == from && any(2) == 0 && !each.first.startsWith("stays"))
                job.images.append(each.first);
        }
        if (any(2) == 0)
            job.substitutions.append({DCM_PatientName, QString::number(any(4))});
        if (any(3) == 0)
            job.substitutions.append(
                {DCM_ImageComments, any(2) == 0 ? QStringLiteral("") : QString::number(any(4))});
        if (any(2) == 0)
            job.substitutions.append({DCM_SeriesInstanceUID,
                                      QString::fromLatin1(job.studyUID + '.' + QByteArray::number(any(3)))});
        if (any(4) == 0 && job.images.size() == 1)
            job.substitutions.append({DCM_SOPInstanceUID, QString::number(1000 + mNextUid++)});
        return job;
    }

    /// Where the images of the job stand then.
    void expect(const QAData& job)
    {
        for (const QByteArray& uid : job.images) {
            QByteArray now = uid;
            QByteArray study = mStudyOf[uid];
            for (const QASubstitution& each : job.substitutions) {
                if (each.key == DCM_SOPInstanceUID)
                    now = each.value.toLatin1();
                if (each.key == DCM_SeriesInstanceUID)
                    study = job.studyUID;
            }
            mStudyOf.erase(uid);
            mStudyOf[now] = study;
        }
    }

    void check()
    {
        for (const char* study : {"1", "2", "3"}) {
            Uids expected;
            for (const auto& each : mStudyOf) {
                if (each.second == study)
                    expected.append(each.first);
            }
            EXPECT_EQ(imagesIn(study), expected) << "study " << study;
        }
    }

    std::map<QByteArray, QByteArray> mStudyOf;
    std::mt19937 mRandom{7};
    int mNextUid = 0;
};

TEST_F(RebuiltCorrectionsRandom, NoBuildUndoesWhatWasCorrected)
{
    const LogCapture quiet;
    const Uids all = {"1", "2", "3"};
    for (int i = 0; i < kImages; ++i) {
        const QByteArray uid = QByteArray::number(100 + i);
        mStudyOf[uid] = anyStudy();
        save(uid.constData(), mStudyOf[uid].constData());
    }
    for (const QByteArray& study : all) {
        mStudyOf["stays" + study] = study;
        save(("stays" + study).constData(), study.constData());
    }
    buildAll();
    for (int i = 0; i < 60 && !HasFailure(); ++i) {
        const QAData job = anyJob();
        const Files before = tagFiles(all);
        // Some are made while there is no database, some end in the middle.
        const int accident = any(5);
        if (accident == 0)
            Kxg::SetDatabaseServer(QByteArray());
        correct(job);
        Kxg::SetDatabaseServer(mAddress);
        expect(job);
        check();
        const std::string after = shown(all);
        if (accident == 1)
            putBack(all, before);
        // The study that images came to is built first: the other one cannot know of moves that no database heard of.
        if (accident == 0)
            build(job.studyUID);
        if (accident <= 2)
            buildAll();
        EXPECT_EQ(shown(all), after) << "job " << i;
    }
}

}  // namespace
}  // namespace Kdd
