#include "kddlib/archive/ObjectBatch.h"

#include "kddlib/archive/ArrivedStudies.h"
#include "kddlib/tagmodel/TagMap.h"

#include <unistd.h>

#include <algorithm>
#include <set>
#include <utility>

namespace Kdd
{

ObjectBatch::ObjectBatch(const ObjectPlaces& places, ArrivedStudies& studies, FlushThreads& flushes,
                         Kxg::Catalogue& catalogue, QByteArray studyUID, Admission admits)
    : mPlaces(places)
    , mStudies(studies)
    , mFlushes(flushes)
    , mCatalogue(catalogue)
    , mStudyUID(std::move(studyUID))
    , mAdmits(std::move(admits))
    , mCanLock(mLocks.open(places.objectLocks()))
{
}

void ObjectBatch::add(StagedFile& file, const QByteArray& digest, ArrivalFault fault, const QString& reason)
{
    mEntries.emplace_back();
    Entry& entry = mEntries.back();
    entry.file = &file;
    entry.digest = digest;
    entry.input.path = file.path();
    if (fault != ArrivalFault::None) {
        refuse(entry.object, fault, reason);
        return;
    }
    if (check(entry) && lock(entry) && mPlaces.settleWithKnown(entry.input, mCatalogue, entry.object) &&
        mPlaces.place(file, entry.input, entry.object)) {
        // The last one is waited for by this thread itself: one that comes alone then wakes no other.
        if (!mPlaced.empty())
            mPlaced.back()->flushed = mFlushes.begin([last = mPlaced.back()] { return flush(*last); });
        mPlaced.push_back(&entry);
    }
}

bool ObjectBatch::check(Entry& entry) const
{
    if (!ObjectPlaces::check(entry.input, mStudyUID, entry.object))
        return false;
    if (mAdmits && !mAdmits(*entry.input.map))
        refuse(entry.object, ArrivalFault::NotAllowed,
               QStringLiteral("Whoever sent it may not store into such studies"));
    return entry.object.isStored();
}

/// The right to decide about the object. Nobody waits for it while he has others, or two would wait for each other.
bool ObjectBatch::lock(Entry& entry)
{
    const QByteArray name = ObjectPlaces::lockName(entry.object);
    // One that is sent twice is decided about twice.
    const bool isThere = std::any_of(mPlaced.begin(), mPlaced.end(), [&](const Entry* placed) {
        return ObjectPlaces::lockName(placed->object) == name;
    });
    SystemResult locked = mCanLock;
    if (locked.good() && (isThere || mLocks.acquire(name, NamedLocks::IfHeld::Fail).bad())) {
        settle();
        locked = mLocks.acquire(name, NamedLocks::IfHeld::Wait);
    }
    if (locked.bad())
        refuse(entry.object, ArrivalFault::Failed, locked.text());
    return locked.good();
}

/// Whether the object's place leads to the file that was received, and not to one that lay there already.
bool ObjectBatch::isOwn(const Entry& entry)
{
    return isSameFile(entry.file->path(), entry.input.path);
}

/// Of a file that lay there already nobody knows whether it ever was waited for.
SystemResult ObjectBatch::flush(const Entry& entry)
{
    return isOwn(entry) ? entry.file->flush() : flushFile(entry.input.path);
}

std::vector<ArrivedObject> ObjectBatch::finish()
{
    settle();
    std::vector<ArrivedObject> objects;
    for (Entry& entry : mEntries)
        objects.push_back(std::move(entry.object));
    return objects;
}

/// Registers what has its place, and lets go of the rights.
void ObjectBatch::settle()
{
    registerPlaced(awaitFlushes());
    mPlaced.clear();
    if (mCanLock.good())
        mLocks.release();
}

/// A file that cannot be written is refused; failure: a folder that names one cannot be.
Result ObjectBatch::awaitFlushes()
{
    if (mPlaced.empty())
        return {};
    const SystemResult last = flush(*mPlaced.back());
    const auto isFlushed = [&](Entry* entry) {
        const SystemResult flushed = entry->flushed.valid() ? entry->flushed.get() : last;
        if (flushed.good())
            return true;
        if (isOwn(*entry))
            ::unlink(entry->input.path.constData());
        refuse(entry->object, faultOf(flushed), flushed.text());
        return false;
    };
    // All are asked, for what they wait with belongs to this object.
    mPlaced.erase(std::stable_partition(mPlaced.begin(), mPlaced.end(), isFlushed), mPlaced.end());
    return flushFolders();
}

/// After the files: as a rule the file system's journal went to the disk with these, and the names of the files with it.
/// At the same time on another thread it would take longer where the processors are busy, which that thread needs first.
Result ObjectBatch::flushFolders()
{
    std::set<QByteArray> folders;
    for (const Entry* entry : mPlaced)
        folders.insert(mPlaces.folderOf(entry->object));
    if (folders.size() == 1)
        return flushFolder(*folders.begin());
    std::vector<std::future<SystemResult>> waits;
    for (const QByteArray& folder : folders)
        waits.push_back(mFlushes.begin([folder] { return flushFolder(folder); }));
    Result result;
    for (std::future<SystemResult>& wait : waits) {
        const SystemResult flushed = wait.get();
        result = result.good() ? Result(flushed) : result;
    }
    return result;
}

void ObjectBatch::registerPlaced(Result result)
{
    std::vector<DicomInput> images;
    std::vector<QByteArray> paths;
    QHash<QByteArray, QByteArray> digests;
    for (Entry* entry : mPlaced) {
        if (!entry->digest.isEmpty() && isOwn(*entry))
            digests.insert(entry->input.path, entry->digest);
        paths.push_back(entry->input.path);
        images.push_back(std::move(entry->input));
    }
    QSet<QByteArray> corrected;
    if (result.good() && !images.empty())
        result = mStudies.add(std::move(images), digests, mCatalogue, corrected);
    for (std::size_t i = 0; i < mPlaced.size(); ++i) {
        ArrivedObject& object = mPlaced[i]->object;
        if (result.good()) {
            if (corrected.contains(paths[i]))
                ObjectPlaces::tellShown(paths[i], mCatalogue, object);
            continue;
        }
        // It may be registered all the same, when the answer was lost: the file stays, and so does its first name, from
        // which it is known what to do with it.
        mPlaced[i]->file->keep();
        refuse(object, ArrivalFault::Failed, result.text());
    }
}

}  // namespace Kdd
