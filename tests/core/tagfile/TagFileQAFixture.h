#pragma once

#include "TagFileFixture.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagfile/qa/QAData.h"

namespace Kdd
{

/// Studies on disk and corrections of them.
class TagFileQATest : public TagFileTest
{
protected:
    using Substitutions = QVector<QASubstitution>;

    static QString text(const char* value) { return QString::fromUtf8(value); }

    static QAData edit(const Uids& images, const Substitutions& substitutions)
    {
        QAData job;
        job.studyUID = "1.2";
        job.substitutions = substitutions;
        job.timestamp = "20240131120000";
        job.login = "anna";
        job.images = images;
        return job;
    }

    /// To a series of another study.
    static QAData move(const Uids& images, const char* seriesUID, const char* studyUID = "1.9",
                       const char* oldStudyUID = "1.2")
    {
        QAData job = edit(images, {{DCM_SeriesInstanceUID, text(seriesUID)}});
        job.studyUID = studyUID;
        job.oldStudyUID = oldStudyUID;
        return job;
    }

    static bool apply(QAData job)
    {
        QString message;
        const bool isDone = TagFile::applyQA(job, message);
        EXPECT_EQ(isDone, message.isEmpty()) << message.toStdString();
        return isDone;
    }

    static std::string refusal(QAData job)
    {
        QString message;
        EXPECT_FALSE(TagFile::applyQA(job, message));
        return message.toStdString();
    }

    static std::unique_ptr<TagFile> stored(const char* studyUID = "1.2")
    {
        auto file = std::make_unique<TagFile>();
        file->readCacheFileForStudy(studyUID, false);
        return file;
    }

    static QString pathOf(const char* studyUID) { return TagFile::cacheFilePathForStudy(studyUID); }

    static QByteArray shown(const TagMap& image, const DcmTagKey& key)
    {
        QByteArray value;
        return image.findAndGetString(key, value) ? value : QByteArray("none");
    }

    static QByteArray shown(const char* studyUID, const char* sopUID, const DcmTagKey& key)
    {
        const auto file = stored(studyUID);
        const TagMap* image = file->findImage(sopUID);
        return image != nullptr ? shown(*image, key) : QByteArray("no image");
    }

    static AuditLog logOf(const TagMap& image)
    {
        AuditLog log;
        EXPECT_TRUE(log.read(image));
        return log;
    }

    /// What an image shows but for what a move changes: UIDs, volumes, previews, labels and the audit log.
    static std::string kept(const TagMap& image)
    {
        const std::unique_ptr<TagMap> copy(image.clone());
        for (const DcmTagKey& key :
             {DCM_StudyInstanceUID, DCM_SeriesInstanceUID, kVolumeIndex, kPreview, kFromDatabase, kAbstract,
              DcmTagKey(0x0071, 0x0010), DcmTagKey(0x0071, 0x1021), DcmTagKey(0x0071, 0x1022)})
            copy->deleteElement(key);
        return shownText(*copy);
    }

    /// "1 2 3, 5 4": the slices of the volumes of a series, which must be what its images say of themselves.
    static std::string volumesOf(const TagFile& file, const char* seriesUID)
    {
        std::string all;
        const TagMap* series = file.findSeries(seriesUID);
        for (const Volume* each : series != nullptr ? series->volumes() : QList<Volume*>()) {
            all += all.empty() ? "" : ",";
            for (const std::string& slice : each->sopUIDList())
                all += (all.empty() ? "" : " ") + slice;
            EXPECT_EQ(each->slices().size(), int(each->sopUIDList().size()));
            for (int i = 0; i < each->numImages(); ++i)
                EXPECT_EQ(each->image(i)->parent(), series);
        }
        return all;
    }
};

}  // namespace Kdd
