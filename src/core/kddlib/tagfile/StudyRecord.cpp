#include "kddlib/tagfile/StudyRecord.h"

#include "kddlib/items/TextDecoding.h"
#include "kddlib/tagfile/SearchAttributes.h"
#include "kddlib/tagfile/SeriesRecord.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/os/JournaledWrite.h"
#include "platform/os/PathName.h"
#include "platform/os/RandomAccessFile.h"

#include <QCryptographicHash>

#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

namespace
{

/// The texts of one image in UTF-8.
class Texts
{
public:
    explicit Texts(const TagMap& image)
        : mImage(image)
    {
        image.findAndGetString(DCM_SpecificCharacterSet, mCharacterSet);
    }

    /// The database holds texts of all studies, so they are in one encoding there.
    QByteArray operator()(const DcmTagKey& key) const
    {
        QByteArray bytes;
        mImage.findAndGetString(key, bytes);
        return decodeText(bytes, mCharacterSet).trimmed().toUtf8();
    }

private:
    const TagMap& mImage;
    QByteArray mCharacterSet;
};

}  // namespace

Kxg::DicomFileRecord fileRecord(const TagMap& image, const QByteArray& path, const Kxg::FileStamp& stamp)
{
    const Texts text(image);
    Kxg::DicomFileRecord record;
    record.path = path;
    record.stamp = stamp;
    record.studyInstanceUID = image.uid(TagMap::StudyLevel);
    record.seriesInstanceUID = image.uid(TagMap::SeriesLevel);
    record.sopInstanceUID = image.uid(TagMap::ImageLevel);
    record.patientName = text(DCM_PatientName);
    record.patientID = text(DCM_PatientID);
    record.patientBirthDate = text(DCM_PatientBirthDate);
    record.patientSex = text(DCM_PatientSex);
    record.studyDate = text(DCM_StudyDate);
    record.studyTime = text(DCM_StudyTime);
    record.studyDescription = text(DCM_StudyDescription);
    record.accessionNumber = text(DCM_AccessionNumber);
    record.seriesNumber = text(DCM_SeriesNumber);
    record.seriesDescription = text(DCM_SeriesDescription);
    record.modality = text(DCM_Modality);
    record.seriesDate = text(DCM_SeriesDate);
    record.seriesTime = text(DCM_SeriesTime);
    record.stationName = text(DCM_StationName);
    return record;
}

Kxg::BuiltStudy builtStudy(const QMap<QByteArray, TagMap*>& series, const Kxg::TagFileStamp& stamp)
{
    // By path, because the order of the tree is that of arrival: two builds of the same files must say the same.
    FirstImages firstByPath;
    for (const TagMap* each : series) {
        if (const TagMap* first = describingImage(*each))
            firstByPath.insert(filePathOf(*first), first);
    }
    Kxg::BuiltStudy built;
    built.tagFile = stamp;
    built.search = searchRecord(firstByPath);
    for (auto it = firstByPath.cbegin(); it != firstByPath.cend(); ++it)
        built.series.push_back(fileRecord(*it.value(), it.key(), {}));
    return built;
}

bool isTagFile(const QString& path, const Kxg::TagFileStamp& stamp)
{
    // With a journal beside it, what the file says is about to change. It may be longer than its stamp, for one that was
    // kept open keeps the old end of a longer study.
    RandomAccessFile file;
    if (stamp.digest.isEmpty() || hasJournal(path) || file.open(pathBytes(path).constData()).bad() ||
        file.size() < stamp.size)
        return false;
    // Only as many bytes as were written: what lies behind them is left over and says nothing.
    QByteArray content(static_cast<int>(stamp.size), Qt::Uninitialized);
    return file.readAt(0, content.data(), content.size()) == content.size() &&
           QCryptographicHash::hash(content, QCryptographicHash::Md5) == stamp.digest;
}

}  // namespace Kdd
