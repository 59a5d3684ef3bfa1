#pragma once

#include "platform/base/Result.h"

#include <QByteArray>

#include <memory>

namespace Kdd
{

class OrlanMesh;

/// Opens a volume file by its path; one behind a URL is fetched as a whole, since its header may lie anywhere in it. Null, with
/// the reason in `result`, when there is no usable one.
std::unique_ptr<OrlanMesh> openVolumeFile(const QByteArray& path, Result& result);

}  // namespace Kdd
