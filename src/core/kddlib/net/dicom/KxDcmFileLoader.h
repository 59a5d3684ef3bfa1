#pragma once

#include "platform/base/Export.h"

#include <QtGlobal>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcfilefo.h>

#include <functional>
#include <string>

namespace Kdd
{

/// Reads a DICOM file from wherever its name leads: a local path, a URL of HTTP(S) or the cloud storage, or a path of
/// the storage servers that is fetched from them by HTTP.
///
/// As everywhere in the library, sequences that nest deeper than `kMaxItemDepth` items are refused while they are read.
/// The settings are those of the process and are to be made before several threads use the class; an object is used by
/// one thread at a time.
class KDD_EXPORT KxDcmFileLoader
{
public:
    /// How a name that is no URL is read.
    enum class Mode : quint32 {
        Default = 0,  ///< as the process-wide setting has it
        /// From the local file; values longer than the caller's bound stay there until asked for, and are refused then
        /// when the file is not the same any more.
        BoundedLocal = 1,
        WholeLocal = 2,    ///< from the local file, with all values
        StorageServer = 3  ///< a path of the storage servers by HTTP, any other as WholeLocal
    };

    /// Reads from the stream in place of DcmFileFormat::read, for instance only up to some attribute.
    using Reader = std::function<OFCondition(DcmInputStream& stream, Uint32 maxReadLength)>;

    explicit KxDcmFileLoader(Mode mode = Mode::Default);
    KxDcmFileLoader(const KxDcmFileLoader& other);
    KxDcmFileLoader& operator=(const KxDcmFileLoader& other);
    virtual ~KxDcmFileLoader();

    /// Reads the file. `maxReadLength` [bytes] counts for BoundedLocal only. What came before an error stays readable.
    ///
    /// Conditions: EC_InvalidStream, with the error logged, when a server refuses or cannot be reached; what the
    /// streams and DCMTK's parser report.
    OFCondition loadFile(const OFFilename& name, E_TransferSyntax syntax = EXS_Unknown,
                         E_GrpLenEncoding groupLength = EGL_noChange,
                         unsigned long maxReadLength = DCM_MaxReadLength,
                         E_FileReadMode readMode = ERM_autoDetect, const Reader& reader = {});

    /// The same into `file`, which the caller owns, with the syntax detected.
    static OFCondition loadFile(const char* name, DcmFileFormat& file, Mode mode,
                                unsigned long maxReadLength);

    // As the operations of DcmFileFormat. What the getters return belongs to this object, but for the dataset that is
    // removed, which belongs to the caller.
    OFCondition read(DcmInputStream& stream, E_TransferSyntax syntax = EXS_Unknown,
                     E_GrpLenEncoding groupLength = EGL_noChange,
                     unsigned long maxReadLength = DCM_MaxReadLength);
    OFCondition validateMetaInfo(E_TransferSyntax syntax, E_FileWriteMode writeMode = EWM_fileformat);
    DcmDataset* getDataset() { return mFile.getDataset(); }
    DcmDataset* getAndRemoveDataset() { return mFile.getAndRemoveDataset(); }
    DcmMetaInfo* getMetaInfo() { return mFile.getMetaInfo(); }

    /// Reads the values that were left in the file.
    OFCondition readUntilEnd();

    /// The mode that stands for Mode::Default, at first WholeLocal. Returns the one before; Mode::Default itself
    /// changes nothing.
    static Mode setDefaultMode(Mode mode);
    static Mode defaultMode();

    /// The port of the storage servers: what was set last, else the database's configuration value FFS2/Port, else
    /// "8181" with a warning. Null and empty: to be asked for again.
    static void setDefaultPort(const char* port);
    static const std::string& defaultPort();

    /// Sent to the storage servers as "Authorization: Bearer ..."; null or empty: nothing is sent.
    static void setBearerToken(const char* token);

    /// Makes a path of the storage servers, "/Storage/HOST/REST" or "//HOST/REST" with either separator, into
    /// "http://HOST:port/REST". Null and empty `port`: the default. False, with `url` as it was, for any other name.
    static bool convertPathToURL(std::string& url, const char* port);

    /// The URL of such a path by way of the own web service; empty for any other name.
    static std::string convertPathToExternalURL(const char* path);

private:
    Mode mMode;
    DcmFileFormat mFile;
};

/// Loads a file as the library itself does: in the process-wide mode once that was set, until then as BoundedLocal, with
/// long values staying in the file until they are asked for.
KDD_EXPORT OFCondition loadDicomFile(const char* name, DcmFileFormat& file);

}  // namespace Kdd
