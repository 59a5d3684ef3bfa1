#pragma once

#include "kddlib/archive/ObjectPlaces.h"
#include "platform/os/FlushThreads.h"
#include "platform/os/NamedLocks.h"

#include <deque>
#include <functional>

namespace Kdd
{

class ArrivedStudies;

/// Objects on their way into the archive: what costs a wait for the disk or the database is done for all of them at once.
/// Used by one thread.
class ObjectBatch
{
public:
    /// Whether an object may be stored, by its attributes; without it every one may.
    using Admission = std::function<bool(const TagMap& image)>;

    /// All but the last two outlive the object. With the UID not empty objects have to be of this study.
    ObjectBatch(const ObjectPlaces& places, ArrivedStudies& studies, FlushThreads& flushes,
                Kxg::Catalogue& catalogue, QByteArray studyUID, Admission admits);

    /// Reads and checks one that was received, or refused by then, gives it its place and begins to wait for the disk. The
    /// file outlives the object. `digest` is of what was received; empty: none was taken.
    void add(StagedFile& file, const QByteArray& digest, ArrivalFault fault, const QString& reason);

    /// Registers all, and tells of each in the order in which they came.
    std::vector<ArrivedObject> finish();

private:
    struct Entry
    {
        StagedFile* file = nullptr;
        DicomInput input;
        ArrivedObject object;
        QByteArray digest;
        std::future<SystemResult> flushed;
    };

    bool check(Entry& entry) const;
    bool lock(Entry& entry);
    static bool isOwn(const Entry& entry);
    static SystemResult flush(const Entry& entry);
    void settle();
    Result awaitFlushes();
    Result flushFolders();
    void registerPlaced(Result result);

    const ObjectPlaces& mPlaces;
    ArrivedStudies& mStudies;
    FlushThreads& mFlushes;
    Kxg::Catalogue& mCatalogue;
    const QByteArray mStudyUID;
    const Admission mAdmits;
    NamedLocks mLocks;
    SystemResult mCanLock;
    std::deque<Entry> mEntries;
    std::vector<Entry*> mPlaced;  // and not registered yet
};

}  // namespace Kdd
