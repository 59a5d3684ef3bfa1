#pragma once

#include <QByteArray>

#include <kddlib/Catalogue.h>

#include <functional>

namespace Kdd::DicomWeb
{

/// A connection that changes the image database, of each thread that has something to change; opened with its first use,
/// which makes a database that is absent, and closed with the thread. May be used on any thread.
class ThreadCatalogue
{
public:
    explicit ThreadCatalogue(QByteArray address)
        : mAddress(std::move(address))
    {
    }

    /// Runs `work` with the thread's connection. Failure: there is none to be had, or that of `work`.
    Result ask(const std::function<Result(Kxg::Catalogue&)>& work) const;

private:
    const QByteArray mAddress;
};

}  // namespace Kdd::DicomWeb
