"""Runs the rows that two builds of this project have in common, interleaved, and prints how they differ."""
import argparse
import os
import re
import shutil
import statistics
import subprocess
import sys
import tempfile

import driver
import matrix
import report


def parse_arguments():
    parser = argparse.ArgumentParser(prog="bench/compare A B", description="Compares two revisions of vemo.")
    parser.add_argument("old", help=argparse.SUPPRESS)
    parser.add_argument("new", help=argparse.SUPPRESS)
    parser.add_argument("--filter", default="^map", metavar="REGEX",
                        help="only rows WORKLOAD/SIZE/PEER in which this is found (default: the maps in memory)")
    parser.add_argument("--rounds", type=int, default=5, metavar="N", help="runs of each row (default 5)")
    parser.add_argument("--sizes", default="", metavar="N,N", help="instead of the sizes of bench/run --quick")
    parser.add_argument("--no-instructions", action="store_true", help="do not count instructions")
    arguments = parser.parse_args()
    try:
        arguments.filter = re.compile(arguments.filter)
        arguments.sizes = [int(size) for size in arguments.sizes.split(",") if size]
    except (re.error, ValueError) as error:
        parser.error(str(error))
    if arguments.rounds < 1 or any(size < 1 for size in arguments.sizes):
        parser.error("rounds and sizes are at least 1")
    return arguments


def list_own_jobs(arguments, build):
    jobs = matrix.list_jobs(build, "quick", arguments.filter, sizes=arguments.sizes)
    return [job for job in jobs if job.peer == matrix.OURS]


def count_instructions(job, build):
    """Instructions an operation inside of the section that is timed; None where valgrind is missing or fails."""
    with tempfile.TemporaryDirectory() as folder:
        done = subprocess.run(
            ["valgrind", "--tool=callgrind", "--collect-atstart=no", "--toggle-collect=*MeasuredSection*",
             f"--callgrind-out-file={folder}/out", f"{build}/bench/{job.program}", "--row", job.name],
            capture_output=True, text=True)
    found = re.search(r"Collected : (\d+)", done.stderr)
    return int(found.group(1)) / job.size if done.returncode == 0 and found else None


def is_counted(job):
    """Rows of memory time nothing, and millions of entries take an hour to count."""
    return job.program == "map_bench" and ".memory." not in job.workload and job.size <= 100_000


def shown(old, new):
    return f"{report.number(old)} | {report.number(new)} | {new / old:.3f}" if old else f"{old} | {new} | -"


def main():
    arguments = parse_arguments()
    known = {job.name for job in list_own_jobs(arguments, arguments.old)}
    jobs = [job for job in list_own_jobs(arguments, arguments.new) if job.name in known]
    if not jobs:
        sys.exit("The two have no row in common that fits.")
    samples = ({}, {})
    for _ in range(arguments.rounds):
        for job in jobs:
            for side, build in enumerate((arguments.old, arguments.new)):
                for sample in driver.run_job(job, build, os.path.join(build, "bench")) or []:
                    key = (sample["row"], sample["size"], sample["unit"])
                    samples[side].setdefault(key, []).append(sample["value"])

    print("| row | unit | old | new | new / old |\n|---|---|---|---|---|")
    for key, old in samples[0].items():
        if key in samples[1]:
            row, size, unit = key
            print(f"| {row}/{size} | {unit} | {shown(statistics.median(old), statistics.median(samples[1][key]))} |")
    if arguments.no_instructions or not any(is_counted(job) for job in jobs):
        return
    if shutil.which("valgrind") is None:
        sys.exit("Without valgrind no instructions are counted.")
    print("\n| row | unit | old | new | new / old |\n|---|---|---|---|---|")
    for job in filter(is_counted, jobs):
        old, new = (count_instructions(job, build) for build in (arguments.old, arguments.new))
        if old is not None and new is not None:
            print(f"| {job.workload}/{job.size} | instructions/op | {shown(old, new)} |")


if __name__ == "__main__":
    main()
