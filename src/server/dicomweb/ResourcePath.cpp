#include "server/dicomweb/ResourcePath.h"

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

constexpr int kLongestUID = 64;

}  // namespace

bool isUID(const QByteArray& text)
{
    const auto isAllowed = [](char each) {
        return (each >= '0' && each <= '9') || (each >= 'A' && each <= 'Z') || (each >= 'a' && each <= 'z') ||
               each == '.' || each == '-' || each == '_';
    };
    return !text.isEmpty() && text.size() <= kLongestUID && std::all_of(text.begin(), text.end(), isAllowed);
}

bool ResourcePath::parse(const QVector<QByteArray>& segments, ResourcePath& path)
{
    path = {};
    // The name of each level, and where its UID goes. A level without UID behind it is a search of that level.
    const struct
    {
        const char* name;
        QByteArray* uid;
    } levels[] = {{"studies", &path.study}, {"series", &path.series}, {"instances", &path.instance}};

    int at = 0;
    for (const auto& level : levels) {
        if (at + 1 >= segments.size() || segments[at] != level.name)
            break;
        if (!isUID(segments[at + 1]))
            return false;
        *level.uid = segments[at + 1];
        at += 2;
    }
    if (at < segments.size())
        path.resource = segments[at++];
    path.rest = segments.mid(at);
    return at > 0;
}

}  // namespace Kdd::DicomWeb
