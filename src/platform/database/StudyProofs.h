#pragma once

#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

namespace Kxg
{

/// By what all bytes of a DICOM or volume file are known.
struct FileDigest
{
    QByteArray path;
    FileStamp stamp;    ///< of the file as it was registered
    QByteArray digest;  ///< SHA-256; empty: none was taken
    bool isVolume = false;
};

/// By what the tag file of a study is proven.
struct TagFileProofs
{
    bool isThere = false;
    bool hasImages = false;  ///< without any there is no tag file
    bool isWaiting = false;  ///< something changed since it was built
    TagFileStamp last;       ///< the one written last; size and time of the file as far as they are known
    std::vector<TagFileStamp> former;  ///< those before it, the latest first, at most kMostFormerTagFiles
};

/// So many tag files of a study are known beside the one written last.
constexpr int kMostFormerTagFiles = 32;

/// How far a look at the files of a study has come.
struct CheckedStudy
{
    QByteArray studyInstanceUID;
    QByteArray position;  ///< of the files up to this path; empty: not begun, or done
    int faults = 0;       ///< files found that are not as they should be
};

/// The right to look at files in the background. It ends with the object, and also when its process dies. The catalogue it
/// came from must outlive it; used by the thread of that.
class KDD_EXPORT CheckTurn
{
public:
    virtual ~CheckTurn() = default;
    CheckTurn(const CheckTurn&) = delete;
    CheckTurn& operator=(const CheckTurn&) = delete;

    /// Failure: it may be another process's by now.
    virtual Kdd::Result confirm() = 0;

protected:
    CheckTurn() = default;
};

}  // namespace Kxg
