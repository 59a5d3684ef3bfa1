#pragma once

#include <QByteArray>

#include <string>

namespace Kdd
{

/// An environment variable that has a value while the object lives, and none afterwards.
class Setting
{
public:
    Setting(const char* name, const std::string& value)
        : mName(name)
    {
        set(value);
    }
    ~Setting() { qunsetenv(mName); }
    Setting(const Setting&) = delete;
    Setting& operator=(const Setting&) = delete;

    void set(const std::string& value) { qputenv(mName, value.c_str()); }

private:
    const char* mName;
};

}  // namespace Kdd
