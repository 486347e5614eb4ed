"""Draws hour.png from samples.csv and hour.json of a folder: draw_hour.py FOLDER. Needs Debian's python3-matplotlib."""

import csv
import json
import pathlib
import sys

import matplotlib

matplotlib.use("Agg")
import matplotlib.pyplot as plt  # noqa: E402


def main(folder):
    with open(folder / "samples.csv", newline="") as rows:
        samples = [{name: float(value) for name, value in row.items()} for row in csv.DictReader(rows)]
    figures = json.loads((folder / "hour.json").read_text())
    minutes = [sample["seconds"] / 60 for sample in samples]
    figure, (memory, counts, sync) = plt.subplots(3, 1, figsize=(9, 8), sharex=True)
    memory.plot(minutes, [sample["pss"] / 1e6 for sample in samples], lw=1, label="PSS")
    memory.plot(minutes, [sample["own"] / 1e6 for sample in samples], lw=1, label="of it no file's")
    memory.set_ylim(bottom=0)
    memory.set_ylabel("memory, MB")
    memory.legend(loc="lower right", fontsize=8)
    memory.set_title(f"The daemon over {figures['minutes']} minutes of recording, a pause each minute "
                     f"({figures['size']}, {figures['fps']} frames a second, picture and sound)", fontsize=10)
    counts.plot(minutes, [sample["descriptors"] for sample in samples], lw=1, label="descriptors")
    counts.plot(minutes, [sample["threads"] for sample in samples], lw=1, label="threads")
    counts.set_ylim(bottom=0)
    counts.set_ylabel("count")
    counts.legend(loc="lower right", fontsize=8)
    # By position in the movie, which has no pauses: its axis is a little shorter than the host's.
    sync.plot([mark / 60 for mark in figures["sync"]["marks_s"]], figures["sync"]["late_ms"], ".", ms=2)
    for limit in (-40, 40):
        sync.axhline(limit, lw=0.8, ls="--", color="grey")
    sync.set_ylabel("beep after its picture, ms")
    sync.set_xlabel("minutes (of the recording; below, in the movie)")
    figure.tight_layout()
    figure.savefig(folder / "hour.png", dpi=90)


if __name__ == "__main__":
    main(pathlib.Path(sys.argv[1]))
