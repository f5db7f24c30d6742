#!/usr/bin/python3
"""Makes the page that tells how this library does beside others from the figures of a run.

    report.py FIGURES.json PAGE.md [DIRECTORY]

With a directory, pictures are drawn into it, too, and shown by the page.
"""
import json
import os
import sys

import texts

# A peer is ahead where its operation takes less than this part of the library's time, and where it was faster in more than this
# part of the rounds: of a hundred rounds, chance gives that to one peer in forty. The rest counts as equal.
AHEAD = 0.95
ROUNDS_AHEAD = 0.6

SIZES = {0: "0 B", 64: "64 B", 4096: "4 KiB", 65536: "64 KiB"}
CPUS = {1: "one CPU", 2: "two CPUs"}


def time_text(nanoseconds):
    for unit, size in (("ns", 1), ("µs", 1e3), ("ms", 1e6)):
        value = nanoseconds / size
        if value < 999.5 or unit == "ms":
            return "{:.{}f} {}".format(value, 0 if value >= 99.5 else 1 if value >= 9.95 else 2, unit)


def size_text(contest):
    return SIZES.get(contest.get("size"), "{} B".format(contest.get("size")))


def range_text(values):
    low, high = min(values), max(values)
    return "{:.2f}".format(low) if round(low, 2) == round(high, 2) else "{:.2f} to {:.2f}".format(low, high)


def name_in(contest):
    """How a contest is called among those of its family and operation."""
    return (size_text(contest) + ", " if "size" in contest else "") + CPUS[contest["cpus"]]


def groups(items, key):
    """Items by key, in the order in which the keys first come."""
    result = {}
    for item in items:
        result.setdefault(key(item), []).append(item)
    return result


def peers_in_order(contests):
    """The names of all peers: the limit, this library, then the others as they were listed."""
    order = {"limit": 0, "ours": 1, "peer": 2}
    rank = {}
    for contest in contests:
        for place, peer in enumerate(contest["peers"]):
            key = (order[peer["role"]], "impossible" in peer, place)
            rank[peer["name"]] = min(rank.get(peer["name"], key), key)
    return sorted(rank, key=rank.get)


def find(contest, name):
    return next((peer for peer in contest["peers"] if peer["name"] == name), None)


# --- the tables

def cell(peer):
    if peer is None:
        return ""
    if "impossible" in peer:
        return "not possible: " + peer["impossible"]
    ratio = peer["to_limit"]
    text = "**{:.2f}** ({:.2f} to {:.2f}), {}".format(ratio["median"], ratio["low"], ratio["high"],
                                                      time_text(peer["nanoseconds"]["median"]))
    return time_text(peer["nanoseconds"]["median"]) if peer["role"] == "limit" else text


def row(cells):
    return "| " + " | ".join(cells) + " |"


def table(contests, column):
    yield row([""] + [column(contest) for contest in contests])
    yield row(["---"] * (len(contests) + 1))
    for name in peers_in_order(contests):
        yield row([name] + [cell(find(contest, name)) for contest in contests])
    yield ""


def tables_of_family(contests):
    for operation, of_operation in groups(contests, lambda contest: contest["operation"]).items():
        if "size" not in of_operation[0]:
            yield from ["### {}".format(operation.capitalize()), ""]
            yield from table(of_operation, lambda contest: CPUS[contest["cpus"]])
            continue
        for cpus, of_cpus in groups(of_operation, lambda contest: contest["cpus"]).items():
            yield from ["### {}, {}".format(operation.capitalize(), CPUS[cpus]), ""]
            yield from table(of_cpus, size_text)


# --- who is ahead

def leads(contests):
    """For each peer that is ahead somewhere in these: its name, and the contests with the part of our time it takes."""
    result = {}
    for contest in contests:
        for peer in contest["peers"]:
            ratio = peer.get("to_ours") if peer["role"] == "peer" else None
            if ratio and ratio["median"] < AHEAD and peer["ahead_of_ours"] > ROUNDS_AHEAD:
                result.setdefault(peer["name"], []).append((contest, ratio["median"]))
    return result


def where_text(of_peer):
    """Contests of one operation, told briefly: what holds on one CPU and on two is said once for each."""
    parts = []
    for cpus, of_cpus in groups(of_peer, lambda pair: pair[0]["cpus"]).items():
        sizes = [size_text(contest) for contest, _ in of_cpus if "size" in contest]
        parts.append((", ".join(sizes) + " on " if sizes else "") + CPUS[cpus])
    return "; ".join(parts)


def ahead_of_us(contests):
    yield from ["## Where a peer is ahead", ""]
    rows = []
    for operation, of_operation in groups(contests, lambda contest: (contest["family"], contest["operation"])).items():
        for name, of_peer in leads(of_operation).items():
            rows.append(row(["{}: {}".format(*operation), name, where_text(of_peer),
                             range_text([ratio for _, ratio in of_peer]), texts.why(*operation, name)]))
    if not rows:
        yield from ["Nowhere in this run.", ""]
        return
    yield from ["Every place where another library, or another of the kernel's own means, took less than {:.0%} of this library's "
                "time and was faster in more than {:.0%} of the rounds; and why. The bare limits are left out.".format(
                    AHEAD, ROUNDS_AHEAD), "",
                row(["operation", "who", "where", "of our time", "why"]), row(["---"] * 5)]
    yield from rows
    yield ""


# --- the pictures

def picture_name(family, operation):
    return "bench-" + "-".join([family] + ([operation.replace(" ", "-")] if operation else [])) + ".svg"


