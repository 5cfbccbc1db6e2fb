"""Plots of the results as SVG, with nothing but this file."""
import html
import math
import os

import matrix
import report

FONT = 'font-family="sans-serif" font-size="12"'
COLOURS = ("#c0392b", "#2471a3", "#1e8449", "#b7950b", "#6c3483", "#a04000", "#117864", "#566573")


def write_all(results, folder):
    """ratios.svg, and cost-WORKLOAD.svg for each workload that was measured at more than one size."""
    os.makedirs(folder, exist_ok=True)
    rows = report.by_row(results)
    write(folder, "ratios.svg", ratios(rows))
    workloads = {}
    for (workload, payload, size), row in rows.items():
        workloads.setdefault((workload, payload), {})[size] = row
    for (workload, payload), sizes in workloads.items():
        if len(sizes) > 1:
            name = f"{workload}.{payload}" if payload else workload
            write(folder, f"cost-{name}.svg", cost(name, sizes))


def write(folder, name, svg):
    with open(os.path.join(folder, name), "w") as file:
        file.write(svg)


def document(width, height, parts):
    return (f'<svg xmlns="http://www.w3.org/2000/svg" width="{width}" height="{height}" '
            f'viewBox="0 0 {width} {height}">\n<rect width="{width}" height="{height}" fill="white"/>\n'
            + "\n".join(parts) + "\n</svg>\n")


def text(x, y, content, anchor="start", colour="black"):
    return f'<text x="{x:.1f}" y="{y:.1f}" {FONT} text-anchor="{anchor}" fill="{colour}">{html.escape(content)}</text>'


def line(x1, y1, x2, y2, colour="#bbbbbb", width=1):
    return (f'<line x1="{x1:.1f}" y1="{y1:.1f}" x2="{x2:.1f}" y2="{y2:.1f}" stroke="{colour}" '
            f'stroke-width="{width}"/>')


def ratios(rows):
    """A bar a row, on a logarithmic scale: to the left of 1 vemo is better than its best peer."""
    found = [(report.shown_name(key), report.ratio(row)) for key, row in rows.items()]
    found = [(name, value) for name, value in found if value]
    left, bar, width = 330, 18, 900
    height = 50 + bar * len(found)
    furthest = max([abs(math.log2(value)) for _, value in found] + [1])
    middle = (left + width - 60) / 2
    scale = (width - 60 - left) / 2 / furthest
    parts = [text(left, 20, "vemo / best peer, medians; shorter than 1 (left) is better")]
    for power in range(-math.floor(furthest), math.floor(furthest) + 1):
        x = middle + power * scale
        parts += [line(x, 30, x, height - 15, "#bbbbbb" if power else "black"),
                  text(x, height - 3, f"{2.0 ** power:g}", "middle")]
    for number, (name, value) in enumerate(found):
        y = 34 + number * bar
        end = middle + math.log2(value) * scale
        parts += [text(left - 10, y + 12, name, "end"),
                  f'<rect x="{min(middle, end):.1f}" y="{y}" width="{abs(end - middle):.1f}" height="{bar - 4}" '
                  f'fill="{COLOURS[2] if value <= 1 else COLOURS[0]}"/>',
                  text(width - 5, y + 12, f"{value:.2f}", "end")]
    return document(width, height, parts)


def cost(name, sizes):
    """Cost against size, a line a peer, both scales logarithmic."""
    left, top, right, bottom, width, height = 80, 40, 180, 40, 720, 400
    peers = []
    for row in sizes.values():
        peers += [peer for peer in row if peer not in peers]
    values = [result["median"] for row in sizes.values() for result in row.values() if result["median"] > 0]
    unit = next(result["unit"] for row in sizes.values() for result in row.values())
    low, high = math.log10(min(values)), math.log10(max(values))
    high = max(high, low + 0.1)
    smallest, largest = math.log10(min(sizes)), math.log10(max(sizes))

    def x_of(size):
        return left + (math.log10(size) - smallest) / (largest - smallest) * (width - left - right)

    def y_of(value):
        return height - bottom - (math.log10(value) - low) / (high - low) * (height - top - bottom)

    parts = [text(left, 20, f"{name}, {unit}")]
    for size in sorted(sizes):
        parts += [line(x_of(size), top, x_of(size), height - bottom), text(x_of(size), height - 20, f"{size:,}", "middle")]
    for value in (10 ** low, 10 ** ((low + high) / 2), 10 ** high):
        parts += [line(left, y_of(value), width - right, y_of(value)),
                  text(left - 8, y_of(value) + 4, report.number(value), "end")]
    for number, peer in enumerate(peers):
        colour = COLOURS[number % len(COLOURS)]
        points = [(x_of(size), y_of(sizes[size][peer]["median"])) for size in sorted(sizes)
                  if peer in sizes[size] and sizes[size][peer]["median"] > 0]
        path = " ".join(f"{x:.1f},{y:.1f}" for x, y in points)
        weight = 3 if peer == matrix.OURS else 1.5
        parts += [f'<polyline points="{path}" fill="none" stroke="{colour}" stroke-width="{weight}"/>',
                  text(width - right + 10, top + 18 * number + 12, peer, colour=colour)]
        parts += [f'<circle cx="{x:.1f}" cy="{y:.1f}" r="{weight}" fill="{colour}"/>' for x, y in points]
    return document(width, height, parts)
