#include "kddlib/archive/ObjectStore.h"

#include "kddlib/archive/ArrivedStudies.h"
#include "kddlib/archive/DicomInput.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/ObjectPlaces.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/PathName.h"
#include "platform/os/StagedFile.h"

#include <QDir>
#include <QSet>
#include <QUuid>

#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <map>

namespace Kdd
{

namespace
{

/// How much may come before the disk is looked at again [bytes].
constexpr qint64 kRoomStep = 16 * 1024 * 1024;

}  // namespace

// ---- an object that is being received

struct ObjectArrival::Private
{
    StagedFile file;
    QByteArray folder;
    qint64 most = 0;
    qint64 freeBytes = 0;
    qint64 roomSeen = 0;  // up to which size the disk was found to have room
    ArrivalFault fault = ArrivalFault::None;
    QString reason;

    bool refuse(ArrivalFault what, const QString& why)
    {
        fault = what;
        reason = why;
        return false;
    }
    bool hasRoom() const
    {
        const qint64 present = freeSpace(folder);
        return present < 0 || present > freeBytes;
    }
};

ObjectArrival::ObjectArrival(std::unique_ptr<Private> made)
    : d(std::move(made))
{
}

ObjectArrival::~ObjectArrival() = default;

bool ObjectArrival::take(const char* bytes, qint64 count)
{
    if (d->fault != ArrivalFault::None)
        return false;
    if (d->file.size() + count > d->most)
        return d->refuse(ArrivalFault::TooLarge, QStringLiteral("It is larger than objects may be here"));
    if (d->file.size() >= d->roomSeen) {
        if (!d->hasRoom())
            return d->refuse(ArrivalFault::OutOfSpace, QStringLiteral("The disk is nearly full"));
        d->roomSeen = d->file.size() + kRoomStep;
    }
    const SystemResult written = d->file.append(bytes, count);
    return written.good() || d->refuse(faultOf(written), written.text());
}

void ObjectArrival::end()
{
    d->file.startFlush();
}

// ---- the store

struct ObjectStore::Private
{
    Private(const ObjectRules& wanted, ArrivedStudies& arrived)
        : studies(arrived)
        , rules(wanted)
        , places(wanted)
    {
    }

    Result makeStaging();
    Result recover(const QByteArray& folder, Kxg::Catalogue& catalogue);
    Result recoverFile(const QByteArray& path, Kxg::Catalogue& catalogue);

    ArrivedStudies& studies;
    const ObjectRules rules;
    const ObjectPlaces places;
    QByteArray staging;  // of this process alone
    LockFile life;       // by which others know that it still lives
    std::atomic<quint64> count{0};
};

Result ObjectStore::Private::makeStaging()
{
    LockFile turn;  // so that nobody takes a folder for one that is left that was made a moment ago
    SystemResult made = makeLastingFolder(places.locks());
    if (made.good())
        made = turn.acquire(places.locks() + "/servers", LockFile::IfHeld::Wait);
    staging = places.staging() + '/' + QUuid::createUuid().toByteArray(QUuid::Id128);
    if (made.good())
        made = makeLastingFolder(staging);
    if (made.good())
        made = life.acquire(staging + "/life", LockFile::IfHeld::Fail);
    return Result(made).within(QStringLiteral("Cannot store into %1").arg(pathText(rules.folder)));
}

ObjectStore::ObjectStore(std::unique_ptr<Private> made)
    : d(std::move(made))
{
}

/// What has to be looked after stays, for whoever recovers it.
ObjectStore::~ObjectStore()
{
    const QDir staging(pathText(d->staging));
    if (staging.entryList(QDir::Files) == QStringList{QStringLiteral("life")})
        QDir(staging).removeRecursively();
}

std::unique_ptr<ObjectStore> ObjectStore::open(const ObjectRules& rules, ArrivedStudies& studies,
                                               Result& result)
{
    ObjectRules known = rules;
    known.folder = absolutePath(rules.folder);
    auto made = std::make_unique<Private>(known, studies);
    result = made->makeStaging();
    if (result.bad())
        return nullptr;
    return std::unique_ptr<ObjectStore>(new ObjectStore(std::move(made)));
}

const ObjectRules& ObjectStore::rules() const
{
    return d->rules;
}

bool ObjectStore::hasRoom() const
{
    const qint64 present = freeSpace(d->rules.folder);
    return present < 0 || present > d->rules.freeBytes;
}

std::unique_ptr<ObjectArrival> ObjectStore::begin()
{
    auto made = std::make_unique<ObjectArrival::Private>();
    made->folder = d->rules.folder;
    made->most = d->rules.objectBytes;
    made->freeBytes = d->rules.freeBytes;
    const SystemResult created = made->file.create(d->staging + '/' + QByteArray::number(++d->count));
    if (created.bad())
        made->refuse(faultOf(created), created.text());
    return std::unique_ptr<ObjectArrival>(new ObjectArrival(std::move(made)));
}

// ---- what has come whole

/// Objects on their way into the archive: what costs a wait for the disk or the database is done for all of them at once.
class ObjectStore::Batch
{
public:
    Batch(Private& store, Kxg::Catalogue& catalogue)
        : mStore(store)
        , mCatalogue(catalogue)
    {
    }

