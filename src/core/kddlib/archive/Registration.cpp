#include "kddlib/archive/Registration.h"

#include "kddlib/archive/ContentDigest.h"
#include "kddlib/archive/DicomInput.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/resources/ExResource.h"

namespace Kdd
{

namespace
{

constexpr std::size_t kBatch = 1000;

void warnOf(const Kxg::FileConflict& conflict)
{
    const QByteArray shownPath = shownAddress(conflict.path);
    const QByteArray shownOther = shownAddress(conflict.otherPath);
    const char* path = shownPath.constData();
    const char* other = shownOther.constData();
    switch (conflict.kind) {
    case Kxg::FileConflict::Kind::Replaces:
        LogFile::warnf("%s replaces %s: both are files of image %s", path, other,
                       conflict.sopInstanceUID.constData());
        break;
    case Kxg::FileConflict::Kind::AlsoInOtherStudy:
        LogFile::warnf("Image %s stands in two studies: in %s (%s) and in %s (%s)",
                       conflict.sopInstanceUID.constData(), conflict.studyInstanceUID.constData(), path,
                       conflict.otherStudyUID.constData(), other);
        break;
    case Kxg::FileConflict::Kind::FollowsCorrection:
        LogFile::warnf("%s names study %s, but goes to study %s: a correction moved its image there", path,
                       conflict.studyInstanceUID.constData(), conflict.otherStudyUID.constData());
        break;
    }
}

}  // namespace

Result Registration::add(const DicomInput& input)
{
    switch (input.kind) {
    case DicomInput::Kind::Image:
        mBatch.dicom.push_back(fileRecord(*input.map, input.path, input.stamp));
        mBatch.dicom.back().isDamaged = !input.leftOut.isEmpty();
        break;
    case DicomInput::Kind::Volume:
        mBatch.volumes.push_back({input.path, input.stamp, input.studyUID, input.seriesUID});
        break;
    case DicomInput::Kind::Other:
        mBatch.others.push_back({input.path, input.stamp});
        break;
    case DicomInput::Kind::Unusable:
        // It is read again the next time, when it may have been mended.
        return {};
    }
    const auto files = mBatch.dicom.size() + mBatch.volumes.size() + mBatch.others.size();
    return files < kBatch ? Result() : flush();
}

/// Digests come after the files are registered: whatever dies meanwhile leaves files without one, which is told and can be
/// mended, and the database is not kept waiting for the disk.
Result Registration::flush()
{
    const Kxg::FileRecords files = ExResource::takesFileDigests() ? mBatch : Kxg::FileRecords();
    Result registered = flushUndigested();
    return registered.good() ? digestRegistered(mCatalogue, files) : registered;
}

Result Registration::flushUndigested()
{
    if (mBatch.dicom.empty() && mBatch.volumes.empty() && mBatch.others.empty())
        return {};
    Kxg::RegistrationOutcome outcome;
    Result registered = mCatalogue.registerFiles(mBatch, outcome);
    if (registered.bad())
        return registered;
    // By these requests the intake tells later whether anything else waits in a study.
    for (auto it = outcome.requests.cbegin(); it != outcome.requests.cend(); ++it)
        mRequests[it.key()].append(it.value());
    mCorrected.unite(outcome.corrected);
    for (const Kxg::FileConflict& conflict : outcome.conflicts)
        warnOf(conflict);
    mImages += static_cast<int>(mBatch.dicom.size());
    mVolumes += static_cast<int>(mBatch.volumes.size());
    // Let go of only when the database has it, so that a failure leaves everything to be tried again.
    mBatch = {};
    return {};
}

}  // namespace Kdd
