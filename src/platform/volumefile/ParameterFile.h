#pragma once

#include "platform/base/Result.h"
#include "platform/volumefile/ParamBundle.h"
#include "platform/volumefile/VolumeFileFormat.h"

#include <hdf5.h>

// Parameters as a volume file keeps them: a bundle is a group, a parameter an attribute of the group, or a dataset in
// it when it is long.
namespace Kdd::VolumeFile
{

/// What a file may still spend on parameters.
struct ParameterBudget
{
    int depth = kMaxBundleDepth;
    int bundles = kMaxBundles;
    int parameters = kMaxParameters;
    qint64 bytes = kMaxParameterBytes;
};

/// Takes one parameter of so many bytes from the budget; failure when that is too small. Writers ask it too, so that
/// nothing is written that would not be read.
Result spend(ParameterBudget& budget, qint64 bytes);

/// Reads an attribute that is a parameter.
Result readAttribute(hid_t object, const QByteArray& name, ParameterBudget& budget, Parameter& parameter);

/// Reads the bundle that a group stands for, with those below it.
Result readBundle(hid_t group, ParameterBudget& budget, ParamBundle& bundle);

Result writeAttribute(hid_t object, const QByteArray& name, const Parameter& parameter);

/// Writes a bundle into an empty group. What readers would refuse is refused.
Result writeBundle(hid_t group, ParameterBudget& budget, const ParamBundle& bundle);

}  // namespace Kdd::VolumeFile
