#include "kddlib/items/FileNaming.h"

#include <cstring>
#include <string_view>

namespace Kdd
{

namespace
{

constexpr std::string_view kExtension = ".dcm";
constexpr std::size_t kShortestPath = 6;

/// The path without its extension; false when it has another one.
bool removeExtension(const char* path, std::string_view& rest)
{
    rest = path != nullptr ? path : "";
    if (rest.size() < kShortestPath || rest.substr(rest.size() - kExtension.size()) != kExtension)
        return false;
    rest.remove_suffix(kExtension.size());
    return true;
}

bool isSeparator(char character)
{
    return character == '/' || character == '\\';
}

/// What stands behind the last separator of folders.
std::string_view lastName(std::string_view path)
{
    std::size_t start = path.size();
    while (start > 0 && !isSeparator(path[start - 1]))
        --start;
    return path.substr(start);
}

/// Into the memory that `to` has got already.
void assign(QByteArray& to, std::string_view from)
{
    to.resize(static_cast<int>(from.size()));
    std::memcpy(to.data(), from.data(), from.size());
}

}  // namespace

bool extractUIDs(const char* path, QByteArray& sopUID, QByteArray& studyUID)
{
    std::string_view rest;
    if (removeExtension(path, rest)) {
        // Without an underscore nothing is left, and nothing names no folder.
        const std::size_t underscore = rest.rfind('_');
        rest = rest.substr(0, underscore != std::string_view::npos ? underscore : 0);
        const std::string_view name = lastName(rest);
        rest.remove_suffix(name.size());
        // A separator alone is the root, which has no name to be a study's UID.
        if (rest.size() > 1) {
            rest.remove_suffix(1);
            assign(sopUID, name);
            assign(studyUID, lastName(rest));
            return true;
        }
    }
    sopUID.clear();
    studyUID.clear();
    return false;
}

void extractSuffix(const char* path, QByteArray& suffix)
{
    std::string_view rest;
    if (!removeExtension(path, rest)) {
        suffix.clear();
        return;
    }
    std::size_t start = rest.size();
    while (start > 0 && rest[start - 1] != '_' && !isSeparator(rest[start - 1]))
        --start;
    assign(suffix, rest.substr(start));
}

QByteArray extractSuffix(const char* path)
{
    QByteArray suffix;
    extractSuffix(path, suffix);
    return suffix;
}

}  // namespace Kdd
