#pragma once

#include "server/http/Client.h"

namespace Kdd
{

/// A port of this machine that nobody listens at; a moment later somebody may.
quint16 freePort();

bool isListening(quint16 port);

/// What stands behind the meta information of a DICOM file; empty when there is none.
QByteArray datasetOf(const QByteArray& file);

/// One side of an association, byte by byte, to a server of this machine. What takes longer than a test may last fails.
class RawCaller
{
public:
    /// A class and the forms of its objects.
    struct Offer
    {
        QByteArray sopClass;
        QVector<QByteArray> transferSyntaxes;
    };

    explicit RawCaller(const QByteArray& address)
        : mConnection(address)
    {
    }

    /// Whose association is asked for at once.
    RawCaller(const QByteArray& address, const QVector<Offer>& offers, const QByteArray& calling = "TEST")
        : RawCaller(address)
    {
        associate(offers, "KDD", calling);
    }

    static QByteArray pdu(char kind, const QByteArray& body);

    /// A piece of a message: 1 for a command, 2 for the last one, 3 for both.
    static QByteArray value(char context, char control, const QByteArray& bytes);

    /// Without its head.
    static QByteArray request(const QVector<Offer>& offers, const QByteArray& called = "KDD",
                              const QByteArray& calling = "TEST");

    /// A command set: elements of group 0, in Implicit VR Little Endian.
    static QByteArray number(quint16 element, quint16 value);
    static QByteArray text(quint16 element, QByteArray value);
    static QByteArray storeCommand(const QByteArray& sopClass, const QByteArray& instance);

    /// Asks for storage commitment.
    static QByteArray actionCommand();

    void send(const QByteArray& bytes) const { mConnection.send(bytes); }

    /// The next PDU with its head; empty when the connection has ended.
    QByteArray receive();

    /// The answer to a request.
    QByteArray associate(const QVector<Offer>& offers, const QByteArray& called = "KDD",
                         const QByteArray& calling = "TEST");

    /// What became of the offers: "1.2.840.10008.1.2" or, of one that was not accepted, "3".
    QVector<QByteArray> accepted() const;

    /// Sends an object under a context in pieces of so many bytes; the status, or -1 when the connection ended.
    int store(const QByteArray& sopClass, const QByteArray& instance, const QByteArray& dataset,
              char context = 1, int piece = 10000);

    /// The status of the next answer; -1 when the connection ended.
    int status();

    void release();

private:
    Client mConnection;
    QByteArray mAnswer;
};

}  // namespace Kdd
