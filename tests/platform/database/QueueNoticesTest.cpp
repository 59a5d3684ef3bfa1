#include "platform/database/QueueNotices.h"

#include "DatabaseFixture.h"

#include <thread>

using namespace Kxg;

namespace
{

constexpr int kLong = 60'000;  // [ms]

class QueueNoticesTest : public DatabaseTest
{
protected:
    std::unique_ptr<QueueNotices> listen()
    {
        Kdd::Result result;
        auto notices = QueueNotices::open(parsedAddress(), mStop, result);
        EXPECT_EQ(result.text().toStdString(), "");
        return notices;
    }

    Kdd::WakeSignal mStop;
};

INSTANTIATE_TEST_SUITE_P(Engines, QueueNoticesTest, testing::Values(Engine::Postgres), engineName);

TEST_P(QueueNoticesTest, WorkIsHeardOfButNotWhatIsTakenCareOf)
{
    catalogue();
    const auto notices = listen();
    add({dicom("/d/1", "1", "1")});
    EXPECT_EQ(notices->await(0), QueueNotices::Heard::Nothing);
    ASSERT_TRUE(catalogue().requestBuild({"1", "1"}).good());
    EXPECT_EQ(notices->await(kLong), QueueNotices::Heard::Work);
    EXPECT_EQ(notices->await(0), QueueNotices::Heard::Nothing) << "once for a transaction";
    ASSERT_TRUE(catalogue().removeStudy("1").good());
    EXPECT_EQ(notices->await(kLong), QueueNotices::Heard::Work);
}

TEST_P(QueueNoticesTest, WaitingEndsWhenItIsToldToAndWhenTheServerGoes)
{
    catalogue();
    auto notices = listen();
    Kdd::stopPostgres();
    // The server says why before it goes.
    if (notices->await(kLong) == QueueNotices::Heard::Nothing) {
        EXPECT_EQ(notices->await(kLong), QueueNotices::Heard::Loss);
    }
    Kdd::startPostgres();
    notices = listen();
    std::thread other([this] { mStop.wake(); });
    EXPECT_EQ(notices->await(kLong), QueueNotices::Heard::Nothing);
    other.join();
}

}  // namespace
