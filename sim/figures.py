#!/usr/bin/python3
"""Draws the figures of a verolux-sim run from the files in its output folder.

Usage: figures.py FOLDER

Reads run.json, [reference-]frames.csv, [reference-]refreshes.csv and [reference-]spacetime-rows.png,
and writes frame-times.png, animation-error.png, latency.png, delay.png and spacetime.png beside
them. The folder of a comparison (--compare) holds a run.json whose layers are the modes' runs in
subfolders; for it, one figure, comparison.png, sets their animation error and latency side by
side. The measures follow the README's definitions, as the simulator's summary does.
Exits with status 3, printing nothing, when matplotlib is missing.
"""

import json
import os
import sys

try:
    import matplotlib

    matplotlib.use("Agg")
    import matplotlib.pyplot as plt
    from matplotlib.patches import Patch
    import numpy as np
except ImportError:
    sys.exit(3)

NS_PER_MS = 1e6
NS_PER_S = 1e9
COLOURS = {"run": "#1f5fbf", "reference": "#e07b00"}
# The runs of a comparison, in order.
PALETTE = ["#1f5fbf", "#e07b00", "#2a9d3a", "#c0392b", "#7b4fbf", "#8c6d31"]
PICTURE_COLOURS = {"blend": "#2870ff", "new": "#28c846", "repeat": "#e62828", "held": "#000000"}
PICTURE_CODES = {name: code for code, name in enumerate(PICTURE_COLOURS)}
DPI = 100
# An hour of play is hundreds of thousands of rows: the figures draw at most this many points per
# series (each time bin's extremes and an even sample of the rest), and at most this many bars.
MAX_POINTS = 40000
MAX_BARS = 240
FEW_BARS = 60


def read_columns(path, names, optional=()):
    """The named columns of a CSV file as float arrays, read by numpy's parser: NaN for an empty
    cell of an optional column; a picture column becomes its code in PICTURE_CODES."""
    if not os.path.exists(path):
        return {name: np.zeros(0) for name in names}
    with open(path) as f:
        header = f.readline().strip().split(",")
    indices = [header.index(name) for name in names]
    nan = float("nan")
    converters = {}
    for name, index in zip(names, indices):
        if name == "picture":
            converters[index] = lambda text: PICTURE_CODES[text]
        elif name in optional:
            converters[index] = lambda text: float(text) if text else nan
    table = np.loadtxt(path, delimiter=",", skiprows=1, usecols=indices, dtype=np.float64,
                       converters=converters, encoding="ascii", ndmin=2)
    return {name: table[:, i] for i, name in enumerate(names)}


