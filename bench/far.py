#!/usr/bin/env python3
"""What it costs to take in a study that lies behind a server 20 ms away: nginx, and a link in front of it that delays.

    bench/far.py BUILD-FOLDER [IMAGES] [ROUND-TRIP-MS] [ROUNDS]

Beside it what bounds it: the first 16 KiB of each object by curl, one after the other and as many at a time as kdd asks
for, and the same study from the disk.
"""

import os
import shutil
import subprocess
import sys
import tempfile
import time

from contest import Contest, machine, table
from servers import ImageTemplate, ct_slices

CONFIGURATION = """
daemon off; pid pid; error_log log; worker_processes 1; events {}
http { access_log off; sendfile on; tcp_nopush on; keepalive_requests 100000; root files;
client_body_temp_path 1; proxy_temp_path 2; fastcgi_temp_path 3; uwsgi_temp_path 4; scgi_temp_path 5;
server { listen 127.0.0.1:18441; } }
"""
LINK = 18442
SIDE = 256  # rows and columns: far more than comes with the first bytes


def make(kdd, folder, images):
    """A CT of so many images, in one folder; their names."""
    os.mkdir(folder + "/files")
    templates = [ImageTemplate(data, SIDE) for data in ct_slices(kdd, folder)[:20]]
    names = ["%05d.dcm" % number for number in range(images)]
    for number, name in enumerate(names):
        template = templates[number % len(templates)]
        with open("%s/files/%s" % (folder, name), "wb") as file:
            file.write(template.head_of(1, 1, number) + bytes(template.pixels))
    return names


def write(path, lines):
    with open(path, "w") as file:
        file.write("\n".join(lines) + "\n")


def contests(kdd, folder, names):
    urls = ["http://127.0.0.1:%d/%s" % (LINK, name) for name in names]
    write(folder + "/list", urls)
    write(folder + "/curl", ['url="%s"\noutput=/dev/null' % url for url in urls])
    curl = ["curl", "-s", "-r", "0-16383", "-K", folder + "/curl"]

    def fresh(store):
        return lambda: shutil.rmtree(folder + "/" + store, ignore_errors=True)

    def tool(store, *words):
        return [kdd, "--quiet", "--store", folder + "/" + store, *words]

    taking = Contest("taking in", len(names))
    taking.enter("kdd add, far", tool("far", "add", "--from", folder + "/list"), before=fresh("far"), kind="ours")
    taking.enter("kdd add, from the disk", tool("near", "add", folder + "/files"), before=fresh("near"), kind="floor")
    taking.enter("curl, 16 at a time, 16 KiB each", curl[:1] + ["-Z", "--parallel-max", "16"] + curl[1:], kind="floor")
    taking.enter("curl, one after the other, 16 KiB each", curl)
    later = []
    for title, words in (("taking in again", ["add", "--from", folder + "/list"]),
                         ("building again", ["build", "--all", "--again"]), ("verifying", ["verify", "--all"])):
        contest = Contest(title, len(names))
        contest.enter("kdd %s, far" % words[0], tool("far", *words), kind="ours")
        later.append(contest)
    return [taking, *later]


def main():
    build, images, delay, rounds = (sys.argv[1:] + ["1000", "20", "3"][len(sys.argv) - 2:])[:4]
    for program in ("nginx", "curl"):
        if not shutil.which(program):
            sys.exit("far: %s is missing (apt-get install nginx-light curl)" % program)
    kdd, floor = (os.path.abspath(build + path) for path in ("/src/tools/kdd/kdd", "/bench/peers/peer_floor"))
    with tempfile.TemporaryDirectory() as folder:
        names = make(kdd, folder, int(images))
        write(folder + "/nginx.conf", (["user root root;"] if os.getuid() == 0 else []) + [CONFIGURATION])
        servers = [subprocess.Popen(["nginx", "-e", "log", "-c", "nginx.conf", "-p", folder + "/"]),
                   subprocess.Popen([os.path.abspath(build + "/bench/delay_proxy"), str(LINK), "18441", delay])]
        time.sleep(1)
        try:
            rows = [row for contest in contests(kdd, folder, names) for row in contest.run(int(rounds), floor)]
        finally:
            for server in servers:
                server.terminate()
                server.wait()
    print("%s, %s ms to the server" % (machine(), delay))
    print(table(rows))


if __name__ == "__main__":
    main()
