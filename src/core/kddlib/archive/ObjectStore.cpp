#include "kddlib/archive/ObjectStore.h"

#include "kddlib/archive/ArrivedStudies.h"
#include "kddlib/archive/DicomInput.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/ObjectContent.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"
#include "platform/os/StagedFile.h"

#include <QCryptographicHash>
#include <QDir>
#include <QUuid>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <atomic>
#include <cerrno>

namespace Kdd
{

namespace
{

// Within the folder of the objects, so that both are on one disk: a file gets its place by a second name.
const QByteArray kStaging = "/.incoming";

/// How much may come before the disk is looked at again [bytes].
constexpr qint64 kRoomStep = 16 * 1024 * 1024;

/// Longer UIDs are none, and nobody could ask for the object.
constexpr int kLongestUid = 64;

/// Files of one SOP Instance UID in a series, each of other content.
constexpr int kMostVersions = 1000;

ArrivalFault faultOf(const SystemResult& result)
{
    const int error = result.error();
    return error == ENOSPC || error == EDQUOT || error == EFBIG ? ArrivalFault::OutOfSpace
                                                                : ArrivalFault::Failed;
}

/// Whether it can be the name of a file or folder: readDicomInput lets only letters, digits, points, hyphens and
/// underscores through.
bool isName(const QByteArray& uid)
{
    return !uid.isEmpty() && uid.size() <= kLongestUid && !uid.startsWith('.');
}

QByteArray nameOf(const QByteArray& sopUID, int version)
{
    // In the order of their names the later ones come behind, as whoever takes in the folder anew wants it.
    return version == 1 ? sopUID + ".dcm"
                        : sopUID + '_' + QByteArray::number(version).rightJustified(4, '0') + ".dcm";
}

void refuse(ArrivedObject& object, ArrivalFault fault, const QString& reason)
{
    object.fault = fault;
    object.reason = reason;
}

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

// ---- the store

struct ObjectStore::Private
{
    explicit Private(ArrivedStudies& arrived)
        : studies(arrived)
    {
    }

    QByteArray folderOf(const ArrivedObject& object) const
    {
        return rules.folder + '/' + object.studyUID + '/' + object.seriesUID;
    }
    Result lock(LockFile& held, const DicomInput& input, const QByteArray& sopUID) const;
    Result makeStaging();
    bool check(DicomInput& input, const QByteArray& studyUID, ArrivedObject& object) const;
    bool settleWithKnown(DicomInput& input, Kxg::Catalogue& catalogue, ArrivedObject& object) const;
    bool place(StagedFile& file, DicomInput& input, ArrivedObject& object) const;
    void tellPlace(const QByteArray& path, Kxg::Catalogue& catalogue, ArrivedObject& object) const;
    Result recover(const QByteArray& folder, Kxg::Catalogue& catalogue);
    Result recoverFile(const QByteArray& path, Kxg::Catalogue& catalogue);

