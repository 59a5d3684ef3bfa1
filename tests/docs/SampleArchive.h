#pragma once

#include "support/CloudStore.h"
#include "support/HttpServer.h"
#include "system/CommandLineFixture.h"

namespace Kdd
{

/// Where the documentation's commands are run: a folder with all that they leave to their reader, and stand-ins for the
/// servers that they name.
class SampleArchive : public CommandLine
{
protected:
    SampleArchive();

    /// Synthetic studies in "day", taken into the archive, and files for the commands to work on.
    void fill();

    /// Runs commands of the documentation one after the other in one shell; the error output says which one failed.
    Answer shell(const QStringList& commands) const;

    void putBeside(const char* name, const QByteArray& content) const { putFile(path(name), content); }
    Answer run(const QString& program, const QStringList& arguments) const;

    const CloudStore mStorage;
    const NginxServer mServer;
    /// With what stands here for what only the reader of a page has.
    QString substituted(QString text) const;

private:
    const ScriptedServer mTokens;
    QProcessEnvironment mEnvironment = QProcessEnvironment::systemEnvironment();
};

}  // namespace Kdd
