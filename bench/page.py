"""docs/benchmarks.md and its pictures."""

import itertools
import os
import pathlib
import subprocess

TOP = pathlib.Path(__file__).resolve().parent.parent
PAGE = TOP / "docs/benchmarks.md"
PICTURES = TOP / "docs/benchmarks"

HEAD = """# Benchmarks

Written by `scripts/bench`, which measures each of ours and its peer in turn in the same run: a ratio is the median of the
ratios of the rounds, so that what else the machine does hits both alike. A limit is a goal: a figure that misses it says so, and fails the script.

Measured on {processors} processors ({model}), Linux {kernel}, with redis-server {redis}, at {date}.
"""


def machine(date):
    model = next((line.split(":")[1].strip() for line in pathlib.Path("/proc/cpuinfo").read_text().splitlines()
                  if line.startswith("model name")), "unknown")
    redis = subprocess.run(["redis-server", "--version"], check=True, stdout=subprocess.PIPE, text=True).stdout.split("v=")[1]
    return HEAD.format(processors=os.cpu_count(), model=model, kernel=os.uname().release, redis=redis.split()[0], date=date)


def figure_tables(figures):
    text = ""
    for group, lines in itertools.groupby(sorted(figures, key=lambda figure: figure.group), key=lambda figure: figure.group):
        text += f"\n## {group}\n\n| what | measured | limit | |\n|---|---|---|---|\n"
        for line in lines:
            text += f"| {line.what} | {line.measured} | {line.limit} | {line.detail} |\n"
    return text


def row(cells):
    return f"| {' | '.join(cells)} |\n"


def section(table):
    text = f"\n## {table.title}\n" + (f"\n{table.text}\n" if table.text else "")
    return text + (f"\n{row(table.head)}{'|---' * len(table.head)}|\n{''.join(map(row, table.rows))}" if table.rows else "")


def picture(growth):
    """Draws the growth with gnuplot."""
    data = "\n".join(" ".join(str(value) for value in point) for point in growth.points)
    curves = [f"$data using 1:{column} with linespoints pointtype 7 pointsize 0.5 title '{name}'"
              for column, name in ((2, "ours"), (3, growth.peer)) if name and len(growth.points[0]) >= column]
    wide = growth.points[-1][0] / growth.points[0][0] > 20
    script = f"""set terminal svg size 560,320 font 'sans,12'
set output '{PICTURES / growth.name}.svg'
set title "{growth.title}"
set xlabel "{growth.size}"
set ylabel "{growth.cost}"
set key left top
set yrange [0:]
{"set logscale x" if wide else ""}
$data << END
{data}
END
plot {", ".join(curves)}
"""
    subprocess.run(["gnuplot", "-"], input=script, text=True, check=True)


def write(figures, growths, tables, date):
    PICTURES.mkdir(exist_ok=True)
    text = machine(date) + figure_tables(figures) + "\n## How cost grows\n"
    for growth in growths:
        picture(growth)
        text += f"\n![{growth.title}](benchmarks/{growth.name}.svg)\n"
    PAGE.write_text(text + "".join(map(section, tables)))
