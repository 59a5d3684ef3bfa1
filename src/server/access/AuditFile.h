#pragma once

#include <QByteArray>
#include <QJsonObject>

#include <kddlib/Result.h>

#include <atomic>

namespace Kdd::Access
{

/// Where lines of an audit trail go, each a JSON object. May be used on any thread.
class AuditFile
{
public:
    /// A file, which is opened for each line: one that was moved away is followed by a new one. "log": the log.
    explicit AuditFile(QByteArray place);

    /// Whether it can be written to.
    Result check() const;

    /// When it no longer can, that is told in the log.
    void write(const QJsonObject& line);

private:
    Result append(const QByteArray& line) const;

    QByteArray mPlace;
    std::atomic<bool> mIsBroken{false};
};

}  // namespace Kdd::Access
