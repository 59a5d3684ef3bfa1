#include "server/dicomweb/StudyShelf.h"

#include "server/dicomweb/ResourcePath.h"

#include <QHash>

#include <fcntl.h>
#include <kddlib/PathName.h>
#include <kddlib/TagFileStamp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <list>

namespace Kdd::DicomWeb
{
namespace
{

using Clock = std::chrono::steady_clock;

// Of studies whose tree had to go the version is kept on: some 300 bytes each, and whoever has an answer of that version
// needs no tree.
constexpr int kMaxEntries = 10000;

qint64 nanoseconds(const timespec& time)
{
    return qint64(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

/// What a file system tells of a file without its content.
struct FileState
{
    int error = ENOENT;  // errno of the attempt to look
    quint64 device = 0;
    quint64 inode = 0;
    qint64 size = 0;      // [bytes]
    qint64 modified = 0;  // [ns]
    qint64 changed = 0;   // [ns]; no program can set this one back
    qint64 age = 0;       // [ns] since the later of the two; negative when the clock was set back

    bool isAbsent() const { return error == ENOENT || error == ENOTDIR; }
    bool equals(const FileState& other) const
    {
        return error == 0 && other.error == 0 && device == other.device && inode == other.inode &&
               size == other.size && modified == other.modified && changed == other.changed;
    }
};

/// Opens the file to look at it: a network file system answers a mere question from memory, but asks its server at every
/// opening.
FileState stateOf(const QByteArray& path)
{
    FileState state;
    const int file = ::open(path.constData(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    struct stat found = {};
    timespec now = {};
    state.error =
        file >= 0 && ::fstat(file, &found) == 0 && ::clock_gettime(CLOCK_REALTIME, &now) == 0 ? 0 : errno;
    if (file >= 0)
        ::close(file);
    if (state.error != 0)
        return state;
    state.device = found.st_dev;
    state.inode = found.st_ino;
    state.size = found.st_size;
    state.modified = nanoseconds(found.st_mtim);
    state.changed = nanoseconds(found.st_ctim);
    state.age = nanoseconds(now) - qMax(state.modified, state.changed);
    return state;
}

/// Whether a writer stands in the middle of the file, or died there: it is for the reader to wait or to finish it.
bool hasJournal(const QByteArray& path)
{
    struct stat found = {};
    return ::lstat((path + ".journal").constData(), &found) == 0;
}

struct Entry
{
    std::mutex reading;  // one reads, others who want this study wait for it
    // Guarded by `reading`:
    Presence presence = Presence::Absent;
    QByteArray version;
    FileState state;              // as it was when it was read
    Clock::time_point readSince;  // when that reading began

    // Guarded by the shelf:
    std::shared_ptr<const ServedStudy> study;
    qint64 weight = 0;
    std::list<QByteArray>::iterator place;
};

}  // namespace

struct StudyShelf::Private
{
    std::shared_ptr<Entry> obtain(const QByteArray& uid);
    std::shared_ptr<const ServedStudy> studyOf(const Entry& entry);
    void put(Entry& entry, const std::shared_ptr<const ServedStudy>& study, qint64 weight);
    void forget(const QByteArray& uid);
    void trim();

    bool isCurrent(const Entry& entry, const QByteArray& path, Clock::time_point asked) const;
    void read(Entry& entry, const QByteArray& uid, const QString& path,
              std::shared_ptr<const ServedStudy>& study);
    Presence absence(const QByteArray& uid, const QByteArray& path) const;
    Presence look(const QByteArray& uid, bool needsTree, QByteArray& version,
                  std::shared_ptr<const ServedStudy>& study);

    Http::CacheCount count;
    TagFileWitness* witness = nullptr;

    std::mutex mutex;
    QHash<QByteArray, std::shared_ptr<Entry>> entries;
    std::list<QByteArray> order;  // the study looked up last comes first
    qint64 capacity = 0;
    qint64 settledAge = 0;  // [ns]
    qint64 used = 0;
};

std::shared_ptr<Entry> StudyShelf::Private::obtain(const QByteArray& uid)
{
    const std::lock_guard<std::mutex> lock(mutex);
    std::shared_ptr<Entry>& entry = entries[uid];
    if (entry == nullptr) {
        entry = std::make_shared<Entry>();
        order.push_front(uid);
    } else {
        order.splice(order.begin(), order, entry->place);
    }
    entry->place = order.begin();
    return entry;
}

std::shared_ptr<const ServedStudy> StudyShelf::Private::studyOf(const Entry& entry)
{
    const std::lock_guard<std::mutex> lock(mutex);
    return entry.study;
}

/// In place of what is there; null lets go of it.
void StudyShelf::Private::put(Entry& entry, const std::shared_ptr<const ServedStudy>& study, qint64 weight)
{
    std::shared_ptr<const ServedStudy> former = study;  // deleted outside of the lock
    const std::lock_guard<std::mutex> lock(mutex);
    used += weight - entry.weight;
    entry.study.swap(former);
    entry.weight = weight;
}

/// Of a study that is not there nothing is kept: anybody may ask for any number of those.
void StudyShelf::Private::forget(const QByteArray& uid)
{
    const std::lock_guard<std::mutex> lock(mutex);
    const auto found = entries.find(uid);
    // Whoever waits for it holds it too, and forgets it in turn.
    if (found == entries.end() || found.value().use_count() > 2)
        return;
    order.erase(found.value()->place);
    entries.erase(found);
}

void StudyShelf::Private::trim()
{
    std::vector<std::shared_ptr<const ServedStudy>> gone;  // deleted outside of the lock
    const std::lock_guard<std::mutex> lock(mutex);
    const qint64 kept = order.empty() ? 0 : entries[order.front()]->weight;
    for (auto at = order.end(); used > capacity && used > kept && at != order.begin();) {
        --at;
        Entry& entry = *entries[*at];
        if (at == order.begin())
            break;
        gone.push_back(std::move(entry.study));
        used -= entry.weight;
        entry.study.reset();
        entry.weight = 0;
    }
    for (auto at = order.end(); entries.size() > kMaxEntries && at != order.begin();) {
        --at;
        const auto found = entries.find(*at);
        if (found.value().use_count() > 1)
            continue;
        used -= found.value()->weight;
        gone.push_back(std::move(found.value()->study));
        entries.erase(found);
        at = order.erase(at);
    }
}

/// Whether what the entry knows is what the file says now, or said after it was asked for.
bool StudyShelf::Private::isCurrent(const Entry& entry, const QByteArray& path, Clock::time_point asked) const
{
    // Others began to read after this one asked: whatever was written before that they have seen.
    if (entry.readSince > asked)
        return true;
    // The file before its journal: a writer that comes in between was not yet there when the file was looked at.
    return entry.state.age > settledAge && entry.state.equals(stateOf(path)) && !hasJournal(path);
}

/// `study` is what the entry holds, and afterwards what was read.
void StudyShelf::Private::read(Entry& entry, const QByteArray& uid, const QString& path,
                               std::shared_ptr<const ServedStudy>& study)
{
    const QByteArray name = pathBytes(path);
    entry.readSince = Clock::now();
    entry.state = {};
    const FileState before = stateOf(name);
    auto file = std::make_unique<TagFile>();
    if (before.isAbsent()) {
        entry.presence = absence(uid, name);
    } else if (file->readStampedWhenFree(path, uid.constData())) {
        Kxg::TagFileStamp stamp = file->stamp();
        stamp.fileSize = before.size;
        stamp.modified = before.modified;
        // Looked at again by whoever asks next: it may have been written in the same tick as the one before.
        if (witness != nullptr && before.equals(stateOf(name)) && witness->isDamaged(uid, stamp)) {
            entry.presence = Presence::Damaged;
            entry.version.clear();
            put(entry, nullptr, 0);
            return;
        }
        const QByteArray version = file->stamp().digest.toHex();
        entry.state = before.equals(stateOf(name)) ? before : FileState();
        entry.presence = Presence::Found;
        // The tree that is there is as good, and others may hold it.
        if (version == entry.version && study != nullptr)
            return;
        entry.version = version;
        const qint64 weight = file->statistics().uncompressedSize;
        study = std::make_shared<const ServedStudy>(std::move(file), version);
        put(entry, study, weight);
        return;
    } else if (stateOf(name).isAbsent()) {
        entry.presence = absence(uid, name);
    } else if (file->wasLockedOut()) {
        entry.presence = Presence::Held;
        return;
    } else {
        entry.state = before.equals(stateOf(name)) ? before : FileState();
        entry.presence = Presence::Damaged;
    }
    entry.version.clear();
    put(entry, nullptr, 0);
}

Presence StudyShelf::Private::absence(const QByteArray& uid, const QByteArray& path) const
{
    const Presence why = witness != nullptr ? witness->whyAbsent(uid) : Presence::Absent;
    // A first one may have been written meanwhile, and be known before it was looked for.
    return stateOf(path).isAbsent() ? why : Presence::Absent;
}

Presence StudyShelf::Private::look(const QByteArray& uid, bool needsTree, QByteArray& version,
                                   std::shared_ptr<const ServedStudy>& study)
{
    version.clear();
    study.reset();
    if (!isUID(uid))
        return Presence::Absent;
    const Clock::time_point asked = Clock::now();
    const QString path = TagFile::cacheFilePathForStudy(uid.constData());
    const std::shared_ptr<Entry> entry = obtain(uid);
    Presence presence = Presence::Absent;
    {
        const std::lock_guard<std::mutex> lock(entry->reading);
        // Held from here on: the entry may lose it at any time, when others need room.
        study = studyOf(*entry);
        const bool isUsable = entry->presence != Presence::Found || !needsTree || study != nullptr;
        const bool isReady = isUsable && isCurrent(*entry, pathBytes(path), asked);
        if (!isReady)
            read(*entry, uid, path, study);
        presence = entry->presence;
        if (presence == Presence::Found) {
            ++(isReady ? count.hits : count.misses);
            version = entry->version;
        } else {
            study.reset();
        }
    }
    if (presence == Presence::Absent || presence == Presence::Unbuilt || presence == Presence::Missing)
        forget(uid);
    trim();
    return presence;
}

StudyShelf::StudyShelf(qint64 capacity, std::chrono::nanoseconds settledAge)
    : d(std::make_unique<Private>())
{
    d->capacity = capacity;
    d->settledAge = settledAge.count();
}

StudyShelf::~StudyShelf() = default;

void StudyShelf::setWitness(TagFileWitness* witness)
{
    d->witness = witness;
}

Presence StudyShelf::find(const QByteArray& studyUID, std::shared_ptr<const ServedStudy>& study)
{
    QByteArray version;
    return d->look(studyUID, true, version, study);
}

Presence StudyShelf::version(const QByteArray& studyUID, QByteArray& version,
                             std::shared_ptr<const ServedStudy>& study)
{
    return d->look(studyUID, false, version, study);
}

const Http::CacheCount& StudyShelf::count() const
{
    return d->count;
}

}  // namespace Kdd::DicomWeb
