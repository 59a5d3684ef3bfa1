#include "server/http/Session.h"

#include <kddlib/LogFile.h>
#include <poll.h>

namespace Kdd::Http
{
namespace
{

// A worker that takes a body lets others have their turn after so much of it.
constexpr int kBodyBlock = 64 * 1024;  // [bytes]
constexpr int kBlocksPerTurn = 64;

/// A client that is sending has more in a moment, in which it is cheaper to wait than to have the socket waited for [ms].
constexpr int kMoment = 2;

/// Whoever sends less [bytes/s] holds a connection for nothing.
constexpr qint64 kSlowestBody = 1024;

/// Of an answer that needs no body.
class LetGo : public BodySink
{
public:
    LetGo(Response response, qint64 most)
        : mResponse(std::move(response))
        , mLeft(most)
    {
    }

    bool take(const char* /*bytes*/, int size) override
    {
        mLeft -= size;
        return mLeft >= 0;
    }
    Response answer() override
    {
        return mLeft >= 0 ? std::move(mResponse) : failure(413, QStringLiteral("The body is too large"));
    }

private:
    Response mResponse;
    qint64 mLeft;
};

}  // namespace

/// On a receiver. What was answered before the body tells what to do with that.
void Session::beginBody(Response response)
{
    mSink = std::move(response.sink);
    mHeaders = mSink != nullptr ? response.headers : QVector<Field>();
    // Nobody has to send what is refused already.
    if (mSink == nullptr && response.status >= 400) {
        endBody(std::move(response), Afterwards::Close);
        return;
    }
    if (mSink == nullptr)
        mSink = std::make_unique<LetGo>(std::move(response), mHost.settings.bodyBytes);
    mBodyBegan = Clock::now();
    mBodyBytes = 0;
    receiveBody();
}

/// Who waits for a disk keeps nobody waiting who only wants an answer.
void Session::receiveOn()
{
    mHost.receivers.run([self = shared_from_this()] { self->receiveBody(); });
}

void Session::receiveBody()
{
    try {
        takeBody();
    } catch (const std::exception& fault) {
        LogFile::errorf("Request %s failed: %s", mRequest.id.constData(), fault.what());
        endBody(failure(500, QStringLiteral("The request failed")), Afterwards::Close);
    }
}

/// On a receiver, for the sink may wait for disks. Nothing is read from the client before the sink has taken what was there.
void Session::takeBody()
{
    QByteArray block;
    block.reserve(kBodyBlock);
    for (int i = 0; i < kBlocksPerTurn; ++i) {
        const char* bytes = nullptr;
        int count = 0;
        switch (mReader.readBody(bytes, count)) {
        case RequestReader::Body::Block:
            mBodyBytes += count;
            if (!mSink->take(bytes, count)) {
                endBody(mSink->answer(), Afterwards::Close);
                return;
            }
            continue;
        case RequestReader::Body::End:
            endBody(mSink->answer(), Afterwards::Stay);
            return;
        case RequestReader::Body::Malformed:
            endBody(failure(400, QStringLiteral("The body is not sent as HTTP/1.1 has it")),
                    Afterwards::Close);
            return;
        case RequestReader::Body::AwaitsLeave:
            tellToGoOn();
            [[fallthrough]];
        case RequestReader::Body::Awaited:
            break;
        }
        block.resize(kBodyBlock);
        const Transport::Outcome outcome = mTransport->read(block.data(), block.size(), count);
        if (outcome == Transport::Outcome::Done) {
            block.resize(count);
            mReader.add(block);
        } else if (outcome == Transport::Outcome::WantsRead) {
            pollfd socket = {mConnection->descriptor(), POLLIN, 0};
            if (::poll(&socket, 1, kMoment) > 0)
                continue;
            mConnection->post([self = shared_from_this()] { self->awaitBody(); });
            return;
        } else {
            mConnection->post([self = shared_from_this()] {
                self->mIsWithWorker = false;
                self->close();
            });
            return;
        }
    }
    receiveOn();
}

/// Back on the thread of the I/O.
void Session::awaitBody()
{
    mIsWithWorker = false;
    if (isTooSlow()) {
        expire();
        return;
    }
    mDeadline = Clock::now() + mHost.settings.patience;
    mConnection->wait(Connection::For::Reading, mDeadline,
                      [self = shared_from_this()](Connection::Waited waited) {
                          if (waited == Connection::Waited::Expired) {
                              self->expire();
                          } else if (waited == Connection::Waited::Ready) {
                              self->mIsWithWorker = true;
                              self->receiveOn();
                          }
                      });
}

bool Session::isTooSlow() const
{
    using Seconds = std::chrono::duration<double>;
    const Clock::duration time = Clock::now() - mBodyBegan;
    return time > mHost.settings.patience &&
           static_cast<double>(mBodyBytes) < Seconds(time).count() * kSlowestBody;
}

void Session::endBody(Response response, Afterwards afterwards)
{
    if (mSink != nullptr && !response.effect)
        response.effect = mSink->effect();
    mSink.reset();
    response.headers += mHeaders;
    // From here on the client waits.
    mBegan = Clock::now();
    mIsRefused = afterwards == Afterwards::Close;
    write(std::move(response));
}

}  // namespace Kdd::Http
