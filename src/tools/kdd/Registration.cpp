#include "tools/kdd/Registration.h"

#include "kddlib/tagmodel/TagMap.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/DicomInput.h"
#include "tools/kdd/FileRecord.h"

namespace Kdd
{

namespace
{

constexpr std::size_t kBatch = 1000;

}  // namespace

bool Registration::add(const DicomInput& input)
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
        return true;
    }
    return mBatch.dicom.size() + mBatch.volumes.size() + mBatch.others.size() < kBatch || flush();
}

bool Registration::flush()
{
    if (mBatch.dicom.empty() && mBatch.volumes.empty() && mBatch.others.empty())
        return true;
    QMap<QByteArray, qint64> requests;
    if (!succeeded(mDatabase.registerFiles(mBatch, requests)))
        return false;
    for (auto it = requests.cbegin(); it != requests.cend(); ++it)
        mRequests[it.key()].append(it.value());
    mImages += static_cast<int>(mBatch.dicom.size());
    mVolumes += static_cast<int>(mBatch.volumes.size());
    mBatch = {};
    return true;
}

}  // namespace Kdd
