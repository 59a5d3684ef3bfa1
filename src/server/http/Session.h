#pragma once

#include "server/http/Connection.h"
#include "server/http/Exchange.h"
#include "server/http/HttpSettings.h"
#include "server/http/RequestReader.h"
#include "server/http/ResponseWriter.h"
#include "server/http/WorkerThreads.h"

#include <atomic>
#include <optional>

namespace Kdd::Http
{

/// What the sessions of one server share.
struct SessionHost
{
    HttpSettings settings;
    Handler& handler;
    ExchangeObserver& observer;
    WorkerThreads& workers;
    WorkerThreads& receivers;
    std::atomic<bool> stops{false};
    std::atomic<int> answering{0};  ///< requests that are answered or wait for that
    std::atomic<int> inFlight{0};   ///< requests whose answers are not sent whole
};

/// One client's connection: reads requests one after the other, has each answered on a worker thread, and sends the
/// answers in that order.
///
/// It belongs to the thread of its I/O, but for the time in which a worker answers, sends or takes a body: then nothing
/// waits for the socket, and the worker hands the session back when it is done or the client takes, or sends, no more.
class Session : public std::enable_shared_from_this<Session>
{
public:
    /// `host` outlives it. `closed` is called once, on the thread of its I/O.
    Session(SessionHost& host, std::shared_ptr<Connection> connection, std::unique_ptr<Transport> transport,
            const QByteArray& peer, std::function<void(Session&)> closed);

    // On the thread of its I/O.

    void begin();

    /// Begins as one too many: the client is told, and that is all.
    void refuse();

    /// Ends the connection as soon as no request is being answered.
    void stop();

    /// Ends the connection; what a worker still does with it fails.
    void abort();

private:
    using Next = void (Session::*)();
    enum class Afterwards { Stay, Close };

    void wait(Connection::For what, Next next);
    void expire();
    void agree();
    void awaitRequest();
    void receive();
    void readOn();
    void tellToGoOn();
    void prepareRequest();
    void dispatch(bool hasBody);
    void answerAtOnce(Response response, Afterwards afterwards);
    void answer();
    void beginBody(Response response);
    void receiveOn();
    void receiveBody();
    void takeBody();
    void awaitBody();
    void endBody(Response response, Afterwards afterwards);
    bool isTooSlow() const;
    void write(Response response);
    void send();
    void sent(ResponseWriter::Step step);
    void sendOn();
    void finish();
    void report(bool isWhole);
    void reportBrokenOff();
    void closeSoftly();
    void drain();
    void close();

    SessionHost& mHost;
    std::shared_ptr<Connection> mConnection;
    std::unique_ptr<Transport> mTransport;
    std::function<void(Session&)> mClosed;
    RequestReader mReader;
    Request mRequest;
    QByteArray mPeer;
    QByteArray mCaller;             // of the request that is answered
    std::optional<Effect> mEffect;  // of that
    std::optional<ResponseWriter> mWriter;
    std::unique_ptr<BodySink> mSink;  // while a body is received
    QVector<Field> mHeaders;          // of the answer that it gives
    Clock::time_point mBodyBegan;
    qint64 mBodyBytes = 0;
    bool mHasBody = false;
    Clock::time_point mDeadline;
    Clock::time_point mBegan;  // of the request that is answered
    bool mIsRequest = false;   // something of a request has come that is not answered yet
    bool mIsWithWorker = false;
    bool mIsDraining = false;
    bool mIsRefused = false;  // the client may still send what nobody reads
    qint64 mDrained = 0;
};

}  // namespace Kdd::Http
