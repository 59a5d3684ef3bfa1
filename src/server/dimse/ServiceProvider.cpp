#include "server/dimse/ServiceProvider.h"

#include <dcmtk/dcmdata/dctk.h>

namespace Kdd::Dimse
{

QByteArray ServiceProvider::chooseTransferSyntax(const QVector<QByteArray>& proposed) const
{
    for (const char* syntax :
         {UID_LittleEndianExplicitTransferSyntax, UID_LittleEndianImplicitTransferSyntax}) {
        if (proposed.contains(syntax))
            return syntax;
    }
    return {};
}

}  // namespace Kdd::Dimse