    ArrivedStudies& studies;
    ObjectRules rules;
    QByteArray staging;  // of this process alone
    LockFile life;       // by which others know that it still lives
    std::atomic<quint64> count{0};
};

/// The right to decide about objects of one UID.
Result ObjectStore::Private::lock(LockFile& held, const DicomInput& input, const QByteArray& sopUID) const
{
    const QByteArray digest =
        QCryptographicHash::hash(input.studyUID + ' ' + sopUID, QCryptographicHash::Md5).toHex();
    // So many that two objects seldom meet, and so few that nobody has to remove them.
    return held.acquire(rules.folder + kStaging + "/locks/" + digest.left(2), LockFile::IfHeld::Wait);
}

Result ObjectStore::Private::makeStaging()
{
    LockFile turn;  // so that nobody takes a folder for one that is left that was made a moment ago
    const QByteArray locks = rules.folder + kStaging + "/locks";
    SystemResult made = makeLastingFolder(locks);
    if (made.good())
        made = turn.acquire(locks + "/servers", LockFile::IfHeld::Wait);
    staging = rules.folder + kStaging + '/' + QUuid::createUuid().toByteArray(QUuid::Id128);
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
    auto made = std::make_unique<Private>(studies);
    made->rules = rules;
    made->rules.folder = absolutePath(rules.folder);
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

/// What the object is, and whether it is what it says.
bool ObjectStore::Private::check(DicomInput& input, const QByteArray& studyUID, ArrivedObject& object) const
{
    ObjectMeta meta;
    const Result known = readMeta(input.path, meta);
    object.sopClassUID = meta.sopClassUID;
    object.sopInstanceUID = isName(meta.sopInstanceUID) ? meta.sopInstanceUID : QByteArray();
    if (known.bad()) {
        refuse(object, ArrivalFault::NotDicom, known.text());
        return false;
    }
    input = readDicomInput(input.path, Damage::Refused);
    if (input.kind != DicomInput::Kind::Image) {
        refuse(object, ArrivalFault::NotDicom,
               input.reason.isEmpty() ? QStringLiteral("It is no DICOM object") : input.reason);
        return false;
    }
    object.studyUID = input.studyUID;
    object.seriesUID = input.seriesUID;
    object.image = input.map->uid(TagMap::ImageLevel);
    object.sopInstanceUID = object.image;
    input.map->findAndGetString(DCM_SOPClassUID, object.sopClassUID);
    if (!isName(object.image) || !isName(object.studyUID) || !isName(object.seriesUID))
        refuse(object, ArrivalFault::NotDicom,
               QStringLiteral("A UID of it is missing or cannot serve as one"));
    else if (object.image != meta.sopInstanceUID || object.sopClassUID != meta.sopClassUID)
        refuse(object, ArrivalFault::Mismatch,
               QStringLiteral("Its meta information names another object or class than its dataset"));
    else if (!studyUID.isEmpty() && object.studyUID != studyUID)
        refuse(object, ArrivalFault::OtherStudy,
               QStringLiteral("It is of another study than it was sent to"));
    return object.isStored();
}

/// Against the files of this image that the archive has. False when nothing more is to be done.
bool ObjectStore::Private::settleWithKnown(DicomInput& input, Kxg::Catalogue& catalogue,
                                           ArrivedObject& object) const
{
    QVector<Kxg::KeptFile> files;
    const Result asked = catalogue.imageFiles(object.studyUID, object.image, files);
    if (asked.bad()) {
        refuse(object, ArrivalFault::Failed, asked.text());
        return false;
    }
    for (const Kxg::KeptFile& file : qAsConst(files)) {
        if (!file.isShown)
            continue;
        if (isSameObject(input.path, file.path)) {
            object.isKnown = true;
            object.studyUID = file.shownStudyUID;
            object.seriesUID = file.shownSeriesUID;
            object.image = file.shownImage;
            return false;
        }
        ObjectMeta meta;
        // What was there and is gone, or cannot be read any more, stands in nobody's way.
        const bool isThere = readMeta(file.path, meta).good() && meta.sopInstanceUID == object.sopInstanceUID;
        if (isThere && rules.sameUid == SameUid::Refuse) {
            refuse(object, ArrivalFault::OtherContent,
                   QStringLiteral("The study has another object of this SOP Instance UID"));
            return false;
        }
    }
    return true;
}

/// Gives the file its place, or finds the place that it has already: a server died before it registered it, or it was
/// removed from the archive, which leaves files where they are.
bool ObjectStore::Private::place(StagedFile& file, DicomInput& input, ArrivedObject& object) const
{
    const QByteArray folder = folderOf(object);
    SystemResult placed = file.flush();
    if (placed.good())
        placed = makeLastingFolder(folder);
    for (int version = 1; placed.good() && version <= kMostVersions; ++version) {
        const QByteArray path = folder + '/' + nameOf(object.image, version);
        placed = file.linkTo(path);
        if (placed.error() == EEXIST) {
            placed = {};
            if (!isSameObject(file.path(), path))
                continue;
        }
        if (placed.good())
            placed = flushFolder(folder);
        FileStatus status;
        if (placed.good() && statusOf(path.constData(), status)) {
            input.path = path;
            input.stamp = {status.size, status.modified};
            return true;
        }
    }
    if (placed.good())
        refuse(object, ArrivalFault::Failed, QStringLiteral("There are too many objects of this UID"));
    else
        refuse(object, faultOf(placed), placed.text());
    return false;
}

/// A correction may show it elsewhere than its file says. What cannot be asked is told as the file has it.
void ObjectStore::Private::tellPlace(const QByteArray& path, Kxg::Catalogue& catalogue,
                                     ArrivedObject& object) const
{
    QVector<Kxg::KeptFile> files;
    if (catalogue.imageFiles(object.studyUID, object.image, files).bad())
        return;
    for (const Kxg::KeptFile& file : qAsConst(files)) {
        if (file.path != path)
            continue;
        object.studyUID = file.shownStudyUID;
        object.seriesUID = file.shownSeriesUID;
        object.image = file.shownImage;
        return;
    }
}

ArrivedObject ObjectStore::commit(ObjectArrival& arrival, Kxg::Catalogue& catalogue,
                                  const QByteArray& studyUID)
{
    ArrivedObject object;
    DicomInput input;
    StagedFile& file = arrival.d->file;
    input.path = file.path();
    if (arrival.d->fault != ArrivalFault::None) {
        refuse(object, arrival.d->fault, arrival.d->reason);
        return object;
    }
    LockFile turn;
    if (!d->check(input, studyUID, object))
        return object;
    const Result locked = d->lock(turn, input, object.image);
    if (locked.bad())
        refuse(object, ArrivalFault::Failed, locked.text());
    if (!object.isStored() || !d->settleWithKnown(input, catalogue, object) || !d->place(file, input, object))
        return object;
    const QByteArray path = input.path;
    const Result registered = d->studies.add(std::move(input), catalogue);
    if (registered.bad()) {
        // It may be registered all the same, when the answer was lost: the file stays, and so does its first name, from
        // which it is known what to do with it.
        file.keep();
        refuse(object, ArrivalFault::Failed, registered.text());
        return object;
    }
    d->tellPlace(path, catalogue, object);
    return object;
}

// ---- what was left

Result ObjectStore::recover(Kxg::Catalogue& catalogue)
{
    LockFile turn;
    const QByteArray root = d->rules.folder + kStaging;
    Result result = turn.acquire(root + "/locks/servers", LockFile::IfHeld::Wait);
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
    Result result;
    if (!check(input, {}, object))
        return result;
    result = lock(turn, input, object.image);
    QVector<Kxg::KeptFile> files;
    if (result.good())
        result = catalogue.imageFiles(object.studyUID, object.image, files);
    for (int version = 1; result.good() && version <= kMostVersions; ++version) {
        const QByteArray place = folderOf(object) + '/' + nameOf(object.image, version);
        if (!isSameFile(path, place))
            continue;
        const bool isRegistered = std::any_of(files.begin(), files.end(),
                                              [&](const Kxg::KeptFile& file) { return file.path == place; });
        if (isRegistered)
            return {};
        if (!files.isEmpty())
            return SystemResult::of(QFile::remove(pathText(place)) ? 0 : errno);
        LogFile::warnf("%s was stored by a server that ended before it told so; it is taken in now",
                       place.constData());
        input.path = place;
        return studies.add(std::move(input), catalogue);
    }
    return result;
}

}  // namespace Kdd
