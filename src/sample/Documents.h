#pragma once

namespace Kdd
{

class SampleFolder;
struct SampleSeries;

/// A presentation state with annotations of the first and the third of `slices` and of the only image of
/// `scout`.
void writePresentationState(const SampleSeries& scout, const SampleSeries& slices, SampleFolder& folder);

/// A report of nested headings that refers to the second of `slices`.
void writeReport(const SampleSeries& slices, SampleFolder& folder);

}  // namespace Kdd
