#include "server/dicomweb/store/ThreadCatalogue.h"

namespace Kdd::DicomWeb
{
namespace
{

/// A thread asks one database; a second one, as tests have it, takes the place of the first.
struct Connection
{
    QByteArray address;
    std::unique_ptr<Kxg::Catalogue> catalogue;
};

}  // namespace

Result ThreadCatalogue::ask(const std::function<Result(Kxg::Catalogue&)>& work) const
{
    thread_local Connection tConnection;
    Result result;
    if (tConnection.catalogue == nullptr || tConnection.address != mAddress)
        tConnection = {mAddress, Kxg::Catalogue::open(mAddress, result)};
    return tConnection.catalogue == nullptr ? result : work(*tConnection.catalogue);
}

}  // namespace Kdd::DicomWeb
