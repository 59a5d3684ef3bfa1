#pragma once

#include "server/dicomweb/search/StudySight.h"
#include "server/dicomweb/store/ArrivalService.h"
#include "server/dicomweb/store/StoreReport.h"
#include "server/http/MultipartReader.h"

#include <optional>

namespace Kdd::DicomWeb
{

/// How much of one request is taken. Each has an answer that tells of it.
struct StoreLimits
{
    qint64 requestBytes = qint64(64) << 30;
    int parts = 10000;
};

/// What is known of a request that brings objects before they come.
struct StoreOrder
{
    QByteArray id;        ///< of the request, for the log
    QByteArray root;      ///< address of DICOMweb
    QByteArray studyUID;  ///< that all are sent to; empty: each to its own
    QByteArray boundary;  ///< empty: the body is one object
    StoreReport::Form form = StoreReport::Form::Json;
    StudySight::Limits limits;  ///< of whoever sent it
};

/// Stores the objects of one request as they come, some at a time as soon as they are whole: what a request that breaks off
/// has brought by then stays.
class StoreBody final : public Http::BodySink, private Http::MultipartReader::Receiver
{
public:
    /// `arrivals` and `sight` outlive the object; `ended` is called with its end.
    StoreBody(ArrivalService& arrivals, const StudySight& sight, const StoreLimits& limits, StoreOrder order,
              std::function<void()> ended);
    ~StoreBody() override;

    bool take(const char* bytes, int size) override;
    Http::Response answer() override;
    std::optional<Http::Effect> effect() const override;

private:
    bool beginPart(const QVector<Http::Field>& headers) override;
    void takePart(const char* bytes, int size) override;
    void endPart() override;
    void commit();
    void add(const ArrivedObject& object);
    void note(const ArrivedObject& object);

    ArrivalService& mArrivals;
    const StudySight& mSight;
    const StoreLimits mLimits;
    const StoreOrder mOrder;
    const std::function<void()> mEnded;
    StoreReport mReport;
    Http::Effect mEffect;
    std::optional<Http::MultipartReader> mParts;
    std::unique_ptr<ObjectArrival> mObject;  // that is coming; null between parts, and of a part that is none
    std::vector<std::unique_ptr<ObjectArrival>> mWhole;  // that wait to be stored
    qint64 mWholeBytes = 0;
    int mCount = 0;
    qint64 mBytes = 0;
    bool mIsTooLarge = false;
};

}  // namespace Kdd::DicomWeb
