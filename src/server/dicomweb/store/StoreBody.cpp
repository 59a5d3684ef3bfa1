#include "server/dicomweb/store/StoreBody.h"

#include "server/http/ContentType.h"

#include <kddlib/LogFile.h>

namespace Kdd::DicomWeb
{
namespace
{

/// So many objects, or as soon as they are so large, are stored at once: each time costs some waits for the disk.
constexpr std::size_t kMostAtATime = 50;
constexpr qint64 kBytesAtATime = 64 * 1024 * 1024;

QByteArray fieldOf(const QVector<Http::Field>& headers, const char* name)
{
    for (const Http::Field& field : headers) {
        if (field.name == name)
            return field.value;
    }
    return {};
}

/// Whether the part holds the bytes of an object as they are. Without a type it has that of the whole.
bool isObject(const QVector<Http::Field>& headers)
{
    const QByteArray type = Http::ContentType::parse(fieldOf(headers, "content-type")).name;
    const QByteArray coding = fieldOf(headers, "content-transfer-encoding").toLower();
    return (type.isEmpty() || type == "application/dicom" || type == "application/octet-stream") &&
           (coding.isEmpty() || coding == "binary" || coding == "8bit" || coding == "7bit");
}

ArrivedObject refused(ArrivalFault fault, const QString& reason)
{
    ArrivedObject object;
    object.fault = fault;
    object.reason = reason;
    return object;
}

}  // namespace

StoreBody::StoreBody(ArrivalService& arrivals, const StudySight& sight, const StoreLimits& limits,
                     StoreOrder order, std::function<void()> ended)
    : mArrivals(arrivals)
    , mSight(sight)
    , mLimits(limits)
    , mOrder(std::move(order))
    , mEnded(std::move(ended))
    , mReport(mOrder.root, mOrder.studyUID)
{
    if (mOrder.boundary.isEmpty())
        beginPart({});
    else
        mParts.emplace(mOrder.boundary, static_cast<Http::MultipartReader::Receiver&>(*this));
}

StoreBody::~StoreBody()
{
    mEnded();
}

bool StoreBody::take(const char* bytes, int size)
{
    mBytes += size;
    mIsTooLarge = mBytes > mLimits.requestBytes;
    if (mIsTooLarge)
        return false;
    if (mParts)
        return mParts->add(bytes, size);
    takePart(bytes, size);
    return true;
}

bool StoreBody::beginPart(const QVector<Http::Field>& headers)
{
    if (++mCount > mLimits.parts) {
        mIsTooLarge = true;
        return false;
    }
    if (isObject(headers))
        mObject = mArrivals.store().begin();
    else
        add(refused(ArrivalFault::NotDicom, QStringLiteral("The part is no application/dicom")));
    return true;
}

/// Of an object that cannot be taken the rest passes; committing tells why.
void StoreBody::takePart(const char* bytes, int size)
{
    mWholeBytes += size;
    if (mObject != nullptr)
        mObject->take(bytes, size);
}

void StoreBody::endPart()
{
    if (mObject == nullptr)
        return;
    mObject->end();
    mWhole.push_back(std::move(mObject));
    if (mWhole.size() >= kMostAtATime || mWholeBytes >= kBytesAtATime)
        commit();
}

void StoreBody::commit()
{
    std::vector<ArrivedObject> objects;
    const Result connected = mArrivals.database().ask([&](Kxg::Catalogue& catalogue) {
        objects = mArrivals.store().commit(mWhole, catalogue, mOrder.studyUID, [this](const TagMap& image) {
            return mSight.admits(mOrder.limits, image);
        });
        return Result();
    });
    if (connected.bad())
        objects.assign(mWhole.size(), refused(ArrivalFault::Failed, connected.text()));
    mWhole.clear();
    mWholeBytes = 0;
    for (const ArrivedObject& object : objects)
        add(object);
}

void StoreBody::add(const ArrivedObject& object)
{
    if (!object.isStored())
        LogFile::warnf("Request %s: object %s is not stored: %s", mOrder.id.constData(),
                       object.sopInstanceUID.isEmpty() ? "without name" : object.sopInstanceUID.constData(),
                       qUtf8Printable(object.reason));
    else if (!object.isKnown)
        note(object);
    mReport.add(object);
}

void StoreBody::note(const ArrivedObject& object)
{
    ++mEffect.images;
    if (!mEffect.studies.contains(object.studyUID))
        mEffect.studies.append(object.studyUID);
}

std::optional<Http::Effect> StoreBody::effect() const
{
    return mEffect.images > 0 ? std::make_optional(mEffect) : std::nullopt;
}

Http::Response StoreBody::answer()
{
    int badStatus = mIsTooLarge ? 413 : 0;
    if (!mParts && !mIsTooLarge)
        endPart();
    commit();
    // The part that was coming is not whole, and nobody may take it for stored.
    if (mObject != nullptr)
        add(refused(mIsTooLarge ? ArrivalFault::TooLarge : ArrivalFault::NotDicom,
                    QStringLiteral("The body ended before it was whole")));
    mObject.reset();
    if (mParts && !mParts->isComplete() && badStatus == 0)
        badStatus = 400;
    if (mParts && mReport.stored() + mReport.failed() == 0) {
        const QString reason = mParts->fault().isEmpty()
                                   ? QStringLiteral("The body has no part that came whole")
                                   : mParts->fault();
        return Http::failure(badStatus == 0 ? 400 : badStatus, reason);
    }
    return mReport.response(mOrder.form, badStatus);
}

}  // namespace Kdd::DicomWeb
