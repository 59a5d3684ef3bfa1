"""A site as docs/deployment.md describes it, in a folder of its own: PostgreSQL, two servers, two workers, and nginx in front
of the servers with the very configuration that the page shows."""
import datetime
import glob
import os
import re
import shutil
import signal
import subprocess
import sys
import threading

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "../../bench"))
from servers import free_port, start_postgres  # noqa: E402

ANSWERS = 8  # [MiB], of the folder of kept answers


def nginx_block(page):
    """The block of the page that has servers behind it."""
    with open(page, encoding="utf-8") as text:
        blocks = re.findall(r"```nginx\n(.*?)```", text.read(), re.DOTALL)
    return next(block for block in blocks if "upstream" in block)


def replaced(pattern, by, text):
    text, count = re.subn(pattern, by, text)
    if count == 0:
        raise SystemExit(f"The page's configuration has no {pattern}")
    return text


class DeployedSite:
    def __init__(self, kdd, page, folder):
        self.kdd, self.folder = kdd, folder
        self.store = os.path.join(folder, "store")
        self.ports = [free_port(), free_port()]
        self.port = free_port()
        self.certificate = os.path.join(folder, "tls.pem")
        self.processes = {}
        self.log = open(os.path.join(folder, "log"), "ab")
        self.database_is_there = threading.Event()
        self.environment = dict(
            os.environ, KDD_STORE=self.store, KDD_FREE_SPACE="0", KDD_SETTLE_SECONDS="3",
            KDD_SERVER_PROXIES="127.0.0.1", KDD_FILE_DIGESTS="1", KDD_CHECK_RATE="4", KDD_CHECK_HOURS="0",
            KDD_ANSWERS_SIZE=str(ANSWERS), KDD_DATABASE=self.start_database())
        self.run("build")
        self.start_nginx(page)

    def note(self, text):
        """In the log of all programs, beside what they tell."""
        now = datetime.datetime.now().isoformat(" ", "milliseconds")
        self.log.write(f"{now} soak {text}\n".encode())
        self.log.flush()

    def run(self, *arguments, **more):
        """A command of the tool, which has to succeed."""
        done = subprocess.run([self.kdd, *arguments], env=dict(self.environment, **more), stdout=subprocess.PIPE,
                              stderr=subprocess.PIPE, check=False)
        if done.returncode != 0 and arguments != ("build",):
            raise SystemExit(f"kdd {' '.join(arguments)} ended with {done.returncode}: {done.stderr.decode()}")
        return done.stdout

    def start_database(self):
        """Its address."""
        self.processes["postgres"], address = start_postgres(self.folder, "-c max_connections=300")
        self.database_is_there.set()
        return address

    def start_nginx(self, page):
        subprocess.run(["openssl", "req", "-x509", "-newkey", "rsa:2048", "-nodes", "-days", "2", "-subj", "/CN=localhost",
                        "-addext", "subjectAltName=DNS:localhost", "-keyout", os.path.join(self.folder, "key.pem"),
                        "-out", self.certificate], check=True, stderr=subprocess.DEVNULL)
        block = nginx_block(page)
        block = replaced(r"listen 443", f"listen 127.0.0.1:{self.port}", block)
        block = replaced(r"127\.0\.0\.1:8042", f"127.0.0.1:{self.ports[0]}", block)
        block = replaced(r"127\.0\.0\.1:8044", f"127.0.0.1:{self.ports[1]}", block)
        block = replaced(r"/etc/kdd/", self.folder + "/", block)
        block = replaced(r"images\.example\.org", "localhost", block)
        folders = "".join(f"{name}_temp_path {self.folder}/{name};\n"
                          for name in ("client_body", "proxy", "fastcgi", "uwsgi", "scgi"))
        path = os.path.join(self.folder, "nginx.conf")
        with open(path, "w", encoding="utf-8") as configuration:
            configuration.write(f"daemon off;\npid {self.folder}/nginx.pid;\nerror_log {self.folder}/nginx.log;\n"
                                f"events {{ worker_connections 1000; }}\nhttp {{\naccess_log off;\n{folders}{block}}}\n")
        command = [shutil.which("nginx", path=os.environ.get("PATH", "") + ":/usr/sbin"), "-p", self.folder, "-c", path,
                   "-e", f"{self.folder}/nginx.log"]
        subprocess.run([*command, "-t"], check=True, stderr=self.log)
        self.processes["nginx"] = subprocess.Popen(command, stdout=self.log, stderr=self.log)

    def start_server(self, number):
        server = subprocess.Popen(
            [self.kdd, "serve", "--stow", "--corrections", "--deletions", "--listen", f"127.0.0.1:{self.ports[number]}"], env=self.environment,
            stdout=subprocess.PIPE, stderr=self.log)
        if not server.stdout.readline():
            raise SystemExit(f"Server {number} did not start; see {self.log.name}")
        self.processes[f"server{number}"] = server

    def start_worker(self, number):
        self.processes[f"worker{number}"] = subprocess.Popen(
            [self.kdd, "build", "--forever"], env=self.environment, stdout=self.log, stderr=self.log)

    def start(self, name):
        if name == "postgres":
            self.start_database()
        elif name.startswith("server"):
            self.start_server(int(name[-1]))
        else:
            self.start_worker(int(name[-1]))

    def signalled(self, name, how, clients):
        """False when clients count on it."""
        with clients.mutex:
            if not name.startswith("worker") and clients.repeating > 0:
                return False
            if name == "postgres":
                self.database_is_there.clear()
                # Killed alone it would leave those that work for it.
                how = signal.SIGQUIT if how == signal.SIGKILL else signal.SIGINT
            self.processes[name].send_signal(how)
            return True

    def end(self, name, how=signal.SIGTERM):
        """Its exit code, after the signal; None: it was given one."""
        process = self.processes.pop(name)
        if how is not None:
            process.send_signal(how)
        return process.wait(120)

    def files(self, folder):
        return [os.path.join(root, name) for root, _, names in os.walk(os.path.join(self.store, folder)) for name in names]

    def tag_files(self, store=None):
        """Their bytes, by their place."""
        root = os.path.join(store or self.store, "meta")
        files = {}
        for path in glob.glob(root + "/**/*.tc", recursive=True):
            with open(path, "rb") as file:
                files[os.path.relpath(path, root)] = file.read()
        return files

    def close(self):
        for name in ("server0", "server1", "worker0", "worker1"):
            if name in self.processes:
                self.end(name, signal.SIGKILL)
        # Its own workers would outlive it if it were killed.
        if "nginx" in self.processes:
            self.end("nginx")
        if "postgres" in self.processes:
            self.end("postgres", signal.SIGINT)
        self.log.close()
