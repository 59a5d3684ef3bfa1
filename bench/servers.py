"""What the comparisons of servers have in common: made-up objects, and servers that are started, watched and stopped."""
import contextlib
import http.client
import json
import os
import re
import shutil
import signal
import socket
import struct
import subprocess
import sys
import tempfile
import time

TICKS = os.sysconf("SC_CLK_TCK")
START_POSTGRES = r"""set -- /usr/lib/postgresql/*/bin
if [ $(id -u) = 0 ]; then chown -R nobody . && S="--reuid nobody --regid nogroup --clear-groups"; fi
[ -d data ] || setpriv $S $1/initdb -D data -U kdd -A trust -E UTF8 --no-sync >/dev/null
exec setpriv --pdeathsig QUIT $S $1/postgres -D data -k $PWD -c listen_addresses= -c fsync=off $PLANS"""

PLUGIN = "/usr/share/orthanc/plugins/libOrthancDicomWeb.so"


def elements(data):
    """Start of the value, its length and its bytes' place in front, for each attribute of the outermost level."""
    at = 132
    while at < len(data):
        group, number = struct.unpack_from("<HH", data, at)
        if data[at + 4:at + 6] in (b"OB", b"OW", b"SQ", b"UN", b"UT", b"UC", b"UR", b"OF", b"OD", b"OL"):
            length, value = struct.unpack_from("<I", data, at + 8)[0], at + 12
        else:
            length, value = struct.unpack_from("<H", data, at + 6)[0], at + 8
        if length == 0xFFFFFFFF:  # a sequence of unknown length ends where its outermost delimiter stands
            depth, end = 0, value
            while True:
                tag, size = data[end:end + 4], struct.unpack_from("<I", data, end + 4)[0]
                if tag == b"\xfe\xff\xdd\xe0":
                    break
                end += 8 if size == 0xFFFFFFFF else 8 + size
                if tag == b"\xfe\xff\x00\xe0" and size == 0xFFFFFFFF:
                    end = data.index(b"\xfe\xff\x0d\xe0", end) + 8
            length = end + 8 - value
        yield (group << 16) | number, at, value, length
        at = value + length


def changed(data, values):
    """The file with other values of some attributes, and the length of its meta information as that is then."""
    out, done, length_at, meta_end = bytearray(data[:132]), 132, None, None
    for tag, at, value, length in elements(data):
        out += data[done:at]
        done = at
        if meta_end is None and tag >> 16 != 2:
            meta_end = len(out)
        if tag == 0x00020000:
            length_at = len(out) + value - at
        if tag in values:
            new = values[tag]
            new += (b"\0" if data[at + 4:at + 6] in (b"UI", b"OW") else b" ") * (len(new) % 2)
            size = struct.pack("<I" if value - at == 12 else "<H", len(new))
            out += data[at:value - len(size)] + size + new
            done = value + length
    out += data[done:]
    struct.pack_into("<I", out, length_at, meta_end - length_at - 4)
    return bytes(out)


class ImageTemplate:
    """Makes images of made-up studies: of one that was taken apart once only what is its own is put in anew."""

    ROOT = "1.2.826.0.1.3680043.2.1143.2"

    def __init__(self, data, side):
        size = struct.pack("<H", side)
        self.pixels = noise(side)
        # Each as long as what takes its place.
        self.marks = (b"3" * len(self.study(0)), b"4" * len(self.series(0, 0)), b"5" * len(self.uid(0, 0, 0)), b"777777",
                      b"888888.8")
        study, series, uid, number, place = self.marks
        data = changed(data, {
            0x00020003: uid, 0x00080018: uid, 0x0020000D: study, 0x0020000E: series, 0x00200013: number,
            0x00200032: b"-200\\-220\\" + place, 0x00201041: place, 0x00280010: size, 0x00280011: size,
            0x7FE00010: bytes(self.pixels)})
        self.head = data[:-len(self.pixels)]

    def study(self, study):
        return "%s.1%06d" % (self.ROOT, study)

    def series(self, study, series):
        return "%s.%d" % (self.study(study), series)

    def uid(self, study, series, number):
        return "%s.1%05d" % (self.series(study, series), number)

    def head_of(self, study, series, number):
        """All that stands before the pixels."""
        own = (self.study(study), self.series(study, series), self.uid(study, series, number), "%6d" % number,
               "%8.1f" % number)
        head = self.head
        for mark, text in zip(self.marks, own):
            head = head.replace(mark, text.encode())
        return head


def ct_slices(kdd, folder):
    """The files of a CT series of kdd sample, in order."""
    day = os.path.join(folder, "ct")
    subprocess.run([kdd, "--quiet", "sample", day, "--images", "200"], check=True)
    slices = []
    for place, _, names in sorted(os.walk(os.path.join(day, "CT-1"))):
        if len(names) > 20:
            slices = [open(os.path.join(place, name), "rb").read() for name in sorted(names) if name.endswith(".dcm")]
            break
    shutil.rmtree(day)
    return slices


