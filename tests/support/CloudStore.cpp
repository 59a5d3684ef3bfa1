#include "support/CloudStore.h"

#include <QCryptographicHash>
#include <QRegularExpression>

namespace Kdd
{
namespace
{

constexpr int kGranularity = 262144;

/// As it should be after the bytes so far.
QByteArray progress(const QByteArray& bytes)
{
    return bytes.isEmpty()
               ? QByteArray("308 Resume Incomplete")
               : "308 Resume Incomplete\r\nRange: bytes=0-" + QByteArray::number(bytes.size() - 1);
}

QByteArray madeOf(const QByteArray& bytes)
{
    return "200 OK\r\nx-goog-stored-content-length: " + QByteArray::number(bytes.size()) +
           "\r\nx-goog-hash: md5=" + QCryptographicHash::hash(bytes, QCryptographicHash::Md5).toBase64();
}

}  // namespace

QByteArray CloudStore::object(const QByteArray& path) const
{
    const std::lock_guard lock(mMutex);
    for (const auto& [address, session] : mSessions) {
        if (session.isComplete && session.path == path)
            return session.bytes.isNull() ? QByteArray("") : session.bytes;
    }
    return {};
}

std::vector<QByteArray> CloudStore::complaints() const
{
    const std::lock_guard lock(mMutex);
    return mComplaints;
}

QByteArray CloudStore::complain(const QByteArray& about)
{
    mComplaints.push_back(about);
    return "400 Bad Request";
}

ScriptedServer::Reply CloudStore::serve(const QByteArray& request)
{
    const std::lock_guard lock(mMutex);
    const Fault fault = mFaults.empty() ? Fault() : mFaults.front();
    if (!mFaults.empty())
        mFaults.pop_front();
    const int headersEnd = request.indexOf("\r\n\r\n");
    const QByteArray headers = request.left(headersEnd + 4);
    const QByteArray body = request.mid(headersEnd + 4);
    const QByteArray path = request.mid(request.indexOf('/') + 1).split(' ').first();
    const auto session = mSessions.find(path);
    const bool isForUs = mServer.url("") == "http://" + headerOf(headers, "Host").toStdString() + "/" &&
                         headerOf(headers, "Cache-Control") == "no-transform";
    QByteArray answer;
    if (!isForUs || headerOf(headers, "Content-Length") != QByteArray::number(body.size()))
        answer = complain(headers);
    else if (request.startsWith("POST "))
        answer = fault.answer.isEmpty() ? start(path, headers) : QByteArray();
    else if (request.startsWith("PUT ") && session != mSessions.end())
        answer = takeBody(session->second, headerOf(headers, "Content-Range"), body, fault.takes);
    else
        answer = complain(headers);
    answer = fault.answer.isEmpty() ? answer : fault.answer;
    const char* const end = answer.contains("\r\n\r\n") ? "" : "\r\nConnection: close\r\n\r\n";
    return {fault.resets ? QByteArray() : "HTTP/1.1 " + answer + end, {}, fault.resets};
}

QByteArray CloudStore::start(const QByteArray& path, const QByteArray& headers)
{
    if (headerOf(headers, "x-goog-resumable") != "start")
        return complain(headers);
    const QByteArray address = "upload" + QByteArray::number(int(mSessions.size()));
    mSessions[address].path = path;
    return "201 Created\r\nLocation: " + QByteArray::fromStdString(mServer.url("")) + address;
}

QByteArray CloudStore::takeBody(Session& session, const QByteArray& range, const QByteArray& body, int takes)
{
    if (session.isComplete)
        return madeOf(session.bytes);
    static const QRegularExpression kForm(QStringLiteral("^bytes (?:(\\d+)-(\\d+)|\\*)/(\\d+|\\*)$"));
    const QRegularExpressionMatch match = kForm.match(QString::fromLatin1(range));
    const int first = body.isEmpty() ? session.bytes.size() : match.captured(1).toInt();
    const int end = first + body.size();
    const bool isLast = match.captured(3) != QLatin1String("*");
    const bool isRight = match.hasMatch() && match.captured(1).isEmpty() == body.isEmpty() &&
                         (body.isEmpty() || match.captured(2).toInt() == end - 1);
    if (!isRight || first > session.bytes.size())
        return complain(range);
    if (!isLast && !body.isEmpty() && end % kGranularity != 0)
        return complain(range + ", which does not end where a chunk may");
    // What is there already is passed over.
    session.bytes += body.mid(session.bytes.size() - first, qMax(0, takes));
    if (isLast && match.captured(3).toInt() != end)
        return complain(range + ", which does not end the object");
    session.isComplete = isLast && session.bytes.size() == end && takes == INT_MAX;
    return session.isComplete ? madeOf(session.bytes) : progress(session.bytes);
}

}  // namespace Kdd
