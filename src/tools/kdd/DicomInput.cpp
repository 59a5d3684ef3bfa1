#include "tools/kdd/DicomInput.h"

#include "kddlib/Limits.h"
#include "kddlib/net/DamagedFile.h"
#include "kddlib/net/DicomFileReader.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/os/FileStatus.h"
#include "platform/os/RandomAccessFile.h"
#include "platform/volumefile/OrlanMesh.h"

#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <vector>

namespace Kdd
{

namespace
{

constexpr int kPreamble = 128;

QString errnoText(int error)
{
    return QString::fromLocal8Bit(std::strerror(error));
}

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
        bytes += fragments != nullptr ? fragments->getLength(xfer, EET_UndefinedLength)
                                      : element->getLengthField();
    }
    return bytes;
}

DicomInput& take(DicomInput& input, DcmFileFormat& file)
{
    DcmDataset& dataset = *file.getDataset();
    input.headerBytes = qMax<qint64>(0, input.fileBytes - pixelBytes(dataset));
    input.map.reset(TagMap::createTagMap(&dataset, kDefaultValueBound));
    if (const char* name = strangeUid(*input.map)) {
        input.map.reset();
        return refuse(input, DicomInput::Kind::Unusable,
                      QStringLiteral("%1 has bytes that no UID has").arg(QLatin1String(name)));
    }
    input.studyUID = input.map->uid(TagMap::StudyLevel);
    input.seriesUID = input.map->uid(TagMap::SeriesLevel);
    input.kind = DicomInput::Kind::Image;
    return input;
}

DicomInput& takeVolume(DicomInput& input)
{
    Result result;
    const std::unique_ptr<OrlanMesh> mesh = OrlanMesh::read(input.path, result);
    if (mesh == nullptr)
        return refuse(input, DicomInput::Kind::Unusable, result.text());
    input.studyUID = dicomValue(*mesh, "G0020-000D");
    input.seriesUID = dicomValue(*mesh, "G0020-000E");
    if (input.studyUID.isEmpty() || input.seriesUID.isEmpty() || isStrange(input.studyUID) ||
        isStrange(input.seriesUID))
        return refuse(input, DicomInput::Kind::Unusable, QStringLiteral("It names no study and series"));
    input.kind = DicomInput::Kind::Volume;
    return input;
}

QByteArray bytes(const std::filesystem::path& path)
{
    return QByteArray::fromStdString(path.native());
}

QString fault(const std::filesystem::path& path, const std::error_code& error)
{
    return QStringLiteral("%1: %2").arg(QString::fromLocal8Bit(bytes(path)),
                                        QString::fromStdString(error.message()));
}

void collect(const std::filesystem::path& place, QList<QByteArray>& files, QStringList& faults);

void collectBelow(const std::filesystem::path& folder, QList<QByteArray>& files, QStringList& faults)
{
    std::error_code error;
    std::vector<std::filesystem::path> entries;
    for (std::filesystem::directory_iterator it(folder, error), end; !error && it != end; it.increment(error))
        entries.push_back(it->path());
    if (error)
        faults.append(fault(folder, error));
    std::sort(entries.begin(), entries.end());
    for (const std::filesystem::path& entry : entries) {
        // A linked folder may lead back up; linked files are welcome.
        if (!std::filesystem::is_symlink(entry, error) || !std::filesystem::is_directory(entry, error))
            collect(entry, files, faults);
    }
}

/// Pipes, sockets and devices are no files; a link that leads nowhere is taken for one, so that its reading tells.
void collect(const std::filesystem::path& place, QList<QByteArray>& files, QStringList& faults)
{
    std::error_code error;
    const std::filesystem::file_status status = std::filesystem::status(place, error);
    if (std::filesystem::is_directory(status))
        collectBelow(place, files, faults);
    else if (!std::filesystem::is_other(status))
        files.append(absolutePath(bytes(place)));
}

}  // namespace

DicomInput::DicomInput() = default;
DicomInput::DicomInput(DicomInput&&) noexcept = default;
DicomInput& DicomInput::operator=(DicomInput&&) noexcept = default;
DicomInput::~DicomInput() = default;

DicomInput readDicomInput(const QByteArray& path, Damage damage)
{
    DicomInput input;
    input.path = path;
    FileStatus status;
    if (statusOf(path.constData(), status))
        input.stamp = {status.size, status.modified};
    if (path.size() > Kxg::kMaxPath)
        return std::move(refuse(input, DicomInput::Kind::Unusable, QStringLiteral("Its path is too long")));
    RandomAccessFile file;
    if (const int error = file.open(path.constData()))
        return std::move(refuse(input, DicomInput::Kind::Unusable, errnoText(error)));
    input.fileBytes = file.size();
    if (input.fileBytes == 0)
        return std::move(refuse(input, DicomInput::Kind::Unusable, QStringLiteral("The file is empty")));
    if (OrlanMesh::isVolumeFile(path))
        return std::move(takeVolume(input));
    const bool isDicom = hasDicomPrefix(file);
    DcmFileFormat format;
    const OFCondition condition = damage == Damage::Refused
                                      ? readDicomFile(path.constData(), format)
                                      : readDamagedDicomFile(path.constData(), format, input.leftOut);
    if (condition.bad() || (!isDicom && !namesItself(*format.getDataset())))
        return std::move(refuse(input, isDicom ? DicomInput::Kind::Unusable : DicomInput::Kind::Other,
                                condition.bad() ? QString::fromLatin1(condition.text())
                                                : QStringLiteral("No DICOM object")));
    if (isMediaDirectory(format))
        return std::move(refuse(input, DicomInput::Kind::Other, QStringLiteral("Media directory")));
    return std::move(take(input, format));
}

QByteArray absolutePath(const QByteArray& path)
{
    QByteArray absolute = bytes(std::filesystem::absolute(path.toStdString()).lexically_normal());
    if (absolute.size() > 1 && absolute.endsWith('/'))
        absolute.chop(1);
    return absolute;
}

QList<QByteArray> filesBelow(const QList<QByteArray>& paths, QStringList& faults)
{
    QList<QByteArray> files;
    for (const QByteArray& path : paths) {
        const std::filesystem::path place(path.toStdString());
        std::error_code error;
        if (std::filesystem::exists(std::filesystem::symlink_status(place, error)))
            collect(place, files, faults);
        else
            faults.append(
                fault(place, error ? error : std::make_error_code(std::errc::no_such_file_or_directory)));
    }
    return files;
}

}  // namespace Kdd
