#include "server/http/Session.h"

#include "server/http/RequestId.h"

#include <kddlib/LogFile.h>
#include <sys/socket.h>

namespace Kdd::Http
{
namespace
{

constexpr int kReadBlock = 16 * 1024;  // [bytes]

/// A client that was refused while it still sends would lose the answer if the connection were closed under it. It may go
/// on for a little, and for so much.
constexpr auto kDrainTime = std::chrono::seconds(5);
constexpr qint64 kDrainBytes = 64 * 1024 * 1024;
constexpr int kDrainBlocks = 64;  // between two looks at other connections

Response busy(const QString& reason)
{
    Response response = failure(503, reason);
    response.addHeader("Retry-After", "1");
    return response;
}

QString reasonFor(int status)
{
    switch (status) {
    case 408:
        return QStringLiteral("The request did not come in time");
    case 413:
        return QStringLiteral("The body is too large");
    case 431:
        return QStringLiteral("The header is too large");
    case 505:
        return QStringLiteral("Only HTTP/1.0 and HTTP/1.1 are spoken here");
    default:
        return QStringLiteral("This is no request of HTTP/1.1");
    }
}

}  // namespace

Session::Session(SessionHost& host, std::shared_ptr<Connection> connection,
                 std::unique_ptr<Transport> transport, const QByteArray& peer,
                 std::function<void(Session&)> closed)
    : mHost(host)
    , mConnection(std::move(connection))
    , mTransport(std::move(transport))
    , mClosed(std::move(closed))
    , mReader({host.settings.headerBytes, host.settings.bodyBytes})
    , mPeer(peer)
{
}

void Session::begin()
{
    mDeadline = Clock::now() + mHost.settings.patience;
    agree();
}

void Session::refuse()
{
    answerAtOnce(busy(QStringLiteral("There are too many connections")), Afterwards::Close);
}

void Session::stop()
{
    if (!mIsWithWorker && !mWriter && !mSink)
        close();
}

void Session::abort()
{
    if (mIsWithWorker)
        ::shutdown(mConnection->descriptor(), SHUT_RDWR);
    else
        close();
}

void Session::wait(Connection::For what, Next next)
{
    mConnection->wait(what, mDeadline, [self = shared_from_this(), next](Connection::Waited waited) {
        if (waited == Connection::Waited::Ready)
            (self.get()->*next)();
        else if (waited == Connection::Waited::Expired)
            self->expire();
    });
}

void Session::expire()
{
    if (mWriter) {
        close();
    } else if (mSink) {
        mIsWithWorker = true;
        endBody(failure(408, reasonFor(408)), Afterwards::Close);
    } else if (mIsRequest && !mIsDraining) {
        answerAtOnce(failure(408, reasonFor(408)), Afterwards::Close);
    } else {
        close();
    }
}

void Session::agree()
{
    switch (mTransport->begin()) {
    case Transport::Outcome::Done:
        receive();
        break;
    case Transport::Outcome::WantsRead:
        wait(Connection::For::Reading, &Session::agree);
        break;
    case Transport::Outcome::WantsWrite:
        wait(Connection::For::Writing, &Session::agree);
        break;
    default:
        close();
        break;
    }
}

void Session::awaitRequest()
{
    mDeadline = Clock::now() + mHost.settings.idle;
    readOn();
}

/// Takes what has come.
void Session::receive()
{
    char bytes[kReadBlock];
    while (true) {
        int count = 0;
        switch (mTransport->read(bytes, kReadBlock, count)) {
        case Transport::Outcome::Done:
            break;
        case Transport::Outcome::WantsRead:
            wait(Connection::For::Reading, &Session::receive);
            return;
        case Transport::Outcome::WantsWrite:
            wait(Connection::For::Writing, &Session::receive);
            return;
        default:
            close();
            return;
        }
        mReader.add(bytes, count);
        // The next wait tells of what else has come, but for what the transport keeps.
        if (!mTransport->hasUnread())
            break;
    }
    readOn();
}

/// Reads the next request of what was received.
void Session::readOn()
{
    const bool isNew = !mIsRequest;
    const RequestReader::State state = mReader.advance();
    mIsRequest = state != RequestReader::State::Between;
    if (isNew && mIsRequest)
        mDeadline = Clock::now() + mHost.settings.patience;
    switch (state) {
    case RequestReader::State::AwaitsLeave:
        tellToGoOn();
        [[fallthrough]];
    case RequestReader::State::Between:
    case RequestReader::State::Begun:
        wait(Connection::For::Reading, &Session::receive);
        break;
    case RequestReader::State::Headed:
        dispatch(true);
        break;
    case RequestReader::State::Whole:
        dispatch(false);
        break;
    case RequestReader::State::Refused:
        prepareRequest();
        answerAtOnce(failure(mReader.refusal(), reasonFor(mReader.refusal())), Afterwards::Close);
        break;
    }
}

/// A client that gets no leave goes on after a second of its own accord, so that this may fail.
void Session::tellToGoOn()
{
    static const QByteArray kGoOn = "HTTP/1.1 100 Continue\r\n\r\n";
    qint64 count = 0;
    mTransport->write(kGoOn.constData(), kGoOn.size(), Transport::More::No, count);
}

void Session::prepareRequest()
{
    mBegan = Clock::now();
    mRequest = mReader.take();
    mCaller.clear();
    mRequest.peer = mPeer;
    mRequest.isEncrypted = qstrcmp(mTransport->scheme(), "https") == 0;
    mRequest.certificate = mTransport->peerName();
    mRequest.id = requestId(mRequest.header("x-request-id"));
    mRequest.base = QByteArray(mTransport->scheme()) + "://" +
                    (mReader.host().isEmpty() ? mHost.settings.address.text() : mReader.host());
}

void Session::dispatch(bool hasBody)
{
    prepareRequest();
    mHasBody = hasBody;
    if (++mHost.answering > mHost.settings.requests) {
        --mHost.answering;
        answerAtOnce(busy(QStringLiteral("There are too many requests")),
                     hasBody ? Afterwards::Close : Afterwards::Stay);
        return;
    }
    mIsWithWorker = true;
    ++mHost.inFlight;
    // What brings a body is answered where that is taken.
    (hasBody ? mHost.receivers : mHost.workers).run([self = shared_from_this()] { self->answer(); });
}

/// Without a worker: what is sent is in memory.
void Session::answerAtOnce(Response response, Afterwards afterwards)
{
    if (mRequest.id.isEmpty())
        prepareRequest();
    mIsRefused = afterwards == Afterwards::Close;
    ++mHost.inFlight;
    mIsWithWorker = true;
    write(std::move(response));
}

/// On a worker or receiver, as all that follows up to `sent`.
void Session::answer()
{
    Response response;
    try {
        response = mHost.handler.answer(mRequest);
    } catch (const std::exception& fault) {
        LogFile::errorf("Request %s failed: %s", mRequest.id.constData(), fault.what());
        response = failure(500, QStringLiteral("The request failed"));
    }
    mCaller = response.caller;
    --mHost.answering;
    if (!mHasBody) {
        write(std::move(response));
        return;
    }
    beginBody(std::move(response));
}

void Session::write(Response response)
{
    ResponseForm form;
    form.isHead = mRequest.method == Method::Head;
    form.isOldVersion = mReader.isOldVersion();
    form.keepsConnection = mReader.keepsConnection() && !mIsRefused && !mHost.stops;
    form.id = mRequest.id;
    mEffect = response.effect;
    mWriter.emplace(std::move(response), form);
    send();
}

void Session::send()
{
    const ResponseWriter::Step step = mWriter->send(*mTransport);
    if (step == ResponseWriter::Step::Yields)
        mHost.workers.run([self = shared_from_this()] { self->send(); });
    else
        mConnection->post([self = shared_from_this(), step] { self->sent(step); });
}

/// Back on the thread of the I/O.
void Session::sent(ResponseWriter::Step step)
{
    mIsWithWorker = false;
    mDeadline = Clock::now() + mHost.settings.patience;
    switch (step) {
    case ResponseWriter::Step::WantsRead:
        wait(Connection::For::Reading, &Session::sendOn);
        break;
    case ResponseWriter::Step::WantsWrite:
        wait(Connection::For::Writing, &Session::sendOn);
        break;
    case ResponseWriter::Step::Sent:
        finish();
        break;
    default:
        close();
        break;
    }
}

void Session::sendOn()
{
    mIsWithWorker = true;
    mHost.workers.run([self = shared_from_this()] { self->send(); });
}

void Session::finish()
{
    const bool keepsConnection = mWriter->keepsConnection();
    report(true);
    mIsRequest = false;
    if (mIsRefused) {
        closeSoftly();
    } else if (!keepsConnection || mHost.stops) {
        mTransport->endWriting();
        close();
    } else {
        awaitRequest();
    }
}

void Session::report(bool isWhole)
{
    --mHost.inFlight;
    const auto duration = std::chrono::duration_cast<std::chrono::microseconds>(Clock::now() - mBegan);
    mHost.observer.ended({mRequest, mCaller, mEffect, mWriter->status(), mWriter->bytesSent(), duration,
                          isWhole, mWriter->fault()});
    mWriter.reset();
    mRequest = {};
}

/// The client went before its request was whole.
void Session::reportBrokenOff()
{
    mSink.reset();
    --mHost.inFlight;
    const auto duration = std::chrono::duration_cast<std::chrono::microseconds>(Clock::now() - mBegan);
    mHost.observer.ended({mRequest, mCaller, {}, 400, 0, duration, false, {}});
    mRequest = {};
}

void Session::closeSoftly()
{
    mTransport->endWriting();
    mIsDraining = true;
    mDeadline = Clock::now() + kDrainTime;
    drain();
}

void Session::drain()
{
    // It may have come to its end while this waited for its turn.
    if (!mConnection->isOpen())
        return;
    char bytes[kReadBlock];
    int count = 0;
    auto outcome = Transport::Outcome::Done;
    for (int i = 0; i < kDrainBlocks && outcome == Transport::Outcome::Done; ++i) {
        outcome = mTransport->read(bytes, kReadBlock, count);
        mDrained += count;
    }
    const bool mayGoOn = outcome == Transport::Outcome::Done || outcome == Transport::Outcome::WantsRead;
    if (!mayGoOn || mDrained > kDrainBytes || Clock::now() > mDeadline)
        close();
    else if (outcome == Transport::Outcome::Done)
        mConnection->post([self = shared_from_this()] { self->drain(); });
    else
        wait(Connection::For::Reading, &Session::drain);
}

void Session::close()
{
    if (!mConnection->isOpen())
        return;
    if (mWriter)
        report(false);
    else if (mSink)
        reportBrokenOff();
    mConnection->close();
    mClosed(*this);
}

}  // namespace Kdd::Http
