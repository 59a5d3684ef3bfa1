#include "kddlib/tagfile/CorrectedVolumes.h"

#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"

#include <QHash>
#include <QSet>

namespace Kdd
{

namespace
{

/// Images that stand elsewhere get an empty name, so that nothing here
/// answers for them and their slices stay unknown.
void rename(VolumeInfo& info, const QHash<QByteArray, QByteArray>& keys)
{
    for (std::string& uid : info.imageUIDs)
        uid = keys.value(QByteArray::fromStdString(uid)).toStdString();
    for (std::string& identifier : info.frameIdentifiers) {
        const std::size_t dot = identifier.rfind('.');
        const QByteArray uid = QByteArray::fromStdString(identifier.substr(0, dot));
        identifier = keys.value(uid).toStdString() + (dot != std::string::npos ? identifier.substr(dot) : "");
    }
}

}  // namespace

CorrectedVolumes::Place CorrectedVolumes::placeOf(const QByteArray& uid, bool isForeign) const
{
    bool isElsewhere = false;
    bool isOurs = false;
    const auto corrections = mCorrections.ofFormerUID(uid);
    for (const Kxg::ImageCorrection* each : corrections) {
        // One that is corrected and stands here is the image that the
        // file means, whatever else bears its old UID.
        const bool isHere = each->shownStudyUID == mCorrections.studyUID();
        if (isHere && mFile.findImage(each->shownImage) != nullptr)
            return {each->shownImage, false, true};
        isElsewhere = isElsewhere || !isHere;
        isOurs = isOurs || each->studyInstanceUID == mCorrections.studyUID();
    }
    // Another image of the UID may have taken the place of one that left, but it is not the one that the file means.
    if (mFile.findImage(uid) != nullptr && (!isElsewhere || !isOurs))
        return {uid, false, false};
    if (isElsewhere || (isForeign && corrections.empty()))
        return {QByteArray(), true, true};
    return {uid, false, !corrections.empty()};
}

CorrectedVolumes::Fate CorrectedVolumes::update(VolumeInfo& info, bool isForeign) const
{
    QHash<QByteArray, QByteArray> keys;
    QSet<const TagMap*> holders;
    bool isAnyElsewhere = false;
    bool isAnyCorrected = false;
    for (const std::string& each : info.imageUIDs) {
        const QByteArray uid = QByteArray::fromStdString(each);
        const Place place = placeOf(uid, isForeign);
        keys.insert(uid, place.key);
        isAnyElsewhere = isAnyElsewhere || place.isElsewhere;
        isAnyCorrected = isAnyCorrected || place.isCorrected;
        // What a correction says to be here may still be missing, when its file could not be read.
        const TagMap* image = mFile.findImage(place.key);
        if (image != nullptr)
            holders.insert(image->parent());
    }
    // Without corrections the file is right about itself, and what it names may only not have been read.
    if (!isAnyCorrected)
        return Fate::Whole;
    // From here on the images are those of the tree, under the names that they have there.
    rename(info, keys);
    if (holders.isEmpty() && (isAnyElsewhere || isForeign))
        return Fate::Gone;
    return isAnyElsewhere || holders.size() > 1 ? Fate::Divided : Fate::Whole;
}

QByteArray CorrectedVolumes::seriesOf(const VolumeInfo& info) const
{
    for (const std::string& uid : info.imageUIDs) {
        const TagMap* image = mFile.findImage(QByteArray::fromStdString(uid));
        if (image != nullptr)
            return image->uid(TagMap::SeriesLevel);
    }
    return {};
}

}  // namespace Kdd