def thin(x, y):
    """At most about MAX_POINTS of the points (x in order): each time bin's lowest and highest,
    so that no spike is lost, and an even sample of the rest, so that bands stay visible."""
    if len(x) <= MAX_POINTS:
        return x, y
    bins = MAX_POINTS // 4
    edges = np.linspace(x[0], x[-1], bins + 1)
    which = np.clip(np.searchsorted(edges, x, side="right") - 1, 0, bins - 1)
    keep = np.zeros(len(x), dtype=bool)
    keep[:: max(1, len(x) // (MAX_POINTS // 2))] = True
    order = np.lexsort((y, which))  # by bin, then by value
    starts = np.searchsorted(which[order], np.arange(bins))
    ends = np.searchsorted(which[order], np.arange(bins), side="right")
    present = ends > starts
    keep[order[starts[present]]] = True
    keep[order[ends[present] - 1]] = True
    return x[keep], y[keep]


class Layer:
    def __init__(self, folder, entry, index=0):
        self.role = entry["role"]
        self.title = entry["title"]
        self.prefix = entry["prefix"]
        self.frames = read_columns(os.path.join(folder, self.prefix + "frames.csv"),
                                   ["frame", "queue_ns", "first_present_ns"],
                                   optional=("queue_ns", "first_present_ns"))
        self.refreshes = read_columns(os.path.join(folder, self.prefix + "refreshes.csv"),
                                      ["refresh", "present_ns", "picture", "content_ns", "delay_ns"],
                                      optional=("content_ns", "delay_ns"))
        self.rows_png = os.path.join(folder, self.prefix + "spacetime-rows.png")
        self.colour = COLOURS.get(self.role, PALETTE[index % len(PALETTE)])

    def game_frame_times(self):
        """(queue time in s, time since the previous queued frame in ms)."""
        order = np.argsort(self.frames["frame"], kind="stable")
        q = self.frames["queue_ns"][order]
        q = q[~np.isnan(q)]
        return q[1:] / NS_PER_S, np.diff(q) / NS_PER_MS

    def display_frame_times(self):
        """(present time in s, time since the previous new picture in ms)."""
        picture = self.refreshes["picture"]
        new = (picture == PICTURE_CODES["blend"]) | (picture == PICTURE_CODES["new"])
        p = self.refreshes["present_ns"][new]
        return p[1:] / NS_PER_S, np.diff(p) / NS_PER_MS

    def shown(self):
        """(present, content) of the refreshes that showed something."""
        content = self.refreshes["content_ns"]
        has = ~np.isnan(content)
        return self.refreshes["present_ns"][has], content[has]

    def animation_errors(self):
        """|content step - present step| between consecutive refreshes showing something, ms."""
        present, content = self.shown()
        return np.abs(np.diff(content) - np.diff(present)) / NS_PER_MS

    def latencies(self):
        """Queue to the first present at which the frame led the picture, ms."""
        latency = self.frames["first_present_ns"] - self.frames["queue_ns"]
        return latency[~np.isnan(latency)] / NS_PER_MS

    def content_ages(self):
        present, content = self.shown()
        return (present - content) / NS_PER_MS


def nearest_rank(values, p):
    if len(values) == 0:
        return None
    ordered = np.sort(values)
    rank = max(1, int(np.ceil(p / 100.0 * len(ordered))))
    return ordered[rank - 1]


def save(fig, folder, name):
    fig.savefig(os.path.join(folder, name), dpi=DPI)
    plt.close(fig)


def frame_times(folder, layers):
    fig, axes = plt.subplots(2, 1, figsize=(10, 6.5), sharex=True)
    panels = [
        (axes[0], "Game side: time between frames the game queued", Layer.game_frame_times),
        (axes[1], "Display side: time between new pictures on screen", Layer.display_frame_times),
    ]
    for ax, title, series in panels:
        # Points, not lines: a frame time that alternates (8 and 17 ms) shows as two bands.
        for layer in reversed(layers):
            x, y = thin(*series(layer))
            if len(y):
                ax.plot(x, y, ".", markersize=3, color=layer.colour, label=layer.title)
        ax.set_title(title)
        ax.set_ylabel("frame time (ms)")
        ax.set_ylim(bottom=0)
        ax.grid(alpha=0.3)
        ax.legend(loc="upper right", fontsize=8, markerscale=3)
    axes[1].set_xlabel("time in the run (s)")
    fig.suptitle("Frame times over the run")
    fig.tight_layout()
    save(fig, folder, "frame-times.png")


def animation_error(folder, layers, period_ms):
    fig, ax = plt.subplots(figsize=(10, 5))
    draw_animation_error(ax, layers, period_ms)
    fig.tight_layout()
    save(fig, folder, "animation-error.png")


def draw_animation_error(ax, layers, period_ms):
    errors = [(layer, layer.animation_errors()) for layer in layers]
    top = max([nearest_rank(e, 99.9) or 0 for _, e in errors] + [period_ms]) * 1.2
    bins = np.linspace(0, top, 80)
    for layer, e in errors:
        if len(e) == 0:
            continue
        clipped = np.minimum(e, top)  # the last bin holds everything beyond
        weights = np.full(len(e), 100.0 / len(e))
        p95 = nearest_rank(e, 95)
        ax.hist(clipped, bins=bins, weights=weights, histtype="step", linewidth=1.6,
                color=layer.colour, label="%s (p95 %.2f ms)" % (layer.title, p95))
    ax.axvline(period_ms / 2, color="#888888", linestyle="--",
               label="half a refresh period (%.2f ms)" % (period_ms / 2))
    ax.set_yscale("log")
    ax.set_xlabel("|animation error| per refresh (ms): content step minus present step")
    ax.set_ylabel("share of refreshes (%)")
    ax.set_title("Animation error: how far motion on screen strays from even motion "
                 "(0 is perfectly smooth)")
    ax.grid(alpha=0.3)
    ax.legend(fontsize=8)


def cdf(ax, values, layer, unit):
    if len(values) == 0:
        return
    ordered = np.sort(values)
    share = np.arange(1, len(ordered) + 1) * 100.0 / len(ordered)
    if len(ordered) > MAX_POINTS:
        pick = np.unique(np.linspace(0, len(ordered) - 1, MAX_POINTS).astype(int))
        ordered, share = ordered[pick], share[pick]
    p50, p99 = nearest_rank(values, 50), nearest_rank(values, 99)
    ax.plot(ordered, share, color=layer.colour,
            label="%s (p50 %.1f, p99 %.1f %s)" % (layer.title, p50, p99, unit))
    ax.plot([p50, p99], [50, 99], "o", color=layer.colour, markersize=4)


def latency(folder, layers):
    fig, axes = plt.subplots(1, 2, figsize=(12, 5))
    draw_latency(axes[0], layers)
    for layer in layers:
        cdf(axes[1], layer.content_ages(), layer, "ms")
    axes[1].set_title("Content age: present time minus the game time shown")
    axes[1].set_xlabel("content age per refresh (ms)")
    axes[1].set_ylabel("share of refreshes at or below (%)")
    cdf_axes(axes[1])
    fig.tight_layout()
    save(fig, folder, "latency.png")


def draw_latency(ax, layers):
    for layer in layers:
        cdf(ax, layer.latencies(), layer, "ms")
    ax.set_title("Latency: queue to the first present where the frame leads")
    ax.set_xlabel("latency per frame (ms)")
    ax.set_ylabel("share of frames at or below (%)")
    cdf_axes(ax)


def cdf_axes(ax):
    ax.set_ylim(0, 100)
    ax.set_xlim(left=0)
    ax.grid(alpha=0.3)
    ax.legend(fontsize=8, loc="lower right")


def comparison(folder, layers, period_ms):
    """One figure for the runs of a comparison: what costs seconds is matplotlib's start and each
    figure drawn, so the comparison draws one."""
    fig, axes = plt.subplots(1, 2, figsize=(15, 5.5))
    draw_animation_error(axes[0], layers, period_ms)
    axes[0].set_title("Animation error per refresh (0 is perfectly smooth)")
    draw_latency(axes[1], layers)
    fig.tight_layout()
    save(fig, folder, "comparison.png")


def delay(folder, layers):
    run = layers[0]
    fig, axes = plt.subplots(2, 1, figsize=(10, 6), sharex=True)
    has_delay = ~np.isnan(run.refreshes["delay_ns"])
    if has_delay.any():
        t = run.refreshes["present_ns"][has_delay] / NS_PER_S
        d = run.refreshes["delay_ns"][has_delay] / NS_PER_MS
        # A step at each change, and the last value held to the end.
        change = np.concatenate(([True], d[1:] != d[:-1]))
        change[-1] = True
        axes[0].plot(t[change], d[change], drawstyle="steps-post", color=run.colour,
                     label=run.title)
        axes[0].set_ylim(0, max(d.max() * 1.2, 1))
        axes[0].legend(fontsize=8, loc="lower right")
    else:
        axes[0].text(0.5, 0.5, "this mode applies no display delay", ha="center", va="center",
                     transform=axes[0].transAxes)
    axes[0].set_title("Display delay the engine applied to each frame")
    axes[0].set_ylabel("display delay (ms)")
    axes[0].grid(alpha=0.3)

    present = run.refreshes["present_ns"] / NS_PER_S
    kinds = run.refreshes["picture"]
    width = 1
    if len(present):
        # A bar per second, or per some seconds in a long run.
        width = max(1, int(np.ceil((present.max() - present.min()) / MAX_BARS)))
        slots = np.floor(present / width).astype(int)
        edges = np.arange(slots.min(), slots.max() + 1)
        # The first and last bars are partly covered: count per second of what was covered.
        covered = np.minimum((edges + 1) * width, present.max()) - np.maximum(edges * width,
                                                                             present.min())
        covered = np.maximum(covered, 1e-3)
        bottom = np.zeros(len(edges))
        for kind, colour in PICTURE_COLOURS.items():
            counts = np.bincount(slots[kinds == PICTURE_CODES[kind]] - edges[0],
                                 minlength=len(edges))
            counts = counts[: len(edges)] / covered
            if len(edges) <= FEW_BARS:
                axes[1].bar((edges + 0.5) * width, counts, width=0.9 * width, bottom=bottom,
                            color=colour, label=kind)
            else:  # one shape per kind: many bars take matplotlib long to draw
                axes[1].stairs(bottom + counts, np.append(edges, edges[-1] + 1) * width,
                               baseline=bottom.copy(), fill=True, color=colour, label=kind)
            bottom += counts
        axes[1].set_ylim(0, bottom.max() * 1.25)
    per = "each second" if width == 1 else "per second, in bars of %d s" % width
    axes[1].set_title("What the screen showed %s (%s)" % (per, run.title))
    axes[1].set_ylabel("refreshes per second")
    axes[1].set_xlabel("time in the run (s)")
    axes[1].legend(fontsize=8, ncol=4, loc="upper right")
    fig.tight_layout()
    save(fig, folder, "delay.png")


def spacetime(folder, layers):
    from PIL import Image

    drawn = [layer for layer in layers if os.path.exists(layer.rows_png)]
    if not drawn:
        return
    fig, axes = plt.subplots(1, len(drawn), figsize=(5.5 * len(drawn), 7), squeeze=False)
    for ax, layer in zip(axes[0], drawn):
        image = Image.open(layer.rows_png)
        first, count = int(image.text["first_refresh"]), int(image.text["rows"])
        rows = np.flatnonzero(layer.refreshes["refresh"] >= first)[:count]
        present = layer.refreshes["present_ns"][rows] / NS_PER_S
        names = list(PICTURE_COLOURS)
        kinds = [names[int(code)] for code in layer.refreshes["picture"][rows]]
        pixels = np.asarray(image.convert("RGB"))
        width = pixels.shape[1]
        top, bottom = present[0], present[-1]
        # A strip on the left gives what each row was.
        strip = np.array([[matplotlib.colors.to_rgb(PICTURE_COLOURS[kind])] for kind in kinds])
        margin = max(4, width // 40)
        ax.imshow(np.repeat(strip, margin, axis=1), extent=(-margin - 2, -2, bottom, top),
                  aspect="auto", interpolation="nearest")
        ax.imshow(pixels, extent=(0, width, bottom, top), aspect="auto", interpolation="nearest")
        ax.set_xlim(-margin - 2, width)
        ax.set_ylim(bottom, top)
        ax.set_title(layer.title)
        ax.set_xlabel("position of the moving bar on screen (px)")
        ax.set_ylabel("present time in the run (s)")
    handles = [Patch(color=c, label=k) for k, c in PICTURE_COLOURS.items()]
    fig.legend(handles=handles, loc="lower center", ncol=4, fontsize=9,
               title="left strip: the picture on screen at each refresh")
    fig.suptitle("Space-time picture: a straight edge is smooth motion, steps are judder")
    fig.tight_layout(rect=(0, 0.08, 1, 0.97))
    save(fig, folder, "spacetime.png")


def main():
    if len(sys.argv) != 2:
        sys.stderr.write("usage: figures.py FOLDER\n")
        return 2
    folder = sys.argv[1]
    with open(os.path.join(folder, "run.json")) as f:
        run = json.load(f)
    layers = [Layer(folder, entry, i) for i, entry in enumerate(run["layers"])]
    period_ms = run["refresh_period_ns"] / NS_PER_MS
    if run.get("comparison"):
        comparison(folder, layers, period_ms)
        return 0
    frame_times(folder, layers)
    animation_error(folder, layers, period_ms)
    latency(folder, layers)
    delay(folder, layers)
    spacetime(folder, layers)
    return 0


if __name__ == "__main__":
    sys.exit(main())
