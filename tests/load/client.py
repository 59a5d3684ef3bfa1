"""A client that asks once more where it has to, and what all clients of an archive know together."""
import collections
import http.client
import random
import ssl
import threading
import time


class Clients:
    """What clients know and have seen, shared by their threads."""

    def __init__(self, site, seed, seconds):
        self.site, self.seed = site, seed
        self.context = ssl.create_default_context(cafile=site.certificate)
        self.mutex = threading.Lock()
        self.began, self.seconds = time.monotonic(), seconds
        self.acknowledged = {}  # SOP Instance UID: its study and series
        self.withdrawn = collections.Counter()  # SOP Instance UID: how often it was taken out
        self.corrected = {}  # study: what a client corrected in all of its images, by tag
        self.faults = []
        self.counts = collections.Counter()
        self.slowest = collections.Counter()  # [ms]
        self.repeating = 0  # requests that have failed once and are not yet answered
        self.over = threading.Event()

    def passed(self):
        """How much of the time, 0 to 1."""
        return min(1.0, (time.monotonic() - self.began) / self.seconds)

    def fault(self, text):
        with self.mutex:
            self.faults.append(text)
        self.site.note("fault: " + text)

    def withdraw(self, uids):
        """Nobody may count on them from here on, until they are acknowledged again."""
        with self.mutex:
            for uid in uids:
                del self.acknowledged[uid]
                self.withdrawn[uid] += 1

    def is_withdrawn(self, uid):
        """What tells, later, whether an image is there no more, or was not all the time."""
        before = self.withdrawn[uid]
        return lambda: uid not in self.acknowledged or self.withdrawn[uid] != before

    def count(self, what):
        with self.mutex:
            self.counts[what] += 1

    def random_image(self, randomness):
        with self.mutex:
            if not self.acknowledged:
                return None
            uid = randomness.choice(list(self.acknowledged))
            return (*self.acknowledged[uid], uid)


class Client:
    """One connection, opened anew when it breaks."""

    def __init__(self, clients, number):
        self.all = clients
        self.random = random.Random(clients.seed * 1000 + number)
        self.connection = None

    def once(self, method, path, body, headers):
        try:
            if self.connection is None:
                self.connection = http.client.HTTPSConnection("localhost", self.all.site.port, timeout=60,
                                                              context=self.all.context)
            self.connection.request(method, path, body, headers)
            answer = self.connection.getresponse()
            content = answer.read()
            if answer.status >= 500:
                # nginx reads no further request from where an upload broke off, and does not say so.
                self.connection.close()
                self.connection = None
            return answer.status, answer.headers, content
        except (OSError, http.client.HTTPException) as fault:
            self.connection = None
            return 0, {}, repr(fault).encode()

    def again(self, wait, *request):
        """After a wait [s], and when the database is there. Nothing that clients count on is killed from here on: what began to
        die when the second attempt began would take that one with it, too."""
        with self.all.mutex:
            self.all.repeating += 1
        self.all.site.database_is_there.wait()
        time.sleep(wait)
        answer = self.once(*request)
        with self.all.mutex:
            self.all.repeating -= 1
        return answer

    def ask(self, kind, path, headers, method="GET", body=None, is_good=lambda status, body: status == 200,
            is_moot=lambda: False):
        """The answer, of the second attempt where the first failed. None where that did too, or where it says something else than
        it should: faults, unless nobody can know any more what it should be."""
        began = time.monotonic()
        path = "/dicom-web" + path
        status, got, content = self.once(method, path, body, headers)
        if status != 200 and not is_good(status, content):
            self.all.count(f"{kind}, asked again after {status}")
            # As long as servers need to be started: they ask for more, since they do not know that the database is there again.
            status, got, content = self.again(min(1, float(got.get("Retry-After", 1))), method, path, body, headers)
        if not is_good(status, content):
            if not is_moot():
                self.all.fault(f"{method} {path}: {status} {content[:200]!r}")
            return None, None
        with self.all.mutex:
            self.all.counts[kind] += 1
            self.all.slowest[kind] = max(self.all.slowest[kind], int(1000 * (time.monotonic() - began)))
        return got, content
