#include "tools/kdd/DicomInput.h"

#include "kddlib/Limits.h"
#include "kddlib/net/DicomFileReader.h"
#include "kddlib/tagmodel/TagMap.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

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

bool hasDicomPrefix(QFile& file)
{
    return file.seek(kPreamble) && file.read(4) == "DICM";
}

bool isMediaDirectory(DcmFileFormat& file)
{
    OFString sopClass;
    file.getMetaInfo()->findAndGetOFString(DCM_MediaStorageSOPClassUID, sopClass);
    return sopClass == UID_MediaStorageDirectoryStorage ||
           file.getDataset()->tagExists(DCM_DirectoryRecordSequence);
}

/// Bytes other than those of UIDs, of which archives have seen letters and hyphens too. A UID with anything else
/// comes from damage, and it would be a trap in lists, logs and requests.
bool isStrange(const QByteArray& uid)
{
    return std::any_of(uid.begin(), uid.end(), [](char c) {
        const bool isFine = (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') ||
                            c == '.' || c == '-' || c == '_';
        return !isFine;
    });
}

/// The first of the three UIDs that cannot be used as a name; null when all can.
const char* strangeUid(const TagMap& map)
{
    const struct
    {
        DcmTagKey key;
        const char* name;
    } uids[] = {{DCM_StudyInstanceUID, "Study Instance UID"},
                {DCM_SeriesInstanceUID, "Series Instance UID"},
                {DCM_SOPInstanceUID, "SOP Instance UID"}};
    for (const auto& uid : uids) {
        QByteArray text;
        if (map.findAndGetString(uid.key, text) && isStrange(text))
            return uid.name;
    }
    return nullptr;
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
    input.map->findAndGetString(DCM_StudyInstanceUID, input.studyUID);
    input.kind = DicomInput::Kind::Image;
    return input;
}

void collect(const QFileInfo& place, QStringList& files, QStringList& faults)
{
    if (!place.isDir()) {
        files.append(place.absoluteFilePath());
        return;
    }
    const QDir folder(place.absoluteFilePath());
    if (!folder.isReadable()) {
        faults.append(QStringLiteral("%1: %2").arg(place.filePath(), errnoText(EACCES)));
        return;
    }
    const QDir::Filters wanted =
        QDir::Files | QDir::Dirs | QDir::System | QDir::Hidden | QDir::NoDotAndDotDot;
    for (const QFileInfo& entry : folder.entryInfoList(wanted, QDir::Name)) {
        // A linked folder may lead back up; linked files are welcome.
        if (entry.isFile() || (entry.isDir() && !entry.isSymLink()) || (entry.isSymLink() && !entry.exists()))
            collect(entry, files, faults);
    }
}

}  // namespace

DicomInput::DicomInput() = default;
DicomInput::DicomInput(DicomInput&&) noexcept = default;
DicomInput& DicomInput::operator=(DicomInput&&) noexcept = default;
DicomInput::~DicomInput() = default;

DicomInput readDicomInput(const QString& path)
{
    DicomInput input;
    input.path = path;
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly))
        return std::move(refuse(input, DicomInput::Kind::Unusable, file.errorString()));
    input.fileBytes = file.size();
    if (input.fileBytes == 0)
        return std::move(refuse(input, DicomInput::Kind::Unusable, QStringLiteral("The file is empty")));
    const bool isDicom = hasDicomPrefix(file);
    file.close();
    DcmFileFormat format;
    const OFCondition condition = readDicomFile(path.toLocal8Bit().constData(), format);
    if (condition.bad() || (!isDicom && !namesItself(*format.getDataset())))
        return std::move(refuse(input, isDicom ? DicomInput::Kind::Unusable : DicomInput::Kind::NotDicom,
                                condition.bad() ? QString::fromLatin1(condition.text())
                                                : QStringLiteral("No DICOM object")));
    if (isMediaDirectory(format))
        return std::move(refuse(input, DicomInput::Kind::NotDicom, QStringLiteral("Media directory")));
    return std::move(take(input, format));
}

QStringList filesBelow(const QStringList& paths, QStringList& faults)
{
    QStringList files;
    for (const QString& path : paths) {
        const QFileInfo place(path);
        if (place.exists() || place.isSymLink())
            collect(place, files, faults);
        else
            faults.append(QStringLiteral("%1: %2").arg(path, errnoText(ENOENT)));
    }
    return files;
}

}  // namespace Kdd
