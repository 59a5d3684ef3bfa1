#pragma once

namespace Kdd
{

class SampleFolder;
struct SampleStudy;

// One function for each kind of study; it writes as many files as `study.images` says, at least the fixed
// ones. SampleFault: a file could not be written.

/// Scout, axial stack, lung stack, a presentation state and a report: at least 7 files.
void writeCtStudy(const SampleStudy& study, SampleFolder& folder);

/// Three localizers and a stack: at least 5 files.
void writeMrStudy(const SampleStudy& study, SampleFolder& folder);

/// A grey and a colour clip: 2 files.
void writeUltrasoundStudy(const SampleStudy& study, SampleFolder& folder);

/// The four standard views: 4 files.
void writeMammogramStudy(const SampleStudy& study, SampleFolder& folder);

/// A chest from the front and from the side: 2 files.
void writeRadiographStudy(const SampleStudy& study, SampleFolder& folder);

/// A scanned request form: 1 file.
void writeCaptureStudy(const SampleStudy& study, SampleFolder& folder);

}  // namespace Kdd
