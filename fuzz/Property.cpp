#include "fuzz/Property.h"

#include "platform/base/LogFile.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/oflog/oflog.h>

#include <cstdio>
#include <cstdlib>

/// Called once before the first run. Damaged input is the rule here, so its log lines would only cost time.
extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/)
{
    Kdd::LogFile::setLevel(Kdd::LogFile::Level::Nothing);
    OFLog::configure(OFLogger::OFF_LOG_LEVEL);
    return 0;
}

namespace Kdd
{

QByteArray bytesOf(const uint8_t* data, std::size_t size)
{
    return {reinterpret_cast<const char*>(data), static_cast<int>(size)};
}

void require(bool holds, const char* property)
{
    if (holds)
        return;
    std::fprintf(stderr, "This does not hold: %s\n", property);
    std::abort();
}

}  // namespace Kdd
