#pragma once

#include "server/http/Response.h"
#include "server/http/Transport.h"

namespace Kdd::Http
{

/// What decides, beside the answer itself, how it is sent.
struct ResponseForm
{
    bool isHead = false;           ///< the body stays behind
    bool isOldVersion = false;     ///< HTTP/1.0: no chunks
    bool keepsConnection = false;  ///< whether the client may ask again
    QByteArray id;                 ///< of the request; empty: it has none
};

/// Sends one answer, as far as the other side takes it, and goes on later. Holds no more of a body than one block. Used by
/// one thread at a time.
class ResponseWriter
{
public:
    enum class Step {
        Sent,
        WantsRead,   ///< to be called again when something has come
        WantsWrite,  ///< when there is room
        Yields,      ///< after others had their turn
        Broken,      ///< the connection cannot be used any more; `fault` says why, unless the client left
    };

    /// An answer that cannot be sent as it is, because a header or a range is wrong, is replaced by 500 and logged.
    ResponseWriter(Response response, const ResponseForm& form);

    Step send(Transport& transport);

    int status() const { return mResponse.status; }
    qint64 bytesSent() const { return mBytesSent; }
    bool keepsConnection() const { return mKeepsConnection; }
    const QString& fault() const { return mFault; }

private:
    enum class Framing { Length, Chunks, UntilClose, None };

    bool isSound(QString& fault) const;
    void chooseFraming(const ResponseForm& form);
    void composeHead(const ResponseForm& form);
    bool isAtEnd() const { return mPart == mResponse.body.size(); }
    bool prepare(Transport& transport);
    bool prepareBlock(Producer& producer);
    bool prepareFile(Transport& transport, FileRange& range);
    void frame();
    void advance(FileRange& range, qint64 sent);
    Transport::Outcome sendPrepared(Transport& transport);
    Step broken(const QString& fault);

    Response mResponse;
    Framing mFraming = Framing::Length;
    bool mKeepsConnection;
    QByteArray mBlock;        // bytes that go next
    qint64 mBlockSent = 0;    // of those
    std::size_t mPart = 0;    // of the body, that goes after the block
    bool mSendsFile = false;  // that part, a range, by the transport
    qint64 mHeldBack = 0;     // of its end, which is read
    qint64 mBytesSent = 0;
    QString mFault;
};

}  // namespace Kdd::Http
