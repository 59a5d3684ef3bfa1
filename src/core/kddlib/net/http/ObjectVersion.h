#pragma once

#include "platform/base/Export.h"

#include <string>

namespace Kdd
{

struct KxHttpStatus;

/// Tells one version of an object from the next by what the server says of it, so that parts fetched one after another
/// are never put together from two of them. A value. Each thread uses a copy of its own.
struct KDD_EXPORT ObjectVersion
{
    std::string entityTag;
    std::string generation;  // of the cloud storage; counts up with each write
    std::string
        lastModified;  // tells nothing of two writes within a second, so counts only without the other two

    static ObjectVersion of(const KxHttpStatus& response);

    /// Whether the server said anything by which the object could be recognised again.
    bool isKnown() const { return !entityTag.empty() || !generation.empty() || !lastModified.empty(); }
};

/// Whether nothing speaks against both being the same object. Of two that tell nothing, nothing does.
KDD_EXPORT bool operator==(const ObjectVersion& a, const ObjectVersion& b);
inline bool operator!=(const ObjectVersion& a, const ObjectVersion& b)
{
    return !(a == b);
}

}  // namespace Kdd
