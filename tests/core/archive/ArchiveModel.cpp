#include "core/archive/ArchiveModel.h"

#include <algorithm>

namespace Kdd
{

namespace
{

bool isBelow(const std::string& path, const std::string& folder)
{
    return path.compare(0, folder.size() + 1, folder + '/') == 0;
}

}  // namespace

std::string ArchiveModel::keyOf(const std::string& path, const ModelFile& file)
{
    return file.sop.empty() ? path : file.sop;
}

// ---- the world outside

void ArchiveModel::write(const std::string& path, const ModelFile& content)
{
    mDisk[path] = content;
    touch(path);
}

void ArchiveModel::spoil(const std::string& study, const ModelStudy* content, bool isThere)
{
    forgetTagFile(study);
    if (content != nullptr)
        mTagFiles[study] = *content;
    if (isThere)
        mIsThere.insert(study);
    mSpoiled.insert(study);
}

// ---- registering

std::vector<std::string> ArchiveModel::changedBelow(const std::string& folder) const
{
    std::vector<std::string> changed;
    for (const auto& file : mDisk) {
        const auto known = mRegistered.find(file.first);
        const bool isKnown = known != mRegistered.end() && known->second.version == mVersions.at(file.first);
        if (isBelow(file.first, folder) && !isKnown)
            changed.push_back(file.first);
    }
    return changed;
}

/// The studies that gained, lost or changed a file.
std::set<std::string> ArchiveModel::registerAll(const std::vector<std::string>& paths)
{
    std::set<std::string> touched;
    for (const std::string& path : paths) {
        const auto former = mRegistered.find(path);
        if (former != mRegistered.end()) {
            touched.insert(former->second.file.study);
            mChanged.insert(former->second.file.study);
        }
        mRegistered[path] = {mDisk.at(path), ++mLastNumber, mVersions.at(path)};
        touched.insert(mDisk.at(path).study);
    }
    return touched;
}

void ArchiveModel::index(const std::string& folder)
{
    const std::set<std::string> touched = registerAll(changedBelow(folder));
    mWaiting.insert(touched.begin(), touched.end());
}

bool ArchiveModel::add(const std::string& folder)
{
    const std::vector<std::string> paths = changedBelow(folder);
    std::map<std::string, ModelStudy> arrivals;
    for (const std::string& path : paths) {
        const ModelFile& file = mDisk.at(path);
        arrivals[file.study][keyOf(path, file)] = {path, file};
    }
    const std::set<std::string> changedBefore = mChanged;
    const std::set<std::string> touched = registerAll(paths);
    mWaiting.insert(touched.begin(), touched.end());
    const bool hasUnchanged = std::any_of(mDisk.begin(), mDisk.end(), [&](const auto& file) {
        return isBelow(file.first, folder) &&
               std::find(paths.begin(), paths.end(), file.first) == paths.end();
    });
    bool isDone = true;
    for (const auto& study : arrivals)
        complete(study.first, study.second, changedBefore.count(study.first) == 0, isDone);
    std::set<std::string> left;
    for (const std::string& study : touched) {
        if (arrivals.count(study) == 0)
            left.insert(study);
    }
    // What was found unchanged may be left of an intake that did not come to its end.
    for (const auto& file : mRegistered) {
        if (hasUnchanged && isBelow(file.first, folder) && mWaiting.count(file.second.file.study) > 0)
            left.insert(file.second.file.study);
    }
    for (const std::string& study : left)
        isDone = build(study) && isDone;
    return isDone;
}

// ---- tag files

void ArchiveModel::put(const std::string& study, ModelStudy content)
{
    mTagFiles[study] = std::move(content);
    mIsThere.insert(study);
    mSpoiled.erase(study);
}

void ArchiveModel::forgetTagFile(const std::string& study)
{
    mTagFiles.erase(study);
    mIsThere.erase(study);
}

bool ArchiveModel::isTrusted(const std::string& study) const
{
    return mTagFiles.count(study) > 0 && mSpoiled.count(study) == 0;
}

/// As corrections make it, whatever file the image comes from.
ModelFile ArchiveModel::edited(const std::string& key, ModelFile file) const
{
    const auto edit = mEdits.find({file.study, key});
    if (edit != mEdits.end())
        file.patient = edit->second;
    return file;
}

bool ArchiveModel::isCorrected(const std::string& study) const
{
    return std::any_of(mEdits.begin(), mEdits.end(),
                       [&](const auto& edit) { return edit.first.first == study; });
}

/// All that the study shows, once the arrivals are in, comes from the file that counts.
bool ArchiveModel::canMerge(const std::string& study, const ModelStudy& arrivals) const
{
    if (!isTrusted(study) || isCorrected(study))
        return false;
    const ModelStudy wanted = listedImages(study);
    const ModelStudy& present = mTagFiles.at(study);
    for (const auto& image : wanted) {
        const auto arrived = arrivals.find(image.first);
        const auto held = present.find(image.first);
        const std::string path = arrived != arrivals.end() ? arrived->second.path
                                 : held != present.end()   ? held->second.path
                                                           : std::string();
        if (path != image.second.path)
            return false;
    }
    return std::all_of(present.begin(), present.end(),
                       [&](const auto& image) { return wanted.count(image.first) > 0; });
}

/// What was registered before and nobody has taken in comes along from the disk. False when that is more than half of
/// all, or is not there as it was registered.
bool ArchiveModel::bringListed(const std::string& study, ModelStudy& arrivals) const
{
    const auto holds = [](const ModelStudy& content, const auto& listed) {
        const auto found = content.find(listed.first);
        return found != content.end() && found->second.path == listed.second.path;
    };
    std::size_t absent = 0;
    const ModelStudy wanted = listedImages(study);
    for (const auto& listed : wanted) {
        if (holds(arrivals, listed) || holds(mTagFiles.at(study), listed))
            continue;
        const auto file = mDisk.find(listed.second.path);
        const ModelFile& known = listed.second.shows;
        if (file == mDisk.end() || file->second.study != known.study || file->second.series != known.series ||
            file->second.sop != known.sop)
            return false;
        arrivals[listed.first] = {listed.second.path, file->second};
        ++absent;
    }
    return 2 * absent <= wanted.size();
}

/// `isAlone`: nothing waited to be taken into account but files that had come.
void ArchiveModel::complete(const std::string& study, ModelStudy arrivals, bool isAlone, bool& isDone)
{
    if (!isAlone || !isTrusted(study) || !bringListed(study, arrivals) || !canMerge(study, arrivals)) {
        isDone = build(study) && isDone;
        return;
    }
    ModelStudy content = mTagFiles.at(study);
    for (const auto& image : arrivals)
        content[image.first] = image.second;
    put(study, content);
    mWaiting.erase(study);
    mChanged.erase(study);
    mUnsettled.insert(study);
}

/// What cannot be read, or is another image now, stays as the tag file had it; then the study goes on waiting.
bool ArchiveModel::build(const std::string& study)
{
    const ModelStudy wanted = listedImages(study);
    ModelStudy content;
    bool isWhole = true;
    for (const auto& image : wanted) {
        const std::string& path = image.second.path;
        const auto file = mDisk.find(path);
        const ModelFile& known = image.second.shows;
        // What was registered without UID has none that it could contradict, but may not take the place of another one.
        const bool isThat =
            file != mDisk.end() && file->second.study == known.study && file->second.series == known.series &&
            (known.sop.empty() ? wanted.count(file->second.sop) == 0 : file->second.sop == known.sop);
        if (isThat) {
            const std::string key = keyOf(path, file->second);
            content[key] = {path, edited(key, file->second)};
            continue;
        }
        isWhole = false;
        const ModelStudy* former = tagFile(study);
        if (former != nullptr && former->count(image.first) > 0)
            content[image.first] = {path, edited(image.first, former->at(image.first).shows)};
    }
    if (wanted.empty()) {
        forgetTagFile(study);
        mSpoiled.erase(study);
    } else if (content.empty()) {
        return false;
    } else {
        put(study, content);
    }
    if (isWhole) {
        mWaiting.erase(study);
        mChanged.erase(study);
        mUnsettled.erase(study);
    } else {
        mChanged.insert(study);
    }
    mMarked.erase(study);
    return isWhole;
}

bool ArchiveModel::buildWaiting()
{
    bool isDone = true;
    const std::set<std::string> waiting = mWaiting;
    for (const std::string& study : waiting)
        isDone = build(study) && isDone;
    return isDone;
}

bool ArchiveModel::buildAll(bool again)
{
    for (const std::string& study : listed()) {
        if (again || !isTrusted(study)) {
            mWaiting.insert(study);
            mChanged.insert(study);
        }
    }
    return buildWaiting();
}

bool ArchiveModel::settle()
{
    mWaiting.insert(mUnsettled.begin(), mUnsettled.end());
    mChanged.insert(mUnsettled.begin(), mUnsettled.end());
    return buildWaiting();
}

// ---- removing and bringing into line

bool ArchiveModel::isKnown(const std::string& study) const
{
    return isWaiting(study) || listed().count(study) > 0;
}

bool ArchiveModel::remove(const std::string& study, const std::string& series, const std::string& image)
{
    const auto isMeant = [&](const std::string& key, const ModelFile& file) {
        return (series.empty() || file.series == series) && (image.empty() || key == image);
    };
    ModelStudy* present = mTagFiles.count(study) > 0 ? &mTagFiles[study] : nullptr;
    const bool isHeld = present != nullptr && std::any_of(present->begin(), present->end(), [&](auto& each) {
                            return isMeant(each.first, each.second.shows);
                        });
    const auto takeOut = [&] {
        for (auto it = present->begin(); it != present->end();)
            it = isMeant(it->first, it->second.shows) ? present->erase(it) : std::next(it);
        if (present->empty())
            forgetTagFile(study);
    };
    if (!isKnown(study)) {
        if (isHeld)
            takeOut();
        return isHeld;
    }
    const ModelStudy wanted = listedImages(study);
    const bool isListed = std::any_of(wanted.begin(), wanted.end(),
                                      [&](auto& each) { return isMeant(each.first, each.second.shows); });
    const bool isWholeStudy = series.empty() && image.empty();
    if (!isWholeStudy && !isListed && !isHeld)
        return false;
    for (auto it = mRegistered.begin(); it != mRegistered.end();) {
        const bool isGone =
            it->second.file.study == study && isMeant(keyOf(it->first, it->second.file), it->second.file);
        it = isGone ? mRegistered.erase(it) : std::next(it);
    }
    const bool isAlone = !isWaiting(study);
    const ModelStudy left = listedImages(study);
    bool holdsAll = isAlone && isTrusted(study) && !isCorrected(study) && !left.empty();
    for (const auto& each : left)
        holdsAll =
            holdsAll && present->count(each.first) > 0 && present->at(each.first).path == each.second.path;
    if (!holdsAll) {
        mWaiting.insert(study);
        mChanged.insert(study);
        return build(study);
    }
    for (auto it = present->begin(); it != present->end();)
        it = left.count(it->first) == 0 ? present->erase(it) : std::next(it);
    mUnsettled.insert(study);
    return true;
}

/// Only paths and what is listed: no file is opened. A tag file that is not the one written last has to be built.
bool ArchiveModel::sync(const std::string& study)
{
    if (!isKnown(study) || mTagFiles.count(study) == 0)
        return false;
    const bool wasTrusted = isTrusted(study);
    const ModelStudy wanted = listedImages(study);
    ModelStudy content;
    for (const auto& image : mTagFiles.at(study)) {
        const auto listed = wanted.find(image.first);
        if (listed != wanted.end())
            content[image.first] = {listed->second.path, image.second.shows};
    }
    if (content.empty()) {
        // Nothing of it is listed any more, and without images it is not written: it has to be built.
        mWaiting.insert(study);
        mChanged.insert(study);
        return false;
    }
    put(study, content);
    mMarked.insert(study);
    if (!wasTrusted)
        mWaiting.insert(study);
    if (isWaiting(study))
        mChanged.insert(study);
    return true;
}

int ArchiveModel::edit(const std::string& study, const std::string& image, const std::string& patient)
{
    ModelStudy& present = mTagFiles.at(study);
    const auto found = present.find(image);
    if (found == present.end())
        return 0;
    if (found->second.shows.patient != patient) {
        found->second.shows.patient = patient;
        mEdits[{study, image}] = patient;
        mMarked.insert(study);
    }
    return 1;
}

}  // namespace Kdd
