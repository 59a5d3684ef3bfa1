#include "server/dicomweb/search/ThreadSearch.h"

#include <kddlib/LogFile.h>

namespace Kdd::DicomWeb
{
namespace
{

/// A thread asks one database; a second one, as tests have it, takes the place of the first.
struct Connection
{
    QByteArray address;
    std::unique_ptr<Kxg::StudySearch> search;
};

Result obtain(const QByteArray& address, Kxg::StudySearch*& search)
{
    thread_local Connection tConnection;
    Result result;
    if (tConnection.search == nullptr || tConnection.address != address)
        tConnection = {address, Kxg::StudySearch::open(address, result)};
    search = tConnection.search.get();
    return result;
}

}  // namespace

Result ThreadSearch::ask(const std::shared_ptr<const Kxg::StudyLimits>& limits,
                         const std::function<Result(Kxg::StudySearch&)>& work) const
{
    Kxg::StudySearch* search = nullptr;
    Result result = obtain(mAddress, search);
    if (result.good()) {
        search->limitTo(limits);
        result = work(*search);
    }
    // A connection that is lost is opened anew by the next transaction, so the one that noticed the loss tries again.
    if (result.bad() && search != nullptr)
        result = work(*search);
    if (result.bad())
        LogFile::errorf("%s", qUtf8Printable(result.text()));
    return result;
}

}  // namespace Kdd::DicomWeb
