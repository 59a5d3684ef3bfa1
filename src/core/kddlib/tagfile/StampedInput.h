#pragma once

#include "platform/database/TagFileStamp.h"

#include <QCryptographicHash>
#include <QIODevice>

namespace Kdd
{

/// Passes on what is read from a tag file and takes its digest on the way: of just the bytes that its reader took, so
/// that those left over behind them from a longer earlier content do not count, and nothing is read twice.
class StampedInput : public QIODevice
{
public:
    /// `source` has to be open when it is read, and to outlive this.
    explicit StampedInput(QIODevice& source)
        : mSource(source)
    {
        open(ReadOnly | Unbuffered);
    }

    /// Of what was read until now.
    Kxg::TagFileStamp stamp() const { return {mSize, mDigest.result()}; }

    bool isSequential() const override { return true; }
    bool atEnd() const override { return mSource.atEnd(); }

protected:
    qint64 readData(char* bytes, qint64 wanted) override
    {
        const qint64 got = mSource.read(bytes, wanted);
        if (got > 0) {
            mDigest.addData(bytes, static_cast<int>(got));
            mSize += got;
        }
        return got;
    }
    qint64 writeData(const char* /*bytes*/, qint64 /*size*/) override { return -1; }

private:
    QIODevice& mSource;
    QCryptographicHash mDigest{QCryptographicHash::Md5};
    qint64 mSize = 0;
};

}  // namespace Kdd
