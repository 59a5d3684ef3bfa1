#pragma once

#include "platform/base/Export.h"

#include <QtGlobal>

namespace Kdd
{

/// Whoever has long work done is told how far it has come, and may end it early. What was finished by then stays, and
/// the same work begun again goes on from there.
///
/// Work on several threads calls it on any of them, one at a time.
class KDD_EXPORT WorkObserver
{
public:
    virtual ~WorkObserver() = default;

    /// A total of 0 is one that is not known.
    virtual void progress(qint64 /*done*/, qint64 /*total*/) {}

    /// Asked between files and between studies, so that nothing is left half done.
    virtual bool isCancelled() { return false; }
};

}  // namespace Kdd
