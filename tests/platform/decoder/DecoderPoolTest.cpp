#include "DecoderFixture.h"
#include "support/Process.h"
#include "support/Setting.h"
#include "support/Threads.h"

#include <fcntl.h>

#include <atomic>
#include <thread>

using namespace Kdd;

namespace
{

using DecoderPools = Decoders;

DecoderLimits shortLimits()
{
    DecoderLimits limits;
    limits.start = std::chrono::milliseconds(300);
    limits.job = std::chrono::milliseconds(300);
    return limits;
}

const char* const kBroken = "The decoder gave an answer that cannot be and was ended";
const char* const kFalseFrame = "The decoder gave a frame that cannot be";

/// What a decoder does, and how what is said of it ends.
const std::pair<const char*, const char*> kFaults[] = {
    {"aborts", "It ended the decoder (signal 6)"},
    {"leaves", "It ended the decoder (status 7)"},
    {"half", "It ended the decoder (status 0)"},
    {"hangs", "The decoder was ended after 0.3 seconds"},
    {"never-ready", "it was not ready in time"},
    {"not-started", "it ended before it was ready (status 3)"},
    {"other-version", "it is of another version"},
    {"refuses", "it cannot be confined"},
    {"tells-unprintable", "a?b?[2Jc"},
    {"wide", kBroken},  // with it go more pixels than there can be
    {"negative", kFalseFrame},
    {"many-samples", kFalseFrame},
    {"other-type", kFalseFrame},
    {"no-type", kFalseFrame},
    {"other-colour", kFalseFrame},
    {"reduced", kFalseFrame},
    {"short-pixels", "The decoder gave 1 bytes of pixels"},
    {"long-pixels", kBroken},
    {"short-head", kFalseFrame},
    {"huge-head", kBroken},
    {"huge-data", kBroken},
    {"negative-data", kBroken},
    {"other-word", kBroken},
    {"wants", kBroken},
    {"wants-before", kBroken},
    {"wants-all", kBroken},
};

TEST_F(DecoderPools, OutliveEveryFaultOfADecoder)
{
    for (const auto& [what, reason] : kFaults) {
        const QByteArray program = falseDecoder(what);
        DecoderPool pool(program, shortLimits());
        for (int i = 0; i < 2; ++i) {
            const QString text = ask(pool).text();
            EXPECT_TRUE(text.endsWith(QLatin1String(reason))) << what << ": " << qPrintable(text);
        }
    }
}

TEST_F(DecoderPools, GiveAJobOnceMoreWhenItsDecoderDies)
{
    DecoderPool pool(falseDecoder("once-dead"));
    EXPECT_TRUE(ask(pool).good());
    EXPECT_TRUE(ask(pool).good());
    EXPECT_EQ(pool.count(), 1);
}

TEST_F(DecoderPools, TellWhenTheProgramIsNotThere)
{
    DecoderPool pool("/nowhere/kdd-decoder");
    EXPECT_STREQ(qPrintable(ask(pool).text()),
                 "The decoder /nowhere/kdd-decoder: it cannot be started: No such file or directory");
}

TEST_F(DecoderPools, HandNothingOver)
{
    const int open = ::open("/dev/null", O_RDONLY);  // not closed by a start
    const Setting password("KDD_TEST_PASSWORD", "secret");
    const Setting modules("KDD_MODULE_FOLDER", "/modules");
    qunsetenv("LD_LIBRARY_PATH");
    DecoderPool pool(falseDecoder("tells"));
    const QString text = ask(pool).text();
    EXPECT_FALSE(text.contains(QLatin1String("secret"))) << qPrintable(text);
    EXPECT_TRUE(text.contains(QLatin1String("KDD_MODULE_FOLDER=/modules "))) << qPrintable(text);
    // The socket, and two that lead nowhere.
    EXPECT_TRUE(text.endsWith(QLatin1String(" 3"))) << qPrintable(text);
    ::close(open);
}

TEST_F(DecoderPools, HaveNoMoreDecodersThanTheyMay)
{
    DecoderLimits limits;
    limits.count = 3;
    DecoderPool pool(falseDecoder("honest"), limits);
    std::atomic<int> good = 0;
    onThreads(12, [&](int /*thread*/) {
        for (int i = 0; i < 20; ++i) {
            good += ask(pool).good() ? 1 : 0;
            EXPECT_LE(pool.count(), 3);
        }
    });
    EXPECT_EQ(good, 240);
}

TEST_F(DecoderPools, EndDecodersThatHaveRestedOrWorkedForLong)
{
    DecoderLimits limits;
    limits.rest = limits.life = std::chrono::milliseconds(0);
    DecoderPool pool(falseDecoder("honest"), limits);
    EXPECT_TRUE(ask(pool).good());
    EXPECT_EQ(pool.count(), 0);
    EXPECT_FALSE(hasChild());
}

TEST_F(DecoderPools, AreNotSharedWithACopyOfTheProcess)
{
    DecoderPool pool(falseDecoder("honest"));
    ASSERT_TRUE(ask(pool).good());
    EXPECT_EQ(inChild([&] { return pool.count() == 1 && ask(pool).good() && pool.count() == 1; }), 1);
    EXPECT_TRUE(ask(pool).good());
}

/// All children of this process.
QList<pid_t> children()
{
    QFile file(QStringLiteral("/proc/self/task/%1/children").arg(::getpid()));
    file.open(QIODevice::ReadOnly);
    QList<pid_t> pids;
    for (const QByteArray& pid : file.readAll().simplified().split(' ')) {
        if (!pid.isEmpty())
            pids.append(pid.toInt());
    }
    return pids;
}

TEST_F(DecoderPools, TellOfADecoderThatIsKilledInTheMiddle)
{
    const QByteArray program = falseDecoder("killed");
    DecoderPool pool(program);
    std::atomic<bool> isDone = false;
    // Whoever ends processes for their memory ends the second one too.
    std::thread killer([&] {
        while (!isDone) {
            if (!QFile::exists(QFile::decodeName(program + ".was")))
                continue;
            for (const pid_t pid : children())
                ::kill(pid, SIGKILL);
        }
    });
    const QString text = ask(pool).text();
    isDone = true;
    killer.join();
    EXPECT_TRUE(text.endsWith(QLatin1String("(signal 9)"))) << qPrintable(text);
    EXPECT_EQ(pool.count(), 0);
}

TEST_F(DecoderPools, LeaveTheHostsSignalsAlone)
{
    static std::atomic<int> sPipes = 0;
    const auto pipe = std::signal(SIGPIPE, [](int /*signal*/) { ++sPipes; });
    // With this the system forgets children by itself.
    const auto child = std::signal(SIGCHLD, SIG_IGN);
    DecoderPool pool(falseDecoder("leaves"), shortLimits());
    EXPECT_TRUE(ask(pool).bad());
    DecoderPool honest(falseDecoder("honest"));
    EXPECT_TRUE(ask(honest).good());
    EXPECT_EQ(std::signal(SIGCHLD, child), SIG_IGN);
    std::signal(SIGPIPE, pipe);
    EXPECT_EQ(sPipes, 0);
}

}  // namespace
