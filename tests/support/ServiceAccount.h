#pragma once

#include "support/FileContent.h"

#include <QJsonObject>
#include <QProcess>

#include <string>

namespace Kdd
{

/// A service account with a key pair of its own, made by the openssl tool.
class ServiceAccount
{
public:
    ServiceAccount()
    {
        openssl("genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:2048 -out private.pem");
        openssl("pkey -in private.pem -pubout -out public.pem");
    }

    /// As the provider hands it out, for tokens from `tokenUri`.
    QJsonObject key(const std::string& tokenUri) const
    {
        return {{QStringLiteral("type"), QStringLiteral("service_account")},
                {QStringLiteral("private_key_id"), QStringLiteral("k1")},
                {QStringLiteral("private_key"), QString::fromLatin1(openssl("pkey -in private.pem"))},
                {QStringLiteral("client_email"), QStringLiteral("robot@hospital")},
                {QStringLiteral("token_uri"), QString::fromStdString(tokenUri)}};
    }

    /// Runs the tool in the folder of the keys; what it says when it succeeds.
    QByteArray openssl(const char* arguments) const
    {
        QProcess process;
        process.setWorkingDirectory(mFolder.path());
        process.start(QStringLiteral("openssl"), QString::fromLatin1(arguments).split(QLatin1Char(' ')));
        const bool isDone = process.waitForFinished() && process.exitCode() == 0;
        return isDone ? process.readAllStandardOutput().trimmed() : QByteArray("failed");
    }

    void save(const char* name, const QByteArray& content) const
    {
        putFile(mFolder.filePath(QLatin1String(name)), content);
    }

private:
    QTemporaryDir mFolder;
};

}  // namespace Kdd