def pictures_of(contests):
    """What is shown together: a family with sizes has a picture for each operation, others have one for all."""
    key = lambda contest: (contest["family"], contest["operation"] if "size" in contest else None)
    return groups(contests, key).items()


def bars_of(contests):
    """The rows of one panel, from above: a title for each contest, then its peers."""
    for contest in contests:
        title = size_text(contest) if "size" in contest else contest["operation"]
        yield title, None
        for name in peers_in_order([contest]):
            peer = find(contest, name)
            if "impossible" not in peer:
                yield name, peer
        yield "", None


COLOURS = {"limit": "#8c8c8c", "ours": "#c8452d", "peer": "#4a7ab5"}
TICKS = [0.01, 0.02, 0.05, 0.1, 0.2, 0.5, 1, 2, 5, 10, 20, 50, 100]


def draw_panel(axes, contests):
    rows = list(bars_of(contests))[:-1]
    for place, (_, peer) in enumerate(rows):
        if peer is None:
            continue
        ratio = peer["to_limit"]
        # From the bare limit on, to the left where it is faster: there is no nought to begin at.
        axes.barh(place, ratio["median"] - 1, left=1, color=COLOURS[peer["role"]], height=0.8)
        axes.plot([ratio["low"], ratio["high"]], [place, place], color="#333333", lw=0.8)
    axes.set_yticks(range(len(rows)), [label for label, _ in rows], fontsize=8)
    for (_, peer), tick in zip(rows, axes.get_yticklabels()):
        tick.set_fontweight("bold" if peer is None else "normal")
    axes.tick_params(axis="y", length=0)
    axes.axvline(1, color="#333333", lw=0.8)
    axes.grid(axis="x", color="#dddddd", lw=0.6)
    axes.set_axisbelow(True)
    axes.set_title(CPUS[contests[0]["cpus"]], fontsize=10)
    axes.set_xlabel("faster  \N{LEFTWARDS ARROW}  the bare limit is 1  \N{RIGHTWARDS ARROW}  slower", fontsize=8)
    return len(rows)


def draw(contests, path):
    import matplotlib
    matplotlib.use("svg")
    from matplotlib import pyplot, ticker
    # Text stays text, and the same figures make the same file.
    matplotlib.rcParams.update({"svg.fonttype": "none", "svg.hashsalt": "peers", "font.family": "sans-serif"})
    panels = list(groups(contests, lambda contest: contest["cpus"]).values())
    figure, all_axes = pyplot.subplots(1, len(panels), squeeze=False, sharex=True, layout="constrained")
    longest = max(draw_panel(axes, of_cpus) for axes, of_cpus in zip(all_axes[0], panels))
    ends = [peer["to_limit"][end] for contest in contests for peer in contest["peers"] if "to_limit" in peer
            for end in ("low", "high")]
    for axes in all_axes[0]:
        axes.set_ylim(longest - 0.4, -0.6)
        axes.set_xscale("log")
        axes.set_xlim(min(0.8, *ends) * 0.9, max(1.25, *ends) * 1.1)
        axes.xaxis.set_major_locator(ticker.FixedLocator(TICKS))
        axes.xaxis.set_major_formatter("{x:g}")
        axes.xaxis.set_minor_locator(ticker.NullLocator())
    figure.set_size_inches(5 * len(panels), 0.8 + 0.2 * longest)
    figure.savefig(path, metadata={"Date": None})
    pyplot.close(figure)


def alternative_text(family, operation):
    return "{}{}: for each peer a bar from the bare limit's time to its own; the figures are in the tables below.".format(
        family.capitalize(), ", " + operation if operation else "")


# --- the page

def machine_lines(figures):
    machine = figures["machine"]
    yield "- Machine: {}, {} CPU{}, {}{}, {}.".format(
        machine["cpu"], machine["cpus"], "" if machine["cpus"] == 1 else "s", machine["architecture"],
        ", a virtual machine" if machine["virtual"] else "", machine["kernel"])
    yield "- Other programs were running: the load average was {:.1f} at the beginning.".format(machine["load"])
    yield "- Date: {}. {} rounds of {:g} ms for each peer{}.".format(
        figures["date"], figures["rounds"], figures["round_milliseconds"],
        ", **a quick run, whose figures are rough**" if figures["quick"] else "")
    yield "- Versions: " + ", ".join("{} {}".format(*item) for item in figures["versions"].items()) + "."


def page(figures, pictures=None):
    contests = figures["contests"]
    yield from ["# Beside others", "", texts.INTRODUCTION, ""]
    yield from machine_lines(figures)
    yield ""
    yield from texts.HOW_TO_READ
    yield ""
    yield from ahead_of_us(contests)
    for family, of_family in groups(contests, lambda contest: contest["family"]).items():
        yield from ["## {}".format(family.capitalize()), ""]
        yield from texts.FAMILIES[family]
        yield ""
        if pictures:
            for key, _ in pictures_of(of_family):
                yield from ["![{}]({}/{})".format(alternative_text(*key), pictures, picture_name(*key)), ""]
        yield from tables_of_family(of_family)


def main():
    with open(sys.argv[1], encoding="utf-8") as file:
        figures = json.load(file)
    directory = sys.argv[3] if len(sys.argv) > 3 else None
    shown = None
    if directory:
        os.makedirs(directory, exist_ok=True)
        shown = os.path.relpath(directory, os.path.dirname(sys.argv[2]) or ".")
        for key, contests in pictures_of(figures["contests"]):
            draw(contests, os.path.join(directory, picture_name(*key)))
    with open(sys.argv[2], "w", encoding="utf-8") as file:
        file.write("\n".join(page(figures, shown)).rstrip("\n") + "\n")


if __name__ == "__main__":
    main()