    /// Reads, checks and flushes each.
    void prepare(std::vector<std::unique_ptr<ObjectArrival>>& arrivals, const QByteArray& studyUID,
                 const Admission& admits);
    void store();
    std::vector<ArrivedObject> take();

private:
    struct Entry
    {
        StagedFile* file = nullptr;
        DicomInput input;
        ArrivedObject object;
    };

    bool lock(Entry& entry);
    void finish();

    Private& mStore;
    Kxg::Catalogue& mCatalogue;
    std::vector<Entry> mEntries;
    std::vector<Entry*> mPlaced;  // and not registered yet
    std::map<QByteArray, LockFile> mLocks;
};

void ObjectStore::Batch::prepare(std::vector<std::unique_ptr<ObjectArrival>>& arrivals,
                                 const QByteArray& studyUID, const Admission& admits)
{
    for (const auto& arrival : arrivals) {
        ObjectArrival::Private& received = *arrival->d;
        Entry entry;
        entry.file = &received.file;
        entry.input.path = received.file.path();
        if (received.fault != ArrivalFault::None)
            refuse(entry.object, received.fault, received.reason);
        else if (ObjectPlaces::check(entry.input, studyUID, entry.object) && admits &&
                 !admits(*entry.input.map))
            refuse(entry.object, ArrivalFault::NotAllowed,
                   QStringLiteral("Whoever sent it may not store into such studies"));
        mEntries.push_back(std::move(entry));
    }
    // Apart from the reading: while the first one is waited for the others are written too.
    for (Entry& entry : mEntries) {
        const SystemResult flushed = entry.object.isStored() ? entry.file->flush() : SystemResult();
        if (flushed.bad())
            refuse(entry.object, faultOf(flushed), flushed.text());
    }
}

/// The right to decide about the object. Nobody waits for it while he has others, or two would wait for each other.
bool ObjectStore::Batch::lock(Entry& entry)
{
    const QByteArray path = mStore.places.lockOf(entry.object);
    // One that is sent twice is decided about twice.
    const bool isThere = std::any_of(mPlaced.begin(), mPlaced.end(), [&](const Entry* placed) {
        return placed->object.studyUID == entry.object.studyUID && placed->object.image == entry.object.image;
    });
    if (mLocks.count(path) > 0 && !isThere)
        return true;
    if (isThere || mLocks[path].acquire(path, LockFile::IfHeld::Fail).bad()) {
        mLocks.erase(path);
        finish();
        const SystemResult waited = mLocks[path].acquire(path, LockFile::IfHeld::Wait);
        if (waited.bad())
            refuse(entry.object, ArrivalFault::Failed, waited.text());
    }
    return entry.object.isStored();
}

void ObjectStore::Batch::store()
{
    for (Entry& entry : mEntries) {
        if (entry.object.isStored() && lock(entry) &&
            mStore.places.settleWithKnown(entry.input, mCatalogue, entry.object) &&
            mStore.places.place(*entry.file, entry.input, entry.object))
            mPlaced.push_back(&entry);
    }
    finish();
}

/// Registers what has its place, and lets go of the rights.
void ObjectStore::Batch::finish()
{
    Result result;
    QSet<QByteArray> folders;
    for (const Entry* entry : mPlaced)
        folders.insert(mStore.places.folderOf(entry->object));
    for (const QByteArray& folder : qAsConst(folders))
        result = result.good() ? Result(flushFolder(folder)) : result;
    std::vector<DicomInput> images;
    std::vector<QByteArray> paths;
    for (Entry* entry : mPlaced) {
        paths.push_back(entry->input.path);
        images.push_back(std::move(entry->input));
    }
    if (result.good() && !images.empty())
        result = mStore.studies.add(std::move(images), mCatalogue);
    for (std::size_t i = 0; i < mPlaced.size(); ++i) {
        ArrivedObject& object = mPlaced[i]->object;
        if (result.good()) {
            ObjectPlaces::tellShown(paths[i], mCatalogue, object);
            continue;
        }
        // It may be registered all the same, when the answer was lost: the file stays, and so does its first name, from
        // which it is known what to do with it.
        mPlaced[i]->file->keep();
        refuse(object, ArrivalFault::Failed, result.text());
    }
    mPlaced.clear();
    mLocks.clear();
}

std::vector<ArrivedObject> ObjectStore::Batch::take()
{
    std::vector<ArrivedObject> objects;
    for (Entry& entry : mEntries)
        objects.push_back(std::move(entry.object));
    return objects;
}

std::vector<ArrivedObject> ObjectStore::commit(std::vector<std::unique_ptr<ObjectArrival>>& arrivals,
                                               Kxg::Catalogue& catalogue, const QByteArray& studyUID,
                                               const Admission& admits)
{
    Batch batch(*d, catalogue);
    batch.prepare(arrivals, studyUID, admits);
    batch.store();
    return batch.take();
}

// ---- what was left

Result ObjectStore::recover(Kxg::Catalogue& catalogue)
{
    LockFile turn;
    const QByteArray root = d->places.staging();
    Result result = turn.acquire(d->places.locks() + "/servers", LockFile::IfHeld::Wait);
    const QStringList folders = QDir(pathText(root)).entryList(QDir::Dirs | QDir::NoDotAndDotDot);
    for (const QString& name : folders) {
        const QByteArray folder = root + '/' + pathBytes(name);
        LockFile life;
        if (result.bad() || name == QLatin1String("locks") || folder == d->staging ||
            life.acquire(folder + "/life", LockFile::IfHeld::Fail).bad())
            continue;
        result = d->recover(folder, catalogue);
        if (result.good())
            QDir(pathText(folder)).removeRecursively();
    }
    return result;
}

Result ObjectStore::Private::recover(const QByteArray& folder, Kxg::Catalogue& catalogue)
{
    Result result;
    for (const QString& name : QDir(pathText(folder)).entryList(QDir::Files)) {
        const QByteArray path = folder + '/' + pathBytes(name);
        // Without a second name it was never whole.
        if (result.good() && linkCount(path) > 1)
            result = recoverFile(path, catalogue);
    }
    return result;
}

/// It has its place, but may not be registered: nobody was told of it then, and what came later goes before it.
Result ObjectStore::Private::recoverFile(const QByteArray& path, Kxg::Catalogue& catalogue)
{
    ArrivedObject object;
    DicomInput input;
    LockFile turn;
    input.path = path;
    if (!ObjectPlaces::check(input, {}, object))
        return {};
    QVector<Kxg::KeptFile> files;
    Result result = turn.acquire(places.lockOf(object), LockFile::IfHeld::Wait);
    if (result.good())
        result = catalogue.imageFiles(object.studyUID, object.image, files);
    const QByteArray place = places.placeOf(path, object);
    const bool isRegistered = std::any_of(files.begin(), files.end(),
                                          [&](const Kxg::KeptFile& file) { return file.path == place; });
    if (result.bad() || place.isEmpty() || isRegistered)
        return result;
    if (!files.isEmpty())
        return SystemResult::of(::unlink(place.constData()) == 0 ? 0 : errno);
    LogFile::warnf("%s was stored by a server that ended before it told so; it is taken in now",
                   place.constData());
    input.path = place;
    std::vector<DicomInput> images;
    images.push_back(std::move(input));
    return studies.add(std::move(images), catalogue);
}

}  // namespace Kdd
