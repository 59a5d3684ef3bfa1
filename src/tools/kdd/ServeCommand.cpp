#include "tools/kdd/Commands.h"
#include "tools/kdd/ServeRequest.h"
#include "tools/kdd/ToolModule.h"

#include <memory>

namespace Kdd
{

namespace
{

Outcome runServe(const GlobalOptions& options, const ServeRequest& request)
{
    const ToolModule* module = toolModule();
    return module != nullptr ? module->serve(options, request) : Outcome::Failed;
}

}  // namespace

void declareServe(CommandSet& commands)
{
    const CommandText text = {
        "serve", kServing, "Answer DICOMweb requests over HTTP",
        "Runs until it is interrupted, and answers the requests in flight before it ends. It listens only "
        "where no other machine reaches it until --access says who may do what. What has no option here is a "
        "setting of the site, as each option is.",
        "kdd serve\n"
        "kdd serve --viewer viewer --public https://images.example.org\n"
        "kdd serve --dicom 11112                # and for modalities of this machine"};
    const auto request = std::make_shared<ServeRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runServe(options, *request); });
    arguments.text({"--listen", kListenAddress, "Where to wait for requests (default: 127.0.0.1:8042)"},
                   request->listen);
    arguments.text(
        {"--status", kListenAddress, "Where to answer /healthz, /readyz and /metrics (default: nowhere)"},
        request->status);
    arguments.path({"--access", "FILE|none", "Who may do what (default: all, from this machine only)"},
                   request->access);
    arguments.path({"--tls-cert", kFile, "Certificate and those above it, in PEM (default: no TLS)"},
                   request->certificate);
    arguments.path({"--tls-key", kFile, "The certificate's key, in PEM"}, request->key);
    arguments.number("--threads", 1, 1000, request->threads,
                     "Requests answered at a time (default: twice the processors, at least 4)");
    arguments.path({"--viewer", kFolder, "Folder of a viewer's files, served under /viewer"},
                   request->viewer);
    arguments.text({"--public", kUrl, "Address under which clients reach the server"},
                   request->publicAddress);
    arguments.flag("--stow", request->stow, "Take objects that clients send (STOW-RS)");
    request->dimse.addTo(arguments);
    arguments.flag("--corrections", request->corrections,
                   "Take corrections of what is stored, and moves between studies");
    arguments.flag("--deletions", request->deletions, "Delete studies, series and images when asked to");
    arguments.texts({"--host", "NAME", "Further name by which the server may be asked; may be repeated"},
                    request->hosts);
}

}  // namespace Kdd
