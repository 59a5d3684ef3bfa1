#pragma once

#include "platform/os/RandomAccessFile.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrma.h>

#include <memory>

namespace Kdd
{

/// A local file as the source of a DCMTK input stream.
///
/// The parser asks for two to eight bytes at a time and after each for what is left. DCMTK's own producer hands every
/// such question to the C library, which takes up to a quarter of the time that a header takes to read; this one
/// answers from a window of the file.
class BufferedFileProducer : public DcmProducer
{
public:
    /// Opens the file; `status` tells when that fails.
    explicit BufferedFileProducer(const char* path);

    /// The same from byte `offset` (0-based) on, as long as the file is the one of `identity`; from the first read on
    /// that finds another, `status` says so.
    BufferedFileProducer(const char* path, qint64 offset, const FileIdentity& identity);

    const FileIdentity& identity() const { return mFile.identity(); }

    OFBool good() const override { return mStatus.good(); }
    OFCondition status() const override { return mStatus; }
    OFBool eos() override { return mPosition >= mFile.size(); }
    offile_off_t avail() override { return mFile.size() - mPosition; }
    offile_off_t read(void* bytes, offile_off_t count) override;
    offile_off_t skip(offile_off_t count) override;

    /// Any number of bytes down to the start of the file.
    void putback(offile_off_t count) override;

private:
    qint64 readFile(void* bytes, qint64 count);
    bool fillWindow();

    RandomAccessFile mFile;
    bool mMustNotChange = false;
    OFCondition mStatus;
    std::unique_ptr<char[]> mWindow;
    qint64 mWindowStart = 0;
    qint64 mWindowSize = 0;
    qint64 mPosition = 0;
};

}  // namespace Kdd
