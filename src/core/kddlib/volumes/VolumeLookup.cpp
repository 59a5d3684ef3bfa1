#include "kddlib/volumes/VolumeLookup.h"

#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"

#include <algorithm>

namespace Kdd
{

namespace
{

/// What is known of the file that a volume came from: one without suffix may at least have been named.
QByteArray suffixOf(const Volume& volume)
{
    const QByteArray suffix = volume.fileNameSuffix();
    return suffix.isEmpty() ? Volume::fileNameSuffix(volume.volumeFileName().constData()) : suffix;
}

/// The number at the end of the suffix of a part; empty for others.
QByteArray partOf(const QByteArray& suffix)
{
    const QByteArray end = suffix.mid(suffix.lastIndexOf('_') + 1);
    const bool isNumber = std::all_of(end.begin(), end.end(), [](char c) { return c >= '0' && c <= '9'; });
    return suffix.contains('_') && isNumber ? end : QByteArray();
}

}  // namespace

Volume* volumeOfIndex(const TagMap& series, int index)
{
    for (Volume* volume : series.volumes()) {
        if (volume->volumeIndex() == index)
            return volume;
    }
    return nullptr;
}

Volume* volumeOfSuffix(const TagMap& series, const QByteArray& suffix, int index)
{
    Volume* found = nullptr;
    for (Volume* volume : series.volumes()) {
        if (suffix.isEmpty() || suffixOf(*volume) != suffix)
            continue;
        if (volume->volumeIndex() == index)
            return volume;
        if (found == nullptr)
            found = volume;
    }
    return found;
}

Volume* volumeOfFile(const TagMap& series, const QByteArray& name, int index)
{
    const QByteArray suffix = Volume::fileNameSuffix(name.constData());
    if (Volume* volume = volumeOfSuffix(series, suffix, index))
        return volume;
    Volume* volume = volumeOfIndex(series, index);
    if (volume == nullptr)
        return nullptr;
    const QByteArray known = suffixOf(*volume);
    return known.isEmpty() || partOf(known) == partOf(suffix) ? volume : nullptr;
}

}  // namespace Kdd
