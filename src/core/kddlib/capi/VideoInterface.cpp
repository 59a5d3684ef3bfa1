#include "kddlib/capi/Border.h"
#include "kddlib/capi/FragmentLocation.h"
#include "kddlib/capi/kddstream.h"
#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "platform/base/LogFile.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QList>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcfilefo.h>
#include <dcmtk/dcmdata/dcmetinf.h>

#include <cstring>

using namespace Kdd;

namespace
{

const QByteArray kCompressedSyntaxes = QByteArrayLiteral("1.2.840.10008.1.2.4.");
// MPEG-2 comes first, HEVC last; below are the syntaxes of still images.
constexpr int kFirstVideoSyntax = 100;
constexpr int kLastVideoSyntax = 108;

struct VideoMetaInfo
{
    QByteArray sopInstanceUID;
    Sint32 cineRate = 0;
    int transferSyntax = 0;
    FragmentLocation location;
};

/// The number that a video's transfer syntax ends in; 0 of other data. A second number, with which newer syntaxes allow
/// several fragments, makes no other kind of video.
int videoSyntaxOf(DcmFileFormat& file)
{
    OFString uid;
    file.getMetaInfo()->findAndGetOFString(DCM_TransferSyntaxUID, uid);
    const QByteArray syntax(uid.c_str());
    if (!syntax.startsWith(kCompressedSyntaxes))
        return 0;
    const int number = syntax.mid(kCompressedSyntaxes.size()).split('.').first().toInt();
    return number >= kFirstVideoSyntax && number <= kLastVideoSyntax ? number : 0;
}

Result readVideo(const char* path, VideoMetaInfo& info)
{
    DcmFileFormat file;
    const OFCondition condition = loadDicomFile(path, file);
    if (condition.bad())
        return Result::failure(QString::fromUtf8(condition.text()));
    OFString uid;
    file.getDataset()->findAndGetOFString(DCM_SOPInstanceUID, uid);
    // The caller's buffer has room for the longest UID that DICOM allows, and no more.
    if (uid.size() >= KDD_UID_SIZE)
        return Result::failure(QStringLiteral("SOP Instance UID is longer than 64 characters: ") +
                               QString::fromUtf8(uid.c_str()));
    info.sopInstanceUID = uid.c_str();
    file.getDataset()->findAndGetSint32(DCM_CineRate, info.cineRate);
    // Only then is the video looked for, which reads the file once more.
    info.transferSyntax = videoSyntaxOf(file);
    if (info.transferSyntax == 0 || !locateFirstFragment(path, file, info.location))
        return Result::failure(QStringLiteral("it holds no video"));
    return {};
}

}  // namespace

// NOLINTNEXTLINE(readability-function-size): as long as its list of results
int GetVideoMetaInfo(const char* path, char* sopInstanceUID, int32_t* cineRate, int32_t* transferSyntax,
                     uint64_t* offset, uint64_t* length)
{
    return guarded(__func__, int{KDD_NOT_READ}, [&](const char* function) -> int {
        if (!isGiven(function, "the SOP Instance UID", sopInstanceUID) ||
            !isGiven(function, "the cine rate", cineRate) ||
            !isGiven(function, "the transfer syntax", transferSyntax) ||
            !isGiven(function, "the offset", offset) || !isGiven(function, "the length", length))
            return KDD_NOT_READ;
        *sopInstanceUID = '\0';
        *cineRate = *transferSyntax = 0;
        *offset = *length = 0;
        VideoMetaInfo info;
        if (!isGiven(function, "the path", path))
            return KDD_NOT_READ;
        if (const Result result = readVideo(path, info); result.bad()) {
            LogFile::errorf("Could not find the video of %s: %s", path, qUtf8Printable(result.text()));
            return KDD_NOT_READ;
        }
        std::memcpy(sopInstanceUID, info.sopInstanceUID.constData(),
                    static_cast<std::size_t>(info.sopInstanceUID.size()) + 1);
        *cineRate = info.cineRate;
        *transferSyntax = info.transferSyntax;
        *offset = static_cast<uint64_t>(info.location.offset);
        *length = static_cast<uint64_t>(info.location.length);
        return info.location.isOnly ? KDD_READ : KDD_READ_PARTLY;
    });
}
