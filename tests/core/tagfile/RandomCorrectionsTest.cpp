#include "ArchiveFixture.h"
#include "kddlib/items/TextDecoding.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/volumes/Volume.h"
#include "support/LogCapture.h"

#include <random>

namespace Kdd
{
namespace
{

constexpr int kImages = 15;

/// What an image shows of its volumes and of the nodes above, and what jobs change.
const DcmTagKey kOfOthers[] = {kVolumeIndex, kPreview, kFromDatabase, kHasVolumeFile, kAbstract};
const DcmTagKey kCorrected[] = {
    DCM_StudyInstanceUID, DCM_SeriesInstanceUID, DCM_SOPInstanceUID, DCM_PatientName,  DCM_Rows,
    DCM_ImageComments,    DCM_InstanceNumber,    {0x0071, 0x0011},   {0x0071, 0x1121}, {0x0071, 0x1122}};

/// Corrections and builds at random, beside a model of where every image must stand and what it must show.
class RandomCorrections : public ArchiveTest
{
protected:
    struct Image
    {
        QByteArray study;
        QByteArray series;
        std::string mark;                        // a text that is only in this image
        std::map<DcmTagKey, QByteArray> values;  // of what jobs correct
        int volumes = 0;                         // that it is in
        std::string kept;                        // all else that it shows
    };

    RandomCorrections()
    {
        for (int i = 0; i < kImages; ++i)
            place(QByteArray::number(100 + i), anyStudy());
        for (const QByteArray& study : mAll) {
            // One image stays, for a study that only tag files know of is not built.
            place("stays" + study, study);
            std::vector<std::string> stack;
            for (const QByteArray& uid : imagesOf(study)) {
                mImages[uid].volumes = any(2);
                if (mImages[uid].volumes > 0)
                    stack.push_back(uid.toStdString());
            }
            const QByteArray volume = study + ".1-stack.vol";
            writeVolume(volume, stack, {{"G0020-000E", "UI:" + study + ".1"}});
            registerFiles({{}, {{path(volume), {}, study, study + ".1"}}, {}});
        }
        place("", "1.1");
        buildAll();
    }

    int any(int count) { return static_cast<int>(mRandom() % static_cast<unsigned>(count)); }
    QByteArray anyStudy() { return mAll.at(any(3)); }

    /// One without UID is known by its path.
    void place(const QByteArray& uid, const QByteArray& study)
    {
        const QByteArray name = uid.isEmpty() ? QByteArray("nameless") : uid;
        const QByteArray mark = "only of " + name + ';';
        DatasetBuilder made = image(uid.constData(), study.constData());
        made.with(DCM_ImageComments, "x")
            .withItem(DCM_ReferencedStudySequence, anItem().with(DCM_PatientComments, mark));
        made.with(DcmTag(0x0071, 0x0010, EVR_LO), "Other").with(DcmTag(0x0071, 0x1021, EVR_LO), "theirs");
        save(uid.isEmpty() ? made.without(DCM_SOPInstanceUID) : made, name);
        mImages[uid.isEmpty() ? path(name) : uid] = {study, study + ".1", mark.toStdString(), {}, 0, ""};
    }

    Uids imagesOf(const QByteArray& study) const
    {
        Uids uids;
        for (const auto& [uid, image] : mImages) {
            if (image.study == study)
                uids.append(uid);
        }
        return uids;
    }

    QAData next()
    {
        const char* const texts[] = {"Doe^J", "Roe^R", "", "M\xc3\xbcller", "line\r\nline\n"};
        QAData job = edit({}, {}, anyStudy().constData());
        if (any(2) == 0)
            job.oldStudyUID = anyStudy();
        job.timestamp = "2024013112" + QByteArray::number(10000 + mNext++ % 60).mid(1);
        for (const QByteArray& uid : imagesOf(job.oldStudyUID.isEmpty() ? job.studyUID : job.oldStudyUID)) {
            if (any(3) == 0 && !uid.startsWith("stays"))
                job.images.append(uid);
        }
        const auto maybe = [&](int oneIn, const DcmTagKey& key, const QByteArray& value) {
            if (any(oneIn) == 0)
                job.substitutions.append({key, QString::fromUtf8(value)});
        };
        maybe(2, DCM_PatientName, texts[any(4)]);
        maybe(3, DCM_Rows, QByteArray::number(any(3) + 16));
        maybe(4, DCM_ImageComments, texts[any(5)]);
        maybe(5, DCM_InstanceNumber, QByteArray::number(any(50)));
        maybe(2, DCM_SeriesInstanceUID, job.studyUID + '.' + QByteArray::number(any(3)));
        if (job.images.size() == 1)
            maybe(3, DCM_SOPInstanceUID, QByteArray::number(1000 + mNext));
        return job;
    }

    /// In the model.
    void note(const QAData& job)
    {
        for (const QByteArray& uid : job.images) {
            Image image = mImages.at(uid);
            QByteArray now = uid;
            for (const auto& [key, text] : job.substitutions) {
                if (key == DCM_SOPInstanceUID) {
                    now = text.toLatin1();
                } else if (key != DCM_SeriesInstanceUID) {
                    image.values[key] = text.toLatin1();
                } else if (image.series != text.toLatin1()) {
                    image.series = text.toLatin1();
                    image.study = job.studyUID;
                }
            }
            mImages.erase(uid);
            mImages[now] = image;
        }
    }

