#pragma once

#include "CommandLineFixture.h"
#include "server/http/Client.h"

namespace Kdd
{

/// A store that takes objects over HTTP and associations, by servers in processes of their own.
class ServedStore : public CommandLine
{
protected:
    struct Addresses
    {
        QByteArray http;
        QByteArray dicom;
    };

    std::unique_ptr<QProcess> serve(Addresses& addresses) const
    {
        auto process = start("--json serve --stow --listen 127.0.0.1:0 --dicom 0");
        const QByteArray told = toldBy(*process);
        addresses.http = jsonAt(told, "address").toString().toLatin1();
        addresses.dicom = jsonAt(told, "dicom").toString().toLatin1();
        return process;
    }

    /// The status; 0 when the server went before it told one.
    static int send(const Addresses& addresses, const QByteArray& object)
    {
        Client client(addresses.http);
        if (!client.isConnected())
            return 0;
        client.send("POST /dicom-web/studies HTTP/1.1\r\nHost: localhost\r\nConnection: close\r\n"
                    "Content-Type: application/dicom\r\nContent-Length: " +
                    QByteArray::number(object.size()) + "\r\n\r\n" + object);
        return client.reply().status;
    }
};

}  // namespace Kdd
