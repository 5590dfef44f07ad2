#!/usr/bin/env bash
# Writes stutter30.frames.csv: 300 frames of a game aiming at 30 fps, with +-1 ms of queue
# jitter, 6 to 12 ms of GPU time per frame, four long frames (at 60, 150, 151 and 240) and a run
# of frames whose render-done time is unknown (100 to 104). Deterministic: a fixed-seed
# Park-Miller generator, no dependence on the awk in use.
set -euo pipefail
cd "$(dirname "$0")"
awk 'BEGIN {
    seed = 20240601
    period = 33333333
    extra[60] = 50000000; extra[150] = 33333333; extra[151] = 33333333; extra[240] = 100000000
    print "frame,queue_ns,render_done_ns"
    t = 0
    for (i = 0; i < 300; i++) {
        seed = (16807 * seed) % 2147483647; jitter = (seed / 2147483647 - 0.5) * 2000000
        seed = (16807 * seed) % 2147483647; render = 6000000 + seed / 2147483647 * 6000000
        if (i in extra) render += 12000000
        queue = (i == 0) ? 0 : t + jitter
        done = (i >= 100 && i <= 104) ? "" : sprintf("%.0f", queue + render)
        printf "%d,%.0f,%s\n", i, queue, done
        t += period + extra[i]
    }
}' > stutter30.frames.csv
