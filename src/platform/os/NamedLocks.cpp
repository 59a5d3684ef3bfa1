#include "platform/os/NamedLocks.h"

#include <QCryptographicHash>
#include <QtEndian>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

namespace Kdd
{

namespace
{

constexpr mode_t kFileMode = 0666;  // less the umask

/// Nothing has to be there.
off_t placeOf(const QByteArray& name)
{
    const QByteArray digest = QCryptographicHash::hash(name, QCryptographicHash::Md5);
    return static_cast<off_t>(qFromBigEndian<quint64>(digest.constData()) >> 2);
}

}  // namespace

NamedLocks::~NamedLocks()
{
    if (mDescriptor >= 0)
        ::close(mDescriptor);
}

SystemResult NamedLocks::open(const QByteArray& path)
{
    mDescriptor = ::open(path.constData(), O_RDWR | O_CREAT | O_CLOEXEC, kFileMode);
    return SystemResult::of(mDescriptor < 0 ? errno : 0);
}

SystemResult NamedLocks::acquire(const QByteArray& name, IfHeld ifHeld)
{
    struct flock place = {};
    place.l_type = F_WRLCK;
    place.l_whence = SEEK_SET;
    place.l_start = placeOf(name);
    place.l_len = 1;
    // Of the open file and not of the process, whose threads would not shut each other out.
    const int how = ifHeld == IfHeld::Fail ? F_OFD_SETLK : F_OFD_SETLKW;
    int answer = ::fcntl(mDescriptor, how, &place);
    while (answer != 0 && errno == EINTR)
        answer = ::fcntl(mDescriptor, how, &place);
    return SystemResult::of(answer == 0 ? 0 : errno == EACCES ? EWOULDBLOCK : errno);
}

void NamedLocks::release()
{
    struct flock all = {};
    all.l_type = F_UNLCK;
    all.l_whence = SEEK_SET;
    ::fcntl(mDescriptor, F_OFD_SETLK, &all);
}

}  // namespace Kdd
