#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/RandomImages.h"
#include "support/TemporaryStore.h"
#include "support/TreeText.h"

#include <QDataStream>

#include <gtest/gtest.h>

#include <map>

using namespace Kdd;

namespace
{

/// A tag file, and beside it what each of its images showed when it stood alone.
class MergedView : public testing::TestWithParam<unsigned int>
{
protected:
    MergedView() { TagFile::setCompressionMode(static_cast<TagFile::CompressionMode>(GetParam() % 2)); }
    ~MergedView() override { TagFile::setCompressionMode(TagFile::CompressionMode::Zlib); }

    void step()
    {
        using Step = void (MergedView::*)();
        const Step steps[] = {&MergedView::add,      &MergedView::add,          &MergedView::take,
                              &MergedView::remove,   &MergedView::emptySeries,  &MergedView::merge,
                              &MergedView::optimize, &MergedView::writeAndRead, &MergedView::rearrange};
        (this->*steps[mRandom.below(int(std::size(steps)))])();
    }

    void expectUnchanged() const
    {
        std::string expected;
        std::string shown;
        for (const auto& [uid, text] : mExpected)
            expected += "image " + uid.toStdString() + '\n' + text;
        for (auto it = mFile->imagesByUID().cbegin(); it != mFile->imagesByUID().cend(); ++it)
            shown += "image " + it.key().toStdString() + '\n' + shownText(*it.value());
        ASSERT_EQ(shown, expected);
    }

private:
    QByteArray anyUID() { return "1.2.3." + QByteArray::number(mRandom.below(10)); }
    void add() { addTo(*mFile); }

    void addTo(TagFile& file)
    {
        const QByteArray uid = anyUID();
        TagMap* image = mRandom.next(uid);
        mExpected[uid] = shownText(*image);
        ASSERT_NE(file.addTagMap(image, nullptr, true), nullptr);
    }

    /// Takes an image out, perhaps to put it back.
    void take()
    {
        const QByteArray uid = anyUID();
        std::unique_ptr<TagMap> taken(mFile->takeImage(uid));
        ASSERT_EQ(taken != nullptr, mExpected.count(uid) == 1);
        if (taken == nullptr)
            return;
        ASSERT_EQ(shownText(*taken), mExpected[uid]);
        if (mRandom.oneIn(2))
            ASSERT_NE(mFile->addTagMap(taken.release(), nullptr, false), nullptr);
        else
            mExpected.erase(uid);
    }

    void remove()
    {
        const QByteArray uid = anyUID();
        const char* name = uid.constData();
        ASSERT_EQ(mFile->removeImages(1, &name), static_cast<int>(mExpected.erase(uid)));
    }

    /// Leaves a series without images in the tree, to be filled again.
    void emptySeries()
    {
        if (mFile->seriesByUID().isEmpty() || !mRandom.oneIn(4))
            return;
        const TagMap& series = *mFile->seriesByUID().first();
        while (!series.children().isEmpty()) {
            const TagMap& image = *series.children().at(mRandom.below(series.children().size()));
            const QByteArray uid = image.findElement(DCM_SOPInstanceUID)->value();
            delete mFile->takeImage(uid);
            mExpected.erase(uid);
        }
    }

    /// A random one of the study and the series.
    TagMap& node()
    {
        const QList<TagMap*> series = mFile->seriesByUID().values();
        const int chosen = mRandom.below(series.size() + 1);
        return chosen < series.size() ? *series.at(chosen) : *mFile->study();
    }

    void optimize()
    {
        if (mRandom.oneIn(4))
            mFile->optimizeAll();
        for (int i = mRandom.below(5); i >= 0 && !mFile->isEmpty(); --i)
            mRandom.oneIn(2) ? node().optimize(mRandom.key()) : node().optimizeAll();
    }

    void rearrange()
    {
        if (mFile->isEmpty())
            return;
        node().storeOptionA(mRandom.key());
        if (mRandom.oneIn(2))
            node().detachItems();
        if (mRandom.oneIn(2))
            mFile->study()->relinkItems();
    }

    static QByteArray bytesOf(TagFile& file)
    {
        QByteArray bytes;
        QDataStream out(&bytes, QIODevice::WriteOnly);
        return file.writeCacheFile(out) ? bytes : QByteArray();
    }

    void writeAndRead()
    {
        if (mExpected.empty())
            return;
        const QByteArray written = bytesOf(*mFile);
        auto again = std::make_unique<TagFile>();
        QDataStream in(written);
        ASSERT_TRUE(again->readCacheFile(in, "1.2"));
        ASSERT_EQ(bytesOf(*again), written);
        mFile.swap(again);
    }

    void merge()
    {
        if (mExpected.empty())
            return;
        ASSERT_TRUE(mFile->writeCacheFile());
        auto fresh = std::make_unique<TagFile>();
        for (int i = mRandom.below(4); i >= 0; --i)
            addTo(*fresh);
        ASSERT_TRUE(fresh->mergeIntoCacheFile());
        mFile.swap(fresh);
    }

    TemporaryStore mStore;
    RandomImages mRandom{GetParam()};
    std::unique_ptr<TagFile> mFile = std::make_unique<TagFile>();
    std::map<QByteArray, std::string> mExpected;
};

TEST_P(MergedView, OfEveryImageStaysWhateverHappensAroundIt)
{
    for (int i = 0; i < 300 && !HasFatalFailure(); ++i) {
        SCOPED_TRACE(i);
        step();
        expectUnchanged();
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, MergedView, testing::Range(1U, 13U));

}  // namespace
