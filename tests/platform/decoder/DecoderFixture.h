#pragma once

#include "platform/decoder/DecoderPool.h"
#include "platform/volume/ApartFrame.h"
#include "platform/volume/FrameLayout.h"

#include <QDir>
#include <QFile>
#include <QTemporaryDir>

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cerrno>

namespace Kdd
{

/// Holds that nothing is left of any decoder.
class Decoders : public testing::Test
{
protected:
    void SetUp() override { mDescriptors = openDescriptors(); }
    void TearDown() override
    {
        EXPECT_EQ(openDescriptors(), mDescriptors);
        EXPECT_FALSE(hasChild());
    }

    /// One that runs, or one that waits to be asked how it ended.
    static bool hasChild()
    {
        siginfo_t info = {};
        return ::waitid(P_ALL, 0, &info, WEXITED | WNOHANG | WNOWAIT) == 0 || errno != ECHILD;
    }

    static int openDescriptors()
    {
        return QDir(QStringLiteral("/proc/self/fd"))
            .entryList(QDir::System | QDir::AllEntries | QDir::NoDotAndDotDot)
            .size();
    }

    /// The file of a decoder that does what `what` says.
    QByteArray falseDecoder(const char* what) const
    {
        const QString path = mFolder.filePath(QLatin1String(what));
        QFile::link(QStringLiteral(KDD_FALSE_DECODER), path);
        return QFile::encodeName(path);
    }

    /// What becomes of a frame of two grey pixels.
    static Result ask(DecoderPool& pool)
    {
        FrameLayout layout;
        layout.rows = 1;
        layout.columns = 2;
        StoredFrame frame;
        Result result = decodeFrameApart(pool, "codestream", layout, 0, frame);
        EXPECT_EQ(frame.pixels.pixels, result.good() ? QByteArray("ab") : QByteArray());
        return result;
    }

private:
    QTemporaryDir mFolder;
    int mDescriptors = 0;
};

}  // namespace Kdd
