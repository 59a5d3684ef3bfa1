#pragma once

#include <QByteArray>

#include <cstddef>
#include <cstdint>

namespace Kdd
{

/// The bytes of one run, in memory of their own: reading past their end is seen by the sanitizers.
QByteArray bytesOf(const uint8_t* data, std::size_t size);

/// Ends the process, which is how a finding is told, when `holds` is false; names the property on standard error.
void require(bool holds, const char* property);

}  // namespace Kdd
