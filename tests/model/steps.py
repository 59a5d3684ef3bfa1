"""The steps of a sequence: lines of words, each done to the archive and to its model. A line means the same whatever came before
it, so that lines can be left out; what there is nothing to do for is passed over."""
import copy
import json
import os
import signal
import time

from archivemodel import Archive, File
from comparison import STUDIES, compare
from dicomfile import bytes_of
from frontdoors import Difference, content_of, put_content

XML_JOB = """<Job><Timestamp>20240131120000</Timestamp><Login>anna</Login><Substitutions%s>
<Tag Group='%s' Element='%s'><Value>%s</Value></Tag></Substitutions></Job>"""


class Sequence:
    """One archive and its model, and what became of the steps so far."""

    def __init__(self, site):
        self.site, self.model = site, Archive()
        self.copies = {}   # study: bytes and content of a tag file that was kept aside
        self.written = {}  # study: bytes of the tag file written last, and how they were compressed
        self.compression = "zlib"
        self.count = 0     # of steps that did something
        self.is_late = False
        self.has_stored = False

    def run(self, line):
        """Does a step and, unless it is one to be done quietly, holds everything that can be seen against the model."""
        words = line.split()
        is_quiet = words[0] == "quietly"
        words = words[is_quiet:]
        self.is_late = False
        if self.has_stored:
            # A server that took an object looks at its study once more, some moments later, and takes in what waits then.
            self.site.stop()
            self.has_stored = False
        # So does one that finds a study at its beginning that cannot be completed, though it is removed and comes again.
        finds_waiting = self.site.server is None and bool(self.model.waiting_with_objects(self.site.objects))
        if getattr(self, "do_" + words[0].replace("-", "_"))(*words[1:]) != "passed over":
            self.count += not is_quiet
            if not is_quiet and self.model.look_after(self.site.objects):
                self.site.stop()
                self.site.start()
                self.is_late = self.has_stored = True
            self.has_stored |= finds_waiting and self.site.server is not None
            if not is_quiet:
                compare(self, self.is_late)
            self.note_written()

    def note_written(self):
        for study in STUDIES:
            content = content_of(self.site.tag_file(study))
            if study not in self.model.listed():
                self.written.pop(study, None)
            elif self.model.is_trusted(study) and self.written.get(study, (None,))[0] != content:
                self.written[study] = (content, self.compression)

    def expect(self, got, wanted, what, said=""):
        if bool(got) != bool(wanted):
            raise Difference("%s %s %s" % (what, "succeeds" if got else "fails", said))

    def path(self, name):
        return os.path.join(self.site.files, name) if "/" in name else name

    def folder(self, name):
        return self.site.files if name == "." else os.path.join(self.site.files, name)

    # ---- files

    def do_write(self, name, study, series, sop, patient, number, *same_stamp):
        path, file = self.path(name), File(study, series, "" if sop == "-" else sop, patient, number)
        # The clock of such a file stood still: nobody can tell by size and time that it is another one.
        is_same = bool(same_stamp) and path in self.model.disk and len(bytes_of(file)) == os.path.getsize(path)
        stamp = os.stat(path).st_mtime_ns if is_same else None
        put_content(path, bytes_of(file))
        self.model.write(path, file, is_same)
        self.set_clock(path, stamp)

    def set_clock(self, path, stamp=None):
        # To and fro, for nothing may depend on later files being younger.
        at = self.model.versions[path]
        stamp = stamp or (1600000000 + (at if at % 2 else -at) * 86400) * 10 ** 9
        os.utime(path, ns=(stamp, stamp))

    def do_touch(self, name):
        path = self.path(name)
        if path not in self.model.disk:
            return "passed over"
        self.model.touch(path)
        return self.set_clock(path)

    def do_unlink(self, name):
        path = self.path(name)
        if path not in self.model.disk:
            return "passed over"
        os.unlink(path)
        return self.model.unlink(path)

    def do_unlink_stored(self, number):
        """One of those that arrived over a network."""
        stored = sorted(self.site.stored_objects())
        if not stored:
            return "passed over"
        path = stored[int(number) % len(stored)]
        os.unlink(path)
        return self.model.unlink(path)

    # ---- commands

    def command(self, words):
        """Arguments of kdd, and what does the same to a model and tells whether it succeeds; none where it is not for sure."""
        kind, *rest = words
        if kind in ("add", "index"):
            folder = self.folder(rest[0])
            return [kind, folder], lambda model: getattr(model, kind)(folder)
        plain = {"build": (["build"], lambda model: model.build()),
                 "build-all": (["build", "--all"], lambda model: model.build_all()),
                 "build-again": (["build", "--all", "--again"], lambda model: model.build_all(True)),
                 "settle": (["build", "--settle"], lambda model: model.settle())}
        if kind in plain:
            return plain[kind]
        if kind == "sync":
            return ["sync", rest[0]], lambda model: model.sync(rest[0])
        if kind == "delete":
            study, series, image = rest[1], *("" if word == "-" else self.path(word) for word in rest[2:])
            if not self.model.is_known(study) and study in self.model.there:
                return None
            names = ["--series", series] * bool(series) + ["--image", image] * bool(image)
            return ["delete", study, *names], lambda model: model.remove(study, series, image)
        if kind == "edit":
            return self.edit_command(*rest[1:])
        if kind == "move":
            return self.move_command(*rest[1:])
        raise ValueError(kind)

    def edit_command(self, study, key, patient):
        model = self.model
        job = self.site.job(XML_JOB % ("", "0010", "0010", patient))
        arguments = ["qa", job, "--study", study, "--image", key]
        if model.can_correct(study, key):
            return arguments, lambda each: each.edit(study, key, patient)
        is_absent = study not in model.shown or (model.is_trusted(study) and key not in model.shown[study] and
                                                 key not in model.listed_images(study))
        return (arguments, lambda each: False) if is_absent and model.is_known(study) else None

    def move_command(self, study, key, to_study, series):
        model = self.model
        is_free = to_study == study or model.is_trusted(to_study) or (
            to_study not in model.there and to_study not in model.listed())
        if not model.can_correct(study, key) or not is_free:
            return None
        old = "" if to_study == study else " OldSUID='%s'" % study
        job = self.site.job(XML_JOB % (old, "0020", "000e", series))
        return (["qa", job, "--study", to_study, "--image", key],
                lambda each: each.move(study, key, to_study, series))

    def do_command(self, *words):
        made = self.command(words)
        if made is None:
            return "passed over"
        code, _, said = self.site.run(*made[0])
        return self.expect(code == 0, made[1](self.model), " ".join(words), said)

    do_add = lambda self, *rest: self.do_command("add", *rest)
    do_index = lambda self, *rest: self.do_command("index", *rest)
    do_build = lambda self: self.do_command("build")
    do_build_all = lambda self: self.do_command("build-all")
    do_build_again = lambda self: self.do_command("build-again")
    do_settle = lambda self: self.do_command("settle")
    do_sync = lambda self, *rest: self.do_command("sync", *rest)

    def do_stack(self, study, *again):
        model = self.model
        if not model.is_known(study):
            return "passed over"
        code, out, said = self.site.run("--json", "stack", study, *(["--again"] if again else []))
        if study not in model.shown:
            return self.expect(code == 0, False, "stack", said)
        whole = all(model.disk.get(image.path) == image.shows for image in model.shown[study].values())
        is_changed, is_done = False, True
        for told in json.loads(out)["series"] if out else ():
            place = (study, told["series"])
            if not told["hadVolumes"]:
                is_changed = bool(model.volumes.pop(place, 0) or told["volumes"]) or is_changed
                if told["volumes"]:
                    model.volumes[place] = len(told["volumes"])
        if is_changed:
            model.waiting.add(study)
            model.changed.add(study)
            is_done = model.build_study(study)
        return self.expect(code == 0, is_done, "stack", said) if whole else None

    def do_edit(self, door, study, key, patient):
        if door == "kdd":
            return self.do_command("edit", door, study, key, patient)
        made = self.edit_command(study, key, patient)
        if made is None:
            return "passed over"
        is_done = made[1](self.model)
        if door == "http":
            got = self.correct_by_http(study, key, {"tags": [{"tag": "00100010", "value": patient}]})
        else:
            got = self.site.call("UpdateTagFile", study, key, made[0][1])
            # It tells of failures, and an image that is not there is none, nor a study without tag file.
            is_done = is_done or study in self.model.shown or study not in self.model.there
        return self.expect(got, is_done, "edit by " + door)

    def correct_by_http(self, study, key, job):
        status, content = self.site.request(
            "POST", "/studies/%s/corrections?image=%s" % (study, key), json.dumps({"login": "anna", **job}),
            {"Content-Type": "application/json", "Accept": "application/json"})
        return status == 200 and json.loads(content)["images"] == 1 and not json.loads(content)["notFound"]

    def do_move(self, door, study, key, to_study, series):
        if door == "kdd":
            return self.do_command("move", door, study, key, to_study, series)
        made = self.move_command(study, key, to_study, series)
        if made is None:
            return "passed over"
        if door == "http":
            job = {"tags": [{"tag": "0020000E", "value": series}]}
            got = self.correct_by_http(to_study, key, {**job, **({"oldStudy": study} if to_study != study else {})})
        else:
            got = self.site.call("UpdateTagFile", to_study, key, made[0][1])
        return self.expect(got, made[1](self.model), "move by " + door)

    def do_delete(self, door, study, series, image):
        if door == "kdd":
            return self.do_command("delete", door, study, series, image)
        made = self.command(["delete", door, study, series, image])
        # Of an image the path says where it stands, which only its tag file tells.
        if made is None or series != "-" or image != "-":
            return "passed over"
        status, _ = self.site.request("DELETE", "/studies/" + study)
        return self.expect(status == 200, made[1](self.model), "delete by http", str(status))

    def do_delete_shown(self, door, study, number):
        """An image that is shown, of whatever UID."""
        shown = sorted((image.shows.series, key) for key, image in self.model.shown.get(study, {}).items() if image.shows.sop)
        if not shown or not self.model.is_known(study):
            return "passed over"
        series, key = shown[int(number) % len(shown)]
        if door == "kdd":
            return self.do_command("delete", door, study, "-", key)
        is_listed = key in self.model.listed_images(study)
        status, _ = self.site.request("DELETE", "/studies/%s/series/%s/instances/%s" % (study, series, key))
        if not is_listed and status == 404:
            return None
        return self.expect(status == 200, self.model.remove(study, "", key), "delete by http", str(status))

    # ---- objects that arrive

    def do_store(self, door, study, series, sop, patient, number):
        file = File(study, series, sop, patient, number)
        wanted = self.model.store(file, lambda version: os.path.join(
            self.site.objects, study, series, sop + (".dcm" if version == 1 else "_%04d.dcm" % version)))
        got = self.site.store_by_http(file) if door == "http" else self.site.store_by_association(file)
        self.expect(got, wanted, "store by " + door)
        if got:
            # Whoever asks for the object waits until its study is complete.
            self.site.get("/studies/%s/series/%s/instances/%s/metadata" % (study, series, sop))
        self.is_late = self.has_stored = True

    # ---- what others do to tag files

    def do_keep(self, study):
        if study not in self.model.shown:
            return "passed over"
        self.copies[study] = (content_of(self.site.tag_file(study)), dict(self.model.shown[study]))
        return None

    def do_restore(self, study):
        kept, content = self.copies.get(study, (None, None))
        if kept is None:
            return "passed over"
        put_content(self.site.tag_file(study), kept)
        self.model.spoil(study, content)
        if kept == self.written.get(study, (None,))[0]:
            self.model.spoiled.discard(study)
        return None

    def do_drop(self, study):
        if study not in self.model.there:
            return "passed over"
        os.unlink(self.site.tag_file(study))
        return self.model.spoil(study, None, False)

    def do_swap(self, study, other):
        if other == study or other not in self.model.shown:
            return "passed over"
        put_content(self.site.tag_file(study), content_of(self.site.tag_file(other)))
        return self.model.spoil(study, None)

    def do_cut(self, study, length):
        if study not in self.model.shown:
            return "passed over"
        put_content(self.site.tag_file(study), content_of(self.site.tag_file(study))[:int(length)])
        return self.model.spoil(study, None)

    def do_c_delete(self, study, key):
        """Takes an image out of the tag file behind the database's back."""
        if key not in self.model.shown.get(study, {}):
            return "passed over"
        self.expect(self.site.call("DeleteImagesInTagFile", study, key), True, "DeleteImagesInTagFile")
        left = {each: image for each, image in self.model.shown[study].items() if each != key}
        return self.model.spoil(study, left or None, bool(left))

    def do_c_drop(self, study):
        self.expect(self.site.call("DeleteTagFile", study), True, "DeleteTagFile")
        return self.model.spoil(study, None, False) if study in self.model.there else None

    def do_c_read(self, study):
        size = self.site.call("ReadAndSyncTagFileData", study)
        listed = self.model.listed_images(study)
        is_there = any(key in listed for key in self.model.shown.get(study, {}))
        return self.expect(size > 0, is_there, "ReadAndSyncTagFileData") if is_there or study not in self.model.shown else None

    # ---- surroundings

    def do_compression(self, name):
        self.compression = name
        self.site.set("KDD_COMPRESSION", name)

    def do_locale(self, name):
        self.site.set("LC_ALL", name)

    def do_same_uid(self, name):
        self.model.same_uid = name
        self.site.set("KDD_SAME_UID", name)

    def do_restart(self):
        self.site.stop()

    def do_kill_server(self):
        self.site.stop(signal.SIGKILL)

    # ---- at the same time, and cut short

    def do_both(self, *words):
        at = words.index("+")
        both = words[:at], words[at + 1:]
        made = [self.command(each) for each in both]
        if None in made:
            return "passed over"
        late = [self.looked_early(each) for each in both]
        processes = [self.site.begin(*each[0]) for each in made]
        said = [process.communicate(timeout=120)[1].decode() for process in processes]
        if any(process.returncode not in (0, 1) for process in processes):
            raise Difference("one of two ends otherwise: " + " ".join(said))
        orders = [[made[0][1], made[1][1]], [made[1][1], made[0][1]]]
        orders += [[made[1 - number][1], late[number]] for number in (0, 1) if late[number]]
        return self.heal(orders)

    def looked_early(self, words):
        """What a scan does that had looked for changed files before the other command did anything, and took them in after it."""
        if words[0] not in ("add", "index"):
            return None
        paths = self.model.changed_below(self.folder(words[1]))
        return lambda model: model.take(paths)

    def do_kill(self, after, *words):
        """[ms] after it began. Then it is repeated."""
        made = self.command(words)
        if made is None:
            return "passed over"
        process = self.site.begin(*made[0])
        time.sleep(int(after) / 1000)
        process.kill()
        process.communicate(timeout=120)
        self.site.run(*made[0])
        return self.heal([[made[1]], [made[1], made[1]]])

    def heal(self, orders):
        """Whatever happened in between, a build of all leaves the archive as one of these orders does. What was merged is built
        then, as only chance has it whether it was."""
        self.site.run("build", "--all")
        self.site.run("build", "--settle")
        faults, began = [], self.model
        for order in orders:
            self.model = copy.deepcopy(began)
            for change in order:
                change(self.model)
            self.model.build_all()
            self.model.settle()
            # So is how it is compressed.
            self.model.uncertain |= set(STUDIES)
            try:
                return compare(self, False)
            except Difference as difference:
                faults.append(str(difference))
        raise Difference("; or: ".join(faults))
