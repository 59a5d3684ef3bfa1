#include "server/access/AuditFile.h"

#include <QFile>
#include <QJsonDocument>

#include <fcntl.h>
#include <kddlib/LogFile.h>
#include <kddlib/SystemResult.h>
#include <unistd.h>

#include <cerrno>

namespace Kdd::Access
{
namespace
{

/// For the group that keeps trails, and nobody else: they tell who looked at whom.
constexpr int kMode = 0640;

}  // namespace

AuditFile::AuditFile(QByteArray place)
    : mPlace(std::move(place))
{
}

Result AuditFile::append(const QByteArray& line) const
{
    const int file = ::open(mPlace.constData(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, kMode);
    if (file < 0)
        return Result(SystemResult::of(errno)).within(QFile::decodeName(mPlace));
    // In one piece, so that the lines of several servers stand behind each other.
    const ssize_t written = ::write(file, line.constData(), static_cast<std::size_t>(line.size()));
    const Result result =
        written == line.size() ? Result() : Result(SystemResult::of(written < 0 ? errno : ENOSPC));
    ::close(file);
    return result.within(QFile::decodeName(mPlace));
}

Result AuditFile::check() const
{
    return mPlace == "log" ? Result() : append({});
}

void AuditFile::write(const QJsonObject& line)
{
    const QByteArray text = QJsonDocument(line).toJson(QJsonDocument::Compact);
    if (mPlace == "log") {
        LogFile::printf("Audit %s", text.constData());
        return;
    }
    const Result result = append(text + '\n');
    // Told once and not with every line, of which there are thousands.
    if (result.bad() != mIsBroken.exchange(result.bad())) {
        if (result.bad())
            LogFile::errorf("The audit trail cannot be written: %s", qUtf8Printable(result.text()));
        else
            LogFile::warnf("The audit trail is written again; what was asked meanwhile is not in it");
    }
}

}  // namespace Kdd::Access
