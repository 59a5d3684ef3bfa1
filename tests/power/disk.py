"""A disk that remembers what it was only told, and what it was told to keep: the states in which a loss of power may leave it.

What is assumed of it. The content of a file is kept when fsync or fdatasync of the file has ended, as far as it was written before
that began. Of what was written since, each sector is afterwards as it was after any one of its writes, whatever became of the
sectors beside it, and the length is any of those that the file had; room that was never written reads as zeros. A name is kept
when its folder was flushed. Of the other changes of names any are there and any are not, each as a whole (a rename too), those of
one name in their order: that is `strict`, and more than file systems do today. `journaled` is what ext4, XFS and the like do:
changes of names are kept in the order in which they were made, and every flush keeps all that were made before it.
What is written through a mapping is never kept; only the database's index of its log is, which it makes anew.
"""
import os
import shutil


class File:
    def __init__(self, content=b"", modified=None):
        self.kept = bytearray(content)
        self.told = []  # (number, at, bytes), or (number, size, None) for a new length
        self.first, self.modified = content, modified  # at the beginning [ns]
        self.position = 0  # of whoever opened it last

    @staticmethod
    def put(content, at, data):
        if data is None:
            del content[at:]
            content.extend(bytes(at - len(content)))
            return
        if len(content) < at:
            content.extend(bytes(at - len(content)))
        content[at:at + len(data)] = data

    def size(self):
        size = len(self.kept)
        for _, at, data in self.told:
            size = at if data is None else max(size, at + len(data))
        return size

    def flush(self, until):
        for number, at, data in self.told:
            if number < until:
                self.put(self.kept, at, data)
        self.told = [each for each in self.told if each[0] >= until]

    def all(self):
        content = bytearray(self.kept)
        for _, at, data in self.told:
            self.put(content, at, data)
        return bytes(content)

    def some(self, chance, sector):
        """Each sector as after one of its writes, the length one of those that it had."""
        if not self.told:
            return bytes(self.kept)
        versions, lengths = {}, [len(self.kept)]
        content = bytearray(self.kept)
        for _, at, data in self.told:
            before = len(content)
            self.put(content, at, data)
            lengths.append(len(content))
            begin, end = (min(at, before), max(at, before)) if data is None else (at, at + len(data))
            for number in range(begin // sector, (end + sector - 1) // sector):
                versions.setdefault(number, []).append(bytes(content[number * sector:(number + 1) * sector]))
        # Most often much or little is lost; halves are rare where writes are many.
        share = chance.choice((0.05, 0.5, 0.95))
        length = lengths[-1] if chance.random() < 0.7 else chance.choice(lengths)
        result = bytearray(self.kept)
        result.extend(bytes(max(0, max(lengths) - len(result))))
        for number, known in versions.items():
            if chance.random() < share:
                piece = (known[-1] if chance.random() < 0.7 else chance.choice(known)).ljust(sector, b"\0")
                place = slice(number * sector, min((number + 1) * sector, len(result)))
                result[place] = piece[:place.stop - place.start]
        return bytes(result[:length])


class Folder:
    def __init__(self):
        self.kept, self.now = {}, {}


class Disk:
    """One folder, which need not be there yet, in one that is; what happens elsewhere counts for nothing."""

    def __init__(self, path, is_strict):
        self.root, self.name = os.path.split(os.fsencode(os.path.abspath(path)))
        self.is_strict = is_strict
        self.top = Folder()
        self.renamings = []  # (number, [(folder, name, what it leads to)]) that were not flushed
        self.gone = {}  # what had a path last
        self.unlinked = []  # (path, content)
        self.files = []  # all that there ever were
        self.times = {}  # in the end [ns], by their number
        self.number, self.is_changed = 0, False

    def load(self):
        """All that is there is kept."""
        def fill(folder, place):
            for entry in os.scandir(place):
                if entry.is_dir(follow_symlinks=False):
                    node = Folder()
                    fill(node, entry.path)
                else:
                    with open(entry.path, "rb") as file:
                        node = self.add(file.read(), entry.stat().st_mtime_ns)
                folder.kept[entry.name] = folder.now[entry.name] = node
        path = os.path.join(self.root, self.name)
        if os.path.exists(path):
            self.top.kept[self.name] = self.top.now[self.name] = folder = Folder()
            fill(folder, path)

    def add(self, content=b"", modified=None):
        node = File(content, modified)
        node.number = len(self.files)
        self.files.append(node)
        return node

    def compare(self):
        """The calls have to have made of it what is there now, whose times are told."""
        there, times = {}, {}
        for place, _, names in os.walk(os.path.join(self.root, self.name)):
            there.update((os.path.join(place, name), None) for name in names if not name.endswith(b"-shm"))
        for path, content, node in self.everything():
            path = os.path.join(self.root, path)
            if content is None:
                continue
            with open(path, "rb") as file:
                if file.read() != content:
                    raise ValueError(f"{path} is something else than the calls have made of it")
            times[node.number] = os.stat(path).st_mtime_ns
            del there[path]
        if there:
            raise ValueError(f"no call has made {list(there)}")
        return times

    # ---- names

    def place(self, path):
        """Folder and last name of a path below the root, or nothing."""
        path = os.path.normpath(path)
        *above, name = path[len(self.root) + 1:].split(b"/")
        if not path.startswith(self.root + b"/") or [*above, name][0] != self.name:
            return None
        folder = self.top
        for each in above:
            folder = folder.now.get(each)
            if not isinstance(folder, Folder):
                return None
        return folder, name

    def find(self, path):
        if path == self.root:
            return self.top
        if path.endswith(b" (deleted)"):
            return self.gone.get(path[:-len(b" (deleted)")])
        place = self.place(path)
        return place and place[0].now.get(place[1])

    def rename(self, changes):
        for folder, name, node in changes:
            if node is None:
                folder.now.pop(name, None)
            else:
                folder.now[name] = node
        self.renamings.append((self.number, changes))
        self.is_changed = True

    @staticmethod
    def keep(changes):
        for folder, name, node in changes:
            if node is None:
                folder.kept.pop(name, None)
            else:
                folder.kept[name] = node

    def flush_names(self, until, folder=None):
        """Those of one folder, and what was done before to a name that they touch."""
        names = {(id(each), name) for number, changes in self.renamings for each, name, _ in changes
                 if number < until and folder in (None, each)}
        wanted = []
        for entry in reversed([each for each in self.renamings if each[0] < until]):
            if any((id(each), name) in names for each, name, _ in entry[1]):
                names.update((id(each), name) for each, name, _ in entry[1])
                wanted.insert(0, entry)
        for entry in wanted:
            self.keep(entry[1])
            self.renamings.remove(entry)

    def flush(self, path, until):
        node = self.find(path)
        if isinstance(node, File):
            node.flush(until)
        if node is not None and not self.is_strict:
            self.flush_names(until)
        elif isinstance(node, Folder):
            self.flush_names(until, node)

    # ---- calls

    def take(self, number, call):
        """What the call of that number does. True when it changed or flushed something."""
        self.number, self.is_changed = number, False
        method = getattr(self, "on_" + call.name, None)
        if method is not None:
            method(call, *call.arguments)
        elif any(self.find(each.path) for each in call.arguments):
            raise ValueError(f"nothing is known of {call.name}")
        return self.is_changed

    def tell(self, node, at, data):
        if isinstance(node, File):
            node.told.append((self.number, at, data))
            self.is_changed = True

    def on_openat(self, _, folder, path, flags, *_mode):
        place = self.place(os.path.join(folder.path, path.text))
        if place is None:
            return
        if b"O_TMPFILE" in flags or b"O_APPEND" in flags:
            raise ValueError(f"opened in a way that is not known here: {flags}")
        node = place[0].now.get(place[1])
        if node is None:
            node = self.add()
            self.rename([(*place, node)])
        if isinstance(node, File):
            node.position = 0
            if b"O_TRUNC" in flags:
                self.tell(node, 0, None)

    def on_lseek(self, call, descriptor, *_):
        node = self.find(descriptor.path)
        if isinstance(node, File):
            node.position = call.result

    def on_write(self, call, descriptor, data, _):
        node = self.find(descriptor.path)
        if isinstance(node, File):
            self.tell(node, node.position, data.text[:call.result])
            node.position += call.result

    def on_pwrite64(self, call, descriptor, data, _, at):
        self.tell(self.find(descriptor.path), at.number, data.text[:call.result])

    def on_ftruncate(self, _, descriptor, size):
        self.tell(self.find(descriptor.path), size.number, None)

    def on_fallocate(self, _, descriptor, mode, at, size):
        node = self.find(descriptor.path)
        if mode != b"0":
            raise ValueError(f"room is taken in a way that is not known here: {mode}")
        if isinstance(node, File) and node.size() < at.number + size.number:
            self.tell(node, at.number + size.number, None)

    def on_rename(self, _, source, target):
        one, other = self.place(source.text), self.place(target.text)
        if (one is None) != (other is None):
            raise ValueError(f"{source.text} goes to {target.text}")
        if one:
            self.gone[target.text] = other[0].now.get(other[1])
            self.rename([(*one, None), (*other, one[0].now[one[1]])])

    def on_link(self, _, source, target):
        if self.place(target.text):
            self.rename([(*self.place(target.text), self.find(source.text))])

    def on_unlink(self, _, path):
        place = self.place(path.text)
        if place:
            node = self.gone[path.text] = place[0].now[place[1]]
            if isinstance(node, File):
                self.unlinked.append((path.text.decode(), node.all()))
            self.rename([(*place, None)])

    on_rmdir = on_unlink

    def on_mkdir(self, _, path, _mode):
        if self.place(path.text):
            self.rename([(*self.place(path.text), Folder())])

    def on_fsync(self, call, descriptor):
        if self.find(descriptor.path) is not None:
            self.flush(descriptor.path, call.begun)
            self.is_changed = True

    on_fdatasync = on_fsync

    def on_sync_file_range(self, *_):
        """Promises nothing."""

    def on_mmap(self, _, _address, _length, protection, flags, descriptor, *_offset):
        if b"PROT_WRITE" in protection and b"MAP_SHARED" in flags and self.find(descriptor.path) and (
                not descriptor.path.endswith(b"-shm")):
            raise ValueError(f"written through a mapping: {descriptor.path}")

    # ---- states

    def state(self, content_of, kept_names):
        """What is there when of the names that were not flushed those are kept, and of each file what the function says: a list of
        (path, content, file), folders without content."""
        names = {}

        def of(folder):
            return names.setdefault(id(folder), dict(folder.kept))
        for changes in kept_names:
            for folder, name, node in changes:
                if node is None:
                    of(folder).pop(name, None)
                else:
                    of(folder)[name] = node
        found, contents = [], {}

        def walk(folder, path):
            for name, node in sorted(of(folder).items()):
                place = os.path.join(path, name)
                if isinstance(node, Folder):
                    found.append((place, None, node))
                    walk(node, place)
                elif not name.endswith(b"-shm"):
                    if id(node) not in contents:
                        contents[id(node)] = content_of(node)
                    found.append((place, contents[id(node)], node))
        walk(self.top, b"")
        return found

    def nothing_more(self):
        """All is lost that was not flushed."""
        return self.state(lambda file: bytes(file.kept), [])

    def everything(self):
        return self.state(File.all, [changes for _, changes in self.renamings])

    def something(self, chance, sector):
        changes = [changes for _, changes in self.renamings]
        if self.is_strict:
            share = chance.choice((0.1, 0.5, 0.9))
            changes = [each for each in changes if chance.random() < share]
        else:
            changes = changes[:chance.randint(0, len(changes))]
        return self.state(lambda file: file.some(chance, sector), changes)

    def put(self, state):
        """Writes it in place of what is there."""
        shutil.rmtree(os.path.join(self.root, self.name), ignore_errors=True)
        paths = {}
        for path, content, node in state:
            path = os.path.join(self.root, path)
            if content is None:
                os.mkdir(path)
            elif id(node) in paths:
                os.link(paths[id(node)], path)
            else:
                with open(path, "wb") as file:
                    file.write(content)
                # The time is kept with the content.
                modified = node.modified if content == node.first else self.times.get(node.number)
                if modified is not None:
                    os.utime(path, ns=(modified, modified))
                paths[id(node)] = path
