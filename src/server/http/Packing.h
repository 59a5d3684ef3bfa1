#pragma once

#include <QByteArray>

namespace Kdd::Http
{

/// Puts several bodies into one, while they pass by. Used by one thread at a time, in this order: for each body
/// `begin`, `pass` with all its bytes, `end`; at last `finish`.
class Packing
{
public:
    virtual ~Packing() = default;

    /// Of the whole.
    virtual QByteArray mediaType() const = 0;

    /// What stands before a body. `name` is its name, `mediaType` what it is.
    virtual QByteArray begin(const QByteArray& name, const QByteArray& mediaType) = 0;

    /// Looks at the next bytes of the body, which are sent as they are.
    virtual void pass(const QByteArray& bytes) = 0;

    /// What stands behind a body, and behind all of them.
    virtual QByteArray end() = 0;
    virtual QByteArray finish() = 0;
};

}  // namespace Kdd::Http
