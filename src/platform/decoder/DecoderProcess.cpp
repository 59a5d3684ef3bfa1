#include "platform/decoder/DecoderProcess.h"

#include "platform/os/SystemResult.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <utility>

namespace Kdd
{
namespace
{

using Outcome = DecoderChannel::Outcome;

constexpr int kMaxReason = 500;

// What a decoder is given of the environment: where libraries are, and how checkers of memory are set. Nothing else, for
// there may be passwords in it.
constexpr const char* kKept[] = {
    "KDD_MODULE_FOLDER=", "LD_LIBRARY_PATH=", "ASAN_OPTIONS=", "TSAN_OPTIONS=", "UBSAN_OPTIONS="};

/// The attributes and actions of a start, which have to be freed.
class Spawning
{
public:
    Spawning()
    {
        ::posix_spawnattr_init(&mAttributes);
        ::posix_spawn_file_actions_init(&mActions);
    }
    ~Spawning()
    {
        ::posix_spawnattr_destroy(&mAttributes);
        ::posix_spawn_file_actions_destroy(&mActions);
    }
    Spawning(const Spawning&) = delete;
    Spawning& operator=(const Spawning&) = delete;

    /// As if nobody had set any signals, in a group of its own, which what is typed at a terminal does not reach; with
    /// `socket` as its only descriptor.
    int prepare(int socket)
    {
        sigset_t all;
        sigset_t none;
        ::sigfillset(&all);
        ::sigemptyset(&none);
        ::posix_spawnattr_setsigdefault(&mAttributes, &all);
        ::posix_spawnattr_setsigmask(&mAttributes, &none);
        ::posix_spawnattr_setpgroup(&mAttributes, 0);
        ::posix_spawnattr_setflags(&mAttributes,
                                   POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETPGROUP);
        int error = ::posix_spawn_file_actions_adddup2(&mActions, socket, STDIN_FILENO);
        for (const int each : {STDOUT_FILENO, STDERR_FILENO}) {
            if (error == 0)
                error = ::posix_spawn_file_actions_addopen(&mActions, each, "/dev/null", O_WRONLY, 0);
        }
        return error != 0 ? error : ::posix_spawn_file_actions_addclosefrom_np(&mActions, STDERR_FILENO + 1);
    }

    int start(const QByteArray& program, const char* kind, pid_t& pid) const
    {
        std::vector<char*> kept;
        for (char** each = environ; each != nullptr && *each != nullptr; ++each) {
            for (const char* beginning : kKept) {
                if (std::strncmp(*each, beginning, std::strlen(beginning)) == 0)
                    kept.push_back(*each);
            }
        }
        kept.push_back(nullptr);
        QByteArray name = program;
        QByteArray argument = kind;
        char* arguments[] = {name.data(), argument.data(), nullptr};
        return ::posix_spawn(&pid, program.constData(), &mActions, &mAttributes,
                             static_cast<char**>(arguments), kept.data());
    }

private:
    posix_spawnattr_t mAttributes = {};
    posix_spawn_file_actions_t mActions = {};
};

}  // namespace

QString readableText(const QByteArray& text)
{
    QString readable = QString::fromUtf8(text.left(kMaxReason));
    for (QChar& each : readable) {
        if (!each.isPrint())
            each = QLatin1Char('?');
    }
    return readable;
}

const char* nameOf(DecoderKind kind)
{
    switch (kind) {
    case DecoderKind::Frames:
        break;
    case DecoderKind::Videos:
        return "videos";
    case DecoderKind::VolumeFiles:
        return "volume-files";
    }
    return "frames";
}

DecoderProcess::DecoderProcess(DecoderKind kind, int socket)
    : mKind(kind)
    , mSocket(socket)
    , mChannel(socket)
    , mOwner(::getpid())
{
}

std::unique_ptr<DecoderProcess> DecoderProcess::start(const QByteArray& program, DecoderKind kind,
                                                      const DecoderLimits& limits, Result& result)
{
    const QString context = QStringLiteral("The decoder %1").arg(QString::fromLocal8Bit(program));
    int sockets[2] = {-1, -1};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, static_cast<int*>(sockets)) != 0) {
        result = Result(SystemResult::of(errno)).within(context);
        return nullptr;
    }
    std::unique_ptr<DecoderProcess> process(new DecoderProcess(kind, sockets[0]));
    result = process->spawn(program, sockets[1]);
    ::close(sockets[1]);
    if (result.good())
        result = process->awaitReady(limits);
    result = result.within(context);
    return result.good() ? std::move(process) : nullptr;
}

Result DecoderProcess::spawn(const QByteArray& program, int theirs)
{
    Spawning spawning;
    int error = spawning.prepare(theirs);
    if (error == 0)
        error = spawning.start(program, nameOf(mKind), mPid);
    if (error != 0)
        return Result(SystemResult::of(error)).within(QStringLiteral("it cannot be started"));
    mHandle = static_cast<int>(::syscall(SYS_pidfd_open, mPid, 0));
    if (mHandle >= 0)
        return {};
    error = errno;
    ::kill(mPid, SIGKILL);
    ::waitpid(mPid, nullptr, 0);
    return Result(SystemResult::of(error)).within(QStringLiteral("it cannot be watched"));
}

