#include "server/dimse/RawCaller.h"

#include <QtEndian>

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

namespace Kdd
{
namespace
{

template <typename Number>
QByteArray big(Number number)
{
    QByteArray bytes(sizeof number, 0);
    qToBigEndian(number, bytes.data());
    return bytes;
}

template <typename Number>
QByteArray little(Number number)
{
    QByteArray bytes(sizeof number, 0);
    qToLittleEndian(number, bytes.data());
    return bytes;
}

QByteArray item(char kind, const QByteArray& content)
{
    return QByteArray(1, kind) + '\0' + big(static_cast<quint16>(content.size())) + content;
}

/// With its length before it.
QByteArray command(const QByteArray& elements)
{
    return QByteArray(4, 0) + little<quint32>(4) + little(static_cast<quint32>(elements.size())) + elements;
}

}  // namespace

quint16 freePort()
{
    sockaddr_in at = {};
    socklen_t size = sizeof at;
    at.sin_family = AF_INET;
    at.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const int socket = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    EXPECT_EQ(::bind(socket, reinterpret_cast<sockaddr*>(&at), size), 0);
    EXPECT_EQ(::getsockname(socket, reinterpret_cast<sockaddr*>(&at), &size), 0);
    ::close(socket);
    return ntohs(at.sin_port);
}

bool isListening(quint16 port)
{
    return Client(':' + QByteArray::number(port)).isConnected();
}

QByteArray datasetOf(const QByteArray& file)
{
    constexpr int kToLength = 140;
    return file.size() < kToLength + 4
               ? QByteArray()
               : file.mid(kToLength + 4 + qFromLittleEndian<qint32>(file.constData() + kToLength));
}

QByteArray RawCaller::pdu(char kind, const QByteArray& body)
{
    return QByteArray(1, kind) + '\0' + big(static_cast<quint32>(body.size())) + body;
}

QByteArray RawCaller::value(char context, char control, const QByteArray& bytes)
{
    return big(static_cast<quint32>(bytes.size() + 2)) + context + control + bytes;
}

QByteArray RawCaller::request(const QVector<Offer>& offers, const QByteArray& called,
                              const QByteArray& calling)
{
    QByteArray body = big<quint16>(1) + QByteArray(2, 0) + called.leftJustified(16, ' ') +
                      calling.leftJustified(16, ' ') + QByteArray(32, 0) +
                      item(0x10, "1.2.840.10008.3.1.1.1");
    for (int i = 0; i < offers.size(); ++i) {
        QByteArray context =
            QByteArray(1, static_cast<char>(2 * i + 1)) + QByteArray(3, 0) + item(0x30, offers[i].sopClass);
        for (const QByteArray& syntax : offers[i].transferSyntaxes)
            context += item(0x40, syntax);
        body += item(0x20, context);
    }
    return body + item(0x50, item(0x51, big<quint32>(16384)) + item(0x52, "1.2.3.4"));
}

QByteArray RawCaller::number(quint16 element, quint16 value)
{
    return QByteArray(2, 0) + little(element) + little<quint32>(2) + little(value);
}

QByteArray RawCaller::text(quint16 element, QByteArray value)
{
    if (value.size() % 2 != 0)
        value += '\0';
    return QByteArray(2, 0) + little(element) + little(static_cast<quint32>(value.size())) + value;
}

QByteArray RawCaller::storeCommand(const QByteArray& sopClass, const QByteArray& instance)
{
    const QByteArray elements = text(0x0002, sopClass) + number(0x0100, 1) + number(0x0110, 7) +
                                number(0x0700, 0) + number(0x0800, 0) + text(0x1000, instance);
    return command(elements);
}

QByteArray RawCaller::actionCommand()
{
    return command(text(0x0003, "1.2.840.10008.1.20.1") + number(0x0100, 0x0130) + number(0x0110, 7) +
                   number(0x0800, 0) + text(0x1001, "1.2.840.10008.1.20.1.1") + number(0x1008, 1));
}

QByteArray RawCaller::receive()
{
    constexpr int kHead = 6;
    const QByteArray head = mConnection.take(kHead);
    if (head.size() < kHead)
        return {};
    const auto length = qFromBigEndian<quint32>(head.constData() + 2);
    const QByteArray body = mConnection.take(length);
    return body.size() == static_cast<int>(length) ? head + body : QByteArray();
}

QByteArray RawCaller::associate(const QVector<Offer>& offers, const QByteArray& called,
                                const QByteArray& calling)
{
    send(pdu(1, request(offers, called, calling)));
    mAnswer = receive();
    return mAnswer;
}

QVector<QByteArray> RawCaller::accepted() const
{
    QVector<QByteArray> made;
    for (int at = 74; at + 4 <= mAnswer.size();) {
        const int length = qFromBigEndian<quint16>(mAnswer.constData() + at + 2);
        if (mAnswer.at(at) == 0x21) {
            const char result = mAnswer.at(at + 6);
            made.append(result == 0 ? mAnswer.mid(at + 12, length - 8) : QByteArray::number(int(result)));
        }
        at += 4 + length;
    }
    return made;
}

int RawCaller::store(const QByteArray& sopClass, const QByteArray& instance, const QByteArray& dataset,
                     char context, int piece)
{
    send(pdu(4, value(context, 3, storeCommand(sopClass, instance))));
    for (int at = 0; at < dataset.size(); at += piece)
        send(pdu(4, value(context, at + piece >= dataset.size() ? 2 : 0, dataset.mid(at, piece))));
    return status();
}

int RawCaller::status()
{
    const QByteArray answer = receive();
    const int at = answer.indexOf(QByteArray("\0\0\0\x09\x02\0\0\0", 8));
    return at < 0 ? -1 : qFromLittleEndian<quint16>(answer.constData() + at + 8);
}

void RawCaller::release()
{
    send(pdu(5, QByteArray(4, 0)));
    EXPECT_EQ(receive().left(1), QByteArray(1, 6));
}

}  // namespace Kdd