def noise(side):
    """Pixels that compress as badly as those of a detector."""
    pixels = bytearray(os.urandom(side * side * 2))
    pixels[1::2] = bytes(byte & 15 for byte in pixels[1::2])
    return pixels


def free_port():
    with socket.socket() as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


class Server:
    """A process that answers DICOMweb at a port of this machine until it is stopped."""

    def __init__(self, name, command, port, prefix="/dicom-web", env=None):
        self.name, self.port, self.prefix = name, port, prefix
        self.process = subprocess.Popen(command, env={**os.environ, **(env or {})},
                                        stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        for _ in range(300):
            try:
                socket.create_connection(("127.0.0.1", port), 1).close()
                return
            except OSError:
                if self.process.poll() is not None:
                    break
                time.sleep(0.1)
        self.stop()
        sys.exit(name + " does not start")

    def stop(self):
        self.process.send_signal(signal.SIGTERM)
        self.process.wait()

    def cpu(self):
        """Processor time so far [s]."""
        with open("/proc/%d/stat" % self.process.pid) as file:
            fields = file.read().rpartition(")")[2].split()
        return (int(fields[11]) + int(fields[12])) / TICKS

    def memory(self):
        with open("/proc/%d/status" % self.process.pid) as file:
            return int(re.search(r"VmHWM:\s+(\d+)", file.read()).group(1)) / 1024


@contextlib.contextmanager
def comparison(name, place=None):
    """A folder of its own, and a list of the servers that work in it: they are stopped in the end, and it goes. Of one
    that came to its end is told how much memory each took."""
    folder = tempfile.mkdtemp(prefix="kdd-%s-" % name, dir=place)
    servers = []
    try:
        yield folder, servers
        print("\nLargest memory, MiB: " + ", ".join("%s %.0f" % (each.name, each.memory()) for each in servers))
    finally:
        for server in reversed(servers):
            server.stop()
        shutil.rmtree(folder)


def add(kdd, folder, files):
    """Takes what lies below a folder of files into the store that `start_kdd` serves."""
    subprocess.run([kdd, "--quiet", "add", files], check=True,
                   env={**os.environ, "KDD_STORE": os.path.join(folder, "store")})


def start_kdd(kdd, folder, name="kdd", options=(), env=None):
    """Over the store in that folder."""
    port = free_port()
    return Server(name, [kdd, "serve", "--listen", "127.0.0.1:%d" % port, *options], port,
                  env={"KDD_STORE": os.path.join(folder, "store"), **(env or {})})


def start_peer(folder, files=None):
    """Orthanc over what lies below a folder of files; None, and said so, where it is not installed."""
    missing = [part for part in ("Orthanc", PLUGIN) if not (shutil.which(part) or os.path.exists(part))]
    if missing:
        print("No comparison: %s is missing (apt-get install orthanc orthanc-dicomweb)\n" % " and ".join(missing))
        return None
    port = free_port()
    config = os.path.join(folder, "peer.json")
    with open(config, "w") as file:
        json.dump({"StorageDirectory": os.path.join(folder, "peer"), "IndexDirectory": os.path.join(folder, "peer"),
                   "HttpPort": port, "DicomServerEnabled": False, "RemoteAccessAllowed": False,
                   "KeepAlive": True, "Plugins": [PLUGIN]}, file)
    peer = Server("Orthanc", ["Orthanc", config], port)
    link = http.client.HTTPConnection("127.0.0.1", port)
    for place, _, names in os.walk(files) if files else ():
        for name in names:
            with open(os.path.join(place, name), "rb") as file:
                link.request("POST", "/instances", file.read())
            answer = link.getresponse()
            answer.read()
            if answer.status not in (200, 400):  # a volume file is no instance
                sys.exit("Orthanc takes no file: %d" % answer.status)
    return peer


def start_postgres(folder, options=""):
    """A server of its own, whose files stay in the folder, and the address of a database that is empty at first."""
    place, log = os.path.join(folder, "postgres"), os.path.join(folder, "postgres.log")
    os.makedirs(place, exist_ok=True)
    os.chmod(folder, 0o755)
    with open(log, "w") as said:
        process = subprocess.Popen(["sh", "-c", START_POSTGRES], cwd=place, stderr=said, env={**os.environ, "PLANS": options})
    while "ready to accept connections" not in open(log).read():
        if process.poll() is not None:
            sys.exit(open(log).read())
        time.sleep(0.1)
    subprocess.run(["psql", "-q", "-c", "CREATE DATABASE kdd", "postgresql://kdd@/postgres?host=" + place],
                   stderr=subprocess.DEVNULL, check=False)
    return process, "postgresql://kdd@/kdd?host=" + place
