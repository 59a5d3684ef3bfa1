#include "support/LogCapture.h"

#include "platform/base/LogFile.h"

#include <algorithm>

namespace Kdd
{

LogCapture::LogCapture()
{
    LogFile::setCallback([this](LogFile::Severity, const char*, const std::string& line) {
        const std::lock_guard lock(mMutex);
        mLines.push_back(line);
    });
}

LogCapture::~LogCapture()
{
    LogFile::setCallback({});
}

int LogCapture::count(const std::string& text) const
{
    const std::lock_guard lock(mMutex);
    return static_cast<int>(std::count_if(mLines.begin(), mLines.end(), [&](const std::string& line) {
        return line.find(text) != std::string::npos;
    }));
}

}  // namespace Kdd
