#include "kddlib/items/FileNaming.h"

namespace Kdd
{

namespace
{

const char kExtension[] = ".dcm";
constexpr int kExtensionLength = 4;

/// The last separator of folders at or before `from`; -1 when there is none.
int lastSeparator(const QByteArray& path, int from)
{
    for (int i = from; i >= 0; --i) {
        if (path.at(i) == '/' || path.at(i) == '\\')
            return i;
    }
    return -1;
}

}  // namespace

bool extractUIDs(const char* path, QByteArray& sopUID, QByteArray& studyUID)
{
    sopUID.clear();
    studyUID.clear();
    const QByteArray text(path);
    if (text.size() < 6 || !text.endsWith(kExtension))
        return false;
    const int underscore = qMax(0, text.lastIndexOf('_', text.size() - kExtensionLength - 1));
    const int nameSeparator = qMax(0, lastSeparator(text, underscore - 1));
    if (nameSeparator < 1)
        return false;
    const int folderSeparator = lastSeparator(text, nameSeparator - 1);
    sopUID = text.mid(nameSeparator + 1, underscore - nameSeparator - 1);
    studyUID = text.mid(folderSeparator + 1, nameSeparator - folderSeparator - 1);
    return true;
}

QByteArray extractSuffix(const char* path)
{
    const QByteArray text(path);
    if (text.size() <= 5 || !text.endsWith(kExtension))
        return {};
    const QByteArray name = text.mid(lastSeparator(text, text.size() - 1) + 1);
    const QByteArray stem = name.left(name.size() - kExtensionLength);
    return stem.mid(stem.lastIndexOf('_') + 1);
}

}  // namespace Kdd
