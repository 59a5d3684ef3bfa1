#pragma once

#include "kddlib/archive/DicomInput.h"
#include "kddlib/archive/ObjectStore.h"
#include "platform/os/StagedFile.h"

namespace Kdd
{

/// Notes why an object is not stored.
void refuse(ArrivedObject& object, ArrivalFault fault, const QString& reason);

/// What a failure of the system means for an object.
ArrivalFault faultOf(const SystemResult& result);

/// Whether an object is what it says, and what becomes of it beside those that are there. Each of these returns false, with
/// the object's fault or that it is known, when nothing more is to be done with it. May be used on any thread.
class ObjectPlaces
{
public:
    explicit ObjectPlaces(const ObjectRules& rules)
        : mRules(rules)
    {
    }

    /// What the files in which objects are received have in common.
    QByteArray staging() const { return mRules.folder + "/.incoming"; }
    QByteArray locks() const { return staging() + "/locks"; }

    /// By these, and the object's name there, goes the right to decide about it.
    QByteArray objectLocks() const { return locks() + "/objects"; }
    static QByteArray lockName(const ArrivedObject& object) { return object.studyUID + ' ' + object.image; }

    /// Reads the object at the input's path.
    static bool check(DicomInput& input, const QByteArray& studyUID, ArrivedObject& object);

    /// Looks at the files of its UID that the archive has.
    bool settleWithKnown(const DicomInput& input, Kxg::Catalogue& catalogue, ArrivedObject& object) const;

    QByteArray folderOf(const ArrivedObject& object) const;

    /// Gives the file its place, or finds the place that it has already: a server died before it registered it, or it was
    /// removed from the archive, which leaves files where they are. The input's path is that place afterwards. Before, the
    /// file's first name tells what `readStagedName` reads: its bytes need not be on the disk yet.
    bool place(StagedFile& file, DicomInput& input, ArrivedObject& object) const;

    /// Of a file that may have got a place: the object's UIDs, and the checksum that it has when all of it is there.
    static bool readStagedName(const QByteArray& path, ArrivedObject& object, quint32& checksum);

    /// Which place of the object is another name of the file at `path`; empty when none is.
    QByteArray placeOf(const QByteArray& path, const ArrivedObject& object) const;

    /// A correction may show it elsewhere than its file says. What cannot be asked is told as the file has it.
    static void tellShown(const QByteArray& path, Kxg::Catalogue& catalogue, ArrivedObject& object);

private:
    const ObjectRules mRules;
};

}  // namespace Kdd
