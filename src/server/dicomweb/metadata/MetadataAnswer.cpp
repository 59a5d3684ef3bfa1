#include "server/dicomweb/metadata/MetadataAnswer.h"

#include "server/http/GzipEncoder.h"

namespace Kdd::DicomWeb
{
namespace
{

// So few images are written faster than a file is opened, and their length is known before the first byte goes.
constexpr int kFew = 4;

// Of a block of text, with the image that goes beyond its end and what frames it; of a compressed one. Memory that is
// asked for anew for each block costs more than what is written into it.
constexpr int kPlainBlock = 96 * 1024;       // [bytes]
constexpr int kCompressedBlock = 16 * 1024;  // [bytes]

class PlainProducer : public Http::Producer
{
public:
    explicit PlainProducer(std::unique_ptr<MetadataText> text)
        : mText(std::move(text))
    {
    }

    Result next(QByteArray& block) override
    {
        block.resize(0);
        block.reserve(kPlainBlock);
        mText->next(block);
        return {};
    }

private:
    std::unique_ptr<MetadataText> mText;
};

class GzipProducer : public Http::Producer
{
public:
    GzipProducer(std::unique_ptr<MetadataText> text, KeptAnswers& kept, const QByteArray& name)
        : mText(std::move(text))
        , mKept(kept)
        , mName(name)
    {
    }

    Result next(QByteArray& block) override
    {
        // Nothing is begun for whoever asks for the head alone.
        if (!mIsBegun)
            mDraft = mKept.begin(mName);
        mIsBegun = true;
        block.resize(0);
        block.reserve(3 * kCompressedBlock);
        // An empty block would be the end, and a small one is not worth sending: other texts follow.
        while (block.size() < kCompressedBlock && !mIsEnded) {
            mPlain.resize(0);
            mPlain.reserve(kPlainBlock);
            mIsEnded = !mText->next(mPlain);
            if (mIsEnded)
                mEncoder.finish(block);
            else
                mEncoder.add(mPlain, block);
        }
        if (mDraft != nullptr)
            mDraft->write(block);
        if (mDraft != nullptr && mIsEnded) {
            mDraft->keep();
            mDraft.reset();
        }
        return {};
    }

private:
    std::unique_ptr<MetadataText> mText;
    KeptAnswers& mKept;
    QByteArray mName;
    Http::GzipEncoder mEncoder;
    QByteArray mPlain;
    std::unique_ptr<KeptAnswers::Draft> mDraft;
    bool mIsBegun = false;
    bool mIsEnded = false;
};

QByteArray wholeBody(MetadataText& text, bool takesGzip)
{
    QByteArray plain;
    while (text.next(plain)) {
    }
    return takesGzip ? Http::gzipped(plain) : plain;
}

}  // namespace

void addBody(Http::Response& response, std::unique_ptr<MetadataText> text, bool takesGzip, KeptAnswers& kept,
             const QByteArray& name)
{
    if (text->count() <= kFew)
        response.body.emplace_back(wholeBody(*text, takesGzip));
    else if (takesGzip)
        response.body.emplace_back(std::make_unique<GzipProducer>(std::move(text), kept, name));
    else
        response.body.emplace_back(std::make_unique<PlainProducer>(std::move(text)));
}

}  // namespace Kdd::DicomWeb
