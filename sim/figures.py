#!/usr/bin/python3
"""Draws the figures of a verolux-sim run from the files in its output folder.

Usage: figures.py FOLDER

Reads run.json, [reference-]frames.csv, [reference-]refreshes.csv and [reference-]spacetime-rows.png,
and writes frame-times.png, animation-error.png, latency.png, delay.png and spacetime.png beside
them. The measures follow the README's definitions, as the simulator's summary does.
Exits with status 3, printing nothing, when matplotlib is missing.
"""

import csv
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
PICTURE_COLOURS = {"blend": "#2870ff", "new": "#28c846", "repeat": "#e62828", "held": "#000000"}
DPI = 100


def read_csv(path):
    if not os.path.exists(path):
        return []
    with open(path, newline="") as f:
        return list(csv.DictReader(f))


def column(rows, name, keep=lambda row: True):
    """The column as floats, leaving out empty cells and rows `keep` refuses."""
    return np.array([float(r[name]) for r in rows if r[name] != "" and keep(r)], dtype=float)


class Layer:
    def __init__(self, folder, entry):
        self.role = entry["role"]
        self.title = entry["title"]
        self.prefix = entry["prefix"]
        self.frames = read_csv(os.path.join(folder, self.prefix + "frames.csv"))
        self.refreshes = read_csv(os.path.join(folder, self.prefix + "refreshes.csv"))
        self.rows_png = os.path.join(folder, self.prefix + "spacetime-rows.png")
        self.colour = COLOURS.get(self.role, "#555555")

    def game_frame_times(self):
        """(queue time in s, time since the previous queued frame in ms)."""
        queued = sorted(
            (int(r["frame"]), float(r["queue_ns"])) for r in self.frames if r["queue_ns"] != ""
        )
        q = np.array([t for _, t in queued])
        return q[1:] / NS_PER_S, np.diff(q) / NS_PER_MS

    def display_frame_times(self):
        """(present time in s, time since the previous new picture in ms)."""
        p = column(self.refreshes, "present_ns", lambda r: r["picture"] in ("blend", "new"))
        return p[1:] / NS_PER_S, np.diff(p) / NS_PER_MS

    def animation_errors(self):
        """|content step - present step| between consecutive refreshes showing something, ms."""
        shown = [r for r in self.refreshes if r["content_ns"] != ""]
        content = np.array([float(r["content_ns"]) for r in shown])
        present = np.array([float(r["present_ns"]) for r in shown])
        return np.abs(np.diff(content) - np.diff(present)) / NS_PER_MS

    def latencies(self):
        """Queue to the first present at which the frame led the picture, ms."""
        return np.array(
            [
                (float(r["first_present_ns"]) - float(r["queue_ns"])) / NS_PER_MS
                for r in self.frames
                if r["first_present_ns"] != "" and r["queue_ns"] != ""
            ]
        )

    def content_ages(self):
        shown = [r for r in self.refreshes if r["content_ns"] != ""]
        return np.array(
            [(float(r["present_ns"]) - float(r["content_ns"])) / NS_PER_MS for r in shown]
        )


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
            x, y = series(layer)
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
    fig.tight_layout()
    save(fig, folder, "animation-error.png")


def cdf(ax, values, layer, unit):
    if len(values) == 0:
        return
    ordered = np.sort(values)
    share = np.arange(1, len(ordered) + 1) * 100.0 / len(ordered)
    p50, p99 = nearest_rank(values, 50), nearest_rank(values, 99)
    ax.plot(ordered, share, color=layer.colour,
            label="%s (p50 %.1f, p99 %.1f %s)" % (layer.title, p50, p99, unit))
    ax.plot([p50, p99], [50, 99], "o", color=layer.colour, markersize=4)


def latency(folder, layers):
    fig, axes = plt.subplots(1, 2, figsize=(12, 5))
    for layer in layers:
        cdf(axes[0], layer.latencies(), layer, "ms")
        cdf(axes[1], layer.content_ages(), layer, "ms")
    axes[0].set_title("Latency: queue to the first present where the frame leads")
    axes[0].set_xlabel("latency per frame (ms)")
    axes[0].set_ylabel("share of frames at or below (%)")
    axes[1].set_title("Content age: present time minus the game time shown")
    axes[1].set_xlabel("content age per refresh (ms)")
    axes[1].set_ylabel("share of refreshes at or below (%)")
    for ax in axes:
        ax.set_ylim(0, 100)
        ax.set_xlim(left=0)
        ax.grid(alpha=0.3)
        ax.legend(fontsize=8, loc="lower right")
    fig.tight_layout()
    save(fig, folder, "latency.png")


def delay(folder, layers):
    run = layers[0]
    fig, axes = plt.subplots(2, 1, figsize=(10, 6), sharex=True)
    rows = [r for r in run.refreshes if r["delay_ns"] != ""]
    if rows:
        t = np.array([float(r["present_ns"]) for r in rows]) / NS_PER_S
        d = np.array([float(r["delay_ns"]) for r in rows]) / NS_PER_MS
        axes[0].plot(t, d, drawstyle="steps-post", color=run.colour, label=run.title)
        axes[0].set_ylim(0, max(d.max() * 1.2, 1))
        axes[0].legend(fontsize=8, loc="lower right")
    else:
        axes[0].text(0.5, 0.5, "this mode applies no display delay", ha="center", va="center",
                     transform=axes[0].transAxes)
    axes[0].set_title("Display delay the engine applied to each frame")
    axes[0].set_ylabel("display delay (ms)")
    axes[0].grid(alpha=0.3)

    present = np.array([float(r["present_ns"]) for r in run.refreshes]) / NS_PER_S
    pictures = [r["picture"] for r in run.refreshes]
    if len(present):
        seconds = np.floor(present).astype(int)
        edges = np.arange(seconds.min(), seconds.max() + 1)
        # The first and last seconds are partly covered: count per second of what was covered.
        covered = np.array([min(e + 1, present.max()) - max(e, present.min()) for e in edges])
        covered = np.maximum(covered, 1e-3)
        bottom = np.zeros(len(edges))
        kinds = np.array(pictures)
        for kind, colour in PICTURE_COLOURS.items():
            counts = np.bincount(seconds[kinds == kind] - edges[0], minlength=len(edges))
            counts = counts[: len(edges)] / covered
            axes[1].bar(edges + 0.5, counts, width=0.9, bottom=bottom, color=colour, label=kind)
            bottom += counts
        axes[1].set_ylim(0, bottom.max() * 1.25)
    axes[1].set_title("What the screen showed each second (%s)" % run.title)
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
        rows = [r for r in layer.refreshes if int(r["refresh"]) >= first][:count]
        present = np.array([float(r["present_ns"]) for r in rows]) / NS_PER_S
        pixels = np.asarray(image.convert("RGB"))
        width = pixels.shape[1]
        top, bottom = present[0], present[-1]
        # A strip on the left gives what each row was.
        strip = np.array([[matplotlib.colors.to_rgb(PICTURE_COLOURS[r["picture"]])] for r in rows])
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
    layers = [Layer(folder, entry) for entry in run["layers"]]
    period_ms = run["refresh_period_ns"] / NS_PER_MS
    frame_times(folder, layers)
    animation_error(folder, layers, period_ms)
    latency(folder, layers)
    delay(folder, layers)
    spacetime(folder, layers)
    return 0


if __name__ == "__main__":
    sys.exit(main())
