#include "kddlib/archive/ObjectInput.h"

#include "kddlib/archive/ReadInput.h"
#include "kddlib/net/dicom/RemoteDicom.h"
#include "kddlib/net/dicom/RemoteFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/VolumeFileOpening.h"
#include "platform/volumefile/OrlanMesh.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcfilefo.h>

#include <cstring>
#include <utility>

namespace Kdd
{

namespace
{

// Preamble and prefix of a DICOM file; a volume file is known by less.
constexpr qint64 kHead = 132;
constexpr char kVolumeFile[] = "\x89HDF\r\n\x1a\n";

void takeOther(DicomInput& input, const std::shared_ptr<RemoteFile>& file)
{
    char head[kHead] = {};
    const qint64 got = file->readAt(0, head, kHead);
    if (got >= static_cast<qint64>(std::strlen(kVolumeFile)) &&
        std::memcmp(head, kVolumeFile, std::strlen(kVolumeFile)) == 0) {
        Result result;
        takeVolume(input, openVolumeFile(input.path, result).get(), result);
        return;
    }
    const bool hasPrefix = got == kHead && std::memcmp(head + kHead - 4, "DICM", 4) == 0;
    DcmFileFormat format;
    const OFCondition condition = readRemoteDicom(file, format);
    takeParsed(input, hasPrefix, condition, format);
    // Of what broke off nobody knows what it is.
    if (file->fault().bad()) {
        input.kind = DicomInput::Kind::Unusable;
        input.reason = file->fault().text();
    }
}

}  // namespace

DicomInput takeObject(const QByteArray& url, ObjectRead read)
{
    DicomInput input;
    input.path = url;
    input.stamp = read.stamp;
    input.fileBytes = read.stamp.size;
    input.kind = DicomInput::Kind::Unusable;
    if (url.size() > Kxg::kMaxPath)
        input.reason = QStringLiteral("Its path is too long");
    else if (read.fault.bad())
        input.reason = read.fault.text();
    else if (read.stamp.size == 0)
        input.reason = QStringLiteral("The file is empty");
    else if (read.isPlain)
        takePlain(url, {{0, 0, read.stamp.size, read.stamp.modified}, true, std::move(read.image)}, input);
    else
        takeOther(input, read.file);
    return input;
}

}  // namespace Kdd
