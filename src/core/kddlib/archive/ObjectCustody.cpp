#include "kddlib/archive/ObjectCustody.h"

#include "kddlib/archive/ObjectContent.h"
#include "platform/base/LogFile.h"
#include "platform/database/HeldFiles.h"
#include "platform/os/FileStatus.h"
#include "platform/os/StagedFile.h"

#include <QHash>

namespace Kdd
{

namespace
{

/// Looks at files, at the folder of several once.
class Custodian
{
public:
    Custody look(const Kxg::HeldFile& file, const ObjectReference& object)
    {
        FileStatus status;
        // Removed behind the archive's back.
        if (!statusOf(file.path.constData(), status))
            return Custody::Unknown;
        ObjectMeta meta;
        const Result read = readMeta(file.path, meta);
        if (read.bad() || status.size != file.size || meta.sopInstanceUID != object.sopInstanceUID) {
            LogFile::warnf("%s is not what was registered, and nobody is told that it is kept: %s",
                           file.path.constData(), qUtf8Printable(read.text()));
            return Custody::Failed;
        }
        if (meta.sopClassUID != object.sopClassUID)
            return Custody::OtherClass;
        return isFlushed(file.path) ? Custody::Kept : Custody::Failed;
    }

private:
    bool isFlushed(const QByteArray& path)
    {
        const QByteArray folder = path.left(path.lastIndexOf('/'));
        SystemResult flushed = flushFile(path);
        if (flushed.good() && !mFolders.contains(folder))
            mFolders.insert(folder, flushFolder(folder).good());
        if (flushed.bad() || !mFolders.value(folder))
            LogFile::warnf("%s cannot be flushed to the disk", path.constData());
        return flushed.good() && mFolders.value(folder);
    }

    QHash<QByteArray, bool> mFolders;  // whether their names are on the disk
};

}  // namespace

void takeCustody(std::vector<ObjectReference>& objects)
{
    QList<QByteArray> uids;
    std::vector<Kxg::HeldFile> files;
    for (const ObjectReference& object : objects)
        uids.append(object.sopInstanceUID);
    const Result asked = Kxg::heldFiles(uids, files);
    if (asked.bad())
        LogFile::errorf("%s", qUtf8Printable(asked.text()));
    QMultiHash<QByteArray, const Kxg::HeldFile*> known;
    for (const Kxg::HeldFile& file : files)
        known.insert(file.sopInstanceUID, &file);
    Custodian custodian;
    for (ObjectReference& object : objects) {
        object.custody = asked.good() ? Custody::Unknown : Custody::Failed;
        // Several studies may have images of one UID, of which one is enough.
        for (const Kxg::HeldFile* file : known.values(object.sopInstanceUID)) {
            const Custody custody = custodian.look(*file, object);
            if (object.custody == Custody::Kept || custody == Custody::Unknown)
                continue;
            object.custody = custody;
            object.studyUID = file->shownStudyUID;
            object.image = file->shownImage;
        }
    }
}

}  // namespace Kdd