    static QByteArray shownBy(const TagMap& image, const DcmTagKey& key)
    {
        QByteArray text;
        return image.findAndGetString(key, text) ? text : QByteArray("none");
    }

    /// The last text that the log tells of each attribute is what the image shows, each change begins where the one
    /// before it ended.
    static void checkLog(const TagMap& image)
    {
        AuditLog log;
        QVector<AuditEntry> entries;
        ASSERT_TRUE(log.read(image) && log.decode(entries));
        std::map<DcmTagKey, QString> texts;
        for (const AuditEntry& entry : entries) {
            for (const AuditChange& change : entry.changes) {
                EXPECT_TRUE(texts.count(change.key) == 0 || texts[change.key] == change.oldText);
                EXPECT_NE(change.oldText, change.newText);
                texts[change.key] = change.newText;
            }
        }
        for (const auto& [key, text] : texts)
            EXPECT_EQ(decodeText(shownBy(image, key), QByteArray()), text);
    }

    /// In how many volumes each image is.
    static std::map<const TagMap*, int> volumesOf(const TagFile& file)
    {
        std::map<const TagMap*, int> counts;
        for (const TagMap* series : file.seriesByUID()) {
            for (const Volume* each : series->volumes()) {
                EXPECT_EQ(each->slices().size(), int(each->sopUIDList().size()));
                for (int i = 0; i < each->numImages(); ++i)
                    ++counts[each->image(i)];
            }
        }
        return counts;
    }

    /// Whether all is as the model has it; what the images show of it, with the VRs.
    std::string checked()
    {
        std::string all;
        for (const QByteArray& study : mAll) {
            TagFile file;
            file.readCacheFileForStudy(study, false);
            EXPECT_EQ(file.imagesByUID().keys(), imagesOf(study)) << study.constData();
            std::map<const TagMap*, int> volumes = volumesOf(file);
            for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it) {
                Image& expected = mImages[it.key()];
                EXPECT_EQ(shownBy(*it.value(), DCM_StudyInstanceUID), study);
                EXPECT_EQ(shownBy(*it.value(), DCM_SeriesInstanceUID), expected.series);
                EXPECT_EQ(volumes[it.value()], expected.volumes) << it.key().constData();
                for (const auto& [key, text] : expected.values)
                    EXPECT_EQ(shownBy(*it.value(), key), text);
                const std::unique_ptr<TagMap> rest(it.value()->clone());
                for (const DcmTagKey& key : kOfOthers)
                    rest->deleteElement(key);
                all += it.key().toStdString() + '\n' + shownText(*rest);
                for (const DcmTagKey& key : kCorrected)
                    rest->deleteElement(key);
                const std::string kept = shownText(*rest);
                EXPECT_TRUE(expected.kept.empty() || expected.kept == kept) << kept << "not\n"
                                                                            << expected.kept;
                expected.kept = kept;
                checkLog(*it.value());
            }
            const std::string held = treeText(file);
            for (const auto& [uid, image] : mImages)
                EXPECT_EQ(held.find(image.mark) == std::string::npos, image.study != study)
                    << "nothing of a patient's image stays with another patient: " << uid.constData();
        }
        return all;
    }

    std::mt19937 mRandom{7};
    int mNext = 0;
    std::map<QByteArray, Image> mImages;  // by UID; those whose UID begins with "stays" are never corrected
    const Uids mAll = {"1.1", "1.2", "1.3"};
};

/// KDD_QA_JOBS asks for more of them.
TEST_F(RandomCorrections, LoseNoImageAndNoChangeHoweverTheyEnd)
{
    const LogCapture quiet;
    checked();
    const int jobs =
        qEnvironmentVariableIsSet("KDD_QA_JOBS") ? qEnvironmentVariableIntValue("KDD_QA_JOBS") : 60;
    for (int i = 0; i < jobs && !HasFailure(); ++i) {
        SCOPED_TRACE("job " + std::to_string(i));
        const QAData job = next();
        const Files before = tagFiles(mAll);
        // Some are made while there is no database, some end before both studies or the one that is left are written.
        const int accident = any(6);
        if (accident == 0)
            Kxg::SetDatabaseServer(QByteArray());
        correct(job);
        note(job);
        const std::string after = checked();
        if (accident < 3)
            putBack(accident < 2 || any(2) == 0 ? Uids{job.oldStudyUID} : mAll, before);
        QAData again = job;
        QString message;
        EXPECT_TRUE(accident == 1 || TagFile::applyQA(again, message)) << qPrintable(message);
        Kxg::SetDatabaseServer(mAddress);
        // The study that images came to is built first: the other one cannot know of moves that no database heard of.
        if (accident == 0)
            build(job.studyUID);
        if (accident < 3)
            buildAll();
        EXPECT_EQ(checked(), after);
    }
}

}  // namespace
}  // namespace Kdd
