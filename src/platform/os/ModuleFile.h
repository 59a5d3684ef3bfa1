#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QString>
#include <QStringList>

namespace Kdd
{

/// Where the library's modules lie: the folder `kddlib` beside the file of the library, or of the program that it is built
/// into; for the decoder, which lies among them, its own. Those of a library that was not installed lie in its build.
KDD_EXPORT QStringList moduleFolders();

/// Loads `file`, a shared library that is no part of the start of a program, from the first of `folders` that has it.
/// `module` receives what dlsym() takes; it stays for the life of the process. All that it needs is there or it is refused.
/// A failure names the file, as what `title` calls it: "The video module kdd-video.so is not installed in ...".
///
/// On any thread.
KDD_EXPORT Result openModule(const QString& title, const QString& file, const QStringList& folders,
                             void*& module);

/// Loads at once what is otherwise loaded when it is first needed. For processes that run for long: a later installation
/// may have put modules of its own in the place of those that fit. Failure tells of the first that cannot be loaded.
KDD_EXPORT Result loadModules();

}  // namespace Kdd
