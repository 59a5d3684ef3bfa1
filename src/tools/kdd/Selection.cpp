#include "tools/kdd/Selection.h"

namespace Kdd
{

void ScanRequest::addTo(ArgumentList& arguments)
{
    arguments.texts({"PATH", kPath, "Files and folders", true}, paths);
    arguments.flag("--tolerant", tolerant,
                   "Of damaged DICOM files take what is sound, with a warning that says what is left out");
    arguments.number("--jobs", 1, 256, jobs, "Files read at once; otherwise as many as there are cores");
}

void StudySelection::addTo(ArgumentList& arguments)
{
    arguments.texts({"UID", kStudy, "Study Instance UIDs, or unique beginnings of them"}, studies);
    arguments.flag("--all", all, "Every study");
}

void NodeSelection::addTo(ArgumentList& arguments)
{
    arguments.text(kOneStudy, study);
    arguments.text({"--series", kUid, "Series Instance UID"}, series);
    arguments.text({"--image", kUid, "SOP Instance UID"}, image);
}

}  // namespace Kdd
