#pragma once

#include "server/http/Request.h"

#include <memory>

namespace Kdd::Http
{

/// Makes requests of the bytes that a client sends: one after the other, as several may come at once.
class RequestReader
{
public:
    /// How much of one request is taken [bytes].
    struct Limits
    {
        unsigned header = 0;
        qint64 body = 0;  ///< of one that is let go
    };

    enum class State {
        Between,      ///< nothing of the next request is there
        Begun,        ///< more of it has to come
        AwaitsLeave,  ///< the client holds its body back until it is told to go on
        Headed,       ///< a request whose body is read by `readBody`
        Whole,
        Refused,  ///< nothing more can be read from this client
    };

    explicit RequestReader(Limits limits);
    ~RequestReader();

    void add(const char* bytes, int size);

    /// The same, without a copy where nothing else is unread.
    void add(const QByteArray& bytes);

    /// Goes on with what is there.
    State advance();

    /// The status that tells the client why it was refused, and what was understood before.
    int refusal() const { return mRefusal; }

    /// The request that is whole or has its header, or what is known of one that is not; without base, peer and id. The
    /// body of any but POST was read and let go. The next call of `advance` begins with the next request.
    Request take();

    enum class Body {
        Block,    ///< `count` bytes of it are there
        Awaited,  ///< more of it has to come
        AwaitsLeave,
        End,
        Malformed,
    };

    /// The next bytes of the body, until its end, of a request that is headed. They stay until the next call of anything.
    Body readBody(const char*& bytes, int& count);

    // Of the request that was taken last.

    /// Whether its sender wants the connection to stay.
    bool keepsConnection() const { return mKeepsConnection; }

    /// HTTP/1.0, whose bodies end with the connection where their length is not known.
    bool isOldVersion() const { return mIsOldVersion; }

    /// The host that the request is for, with its port where it names one. Never empty but for HTTP/1.0.
    const QByteArray& host() const { return mHost; }

private:
    struct Private;

    State refuse(int status);
    State understand();
    State letGo();

    Limits mLimits;
    std::unique_ptr<Private> d;
    Request mRequest;
    QByteArray mHost;
    qint64 mLetGo = 0;  // of the body
    int mRefusal = 0;
    bool mKeepsConnection = false;
    bool mIsOldVersion = false;
};

}  // namespace Kdd::Http
