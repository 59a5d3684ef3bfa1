#pragma once

#include "kddlib/archive/DicomInput.h"
#include "kddlib/archive/WorkObserver.h"
#include "platform/database/Catalogue.h"

#include <QList>

#include <functional>
#include <vector>

namespace Kdd
{

class PlainFiles;
class PlainObjects;

/// Looks through files and folders for what the catalogue does not know yet, or knows otherwise: files whose path, size
/// and time of change are known are not opened. The archive's own files are passed over. Used by the thread of its
/// catalogue.
///
/// A path may be the URL of an object, "http://", "https://" or "gs://", which is read by its header. One whose URL, size
/// and version are known is not read; a server that tells no version has it read each time. Messages show addresses
/// without the secrets in them.
class KDD_EXPORT FileScan
{
public:
    /// Both must outlive the object.
    FileScan(Kxg::Catalogue& catalogue, WorkObserver& observer)
        : mCatalogue(catalogue)
        , mObserver(observer)
    {
    }

    /// What the archive keeps itself, absolute: files, and folders, whose names end in "/".
    void setOwnPlaces(const QList<QByteArray>& places) { mOwnPlaces = places; }

    /// Of damaged files what is sound is taken, with a warning that tells what is left out; else they are refused.
    void setDamage(Damage damage) { mDamage = damage; }

    /// Files that are no images are named in the log.
    void setNamesSkipped(bool names) { mNamesSkipped = names; }

    /// Files read at once; 0, as at first: as many as there are cores to spare. What comes of a scan does not depend on it.
    void setReaders(int readers) { mReaders = readers; }

    /// Reads the files at and below the paths, several at a time, and hands on what each one is in their order until
    /// `take` fails or the observer cancels. Files that cannot be read are logged and refused instead. Failure: that of
    /// the database or of `take`.
    Result run(const QList<QByteArray>& paths, const std::function<Result(DicomInput)>& take);

    int unchanged() const { return mUnchanged; }
    int skipped() const { return mSkipped; }
    const std::vector<RefusedFile>& refused() const { return mRefused; }

private:
    Result findChanged(const QList<QByteArray>& paths, QList<QByteArray>& changed);
    bool isOwn(const QByteArray& file) const;
    Result readAll(const QList<QByteArray>& files, const std::function<Result(DicomInput)>& take);
    Result takeNext(const QByteArray& file, PlainFiles& ahead, const std::function<Result(DicomInput)>& take);
    Result takeNext(const QByteArray& url, PlainObjects& ahead,
                    const std::function<Result(DicomInput)>& take);
    Result handOn(DicomInput input, const std::function<Result(DicomInput)>& take);

    Kxg::Catalogue& mCatalogue;
    WorkObserver& mObserver;
    QList<QByteArray> mOwnPlaces;
    bool mNamesSkipped = false;
    Damage mDamage = Damage::Refused;
    int mReaders = 0;
    int mUnchanged = 0;
    int mSkipped = 0;
    std::vector<RefusedFile> mRefused;
};

}  // namespace Kdd
