#pragma once

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrma.h>

namespace Kdd
{

/// Another's stream, to be read under a guard of ours. That stream moves on as if the parser read from it itself.
class ForwardedStream : public DcmInputStream
{
public:
    /// `inner` must outlive this object.
    explicit ForwardedStream(DcmInputStream& inner)
        : DcmInputStream(nullptr)
        , mInner(inner)
    {
    }

    OFBool good() const override { return mInner.good(); }
    OFCondition status() const override { return mInner.status(); }
    OFBool eos() override { return mInner.eos(); }
    offile_off_t avail() override { return mInner.avail(); }
    offile_off_t read(void* to, offile_off_t count) override { return mInner.read(to, count); }
    offile_off_t skip(offile_off_t count) override { return mInner.skip(count); }
    offile_off_t tell() const override { return mInner.tell(); }
    OFCondition installCompressionFilter(E_StreamCompression kind) override
    {
        return mInner.installCompressionFilter(kind);
    }
    DcmInputStreamFactory* newFactory() const override { return mInner.newFactory(); }
    void mark() override { mInner.mark(); }
    void putback() override { mInner.putback(); }

private:
    DcmInputStream& mInner;
};

}  // namespace Kdd
