#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QString>
#include <QVector>

#include <dcmtk/dcmdata/dctagkey.h>

#include <memory>

namespace Kdd
{

class ByteRows;

/// Where the bytes of tag files go: which attributes of which nodes take how many of them, which the volumes, which the
/// previews, before and after compression. Of one file or of many together.
///
/// What an attribute takes after compression is read off the compressed body itself. With zlib, each literal counts for the
/// attribute that it stands in; the bits of a repetition count in equal parts for the bytes that it repeats, whatever
/// attributes these belong to, so that what is written once and repeated a thousand times is dear once and cheap a thousand
/// times. With LZMA the same is known to about a byte of the compressed body, which evens out over many values.
///
/// An object is used by one thread at a time.
class KDD_EXPORT ByteMap
{
public:
    /// What bytes are spent for.
    enum class Part {
        Study,  ///< attributes of a study's node, in items as well
        Series,
        Image,
        Volumes,         ///< the lists of volumes
        ImagePreviews,   ///< pictures that images name
        VolumePreviews,  ///< the other pictures
        Frame,           ///< head of the file, and what the compression needs for itself
        Unread,          ///< records that this release passes over
        LeftOver,        ///< behind the content, of a longer one that the file held before
    };

    struct Cost
    {
        qint64 entries = 0;  ///< how often it is there
        qint64 before = 0;   ///< compression [bytes], with keys, VRs and lengths
        qint64 after = 0;    ///< [bytes]
    };

    struct Entry
    {
        Part part;
        QVector<DcmTagKey>
            path;  ///< the sequences that lead to an attribute, and it; empty of what is no attribute
        Cost cost;
    };

    ByteMap();
    ~ByteMap();
    ByteMap(const ByteMap&) = delete;
    ByteMap& operator=(const ByteMap&) = delete;

    /// Adds the file at `path`; with `studyUID` not null only if it holds that study. While others write the file it is
    /// waited for as `TagFile::readWhenFree` does. On failure the map is as it was.
    Result addFile(const QString& path, const char* studyUID);

    /// Adds a file whose content is at hand. On failure, because its reader would refuse it, the map is as it was.
    Result add(const QByteArray& content);

    /// How many were added.
    int files() const;

    /// One for each part, in their order, then one for each attribute of each kind of node. An entry of Study, Series or Image without
    /// path stands for the nodes themselves: the heads of their records. Bytes after compression are rounded so that
    /// together they are the size of the files.
    QVector<Entry> entries() const;

private:
    Result addSound(const QByteArray& content);

    std::unique_ptr<ByteRows> mRows;
    int mFiles = 0;
};

}  // namespace Kdd
