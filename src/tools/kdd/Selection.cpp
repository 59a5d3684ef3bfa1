#include "tools/kdd/Selection.h"

#include <kddlib/LogFile.h>

#include <fstream>
#include <iostream>
#include <string>

namespace Kdd
{

namespace
{

/// Lines without anything are passed over. By streams of bytes, for a path need not be text.
bool readList(const QByteArray& name, QList<QByteArray>& paths)
{
    const bool isInput = name == "-";
    std::ifstream file;
    if (!isInput)
        file.open(name.constData(), std::ios::binary);
    std::istream& list = isInput ? std::cin : file;
    for (std::string line; std::getline(list, line);) {
        if (!line.empty() && line.back() == '\r')
            line.pop_back();
        if (!line.empty())
            paths.append(QByteArray::fromStdString(line));
    }
    // A stream that came to its end has failed to read a further line, and nothing else.
    if (list.eof() && !list.bad())
        return true;
    LogFile::errorf("The list %s cannot be read", name.constData());
    return false;
}

}  // namespace

void ScanRequest::addTo(ArgumentList& arguments)
{
    arguments.texts({"PATH", kPath, "Files, folders and addresses of objects (http://, https://, gs://)"},
                    paths);
    arguments.text({"--from", kFile, "A list of such, one a line; \"-\" is standard input"}, from);
    arguments.flag("--tolerant", tolerant,
                   "Of damaged DICOM files take what is sound, with a warning that says what is left out");
    arguments.number("--jobs", 1, 256, jobs, "Files read at once; otherwise as many as there are cores");
}

bool ScanRequest::collect(QList<QByteArray>& all, Outcome& outcome) const
{
    all = paths;
    if (!from.isEmpty() && !readList(from, all)) {
        outcome = Outcome::Failed;
        return false;
    }
    outcome = Outcome::Done;
    if (all.isEmpty() && from.isEmpty()) {
        LogFile::errorf("Nothing is named: give paths, or a list with --from");
        outcome = Outcome::WrongUsage;
    }
    return outcome == Outcome::Done;
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
