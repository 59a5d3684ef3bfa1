#include "kddlib/tagfile/qa/BuildCorrections.h"

#include "kddlib/tagfile/StudyTree.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <string>

namespace Kdd
{

namespace
{

/// All SOP Instance UIDs that an image had before the one that it has now.
QSet<QByteArray> formerUIDs(const Kxg::ImageCorrection& correction)
{
    // Also those between two corrections: a volume file names its images as they were when it was made.
    QSet<QByteArray> uids = {correction.image};
    QVector<AuditEntry> entries;
    logOf(correction).decode(entries);
    for (const AuditEntry& entry : qAsConst(entries)) {
        for (const AuditChange& change : entry.changes) {
            if (change.key == DCM_SOPInstanceUID)
                uids.insert(change.oldText.toUtf8());
        }
    }
    return uids;
}

}  // namespace

AuditLog logOf(const Kxg::ImageCorrection& correction)
{
    ImageOverlay overlay;
    return overlay.decode(correction.changes) ? overlay.log() : AuditLog();
}

Result BuildCorrections::read(int studyId)
{
    std::vector<std::string> foreign;
    // What is left of an earlier study would be taken for corrections of this one.
    *this = {};
    const Result result = Kxg::GetCorrections(studyId, mStudyUID, mCorrections, foreign);
    for (const std::string& path : foreign)
        mForeignVolumes.insert(QByteArray::fromStdString(path));
    for (std::size_t i = 0; i < mCorrections.size(); ++i) {
        const Kxg::ImageCorrection& each = mCorrections[i];
        mByImage[each.image].push_back(i);
        // Images of this study that are shown in another one are asked
        // for as well, but only these are shown here.
        if (each.shownStudyUID == mStudyUID)
            mByShownImage[each.shownImage].push_back(i);
        for (const QByteArray& uid : formerUIDs(each))
            mByFormerUID[uid].push_back(i);
    }
    return result;
}

const Kxg::ImageCorrection* BuildCorrections::find(const ImageIdentity& identity) const
{
    for (const std::size_t i : mByImage.value(identity.image)) {
        if (mCorrections[i].studyInstanceUID == identity.studyUID)
            return &mCorrections[i];
    }
    return nullptr;
}

const Kxg::ImageCorrection* BuildCorrections::findShown(const QByteArray& key, const AuditLog& log) const
{
    const Kxg::ImageCorrection* found = nullptr;
    for (const std::size_t i : mByShownImage.value(key)) {
        if (found == nullptr || logOf(mCorrections[i]).text() == log.text())
            found = &mCorrections[i];
    }
    return found;
}

bool BuildCorrections::apply(const Kxg::ImageCorrection& correction, TagMap& image)
{
    ImageOverlay overlay;
    if (!overlay.decode(correction.changes)) {
        LogFile::errorf("What the image database has of the corrections of image %s of study %s is damaged",
                        correction.image.constData(), correction.studyInstanceUID.constData());
        return false;
    }
    overlay.applyTo(image);
    return true;
}

bool BuildCorrections::applyTo(TagMap& image, const QByteArray& path) const
{
    // By what the file says, which is how the database knows the image.
    const Kxg::ImageCorrection* known = find(identityOf(image, path));
    return known == nullptr || apply(*known, image);
}

bool BuildCorrections::applyToFormer(TagMap& image) const
{
    AuditLog log;
    const QByteArray key = StudyTree::imageKey(image);
    // By its log first: what stands under this name may be the image that a correction put in front of another.
    const Kxg::ImageCorrection* known = log.read(image) ? findShown(key, log) : nullptr;
    if (known == nullptr)
        // One that the tag file does not show corrected yet is known by what its file says.
        known = find({mStudyUID, key});
    return known == nullptr || apply(*known, image);
}

std::vector<const Kxg::ImageCorrection*> BuildCorrections::ofFormerUID(const QByteArray& sopUID) const
{
    std::vector<const Kxg::ImageCorrection*> found;
    for (const std::size_t i : mByFormerUID.value(sopUID))
        found.push_back(&mCorrections[i]);
    return found;
}

}  // namespace Kdd
