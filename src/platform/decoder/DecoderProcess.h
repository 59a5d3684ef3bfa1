#pragma once

#include "platform/base/Result.h"
#include "platform/decoder/DecoderChannel.h"

#include <QByteArray>
#include <QString>

#include <sys/types.h>

#include <functional>
#include <memory>

namespace Kdd
{

/// What a decoder is started for: it loads the libraries of that and no others.
enum class DecoderKind { Frames, Videos, VolumeFiles };

/// The argument by which it is told.
const char* nameOf(DecoderKind kind);

/// What a decoder says, made fit for a line of the log.
QString readableText(const QByteArray& text);

/// What decoders may take.
struct DecoderLimits
{
    std::chrono::milliseconds start{30000};  ///< until it is ready
    std::chrono::milliseconds job{120000};   ///< for one job, without the time in which it waits for bytes
    std::chrono::milliseconds life{300000};  ///< for jobs in all: then another one takes its place
    std::chrono::milliseconds rest{60000};   ///< without a job
    int count = 0;                           ///< at a time; 0: as many as there are processors
};

/// One thing to be decoded.
struct DecoderJob
{
    DecoderMessage question;
    qint64 mostData = 0;  ///< of the answer [bytes]; with more it is none

    /// Where the decoder may read, if anywhere: up to `length` bytes from `offset` into `out`; how many, 0 at the end, -1
    /// on failure. Called on the thread of the job.
    std::function<qint64(qint64 offset, char* out, qint64 length)> source;
    qint64 mostRead = 0;  ///< there, in all [bytes]
};

/// A decoder that runs: a child of this process, which can do nothing but decode. What it says is not believed. One thread
/// at a time.
class DecoderProcess
{
public:
    enum class End {
        Answered,  ///< what it said is in the answer
        Died,      ///< and told nothing; it may have been for a job before this one
        Broken,    ///< it took too long, or said what cannot be; it does not live any more
    };

    /// Null, and `result` says why, when it cannot be started or cannot take away its own rights. `program` is its file.
    static std::unique_ptr<DecoderProcess> start(const QByteArray& program, DecoderKind kind,
                                                 const DecoderLimits& limits, Result& result);

    /// It ends at once. Of a process that was copied from this one by fork it is not ended, since it is not its child.
    ~DecoderProcess();
    DecoderProcess(const DecoderProcess&) = delete;
    DecoderProcess& operator=(const DecoderProcess&) = delete;

    /// `result` is what the decoder says of the job, or how it ended.
    End run(const DecoderJob& job, const DecoderLimits& limits, DecoderMessage& answer, Result& result);

    DecoderKind kind() const { return mKind; }
    pid_t pid() const { return mPid; }

    /// How long it has worked on jobs, and when it ended the last one.
    std::chrono::milliseconds worked() const { return mWorked; }
    DecoderChannel::Clock::time_point restsSince() const { return mRestsSince; }

private:
    DecoderProcess(DecoderKind kind, int socket);
    Result spawn(const QByteArray& program, int theirs);
    Result awaitReady(const DecoderLimits& limits);
    DecoderChannel::Outcome converse(const DecoderJob& job, DecoderMessage& answer);
    DecoderChannel::Outcome give(const DecoderJob& job, const QByteArray& wanted, qint64& left);
    QString end();

    DecoderKind mKind;
    int mSocket;
    DecoderChannel mChannel;
    pid_t mPid = -1;
    int mHandle = -1;  // of the process, since its number may be another's once it has ended
    pid_t mOwner;
    std::chrono::milliseconds mWorked{0};
    DecoderChannel::Clock::time_point mRestsSince = DecoderChannel::Clock::now();
};

}  // namespace Kdd
