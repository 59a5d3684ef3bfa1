#pragma once

#include "server/http/OpenFile.h"
#include "server/http/Request.h"

#include <kddlib/Result.h>

#include <memory>
#include <optional>
#include <variant>
#include <vector>

namespace Kdd::Http
{

/// Makes a body block by block, for whoever sends it as fast as the client takes it. Used by one thread at a time, not
/// always the same.
class Producer
{
public:
    virtual ~Producer() = default;

    /// Replaces `block` by the next bytes, some 64 KiB; empty at the end. What was reserved of it stays so from block to
    /// block. After a failure the connection is closed before the end of the body, so that the client sees that something
    /// is missing.
    virtual Result next(QByteArray& block) = 0;
};

struct Response;

/// Takes the body of a request block by block, as fast as it can, and then answers. It goes without having been asked for
/// the answer when the client goes. Used by one thread at a time, not always the same.
class BodySink
{
public:
    virtual ~BodySink() = default;

    /// False: no more of the body is wanted, and the answer tells why.
    virtual bool take(const char* bytes, int size) = 0;

    /// The answer, once the body has come whole or no more of it is wanted.
    virtual Response answer() = 0;
};

/// What a request changed, for those who keep trails: which studies, and how much of them. Never values.
struct Effect
{
    QVector<QByteArray> studies;
    int images = 0;
};

/// What an answer consists of, in this order. Its length is known unless there is a producer, and is then sent.
using BodyPart = std::variant<QByteArray, FileRange, std::unique_ptr<Producer>>;

struct Response
{
    int status = 200;
    QVector<Field> headers;  ///< Content-Length, Transfer-Encoding, Connection and Date come from the session
    std::vector<BodyPart> body;
    QByteArray caller;  ///< who asked, for those who are told of the exchange; empty where nobody knows
    std::optional<Effect> effect;  ///< for the same; null: nothing was changed, or nobody says

    /// Of a request whose body decides: takes the body and gives the answer, to which `headers` are added. POST is answered
    /// before its body is read, so that who may not send it need not; without a sink a small body is let go.
    std::unique_ptr<BodySink> sink;

    Response() = default;
    explicit Response(int code)
        : status(code)
    {
    }

    void addHeader(const char* name, const QByteArray& value) { headers.append({name, value}); }
};

/// A body that is there as a whole.
Response textResponse(int status, const QByteArray& mediaType, const QByteArray& body);

/// A failure in words for whoever sent the request: one line of plain text. No name of a file of the server belongs
/// there.
Response failure(int status, const QString& reason);

/// Answers requests. Called on several threads at the same time. HEAD is answered like GET; the body stays behind.
class Handler
{
public:
    virtual ~Handler() = default;
    virtual Response answer(const Request& request) = 0;
};

}  // namespace Kdd::Http
