"""What is to be said of the recording of an hour, from what hour_record left in a folder."""

import csv
import json
import statistics
import subprocess

WARM_UP = 300               # seconds before memory is judged; a shorter run: half of it
MOST_SYNC = 40.0            # ms from a marked frame to its beep
SAMPLE_BYTES, CHUNK_BYTES = 8, 12   # of the index in memory, linux/media/mp4/SampleIndex.h
MORE_PER_HOUR = 1 << 20     # bytes that the daemon may grow by in an hour beside its index
BEEP_FREQUENCY = "1000"


def judge(binaries, folder):
    """Prints and stores (`hour.json`) the figures; answers the verdicts."""
    recorded = json.loads((folder / "recorded.json").read_text())
    samples = read_samples(folder / "samples.csv")
    stretches = stretches_of(recorded["events"])
    report = checked(binaries, folder, stretches)
    figures = {"machine": recorded["machine"], "load": recorded["load"], "size": recorded["size"],
               "fps": recorded["fps"], "minutes": recorded["minutes"], "beeps": recorded["beeps"],
               "findings": report["findings"][:50], "frames": dict(report["frames"]), "tracks": report["boxes"]["tracks"]}
    figures["frames"]["missing"] = len(report["frames"]["missing"])
    figures["length"] = length_of(report, stretches, 1 / recorded["fps"])
    figures["sync"] = sync_of(report, drawn_late(folder / "frames.txt", 1 / recorded["fps"]))
    figures["daemon"] = growth_of(samples, report["boxes"]["tracks"], report["duration_s"])
    figures["verdicts"] = verdicts_on(figures, len(stretches) - 1)
    (folder / "hour.json").write_text(json.dumps(figures, indent=1) + "\n")
    show(figures)
    return figures["verdicts"]


def read_samples(path):
    with open(path, newline="") as rows:
        return [{name: float(value) for name, value in row.items()} for row in csv.DictReader(rows)]


def stretches_of(events):
    """The recorded stretches: between which two moments each began and ended, and the numbers drawn in the pause after."""
    stretches, begun, shown = [], None, None
    for event in events:
        if event["command"] in ("start", "resume"):
            if stretches:
                stretches[-1]["paused"] = (stretches[-1]["last"] + 1, shown - 1)
            begun = event
        elif event["command"] == "frame":
            shown = event["frame"]
        else:
            stretches.append({"begin": (begun["asked"], begun["answered"]), "end": (event["asked"], event["answered"]),
                              "first": begun["frame"], "last": event["frame"]})
    return stretches


def checked(binaries, folder, stretches):
    command = [str(binaries / "check_movie"), str(folder / "movie.mp4"), "--frames-log", str(folder / "frames.txt"),
               "--expect-all", "--allow-repeats", "1000000", "--max-late-ms", "100", "--video-tracks", "1",
               "--audio-tracks", "1", "--beeps-at-marked-frames", BEEP_FREQUENCY, "--max-sync-ms", str(MOST_SYNC)]
    for stretch in stretches[:-1]:
        command += ["--forbid", f"{stretch['paused'][0]}-{stretch['paused'][1]}"]
    done = subprocess.run(command, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True)
    if done.returncode not in (0, 1):
        raise RuntimeError("check_movie could not judge the movie")
    return json.loads(done.stdout)


def length_of(report, stretches, frame):
    """The movie's length, and between what it must be: each stretch began and ended between the question and the answer,
    and a picture stands for one frame's time at most before and after."""
    least = sum(stretch["end"][0] - stretch["begin"][1] - frame for stretch in stretches)
    most = sum(stretch["end"][1] - stretch["begin"][0] + frame for stretch in stretches)
    return {"movie_s": report["duration_s"], "least_s": least, "most_s": most, "stretches": len(stretches)}


def drawn_late(path, frame):
    """The numbers of frames that the application, by its own log, drew more than half a frame's time too late."""
    numbers, last = set(), None
    for words in map(str.split, path.read_text().splitlines()):
        number, shown = int(words[0]), int(words[1]) / 1e9
        if last is not None and shown - last > 1.5 * frame:
            numbers.add(number)
        last = shown
    return numbers


