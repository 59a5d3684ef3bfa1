#pragma once

#include <kddlib/StudySearch.h>

#include <functional>

namespace Kdd::DicomWeb
{

/// A connection to the image database of each thread that asks, opened with its first question and closed with the
/// thread. May be used on any thread.
class ThreadSearch
{
public:
    explicit ThreadSearch(QByteArray address)
        : mAddress(std::move(address))
    {
    }

    /// Runs `work` with the thread's connection, which finds studies within the limits of whoever asks and no others. One
    /// that was lost, because the server of the database was stopped meanwhile, is opened anew and the work done once more.
    Result ask(const std::shared_ptr<const Kxg::StudyLimits>& limits,
               const std::function<Result(Kxg::StudySearch&)>& work) const;

private:
    const QByteArray mAddress;
};

}  // namespace Kdd::DicomWeb
