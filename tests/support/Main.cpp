#include <QThread>

#include <gmock/gmock.h>

#include <clocale>

/// The tests run under the locale of whoever starts them, as the programs do that load the library.
int main(int argc, char* argv[])
{
    std::setlocale(LC_ALL, "");
    // Qt takes the thread that it sees first for the main one, and it must not be a server's.
    QThread::currentThread();
    testing::InitGoogleMock(&argc, argv);
    return RUN_ALL_TESTS();
}
