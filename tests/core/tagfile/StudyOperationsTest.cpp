#include "TagFileFixture.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "platform/database/DirectoryEntry.h"
#include "support/RandomImages.h"

#include <algorithm>
#include <map>
#include <set>
#include <sstream>

namespace Kdd
{
namespace
{

constexpr int kImages = 14;
constexpr int kSteps = 40;
constexpr unsigned kSeeds = 100;

/// What an image without UID is known by, its path.
constexpr const char* kNameless = "/a/b";

/// What operations change in an image that they are not about: its places, marks of others, and what a correction notes.
constexpr const char* kNotItsOwn[] = {"0006,7100", "0006,7101", "0006,7103", "0006,7107",
                                      "0006,7108", "0006,7120", "0020,0013", "0071,"};

/// All that happens to images, at random, beside a model that knows what each showed when it stood alone, and for each
/// slice of each volume its image.
class StudyOperations : public TagFileTest
{
protected:
    struct Stack
    {
        QByteArray series;
        std::vector<std::pair<QByteArray, int>> slices;  // image, empty when it is lost, and frame
    };

    int any(int count) { return mRandom.below(count); }
    QByteArray anyUID() { return QByteArray::number(1 + any(kImages)); }
    QByteArray anySeries() { return "1.2." + QByteArray::number(any(3)); }

    static std::string shownOf(const TagMap& image)
    {
        std::string text;
        std::istringstream lines(shownText(image));
        for (std::string line; std::getline(lines, line);) {
            const bool isOwn = std::none_of(std::begin(kNotItsOwn), std::end(kNotItsOwn),
                                            [&](const char* key) { return line.find(key) == 0; });
            text += isOwn ? line + '\n' : "";
        }
        return text;
    }

    TagMap* newImage(const QByteArray& uid, const QByteArray& series)
    {
        TagMap* image = mRandom.next(uid);
        image->putAndInsertString(DCM_SeriesInstanceUID, series);
        image->putAndInsertString(DCM_InstanceNumber, QByteArray::number(any(9)));
        mShown[uid] = shownOf(*image);
        return image;
    }

    /// Also one without UID, which is known by its path.
    void build(unsigned seed)
    {
        mRandom = RandomImages(seed);
        mFile.clear();
        mSeries.clear();
        mStacks.clear();
        mShown.clear();
        for (int i = 1; i <= kImages; ++i)
            place(mFile, QByteArray::number(i), anySeries());
        mFile.addTagMap(anImage().inSeries("1.2.0").without(DCM_SOPInstanceUID).map(), "/a\\b", false);
        std::vector<VolumeInfo> infos;
        for (int i = any(6); i > 0; --i) {
            infos.push_back(anyVolume());
            expect(infos.back());
        }
        addVolumes(mFile, infos);
    }

    void place(TagFile& file, const QByteArray& uid, const QByteArray& series)
    {
        ASSERT_NE(file.addTagMap(newImage(uid, series), nullptr, true), nullptr);
        if (mSeries.count(uid) != 0 && mSeries[uid] != series)
            lose(uid);
        mSeries[uid] = series;
    }

    /// Images of other series, strangers, images twice and frames included.
    VolumeInfo anyVolume()
    {
        VolumeInfo info = aVolume({}, ("x-stack_part" + QByteArray::number(++mNumber) + ".vol").constData());
        const bool hasFrames = any(3) == 0;
        std::set<std::string> uids;
        for (int i = 1 + any(8); i > 0; --i) {
            const std::string uid = any(12) == 0 ? "stranger" : anyUID().toStdString();
            if (hasFrames)
                info.frameIdentifiers.push_back(uid + '.' + std::to_string(any(4)));
            if (!hasFrames || uids.insert(uid).second)
                info.imageUIDs.push_back(uid);
        }
        info.dims.z = static_cast<int>(info.imageUIDs.size());
        return info;
    }

    void expect(const VolumeInfo& info)
    {
        Stack stack;
        for (const std::string& each : info.imageUIDs) {
            const QByteArray uid = QByteArray::fromStdString(each);
            if (stack.series.isEmpty() && mSeries.count(uid) != 0)
                stack.series = mSeries[uid];
            if (info.frameIdentifiers.empty() && mSeries.count(uid) != 0 && mSeries[uid] == stack.series)
                stack.slices.emplace_back(uid, 0);
        }
        for (const std::string& each : info.frameIdentifiers) {
            const QByteArray uid = QByteArray::fromStdString(each.substr(0, each.rfind('.')));
            const bool isHeld = mSeries.count(uid) != 0 && mSeries[uid] == stack.series;
            stack.slices.emplace_back(isHeld ? uid : QByteArray(),
                                      std::stoi(each.substr(each.rfind('.') + 1)));
        }
        if (!stack.series.isEmpty())
            mStacks[Volume::fileNameSuffix(info.name.constData())] = stack;
    }

