#include <gmock/gmock.h>

#include <clocale>

/// The tests run under the locale of whoever starts them, as the programs do that load the library.
int main(int argc, char* argv[])
{
    std::setlocale(LC_ALL, "");
    testing::InitGoogleMock(&argc, argv);
    return RUN_ALL_TESTS();
}
