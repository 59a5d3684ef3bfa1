"""Who sends objects, by STOW-RS or over associations, and goes on until it was told what became of each."""
import http.client
import json
import os
import re
import socket
import subprocess
import threading
import time

BOUNDARY = b"a-boundary-of-the-kills"
OTHER_OBJECT = 0x0111  # why one is refused whose UID is taken


class Stow:
    """Sends by STOW-RS: an object alone, or several as parts of one request."""

    def __init__(self, template, chance):
        self.template, self.chance = template, chance

    def most(self):
        """How many go at once."""
        return self.chance.choice((1, 1, 1, 2, 5, 12))

    def send(self, server, uploads):
        """The outcome of each, in words; nothing of those of which nothing was told."""
        parts = b"".join(b"--" + BOUNDARY + b"\r\nContent-Type: application/dicom\r\n\r\n" + object_of(self.template, each) +
                         b"\r\n" for each in uploads) + b"--" + BOUNDARY + b"--\r\n"
        request = (b"POST /dicom-web/studies HTTP/1.1\r\nHost: localhost\r\nConnection: close\r\nContent-Length: %d\r\n"
                   b'Content-Type: multipart/related; type="application/dicom"; boundary=%s\r\n\r\n'
                   % (len(parts), BOUNDARY)) + parts
        link = socket.create_connection(("127.0.0.1", server.port), 60)
        with link:
            if self.chance.random() < 0.02:
                link.sendall(request[:self.chance.randrange(len(request))])
                return {}
            link.sendall(request)
            answer = http.client.HTTPResponse(link, method="POST")
            answer.begin()
            body = answer.read()
        return self.outcomes(answer.status, body, uploads)

    def outcomes(self, status, body, uploads):
        if status not in (200, 202, 409):
            return {each: "status %d" % status for each in uploads}
        by_uid = {self.template.uid(each.study, each.series, each.number): each for each in uploads}
        outcomes = {}
        for sequence in ("00081199", "00081198", "0008119A"):
            for item in json.loads(body).get(sequence, {}).get("Value", []):
                value = lambda tag: item.get(tag, {}).get("Value", [None])[0]
                reason = value("00081197")
                known = {None: "stored", OTHER_OBJECT: "refused"}
                outcomes[by_uid[value("00081155")]] = known.get(reason, "reason %04X" % (reason or 0))
        return outcomes


class Association:
    """Sends by DCMTK's storescu: some objects, one after the other."""

    TOLD = {"Success": "stored", "Unknown Status: 0x%x" % OTHER_OBJECT: "refused"}

    def __init__(self, template, chance, folder):
        self.template, self.chance, self.folder = template, chance, folder
        os.makedirs(folder)

    def most(self):
        return self.chance.choice((1, 3, 8, 20))

    def send(self, server, uploads):
        by_path = {}
        for upload in uploads:
            path = os.path.join(self.folder, "%d" % len(by_path))
            by_path[path] = upload
            with open(path, "wb") as file:
                file.write(object_of(self.template, upload))
        port = server.dicom
        if port is None:
            raise ConnectionError("it is not there")
        with subprocess.Popen(["storescu", "-v", "-nh", "-aec", "KDD", "127.0.0.1", port, *by_path], stdout=subprocess.PIPE,
                              stderr=subprocess.STDOUT) as process:
            if self.chance.random() < 0.1:
                time.sleep(self.chance.uniform(0, 0.3))
                process.kill()
            said = process.communicate()[0].decode()
        outcomes, path = {}, None
        for line in said.splitlines():
            if line.startswith("I: Sending file: "):
                path = line[len("I: Sending file: "):]
            answered = re.match(r".: Received Store Response \((.*)\)$", line)
            if answered:
                outcomes[by_path[path]] = self.TOLD.get(answered[1], answered[1])
        return outcomes


def object_of(template, upload):
    pixels = bytes(template.pixels)
    return (template.head_of(upload.study, upload.series, upload.number) + upload.content.to_bytes(2, "little") + pixels[2:])


class Sender(threading.Thread):
    def __init__(self, way, uploads, servers, ledger, chance):
        super().__init__()
        self.way, self.uploads, self.servers, self.ledger, self.chance = way, uploads, servers, ledger, chance

    def take(self):
        """Some uploads of different UIDs: of two of one UID nobody could tell which one an answer is about."""
        taken, uids = [], set()
        for _ in range(self.way.most()):
            try:
                upload = self.uploads.popleft()
            except IndexError:
                break
            if upload._replace(content=0) in uids:
                self.uploads.append(upload)
                break
            uids.add(upload._replace(content=0))
            taken.append(upload)
        return taken

    def run(self):
        try:
            while True:
                taken = self.take()
                if not taken:
                    return
                self.deliver(taken)
        except Exception as fault:
            self.ledger.fault("a sender ended: %r" % fault)

    def deliver(self, taken):
        """Until something was told of each."""
        while taken and not self.ledger.faults:
            self.ledger.begin(taken)
            try:
                outcomes = self.way.send(self.chance.choice(self.servers), taken)
            except (OSError, TypeError, http.client.HTTPException):
                # Killed, or not there yet.
                outcomes = {}
                time.sleep(0.02)
            left = []
            for upload in taken:
                outcome = outcomes.get(upload, "nothing told")
                self.ledger.note(upload, outcome)
                if outcome == "refused" and len(self.ledger.sent[upload._replace(content=0)]) < 2:
                    self.ledger.fault("%s was refused for another one, and there is none" % (upload,))
                if outcome not in ("stored", "refused"):
                    left.append(upload)
            taken = left
