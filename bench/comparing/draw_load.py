"""Draws load.png from load.json of a folder: draw_load.py FOLDER. Needs Debian's python3-matplotlib."""

import json
import pathlib
import sys

import matplotlib

matplotlib.use("Agg")
import matplotlib.pyplot as plt  # noqa: E402


def main(folder):
    figures = json.loads((folder / "load.json").read_text())
    steps = [step for step in figures["steps"] if step["rate"]]
    rates = [step["offered_per_s"] for step in steps]
    figure, (times, frames, cores) = plt.subplots(3, 1, figsize=(9, 8), sharex=True)
    for name, label in (("p50_us", "half within"), ("p99_us", "99 in 100 within"), ("max_us", "the longest")):
        times.plot(rates, [step[name] / 1000 for step in steps], "o-", lw=1, ms=4, label=label)
    times.set_yscale("log")
    times.set_ylabel("round trip, ms")
    times.legend(loc="upper left", fontsize=8)
    times.set_title(f"State requests beside a recording of {figures['size']} at {figures['fps']} frames a second\n"
                    f"({figures['clients']} clients, {figures['seconds']:g} s a step; {figures['machine']})", fontsize=10)
    frames.plot(rates, [100 * step["lost"] / max(step["drawn"], 1) for step in steps], "o-", lw=1, ms=4, color="tab:red")
    frames.set_ylim(bottom=0)
    frames.set_ylabel("frames lost, %")
    cores.plot(rates, [step["cpu"] for step in steps], "o-", lw=1, ms=4, color="tab:green")
    cores.set_ylim(bottom=0)
    cores.set_ylabel("daemon, cores")
    cores.set_xlabel("requests a second, due at fixed times")
    cores.set_xscale("log")
    cores.set_xticks(rates, [f"{rate:,.0f}" for rate in rates], fontsize=8)
    cores.minorticks_off()
    figure.tight_layout()
    figure.savefig(folder / "load.png", dpi=90)


if __name__ == "__main__":
    main(pathlib.Path(sys.argv[1]))
