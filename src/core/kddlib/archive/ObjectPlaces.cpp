#include "kddlib/archive/ObjectPlaces.h"

#include "kddlib/archive/ObjectContent.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/os/FileStatus.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <cerrno>

namespace Kdd
{

namespace
{

/// Longer UIDs are none, and nobody could ask for the object.
constexpr int kLongestUid = 64;

/// Files of one SOP Instance UID in a series, each of other content.
constexpr int kMostVersions = 1000;

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

/// Neither UIDs nor numbers have it in them.
constexpr char kSeparator = '=';

QByteArray stagedName(const StagedFile& file, const ArrivedObject& object)
{
    const QList<QByteArray> parts = {file.path(), QByteArray::number(file.checksum(), 16), object.studyUID,
                                     object.seriesUID, object.image};
    return parts.join(kSeparator);
}

}  // namespace

void refuse(ArrivedObject& object, ArrivalFault fault, const QString& reason)
{
    object.fault = fault;
    object.reason = reason;
}

ArrivalFault faultOf(const SystemResult& result)
{
    const int error = result.error();
    return error == ENOSPC || error == EDQUOT || error == EFBIG ? ArrivalFault::OutOfSpace
                                                                : ArrivalFault::Failed;
}

bool ObjectPlaces::check(DicomInput& input, const QByteArray& studyUID, ArrivedObject& object)
{
    ObjectMeta meta;
    const Result found = readMeta(input.path, meta);
    if (found.bad()) {
        refuse(object, ArrivalFault::NotDicom, found.text());
        return false;
    }
    input = readDicomInput(input.path, Damage::Refused);
    object.sopClassUID = meta.sopClassUID;
    object.sopInstanceUID = isName(meta.sopInstanceUID) ? meta.sopInstanceUID : QByteArray();
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

bool ObjectPlaces::settleWithKnown(const DicomInput& input, Kxg::Catalogue& catalogue,
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
        if (isThere && mRules.sameUid == SameUid::Refuse) {
            refuse(object, ArrivalFault::OtherContent,
                   QStringLiteral("The study has another object of this SOP Instance UID"));
            return false;
        }
    }
    return true;
}

QByteArray ObjectPlaces::folderOf(const ArrivedObject& object) const
{
    return mRules.folder + '/' + object.studyUID + '/' + object.seriesUID;
}

bool ObjectPlaces::place(StagedFile& file, DicomInput& input, ArrivedObject& object) const
{
    const QByteArray folder = folderOf(object);
    SystemResult placed = makeLastingFolder(folder);
    if (placed.good())
        placed = file.rename(stagedName(file, object));
    for (int version = 1; placed.good() && version <= kMostVersions; ++version) {
        const QByteArray path = folder + '/' + nameOf(object.image, version);
        placed = file.linkTo(path);
        if (placed.error() == EEXIST) {
            placed = {};
            if (!isSameObject(file.path(), path))
                continue;
        }
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

bool ObjectPlaces::readStagedName(const QByteArray& path, ArrivedObject& object, quint32& checksum)
{
    const QList<QByteArray> parts = path.mid(path.lastIndexOf('/') + 1).split(kSeparator);
    bool isNumber = false;
    checksum = parts.value(1).toUInt(&isNumber, 16);
    object.studyUID = parts.value(2);
    object.seriesUID = parts.value(3);
    object.image = parts.value(4);
    return isNumber && isName(object.studyUID) && isName(object.seriesUID) && isName(object.image);
}

QByteArray ObjectPlaces::placeOf(const QByteArray& path, const ArrivedObject& object) const
{
    for (int version = 1; version <= kMostVersions; ++version) {
        const QByteArray place = folderOf(object) + '/' + nameOf(object.image, version);
        if (isSameFile(path, place))
            return place;
    }
    return {};
}

void ObjectPlaces::tellShown(const QByteArray& path, Kxg::Catalogue& catalogue, ArrivedObject& object)
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

}  // namespace Kdd
