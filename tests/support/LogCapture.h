#pragma once

#include "platform/base/LogFile.h"

#include <algorithm>
#include <mutex>
#include <string>
#include <vector>

namespace Kdd
{

/// Takes every log line while it lives, instead of its being written. Any thread may write; once they are done, ask.
class LogCapture
{
public:
    LogCapture()
    {
        LogFile::setCallback([this](LogFile::Severity, const char*, const std::string& line) {
            const std::lock_guard lock(mMutex);
            mLines.push_back(line);
        });
    }
    ~LogCapture() { LogFile::setCallback({}); }
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    const std::vector<std::string>& lines() const { return mLines; }

    /// How many lines contain the text.
    int count(const std::string& text) const
    {
        return static_cast<int>(std::count_if(mLines.begin(), mLines.end(), [&](const std::string& line) {
            return line.find(text) != std::string::npos;
        }));
    }

private:
    std::mutex mMutex;
    std::vector<std::string> mLines;
};

}  // namespace Kdd
