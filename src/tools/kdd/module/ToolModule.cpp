#include "tools/kdd/ToolModule.h"

#include "tools/kdd/module/ContactSheet.h"
#include "tools/kdd/module/ServerRuns.h"

#include <kddlib/BuildInfo.h>
#include <kddlib/Export.h>

extern "C" KDD_EXPORT const Kdd::ToolModule kddToolModule;

const Kdd::ToolModule kddToolModule = {Kdd::BuildInfo::text(), &Kdd::runServe, &Kdd::runReceive,
                                       &Kdd::writeContactSheet};
