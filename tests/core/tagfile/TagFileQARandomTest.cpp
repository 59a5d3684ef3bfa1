#include "RandomJobs.h"
#include "TagFileQAFixture.h"
#include "kddlib/items/TextDecoding.h"

namespace Kdd
{
namespace
{

constexpr int kImages = 36;
const char* const kStudies[] = {"1.1", "1.2", "1.3"};

/// Corrections at random of three studies, beside a model of what must come of them.
class TagFileQARandom : public TagFileQATest
{
protected:
    TagFileQARandom()
    {
        for (int s = 0; s < 3; ++s) {
            TagFile file;
            std::vector<std::string> stack;
            for (int i = s * 12; i < s * 12 + 12; ++i) {
                const QByteArray uid = QByteArray::number(i);
                const QByteArray series = QByteArray(kStudies[s]) + '.' + QByteArray::number(i % 2);
                add(file, anImage(uid.constData())
                              .inStudy(kStudies[s])
                              .inSeries(series.constData())
                              .with(DCM_InstanceNumber, uid.constData())
                              .with(DCM_Rows, "16")
                              .withItem(DCM_ReferencedStudySequence,
                                        anItem().with(DCM_PatientID, uid.constData())));
                if (i % 4 == 0)
                    stack.push_back(uid.toStdString());
                mJobs.images()[uid] = {kStudies[s], series, i % 4 == 0, {}};
            }
            addVolumes(file, {aVolume(stack, "x-stack.vol")});
            EXPECT_TRUE(file.writeCacheFile());
        }
        check();
    }

    /// The last text that the log tells of each attribute is what the image shows, each change begins where the one
    /// before it ended.
    static void checkLog(const TagMap& image)
    {
        QVector<AuditEntry> entries;
        ASSERT_TRUE(logOf(image).decode(entries));
        std::map<DcmTagKey, QString> texts;
        for (const AuditEntry& entry : entries) {
            for (const AuditChange& change : entry.changes) {
                EXPECT_TRUE(texts.count(change.key) == 0 || texts[change.key] == change.oldText);
                EXPECT_NE(change.oldText, change.newText);
                texts[change.key] = change.newText;
            }
        }
        for (const auto& [key, text] : texts)
            EXPECT_EQ(decodeText(shown(image, key), QByteArray()), text);
    }

    void checkVolumes(const TagFile& file)
    {
        for (auto it = file.seriesByUID().cbegin(); it != file.seriesByUID().cend(); ++it) {
            volumesOf(file, it.key().constData());
            std::map<QByteArray, int> counts;
            for (const Volume* each : it.value()->volumes()) {
                EXPECT_GT(each->numImages(), 0);
                for (int i = 0; i < each->numImages(); ++i)
                    ++counts[each->image(i)->uid(TagMap::ImageLevel)];
            }
            for (const TagMap* image : it.value()->children()) {
                const QByteArray uid = image->uid(TagMap::ImageLevel);
                EXPECT_EQ(counts[uid], mJobs.images()[uid].volumes) << uid.constData();
            }
        }
    }

    void check()
    {
        int found = 0;
        for (const char* study : kStudies) {
            const auto file = stored(study);
            found += file->imagesByUID().size();
            for (auto it = file->imagesByUID().cbegin(); it != file->imagesByUID().cend(); ++it) {
                RandomJobs::Image& expected = mJobs.images()[it.key()];
                EXPECT_EQ(expected.study, study) << it.key().constData();
                EXPECT_EQ(expected.series, shown(*it.value(), DCM_SeriesInstanceUID));
                EXPECT_EQ(shown(*it.value(), DCM_StudyInstanceUID), study);
                const std::string now = kept(*it.value());
                EXPECT_TRUE(expected.kept.empty() || expected.kept == now) << now << "not" << expected.kept;
                expected.kept = now;
                checkLog(*it.value());
            }
            checkVolumes(*file);
        }
        EXPECT_EQ(found, kImages);
    }

    RandomJobs mJobs{20};
};

/// KDD_QA_JOBS asks for more of them.
TEST_F(TagFileQARandom, CorrectionsLoseNoImageAndNoChange)
{
    const int jobs =
        qEnvironmentVariableIsSet("KDD_QA_JOBS") ? qEnvironmentVariableIntValue("KDD_QA_JOBS") : 60;
    for (int i = 0; i < jobs && !HasFailure(); ++i) {
        const QAData job = mJobs.next();
        const QString source = pathOf(job.oldStudyUID.constData());
        const QByteArray before = content(source);
        EXPECT_TRUE(apply(job)) << "job " << i;
        mJobs.done(job);
        check();
        // As if the process had died before the source was written.
        if (mJobs.any(4) == 0 && !job.oldStudyUID.isEmpty() && job.oldStudyUID != job.studyUID &&
            before != "(no file)")
            put(source, before);
        EXPECT_TRUE(apply(job));
        check();
    }
}

}  // namespace
}  // namespace Kdd
