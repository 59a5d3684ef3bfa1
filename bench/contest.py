"""Whole processes that do the same work, in turn: what each takes, and how that is told."""
import json
import os
import platform
import shutil
import statistics
import subprocess
import sys


class Contest:
    """One piece of work, and who does it. `ours` stands first; what has no work to do but bounds it is a floor.

    Where it may fail, files that cannot be read are no fault, and of a peer that dies of them that is told.
    """

    def __init__(self, title, size, unit="images", may_fail=False):
        self.title, self.size, self.unit, self.may_fail, self.entries = title, size, unit, may_fail, []

    def enter(self, who, command, env=None, before=None, kind="peer"):
        """`before` is called ahead of each round, and not timed."""
        self.entries.append({"who": who, "command": command, "env": {**os.environ, **(env or {})}, "before": before,
                             "kind": kind, "times": [], "cpu": [], "peak": [], "dies": False})

    def run(self, rounds, floor):
        for _ in range(rounds):
            for entry in self.entries:
                if entry["before"]:
                    entry["before"]()
                wall, cpu, peak, code = timed(entry["command"], entry["env"], floor)
                entry["dies"] |= self.may_fail and entry["kind"] == "peer" and code > 1
                if code > (1 if self.may_fail else 0) and not entry["dies"]:
                    sys.exit("%s ends with %d" % (" ".join(entry["command"]), code))
                entry["times"].append(wall)
                entry["cpu"].append(cpu)
                entry["peak"].append(peak)
        return self.rows()

    def rows(self):
        rows = [{"work": self.title, "size": self.size, "unit": self.unit, "who": entry["who"], "kind": entry["kind"],
                 "ms": statistics.median(entry["times"]), "cpu": statistics.median(entry["cpu"]),
                 "peak": max(entry["peak"]), "dies": entry["dies"]} for entry in self.entries]
        ours = next(row for row in rows if row["kind"] == "ours")
        for row in rows:
            row["ratio"] = row["ms"] / ours["ms"]
        return rows


def timed(command, env, floor):
    """Wall-clock and processor time [ms], peak memory [MiB] and exit code of a process; of a signal 128 and its number."""
    done = subprocess.run([floor, "time", *command], env=env, stdout=subprocess.PIPE, stderr=subprocess.PIPE, check=False)
    told = done.stdout.decode().split()
    if done.returncode != 0:
        sys.exit("%s fails: %s" % (floor, done.stderr.decode(errors="replace")))
    return float(told[0]), float(told[1]), int(told[2]) / 1024, int(told[3])


def machine():
    with open("/proc/cpuinfo") as file:
        name = next((line.split(":")[1].strip() for line in file if line.startswith("model name")), platform.machine())
    return "%s, %d cores, load %.1f" % (name, os.cpu_count(), os.getloadavg()[0])


def number(value):
    return "%.0f" % value if value >= 100 else "%.1f" % value if value >= 1 else "%.2f" % value


def table(rows):
    lines, work = [], None
    for row in rows:
        head = "%s, %s %s" % (row["work"], "{:,}".format(row["size"]), row["unit"])
        if head != work:
            work = head
            lines += ["", "**%s**" % head, "", "| | ms | CPU ms | peak MiB | time / ours |", "| --- | --: | --: | --: | --: |"]
        who = "*%s*" % row["who"] if row["kind"] == "floor" else row["who"]
        if row["dies"]:
            lines.append("| %s | dies of a file | | | |" % who)
            continue
        lines.append("| %s | %s | %s | %.0f | %s |" % (who, number(row["ms"]), number(row["cpu"]), row["peak"],
                                                      "" if row["kind"] == "ours" and row["ratio"] == 1
                                                      else number(row["ratio"])))
    return "\n".join(lines) + "\n"


def plot(rows, title, path):
    """Time by the number of images, a line for each of those that do the work; nothing without gnuplot."""
    names = list(dict.fromkeys(row["who"] for row in rows))
    if not shutil.which("gnuplot") or len({row["size"] for row in rows}) < 2:
        return False
    data = "".join("$line%d << END\n%s\nEND\n" % (i, "\n".join("%d %g" % (row["size"], row["ms"]) for row in rows
                                                              if row["who"] == name)) for i, name in enumerate(names))
    lines = ", ".join('$line%d with linespoints title "%s"' % (i, name) for i, name in enumerate(names))
    script = ('set terminal svg size 800,480 background "white"\nset output "%s"\nset logscale xy\nset key outside\n'
              'set title "%s"\nset xlabel "images"\nset ylabel "ms"\nset grid\n%splot %s\n' % (path, title, data, lines))
    subprocess.run(["gnuplot"], input=script.encode(), check=True)
    return True


def save(rows, path):
    with open(path, "w") as file:
        json.dump({"machine": machine(), "rows": rows}, file, indent=1)