    void lose(const QByteArray& uid)
    {
        for (auto& each : mStacks) {
            for (auto& slice : each.second.slices) {
                if (slice.first == uid)
                    slice.first.clear();
            }
        }
    }

    void remove(const QByteArray& uid)
    {
        lose(uid);
        mSeries.erase(uid);
        mShown.erase(uid);
    }

    void step()
    {
        const QByteArray uid = anyUID();
        const bool isHeld = mSeries.count(uid) != 0;
        const char* uids[] = {uid.constData()};
        switch (any(12)) {
        case 0:
            EXPECT_EQ(mFile.removeImages(1, uids), isHeld ? 1 : 0);
            return remove(uid);
        case 1:
            return take(uid);
        case 2:
        case 3:
            return place(mFile, uid, isHeld && any(2) == 0 ? mSeries[uid] : anySeries());
        case 4:
            return mFile.optimizeAll();
        case 5:
            return sync();
        case 6:
            return merge();
        case 7:
            return correct();
        case 8:
            return emptySeries();
        case 9:
            return rearrange();
        case 10:
            return writeAndRead();
        default:
            return addVolume();
        }
    }

    /// Takes an image out, perhaps to put it back.
    void take(const QByteArray& uid)
    {
        std::unique_ptr<TagMap> taken(mFile.takeImage(uid));
        ASSERT_EQ(taken != nullptr, mSeries.count(uid) != 0);
        if (taken == nullptr)
            return;
        EXPECT_EQ(shownOf(*taken), mShown[uid]);
        if (any(2) == 0)
            return remove(uid);
        lose(uid);
        ASSERT_NE(mFile.addTagMap(taken.release(), nullptr, false), nullptr);
    }

    /// Leaves a series without images in the tree, to be filled again.
    void emptySeries()
    {
        const QByteArray series = anySeries();
        for (const auto& each : std::map<QByteArray, QByteArray>(mSeries)) {
            if (each.second != series)
                continue;
            delete mFile.takeImage(each.first);
            remove(each.first);
        }
    }

    /// What is shared among images is placed otherwise.
    void rearrange()
    {
        for (int i = any(5); i >= 0 && !mFile.isEmpty(); --i) {
            const QList<TagMap*> series = mFile.seriesByUID().values();
            const int chosen = any(series.size() + 1);
            TagMap& node = chosen < series.size() ? *series.at(chosen) : *mFile.study();
            any(2) == 0 ? node.optimize(mRandom.key()) : node.storeOptionA(mRandom.key());
            if (any(4) == 0)
                node.optimizeAll();
            if (any(4) == 0)
                node.detachItems();
            if (any(4) == 0)
                mFile.study()->relinkItems();
        }
    }

    void writeAndRead()
    {
        if (mSeries.empty())
            return;
        const QByteArray bytes = written(mFile);
        ASSERT_TRUE(read(mFile, bytes, "1.2"));
        EXPECT_EQ(written(mFile), bytes);
    }

    void addVolume()
    {
        const VolumeInfo info = anyVolume();
        expect(info);
        if (!mFile.isEmpty())
            addVolumes(mFile, {info});
    }

    /// The database lists all but a few images.
    void sync()
    {
        const auto study = std::make_shared<Kxg::DicomDirectoryEntry>();
        study->studyInstanceUID = "1.2";
        std::map<QByteArray, std::shared_ptr<Kxg::SeriesInfo>> infos;
        for (const auto& each : std::map<QByteArray, QByteArray>(mSeries)) {
            auto& info = infos[each.second];
            if (info == nullptr)
                info = std::make_shared<Kxg::SeriesInfo>();
            if (any(10) == 0)
                remove(each.first);
            else
                info->images.push_back({each.first, "/store/" + each.first});
        }
        for (const auto& each : infos) {
            study->entries.emplace_back();
            study->entries.back().seriesInstanceUID = each.first;
            study->entries.back().seriesInfo = each.second;
        }
        if (!mFile.isEmpty() && !infos.empty())
            mFile.syncWithDatabase(study);
    }

