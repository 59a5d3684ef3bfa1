#!/usr/bin/env python3
"""How fast objects arrive by STOW-RS: kdd serve beside Orthanc with its DICOMweb plugin, in turn, over loopback.

    bench/arrivals.py BUILD-FOLDER [IMAGES] [CONNECTIONS,...] [OBJECTS-PER-REQUEST,...]

A CT of 1,000 images of 512 x 512, a study of its own for each row, is sent over 1, 4 and 8 connections, one object in a
request and 20. Told are objects per second, from the first byte to the last answer; the time from there until a search
has answered with the right count and the metadata with all images; the server's processor time for each object, until
then; and how many objects were not told as stored. A row of the disk follows: how many files of that size as many threads
write a second that wait for as many of them at a time, and do nothing else. Before and after all rows stands what one wait
for the disk costs: a server that tells of nothing before it is on the disk cannot be faster than its waits.
"""
import gzip
import http.client
import itertools
import json
import os
import socket
import statistics
import sys
import tempfile
import threading
import time

from servers import ImageTemplate, comparison, ct_slices, start_kdd, start_peer

SIDE = 512  # rows and columns
BOUNDARY = b"a-boundary-of-the-benchmark"
PART = b"\r\n--" + BOUNDARY + b"\r\nContent-Type: application/dicom\r\n\r\n"
END = b"\r\n--" + BOUNDARY + b"--\r\n"
PATIENCE = 300  # until a study counts as never complete [s]


class Sender(threading.Thread):
    """Sends requests, which it takes from a list that others take from too, over one connection."""

    def __init__(self, server, requests, begin):
        super().__init__()
        self.server, self.requests, self.begin, self.stored, self.fault = server, requests, begin, 0, None

    def run(self):
        try:
            link = socket.create_connection(("127.0.0.1", self.server.port))
            link.setsockopt(socket.IPPROTO_TCP, socket.TCP_NODELAY, 1)
            self.begin.wait()
            while True:
                try:
                    objects = self.requests.pop()
                except IndexError:
                    return
                self.send(link, objects)
        except Exception as fault:
            self.fault = fault

    def send(self, link, objects):
        pieces = [piece for object in objects for piece in (PART, *object)] + [END]
        head = (b"POST %s/studies HTTP/1.1\r\nHost: 127.0.0.1:%d\r\nAccept: application/dicom+json\r\n"
                b'Content-Type: multipart/related; type="application/dicom"; boundary=%s\r\nContent-Length: %d\r\n\r\n'
                % (self.server.prefix.encode(), self.server.port, BOUNDARY, sum(len(each) for each in pieces)))
        send_all(link, [head] + pieces)
        answer = http.client.HTTPResponse(link, method="POST")
        answer.begin()
        told = json.loads(answer.read())
        self.stored += len(told.get("00081199", {}).get("Value", []))


def send_all(link, pieces):
    """In as few calls as it takes: the sender's time is taken from the server's, on the same processors."""
    pieces = [memoryview(piece) for piece in pieces]
    while pieces:
        sent = link.sendmsg(pieces[:512])
        while pieces and sent >= len(pieces[0]):
            sent -= len(pieces.pop(0))
        if sent:
            pieces[0] = pieces[0][sent:]


def ask(server, path):
    """The answer, and when it had come."""
    link = http.client.HTTPConnection("127.0.0.1", server.port, timeout=PATIENCE)
    link.request("GET", server.prefix + path, headers={"Accept": "application/dicom+json", "Accept-Encoding": "gzip"})
    answer = link.getresponse()
    body = answer.read()
    moment = time.monotonic()
    if answer.status != 200:
        return [], moment
    if answer.getheader("Content-Encoding") == "gzip":
        body = gzip.decompress(body)
    return json.loads(body), moment


def await_complete(server, study, count):
    """Seconds until a search tells the count, and until the metadata has it."""
    begin, counted = time.monotonic(), None
    while time.monotonic() - begin < PATIENCE:
        if counted is None:
            found, moment = ask(server, "/studies?includefield=00201208&StudyInstanceUID=" + study)
            if found and [int(each) for each in found[0].get("00201208", {}).get("Value", [])] == [count]:
                counted = moment - begin
        if counted is not None:
            found, moment = ask(server, "/studies/%s/metadata" % study)
            if len(found) == count:
                return counted, moment - begin
        time.sleep(0.02)
    return counted or float("inf"), float("inf")


