#!/usr/bin/env python3
"""How kdd serve stands beside Orthanc with its DICOMweb plugin: the same requests to both, in turn, over loopback.

    bench/dicomweb.py BUILD-FOLDER [SECONDS-PER-MEASUREMENT]

The archive is a CT of 1,000 images of 512 x 512, one of its series with 499, and 50 small studies of kdd sample. Both
servers stand on SQLite as it comes. Wall time and processor time are those of one request after the other over one
connection; requests/s are those of one and of four connections, or what the wall time says where it is over half a
second. Processor time is the server's alone.
"""
import gzip
import http.client
import json
import os
import re
import shutil
import statistics
import struct
import subprocess
import sys
import time

from servers import add, changed, comparison, ct_slices, noise, start_kdd, start_peer

STUDY = "1.2.826.0.1.3680043.2.1143.1"
SERIES = (STUDY + ".1", STUDY + ".2")
IMAGES = 1000
SIDE = 512  # rows and columns
LIST = "/studies?limit=101&offset=0&fuzzymatching=true&includefield=00081030%2C00080060%2C00080090%2C00100030"
JSON = "application/dicom+json"
FRAME = 'multipart/related; type="application/octet-stream"; transfer-syntax="*"'
OBJECT = 'multipart/related; type="application/dicom"; transfer-syntax="*"'


def make_archive(kdd, folder):
    """Files of both servers; what is in them does not matter, but what they are like does."""
    slices = ct_slices(kdd, folder)
    files = os.path.join(folder, "files")
    os.mkdir(files)
    pixels = noise(SIDE)
    for number in range(IMAGES):
        series = 0 if number < 499 else 1
        uid = "%s.%d" % (SERIES[series], number + 1)
        pixels[0:2] = struct.pack("<H", number)
        data = changed(slices[number % len(slices)], {
            0x00020003: uid.encode(), 0x00080018: uid.encode(),
            0x0020000D: STUDY.encode(), 0x0020000E: SERIES[series].encode(),
            0x00200013: str(number + 1).encode(), 0x00200011: str(series + 1).encode(),
            0x00200032: b"-200\\-220\\%.2f" % (64.5 - number * 1.5), 0x00201041: b"%.2f" % (64.5 - number * 1.5),
            0x00280010: struct.pack("<H", SIDE), 0x00280011: struct.pack("<H", SIDE), 0x7FE00010: bytes(pixels)})
        with open(os.path.join(files, "%04d.dcm" % number), "wb") as file:
            file.write(data)
    day = os.path.join(folder, "day")
    studies = 0
    for seed in range(1, 9):
        subprocess.run([kdd, "--quiet", "sample", day, "--images", "23", "--seed", str(seed)], check=True)
        for name in sorted(os.listdir(day)):
            if studies < 50 and re.match(r"[A-Z]+-\d+$", name):
                shutil.move(os.path.join(day, name), os.path.join(files, "%d-%s" % (seed, name)))
                studies += 1
        shutil.rmtree(day)
    return files


def ask(link, server, path, headers):
    try:
        link.request("GET", server.prefix + path, headers=headers)
        answer = link.getresponse()
    except (http.client.RemoteDisconnected, BrokenPipeError):  # a connection that was kept too long
        link.close()
        link.request("GET", server.prefix + path, headers=headers)
        answer = link.getresponse()
    body = answer.read()
    if answer.status != 200:
        raise RuntimeError("%s answers %s with %d" % (server.name, path, answer.status))
    return body, answer


def check(server, row, link):
    """That the answer is one: how many bytes it has."""
    body, answer = ask(link, server, row["path"], row["headers"])
    plain = gzip.decompress(body) if answer.getheader("Content-Encoding") == "gzip" else body
    if row["holds"] is bytes and len(plain) < row["count"]:
        raise RuntimeError("%s: %s has %d bytes only" % (server.name, row["name"], len(plain)))
    if row["holds"] is list and len(json.loads(plain)) != row["count"]:
        raise RuntimeError("%s: %s has %d objects" % (server.name, row["name"], len(json.loads(plain))))
    return len(body)


def one_by_one(server, row, seconds):
    link = http.client.HTTPConnection("127.0.0.1", server.port)
    size = check(server, row, link)
    times, cpu, begin = [], server.cpu(), time.monotonic()
    while len(times) < 3 or time.monotonic() - begin < seconds:
        start = time.monotonic()
        ask(link, server, row["path"], row["headers"])
        times.append(time.monotonic() - start)
    return size, statistics.median(times), (server.cpu() - cpu) / len(times)


