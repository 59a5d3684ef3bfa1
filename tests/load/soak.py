#!/usr/bin/env python3
"""Two servers and two workers behind nginx, while clients store, search, read, correct and delete, and everything is killed at
random and the database restarted.

    tests/load/soak.py KDD PAGE SECONDS [SEED]

PAGE is docs/deployment.md, whose nginx configuration is used. What a client asks for has to succeed, if need be when it
asks once more; at the end whatever was told as stored is there, once, with what was corrected, and every tag file is byte for
byte what a build of the same objects in another place makes, or where it was corrected, shows what it showed when it is built
anew. In the second half of the time one server and one worker are left alive, and may not take more and more.
"""
import os
import random
import shutil
import signal
import sys
import tempfile
import threading
import time

sys.dont_write_bytecode = True
from client import Clients  # noqa: E402
from deployedsite import DeployedSite  # noqa: E402
from growth import Watch  # noqa: E402
from outcome import check  # noqa: E402
from work import change, read, upload  # noqa: E402

UPLOADERS = 3
READERS = 3
NAMES = ("server0", "server1", "worker0", "worker1")
LONG_LIVED = ("server1", "worker1")
TELLING = 60  # [s] that a watch needs

def kill(clients, names, randomness, seconds):
    """One at a time, the next one when it is there again, and nothing that clients count on while a request that failed is asked
    again: on a busy machine requests may take longer than servers live."""
    end = time.monotonic() + seconds
    while time.monotonic() < end:
        clients.over.wait(randomness.uniform(0.3, 2.0))
        # The whole site goes with the database, so it comes less often.
        name = randomness.choice(names) if randomness.random() < 0.9 else "postgres"
        how = signal.SIGTERM if randomness.random() < 0.2 else signal.SIGKILL
        while not clients.site.signalled(name, how, clients):
            time.sleep(0.02)
        clients.site.note(f"{signal.Signals(how).name} to {name}")
        clients.site.end(name, None)
        clients.count(f"{name.rstrip('01')} {'stopped' if how == signal.SIGTERM else 'killed'}")
        clients.site.start(name)
        clients.site.note(f"{name} is there again")


def shares(folders, seed):
    """The files of a day: of each uploader, mixed; and of each study that one client has to itself."""
    studies = [[os.path.join(root, name) for root, _, names in sorted(os.walk(folder)) for name in sorted(names)
                if ".vol" not in name] for folder in folders]
    own = sorted(studies, key=len)[:max(1, len(studies) // 8)]
    files = [path for study in studies if study not in own for path in study]
    random.Random(seed).shuffle(files)
    return [files[number::UPLOADERS] for number in range(UPLOADERS)], own


def work(clients, uploads, own):
    """The threads of all clients, at work."""
    each = [(upload, number, files) for number, files in enumerate(uploads)]
    each += [(read, UPLOADERS + number) for number in range(READERS)] + [(change, UPLOADERS + READERS, own)]
    threads = [threading.Thread(target=what, args=(clients, *arguments)) for what, *arguments in each]
    for thread in threads:
        thread.start()
    return threads


def soak(kdd, page, seconds, seed, folder):
    day = os.path.join(folder, "day")
    site = DeployedSite(kdd, page, folder)
    watch = None
    try:
        site.run("sample", day, "--quiet", "--images", str(max(120, min(20000, 15 * seconds))), "--seed", str(seed))
        for name in NAMES:
            site.start(name)
        clients = Clients(site, seed, seconds)
        threads = work(clients, *shares([os.path.join(day, name) for name in sorted(os.listdir(day))], seed))
        randomness = random.Random(seed)
        kill(clients, NAMES, randomness, seconds / 2)
        if seconds / 2 > TELLING:
            watch = Watch({name: site.processes[name] for name in LONG_LIVED}, seconds / 2)
        kill(clients, [name for name in NAMES if name not in LONG_LIVED], randomness, seconds / 2)
        if watch is not None:
            watch.end()
        clients.over.set()
        for thread in threads:
            thread.join()
        for name in NAMES:
            if site.end(name) != 0:
                clients.fault(f"{name} does not end in order")
        images, studies = check(site, clients)
    finally:
        site.close()
    for what in sorted(clients.counts):
        slowest = f", the slowest in {clients.slowest[what]} ms" if what in clients.slowest else ""
        print(f"{clients.counts[what]:8} {what}{slowest}")
    print(f"{len(clients.acknowledged):8} objects told as stored, {images} there, in {studies} studies, "
          f"{len(clients.corrected)} of them corrected")
    said, growing = watch.told() if watch is not None else ([], [])
    for text in said + clients.faults[:20] + growing:
        print(text)
    return not clients.faults and not growing


def main():
    if len(sys.argv) not in (4, 5):
        raise SystemExit(__doc__)
    if not all(shutil.which(name, path=os.environ["PATH"] + ":/usr/sbin") for name in ("nginx", "openssl", "setpriv")):
        print("Skipped: there is no nginx, openssl or setpriv")
        raise SystemExit(77)
    seed = int(sys.argv[4]) if len(sys.argv) == 5 else 1
    with tempfile.TemporaryDirectory(prefix="kddsoak") as folder:
        is_good = soak(sys.argv[1], sys.argv[2], int(sys.argv[3]), seed, folder)
        if not is_good and os.path.exists(folder):
            shutil.copy(os.path.join(folder, "log"), "soak.log")
    raise SystemExit(0 if is_good else 1)


if __name__ == "__main__":
    main()
