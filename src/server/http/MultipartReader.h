#pragma once

#include "server/http/Request.h"

#include <QString>

namespace Kdd::Http
{

/// Takes a multipart body apart as it comes: hands on each part block by block, and holds no more than a delimiter and a
/// part's header. Used by one thread at a time.
class MultipartReader
{
public:
    /// Is told of the parts, one after the other.
    class Receiver
    {
    public:
        virtual ~Receiver() = default;

        /// Header names in small letters. False: nothing more is wanted of the body.
        virtual bool beginPart(const QVector<Field>& headers) = 0;
        virtual void takePart(const char* bytes, int size) = 0;
        virtual void endPart() = 0;
    };

    /// `boundary` is that of the media type. The receiver outlives the object.
    MultipartReader(const QByteArray& boundary, Receiver& receiver);

    /// The next bytes. False: no more are taken, `fault` says why.
    bool add(const char* bytes, int size);

    /// Whether the last delimiter has come. What follows it is passed over.
    bool isComplete() const { return mState == State::Epilogue; }

    /// Empty unless the body is none of this kind, or the receiver has had enough.
    const QString& fault() const { return mFault; }

private:
    enum class State { Preamble, Delimiter, Header, Body, Epilogue, Failed };

    bool fail(const QString& reason);
    bool advance();
    bool readPreamble();
    bool readDelimiter();
    bool readHeader();
    bool readBody();
    int passOn(const char* bytes, int size);

    QByteArray mDelimiter;  // with the end of line that belongs to it
    Receiver& mReceiver;
    State mState = State::Preamble;
    QByteArray mUnread;
    int mPassed = 0;  // of the preamble
    bool mIsInPart = false;
    QString mFault;
};

}  // namespace Kdd::Http
