#pragma once

#include "server/http/Packing.h"

#include <vector>

namespace Kdd::Http
{

/// Makes a zip archive of files that are stored as they are, in one pass: sizes and checksums stand behind each file and
/// in the directory at the end. Files and archives beyond 4 GiB, and more than 65,535 files, have the form for large
/// archives.
class ZipStream : public Packing
{
public:
    QByteArray mediaType() const override { return "application/zip"; }

    /// `name` in letters of ASCII, parts separated by "/". It is taken as it is, so it must not climb.
    QByteArray begin(const QByteArray& name, const QByteArray& mediaType) override;
    void pass(const QByteArray& bytes) override;
    QByteArray end() override;
    QByteArray finish() override;

private:
    struct Entry
    {
        QByteArray name;
        quint64 offset = 0;  // of its local header
        quint64 size = 0;
        quint32 checksum = 0;
    };

    QByteArray counted(const QByteArray& bytes);
    static QByteArray directoryOf(const Entry& entry);

    std::vector<Entry> mEntries;
    quint64 mWritten = 0;
};

}  // namespace Kdd::Http