def measure(server, row, count, connections, batch, template):
    study = template.study(row)
    pixels = memoryview(template.pixels)  # which all share
    objects = [(template.head_of(row, 1, number), pixels) for number in range(count)]
    requests = [objects[at:at + batch] for at in range(0, count, batch)][::-1]
    begin = threading.Barrier(connections + 1)
    senders = [Sender(server, requests, begin) for _ in range(connections)]
    for sender in senders:
        sender.start()
    cpu = server.cpu()
    begin.wait()
    start = time.monotonic()
    for sender in senders:
        sender.join()
    wall = time.monotonic() - start
    faults = [sender.fault for sender in senders if sender.fault]
    if faults:
        raise faults[0]
    counted, whole = await_complete(server, study, count)
    return {"rate": count / wall, "counted": counted, "whole": whole, "cpu": (server.cpu() - cpu) / count * 1000,
            "missing": count - sum(sender.stored for sender in senders)}


def disk_wait(folder):
    """Milliseconds until half a MiB in a new file is on the disk."""
    times = []
    for _ in range(20):
        path = os.path.join(folder, "probe")
        with open(path, "wb", buffering=0) as file:
            file.write(bytes(512 * 1024))
            start = time.monotonic()
            os.fdatasync(file.fileno())
            times.append(time.monotonic() - start)
        os.unlink(path)
    return statistics.median(times) * 1000


def disk_rate(folder, connections, batch, count):
    """Files a second of half a MiB each that are written and waited for, by threads that have nothing else to do.

    They stay until the end: a file system may pass over what was deleted a moment ago, one by one, for each file that comes
    after.
    """
    names = iter(range(count))
    place = tempfile.mkdtemp(dir=folder)

    def write():
        while True:
            files = []
            for name in itertools.islice(names, batch):
                files.append(os.open(os.path.join(place, str(name)), os.O_WRONLY | os.O_CREAT | os.O_EXCL))
                os.write(files[-1], bytes(512 * 1024))
            if not files:
                return
            for file in files:
                os.fdatasync(file)
                os.close(file)

    threads = [threading.Thread(target=write) for _ in range(connections)]
    start = time.monotonic()
    for thread in threads:
        thread.start()
    for thread in threads:
        thread.join()
    wall = time.monotonic() - start
    return count / wall


def numbers(at, default):
    return [int(each) for each in sys.argv[at].split(",")] if len(sys.argv) > at else default


def main():
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    kdd = os.path.abspath(os.path.join(sys.argv[1], "src/tools/kdd/kdd"))
    count = numbers(2, [1000])[0]
    with comparison("arrivals", os.environ.get("KDD_BENCH_FOLDER")) as (folder, servers):
        template = ImageTemplate(ct_slices(kdd, folder)[0], SIDE)
        servers.append(start_kdd(kdd, folder, options=["--stow"], env={"KDD_FREE_SPACE": "0"}))
        peer = start_peer(folder)
        if peer:
            servers.append(peer)
        print("One wait for the disk: %.1f ms" % disk_wait(folder))
        head = "| connections | objects a request | server | objects/s | ratio | counted s | metadata s | CPU ms | not stored |"
        print(head + "\n|" + "---|" * head.count(" | ") + "---|")
        row = 0
        for batch in numbers(4, [1, 20]):
            for connections in numbers(3, [1, 4, 8]):
                first = None
                row += 1
                for server in servers:
                    found = measure(server, row, count, connections, batch, template)
                    first = first or found
                    print("| %d | %d | %s | %.0f | %s | %.2f | %.2f | %.2f | %d |" % (
                        connections, batch, server.name, found["rate"],
                        "" if found is first else "%.1f" % (first["rate"] / found["rate"]),
                        found["counted"], found["whole"], found["cpu"], found["missing"]), flush=True)
                disk = disk_rate(folder, connections, batch, min(count, 500))
                print("| %d | %d | disk alone | %.0f | %.1f | | | | |" % (connections, batch, disk, first["rate"] / disk), flush=True)
        print("One wait for the disk: %.1f ms" % disk_wait(folder))


if __name__ == "__main__":
    main()
