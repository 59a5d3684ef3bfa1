#include "TagFileQAFixture.h"
#include "kddlib/items/TextDecoding.h"

#include <random>

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
    struct Expected
    {
        QByteArray study;
        QByteArray series;
        int volumes;
        std::string kept;
    };

    TagFileQARandom()
    {
        for (int s = 0; s < 3; ++s) {
            TagFile file;
            std::vector<std::string> stack;
            for (int i = s * 12; i < s * 12 + 12; ++i) {
                const QByteArray uid = QByteArray::number(i);
                add(file, anImage(uid.constData())
                              .inStudy(kStudies[s])
                              .inSeries(seriesOf(kStudies[s], i % 2).constData())
                              .with(DCM_InstanceNumber, uid.constData())
                              .with(DCM_Rows, "16")
                              .withItem(DCM_ReferencedStudySequence,
                                        anItem().with(DCM_PatientID, uid.constData())));
                if (i % 4 == 0)
                    stack.push_back(uid.toStdString());
                mExpected[uid] = {kStudies[s], seriesOf(kStudies[s], i % 2), i % 4 == 0, ""};
            }
            VolumeInfo info = volume(stack, "x-stack.vol");
            file.addVolumeInfo({&info});
            EXPECT_TRUE(file.writeCacheFile());
        }
        check(kImages);
    }

    static QByteArray seriesOf(const char* study, int number)
    {
        return QByteArray(study) + '.' + QByteArray::number(number);
    }

    int any(int count) { return static_cast<int>(mRandom() % static_cast<unsigned>(count)); }

    QAData anyJob(int number)
    {
        const char* const texts[] = {"Doe^J", "Roe^R", "", "M\xc3\xbcller", "line\r\nline"};
        QAData job;
        job.studyUID = kStudies[any(3)];
        if (any(2) == 0)
            job.oldStudyUID = kStudies[any(3)];
        job.timestamp =
            "2024013112" + QByteArray::number(10000 + number % 3600 / 60 * 100 + number % 60).mid(1);
        job.login = any(2) == 0 ? "anna" : "";
        for (int i = any(12); i >= 0; --i)
            job.images.append(QByteArray::number(any(kImages + 3)));
        if (any(2) == 0)
            job.substitutions.append({DCM_PatientName, text(texts[any(4)])});
        if (any(3) == 0)
            job.substitutions.append({DCM_Rows, QString::number(any(3) + 16)});
        if (any(4) == 0)
            job.substitutions.append({DCM_ImageComments, text(texts[any(5)])});
        if (any(5) == 0)
            job.substitutions.append({DCM_InstanceNumber, QString::number(any(50))});
        if (any(2) == 0)
            job.substitutions.append(
                {DCM_SeriesInstanceUID, QString::fromLatin1(seriesOf(job.studyUID.constData(), any(3)))});
        return job;
    }

    /// What the job makes of the images that it finds; those are looked at only by what is expected of all.
    void expect(const QAData& job)
    {
        const QByteArray from = job.oldStudyUID.isEmpty() ? job.studyUID : job.oldStudyUID;
        for (const QByteArray& uid : job.images) {
            const auto image = mExpected.find(uid);
            if (image == mExpected.end() || image->second.study != from)
                continue;
            image->second.kept.clear();
            for (const QASubstitution& each : job.substitutions) {
                if (each.key == DCM_SeriesInstanceUID && image->second.series != each.value.toLatin1()) {
                    image->second.series = each.value.toLatin1();
                    image->second.study = job.studyUID;
                }
            }
        }
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
                EXPECT_EQ(counts[uid], mExpected[uid].volumes) << uid.constData();
            }
        }
    }

    void check(int images)
    {
        int found = 0;
        for (const char* study : kStudies) {
            const auto file = stored(study);
            found += file->imagesByUID().size();
            for (auto it = file->imagesByUID().cbegin(); it != file->imagesByUID().cend(); ++it) {
                Expected& expected = mExpected[it.key()];
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
        EXPECT_EQ(found, images);
    }

    std::map<QByteArray, Expected> mExpected;
    std::mt19937 mRandom{20};
};

/// KDD_QA_JOBS asks for more of them.
TEST_F(TagFileQARandom, CorrectionsLoseNoImageAndNoChange)
{
    const int jobs =
        qEnvironmentVariableIsSet("KDD_QA_JOBS") ? qEnvironmentVariableIntValue("KDD_QA_JOBS") : 60;
    for (int i = 0; i < jobs && !HasFailure(); ++i) {
        const QAData job = anyJob(i);
        const QString source = pathOf(job.oldStudyUID.constData());
        const QByteArray before = content(source);
        EXPECT_TRUE(apply(job)) << "job " << i;
        expect(job);
        check(kImages);
        // As if the process had died before the source was written.
        if (any(4) == 0 && !job.oldStudyUID.isEmpty() && job.oldStudyUID != job.studyUID &&
            before != "(no file)")
            put(source, before);
        EXPECT_TRUE(apply(job));
        check(kImages);
    }
}

}  // namespace
}  // namespace Kdd
