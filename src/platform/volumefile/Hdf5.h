#pragma once

#include "platform/base/Result.h"

#include <QByteArray>
#include <QString>
#include <QVector>

#include <hdf5.h>

#include <utility>

namespace Kdd::VolumeFile
{

/// Owns something open in the HDF5 library, and closes it. May be moved, not copied.
class Handle
{
public:
    using Close = herr_t (*)(hid_t);

    Handle() = default;
    Handle(hid_t id, Close closeId)
        : mId(id)
        , mClose(closeId)
    {
    }
    Handle(Handle&& other) noexcept { swap(other); }
    Handle& operator=(Handle&& other) noexcept
    {
        swap(other);
        return *this;
    }
    ~Handle() { close(); }

    bool isOpen() const { return mId >= 0; }
    hid_t id() const { return mId; }

    /// False when the library reports an error, as for what it could not write.
    bool close() { return mId < 0 || mClose(std::exchange(mId, H5I_INVALID_HID)) >= 0; }

private:
    void swap(Handle& other) noexcept
    {
        std::swap(mId, other.mId);
        std::swap(mClose, other.mClose);
    }

    hid_t mId = H5I_INVALID_HID;
    Close mClose = nullptr;
};

/// Keeps the library from printing errors while it lives, on this thread. What the host had set is in force again
/// afterwards.
class QuietErrors
{
public:
    QuietErrors();
    ~QuietErrors();
    QuietErrors(const QuietErrors&) = delete;
    QuietErrors& operator=(const QuietErrors&) = delete;

private:
    unsigned mIsVersion2 = 1;
    H5E_auto2_t mPrint = nullptr;
    void* mData = nullptr;
};

/// A failure with the library's own reason. To be called directly after the call that failed.
Result libraryFailure(const QString& what);

/// The names of the members of a group, ascending. Failure when there are more than `limit`, or when one of them leads
/// elsewhere, to another file for example.
Result listMembers(hid_t group, int limit, QVector<QByteArray>& names);

/// The names of the attributes of an object, ascending; failure when there are more than `limit`.
Result listAttributes(hid_t object, int limit, QVector<QByteArray>& names);

/// Opens a member of a group, of any kind: H5Iget_type tells. Failure when its metadata have no checksums, for those
/// can bring the library down.
Result openMember(hid_t group, const QByteArray& name, Handle& object);

/// The same for a group.
Result openGroup(hid_t parent, const QByteArray& name, Handle& group);

}  // namespace Kdd::VolumeFile
