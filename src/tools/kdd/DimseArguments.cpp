#include "tools/kdd/ServeRequest.h"

namespace Kdd
{

void DimseRequest::addTo(ArgumentList& arguments)
{
    arguments.text(
        {"--dicom", "PORT|ADDRESS:PORT", "Where to wait for DICOM associations (default: nowhere)"}, listen);
    addRulesTo(arguments);
}

void DimseRequest::addRulesTo(ArgumentList& arguments)
{
    arguments.text(
        {"--title", "AE[,AE]", "Application entity titles it answers to, \"*\" for any (default: KDD)"},
        title);
    arguments.path(
        {"--peers", "FILE|none", "Who may have associations (default: all, from this machine only)"}, peers);
}

}  // namespace Kdd
