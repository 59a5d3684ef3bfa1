#include "kddlib/archive/ObjectStore.h"

#include "kddlib/archive/ArrivedStudies.h"
#include "kddlib/archive/ContentDigest.h"
#include "kddlib/archive/DicomInput.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/ObjectBatch.h"
#include "kddlib/archive/ObjectPlaces.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/FlushThreads.h"
#include "platform/os/NamedLocks.h"
#include "platform/os/PathName.h"
#include "platform/os/StagedFile.h"
#include "platform/resources/ExResource.h"

#include <QDir>
#include <QUuid>

#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>

namespace Kdd
{

namespace
{

/// How much may come before the disk is looked at again [bytes].
constexpr qint64 kRoomStep = 16 * 1024 * 1024;

/// Waits for the disk at a time. They take nothing but the disk's time, of which many at once take hardly more than one.
constexpr int kFlushThreads = 16;

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
    std::unique_ptr<ContentDigest> digest;  // null where the site wants none

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
    if (d->digest != nullptr)
        d->digest->add(bytes, count);
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
    Result takeIn(const QByteArray& place, Kxg::Catalogue& catalogue);

    ArrivedStudies& studies;
    const ObjectRules rules;
    const ObjectPlaces places;
    const bool takesDigests = ExResource::takesFileDigests();
    QByteArray staging;  // of this process alone
    LockFile life;       // by which others know that it still lives
    std::atomic<quint64> count{0};
    FlushThreads flushes{kFlushThreads};
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
    if (d->takesDigests)
        made->digest = std::make_unique<ContentDigest>();
    return std::unique_ptr<ObjectArrival>(new ObjectArrival(std::move(made)));
}

std::vector<ArrivedObject> ObjectStore::commit(std::vector<std::unique_ptr<ObjectArrival>>& arrivals,
                                               Kxg::Catalogue& catalogue, const QByteArray& studyUID,
                                               const Admission& admits)
{
    ObjectBatch batch(d->places, d->studies, d->flushes, catalogue, studyUID, admits);
    for (const auto& arrival : arrivals)
        batch.add(arrival->d->file, arrival->d->digest ? arrival->d->digest->result() : QByteArray(),
                  arrival->d->fault, arrival->d->reason);
    return batch.finish();
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
        // Without a second name it was never whole, or nobody needs the first one.
        if (result.good() && linkCount(path) > 1)
            result = recoverFile(path, catalogue);
    }
    return result;
}

/// It has its place, but may not be registered: nobody was told of it then, and what came later goes before it.
Result ObjectStore::Private::recoverFile(const QByteArray& path, Kxg::Catalogue& catalogue)
{
    ArrivedObject object;
    quint32 checksum = 0;
    NamedLocks turn;
    QVector<Kxg::KeptFile> files;
    if (!ObjectPlaces::readStagedName(path, object, checksum))
        return {};
    Result result = turn.open(places.objectLocks());
    if (result.good())
        result = turn.acquire(ObjectPlaces::lockName(object), NamedLocks::IfHeld::Wait);
    if (result.good())
        result = catalogue.imageFiles(object.studyUID, object.image, files);
    const QByteArray place = places.placeOf(path, object);
    const bool isRegistered = std::any_of(files.begin(), files.end(),
                                          [&](const Kxg::KeptFile& file) { return file.path == place; });
    if (result.bad() || place.isEmpty() || isRegistered)
        return result;
    quint32 found = 0;
    if (!files.isEmpty() || readChecksum(path, found).bad() || found != checksum)
        return SystemResult::of(::unlink(place.constData()) == 0 ? 0 : errno);
    return takeIn(place, catalogue);
}

/// It may only be whole in memory yet.
Result ObjectStore::Private::takeIn(const QByteArray& place, Kxg::Catalogue& catalogue)
{
    Result result = flushNamedFile(place);
    std::vector<DicomInput> images;
    images.push_back(readDicomInput(place, Damage::Refused));
    if (result.bad() || images[0].kind != DicomInput::Kind::Image)
        return result;
    LogFile::warnf("%s was stored by a server that ended before it told so; it is taken in now",
                   place.constData());
    QSet<QByteArray> corrected;
    const DigestedFile read = takesDigests ? digestFile(place) : DigestedFile();
    if (read.digest.isEmpty() || !(read.stamp == images[0].stamp))
        return studies.add(std::move(images), catalogue, corrected);
    return studies.add(std::move(images), {{place, read.digest}}, catalogue, corrected);
}

}  // namespace Kdd
