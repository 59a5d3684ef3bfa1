"""An archive in plain words: which files lie on the disk, which are registered, what was corrected, which volumes were made, and
what each study's tag file shows. Knows nothing of the programs, so that it cannot err with them."""
import collections

# What a DICOM file says, as far as the model looks. Without `sop` an image is known by its path.
File = collections.namedtuple("File", "study series sop patient number")
# An image as a tag file shows it.
Image = collections.namedtuple("Image", "path shows")
Registered = collections.namedtuple("Registered", "file order version")


def key_of(path, file):
    return file.sop or path


class Correction:
    """What was corrected of an image that its file calls by some study and key."""

    def __init__(self):
        self.study = self.series = self.patient = None


class Archive:
    def __init__(self):
        self.disk = {}         # path: File
        self.versions = {}     # path: what size and time of the file say
        self.registered = {}   # path: Registered
        self.corrections = {}  # (study, key) as the file has it: Correction
        self.volumes = {}      # (study, series): how many were made of it
        self.shares = {}       # (study, series): those series whose volumes hold images that stand here now
        self.shown = {}        # study: {key: Image}, of each tag file that can be read
        self.there = set()     # studies with a file in the tag file's place
        self.spoiled = set()   # those whose file is not the one written last
        self.waiting = set()
        self.changed = set()   # those of which more happened, since they were built, than that files came
        self.unsettled = set()
        self.marked = set()    # by a sync or a correction, which change the tag file as it is
        self.uncertain = set()  # of which nobody knows how they came about, until they are built again
        self.same_uid = "refuse"
        self.order = self.version = 0

    # ---- the world outside

    def write(self, path, file, same_stamp=False):
        self.disk[path] = file
        if not same_stamp:
            self.touch(path)

    def touch(self, path):
        self.version += 1
        self.versions[path] = self.version

    def unlink(self, path):
        self.disk.pop(path, None)

    def spoil(self, study, content, is_there=True):
        """Somebody puts a file that shows `content` in the place of the tag file; none: one that cannot be read."""
        self.forget_tag_file(study)
        if content is not None:
            self.shown[study] = dict(content)
        if is_there:
            self.there.add(study)
        self.spoiled.add(study)

    # ---- where images stand

    def correction_of(self, path, file):
        return self.corrections.get((file.study, key_of(path, file)))

    def place(self, path, file):
        """Study and series."""
        made = self.correction_of(path, file)
        return (made and made.study or file.study, made and made.series or file.series)

    def corrected(self, path, file):
        """As the image is shown, whichever file it comes from."""
        made = self.correction_of(path, file)
        study, series = self.place(path, file)
        return file._replace(study=study, series=series, patient=made and made.patient or file.patient)

    def listed_images(self, study):
        """Of several files of one image the one registered last counts."""
        newest = {}
        for path, known in self.registered.items():
            if self.place(path, known.file)[0] == study:
                key = key_of(path, known.file)
                if key not in newest or newest[key][0] < known.order:
                    newest[key] = (known.order, path, known.file)
        return {key: Image(path, file) for key, (_, path, file) in newest.items()}

    def listed(self):
        return ({self.place(path, known.file)[0] for path, known in self.registered.items()} |
                {study for study, _ in self.volumes})

    def is_corrected(self, study):
        return any(study in (key[0], made.study) for key, made in self.corrections.items())

    def volumes_of(self, study):
        """Also those of other series that hold images which stand here now."""
        series = {place for place in self.volumes if place[0] == study}
        stands = {self.place(path, known.file) for path, known in self.registered.items()}
        for place, owners in self.shares.items():
            if place[0] == study and (place in stands or place in self.volumes):
                series |= {owner for owner in owners if owner in self.volumes}
        return series

    # ---- registering

    def changed_below(self, folder):
        return sorted(path for path in self.disk if path.startswith(folder + "/") and
                      (path not in self.registered or self.registered[path].version != self.versions[path]))

    def register(self, paths):
        """The studies that gained, lost or changed a file."""
        touched = set()
        for path in paths:
            former = self.registered.get(path)
            if former:
                left = self.place(path, former.file)[0]
                touched.add(left)
                self.changed.add(left)
            self.order += 1
            self.registered[path] = Registered(self.disk[path], self.order, self.versions[path])
            touched.add(self.place(path, self.disk[path])[0])
        self.waiting |= touched
        return touched

    def index(self, folder):
        self.register(self.changed_below(folder))
        return True

    def add(self, folder):
        """Whether every study that it completed could be completed."""
        paths = self.changed_below(folder)
        has_unchanged = any(path.startswith(folder + "/") and path not in paths for path in self.disk)
        is_done = self.take(paths)
        # What was found unchanged may be left of an intake that did not come to its end.
        left = {self.place(path, known.file)[0] for path, known in self.registered.items()
                if has_unchanged and path.startswith(folder + "/")}
        for study in sorted(left & self.waiting):
            is_done = self.build_study(study) and is_done
        return is_done

    def take(self, paths):
        """Registers the files, and completes the studies that gained or lost one."""
        arrivals = collections.defaultdict(dict)
        for path in paths:
            file = self.disk[path]
            arrivals[self.place(path, file)[0]][key_of(path, file)] = Image(path, file)
        changed_before = set(self.changed)
        touched = self.register(paths)
        is_done = True
        for study, images in arrivals.items():
            is_done = self.complete(study, images, study not in changed_before) and is_done
        for study in sorted(touched - set(arrivals)):
            is_done = self.build_study(study) and is_done
        return is_done

    def known_as(self, file):
        """The paths under which an object that arrives may be known already: those shown of what says the same of itself."""
        for path, known in self.registered.items():
            if (known.file.study, known.file.sop) == (file.study, file.sop):
                place = self.place(path, known.file)[0]
                if self.listed_images(place)[file.sop].path == path:
                    yield path

    def store(self, file, path_of):
        """An object arrives. `path_of(n)`: where the archive puts the n-th object of that name. Whether it is told as stored."""
        for path in self.known_as(file):
            there = self.disk.get(path)
            if there == file:
                return True
            if there is not None and there.sop == file.sop and self.same_uid == "refuse":
                return False
        number = 1
        while path_of(number) in self.disk and self.disk[path_of(number)] != file:
            number += 1
        if path_of(number) not in self.disk:
            self.write(path_of(number), file)
        self.take([path_of(number)])
        return True

    def waiting_with_objects(self, folder):
        """The studies that a server with this folder looks after when it begins."""
        return sorted(self.waiting & {self.place(path, known.file)[0] for path, known in self.registered.items()
                                      if path.startswith(folder + "/")})

    def look_after(self, folder):
        """A server that begins completes them. Whether there were any."""
        waiting = self.waiting_with_objects(folder)
        for study in waiting:
            self.complete(study, {}, study not in self.changed)
        return bool(waiting)

    # ---- tag files

    def put(self, study, content):
        self.shown[study] = content
        self.there.add(study)
        self.spoiled.discard(study)

    def forget_tag_file(self, study):
        self.shown.pop(study, None)
        self.there.discard(study)

    def is_trusted(self, study):
        return study in self.shown and study not in self.spoiled

    def can_merge(self, study, arrivals):
        """With what was registered before, and nobody has taken in, in `arrivals` too."""
        if not self.is_trusted(study) or self.is_corrected(study) or self.volumes_of(study):
            return False
        wanted, present = self.listed_images(study), self.shown[study]
        absent = {key: image for key, image in wanted.items()
                  if not any(key in content and content[key].path == image.path for content in (arrivals, present))}
        for key, (path, known) in absent.items():
            if path not in self.disk or self.disk[path][:3] != known[:3]:
                return False
            arrivals[key] = Image(path, self.disk[path])
        merged = {**present, **arrivals}
        return (bool(arrivals) and 2 * len(absent) <= len(wanted) and set(merged) == set(wanted) and
                all(merged[key].path == image.path for key, image in wanted.items()))

    def complete(self, study, arrivals, is_alone):
        """`is_alone`: nothing waited to be taken into account but files that had come."""
        if not is_alone or not self.can_merge(study, arrivals):
            return self.build_study(study)
        self.put(study, {**self.shown[study], **arrivals})
        self.waiting.discard(study)
        self.changed.discard(study)
        self.unsettled.add(study)
        return True

    def build_study(self, study):
        """What cannot be read, or is another image now, stays as the tag file had it; then the study goes on waiting."""
        wanted, content, is_whole = self.listed_images(study), {}, True
        for key, (path, known) in sorted(wanted.items()):
            file = self.disk.get(path)
            # What was registered without UID has none that it could contradict, but may not take the place of another one.
            if file and file[:2] == known[:2] and (file.sop == known.sop if known.sop else file.sop not in wanted):
                content[key_of(path, file)] = Image(path, self.corrected(path, file))
                continue
            is_whole = False
            if key in self.shown.get(study, {}):
                shows = self.shown[study][key].shows
                made = self.correction_of(path, known)
                content[key] = Image(path, shows._replace(patient=made and made.patient or shows.patient))
        if not wanted:
            self.forget_tag_file(study)
            self.spoiled.discard(study)
        elif not content:
            return False
        else:
            self.put(study, content)
        if is_whole:
            for those in (self.waiting, self.changed, self.unsettled):
                those.discard(study)
        else:
            self.changed.add(study)
        self.marked.discard(study)
        return is_whole

    def build(self, studies=None):
        is_done = True
        for study in sorted(self.waiting if studies is None else studies):
            is_done = self.build_study(study) and is_done
        return is_done

    def build_all(self, again=False):
        if again:
            self.uncertain.clear()
        for study in self.listed():
            if self.listed_images(study) and (again or not self.is_trusted(study)):
                self.waiting.add(study)
                self.changed.add(study)
        return self.build()

    def settle(self):
        self.waiting |= self.unsettled
        self.changed |= self.unsettled
        return self.build()

    # ---- changes

    def is_known(self, study):
        return study in self.waiting or study in self.listed()

    def remove(self, study, series, image):
        """`series`, `image`: empty for all. False: there is nothing of that name, or a file could not be read."""
        def is_meant(key, place_series):
            return (not series or place_series == series) and (not image or key == image)

        present = self.shown.get(study)
        is_held = present is not None and any(is_meant(key, each.shows.series) for key, each in present.items())
        if not self.is_known(study):
            if is_held:
                self.take_out(study, [key for key, each in present.items() if is_meant(key, each.shows.series)])
            return is_held
        wanted = self.listed_images(study)
        is_listed = any(is_meant(key, self.place(*each)[1]) for key, each in wanted.items())
        if (series or image) and not is_listed and not is_held:
            return False
        for path, known in list(self.registered.items()):
            place = self.place(path, known.file)
            if place[0] == study and is_meant(key_of(path, known.file), place[1]):
                del self.registered[path]
        for place in list(self.volumes):
            if place[0] == study and not image and series in ("", place[1]):
                del self.volumes[place]
        left = self.listed_images(study)
        holds_all = (study not in self.waiting and self.is_trusted(study) and not self.is_corrected(study) and
                     not self.volumes_of(study) and left and
                     all(key in present and present[key].path == each.path for key, each in left.items()))
        if not holds_all:
            self.waiting.add(study)
            self.changed.add(study)
            return self.build_study(study)
        self.put(study, {key: each for key, each in present.items() if key in left})
        self.unsettled.add(study)
        return True

    def take_out(self, study, keys):
        """Of the tag file only."""
        for key in keys:
            self.shown[study].pop(key, None)
        if not self.shown[study]:
            self.forget_tag_file(study)

    def sync(self, study):
        """Only paths and what is listed: no file is opened."""
        if not self.is_known(study) or study not in self.shown:
            return False
        was_trusted = self.is_trusted(study)
        wanted = self.listed_images(study)
        content = {key: Image(wanted[key].path, each.shows)
                   for key, each in self.shown[study].items() if key in wanted}
        if not content:
            return False
        self.put(study, content)
        self.marked.add(study)
        if not was_trusted:
            self.waiting.add(study)
        if study in self.waiting:
            self.changed.add(study)
        return True

    def can_correct(self, study, key):
        """Whether it is beyond doubt that a correction of the image is made."""
        listed = self.listed_images(study).get(key)
        return (self.is_trusted(study) and listed is not None and key in self.shown[study] and
                self.shown[study][key].path == listed.path)

    def origin(self, study, key):
        path, file = self.listed_images(study)[key]
        return file.study, key_of(path, file)

    def is_correctable(self, study, key):
        """What else is done at the same time may have taken the image away."""
        return key in self.shown.get(study, {}) and key in self.listed_images(study)

    def edit(self, study, key, patient):
        """Whether there is such an image."""
        if not self.is_correctable(study, key):
            return False
        shown = self.shown[study][key]
        if shown.shows.patient != patient:
            self.corrections.setdefault(self.origin(study, key), Correction()).patient = patient
            self.shown[study][key] = shown._replace(shows=shown.shows._replace(patient=patient))
            self.marked.add(study)
            self.changed |= {study} & self.waiting
        return True

    def move(self, study, key, to_study, to_series):
        """To another series, and perhaps study, which replaces the image that stands there under the same UID. Whether there is
        such an image."""
        if not self.is_correctable(study, key):
            return False
        shown = self.shown[study][key]
        if (study, shown.shows.series) == (to_study, to_series):
            return True
        origin = self.origin(study, key)
        files = [path for path, known in sorted(self.registered.items(), key=lambda each: each[1].order)
                 if (known.file.study, key_of(path, known.file)) == origin]
        left = {self.place(path, self.registered[path].file) for path in files}
        made = self.corrections.setdefault(origin, Correction())
        made.study, made.series = to_study, to_series
        for path in files:
            self.order += 1
            self.registered[path] = self.registered[path]._replace(order=self.order)
        shares = self.shares.setdefault((to_study, to_series), set())
        for place in left:
            shares |= ({place} if place in self.volumes else set()) | self.shares.get(place, set())
        self.take_out(study, [key])
        moved = shown._replace(shows=shown.shows._replace(study=to_study, series=to_series))
        self.put(to_study, {**self.shown.get(to_study, {}), key: moved})
        self.marked |= {study, to_study}
        self.changed |= {study, to_study} & self.waiting
        # Another image may have stood behind the one that left.
        if key in self.listed_images(study):
            if study != to_study:
                self.waiting.add(study)
                self.changed.add(study)
        return True
