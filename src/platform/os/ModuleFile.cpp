#include "platform/os/ModuleFile.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <dlfcn.h>
#include <link.h>

namespace Kdd
{
namespace
{

/// The folder of the library or program that holds this code.
QString ownFolder()
{
    Dl_info info = {};
    link_map* map = nullptr;
    const auto* here = reinterpret_cast<const void*>(&ownFolder);
    if (::dladdr1(here, &info, reinterpret_cast<void**>(&map), RTLD_DL_LINKMAP) == 0 || map == nullptr)
        return {};
    // The program itself has no name there, and how it was called need not lead to its file.
    const QString file =
        *map->l_name == '\0' ? QStringLiteral("/proc/self/exe") : QFile::decodeName(map->l_name);
    return QFileInfo(QFileInfo(file).canonicalFilePath()).path();
}

}  // namespace

QStringList moduleFolders()
{
    const QString own = ownFolder();
    // A program that belongs to the modules lies among them, which no library does.
    if (QFileInfo::exists(own + QLatin1String("/kdd-decoder")))
        return {own};
    QStringList folders = {own + QLatin1String("/kddlib")};
    // Only what was not installed looks where it was built: elsewhere anybody might have made a folder of that name.
    const QString build = QStringLiteral(KDD_BUILD_FOLDER "/");
    if ((own + QLatin1Char('/')).startsWith(build))
        folders.append(build + QLatin1String("kddlib"));
    return folders;
}

Result openModule(const QString& title, const QString& file, const QStringList& folders, void*& module)
{
    for (const QString& folder : folders) {
        const QString path = QDir(folder).absoluteFilePath(file);
        // The first one found counts. When it cannot be loaded its reason is told and no other is tried.
        if (!QFileInfo::exists(path))
            continue;
        // All symbols now: one that is missing should be a message here and not the end of the process later.
        module = ::dlopen(QFile::encodeName(path).constData(), RTLD_NOW | RTLD_LOCAL);
        return module != nullptr ? Result()
                                 : Result::failure(QStringLiteral("The %1 cannot be loaded: %2")
                                                       .arg(title, QString::fromLocal8Bit(::dlerror())));
    }
    return Result::failure(QStringLiteral("The %1 %2 is not installed in %3")
                               .arg(title, file, folders.join(QLatin1String(" or "))));
}

}  // namespace Kdd
