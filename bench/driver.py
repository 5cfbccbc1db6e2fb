"""Runs the benchmark: every job in a process of its own, peers interleaved with ours within each round."""
import argparse
import json
import os
import re
import shlex
import shutil
import subprocess
import sys
import tempfile
import time

import matrix
import report


# What --quick promises.
QUICK_SECONDS = 300


def parse_arguments():
    parser = argparse.ArgumentParser(prog="bench/run", description="Measures vemo beside its peers.")
    parser.add_argument("--build", default="build", help=argparse.SUPPRESS)
    size = parser.add_mutually_exclusive_group()
    size.add_argument("--quick", action="store_true", help="a slice of five minutes at most")
    size.add_argument("--smoke", action="store_true", help="each row once and tiny: whether it works, not how fast")
    parser.add_argument("--filter", default="", metavar="REGEX",
                        help="only rows WORKLOAD/SIZE/PEER in which this is found")
    parser.add_argument("--rounds", type=int, metavar="N", help="runs of each row (default 5; 3 with --quick)")
    parser.add_argument("--json", metavar="FILE", help="write the results there as JSON")
    parser.add_argument("--markdown", metavar="FILE",
                        help="write the table there as well as to the terminal; in a file that has the two marks of "
                             "docs/benchmarks.md, between these")
    parser.add_argument("--plots", metavar="FOLDER", help="write SVG plots there")
    parser.add_argument("--scratch", metavar="FOLDER", help="where stores are made (default: the build folder)")
    arguments = parser.parse_args()
    try:
        arguments.filter = re.compile(arguments.filter)
    except re.error as error:
        parser.error(f"--filter is no regular expression: {error}")
    if arguments.rounds is not None and arguments.rounds < 1:
        parser.error("--rounds: at least 1")
    arguments.mode = "smoke" if arguments.smoke else "quick" if arguments.quick else "full"
    return arguments


def run_job(job, build, scratch):
    """The rows that the job's process printed. A process that fails takes its rows along, and says so."""
    command = [f"{build}/bench/{job.program}", "--row", job.name]
    folder = None
    if job.program != "map_bench":
        folder = tempfile.mkdtemp(prefix="bench-", dir=scratch)
        command += ["--folder", folder]
    try:
        done = subprocess.run(command, capture_output=True, text=True)
    finally:
        if folder:
            shutil.rmtree(folder, ignore_errors=True)
    if done.returncode != 0:
        print(f"{job.name} failed ({done.returncode}): {done.stderr.strip()[-500:]}", file=sys.stderr)
        return None
    if done.stderr.strip():
        print(done.stderr.strip(), file=sys.stderr)
    return [json.loads(line) for line in done.stdout.splitlines()]


def check_answers(samples):
    """Peers that answered differently did not do the same work."""
    good = True
    answers = {}
    for (row, size, peer), found in samples.items():
        for answer in {sample["answers"] for sample in found}:
            first = answers.setdefault((row, size), (answer, peer))
            if first[0] != answer:
                print(f"{row}/{size}: {peer} answered {answer}, {first[1]} {first[0]}", file=sys.stderr)
                good = False
    return good


def main():
    arguments = parse_arguments()
    scratch = arguments.scratch or os.path.join(arguments.build, "bench")
    os.makedirs(scratch, exist_ok=True)
    jobs = matrix.list_jobs(arguments.build, arguments.mode, arguments.filter)
    if not jobs:
        sys.exit("No row fits; the programs in build/bench list theirs with --list.")
    rounds = arguments.rounds or matrix.ROUNDS[arguments.mode]

    revision = report.current_revision()  # of what was built, whatever is checked out meanwhile
    start = time.monotonic()
    samples = {}
    failed = set()
    done = 0
    for turn in range(rounds):
        elapsed = time.monotonic() - start
        if arguments.quick and turn > 0 and elapsed * (turn + 1) / turn > QUICK_SECONDS:
            print(f"Only {turn} rounds: another would take longer than {QUICK_SECONDS} s in all.", file=sys.stderr)
            break
        done = turn + 1
        for number, job in enumerate(jobs):
            if job in failed:
                continue
            if sys.stderr.isatty():
                print(f"\r\x1b[Kround {turn + 1} of {rounds}, {number + 1} of {len(jobs)}: {job.name}", end="",
                      file=sys.stderr, flush=True)
            found = run_job(job, arguments.build, scratch)
            if found is None:
                failed.add(job)
                continue
            for sample in found:
                if arguments.filter.search(f"{sample['row']}/{sample['size']}/{sample['peer']}"):
                    samples.setdefault((sample["row"], sample["size"], sample["peer"]), []).append(sample)
    if sys.stderr.isatty():
        print("\r\x1b[K", end="", file=sys.stderr)

    results = report.summarise(samples)
    command = shlex.join(["bench/run", *sys.argv[1:]]).replace(f" --build {shlex.quote(arguments.build)}", "")
    text = report.markdown(results, command, revision, done, time.monotonic() - start)
    print(text)
    if arguments.markdown:
        report.write_markdown(arguments.markdown, text)
    if arguments.json:
        with open(arguments.json, "w") as file:
            json.dump(results, file, indent=1)
            file.write("\n")
    if arguments.plots:
        import plots
        plots.write_all(results, arguments.plots)
    if not check_answers(samples) or failed:
        sys.exit(1)


if __name__ == "__main__":
    main()
