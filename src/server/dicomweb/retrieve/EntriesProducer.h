#pragma once

#include "server/dicomweb/Verdict.h"
#include "server/dicomweb/retrieve/BodyBlocks.h"
#include "server/http/Packing.h"

#include <deque>
#include <functional>
#include <memory>
#include <vector>

namespace Kdd::DicomWeb
{

/// One of the bodies that an answer packs.
struct Entry
{
    QByteArray name;
    QByteArray mediaType;
    std::vector<Http::BodyPart> body;
};

/// Sends many bodies packed into one. They are made image by image as they are sent, so that no more than those of one
/// image take memory.
class EntriesProducer : public Http::Producer
{
public:
    /// Makes what is sent of the image of that number (0-based).
    using Maker = std::function<Verdict(int image, std::vector<Entry>& entries)>;

    EntriesProducer(int images, Maker make, std::unique_ptr<Http::Packing> packing)
        : mImages(images)
        , mMake(std::move(make))
        , mPacking(std::move(packing))
    {
    }

    Result next(QByteArray& block) override;

private:
    Result step(QByteArray& block);

    int mImages;
    Maker mMake;
    std::unique_ptr<Http::Packing> mPacking;
    int mNextImage = 0;
    std::deque<Entry> mEntries;         // of the present image, the first half sent perhaps
    std::unique_ptr<BodyBlocks> mBody;  // of the entry that has begun
    bool mIsFinished = false;
};

}  // namespace Kdd::DicomWeb
