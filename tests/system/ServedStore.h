#pragma once

#include "CommandLineFixture.h"
#include "server/http/Client.h"

namespace Kdd
{

/// A store that takes objects over HTTP, by servers in processes of their own.
class ServedStore : public CommandLine
{
protected:
    std::unique_ptr<QProcess> serve(quint16& port) const
    {
        auto process = start("--json serve --stow --listen 127.0.0.1:0");
        EXPECT_TRUE(process->waitForReadyRead(kTimeout)) << process->readAllStandardError().toStdString();
        const QString address =
            QJsonDocument::fromJson(process->readLine()).object().value(QLatin1String("address")).toString();
        port = address.mid(address.lastIndexOf(QLatin1Char(':')) + 1).toUShort();
        return process;
    }

    /// The status; 0 when the server went before it told one.
    static int send(quint16 port, const QByteArray& object)
    {
        Client client("http://127.0.0.1:" + QByteArray::number(port));
        if (!client.isConnected())
            return 0;
        client.send("POST /dicom-web/studies HTTP/1.1\r\nHost: localhost\r\nConnection: close\r\n"
                    "Content-Type: application/dicom\r\nContent-Length: " +
                    QByteArray::number(object.size()) + "\r\n\r\n" + object);
        return client.reply().status;
    }
};

}  // namespace Kdd
