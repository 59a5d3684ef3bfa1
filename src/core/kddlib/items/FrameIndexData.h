#pragma once

#include "kddlib/items/FrameIndex.h"
#include "platform/volume/FrameLayout.h"

namespace Kdd
{

/// What was found out of one file.
struct FrameIndex::Private
{
    QByteArray transferSyntaxUID;
    QByteArray studyInstanceUID;
    QByteArray sopInstanceUID;
    bool isExplicit = true;
    qint64 dataset = 0;  ///< where its first element begins

    FileStretch element;
    FileStretch value;
    DcmTagKey pixelKey;
    QByteArray pixelVr;
    bool isEncapsulated = false;

    int frames = 0;
    FrameLayout layout;
    Result layoutFault;  ///< why the layout does not count

    QVector<FileStretch> fragments;  ///< without the offset table
    QVector<int> firstFragments;     ///< of each frame; empty when that is not known
    bool sharesChroma = false;
};

/// MPEG-2, H.264 or HEVC.
bool isVideoSyntax(const QByteArray& uid);

/// Tells which fragments belong to which frame: by their number, by the offset tables, or else by where codestreams
/// begin. Tables that do not name the beginning of fragments are taken for none.
void assignFragments(MediaSource& file, const FileStretch& basicTable, const FileStretch& extendedTable,
                     FrameIndex::Private& found);

}  // namespace Kdd
