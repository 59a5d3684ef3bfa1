"""Whether programs that live for long take more and more: memory, descriptors, threads, processes of their own."""
import glob
import os
import statistics
import threading

# What a program may take more in the second half of its time than in the first: that part of what it took, and so much.
ALLOWED = {"MiB of memory": (0.1, 16), "descriptors": (0.1, 8), "threads": (0, 2), "processes": (0, 2)}


def taken(pid):
    with open(f"/proc/{pid}/status", encoding="ascii", errors="replace") as status:
        told = dict(line.split(":", 1) for line in status)
    children = []
    for path in glob.glob(f"/proc/{pid}/task/*/children"):
        with open(path, encoding="ascii") as listed:
            children += listed.read().split()
    return {"MiB of memory": int(told["RssAnon"].split()[0]) / 1024, "descriptors": len(os.listdir(f"/proc/{pid}/fd")),
            "threads": int(told["Threads"]), "processes": len(children)}


class Watch:
    """Over processes that nobody kills from its beginning to its end. Needs a minute or two to tell anything."""

    def __init__(self, processes, seconds):
        """Processes by name."""
        self.processes, self.rest = processes, seconds / 400
        self.samples = {name: [] for name in processes}
        self.is_over = threading.Event()
        self.thread = threading.Thread(target=self.look)
        self.thread.start()

    def look(self):
        while not self.is_over.wait(self.rest):
            for name, process in self.processes.items():
                self.samples[name].append(taken(process.pid))

    def end(self):
        self.is_over.set()
        self.thread.join()

    def told(self):
        """What was taken, and what grew beyond what is allowed."""
        said, faults = [], []
        for name, samples in self.samples.items():
            half = len(samples) // 2
            for what, (part, much) in ALLOWED.items():
                first, second = (statistics.median(sample[what] for sample in some) for some in (samples[:half], samples[half:]))
                text = f"{what} of {name}: {first:.0f}, then {second:.0f}"
                said.append(text)
                if second > first * (1 + part) + much:
                    faults.append("Grows: " + text)
        return said, faults
