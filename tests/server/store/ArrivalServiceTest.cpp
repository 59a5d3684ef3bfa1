#include "server/dicomweb/store/ArrivalService.h"

#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/Setting.h"
#include "support/TemporaryStore.h"

#include <QFile>

#include <gtest/gtest.h>
#include <kddlib/Kxg.h>
#include <kddlib/TagFile.h>

#include <future>
#include <thread>

using namespace Kdd;
using DicomWeb::ArrivalService;
using DicomWeb::Arrived;

namespace
{

/// What two servers over one store know of each other's objects. Neither brings anything in but when it is asked to.
class ArrivalServiceTest : public testing::Test
{
protected:
    ArrivalServiceTest()
    {
        Kxg::SetDatabaseServer(mAddress);
        mRules.folder = mStore.filePath("objects").toUtf8();
        mRules.freeBytes = 0;
    }

    std::unique_ptr<ArrivalService> make() const
    {
        Result result;
        auto service = ArrivalService::make(mRules, mAddress, result);
        EXPECT_TRUE(result.good()) << result.text().toStdString();
        return service;
    }

    QByteArray store(ArrivalService& service, const char* sopUID) const
    {
        const QByteArray bytes = anImage(sopUID).file();
        std::vector<std::unique_ptr<ObjectArrival>> arrivals;
        arrivals.push_back(service.store().begin());
        arrivals[0]->take(bytes.constData(), bytes.size());
        arrivals[0]->end();
        EXPECT_TRUE(service.database()
                        .ask([&](Kxg::Catalogue& catalogue) {
                            EXPECT_TRUE(service.store().commit(arrivals, catalogue).at(0).isStored());
                            return Result();
                        })
                        .good());
        return mRules.folder + "/1.2/1.2.3/" + sopUID + ".dcm";
    }

    std::unique_ptr<Kxg::StudyClaim> claim() const
    {
        std::unique_ptr<Kxg::StudyClaim> claimed;
        EXPECT_TRUE(mCatalogue->claim("1.2", 0, claimed).good());
        return claimed;
    }

    static int shown()
    {
        TagFile file;
        EXPECT_TRUE(file.readWhenFreeForStudy("1.2", false));
        return file.imagesByUID().size();
    }

    LogCapture mLog;
    TemporaryStore mStore;
    QByteArray mAddress = "sqlite:" + mStore.filePath("kdd.sqlite").toUtf8();
    ObjectRules mRules;
    Result mResult;
    std::unique_ptr<Kxg::Catalogue> mCatalogue = Kxg::Catalogue::open(mAddress, mResult);
};

TEST_F(ArrivalServiceTest, BringsInWhatCameToAnotherOneWhileItWasAtWork)
{
    const auto one = make();
    const auto other = make();
    store(*one, "1.2.3.1");
    ASSERT_EQ(one->bringIn("1.2"), Arrived::Brought);
    store(*one, "1.2.3.2");
    std::future<Arrived> first;
    std::future<Arrived> second;
    {
        // Whoever completes the study has looked at what there is to do, and waits for the tag file.
        TagFile held;
        ASSERT_TRUE(held.readWhenFreeForStudy("1.2", true));
        first = std::async(std::launch::async, [&] { return one->bringIn("1.2"); });
        while (claim() != nullptr)
            std::this_thread::yield();
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
        store(*other, "1.2.3.3");
        second = std::async(std::launch::async, [&] { return one->bringIn("1.2"); });
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    EXPECT_EQ(first.get(), Arrived::Brought);
    EXPECT_EQ(second.get(), Arrived::Brought);
    EXPECT_EQ(shown(), 3);
    EXPECT_EQ(other->bringIn("1.2"), Arrived::Brought) << "of what it knew itself";
    EXPECT_EQ(one->bringIn("1.2"), Arrived::Nothing);
}

TEST_F(ArrivalServiceTest, FindsWhatAnotherThreadBroughtInSinceTheFirstLook)
{
    const auto service = make();
    store(*service, "1.2.3.1");
    ASSERT_EQ(service->bringIn("1.2"), Arrived::Brought);
    store(*service, "1.2.3.2");
    bool isThere = false;
    const auto look = [&] {
        isThere = shown() == 2;
        service->bringIn("1.2");
        return isThere;
    };
    EXPECT_FALSE(isLackingAfter(look, "1.2", service.get()));
    EXPECT_TRUE(isThere);
}

TEST_F(ArrivalServiceTest, TellsWhetherItCanSoonBeHad)
{
    const Setting patience("KDD_READ_PATIENCE", "400");
    const auto one = make();
    const auto other = make();
    store(*one, "1.2.3.1");
    const QByteArray second = store(*one, "1.2.3.2");
    {
        const auto claimed = claim();
        ASSERT_NE(claimed, nullptr);
        EXPECT_EQ(other->bringIn("1.2"), Arrived::Held);
    }
    ASSERT_TRUE(QFile::rename(QString::fromUtf8(second), mStore.filePath("away")));
    EXPECT_EQ(other->bringIn("1.2"), Arrived::Stuck);
    EXPECT_EQ(shown(), 1) << "what can be had";
    EXPECT_EQ(make()->bringIn("1.2"), Arrived::Nothing) << "it has been tried";
    // Whatever comes is a reason to try again.
    store(*one, "1.2.3.3");
    EXPECT_EQ(make()->bringIn("1.2"), Arrived::Stuck);
    EXPECT_EQ(shown(), 2);
    ASSERT_TRUE(QFile::rename(mStore.filePath("away"), QString::fromUtf8(second)));
    EXPECT_EQ(one->bringIn("1.2"), Arrived::Brought);
    EXPECT_EQ(shown(), 3);
}

}  // namespace
