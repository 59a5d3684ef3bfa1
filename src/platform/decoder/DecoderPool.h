#pragma once

#include "platform/base/Result.h"
#include "platform/decoder/DecoderProcess.h"

#include <QByteArray>

#include <condition_variable>
#include <memory>
#include <mutex>
#include <vector>

namespace Kdd
{

/// The decoders of a process: started when there is a job and none is free, kept for the next one, ended when they have
/// rested, have worked for long, or say that something cannot be decoded. Each does one job at a time; threads wait where
/// all are at work. May be used on any thread.
///
/// In a process that was copied by fork it begins anew, so that parent and child do not talk to the same decoders.
class DecoderPool
{
public:
    /// With decoders of the file `program`.
    explicit DecoderPool(QByteArray program, const DecoderLimits& limits = {});

    /// The file kdd-decoder among the modules of the library, or where it should be.
    static QByteArray programOfProcess();

    /// The one of this process, with that program. A decoder that is not installed is the failure of each job.
    static DecoderPool& ofProcess();

    /// Has a job done. One that dies of it is replaced, and the job is given once more: what it died of may have been an
    /// earlier job, or somebody who ends processes for their memory. Failure: what the decoder says of the job, or that it
    /// ended ("It ended the decoder (signal 11)"), took too long, gave an answer that cannot be, or cannot be started.
    Result run(DecoderKind kind, const DecoderJob& job, DecoderMessage& answer);

    /// How many there are, those at work included.
    int count() const;

private:
    std::unique_ptr<DecoderProcess> lend(DecoderKind kind, Result& result);
    void takeBack(std::unique_ptr<DecoderProcess> process);
    void beginAnewAfterFork();

    const QByteArray mProgram;
    const DecoderLimits mLimits;
    const int mMost;
    mutable std::mutex mMutex;
    std::condition_variable mIsFree;
    std::vector<std::unique_ptr<DecoderProcess>> mIdle;  // the one that rests for the shortest time last
    int mCount = 0;
    pid_t mOwner;
};

}  // namespace Kdd
