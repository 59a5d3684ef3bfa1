#!/usr/bin/env python3
"""Where the processor's work goes on the paths that are gone most: instructions as valgrind counts them, on which neither the
machine nor its load tell.

    bench/profile.py BUILD-FOLDER [IMAGES] [PATH ...]

A CT study of so many images (1,000) is taken in by `index` and by `add`, `merge` brings one image more, `stat` reads it and
`metadata` writes it as DICOM JSON. Of each path those functions are told that need, with what they call, the most, but for
such as do nothing else than to call one.
"""
import os
import re
import shutil
import subprocess
import sys
import tempfile

from servers import ImageTemplate, ct_slices

SIDE = 64  # rows and columns: it is the headers that are asked for
TOLD = 12  # functions
LEAST = 3.0  # of a hundred instructions
WRAPPER = 0.3  # likewise: what does so little itself is not told beside what it calls
LINE = re.compile(r"^ *([\d,]+) \( *([\d.]+)%\) +\S*?:((?:Kdd|Kxg)::.*?)(?: \[[^\]]*\])?$")


class Study:
    def __init__(self, kdd, folder, count):
        self.kdd, self.folder = kdd, folder
        # Several templates: attributes that differ by image in a true series differ here.
        templates = [ImageTemplate(data, SIDE) for data in ct_slices(kdd, folder)[:20]]
        self.uid = templates[0].study(0)
        for number in range(count + 1):
            self.write(templates[number % len(templates)], "more" if number == count else "images", number)

    def write(self, template, where, number):
        place = os.path.join(self.folder, where)
        os.makedirs(place, exist_ok=True)
        with open(os.path.join(place, "IM%05d.dcm" % number), "wb") as file:
            file.write(template.head_of(0, 1, number) + bytes(template.pixels))

    def env(self):
        store = os.path.join(self.folder, "store")
        return {**os.environ, "KDD_STORE": store, "KDD_DATABASE": "sqlite:" + store + "/kdd.sqlite"}

    def run(self, before, command):
        """The lines of the counts, after the commands that make the archive for it."""
        shutil.rmtree(self.env()["KDD_STORE"], ignore_errors=True)
        for each in before:
            subprocess.run([self.kdd, "--quiet", *each], env=self.env(), check=True)
        counts = os.path.join(self.folder, "counts")
        subprocess.run(["valgrind", "--quiet", "--tool=callgrind", "--callgrind-out-file=" + counts, self.kdd, *command],
                       env=self.env(), check=True, stdout=subprocess.DEVNULL)
        return subprocess.run(["callgrind_annotate", "--inclusive=yes", "--threshold=100", counts], check=True,
                              stdout=subprocess.PIPE, text=True).stdout.splitlines()


def name_of(function):
    """Without parameters, and without what says only that it is ours."""
    name = re.sub(r"\(anonymous namespace\)::|Kdd::|Kxg::", "", function)
    return re.sub(r"\(.*", "", name)


def report(title, count, lines):
    total = next(int(line.split()[0].replace(",", "")) for line in lines if "PROGRAM TOTALS" in line)
    print("\n**%s**: %s million instructions, %s thousand for an image\n\n| instructions | in |\n| --: | --- |"
          % (title, "{:,}".format(round(total / 1e6)), "{:,}".format(round(total / count / 1e3))))
    told, last = set(), 100.0
    for found in filter(None, map(LINE.match, lines)):
        name, share = name_of(found[3]), int(found[1].replace(",", "")) * 100 / total
        if share < LEAST or len(told) == TOLD:
            break
        if name != "run" and name not in told and last - share > WRAPPER:
            told.add(name)
            last = share
            print("| %.0f %% | `%s` |" % (share, name))


def main():
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    count = int(sys.argv[2]) if len(sys.argv) > 2 else 1000
    kdd = os.path.join(os.path.abspath(sys.argv[1]), "src/tools/kdd/kdd")
    folder = tempfile.mkdtemp(prefix="kdd-profile-")
    try:
        study = Study(kdd, folder, count)
        images, more = os.path.join(folder, "images"), os.path.join(folder, "more")
        paths = {"index": ([], ["index", images]), "add": ([], ["add", images]),
                 "merge": ([["add", images]], ["add", more]), "stat": ([["add", images]], ["stat", study.uid]),
                 "metadata": ([["add", images]], ["metadata", study.uid])}
        for path in sys.argv[3:] or paths:
            before, command = paths[path]
            shown = " ".join("STUDY" if each == study.uid else os.path.basename(each) for each in command)
            report("kdd " + shown, 1 if path == "merge" else count, study.run(before, command))
    finally:
        shutil.rmtree(folder, ignore_errors=True)


if __name__ == "__main__":
    main()
