"""Which rows are measured at which sizes, and how a row of output is named."""
import os
import re
import subprocess
import sys
from dataclasses import dataclass

OURS = "vemo"
PROGRAMS = ("map_bench", "store_bench", "replay_bench")

# The first line that fits a workload decides its sizes.
SIZES = {
    "smoke": [
        (r"replay\.", [200]),
        (r".*", [1_000]),
    ],
    "quick": [
        (r"map\.(insert|find-hit|scan)\.clustered\.P1$", [100_000, 1_000_000]),
        (r"map\..*\.clustered\.P1$", [100_000]),
        (r"map\.(insert|find-hit)\.(random\.P1|clustered\.P2)$", [100_000]),
        (r"map\.", []),
        (r"store\.clustered\.P1$", [100_000]),
        (r"store\.", []),
        (r"replay\.recording$", [259_778]),
        (r"replay\.git$", [10_000]),
    ],
    "full": [
        (r"map\.(insert|find-hit|find-dependent|scan|erase|memory)\.clustered\.P1$", [100_000, 1_000_000, 10_000_000]),
        (r"map\.", [100_000, 1_000_000]),
        (r"store\.clustered\.P1$", [100_000, 1_000_000, 10_000_000]),
        (r"store\.", [1_000_000]),
        (r"replay\.recording$", [259_778]),
        (r"replay\.git$", [10_000]),
    ],
}
ROUNDS = {"smoke": 1, "quick": 3, "full": 5}


@dataclass(frozen=True)
class Job:
    """One process of one round. It reports one row or, where the work hangs together, several."""
    program: str
    workload: str
    size: int
    peer: str
    rows: tuple

    @property
    def name(self):
        return f"{self.workload}/{self.size}/{self.peer}"


def sizes_of(workload, mode):
    for pattern, sizes in SIZES[mode]:
        if re.match(pattern, workload):
            return sizes
    return []


def split_payload(row):
    """map.insert.clustered.P1 -> (map.insert.clustered, P1); the payload is empty where a row has none."""
    head, _, tail = row.rpartition(".")
    return (head, tail) if re.fullmatch(r"P\d", tail) else (row, "")


def list_jobs(build, mode, wanted, sizes=None):
    """All jobs that report a row which `wanted`, a compiled expression, is found in; ours first, a row's peers together. `sizes`
    replaces those of the mode."""
    jobs = []
    for program in PROGRAMS:
        if not os.path.exists(f"{build}/bench/{program}"):
            print(f"{program} was not built: its rows are skipped", file=sys.stderr)
            continue
        listed = subprocess.run([f"{build}/bench/{program}", "--list"], check=True, stdout=subprocess.PIPE, text=True)
        for line in listed.stdout.splitlines():
            name, *rows = line.split()
            workload, _, peer = name.partition("/")
            for size in sizes or sizes_of(workload, mode):
                if any(wanted.search(f"{row}/{size}/{peer}") for row in rows or [workload]):
                    jobs.append(Job(program, workload, size, peer, tuple(rows or [workload])))
    order = {}
    for job in jobs:
        order.setdefault((job.workload, job.size), len(order))
    return sorted(jobs, key=lambda job: (order[job.workload, job.size], job.peer != OURS))
