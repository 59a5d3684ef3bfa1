#pragma once

#include "support/HttpServer.h"
#include "support/Setting.h"

#include <climits>
#include <deque>
#include <map>
#include <mutex>
#include <string>
#include <vector>

namespace Kdd
{

/// The cloud storage as an upload meets it: strict about all that is sent to it, and faulty on request. The storage's
/// hosts are set to this server while it lives.
class CloudStore
{
public:
    /// How one request is dealt with. By default as it should be.
    struct Fault
    {
        int takes = INT_MAX;     ///< so many bytes of the body are stored, and the object is not ended
        QByteArray answer = {};  ///< in place of its own: code, text, header lines; perhaps a body
        bool resets = false;     ///< no answer at all
    };

    /// For the next requests, one each; those after them meet no fault.
    void misbehave(const std::vector<Fault>& faults) { mFaults.assign(faults.begin(), faults.end()); }

    /// Null when there is none. The path has no "/" in front.
    QByteArray object(const QByteArray& path) const;

    /// What was sent but must not be.
    std::vector<QByteArray> complaints() const;

    std::vector<QByteArray> requests() const { return mServer.requests(); }
    std::string url(const std::string& path) const { return mServer.url(path); }

private:
    struct Session
    {
        QByteArray path;
        QByteArray bytes;
        bool isComplete = false;
    };

    ScriptedServer::Reply serve(const QByteArray& request);
    QByteArray start(const QByteArray& path, const QByteArray& headers);
    QByteArray takeBody(Session& session, const QByteArray& range, const QByteArray& body, int takes);
    QByteArray complain(const QByteArray& about);

    mutable std::mutex mMutex;
    std::deque<Fault> mFaults;
    std::map<QByteArray, Session> mSessions;  // by path of the request
    std::vector<QByteArray> mComplaints;
    ScriptedServer mServer{[this](const QByteArray& request) { return serve(request); }};
    Setting mApi{"KDD_CLOUD_API", mServer.url("")};
    Setting mUpload{"KDD_CLOUD_UPLOAD", mServer.url("")};
};

}  // namespace Kdd
