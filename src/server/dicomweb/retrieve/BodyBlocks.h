#pragma once

#include "server/http/GzipEncoder.h"
#include "server/http/Response.h"

#include <deque>
#include <vector>

namespace Kdd::DicomWeb
{

/// Gives the bytes of a body block by block, wherever they are.
class BodyBlocks : public Http::Producer
{
public:
    explicit BodyBlocks(std::vector<Http::BodyPart> body);

    Result next(QByteArray& block) override;

private:
    Result takeFrom(Http::BodyPart& part, QByteArray& block, bool& isDone);

    std::deque<Http::BodyPart> mBody;  // what is left
};

/// Deflates a body on its way, without a frame around it, into an even number of bytes.
class DeflatedBody : public Http::Producer
{
public:
    explicit DeflatedBody(std::vector<Http::BodyPart> body)
        : mBlocks(std::move(body))
    {
    }

    Result next(QByteArray& block) override;

private:
    BodyBlocks mBlocks;
    Http::GzipEncoder mEncoder{Http::GzipEncoder::Frame::None};
    bool mIsOdd = false;
    bool mIsFinished = false;
};

}  // namespace Kdd::DicomWeb
