#pragma once

#include <map>
#include <set>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

namespace Kdd
{

/// What a DICOM file says, as far as the model looks at it. Without SOP Instance UID an image is known by its path.
struct ModelFile
{
    std::string study;
    std::string series;
    std::string sop;
    std::string patient;
    std::string number;

    bool operator==(const ModelFile& o) const
    {
        return std::tie(study, series, sop, patient, number) ==
               std::tie(o.study, o.series, o.sop, o.patient, o.number);
    }
};

/// An image as a tag file shows it.
struct ModelImage
{
    std::string path;
    ModelFile shows;
};

/// By SOP Instance UID or path.
using ModelStudy = std::map<std::string, ModelImage>;

/// An archive in plain words: which files there are, which are registered, and what each study's tag file shows. Uses
/// nothing of the library, so that it cannot err with it.
class ArchiveModel
{
public:
    // ---- the world outside

    void write(const std::string& path, const ModelFile& content);

    /// In the same tick of the clock and of the same length, so that nobody can tell.
    void rewrite(const std::string& path, const ModelFile& content) { mDisk[path] = content; }

    /// Its clock is set, and it stays what it is.
    void touch(const std::string& path) { mVersions[path] = ++mLastVersion; }
    void removeFromDisk(const std::string& path) { mDisk.erase(path); }

    /// What somebody puts in the place of a tag file that shows `content`; null: nothing that can be read.
    void spoil(const std::string& study, const ModelStudy* content, bool isThere);

    /// What was put in its place is the very one that was written last.
    void recognise(const std::string& study) { mSpoiled.erase(study); }

    // ---- operations

    void index(const std::string& folder);

    /// Whether every study that it completed could be completed.
    bool add(const std::string& folder);

    bool buildWaiting();
    bool buildAll(bool again);
    bool settle();

    /// Empty: not restricted to a series or an image.
    bool remove(const std::string& study, const std::string& series, const std::string& image);
    bool sync(const std::string& study);

    /// Of a patient's name; how many images were found.
    int edit(const std::string& study, const std::string& image, const std::string& patient);

    // ---- what is to be seen

    std::set<std::string> listed() const;
    ModelStudy listedImages(const std::string& study) const;
    bool isWaiting(const std::string& study) const { return mWaiting.count(study) > 0; }

    /// Null when no file that can be read is to be there.
    const ModelStudy* tagFile(const std::string& study) const;
    bool isTrusted(const std::string& study) const;
    bool hasTagFile(const std::string& study) const { return mIsThere.count(study) > 0; }

    /// Whether a check has something to tell.
    bool isFaulty() const;
    bool isFaulty(const std::string& study) const;

    /// Nothing waits for its time, nothing differs: another build makes the same bytes.
    bool isSettled(const std::string& study) const;

    const std::map<std::string, ModelFile>& disk() const { return mDisk; }

private:
    struct Registered
    {
        ModelFile file;
        int number = 0;   // the greatest is shown
        int version = 0;  // of the content
    };

    static std::string keyOf(const std::string& path, const ModelFile& file);
    std::vector<std::string> changedBelow(const std::string& folder) const;
    std::set<std::string> registerAll(const std::vector<std::string>& paths);
    ModelFile edited(const std::string& key, ModelFile file) const;
    bool isCorrected(const std::string& study) const;
    bool canMerge(const std::string& study, const ModelStudy& arrivals) const;
    bool bringListed(const std::string& study, ModelStudy& arrivals) const;
    void complete(const std::string& study, ModelStudy arrivals, bool isAlone, bool& isDone);
    bool build(const std::string& study);
    void put(const std::string& study, ModelStudy content);
    void forgetTagFile(const std::string& study);
    bool isKnown(const std::string& study) const;

    std::map<std::string, ModelFile> mDisk;
    std::map<std::string, int> mVersions;  // of the files on the disk
    int mLastVersion = 0;
    std::map<std::string, Registered> mRegistered;
    int mLastNumber = 0;
    std::map<std::string, ModelStudy> mTagFiles;  // those that can be read
    std::set<std::string> mIsThere;               // also those that cannot
    std::set<std::string> mSpoiled;               // not what was written last
    std::set<std::string> mWaiting;
    std::set<std::string> mChanged;  // of which more happened, since they were built, than that files came
    std::set<std::string> mUnsettled;
    std::set<std::string> mMarked;  // by a sync or a correction, which change the tag file as it is
    std::map<std::pair<std::string, std::string>, std::string> mEdits;  // of studies and images
};

}  // namespace Kdd
