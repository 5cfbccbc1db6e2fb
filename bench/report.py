"""From samples to medians, a table and a list of results. Lower is better in every row."""
import datetime
import os
import statistics
import subprocess

import matrix

FLOOR = "append+fdatasync"
BEGIN = "<!-- results -->"
END = "<!-- end of results -->"


def summarise(samples):
    """One result for each row, size and peer, in the order in which they were first measured."""
    results = []
    for (row, size, peer), found in samples.items():
        workload, payload = matrix.split_payload(row)
        values = [sample["value"] for sample in found]
        results.append({
            "workload": workload, "size": size, "payload": payload, "peer": peer, "unit": found[0]["unit"],
            "median": statistics.median(values), "min": min(values), "max": max(values), "runs": len(values),
        })
    return results


def by_row(results):
    """{(workload, payload, size): {peer: result}}, in order."""
    rows = {}
    for result in results:
        key = (result["workload"], result["payload"], result["size"])
        rows.setdefault(key, {})[result["peer"]] = result
    return rows


def best_peer(row):
    """The peer to beat: neither ourselves nor the floor. None where we are alone."""
    peers = [result for peer, result in row.items() if peer not in (matrix.OURS, FLOOR)]
    return min(peers, key=lambda result: result["median"], default=None)


def ratio(row):
    """Ours to the best peer's, by medians; None where one of the two is missing."""
    best = best_peer(row)
    if best is None or matrix.OURS not in row or best["median"] == 0:
        return None
    return row[matrix.OURS]["median"] / best["median"]


def number(value):
    return f"{value:,.0f}" if value >= 100 else f"{value:,.1f}" if value >= 10 else f"{value:,.2f}"


def cell(result):
    if result is None:
        return "-"
    if result["runs"] == 1:
        return number(result["median"])
    return f"{number(result['median'])} ({number(result['min'])} to {number(result['max'])})"


def shown_name(key):
    workload, payload, size = key
    return f"{workload}{'.' + payload if payload else ''}/{size}"


def processor():
    try:
        with open("/proc/cpuinfo") as file:
            names = [line.split(":", 1)[1].strip() for line in file if line.startswith("model name")]
        return f"{len(names)} x {names[0]}"
    except (OSError, IndexError):
        return "unknown processor"


def current_revision():
    found = subprocess.run(["git", "describe", "--always", "--dirty"], capture_output=True, text=True)
    return found.stdout.strip() or "unknown"


def write_markdown(path, text):
    """Between the marks of a file that has them, else as the whole file."""
    old = ""
    if os.path.exists(path):
        with open(path) as file:
            old = file.read()
    before, begin, rest = old.partition(BEGIN)
    _, end, after = rest.partition(END)
    with open(path, "w") as file:
        file.write(f"{before}{begin}\n\n{text}\n\n{end}{after}" if begin and end else text + "\n")


def markdown(results, command, revision, rounds, seconds):
    """A table for each group of rows that the same peers took part in."""
    runs = "1 round" if rounds == 1 else f"{rounds} rounds"
    lines = [f"`{command}`, {datetime.date.today()}, {processor()}, revision {revision}; {runs} in {seconds:,.0f} s. "
             "Median (least to most); the ratio is ours to the best peer, below 1 where vemo is better."]
    header = None
    for key, row in by_row(results).items():
        group = key[0].split(".")[0]
        if group != header:
            header = group
            peers = [matrix.OURS]
            for other, found in by_row(results).items():
                if other[0].split(".")[0] == group:
                    peers += [peer for peer in found if peer not in peers]
            lines += ["", "| row | unit | " + " | ".join(peers) + " | best peer | ratio |",
                      "|---|---|" + "---|" * (len(peers) + 2)]
        best = best_peer(row)
        relation = ratio(row)
        lines.append(f"| {shown_name(key)} | {next(iter(row.values()))['unit']} | "
                     + " | ".join(cell(row.get(peer)) for peer in peers)
                     + f" | {best['peer'] if best else '-'} | {'-' if relation is None else f'{relation:.2f}'} |")
    return "\n".join(lines)
