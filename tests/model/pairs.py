"""Each operation after each other one, over the same studies, and the table of docs/operations.md that tells of them."""
import re

# Of study 1.1 an older tag file is kept aside; 1.2 is where images are moved to.
BEFORE = ["write a/0 1.1 1.1.0 9.0 Doe^1 00", "write a/1 1.1 1.1.0 9.1 Doe^1 01", "write b/0 1.2 1.2.0 9.8 Doe^2 05", "add .",
          "keep 1.1", "write a/2 1.1 1.1.0 9.2 Doe^1 02", "write a/3 1.1 1.1.1 9.3 Doe^1 03", "add ."]

# Name, what the page calls it as what was done and as what is done next, and what is done: at first, and when it was done before.
OPERATIONS = (
    ("add", "add", "add", "write a/4 1.1 1.1.0 9.4 Doe^1 04; add .", "write a/5 1.1 1.1.0 9.5 Doe^1 05; add ."),
    ("index", "index", "index", "write b/4 1.1 1.1.0 9.6 Doe^1 06; index .", "write b/5 1.1 1.1.0 9.7 Doe^1 07; index ."),
    ("build", "build", "build", "build"),
    ("settle", "build", "build", "settle"),
    ("build --all", "build", "build", "build-all"),
    ("build --all --again", "build", "build --all --again", "build-again"),
    ("stack", "stack", "stack", "stack 1.1", "stack 1.1 again"),
    ("sync", "sync", "sync", "sync 1.1"),
    ("edit", "qa: edit", "qa", "edit kdd 1.1 9.1 Roe^1", "edit kdd 1.1 9.1 Roe^2"),
    ("edit by the server", "qa: edit", "qa", "edit http 1.1 9.1 Roe^1", "edit http 1.1 9.1 Roe^2"),
    ("edit by the C interface", "qa: edit", "qa", "edit c 1.1 9.1 Roe^1", "edit c 1.1 9.1 Roe^2"),
    ("move", "qa: move", "move", "move kdd 1.1 9.1 1.2 1.2.0", "move kdd 1.2 9.1 1.1 1.1.0"),
    ("move by the server", "qa: move", "move", "move http 1.1 9.1 1.2 1.2.0", "move http 1.2 9.1 1.1 1.1.0"),
    ("move to a series", "qa: move", "move", "move kdd 1.1 9.1 1.1 1.1.1", "move kdd 1.1 9.1 1.1 1.1.0"),
    ("delete an image", "delete", "delete", "delete kdd 1.1 - 9.1"),
    ("delete a series", "delete", "delete", "delete kdd 1.1 1.1.0 -"),
    ("delete a study", "delete", "delete", "delete kdd 1.1 - -"),
    ("delete by the server", "delete", "delete", "delete-shown http 1.1 1; delete http 1.1 - -"),
    ("object arrives over HTTP", "object arrives", "object arrives", "store http 1.1 1.1.0 9.4 Doe^1 08",
     "store http 1.1 1.1.0 9.4 Doe^1 08"),
    ("object arrives over an association", "object arrives", "object arrives", "store dimse 1.1 1.1.0 9.1 Doe^1 01",
     "store dimse 1.1 1.1.0 9.1 Doe^2 01"),
    ("object replaces", "object arrives", "object arrives", "same-uid replace; store http 1.1 1.1.0 9.1 Doe^2 01"),
    ("replace a file", "file changed", "file changed", "write a/1 1.1 1.1.0 9.1 Doe^2 01; add ."),
    ("replace by another study's", "file changed", "file changed", "write a/1 1.3 1.3.0 9.9 Doe^2 01; add .",
     "write a/1 1.1 1.1.0 9.1 Doe^2 01; add ."),
    ("change a file", "file changed", "file changed", "write a/1 1.1 1.1.0 9.1 Roe^2 09"),
    ("change a file in the same tick", "file changed", "file changed", "write a/1 1.1 1.1.0 9.1 Roe^2 09 same-stamp"),
    ("change a clock", "file changed", "file changed", "touch a/1"),
    ("lose a file", "file removed", "file removed", "unlink a/1", "unlink a/2"),
    ("restore an old tag file", "tag file gone, old, damaged or another's", "tag file changed", "restore 1.1"),
    ("lose a tag file", "tag file gone, old, damaged or another's", "tag file changed", "drop 1.1"),
    ("cut a tag file", "tag file gone, old, damaged or another's", "tag file changed", "cut 1.1 50"),
    ("put another tag file", "tag file gone, old, damaged or another's", "tag file changed", "swap 1.1 1.2"),
    ("take out of a tag file", "tag file gone, old, damaged or another's", "tag file changed", "c-delete 1.1 9.1"),
    ("delete a tag file", "tag file gone, old, damaged or another's", "tag file changed", "c-drop 1.1"),
    ("read and sync", "setting or server changed", "setting or server changed", "c-read 1.1"),
    ("compression", "setting or server changed", "setting or server changed", "compression lzma; build-again",
     "compression none; build-again"),
    ("locale", "setting or server changed", "setting or server changed", "locale de_DE.UTF-8"),
    ("kill the server", "setting or server changed", "setting or server changed", "kill-server"),
    ("kill an add", "add", "kill and repeat", "write a/6 1.1 1.1.0 9.7 Doe^1 10; kill 9 add .",
     "write b/6 1.1 1.1.0 9.6 Doe^1 11; kill 12 add ."),
    ("kill an edit", "qa: edit", "kill and repeat", "kill 9 edit kdd 1.1 9.2 Roe^1", "kill 12 edit kdd 1.1 9.2 Roe^2"),
    ("kill a move", "qa: move", "kill and repeat", "kill 9 move kdd 1.1 9.2 1.2 1.2.1", "kill 12 move kdd 1.2 9.2 1.1 1.1.0"),
    ("kill a removal", "delete", "kill and repeat", "kill 9 delete kdd 1.1 - 9.2"),
    ("add while all is built", "add", "add", "write a/6 1.1 1.1.0 9.7 Doe^1 10; both add . + build-again"),
    ("remove while all is built", "delete", "delete", "both delete kdd 1.1 - 9.2 + build-again"),
    ("edit while all is built", "qa: edit", "qa", "both edit kdd 1.1 9.2 Roe^1 + build-again"),
)


def sequences():
    for first in OPERATIONS:
        for second in OPERATIONS:
            lines = (first[3] + "; " + second[-1 if first is second else 3]).split("; ")
            yield name_of(first, second), ["quietly " + line for line in BEFORE] + lines + ["build-all"]


def cells_of(names):
    """Where the page tells of what was done."""
    return {(first[1], second[2]) for first in OPERATIONS for second in OPERATIONS if name_of(first, second) in names}


def name_of(first, second):
    return "%s, then %s" % (first[0], second[0])


def told(page):
    """The cells that the page's tables have, pairs of which they have none, and cells of which there is no pair."""
    with open(page, encoding="utf-8") as text:
        lines = [line for line in text if line.startswith("|")]
    cells, columns = set(), None
    for line in lines:
        words = [word.strip() for word in line.strip().strip("|").split("|")]
        if words[0].startswith("before"):
            columns = words[1:]
        elif columns and words[0].startswith("**"):
            cells |= {(words[0].strip("*"), re.sub(r"`", "", column)) for column in columns}
        elif not words[0].startswith("-"):
            columns = None
    done = {(first[1], second[2]) for first in OPERATIONS for second in OPERATIONS}
    return cells, sorted(done - cells), sorted(cells - done)
