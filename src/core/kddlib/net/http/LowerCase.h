#pragma once

#include <string>
#include <string_view>

namespace Kdd
{

/// With the letters of ASCII in lower case. Names of hosts and headers are compared so under every locale.
inline std::string lowerCase(std::string_view text)
{
    std::string lower(text);
    for (char& letter : lower) {
        if (letter >= 'A' && letter <= 'Z')
            letter = static_cast<char>(letter - 'A' + 'a');
    }
    return lower;
}

}  // namespace Kdd