def sync_of(report, held_up):
    marks, late = report["sync"]["mark_ms"], report["sync"]["late_ms"]
    far = [(number, offset) for number, offset in zip(report["sync"]["mark_number"], late) if abs(offset) > MOST_SYNC]
    sizes = sorted(abs(offset) for offset in late)
    in_time = [abs(offset) for number, offset in zip(report["sync"]["mark_number"], late) if number not in held_up]
    slope, _ = line(marks, late) if len(marks) > 1 else (0, 0)
    return {"pairs": len(late), "worst_ms": report["sync"]["worst_ms"], "drift_ms": report["sync"]["drift_ms"],
            "drift_by_line_ms_per_hour": slope * 3.6e6, "median_ms": statistics.median(late) if late else None,
            "p99_ms": sizes[len(sizes) * 99 // 100] if sizes else None, "far": len(far),
            "far_drawn_late": sum(number in held_up for number, _ in far),
            "worst_drawn_in_time_ms": max(in_time, default=None), "unmatched": [text for text in report["findings"] if text.startswith("sync: no ")],
            "marks_s": [mark / 1000 for mark in marks], "late_ms": late}


def line(xs, ys):
    """Slope and offset of the line of least squares."""
    middle_x, middle_y = statistics.fmean(xs), statistics.fmean(ys)
    slope = (sum((x - middle_x) * (y - middle_y) for x, y in zip(xs, ys)) / sum((x - middle_x) ** 2 for x in xs))
    return slope, middle_y - slope * middle_x


def growth_of(samples, tracks, seconds):
    warm_up = min(WARM_UP, samples[-1]["seconds"] / 2)
    early = [sample for sample in samples if sample["seconds"] < warm_up]
    later = [sample for sample in samples if sample["seconds"] >= warm_up]
    last = [sample for sample in samples if sample["seconds"] > samples[-1]["seconds"] - warm_up]
    slope, offset = line([sample["seconds"] for sample in later], [sample["own"] for sample in later])
    whole, _ = line([sample["seconds"] for sample in later], [sample["pss"] for sample in later])
    index = sum(SAMPLE_BYTES * track["samples"] + CHUNK_BYTES * track["chunks"] for track in tracks) / seconds
    column = {name: [sample[name] for sample in later] for name in ("pss", "own", "descriptors", "threads", "load")}
    return {"from_s": warm_up, "own_per_hour": slope * 3600, "index_per_hour": index * 3600,
            "own_at_first": offset + slope * warm_up, "own_least": min(column["own"]), "own_most": max(column["own"]),
            "pss_per_hour": whole * 3600, "pss_least": min(column["pss"]), "pss_most": max(column["pss"]),
            **{name: [statistics.median(sample[name] for sample in stretch) for stretch in (early, last)] + [max(column[name])]
               for name in ("descriptors", "threads")},
            "load": [min(column["load"]), statistics.median(column["load"]), max(column["load"])]}


def verdicts_on(figures, pauses):
    frames, length, sync, daemon = (figures[name] for name in ("frames", "length", "sync", "daemon"))
    beeps_missed = figures["beeps"]["left out"]

    def verdict(what, met):
        return {"what": what, "met": bool(met)}

    return [
        verdict(f"no frame of the {pauses} paused stretches is in the movie", not frames["forbidden"]),
        verdict("the frames are in order", frames["order_ok"] and frames["unreadable"] == 0),
        verdict(f"each of {sync['pairs']} beeps is within {MOST_SYNC:.0f} ms of its marked frame",
                sync["pairs"] > 0 and abs(sync["worst_ms"]) <= MOST_SYNC),
        verdict(f"no beep and no mark is without the other ({len(sync['unmatched'])} are, "
                f"{beeps_missed} were not played)", len(sync["unmatched"]) <= beeps_missed),
        verdict(f"the movie lasts {length['movie_s']:.3f} s; recorded were {length['least_s']:.3f} to "
                f"{length['most_s']:.3f} s", length["least_s"] <= length["movie_s"] <= length["most_s"]),
        verdict(f"memory of its own grows by {daemon['own_per_hour'] / 1e6:.2f} MB an hour, the movie's index in it by "
                f"{daemon['index_per_hour'] / 1e6:.2f}; the rest may be {MORE_PER_HOUR / 1e6:.2f}",
                daemon["own_per_hour"] <= daemon["index_per_hour"] + MORE_PER_HOUR),
        # A pause lets some of them go, so the most at any look counts.
        verdict("no more descriptors or threads at the end than in the beginning ({:.0f}, then {:.0f}, at most {:.0f}; {:.0f}, "
                "then {:.0f}, at most {:.0f})".format(*daemon["descriptors"], *daemon["threads"]),
                daemon["descriptors"][1] <= daemon["descriptors"][0] and daemon["threads"][1] <= daemon["threads"][0]),
    ]


def show(figures):
    frames, sync, daemon = (figures[name] for name in ("frames", "sync", "daemon"))
    print(f"{figures['machine']}; load {daemon['load'][0]:.1f} to {daemon['load'][2]:.1f}, median {daemon['load'][1]:.1f}")
    print(f"{figures['minutes']} minutes of {figures['size']} at {figures['fps']} frames a second: {frames['count']} "
          f"pictures, {frames['repeats']} repeated, {frames['missing']} frames missing, the largest step "
          f"{frames['largest_hole_ms']:.0f} ms, the farthest from its time {frames['largest_lateness_ms']:.0f} ms")
    print(f"beeps: median {sync['median_ms']:.1f} ms late, 99 in 100 within {sync['p99_ms']:.1f} ms, worst "
          f"{sync['worst_ms']:.1f} ms; {sync['far']} further than {MOST_SYNC:.0f} ms, of which the application itself drew the "
          f"marked frame late {sync['far_drawn_late']} times; the worst of the others {sync['worst_drawn_in_time_ms']:.1f} ms")
    print(f"drift {sync['drift_ms'] or 0:.1f} ms from the first fifth to the last "
          f"({sync['drift_by_line_ms_per_hour']:.1f} ms an hour by the line); the application ran out of sound "
          f"{figures['beeps']['underflows']} times, played {figures['beeps']['late']} tones late and left out "
          f"{figures['beeps']['left out']}")
    print(f"daemon: {daemon['pss_least'] / 1e6:.1f} to {daemon['pss_most'] / 1e6:.1f} MB of memory (PSS), of which "
          f"{daemon['own_least'] / 1e6:.1f} to {daemon['own_most'] / 1e6:.1f} are no file's, from second "
          f"{daemon['from_s']:.0f} on")
    for verdict in figures["verdicts"]:
        print(("met:    " if verdict["met"] else "MISSED: ") + verdict["what"])
