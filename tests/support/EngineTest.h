#pragma once

#include "platform/database/Kxg.h"
#include "support/Engines.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"

#include <QThread>

#include <gtest/gtest.h>

namespace Kdd
{

/// Tests for each engine that an image database may have, with a new one that all questions go to.
class EngineTest : public testing::TestWithParam<Engine>
{
protected:
    EngineTest() { Kxg::SetDatabaseServer(mAddress); }
    ~EngineTest() override { Kxg::SetDatabaseServer(QByteArray()); }

    /// Looks until it is so, for as long as it takes on a busy machine.
    template <typename Condition>
    static bool comesTrue(const Condition& condition)
    {
        for (int look = 0; look < 6000 && !condition(); ++look)
            QThread::msleep(1);
        return condition();
    }

    LogCapture mLog;
    TemporaryStore mStore;
    QByteArray mAddress = newDatabase(GetParam(), mStore.filePath("kdd.sqlite"));
};

}  // namespace Kdd