def rate(server, row, connections, seconds):
    """Requests per second and processor time of each."""
    command = ["wrk", "-t1", "-c%d" % connections, "-d%ds" % max(1, round(seconds)), "--timeout", "120s"]
    for name, value in row["headers"].items():
        command += ["-H", "%s: %s" % (name, value)]
    before = server.cpu()
    text = subprocess.run(command + ["http://127.0.0.1:%d%s%s" % (server.port, server.prefix, row["path"])],
                          capture_output=True, text=True, check=True).stdout
    if "Non-2xx" in text or "Socket errors" in text:
        raise RuntimeError("%s: %s: %s" % (server.name, row["name"], text))
    count = int(re.search(r"(\d+) requests in", text).group(1))
    return (float(re.search(r"Requests/sec:\s+([\d.]+)", text).group(1)),
            (server.cpu() - before) / count if count else float("inf"))


def rows():
    series = "/studies/%s/series/%s" % (STUDY, SERIES[0])
    instance = series + "/instances/%s.7" % SERIES[0]
    row = lambda name, path, count=1, accept=JSON, packed=False, holds=list, kept=True: {
        "name": name, "path": path, "count": count, "holds": holds, "kept": kept,
        "headers": {"Accept": accept, "Accept-Encoding": "gzip" if packed else "identity"}}
    return [
        row("list of 51 studies", LIST, 51),
        row("one study by UID", LIST + "&StudyInstanceUID=" + STUDY),
        row("series of a study", "/studies/%s/series?includefield=0008103E%%2C00080021" % STUDY, 2),
        row("instances of a series, 499", series + "/instances", 499),
        row("series metadata, 499, plain", series + "/metadata", 499),
        row("series metadata, 499, gzip, not kept", series + "/metadata", 499, packed=True, kept=False),
        row("series metadata, 499, gzip", series + "/metadata", 499, packed=True),
        row("study metadata, 1,000, plain", "/studies/%s/metadata" % STUDY, 1000),
        row("study metadata, 1,000, gzip, not kept", "/studies/%s/metadata" % STUDY, 1000, packed=True, kept=False),
        row("study metadata, 1,000, gzip", "/studies/%s/metadata" % STUDY, 1000, packed=True),
        row("instance metadata", instance + "/metadata"),
        row("frame, 512 KB", instance + "/frames/1", SIDE * SIDE * 2, FRAME, holds=bytes),
        row("instance as Part 10", instance, SIDE * SIDE * 2, OBJECT, holds=bytes),
        row("rendered, JPEG", instance + "/rendered", 1000, "image/jpeg", holds=bytes),
    ]


def measure(server, row, seconds):
    size, wall, cpu = one_by_one(server, row, seconds)
    rates = []
    if wall > 0.5:  # four at once would take a minute each, and tell what two processors do with four times the work
        rates = [1 / wall, 1 / wall]
    elif shutil.which("wrk"):
        for connections in (1, 4):
            found, spent = rate(server, row, connections, max(seconds, 3 * connections * wall))
            rates.append(found)
            # Of many short requests the clock's ticks tell more.
            if connections == 1 and wall < 0.02:
                cpu = spent
    return {"bytes": size, "wall": wall * 1000, "cpu": cpu * 1000, "rates": rates}


def main():
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    kdd = os.path.abspath(os.path.join(sys.argv[1], "src/tools/kdd/kdd"))
    seconds = float(sys.argv[2]) if len(sys.argv) > 2 else 3
    with comparison("dicomweb") as (folder, servers):
        files = make_archive(kdd, folder)
        add(kdd, folder, files)
        kept = start_kdd(kdd, folder)
        servers.append(kept)
        unkept = start_kdd(kdd, folder, "kdd, nothing kept", env={"KDD_ANSWERS_SIZE": "0"})
        servers.append(unkept)
        peer = start_peer(folder, files)
        if peer:
            servers.append(peer)
        if not shutil.which("wrk"):
            print("No requests/s: wrk is missing (apt-get install wrk)\n")
        head = "| request | server | bytes | median ms | CPU ms | /s, 1 connection | /s, 4 | CPU ratio | /s ratio, 4 |"
        print(head + "\n|" + "---|" * head.count(" | ") + "---|")
        for row in rows():
            results = []
            for server in (kept if row["kept"] else unkept, peer):
                if server is None:
                    continue
                found = measure(server, row, seconds)
                results.append(found)
                ratios = ["", ""]
                if len(results) == 2:
                    ratios[0] = "%.0f" % (found["cpu"] / results[0]["cpu"])
                    if found["rates"] and results[0]["rates"]:
                        ratios[1] = "%.1f" % (results[0]["rates"][1] / found["rates"][1] if found["rates"][1] else 0)
                rates = ["%.1f" % each for each in found["rates"]] or ["", ""]
                print("| %s | %s | %d | %.2f | %.3f | %s |" % (row["name"], server.name, found["bytes"], found["wall"],
                                                               found["cpu"], " | ".join(rates + ratios)), flush=True)


if __name__ == "__main__":
    main()
