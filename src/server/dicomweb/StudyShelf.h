#pragma once

#include "server/dicomweb/Arrivals.h"
#include "server/dicomweb/Presence.h"
#include "server/http/CacheCount.h"

#include <QByteArray>

#include <kddlib/TagFile.h>
#include <kddlib/TagFileStamp.h>

#include <chrono>
#include <memory>
#include <mutex>

namespace Kdd::DicomWeb
{

/// A study's tag file as it was at one moment: never changed once it is here. Kept by whoever answers from it, also when
/// the file has been replaced meanwhile.
class ServedStudy
{
public:
    ServedStudy(std::unique_ptr<TagFile> file, const QByteArray& version)
        : mFile(std::move(file))
        , mVersion(version)
    {
    }

    /// Of the file's content, in letters that may stand in an ETag: two tag files of the same version answer alike.
    const QByteArray& version() const { return mVersion; }

    /// What `look(file)` gives. A tree is looked at by one thread at a time, so whoever sends to a slow client looks
    /// again for each block and holds nothing between. Nothing of the tree may be changed or kept.
    template <typename Look>
    auto look(const Look& look) const
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        return look(static_cast<const TagFile&>(*mFile));
    }

private:
    mutable std::mutex mMutex;
    std::unique_ptr<TagFile> mFile;
    QByteArray mVersion;
};

/// Knows which tag files were written, and by what each was recognised then. Called on several threads at the same time.
class TagFileWitness
{
public:
    virtual ~TagFileWitness() = default;

    /// Whether the bytes that were read are others than those that were written, though the size and time of the file are
    /// as they were then: told in the log.
    virtual bool isDamaged(const QByteArray& studyUID, const Kxg::TagFileStamp& read) = 0;

    /// Why there is no tag file: `Absent`, `Unbuilt`, or `Missing`, which is told in the log.
    virtual Presence whyAbsent(const QByteArray& studyUID) = 0;
};

/// The tag files that were asked for last, read again as soon as they change. May be used on any thread.
class StudyShelf
{
public:
    /// `capacity` bounds what is kept by the tag files' uncompressed size [bytes]; the study looked up last always is.
    /// Two writes within one tick of a file system's clock leave the same times, and some tick once in two seconds: a file
    /// that was younger than `settledAge` when it was read is read again by whoever asks next.
    explicit StudyShelf(qint64 capacity,
                        std::chrono::nanoseconds settledAge = std::chrono::milliseconds(2500));
    ~StudyShelf();

    /// Who knows of images that tag files do not show yet; null: nobody. Set before it is used, and outlives it.
    void setArrivals(Arrivals* arrivals) { mArrivals = arrivals; }
    Arrivals* arrivals() const { return mArrivals; }

    /// Who is asked of each tag file that is read or is not there; null: nobody. Likewise.
    void setWitness(TagFileWitness* witness);

    /// The study as its file is now.
    Presence find(const QByteArray& studyUID, std::shared_ptr<const ServedStudy>& study);

    /// The version, without reading the tree where the file was seen before; `study` is null then, unless it is there
    /// anyway.
    Presence version(const QByteArray& studyUID, QByteArray& version,
                     std::shared_ptr<const ServedStudy>& study);

    /// How often nothing had to be read of a tag file that is there.
    const Http::CacheCount& count() const;

private:
    struct Private;
    Arrivals* mArrivals = nullptr;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd::DicomWeb
