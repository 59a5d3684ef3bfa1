#pragma once

namespace Kdd
{

class StudyTree;

// The label of a series (0006,7120), by which users tell the series of a study apart.

/// Whether any series has a label: then all are to have one. Labels are distinct only among the series that were there
/// when they were made, so they are made anew when series come or go.
bool hasLabels(const StudyTree& tree);

/// Gives every series a label that no other series of the study has.
void createLabels(StudyTree& tree);

}  // namespace Kdd
