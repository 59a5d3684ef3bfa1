#pragma once

#include <mutex>
#include <string>
#include <vector>

namespace Kdd
{

/// Takes every log line while it lives, instead of its being written. Any thread may write; what writes has to end before it.
class LogCapture
{
public:
    LogCapture();
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    const std::vector<std::string>& lines() const { return mLines; }

    /// How many lines contain the text.
    int count(const std::string& text) const;

private:
    mutable std::mutex mMutex;
    std::vector<std::string> mLines;
};

}  // namespace Kdd
