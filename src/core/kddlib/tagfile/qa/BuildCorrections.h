#pragma once

#include "kddlib/tagfile/qa/ImageIdentity.h"
#include "kddlib/tagfile/qa/ImageOverlay.h"
#include "platform/base/Result.h"
#include "platform/database/Catalogue.h"

#include <QHash>
#include <QSet>

#include <vector>

namespace Kdd
{

/// The corrections of images that are or were in a study, as the image database knows them.
class BuildCorrections
{
public:
    /// Asks for those of a study, in place of earlier ones.
    Result read(int studyId);

    /// The study's own; empty when the database has no such study.
    const QByteArray& studyUID() const { return mStudyUID; }

    /// Whether no image that is or was in the study was ever corrected.
    bool isEmpty() const { return mCorrections.empty(); }

    /// Null when the image, as its file has it, was never corrected. Owned by this object.
    const Kxg::ImageCorrection* find(const ImageIdentity& identity) const;

    /// That of the image shown in this study under the key, whose present log is `log`: two files may be shown as the
    /// same image, one in front of the other. Null when there is none.
    const Kxg::ImageCorrection* findShown(const QByteArray& key, const AuditLog& log) const;

    /// Makes an image, as it was loaded from the file at the path, show what corrections make of it. False, with the
    /// fault logged, when what is known of them is damaged.
    bool applyTo(TagMap& image, const QByteArray& path) const;

    /// The same for an image of the study's earlier tag file, which may show them already.
    bool applyToFormer(TagMap& image) const;

    /// The corrections of images that had the SOP Instance UID at some time before now.
    std::vector<const Kxg::ImageCorrection*> ofFormerUID(const QByteArray& sopUID) const;

    /// Whether the volume file belongs to another study and is listed because images of it are here.
    bool isForeign(const QByteArray& volumePath) const { return mForeignVolumes.contains(volumePath); }

private:
    static bool apply(const Kxg::ImageCorrection& correction, TagMap& image);

    QByteArray mStudyUID;
    std::vector<Kxg::ImageCorrection> mCorrections;
    QHash<QByteArray, std::vector<std::size_t>> mByImage;       // by what files say
    QHash<QByteArray, std::vector<std::size_t>> mByFormerUID;   // also what they were between two corrections
    QHash<QByteArray, std::vector<std::size_t>> mByShownImage;  // of this study
    QSet<QByteArray> mForeignVolumes;
};

/// The audit log that a correction makes its image show.
AuditLog logOf(const Kxg::ImageCorrection& correction);

}  // namespace Kdd
