"""What comparisons print: medians, what each round gave, and whether a target was met."""

import statistics


def medians(pairs, read):
    return [statistics.median(read(figures) for figures in side) for side in zip(*pairs)]


def show(caption, lines, pairs, others="ffmpeg"):
    """`pairs` are rounds, figures of ours and of the other; `lines` are (what, how to read it from figures, format)."""
    print(f"\n| {caption}, medians | ours | {others} | ratio | rounds, ours/{others} |")
    print("|---|---|---|---|---|")
    for what, read, form in lines:
        ours, theirs = medians(pairs, read)
        ratio = f"{ours / theirs:.3f}" if theirs else "-"
        each = ", ".join(f"{form.format(read(one))}/{form.format(read(other))}" for one, other in pairs)
        print(f"| {what} | {form.format(ours)} | {form.format(theirs)} | {ratio} | {each} |")
    print()


def judge(what, value, most):
    """Prints whether a value is what it may be at most; answers it for the file of figures."""
    print(f"{'met   ' if value <= most else 'MISSED'}  {what}: {value:.3f}, target <= {most}")
    return {"what": what, "value": value, "target": most, "met": value <= most}


def ratio(pairs, read):
    ours, theirs = medians(pairs, read)
    return ours / theirs
