"""What has to be there when all clients have ended."""
import collections
import hashlib
import json
import os
import time

from deployedsite import ANSWERS


def tag_file_of(study):
    """Its place in the folder of tag files."""
    name = hashlib.md5(study.encode() + b"\n").hexdigest()
    return os.path.join(name[:2], name[2:4], name[4:] + ".tc")


def arriving(site):
    """The files of objects that are on their way."""
    return [name for folder, _, names in os.walk(os.path.join(site.store, "objects", ".incoming")) for name in names
            if name.isdigit() and os.path.basename(folder) != "locks"]


def check(site, clients):
    """Of the archive when nothing runs any more."""
    # What the killed ones left half way is looked after by the next server.
    site.start("server0")
    end = time.monotonic() + 60
    while arriving(site) and time.monotonic() < end:
        time.sleep(0.1)
    if site.end("server0") != 0:
        clients.fault("A server does not end in order")
    site.run("build", "--settle", "--quiet")
    site.run("verify", "--all", "--deep", "--quiet")
    shown = collections.Counter()
    for study in json.loads(site.run("list", "--json"))["studies"]:
        expected = clients.corrected.get(study["study"], {}).items()
        for image in json.loads(site.run("metadata", study["study"])):
            shown[image["00080018"]["Value"][0]] += 1
            if not expected <= image.items():
                clients.fault(f"Study {study['study']} does not show {dict(expected)}")
    lost = set(clients.acknowledged) - set(shown)
    twice = [uid for uid, count in shown.items() if count != 1]
    files = collections.Counter(name for _, _, names in os.walk(os.path.join(site.store, "objects"))
                                for name in names if name.endswith(".dcm"))
    for text, uids in (("Lost", lost), ("Twice", twice), ("Files of one object", [n for n in files if files[n] != 1]),
                       ("Files of nothing", set(n[:-4] for n in files) - set(shown)), ("Left behind", arriving(site))):
        if uids:
            clients.fault(f"{text}: {sorted(uids)[:5]}, {len(uids)} in all")
    check_against_scratch(site, clients)
    check_rebuilt(site, clients)
    kept = sum(os.path.getsize(path) for path in site.files("meta/answers"))
    if kept > 2 * ANSWERS << 20:
        clients.fault(f"Kept answers take {kept} bytes, and should {ANSWERS} MiB")
    return len(shown), len(site.tag_files())


def check_against_scratch(site, clients):
    other = os.path.join(site.folder, "other")
    elsewhere = {"KDD_STORE": other, "KDD_DATABASE": "sqlite:" + os.path.join(other, "kdd.sqlite")}
    objects = os.path.join(site.store, "objects")
    site.run("index", "--quiet", *(os.path.join(objects, name) for name in sorted(os.listdir(objects)) if name[0] != "."),
             **elsewhere)
    site.run("build", "--quiet", **elsewhere)
    ours, scratch = site.tag_files(), site.tag_files(other)
    differing = {name for name in set(ours) | set(scratch) if ours.get(name) != scratch.get(name)}
    # What was corrected nobody else knows.
    differing ^= {tag_file_of(study) for study in clients.corrected}
    if differing or not ours:
        clients.fault(f"Not what a build from scratch makes: {sorted(differing)[:5]}, {len(differing)} of {len(ours)}")


def check_rebuilt(site, clients):
    """Of what was corrected: a build of all files makes each correction again."""
    before = {study: site.run("metadata", study) for study in clients.corrected}
    site.run("build", "--all", "--again", "--quiet")
    for study, metadata in before.items():
        if site.run("metadata", study) != metadata:
            clients.fault(f"Study {study} is another one when it is built anew")
