#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QString>

#include <functional>
#include <memory>
#include <vector>

namespace Kxg
{
class Catalogue;
}

namespace Kdd
{

class ArrivedStudies;
class StagedFile;
class TagMap;

/// What becomes of an object whose SOP Instance UID the study has with other content.
enum class SameUid {
    Refuse,
    Replace,  ///< it is shown in place of the one before it, whose file stays
};

struct ObjectRules
{
    QByteArray folder;  ///< of the objects, made when it is absent
    SameUid sameUid = SameUid::Refuse;
    qint64 freeBytes = qint64(1) << 30;  ///< of the folder's disk that stay free; nothing is taken below that
    qint64 objectBytes = qint64(4) << 30;  ///< of one object
};

/// Why an object was not stored.
enum class ArrivalFault {
    None,
    OutOfSpace,  ///< the disk is full, or nearly so
    TooLarge,
    NotDicom,      ///< or so damaged that it cannot be read, or without the UIDs by which it would be found
    Mismatch,      ///< meta information and dataset name different objects
    OtherStudy,    ///< than the one it was sent to
    OtherContent,  ///< the study has another object of this UID
    NotAllowed,    ///< whoever sent it may not store it
    Failed,        ///< the database or the disk; it may be sent again
};

/// What became of one object that arrived.
struct ArrivedObject
{
    ArrivalFault fault = ArrivalFault::None;
    QString reason;          ///< in words, without names of patients
    bool isKnown = false;    ///< the archive had this very object, and nothing was changed
    QByteArray sopClassUID;  ///< this and the next as far as they could be read
    QByteArray sopInstanceUID;

    // Of one that is stored: where it is shown, which a correction may have changed.

    QByteArray studyUID;
    QByteArray seriesUID;
    QByteArray image;

    bool isStored() const { return fault == ArrivalFault::None; }
};

/// An object that is being received. What is not committed leaves nothing behind. Used by one thread at a time.
class KDD_EXPORT ObjectArrival
{
public:
    ~ObjectArrival();
    ObjectArrival(const ObjectArrival&) = delete;
    ObjectArrival& operator=(const ObjectArrival&) = delete;

    /// Goes to the disk as it comes. False: no more can be taken, and committing will tell why.
    bool take(const char* bytes, qint64 count);

    /// It has come whole: the disk may begin with it.
    void end();

private:
    friend class ObjectStore;
    struct KDD_LOCAL Private;
    explicit ObjectArrival(std::unique_ptr<Private> made);
    std::unique_ptr<Private> d;
};

/// Takes objects into the archive as they arrive over a network, by whatever protocol: below a folder of its own, as
/// STUDY/SERIES/INSTANCE.dcm, and never over a file that is there.
///
/// An object that is reported as stored is on the disk, registered in the image database, and its study waits to be
/// completed. Whatever ends the process before that leaves nothing that anybody was told of; what it left is taken in or
/// removed by `recover`. Any number of servers may store into one folder. Objects of one UID are taken one after the
/// other, so that one that comes twice at the same time is there once.
///
/// May be used on any thread; each call brings the catalogue of its own thread.
class KDD_EXPORT ObjectStore
{
public:
    /// `studies` must outlive the object. Null, with the reason, when the folder cannot be used.
    static std::unique_ptr<ObjectStore> open(const ObjectRules& rules, ArrivedStudies& studies,
                                             Result& result);

    ~ObjectStore();

    const ObjectRules& rules() const;

    /// Whether the disk has more room than has to stay free.
    bool hasRoom() const;

    /// Begins to receive an object; also when it cannot be received, which committing will tell.
    std::unique_ptr<ObjectArrival> begin();

    /// Whether whoever sent an image may store it; none: he may.
    using Admission = std::function<bool(const TagMap& image)>;

    /// Stores objects that have come whole, what costs a wait for disk or database for all of them at once, and tells of each
    /// what became of it. With `studyUID` not empty they have to be of that study. In this order: headers are read and
    /// checked, the files get their places, all of that is flushed, they are registered.
    std::vector<ArrivedObject> commit(std::vector<std::unique_ptr<ObjectArrival>>& arrivals,
                                      Kxg::Catalogue& catalogue, const QByteArray& studyUID = {},
                                      const Admission& admits = {});

    /// Looks after what servers left that died: what was whole is taken in, the rest goes. Failure: that of the database.
    Result recover(Kxg::Catalogue& catalogue);

private:
    struct KDD_LOCAL Private;
    explicit ObjectStore(std::unique_ptr<Private> made);
    std::unique_ptr<Private> d;
};

}  // namespace Kdd
