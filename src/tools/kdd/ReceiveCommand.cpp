#include "server/Receiver.h"
#include "tools/kdd/DimseOptions.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/ServerSignals.h"

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

Outcome runReceive(const GlobalOptions& options, const DimseRequest& request)
{
    DimseOrder order;
    ObjectRules objects;
    if (!readDimse(request, order) || !readObjectRules(options, objects))
        return Outcome::WrongUsage;
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

}  // namespace

void declareReceive(CommandSet& commands)
{
    const CommandText text = {
        "receive", kServing, "Take objects from modalities over DICOM associations",
        "Runs until it is interrupted, and answers the messages that have begun before it ends. What serve "
        "--dicom does, without HTTP. It listens only where no other machine reaches it until --peers says "
        "who "
        "may have associations.",
        "kdd receive 11112\n"
        "kdd receive 11112 --title ARCHIVE"};
    const auto request = std::make_shared<DimseRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runReceive(options, *request); });
    arguments.text({"LISTEN", "PORT|ADDRESS:PORT", "Where to wait for associations", true}, request->listen);
    request->addRulesTo(arguments);
}

}  // namespace Kdd
