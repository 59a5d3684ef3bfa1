#pragma once

#include <QByteArray>

namespace Kdd
{

/// What a site may set: in the environment, which goes first, or in its file.
struct Setting
{
    const char* variable;
    const char* key;       ///< in the file
    const char* standard;  ///< what counts without either
};

/// The present value.
QByteArray valueOf(const Setting& setting);

/// Of `least` to `most`; of anything else the standard, for a site's slip should not stop its server.
int numberOf(const Setting& setting, int least, int most);

}  // namespace Kdd
