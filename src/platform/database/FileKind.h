#pragma once

namespace Kxg
{

/// As stored with each file, so a value never changes its meaning.
enum class FileKind { Other = 0, Dicom = 1, Volume = 2 };

}  // namespace Kxg
