#!/usr/bin/env python3
"""What searches cost from end to end: kdd serve over 100,000 made-up studies, in SQLite and in PostgreSQL.

    bench/searches.py BUILD-FOLDER [REQUESTS] [FOLDER]

For each question the processor's time of the server and of the database's processes, and the time until the answer was
there [ms]. A FOLDER is kept, so that a repeat need not fill the databases again. With KDD_BENCH_PLANS=1 is told how each
engine goes about it: SQLite's plans are printed, PostgreSQL's stand in postgres.log of the folder.
"""

import glob
import http.client
import os
import re
import subprocess
import sys
import tempfile
import time

from servers import start_postgres

TICK = 1000 / os.sysconf("SC_CLK_TCK")  # [ms]

# The study list of a common viewer, and what its users add in front of it.
LIST = "limit=101&offset=0&fuzzymatching=true&includefield=00081030%2C00080060%2C00080090%2C00100030"
QUESTIONS = [
    ("list", LIST),
    ("page 50", LIST.replace("offset=0", "offset=5000")),
    ("name *sch*", "PatientName=*sch*&" + LIST),
    ("name *aba*", "PatientName=*aba*&" + LIST),
    ("name *schowtra*", "PatientName=*schowtra*&" + LIST),
    ("name *wi*", "PatientName=*wi*&" + LIST),
    ("name *w*", "PatientName=*w*&" + LIST),
    ("one ideograph", "PatientName=*%E4%B9%81*&" + LIST),
    ("two ideographs", "PatientName=*%E4%B9%81%E4%B9%81*&" + LIST),
    ("family Bababa", "PatientName=Bababa%5E*&" + LIST),
    ("dates of a month", "StudyDate=20200101-20200131&" + LIST),
    ("part of an identifier", "00100020=*4711*&" + LIST),
    ("identifier", "00100020=PID4711&" + LIST),
    ("accession number", "AccessionNumber=A1004711&" + LIST),
    ("part of a description", "StudyDescription=*spine*&" + LIST),
    ("modality CT", "ModalitiesInStudy=CT&" + LIST),
    ("rare modality", "ModalitiesInStudy=OPT&" + LIST),
    ("modality in a year", "ModalitiesInStudy=OPT&StudyDate=20200101-20201231&" + LIST),
    ("modality and name", "ModalitiesInStudy=MR&PatientName=*sch*&" + LIST),
    ("name in a year", "PatientName=*sch*&StudyDate=20200101-20201231&" + LIST),
    ("by name, page 50", "orderby=PatientName&" + LIST.replace("offset=0", "offset=5000")),
    ("one study", "StudyInstanceUID=1.2.3.4711&" + LIST),
]

PLANS = "-c session_preload_libraries=auto_explain -c auto_explain.log_min_duration=0 -c auto_explain.log_analyze=on"


def spent(pid):
    """Of a process and its children, those that ended included."""
    total = 0
    for stat in glob.glob("/proc/[0-9]*/stat"):
        try:
            fields = open(stat).read().rsplit(")", 1)[1].split()
        except OSError:
            continue
        if stat == f"/proc/{pid}/stat":
            total += sum(map(int, fields[11:15]))
        elif int(fields[1]) == pid:
            total += int(fields[11]) + int(fields[12])
    return total * TICK


def fill(build, address):
    """By the benchmark itself, which fills a database that is empty; with plans it tells those."""
    wanted = "search/" if "KDD_BENCH_PLANS" in os.environ else "search/newest"
    subprocess.run([build + "/bench/kdd_bench", "--benchmark_filter=" + wanted], check=True,
                   stdout=subprocess.DEVNULL, stderr=None if wanted == "search/" else subprocess.DEVNULL, env=dict(os.environ, KDD_BENCH_DATABASE=address))


def measure(build, store, address, database, requests):
    server = subprocess.Popen([build + "/src/tools/kdd/kdd", "--store", store, "--database", address, "serve",
                               "--listen", "127.0.0.1:0", "--threads", "1"],
                              stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True)
    try:
        port = int(re.search(r"127\.0\.0\.1:(\d+)", server.stdout.readline()).group(1))
        client = http.client.HTTPConnection("127.0.0.1", port)
        for name, query in QUESTIONS:
            def ask():
                client.request("GET", "/dicom-web/studies?" + query, headers={"Accept": "application/dicom+json"})
                answer = client.getresponse()
                body = answer.read()
                assert answer.status == 200, (name, answer.status, body[:200])
                return body.count(b'"00201206"')
            found = ask()
            before = spent(server.pid), spent(database) if database else 0
            times = []
            for _ in range(requests):
                begin = time.perf_counter()
                ask()
                times.append(1000 * (time.perf_counter() - begin))
            own = (spent(server.pid) - before[0]) / requests
            other = (spent(database) - before[1]) / requests if database else 0
            print(f"{name:24}{found:6}{own:10.2f}{other:10.2f}{own + other:10.2f}{sorted(times)[requests // 2]:10.1f}",
                  flush=True)
    finally:
        server.terminate()
        server.wait()


def main():
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    build = os.path.abspath(sys.argv[1])
    requests = int(sys.argv[2]) if len(sys.argv) > 2 else 50
    kept = tempfile.TemporaryDirectory(prefix="kddsearches") if len(sys.argv) < 4 else None
    folder = kept.name if kept else os.path.abspath(sys.argv[3])
    os.makedirs(folder + "/store/meta", exist_ok=True)
    postgres, address = start_postgres(folder, PLANS if "KDD_BENCH_PLANS" in os.environ else "")
    try:
        engines = [("SQLite", f"sqlite:{folder}/kdd.sqlite", None),
                   ("PostgreSQL", address, postgres.pid)]
        for engine, address, database in engines:
            fill(build, address)
            print(f"{engine:24}{'found':>6}{'server':>10}{'database':>10}{'together':>10}{'median':>10}")
            measure(build, folder + "/store", address, database, requests)
    finally:
        postgres.terminate()
        postgres.wait()


if __name__ == "__main__":
    main()
