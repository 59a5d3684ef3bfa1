#include "tools/kdd/Commands.h"
#include "tools/kdd/ServeRequest.h"
#include "tools/kdd/ToolModule.h"

#include <memory>

namespace Kdd
{

namespace
{

Outcome runReceive(const GlobalOptions& options, const DimseRequest& request)
{
    const ToolModule* module = toolModule();
    return module != nullptr ? module->receive(options, request) : Outcome::Failed;
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
