#pragma once

#include "server/dicomweb/search/StudyRule.h"

#include <gtest/gtest.h>

#include <memory>

namespace Kdd
{

/// The limits of somebody who may see the studies of one patient.
inline std::shared_ptr<const Kxg::StudyLimits> onlyPatient(const char* id)
{
    DicomWeb::StudyRule rule;
    EXPECT_TRUE(DicomWeb::StudyRule::resolve("PatientID", rule));
    return std::make_shared<Kxg::StudyLimits>(Kxg::StudyLimits{{rule.limit({QString::fromLatin1(id)})}});
}

}  // namespace Kdd
