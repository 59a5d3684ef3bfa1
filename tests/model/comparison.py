"""Holds everything that an archive shows at its doors against the model."""
import contextlib
import glob
import json
import os
import time

from archivefaults import all_faults, faults, is_settled
from frontdoors import Difference, content_of

STUDIES = ("1.1", "1.2", "1.3")
LATE = 20  # [s] that the study of an object that arrived may take


def compare(sequence, is_late):
    """`is_late`: an object has arrived, whose study is completed soon."""
    end = time.monotonic() + (LATE if is_late else 0)
    while True:
        try:
            return compare_once(sequence)
        except Difference:
            if time.monotonic() >= end:
                raise
            time.sleep(0.05)


def compare_once(sequence):
    # What takes longest runs meanwhile.
    commands = (("--json", "list"), ("verify", "--all"))
    running = [sequence.site.begin(*command) for command in commands]
    found = []
    try:
        compare_requests(sequence)
    except Difference as difference:
        found.append(difference)
    listed, verified = (sequence.site.finish(process, command) for process, command in zip(running, commands))
    if found:
        raise found[0]
    compare_list(sequence, *listed)
    compare_verify(sequence, *verified)


def compare_requests(sequence):
    for study in STUDIES:
        compare_metadata(sequence, study, sequence.count % 3 == 0)
    compare_searches(sequence)
    compare_objects(sequence)


def differ(what, got, wanted):
    if got != wanted:
        raise Difference("%s: %s instead of %s" % (what, got, wanted))


def compare_list(sequence, code, out, said):
    model = sequence.model
    differ("kdd list ends with", (code, said), (0, ""))
    got = {each["study"]: (each["images"], each["volumes"], each["waiting"], each["bytes"] > 0)
           for each in json.loads(out)["studies"]}
    wanted = {study: (len(model.listed_images(study)), sum(count for place, count in model.volumes.items() if place[0] == study),
                      study in model.waiting,
                      study in model.there and os.path.getsize(sequence.site.tag_file(study)) > 0 if
                      os.path.exists(sequence.site.tag_file(study)) else study in model.there)
              for study in model.listed()}
    differ("kdd list", got, wanted)


def value_of(image, tag):
    values = image.get(tag, {}).get("Value", [""])
    value = values[0]["Alphabetic"] if isinstance(values[0], dict) else values[0]
    return "%02d" % value if isinstance(value, (int, float)) else str(value)


def compare_metadata(sequence, study, by_command):
    model = sequence.model
    wanted = None
    if study in model.shown:
        wanted = sorted(tuple(image.shows) for image in model.shown[study].values())
    # What is there of a study that the database does not know is nobody's.
    elif not model.is_known(study):
        return
    if not model.is_known(study):
        return
    if by_command:
        code, out, said = sequence.site.run("metadata", study)
        images = json.loads(out) if code == 0 else None
    else:
        images = sequence.site.get("/studies/%s/metadata" % study)
    got = images and sorted(tuple(value_of(image, tag) for tag in ("0020000D", "0020000E", "00080018", "00100010", "00200013"))
                            for image in images)
    differ("study %s shows" % study, got, wanted)


def compare_searches(sequence):
    """Each study that is built is found, and said to have the images that its tag file has."""
    model = sequence.model
    for study in STUDIES:
        if study not in model.shown or not model.listed_images(study):
            continue
        found = sequence.site.get("/studies?StudyInstanceUID=%s&includefield=00201208" % study)
        differ("a search for study %s finds" % study, len(found or ()), 1)
        counted = int(found[0]["00201208"]["Value"][0])
        differ("a search counts the images of study %s as" % study, counted, len(model.shown[study]))
        patients = {image.shows.patient for image in model.shown[study].values()}
        if value_of(found[0], "00100010") not in patients:
            raise Difference("a search has study %s of %s, and its images are of %s" % (study, found[0]["00100010"], patients))
        if sequence.count % 16 == 0:
            differ("C-FIND counts the images of study %s as" % study, sequence.site.find_by_association(study),
                   len(model.shown[study]))


def compare_verify(sequence, code, _, said):
    model = sequence.model
    wanted = all_faults(model)
    for fault in wanted:
        if fault not in said:
            raise Difference('kdd verify does not say "%s":\n%s' % (fault, said))
    if not wanted and (code != 0 or said):
        raise Difference("kdd verify finds what is not there:\n" + said)
    differ("kdd verify ends with", code, 1 if wanted else 0)


def compare_objects(sequence):
    """Nothing that arrived is lost, changed or left over."""
    known = {path for path in sequence.model.disk if path.startswith(sequence.site.objects + "/")}
    differ("objects", sequence.site.stored_objects(), known)


def compare_with_build(sequence):
    """What nothing happened to but that it grew is, byte for byte, what a build makes in an empty place."""
    site = sequence.site
    for step in ("add .", "settle", "build-all"):
        sequence.run(step)
    settled = {study: content_of(site.tag_file(study)) for study in STUDIES
               if is_settled(sequence.model, study) and sequence.written[study][1] == sequence.compression}
    site.stop()
    elsewhere = os.path.join(site.folder, "elsewhere")
    built = []
    for name in ("first", "second"):
        site.environment["KDD_META_FOLDER"] = os.path.join(elsewhere, name)
        code, _, said = site.run("build", "--all", "--again")
        built.append({study: content_of(site.tag_file(study)) for study in STUDIES})
        for study, content in settled.items():
            if built[-1][study] != content:
                raise Difference("study %s is settled, and a build makes another tag file" % study)
    # Of what cannot be read the second build finds no former tag file to keep.
    for study in STUDIES:
        if not faults(sequence.model, study) and built[0][study] != built[1][study]:
            raise Difference("two builds of study %s make different tag files" % study)
