#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

#include <iosfwd>
#include <memory>
#include <string>

namespace Kdd
{

class TagMap;

/// Writes the merged view of a node as one object of the DICOM JSON model, in UTF-8 and without the system's own
/// group 0006.
///
/// A value that the cache does not keep is written as {"vr": ..., "BulkDataURI": ...}; the address is `bulkDataRoot`,
/// "/" and the keys that lead to the value, with the 0-based item index after that of each sequence
/// ("root/00409096/0/00281051"). Texts that their character set cannot explain are decoded as `decodeText` does.
KDD_EXPORT void writeDicomJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot);

/// The same of the node's own entries only, and in sequences of the items' own. Markers that hide an inherited value
/// have no form in JSON and are left out; texts are decoded by the character set that the node shows, also where it
/// inherits that.
KDD_EXPORT void writeOwnDicomJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot);

/// In which form images are written.
enum class MetadataForm {
    Json,  ///< an object of the DICOM JSON model, as `writeDicomJson` does
    Xml,   ///< a document of the Native DICOM Model, with its XML declaration
};

/// Writes image after image of one study. What the images of a series share is written once and then copied, so that an
/// image costs little more than the values of its own. Series by series is the order that makes the most of it.
///
/// The study must outlive the object and not change while it is used. Used by the thread that uses the tree.
class KDD_EXPORT DicomImageWriter
{
public:
    /// With keys only these attributes of the images, with all that they hold, and always Specific Character Set and
    /// the UIDs of study, series and image.
    explicit DicomImageWriter(MetadataForm form, QVector<DcmTagKey> wanted = {});
    ~DicomImageWriter();
    DicomImageWriter(const DicomImageWriter&) = delete;
    DicomImageWriter& operator=(const DicomImageWriter&) = delete;

    /// Appends an image. `bulkDataRoot` is as for `writeDicomJson`.
    void append(QByteArray& out, const TagMap& image, const QByteArray& bulkDataRoot);

private:
    struct Private;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd
