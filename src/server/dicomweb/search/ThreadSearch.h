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

    /// Runs `work` with the thread's connection. One that was lost, because the server of the database was stopped
    /// meanwhile, is opened anew and the work done once more.
    Result ask(const std::function<Result(Kxg::StudySearch&)>& work) const;

private:
    const QByteArray mAddress;
};

}  // namespace Kdd::DicomWeb
