"""What a program asked of its disk, in order, by strace."""
import collections
import re

CALLS = """open openat creat write pwrite64 writev pwritev pwritev2 ftruncate truncate fallocate rename renameat renameat2 link
linkat symlink symlinkat unlink unlinkat rmdir mkdir mkdirat fsync fdatasync sync syncfs sync_file_range copy_file_range sendfile
splice lseek sendto sendmsg mmap""".split()

# `begun`: how many calls had come to their end when this one began. `result`: a number, and `opened` the path of a new descriptor.
Call = collections.namedtuple("Call", "name arguments result opened begun")

ESCAPED = re.compile(rb"\\x([0-9a-f]{2})")
LINE = re.compile(rb"(\d+) +(?:<\.\.\. (\w+) resumed>|(\w+)\()(.*)$", re.DOTALL)
RESULT = re.compile(rb"(.*)\) += (-?[\dxa-f]+|\?)(?:<([^>]*)>)?(?: .*)?$", re.DOTALL)
UNFINISHED = b" <unfinished ...>"


def decoded(text):
    return bytes.fromhex(text.replace(b"\\x", b"").decode())


class Argument(bytes):
    """As strace writes it; strings and paths are hexadecimal in it, so that no comma or quote of theirs is in the way."""

    @property
    def text(self):
        """All that stands in quotes: of a list of buffers their whole content."""
        return b"".join(decoded(each) for each in re.findall(rb'"((?:\\x[0-9a-f]{2})*)"', self))

    @property
    def number(self):
        return int(self, 0)

    @property
    def path(self):
        """Of a descriptor."""
        found = re.match(rb"[\w-]+<((?:\\x[0-9a-f]{2})*)>", self)
        return decoded(found[1]) if found else b""


def split(arguments):
    """At the commas of the outermost level."""
    parts, depth, begin = [], 0, 0
    for found in re.finditer(rb"[\[\]{}]|, ", arguments):
        mark = found[0]
        if mark == b", " and depth == 0:
            parts.append(Argument(arguments[begin:found.start()]))
            begin = found.end()
        elif mark != b", ":
            depth += 1 if mark in b"[{" else -1
    return parts + [Argument(arguments[begin:])]


def command(log):
    """To be put in front of a command whose calls are wanted."""
    return ["strace", "-f", "-qq", "-y", "-xx", "-s", "33554432", "--seccomp-bpf", "-o", log, "-e", "trace=" + ",".join(CALLS)]


def read(log):
    """The calls that succeeded, in the order in which they ended. What a dying process had begun is left out."""
    calls, begun, open_lines = [], 0, {}
    with open(log, "rb") as lines:
        for line in lines:
            found = LINE.match(line.rstrip(b"\n"))
            if not found:
                continue  # a signal, or the end of a process
            thread, resumed, name, rest = found.groups()
            if rest.endswith(UNFINISHED):
                open_lines[thread] = (name, rest[:-len(UNFINISHED)], len(calls))
                continue
            begun = len(calls)
            if resumed:
                name, head, begun = open_lines.pop(thread)
                rest = head + rest
            done = RESULT.match(rest)
            if not done:
                raise ValueError(f"not understood: {line[:200]!r}")
            if done[2] == b"?" or int(done[2], 0) < 0:
                continue
            calls.append(Call(name.decode(), split(done[1]), int(done[2], 0), decoded(done[3]) if done[3] else b"", begun))
    return calls