Result DecoderProcess::awaitReady(const DecoderLimits& limits)
{
    mChannel.setDeadline(DecoderChannel::Clock::now() + limits.start);
    DecoderMessage said;
    const Outcome outcome = mChannel.receive(0, said);
    quint32 protocol = 0;
    if (outcome == Outcome::Done && said.word == DecoderWord::Ready && readFrom(said.head, protocol) &&
        protocol == kDecoderProtocol)
        return {};
    if (outcome == Outcome::Done && said.word == DecoderWord::Failed)
        return Result::failure(readableText(said.head));
    if (outcome == Outcome::Ended)
        return Result::failure(QStringLiteral("it ended before it was ready (%1)").arg(end()));
    return Result::failure(outcome == Outcome::Late ? QStringLiteral("it was not ready in time")
                                                    : QStringLiteral("it is of another version"));
}

/// What it had ended by, else the signal that ends it here: the first one counts.
QString DecoderProcess::end()
{
    QString how = QStringLiteral("nobody knows how");
    if (mHandle < 0)
        return how;
    // It is not this process's child: the handle is that of its parent.
    if (mOwner == ::getpid()) {
        (void)::syscall(SYS_pidfd_send_signal, mHandle, SIGKILL, nullptr, 0);
        siginfo_t info = {};
        int waited = 0;
        do
            waited = ::waitid(P_PIDFD, static_cast<id_t>(mHandle), &info, WEXITED);
        while (waited != 0 && errno == EINTR);
        // Where the host has its children forgotten, or waits for all of them, it is not told.
        if (waited == 0)
            how = info.si_code == CLD_EXITED ? QStringLiteral("status %1").arg(info.si_status)
                                             : QStringLiteral("signal %1").arg(info.si_status);
    }
    ::close(mHandle);
    mHandle = -1;
    return how;
}

DecoderProcess::~DecoderProcess()
{
    (void)end();
    ::close(mSocket);
}

DecoderProcess::End DecoderProcess::run(const DecoderJob& job, const DecoderLimits& limits,
                                        DecoderMessage& answer, Result& result)
{
    const auto began = DecoderChannel::Clock::now();
    mChannel.setDeadline(began + limits.job);
    const Outcome outcome = converse(job, answer);
    mRestsSince = DecoderChannel::Clock::now();
    mWorked += std::chrono::duration_cast<std::chrono::milliseconds>(mRestsSince - began);
    if (outcome == Outcome::Done) {
        result = answer.word == DecoderWord::Failed ? Result::failure(readableText(answer.head)) : Result();
        return End::Answered;
    }
    const QString how = end();
    if (outcome == Outcome::Ended) {
        result = Result::failure(QStringLiteral("It ended the decoder (%1)").arg(how));
        return End::Died;
    }
    result = Result::failure(
        outcome == Outcome::Late
            ? QStringLiteral("The decoder was ended after %1 seconds").arg(double(limits.job.count()) / 1000)
            : QStringLiteral("The decoder gave an answer that cannot be and was ended"));
    return End::Broken;
}

Outcome DecoderProcess::converse(const DecoderJob& job, DecoderMessage& answer)
{
    Outcome outcome = mChannel.send(job.question);
    qint64 left = job.mostRead;
    while (outcome == Outcome::Done) {
        outcome = mChannel.receive(job.mostData, answer);
        if (outcome != Outcome::Done || answer.word == DecoderWord::Done ||
            answer.word == DecoderWord::Failed)
            return outcome;
        if (answer.word != DecoderWord::Wanted || !answer.data.isEmpty())
            return Outcome::Nonsense;
        outcome = give(job, answer.head, left);
    }
    return outcome;
}

Outcome DecoderProcess::give(const DecoderJob& job, const QByteArray& wanted, qint64& left)
{
    WantedBytes range;
    if (!job.source || !readFrom(wanted, range) || range.offset < 0 || range.length < 0 ||
        range.length > kMaxWanted || left <= 0)
        return Outcome::Nonsense;
    DecoderMessage bytes;
    bytes.word = DecoderWord::Bytes;
    bytes.data = QByteArray(static_cast<int>(range.length), Qt::Uninitialized);
    const auto began = DecoderChannel::Clock::now();
    const qint64 count = job.source(range.offset, bytes.data.data(), range.length);
    // A slow disk or network is no fault of the decoder's.
    mChannel.setDeadline(*mChannel.deadline() + (DecoderChannel::Clock::now() - began));
    bytes.data.truncate(static_cast<int>(std::clamp<qint64>(count, 0, range.length)));
    left -= bytes.data.size();
    return mChannel.send(bytes);
}

}  // namespace Kdd
