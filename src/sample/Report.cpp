#include "sample/Documents.h"
#include "sample/Series.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

namespace Kdd
{

namespace
{

const SampleAttribute kDocument[] = {
    {DCM_Manufacturer, "Sample Imaging"}, {DCM_CompletionFlag, "COMPLETE"},
    {DCM_VerificationFlag, "UNVERIFIED"}, {DCM_PreliminaryFlag, "FINAL"},
    {DCM_ValueType, "CONTAINER"},         {DCM_ContinuityOfContent, "SEPARATE"},
};

const SampleCode kTitle = {"18748-4", "LN", "Diagnostic imaging report"};
const SampleCode kObserver = {"121008", "DCM", "Person Observer Name"};
const SampleCode kFindings = {"121070", "DCM", "Findings"};
const SampleCode kFinding = {"121071", "DCM", "Finding"};
const SampleCode kDistance = {"121206", "DCM", "Distance"};
const SampleCode kConclusions = {"121076", "DCM", "Conclusions"};
const SampleCode kConclusion = {"121077", "DCM", "Conclusion"};
const SampleCode kImage = {"121080", "DCM", "Best illustration of finding"};
const SampleCode kMillimetre = {"mm", "UCUM", "millimeter"};

// Longer than most values, with line ends in it, and within what a tag file keeps.
const char* const kLongFinding = "In the right lower lobe lies a round nodule that is clearly delimited and "
                                 "not calcified. It lies against the "
                                 "pleura, which is not thickened. There are no further nodules, no effusion "
                                 "and no enlarged lymph nodes. The "
                                 "heart is of normal size. Bones without signs of "
                                 "destruction.\r\n\r\nCompared with the last study the nodule "
                                 "has not grown.";

SampleDataset content(SampleDataset& parent, const char* type, const SampleCode& name)
{
    SampleDataset item = parent.item(DCM_ContentSequence);
    // Each item says how it belongs to the one above it, of what kind it is and what it is called.
    item.with(DCM_RelationshipType, "CONTAINS").with(DCM_ValueType, type);
    return item.withCode(DCM_ConceptNameCodeSequence, name);
}

SampleDataset heading(SampleDataset& parent, const SampleCode& name)
{
    return content(parent, "CONTAINER", name).with(DCM_ContinuityOfContent, "SEPARATE");
}

void addDistance(SampleDataset& parent, SampleRandom& random)
{
    content(parent, "NUM", kDistance)
        .item(DCM_MeasuredValueSequence)
        .with(DCM_NumericValue, decimal(random.between(30, 90) / 10.0, 1))
        .withCode(DCM_MeasurementUnitsCodeSequence, kMillimetre);
}

void addFindings(SampleDataset& document, const SampleSeries& slices, SampleRandom& random)
{
    SampleDataset findings = heading(document, kFindings);
    SampleDataset nodule = heading(findings, kFinding);
    content(nodule, "TEXT", kFinding).with(DCM_TextValue, kLongFinding);
    content(nodule, "CODE", kFinding)
        .item(DCM_ConceptCodeSequence)
        // Too long for the usual code value, so it stands in the attribute for long ones.
        .with(DCM_LongCodeValue, "round-nodule/clearly-delimited")
        .with(DCM_CodingSchemeDesignator, "99SAMPLE")
        .with(DCM_CodeMeaning, "Clearly delimited round nodule");
    addDistance(nodule, random);
    SampleDataset image = content(nodule, "IMAGE", kImage);
    // The report points to one image, whose series and study it names as evidence below.
    slices.refer(image, DCM_ReferencedSOPSequence, 2);
}

void addEvidence(SampleDataset& document, const SampleSeries& slices)
{
    // What the report refers to is listed once more, below its study and its series.
    SampleDataset study = document.item(DCM_CurrentRequestedProcedureEvidenceSequence);
    study.with(DCM_StudyInstanceUID, slices.study.uid("study"));
    SampleDataset series = study.item(DCM_ReferencedSeriesSequence);
    series.with(DCM_SeriesInstanceUID, slices.uid())
        .with(DCM_RetrieveURL, "https://archive.sample.example/studies/" + slices.study.uid("study"));
    slices.refer(series, DCM_ReferencedSOPSequence, 2);
}

}  // namespace

void writeReport(const SampleSeries& slices, SampleFolder& folder)
{
    const SampleSeries series = {slices.study, 901, "SR", UID_BasicTextSRStorage, "Report", 2700};
    SampleObject object(series, 1, 8);
    SampleDataset& document = object.dataset();
    document.withAll(kDocument).withCode(DCM_ConceptNameCodeSequence, kTitle);
    series.study.describeRequest(document);
    addEvidence(document, slices);
    content(document, "PNAME", kObserver).with(DCM_PersonName, "Reader^First");
    addFindings(document, slices, object.random());
    SampleDataset conclusions = heading(document, kConclusions);
    content(conclusions, "TEXT", kConclusion).with(DCM_TextValue, "No change. Control in a year.");
    object.saveTo(folder);
}

}  // namespace Kdd
