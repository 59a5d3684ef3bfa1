#include "server/dicomweb/Presence.h"

namespace Kdd::DicomWeb
{

Verdict verdictOn(Presence presence)
{
    switch (presence) {
    case Presence::Found:
        return {};
    case Presence::Absent:
        return {404, QStringLiteral("There is no such study")};
    case Presence::Unbuilt:
        return {503, QStringLiteral("The study waits to be built; ask again")};
    case Presence::Held:
        return {503, QStringLiteral("The study is being changed; ask again")};
    case Presence::Missing:
        return {500, QStringLiteral("The study's tag file is missing")};
    case Presence::Damaged:
        break;
    }
    return {500, QStringLiteral("The study's tag file is damaged")};
}

}  // namespace Kdd::DicomWeb
