#pragma once

#include <QtGlobal>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcostrma.h>

#include <functional>

namespace Kdd::Dimse
{

/// Hands on what DCMTK writes into it. Whoever takes the bytes never refuses them: the rest of what comes has to be read
/// either way.
class SinkStream : public DcmOutputStream
{
public:
    using Take = std::function<void(const char* bytes, qint64 count)>;

    explicit SinkStream(Take take)
        : DcmOutputStream(&mConsumer)
        , mConsumer(std::move(take))
    {
    }

private:
    class Consumer : public DcmConsumer
    {
    public:
        explicit Consumer(Take take)
            : mTake(std::move(take))
        {
        }

        OFBool good() const override { return OFTrue; }
        OFCondition status() const override { return EC_Normal; }
        OFBool isFlushed() const override { return OFTrue; }
        offile_off_t avail() const override { return kBlock; }
        offile_off_t write(const void* bytes, offile_off_t count) override
        {
            mTake(static_cast<const char*>(bytes), count);
            return count;
        }
        void flush() override {}

    private:
        static constexpr offile_off_t kBlock = 1 << 20;
        Take mTake;
    };

    Consumer mConsumer;
};

}  // namespace Kdd::Dimse
