#pragma once

#include "server/ServerFixture.h"
#include "server/dimse/RawCaller.h"

#include <dcmtk/dcmdata/dcostrmb.h>

namespace Kdd
{

const QByteArray kExplicit = UID_LittleEndianExplicitTransferSyntax;
const QByteArray kImplicit = UID_LittleEndianImplicitTransferSyntax;
const QByteArray kCapture = UID_SecondaryCaptureImageStorage;
const QByteArray kEcho = UID_VerificationSOPClass;

/// A server that has associations, over a store of its own.
class DimseFixture : public ServerFixture
{
protected:
    DimseFixture()
    {
        takeObjects();
        takeAssociations(mSettings);
        mSettings.dimse->rules.titles = {"KDD"};
    }

    QString port() const { return QString::number(dicomPort(*mServer)); }

    struct Said
    {
        int exitCode = -1;
        QByteArray text;
    };

    /// A tool of DCMTK's, which is told where the server is; `files` come last.
    std::unique_ptr<QProcess> begin(const char* program, const QByteArray& options = {},
                                    const QStringList& files = {}) const
    {
        auto process = std::make_unique<QProcess>();
        process->setProcessChannelMode(QProcess::MergedChannels);
        process->start(QLatin1String(program),
                       words("-v -aec KDD " + options + " 127.0.0.1 " + port().toLatin1()) + files);
        return process;
    }

    static Said finish(QProcess& process)
    {
        EXPECT_TRUE(process.waitForFinished(120000)) << process.errorString().toStdString();
        return {process.exitStatus() == QProcess::NormalExit ? process.exitCode() : -1, process.readAll()};
    }

    Said run(const char* program, const QByteArray& options = {}, const QStringList& files = {}) const
    {
        return finish(*begin(program, options, files));
    }

    QString save(const DatasetBuilder& image, const char* name,
                 E_TransferSyntax syntax = EXS_LittleEndianExplicit) const
    {
        const QString path = mStore.filePath(name);
        image.save(path, syntax);
        return path;
    }

    /// The bytes of a dataset alone.
    static QByteArray bytesOf(const DatasetBuilder& image, E_TransferSyntax syntax = EXS_LittleEndianExplicit)
    {
        QByteArray bytes(1 << 20, 0);
        DcmOutputBufferStream stream(bytes.data(), bytes.size());
        DcmDataset copy(image.build());
        copy.transferInit();
        EXPECT_TRUE(copy.write(stream, syntax, EET_UndefinedLength, nullptr).good());
        copy.transferEnd();
        return bytes.left(static_cast<int>(stream.filled()));
    }

    /// Stores over an association of its own.
    int store(const DatasetBuilder& image, const QByteArray& instance = "1.2.3.1",
              const QByteArray& sopClass = kCapture) const
    {
        RawCaller caller(mServer->dimseAddress(), {{sopClass, {kExplicit}}});
        return caller.store(sopClass, instance, bytesOf(image));
    }
};

}  // namespace Kdd
