#include "server/dicomweb/retrieve/PixelBody.h"

#include "server/http/MultipartWriter.h"

#include <kddlib/LogFile.h>

namespace Kdd::DicomWeb
{

namespace
{

Result readFrame(const FoundObject& object, int frame, const PixelForm& form, QByteArray& bytes)
{
    if (form.isStored)
        return object.index.readStored(*object.bytes, frame, bytes);
    if (form.transferSyntax == kExplicitLittleEndian)
        return object.index.readDecoded(*object.bytes, frame, bytes);
    return object.index.readEncoded(*object.bytes, frame, form.transferSyntax, bytes);
}

}  // namespace

Verdict damagedFrame(int frame, const Result& result)
{
    LogFile::errorf("Frame %d cannot be served: %s", frame + 1, qUtf8Printable(result.text()));
    return {500, QStringLiteral("Frame %1 cannot be read or is damaged").arg(frame + 1)};
}

PixelOffer pixelOfferOf(const FrameIndex& index, int frames)
{
    PixelOffer offer;
    // Bytes without compression are the same under both syntaxes, and only one of them is told.
    offer.transferSyntax = index.isEncapsulated() ? index.transferSyntaxUID() : kExplicitLittleEndian;
    offer.canDecode = index.canDecode();
    offer.canBeSingle = frames == 1;
    offer.encodings = index.encodings();
    return offer;
}

Verdict noSuitablePixels(const FrameIndex& index)
{
    const QString syntax = QString::fromLatin1(index.transferSyntaxUID());
    const QString type = QString::fromLatin1(mediaTypeOf(index.transferSyntaxUID()));
    QString decoded = index.canDecode() ? QStringLiteral(" or decoded as application/octet-stream")
                                        : QStringLiteral("; there is no decoder for them");
    for (const QByteArray& uid : index.encodings())
        decoded += QLatin1String(", ") + QString::fromLatin1(mediaTypeOf(uid) + "; transfer-syntax=" + uid);
    return {406,
            QStringLiteral("The pixels can be given as %1; transfer-syntax=%2%3").arg(type, syntax, decoded)};
}

Verdict appendFrame(const FoundObject& object, int frame, const PixelForm& form,
                    std::vector<Http::BodyPart>& body)
{
    QVector<FileStretch> stretches;
    const bool isInPlace = form.isStored && object.index.locate(frame, stretches).good();
    if (isInPlace) {
        object.bytes->append(stretches, body);
        return {};
    }
    QByteArray bytes;
    const Result read = readFrame(object, frame, form, bytes);
    if (read.bad())
        return damagedFrame(frame, read);
    body.emplace_back(bytes);
    return {};
}

Http::Response framesAsParts(const FoundObject& object, const QVector<int>& frames, const PixelForm& form)
{
    auto packing = std::make_unique<Http::MultipartWriter>(form.mediaType);
    Http::Response response;
    response.addHeader("Content-Type", packing->mediaType());
    // One frame is made at once, so that a damaged one gets its status; of several only one at a time is in memory.
    QVector<FileStretch> stretches;
    const bool isInPlace = form.isStored && object.index.locate(frames.first(), stretches).good();
    if (!isInPlace && frames.size() > 1) {
        response.body.emplace_back(
            std::make_unique<FramesProducer>(object, frames, form, std::move(packing)));
        return response;
    }
    for (int frame : frames) {
        response.body.emplace_back(packing->begin({}, form.contentType()));
        const Verdict appended = appendFrame(object, frame, form, response.body);
        if (appended.bad())
            return appended.response();
        response.body.emplace_back(packing->end());
    }
    response.body.emplace_back(packing->finish());
    return response;
}

Result FramesProducer::next(QByteArray& block)
{
    block.clear();
    if (mNext < mFrames.size()) {
        QByteArray frame;
        const int number = mFrames.at(mNext++);
        const Result read = readFrame(mObject, number, mForm, frame);
        if (read.bad())
            return read.within(QStringLiteral("Frame %1").arg(number + 1));
        block =
            mPacking == nullptr ? frame : mPacking->begin({}, mForm.contentType()) + frame + mPacking->end();
    }
    if (mNext == mFrames.size() && mPacking != nullptr) {
        block += mPacking->finish();
        mPacking = nullptr;
    }
    return {};
}

}  // namespace Kdd::DicomWeb
