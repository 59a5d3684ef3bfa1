#include "server/Receiver.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/ServeRequest.h"
#include "tools/kdd/ServerSignals.h"
#include "tools/kdd/module/DimseOptions.h"
#include "tools/kdd/module/ServerRuns.h"

#include <QJsonObject>

#include <kddlib/LogFile.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

void tellAddress(const GlobalOptions& options, const Receiver& receiver)
{
    const QByteArray address = receiver.address().text();
    if (options.json)
        printJson({{QStringLiteral("dicom"), QString::fromLatin1(address)}});
    else
        std::printf("Associations at %s\n", address.constData());
    std::fflush(stdout);
}

}  // namespace

Outcome runReceive(const GlobalOptions& options, const DimseRequest& request)
{
    DimseOrder order;
    ObjectRules objects;
    if (!readDimse(request, order) || !readObjectRules(options, objects))
        return Outcome::WrongUsage;
    loadForLongRun();
    const ServerSignals received;
    Result result;
    const std::unique_ptr<Receiver> receiver =
        Receiver::make(*order.settings, order.audit, order.isDecided, objects, result);
    if (receiver != nullptr)
        result = receiver->start();
    if (result.bad()) {
        LogFile::errorf("Cannot receive: %s", qUtf8Printable(result.text()));
        return Outcome::Failed;
    }
    tellAddress(options, *receiver);
    received.awaitEnd(
        [&] { renewCertificate(receiver->hasCertificate(), [&] { return receiver->renewCertificate(); }); });
    receiver->stop();
    return Outcome::Done;
}

}  // namespace Kdd
