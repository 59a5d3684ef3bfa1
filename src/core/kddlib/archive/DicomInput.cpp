#include "kddlib/archive/DicomInput.h"

#include "kddlib/Limits.h"
#include "kddlib/archive/ObjectInput.h"
#include "kddlib/archive/ReadInput.h"
#include "kddlib/net/dicom/DamagedFile.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/os/FileStatus.h"
#include "platform/os/RandomAccessFile.h"
#include "platform/volumefile/OrlanMesh.h"

#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>
#include <cstring>

namespace Kdd
{

namespace
{

// Bytes of any content that stand before the prefix.
constexpr int kPreamble = 128;

DicomInput& refuse(DicomInput& input, DicomInput::Kind kind, const QString& reason)
{
    input.kind = kind;
    input.reason = reason;
    return input;
}

bool hasDicomPrefix(const RandomAccessFile& file)
{
    char prefix[4] = {};
    return file.readAt(kPreamble, prefix, sizeof prefix) == sizeof prefix &&
           std::memcmp(prefix, "DICM", 4) == 0;
}

/// By its class or by what it holds, for the meta information may be missing.
bool isMediaDirectory(DcmFileFormat& file)
{
    OFString sopClass;
    file.getMetaInfo()->findAndGetOFString(DCM_MediaStorageSOPClassUID, sopClass);
    return sopClass == UID_MediaStorageDirectoryStorage ||
           file.getDataset()->tagExists(DCM_DirectoryRecordSequence);
}

/// Too long, or with bytes other than those of UIDs, of which archives have seen letters and hyphens too. A UID with
/// anything else comes from damage, and it would be a trap in lists, logs and requests.
bool isStrange(const QByteArray& uid)
{
    return uid.size() > Kxg::kMaxUID || std::any_of(uid.begin(), uid.end(), [](char c) {
               const bool isFine = (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') ||
                                   (c >= 'a' && c <= 'z') || c == '.' || c == '-' || c == '_';
               return !isFine;
           });
}

/// The first of the three UIDs that cannot be used as a name; null when all can.
const char* strangeUid(const TagMap& map)
{
    if (isStrange(map.uid(TagMap::StudyLevel)))
        return "Study Instance UID";
    if (isStrange(map.uid(TagMap::SeriesLevel)))
        return "Series Instance UID";
    return isStrange(map.uid(TagMap::ImageLevel)) ? "SOP Instance UID" : nullptr;
}

/// Without the DICM prefix nearly any bytes can be read as some attribute, so an object has to name itself.
bool namesItself(DcmItem& dataset)
{
    return dataset.tagExistsWithValue(DCM_SOPInstanceUID) || dataset.tagExistsWithValue(DCM_SOPClassUID) ||
           dataset.tagExistsWithValue(DCM_StudyInstanceUID);
}

/// What the pixels take of the file, to tell how much of it is header.
qint64 pixelBytes(DcmItem& dataset)
{
    qint64 bytes = 0;
    for (const DcmTagKey& key : {DCM_PixelData, DCM_FloatPixelData, DCM_DoubleFloatPixelData}) {
        DcmElement* element = nullptr;
        if (dataset.findAndGetElement(key, element).bad())
            continue;
        DcmPixelSequence* fragments = nullptr;
        E_TransferSyntax xfer = EXS_Unknown;
        const DcmRepresentationParameter* parameter = nullptr;
        if (element->ident() == EVR_PixelData) {
            auto& pixels = static_cast<DcmPixelData&>(*element);
            pixels.getOriginalRepresentationKey(xfer, parameter);
            if (DcmXfer(xfer).isEncapsulated())
                pixels.getEncapsulatedRepresentation(xfer, parameter, fragments);
        }
        // Encapsulated pixel data has no length of its own, but its fragments have.
        bytes += fragments != nullptr ? fragments->getLength(xfer, EET_UndefinedLength)
                                      : element->getLengthField();
    }
    return bytes;
}

/// Makes an image of what its map holds, unless its UIDs cannot serve as names.
DicomInput& take(DicomInput& input, std::unique_ptr<TagMap> map, qint64 pixels)
{
    input.headerBytes = qMax<qint64>(0, input.fileBytes - pixels);
    if (const char* name = strangeUid(*map))
        return refuse(input, DicomInput::Kind::Unusable,
                      QStringLiteral("%1 has bytes that no UID has").arg(QLatin1String(name)));
    input.studyUID = map->uid(TagMap::StudyLevel);
    input.seriesUID = map->uid(TagMap::SeriesLevel);
    // Together in a study without a name, or a series, the images of two patients would meet.
    if (input.studyUID.isEmpty() || input.seriesUID.isEmpty())
        return refuse(input, DicomInput::Kind::Unusable,
                      input.studyUID.isEmpty() ? QStringLiteral("It has no Study Instance UID")
                                               : QStringLiteral("It has no Series Instance UID"));
    input.map = std::move(map);
    input.kind = DicomInput::Kind::Image;
    return input;
}

}  // namespace

DicomInput::DicomInput() = default;
DicomInput::DicomInput(DicomInput&&) noexcept = default;
DicomInput& DicomInput::operator=(DicomInput&&) noexcept = default;
DicomInput::~DicomInput() = default;

DicomInput readDicomInput(const QByteArray& path, Damage damage)
{
    if (isObjectAddress(path))
        return takeObject(path, readObject(path, kDefaultValueBound));
    DicomInput plain;
    if (takePlain(path, readPlain(path, kDefaultValueBound), plain))
        return plain;
    return parseInput(path, damage);
}

DicomInput parseInput(const QByteArray& path, Damage damage)
{
    DicomInput input;
    input.path = path;
    FileStatus status;
    // Before the file is read: one that changes meanwhile has
    // another stamp at the next scan and is read again.
    if (statusOf(path.constData(), status))
        input.stamp = {status.size, status.modified};
    if (path.size() > Kxg::kMaxPath)
        return std::move(refuse(input, DicomInput::Kind::Unusable, QStringLiteral("Its path is too long")));
    RandomAccessFile file;
    const Result opened = file.open(path.constData());
    if (opened.bad())
        return std::move(refuse(input, DicomInput::Kind::Unusable, opened.text()));
    input.fileBytes = file.size();
    if (input.fileBytes == 0)
        return std::move(refuse(input, DicomInput::Kind::Unusable, QStringLiteral("The file is empty")));
    if (OrlanMesh::isVolumeFile(path)) {
        // Only the header is read, which tells the study and the series.
        Result result;
        takeVolume(input, OrlanMesh::read(path, result).get(), result);
        return input;
    }
    const bool isDicom = hasDicomPrefix(file);
    DcmFileFormat format;
    const OFCondition condition = damage == Damage::Refused
                                      ? readDicomFile(path.constData(), format)
                                      : readDamagedDicomFile(path.constData(), format, input.leftOut);
    takeParsed(input, isDicom, condition, format);
    return input;
}

void takeVolume(DicomInput& input, const OrlanMesh* mesh, const Result& result)
{
    if (mesh == nullptr) {
        refuse(input, DicomInput::Kind::Unusable, result.text());
        return;
    }
    input.studyUID = dicomValue(*mesh, "G0020-000D");
    input.seriesUID = dicomValue(*mesh, "G0020-000E");
    if (input.studyUID.isEmpty() || input.seriesUID.isEmpty() || isStrange(input.studyUID) ||
        isStrange(input.seriesUID))
        refuse(input, DicomInput::Kind::Unusable, QStringLiteral("It names no study and series"));
    else
        input.kind = DicomInput::Kind::Volume;
}

void takeParsed(DicomInput& input, bool hasPrefix, const OFCondition& condition, DcmFileFormat& format)
{
    // A file with the prefix claims to be DICOM, so that it cannot be
    // read is a fault. Any other is something else.
    if (condition.bad() || (!hasPrefix && !namesItself(*format.getDataset()))) {
        refuse(input, hasPrefix ? DicomInput::Kind::Unusable : DicomInput::Kind::Other,
               condition.bad() ? QString::fromLatin1(condition.text()) : QStringLiteral("No DICOM object"));
        return;
    }
    if (isMediaDirectory(format)) {
        refuse(input, DicomInput::Kind::Other, QStringLiteral("Media directory"));
        return;
    }
    DcmDataset& dataset = *format.getDataset();
    std::unique_ptr<TagMap> map(TagMap::createTagMap(&dataset, kDefaultValueBound));
    take(input, std::move(map), pixelBytes(dataset));
}

bool takePlain(const QByteArray& path, PlainRead read, DicomInput& input)
{
    if (!read.isPlain || path.size() > Kxg::kMaxPath)
        return false;
    input.path = path;
    input.stamp = {read.identity.size, read.identity.modified};
    input.fileBytes = read.identity.size;
    take(input, std::move(read.image.map), read.image.pixelBytes);
    return true;
}

}  // namespace Kdd
