#pragma once

#include "kddlib/tagfile/qa/BuildCorrections.h"
#include "platform/base/Result.h"

#include <QMap>
#include <QSet>

#include <memory>
#include <vector>

namespace Kdd
{

class TagMap;

/// Corrections that only a study's tag file tells of, made while there was no database or by a release that kept
/// them nowhere else. A build hands them to the image database before it makes the tag file anew.
class AdoptedCorrections
{
public:
    /// What is there so far: the images of the study's tag file and the corrections known, which must outlive the object,
    /// and the DICOM files listed for the study.
    AdoptedCorrections(const QMap<QByteArray, TagMap*>& former, const BuildCorrections& known,
                       QSet<QByteArray> listed);
    ~AdoptedCorrections();

    /// Looks through the tag file and has what it finds recorded. On failure nothing is.
    Result record();

    /// Whether anything was recorded, so that the study's files and corrections are to be asked for again.
    bool isAny() const { return !mFound.empty(); }

    /// The paths of images of which it cannot be decided what the database should know: they stay as they are, also
    /// those that are not listed.
    const QSet<QByteArray>& undecided() const { return mUndecided; }

    /// To be called when the tag file is written: the study does not wait for what was recorded.
    Result finish();

private:
    void look(const TagMap& image);
    static bool identify(const TagMap& image, const AuditLog& log, ImageIdentity& identity);
    const Kxg::ImageCorrection* find(const ImageIdentity& identity,
                                     std::vector<Kxg::ImageCorrection>& elsewhere);
    bool isToBeKept(const TagMap& image, const AuditLog& log, const ImageIdentity& identity);
    bool isListed(const ImageIdentity& identity, const QByteArray& path);
    void leaveUndecided(const TagMap& image, const char* reason);
    Result openCatalogue();

    const QMap<QByteArray, TagMap*>& mFormer;
    const BuildCorrections& mKnown;
    const QSet<QByteArray> mListed;
    std::unique_ptr<Kxg::Catalogue> mCatalogue;
    std::vector<Kxg::ImageCorrection> mFound;
    QSet<QByteArray> mUndecided;
    Result mResult;
    qint64 mRequest = 0;  // of the study itself
};

}  // namespace Kdd
