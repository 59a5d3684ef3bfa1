#pragma once

#include "server/http/Response.h"

#include <kddlib/Result.h>

namespace Kdd::Access
{

/// Under which addresses a server is reached.
struct AddressRules
{
    QByteArray publicAddress;  ///< "https://images.example.org/archive"; empty: as the client says
    QVector<QByteArray>
        hosts;  ///< names by which it may be asked, beside those of this machine and of that address
    QVector<QByteArray> proxies;  ///< numeric addresses of those who may say how a client reached them

    /// Whether they can be followed; the reason names the value that cannot. Brings the values into the form in which
    /// they are compared.
    Result normalise();
};

/// Lets only requests through that are meant for this server, and tells by which address it was reached.
///
/// A page of another origin can give its own name to the address of this machine, and then ask us as if we were its
/// server; but it cannot hide the name.
class AddressGuard : public Http::Handler
{
public:
    /// `rules` are normalised; `inner` outlives this.
    AddressGuard(const AddressRules& rules, Http::Handler& inner);

    /// 421 for another host.
    Http::Response answer(const Http::Request& request) override;

private:
    bool isMeant(const QByteArray& host) const;
    QByteArray baseOf(const Http::Request& request) const;

    AddressRules mRules;
    Http::Handler& mInner;
};

}  // namespace Kdd::Access
