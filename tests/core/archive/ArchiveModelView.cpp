#include "core/archive/ArchiveModel.h"

#include <algorithm>

namespace Kdd
{

std::set<std::string> ArchiveModel::listed() const
{
    std::set<std::string> studies;
    for (const auto& file : mRegistered)
        studies.insert(file.second.file.study);
    return studies;
}

ModelStudy ArchiveModel::listedImages(const std::string& study) const
{
    std::map<std::string, int> newest;
    ModelStudy images;
    for (const auto& each : mRegistered) {
        const std::string key = keyOf(each.first, each.second.file);
        if (each.second.file.study != study || each.second.number < newest[key])
            continue;
        newest[key] = each.second.number;
        images[key] = {each.first, each.second.file};
    }
    return images;
}

const ModelStudy* ArchiveModel::tagFile(const std::string& study) const
{
    const auto found = mTagFiles.find(study);
    return found != mTagFiles.end() ? &found->second : nullptr;
}

bool ArchiveModel::isFaulty(const std::string& study) const
{
    const bool isListed = listed().count(study) > 0;
    if (!isListed)
        return hasTagFile(study);
    if (isWaiting(study) || !isTrusted(study))
        return true;
    const ModelStudy wanted = listedImages(study);
    const ModelStudy& held = mTagFiles.at(study);
    if (held.size() != wanted.size())
        return true;
    return std::any_of(held.begin(), held.end(), [&](const auto& image) {
        const auto file = mDisk.find(image.second.path);
        const auto known = wanted.find(image.first);
        return known == wanted.end() || known->second.path != image.second.path || file == mDisk.end() ||
               !(edited(image.first, file->second) == image.second.shows);
    });
}

bool ArchiveModel::isFaulty() const
{
    std::set<std::string> studies = listed();
    studies.insert(mIsThere.begin(), mIsThere.end());
    return std::any_of(studies.begin(), studies.end(), [this](const auto& study) { return isFaulty(study); });
}

bool ArchiveModel::isSettled(const std::string& study) const
{
    return listed().count(study) > 0 && !isFaulty(study) && mUnsettled.count(study) == 0 &&
           mMarked.count(study) == 0;
}

}  // namespace Kdd
