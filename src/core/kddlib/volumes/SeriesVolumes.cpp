#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"

#include <memory>

namespace Kdd
{

namespace
{

/// Owns the volumes of a series; the copy of a node only shares them, as it shares elements and children.
class SeriesVolumes : public VolumeHolder
{
public:
    enum class Ownership { Owns, Shares };

    explicit SeriesVolumes(Ownership ownership)
        : mOwnership(ownership)
    {
    }

    ~SeriesVolumes() override
    {
        if (mOwnership == Ownership::Owns)
            qDeleteAll(list());
    }

    std::unique_ptr<VolumeHolder> share() const override
    {
        auto shared = std::make_unique<SeriesVolumes>(Ownership::Shares);
        shared->list() = list();
        return shared;
    }

    void forgetFileSuffixes() override
    {
        for (Volume* volume : qAsConst(list()))
            volume->setFileNameSuffix(QByteArray());
    }

private:
    Ownership mOwnership;
};

}  // namespace

/// Whoever changes the list comes through here: only this room can make a holder.
QList<Volume*>& TagMap::obtainVolumes()
{
    if (mVolumes == nullptr)
        mVolumes = std::make_unique<SeriesVolumes>(mOwns ? SeriesVolumes::Ownership::Owns
                                                         : SeriesVolumes::Ownership::Shares);
    return mVolumes->list();
}

void TagMap::addBareVolume(Volume* volume)
{
    QList<Volume*>& held = obtainVolumes();
    if (held.contains(volume))
        return;  // it would be deleted twice
    held.append(volume);
    if (volume->mVolumeIndex < 0)
        volume->mVolumeIndex = held.size();
}

}  // namespace Kdd
