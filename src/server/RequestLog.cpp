#include "server/RequestLog.h"

#include "server/dicomweb/ResourcePath.h"

#include <QByteArrayList>

#include <kddlib/LogFile.h>

#include <algorithm>

namespace Kdd
{
namespace
{

constexpr int kLongestTarget = 1000;  // [bytes]

/// Resources by which requests are counted; what a client makes up is "other".
constexpr const char* kGroups[] = {"bulkdata",  "changefeed", "frames",   "instances", "metadata",
                                   "patients",  "pixeldata",  "rendered", "series",    "studies",
                                   "thumbnail", "volumes",    "wado"};

/// With the names of the parameters, but not what they are set to.
QByteArray withoutValues(const QByteArray& target)
{
    const int question = target.indexOf('?');
    if (question < 0)
        return target.left(kLongestTarget);
    QByteArrayList names;
    for (const QByteArray& pair : target.mid(question + 1).split('&'))
        if (const int equals = pair.indexOf('='); equals > 0)
            names.append(pair.left(equals));
    return (target.left(question) + '?' + names.join('&')).left(kLongestTarget);
}

}  // namespace

QByteArray RequestLog::groupOf(const QVector<QByteArray>& path) const
{
    if (path.isEmpty())
        return "page";
    if (path.mid(0, mPrefix.size()) != mPrefix)
        return path[0] == "viewer" || path[0] == "wado" ? path[0] : QByteArray("other");
    DicomWeb::ResourcePath resource;
    if (!DicomWeb::ResourcePath::parse(path.mid(mPrefix.size()), resource))
        return "other";
    if (resource.resource.isEmpty())
        return "objects";
    const bool isKnown = std::any_of(std::begin(kGroups), std::end(kGroups),
                                     [&](const char* each) { return resource.resource == each; });
    return isKnown ? resource.resource : "other";
}

void RequestLog::ended(const Http::Exchange& exchange)
{
    mMetrics.count(groupOf(exchange.request.path), exchange);
    const bool isFailed = exchange.status >= 500 || !exchange.fault.isEmpty();
    if (!isFailed && exchange.duration < mSlow)
        return;
    const auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(exchange.duration).count();
    const QByteArray line = exchange.request.id + ": " + nameOf(exchange.request.method) + ' ' +
                            withoutValues(exchange.request.target) + ' ' +
                            QByteArray::number(exchange.status) + ", " + QByteArray::number(exchange.bytes) +
                            " bytes, " + QByteArray::number(static_cast<qlonglong>(ms)) + " ms";
    if (!exchange.fault.isEmpty())
        LogFile::errorf("Request %s: broken off, %s", line.constData(), qUtf8Printable(exchange.fault));
    else if (isFailed)
        LogFile::errorf("Request %s", line.constData());
    else
        LogFile::warnf("Slow request %s", line.constData());
}

}  // namespace Kdd
