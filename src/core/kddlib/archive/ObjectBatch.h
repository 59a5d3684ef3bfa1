#pragma once

#include "kddlib/archive/ObjectPlaces.h"
#include "platform/os/FlushThreads.h"
#include "platform/os/NamedLocks.h"

#include <deque>

namespace Kdd
{

class ArrivedStudies;

/// Objects on their way into the archive: what costs a wait for the disk or the database is done for all of them at once.
/// Used by one thread.
class ObjectBatch
{
public:
    /// All but the UID outlive the object. With that not empty objects have to be of this study.
    ObjectBatch(const ObjectPlaces& places, ArrivedStudies& studies, FlushThreads& flushes,
                Kxg::Catalogue& catalogue, QByteArray studyUID);

    /// Reads and checks one that was received, or refused by then, gives it its place and begins to wait for the disk. The
    /// file outlives the object.
    void add(StagedFile& file, ArrivalFault fault, const QString& reason);

    /// Registers all, and tells of each in the order in which they came.
    std::vector<ArrivedObject> finish();

private:
    struct Entry
    {
        StagedFile* file = nullptr;
        DicomInput input;
        ArrivedObject object;
        std::future<SystemResult> flushed;
    };

    bool lock(Entry& entry);
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
    NamedLocks mLocks;
    SystemResult mCanLock;
    std::deque<Entry> mEntries;
    std::vector<Entry*> mPlaced;  // and not registered yet
};

}  // namespace Kdd
