#pragma once

#include "server/dimse/QueryEnding.h"

#include <QByteArray>

#include <kddlib/ObjectCustody.h>

#include <memory>
#include <vector>

class DcmDataset;
class DcmItem;

namespace Kdd::Dimse
{

/// Of the dataset of a request [bytes], and the objects that it names: some studies of thousands of images.
constexpr qint64 kMostCommitmentBytes = 4 * 1024 * 1024;
constexpr std::size_t kMostCommitmentObjects = 20000;

/// What somebody wants to leave to the archive alone, and what there is to say to that.
struct Commitment
{
    QByteArray transaction;  ///< UID that whoever asks made up, by which he knows the answer
    std::vector<ObjectReference> objects;

    /// Good, or the status that refuses the request, with the reason.
    static QueryEnding read(DcmItem& dataset, Commitment& commitment);

    bool isWhole() const;

    /// The dataset of the answer. `title` is that under which objects can be retrieved.
    std::unique_ptr<DcmDataset> answer(const QByteArray& title) const;
};

}  // namespace Kdd::Dimse
