#include "platform/volumefile/Hdf5.h"

#include "platform/volumefile/VolumeFileFormat.h"

namespace Kdd::VolumeFile
{
namespace
{

/// The first version of object headers that has a checksum.
constexpr unsigned kChecksummedHeader = 2;

/// Walking upward begins with the innermost function, which knows the reason best.
herr_t takeFirst(unsigned position, const H5E_error2_t* error, void* reason)
{
    if (position == 0 && error->desc != nullptr)
        *static_cast<QString*>(reason) = QString::fromUtf8(error->desc);
    return 0;
}

QString failedFor(const char* format, const QByteArray& name)
{
    return QString::fromLatin1(format).arg(QString::fromUtf8(name));
}

struct Listing
{
    QVector<QByteArray>& names;
    QByteArray refused;
};

// The walks below run inside the library, which knows no exceptions; the numbers of names are bounded before.

herr_t takeMember(hid_t /*group*/, const char* name, const H5L_info_t* info, void* target)
{
    auto& listing = *static_cast<Listing*>(target);
    // A soft or external link would make reading follow a path of the file's choice, perhaps into another
    // file.
    if (info->type != H5L_TYPE_HARD || !isName(name))
        listing.refused = name;
    listing.names.append(name);
    // One that is refused ends the walk: its name is the message.
    return listing.refused.isNull() ? 0 : 1;
}

herr_t takeAttribute(hid_t /*object*/, const char* name, const H5A_info_t* /*info*/, void* target)
{
    static_cast<QVector<QByteArray>*>(target)->append(name);
    return 0;
}

}  // namespace

QuietErrors::QuietErrors()
{
    // A host may have set the library's older form of printing, which cannot be read or restored by the newer
    // functions.
    if (H5Eauto_is_v2(H5E_DEFAULT, &mIsVersion2) < 0 || mIsVersion2 == 0)
        return;
    H5Eget_auto2(H5E_DEFAULT, &mPrint, &mData);
    H5Eset_auto2(H5E_DEFAULT, nullptr, nullptr);
}

QuietErrors::~QuietErrors()
{
    if (mIsVersion2 != 0)
        H5Eset_auto2(H5E_DEFAULT, mPrint, mData);
}

Result libraryFailure(const QString& what)
{
    QString reason;
    H5Ewalk2(H5E_DEFAULT, H5E_WALK_UPWARD, takeFirst, &reason);
    // The library does not always say.
    return reason.isEmpty() ? Result::failure(what) : Result::failure(reason).within(what);
}

Result listMembers(hid_t group, int limit, QVector<QByteArray>& names)
{
    H5G_info_t info = {};
    if (H5Gget_info(group, &info) < 0)
        return libraryFailure(QStringLiteral("cannot examine a group"));
    // Counted before they are listed, since the list takes memory for each.
    if (info.nlinks > static_cast<hsize_t>(limit))
        return Result::failure(
            QStringLiteral("a group has %1 members, %2 are the most").arg(info.nlinks).arg(limit));
    Listing listing{names, {}};
    if (H5Literate(group, H5_INDEX_NAME, H5_ITER_INC, nullptr, takeMember, &listing) < 0)
        return libraryFailure(QStringLiteral("cannot list a group"));
    if (!listing.refused.isNull())
        return Result::failure(
            failedFor("\"%1\" is a link to elsewhere or has no proper name", listing.refused));
    return {};
}

Result listAttributes(hid_t object, int limit, QVector<QByteArray>& names)
{
    H5O_info_t info = {};
    if (H5Oget_info2(object, &info, H5O_INFO_NUM_ATTRS) < 0)
        return libraryFailure(QStringLiteral("cannot count attributes"));
    if (info.num_attrs > static_cast<hsize_t>(limit))
        return Result::failure(
            QStringLiteral("%1 attributes, %2 are the most").arg(info.num_attrs).arg(limit));
    if (H5Aiterate2(object, H5_INDEX_NAME, H5_ITER_INC, nullptr, takeAttribute, &names) < 0)
        return libraryFailure(QStringLiteral("cannot list attributes"));
    return {};
}

Result openMember(hid_t group, const QByteArray& name, Handle& object)
{
    object = Handle(H5Oopen(group, name.constData(), H5P_DEFAULT), H5Oclose);
    if (!object.isOpen())
        return libraryFailure(failedFor("cannot open \"%1\"", name));
    H5O_info_t info = {};
    if (H5Oget_info2(object.id(), &info, H5O_INFO_HDR) < 0)
        return libraryFailure(failedFor("cannot examine \"%1\"", name));
    // Damage to metadata without checksums goes unnoticed until the library follows it.
    if (info.hdr.version < kChecksummedHeader)
        return Result::failure(failedFor("\"%1\" has no checksum", name));
    return {};
}

Result openGroup(hid_t parent, const QByteArray& name, Handle& group)
{
    Result opened = openMember(parent, name, group);
    if (opened.bad())
        return opened;
    if (H5Iget_type(group.id()) != H5I_GROUP)
        return Result::failure(failedFor("\"%1\" is no group", name));
    return {};
}

}  // namespace Kdd::VolumeFile
