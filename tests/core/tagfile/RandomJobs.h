#pragma once

#include "kddlib/tagfile/qa/QAData.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <map>
#include <random>
#include <string>

namespace Kdd
{

/// Corrections of three studies at random, and where every image stands after them.
class RandomJobs
{
public:
    struct Image
    {
        QByteArray study;
        QByteArray series;
        int volumes = 0;   // that it is in
        std::string kept;  // what it is known to show; empty after a correction
    };

    using Images = std::map<QByteArray, Image>;

    explicit RandomJobs(unsigned seed)
        : mRandom(seed)
    {
    }

    int any(int count) { return static_cast<int>(mRandom() % static_cast<unsigned>(count)); }
    QByteArray anyStudy() { return "1." + QByteArray::number(1 + any(3)); }

    /// By SOP Instance UID. Images whose UID begins with "stays" are never corrected.
    Images& images() { return mImages; }

    QList<QByteArray> imagesIn(const QByteArray& study) const
    {
        QList<QByteArray> uids;
        for (const auto& [uid, image] : mImages) {
            if (image.study == study)
                uids.append(uid);
        }
        return uids;
    }

    QAData next()
    {
        const char* const texts[] = {"Doe^J", "Roe^R", "", "M\xc3\xbcller", "line\r\nline"};
        QAData job;
        job.studyUID = anyStudy();
        if (any(2) == 0)
            job.oldStudyUID = anyStudy();
        job.timestamp = "2024013112" + QByteArray::number(10000 + mNext++ % 60).mid(1);
        job.login = any(2) == 0 ? "anna" : "";
        for (const QByteArray& uid : imagesIn(sourceOf(job))) {
            if (any(3) == 0 && !uid.startsWith("stays"))
                job.images.append(uid);
        }
        maybe(job, 2, DCM_PatientName, texts[any(4)]);
        maybe(job, 3, DCM_Rows, QByteArray::number(any(3) + 16));
        maybe(job, 4, DCM_ImageComments, texts[any(5)]);
        maybe(job, 5, DCM_InstanceNumber, QByteArray::number(any(50)));
        maybe(job, 2, DCM_SeriesInstanceUID, job.studyUID + '.' + QByteArray::number(any(3)));
        if (job.images.size() == 1)
            maybe(job, 3, DCM_SOPInstanceUID, QByteArray::number(1000 + mNext));
        return job;
    }

    /// Puts the images of the job where it wants them.
    void done(const QAData& job)
    {
        for (const QByteArray& uid : job.images) {
            Image image = mImages.at(uid);
            QByteArray now = uid;
            image.kept.clear();
            for (const QASubstitution& each : job.substitutions) {
                if (each.key == DCM_SOPInstanceUID)
                    now = each.value.toLatin1();
                if (each.key == DCM_SeriesInstanceUID && image.series != each.value.toLatin1()) {
                    image.series = each.value.toLatin1();
                    image.study = job.studyUID;
                }
            }
            mImages.erase(uid);
            mImages[now] = image;
        }
    }

private:
    static QByteArray sourceOf(const QAData& job)
    {
        return job.oldStudyUID.isEmpty() ? job.studyUID : job.oldStudyUID;
    }

    void maybe(QAData& job, int oneIn, const DcmTagKey& key, const QByteArray& value)
    {
        if (any(oneIn) == 0)
            job.substitutions.append({key, QString::fromUtf8(value)});
    }

    std::mt19937 mRandom;
    Images mImages;
    int mNext = 0;
};

}  // namespace Kdd
