#pragma once

#include "kddlib/tagfile/TagFile.h"
#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

#include <QSet>

#include <vector>

namespace Kdd
{

/// What became of a study that was to be completed.
struct CompletedStudy
{
    Result result;           ///< on failure the study goes on waiting
    bool isRemoved = false;  ///< the catalogue has no image of it, so it has no tag file any more
    TagFile::Statistics statistics;
};

/// Brings the tag file of a claimed study into line with what the catalogue has of the study, and takes the study off
/// the queue. There is one way to that for arrivals, for the queue, after removals and corrections alike:
///
/// - a study without images loses its tag file;
/// - images that have just arrived are merged into a tag file that holds all the others and is the one that was written
///   last, unless something else changed that is not in it yet; it is then built once more when nothing has arrived for
///   a time (`ExResource::settleSeconds`), because the order of arrival shows in the order of the file. Images that
///   arrived at other processes are merged along, from their files;
/// - from such a tag file images that were removed are taken out, likewise;
/// - else the tag file is built from all files of the study.
///
/// A file that was removed by hand, restored from a backup or written by others is thus never taken for what the
/// catalogue believes it to be. Used by the thread of its catalogue.
class KDD_EXPORT StudyCompletion
{
public:
    /// The catalogue must outlive the object. Without `optimize` every attribute stays where it was found.
    explicit StudyCompletion(Kxg::Catalogue& catalogue, bool optimize = true)
        : mCatalogue(catalogue)
        , mOptimize(optimize)
    {
    }

    /// With images that were loaded already, each with its path in (0006,7100); of another study or not listed they are
    /// ignored. `requests` are those that registering them left; when nothing of these is left to be done, nothing is.
    /// What `arrivals` holds afterwards is not settled.
    CompletedStudy complete(Kxg::StudyClaim& claim, TagFile& arrivals, const QVector<qint64>& requests);

    /// The same in two steps, for whoever gathers arrivals while others register more of them: `read` takes in what the
    /// catalogue has and what is requested, and the arrivals known by then are completed with.
    Result read(Kxg::StudyClaim& claim);
    CompletedStudy completeRead(Kxg::StudyClaim& claim, TagFile& arrivals, const QVector<qint64>& requests);

    /// Whether something changed, of what was read, since the tag file was built.
    bool isChanged() const { return !mContents.changes.isEmpty(); }

    /// After a removal from a study of which nothing else had changed: takes out what is not listed any more, without
    /// opening a file where the tag file can be trusted.
    CompletedStudy reduce(Kxg::StudyClaim& claim);

    /// From all files of the study.
    CompletedStudy build(Kxg::StudyClaim& claim);

private:
    static CompletedStudy remove(Kxg::StudyClaim& claim);
    CompletedStudy build(Kxg::StudyClaim& claim, TagFile& loaded) const;
    bool canMerge(const QByteArray& studyUID, TagFile& arrivals, const QVector<qint64>& requests,
                  TagFile& present) const;
    bool bringListed(const QByteArray& studyUID, TagFile& arrivals, const TagFile& present) const;
    bool isTrusted(const QByteArray& studyUID) const;
    bool holdsListed(const TagFile& arrivals, const TagFile& present) const;
    std::vector<QByteArray> unlisted(const TagFile& present) const;
    static CompletedStudy merge(Kxg::StudyClaim& claim, TagFile& arrivals, TagFile& present);

    Kxg::Catalogue& mCatalogue;
    bool mOptimize;
    Kxg::StudyContents mContents;
    QSet<QByteArray> mListed;  // the keys of its images
};

}  // namespace Kdd