    void merge()
    {
        mFile.deleteEmptyNodes();
        if (mFile.isEmpty() || !mFile.writeCacheFile())
            return;
        TagFile arrivals;
        for (int i = 1 + any(any(2) == 0 ? 4 : 40); i > 0; --i) {
            const QByteArray uid = anyUID();
            const bool stays = mSeries.count(uid) != 0 && any(2) == 0;
            if (arrivals.findImage(uid) == nullptr)
                place(arrivals, uid, stays ? mSeries[uid] : anySeries());
        }
        ASSERT_TRUE(arrivals.mergeIntoCacheFile());
        EXPECT_EQ(found(arrivals), expected());
        ASSERT_TRUE(mFile.readCacheFileForStudy("1.2", false));
    }

    /// Another place in the order of images.
    void correct()
    {
        if (mFile.isEmpty() || !mFile.writeCacheFile())
            return;
        QAData job;
        job.studyUID = "1.2";
        job.images = {anyUID(), anyUID()};
        job.substitutions.append({DCM_InstanceNumber, QString::number(any(9))});
        QString message;
        ASSERT_TRUE(TagFile::applyQA(job, message)) << qPrintable(message);
        ASSERT_TRUE(mFile.readCacheFileForStudy("1.2", false));
    }

    static QByteArray lineOf(const QByteArray& series, const QByteArray& suffix)
    {
        return series + ' ' + suffix + ':';
    }

    std::string expected() const
    {
        QByteArray text;
        for (const auto& [suffix, stack] : mStacks) {
            QByteArray line;
            bool isSeen = false;
            for (const auto& [uid, frame] : stack.slices) {
                line += ' ' + uid + '/' + QByteArray::number(frame);
                isSeen = isSeen || !uid.isEmpty();
            }
            if (isSeen)
                text += lineOf(stack.series, suffix) + line + '\n';
        }
        for (const auto& [uid, shown] : mShown)
            text += "image " + uid + '\n' + QByteArray::fromStdString(shown);
        return text.toStdString();
    }

    static std::string found(const TagFile& file)
    {
        std::map<QByteArray, QByteArray> lines;
        int nodes = 0;
        for (auto it = file.seriesByUID().cbegin(); it != file.seriesByUID().cend(); ++it) {
            nodes += it.value()->children().size();
            for (const Volume* volume : it.value()->volumes()) {
                QByteArray line = lineOf(it.key(), volume->fileNameSuffix());
                for (int i = 0; i < volume->slices().size() && volume->numImages() > 0; ++i) {
                    int frame = 0;
                    const TagMap* image = volume->imageForSlice(i, frame);
                    line += ' ' + (image != nullptr ? image->uid(TagMap::ImageLevel) : QByteArray()) + '/' +
                            QByteArray::number(frame);
                }
                if (volume->numImages() > 0)
                    lines[volume->fileNameSuffix()] = line + '\n';
            }
        }
        EXPECT_EQ(nodes, file.imagesByUID().size());
        QByteArray text;
        for (const auto& each : lines)
            text += each.second;
        for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it) {
            if (it.key() != kNameless)
                text += "image " + it.key() + '\n' + QByteArray::fromStdString(shownOf(*it.value()));
        }
        return text.toStdString();
    }

    RandomImages mRandom{0};
    int mNumber = 10;  // of the last volume
    TagFile mFile;
    std::map<QByteArray, QByteArray> mSeries;  // by image
    std::map<QByteArray, Stack> mStacks;       // by suffix
    std::map<QByteArray, std::string> mShown;  // by image
};

TEST_F(StudyOperations, KeepWhatEveryImageShowsAndTheImageOfEverySliceThatIsThere)
{
    const LogCapture log;
    for (unsigned seed = 0; seed < kSeeds && !HasFailure(); ++seed) {
        build(seed);
        for (int i = 0; i < kSteps && !HasFailure(); ++i) {
            step();
            EXPECT_EQ(found(mFile), expected()) << "seed " << seed << " step " << i;
            TagFile again;
            const bool isHeld = mFile.isEmpty() || read(again, written(mFile));
            EXPECT_TRUE(isHeld);
            EXPECT_EQ(found(again), mFile.isEmpty() ? "" : expected()) << "seed " << seed << " step " << i;
        }
    }
}

}  // namespace
}  // namespace Kdd
