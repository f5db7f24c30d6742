#!/usr/bin/env python3
# Draws what a soak recorded: messages per second, and what each process held.
#
#   plot.py DIRECTORY
import csv
import os
import sys
from collections import defaultdict

import matplotlib

matplotlib.use("Agg")
import matplotlib.pyplot as plt  # noqa: E402

directory = sys.argv[1]


def rows(name):
    with open(os.path.join(directory, name), newline="") as file:
        return list(csv.DictReader(file))


rates = rows("rates.csv")
if not rates:
    sys.exit("plot.py: the soak ended before its first sample")
# An incarnation is a line of its own, so that a restart shows as a gap.
held = defaultdict(lambda: defaultdict(list))
for row in rows("samples.csv"):
    held[row["process"]][row["incarnation"]].append(row)

figure, (speed, descriptors, memory) = plt.subplots(3, 1, sharex=True, figsize=(11, 10))
seconds = [float(row["seconds"]) for row in rates]
speed.plot(seconds, [float(row["messages_per_second"]) for row in rates], color="black", linewidth=1)
speed.set_ylabel("messages per second")
speed.set_ylim(bottom=0)
kills = speed.twinx()
kills.plot(seconds, [int(row["kills"]) for row in rates], color="tab:red", linewidth=1)
kills.set_ylabel("kills so far", color="tab:red")
kills.set_ylim(bottom=0)

colours = plt.get_cmap("tab10")
for place, process in enumerate(sorted(held, key=lambda name: (name != "server", name))):
    stays = len(held[process]) == 1
    for number, samples in enumerate(held[process].values()):
        times = [float(row["seconds"]) for row in samples]
        style = {
            "color": "black" if process == "server" else colours(place),
            "linewidth": 1.6 if stays else 0.6,
            "label": process if number == 0 else None,
        }
        descriptors.plot(times, [int(row["descriptors"]) for row in samples], **style)
        memory.plot(times, [int(row["resident_kib"]) / 1024 for row in samples], **style)
descriptors.set_ylabel("descriptors")
memory.set_ylabel("resident memory, MiB")
memory.set_xlabel("seconds")
for axes in (descriptors, memory):
    axes.set_ylim(bottom=0)
descriptors.legend(loc="upper left", ncol=5, fontsize="small")
figure.tight_layout()
figure.savefig(os.path.join(directory, "report.svg"))
