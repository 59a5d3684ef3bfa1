#pragma once

#include <QByteArray>

#include <chrono>
#include <cstring>
#include <optional>

namespace Kdd
{

/// What a process and its decoder say to each other.
enum class DecoderWord : quint32 {
    // To the decoder.
    Frame = 1,   ///< decode a compressed frame: FrameQuestion, its bytes
    Video = 2,   ///< decode a frame of a video: VideoQuestion
    Volume = 3,  ///< read the header of a volume file: VolumeQuestion, its name
    Bytes = 4,   ///< what was wanted; none at the end or where they cannot be read
    // From the decoder.
    Ready = 10,   ///< all libraries are loaded and nothing else can be reached: the number of the protocol
    Wanted = 11,  ///< bytes of the source: WantedBytes
    Done = 12,    ///< the answer
    Failed = 13,  ///< its place has a reason, in UTF-8
};

/// Raised with every change of a message. Both sides are mostly of one build, but for servers that go on while the
/// packages below them are renewed.
constexpr quint32 kDecoderProtocol = 1;

/// A word, a small structure that goes with it, and what is too large for that.
struct DecoderMessage
{
    DecoderWord word = DecoderWord::Failed;
    QByteArray head;
    QByteArray data;
};

/// The bytes of a structure, which has neither pointers nor gaps.
template <typename T>
QByteArray bytesOf(const T& structure)
{
    static_assert(std::has_unique_object_representations_v<T> || std::is_floating_point_v<T>,
                  "What lies in gaps would be sent along");
    return QByteArray(reinterpret_cast<const char*>(&structure), sizeof(T));
}

/// False when the bytes are not of the structure's size.
template <typename T>
bool readFrom(const QByteArray& bytes, T& structure)
{
    if (bytes.size() != int(sizeof(T)))
        return false;
    std::memcpy(&structure, bytes.constData(), sizeof(T));
    return true;
}

/// Which bytes of its source a decoder asks for.
struct WantedBytes
{
    qint64 offset = 0;
    qint64 length = 0;
};

/// The most that a decoder gets at once [bytes].
constexpr qint64 kMaxWanted = 1 << 20;

/// One end of the socket between a process and its decoder. What comes from the other end is held against bounds before
/// memory is taken for it. One thread at a time.
class DecoderChannel
{
public:
    using Clock = std::chrono::steady_clock;

    enum class Outcome {
        Done,
        Ended,    ///< the other end is closed
        Late,     ///< it did not go on in time
        Nonsense  ///< what came is no message, or goes beyond the bounds
    };

    /// The largest head of a message [bytes].
    static constexpr int kMaxHead = 4096;

    /// `socket` stays the caller's.
    explicit DecoderChannel(int socket)
        : mSocket(socket)
    {
    }

    /// Until when each of the calls below may last; without it they last as long as it takes.
    void setDeadline(std::optional<Clock::time_point> deadline) { mDeadline = deadline; }
    std::optional<Clock::time_point> deadline() const { return mDeadline; }

    Outcome send(const DecoderMessage& message) const;

    /// On failure the message is not to be used.
    Outcome receive(qint64 mostData, DecoderMessage& message) const;

private:
    Outcome write(const void* bytes, qint64 size) const;
    Outcome read(void* bytes, qint64 size) const;
    Outcome await(short event) const;
    int flags() const;

    int mSocket;
    std::optional<Clock::time_point> mDeadline;
};

/// What a decoder reads its source by: up to `length` bytes from `offset` into `out`, no more than kMaxWanted; how many, 0
/// where there are none.
qint64 askForBytes(const DecoderChannel& channel, qint64 offset, char* out, qint64 length);

}  // namespace Kdd
