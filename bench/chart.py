#!/usr/bin/python3
"""Draws the benchmark's JSON as one PNG: time per operation for each way
(log scale, with the floor), the proxy's time over p11-kit's against the
goals, and the service's resident size.

    chart.py <bench.json> <chart.png>
"""
import json
import sys

import matplotlib

matplotlib.use("Agg")
import matplotlib.pyplot as plt  # noqa: E402
import matplotlib.ticker  # noqa: E402

COLOURS = {"direct": "#9e9e9e", "proxy": "#1f77b4", "p11-kit": "#ff7f0e"}


def main(source, target):
    with open(source) as f:
        data = json.load(f)
    ops = data["operations"]
    floors = {f["key"]: f["time"] for f in data["floors"]}
    names = [o["name"] for o in ops]
    rows = range(len(ops))

    fig = plt.figure(figsize=(16, 10))
    grid = fig.add_gridspec(2, 2, height_ratios=[3, 1.3], width_ratios=[1.6, 1], left=0.14,
                            right=0.97, top=0.93, bottom=0.07, wspace=0.06, hspace=0.3)
    times, ratios, memory = fig.add_subplot(grid[0, 0]), fig.add_subplot(grid[0, 1]), \
        fig.add_subplot(grid[1, :])

    height = 0.25
    for k, way in enumerate(data["ways"]):
        medians, low, high = [], [], []
        for o in ops:
            cell = o["ways"].get(way, {})
            m = cell.get("median_us", 0)
            medians.append(m)
            low.append(m - cell.get("p25_us", m))
            high.append(cell.get("p75_us", m) - m)
        y = [r + (k - 1) * height for r in rows]
        times.barh(y, medians, height, xerr=[low, high], color=COLOURS.get(way), label=way)
        for yy, m, o in zip(y, medians, ops):
            if "failed" in o["ways"].get(way, {}):
                times.text(1, yy, " %s failed" % way, va="center", fontsize=8, color="red")
    for r, o in zip(rows, ops):
        floor = floors.get(o["floor"], {}).get("median_us")
        if floor:
            times.plot([floor, floor], [r - 1.6 * height, r + 1.6 * height], color="black",
                       linewidth=2, label="bare socket floor" if r == 0 else None)
    times.set_xscale("log")
    times.set_yticks(list(rows))
    times.set_yticklabels(names)
    times.invert_yaxis()
    times.set_xlabel("median time per call, µs (log scale; whiskers: interquartile range)")
    times.legend(loc="lower right", fontsize=9)
    times.grid(axis="x", which="both", alpha=0.3)

    values, colours = [], []
    for o in ops:
        ratio = o["proxy_over_p11kit"]
        values.append(ratio)
        met = o["goal_met"]
        colours.append("#bdbdbd" if met is None else "#2ca02c" if met else "#d62728")
    ratios.barh(list(rows), values, 0.6, color=colours)
    for r, (o, v) in enumerate(zip(ops, values)):
        goal = o["goal_over_p11kit"]
        if goal:
            ratios.plot([goal, goal], [r - 0.4, r + 0.4], color="black", linewidth=2)
        ratios.text(v, r, " %.2f" % v if v else " -", va="center", fontsize=9)
    ratios.axvline(1.0, color="#555555", linestyle="--", linewidth=1)
    ratios.set_xscale("log")
    ratios.set_xlim(min([0.25] + [v / 1.5 for v in values if v]),
                    max([2.0] + [v * 1.6 for v in values]))
    ratios.xaxis.set_major_formatter(matplotlib.ticker.FuncFormatter(lambda x, _: "%g" % x))
    ratios.set_yticks(list(rows))
    ratios.set_yticklabels([])
    ratios.invert_yaxis()
    ratios.set_xlabel("proxy time ÷ p11-kit time, log scale\n"
                      "(black tick: goal; green: met, red: not met, grey: no goal)")

    m = data["memory"]
    series = m.get("rss_kib_during_small_calls", [])
    if m.get("measured") and series:
        calls = [i * m["small_calls"] / (len(series) - 1) for i in range(len(series))]
        memory.plot(calls, [v / 1024 for v in series], marker="o", label="during small calls")
        end = calls[-1]
        points = [("before", m["rss_kib_before_big"]), ("peak", m["rss_kib_peak_during_big"]),
                  ("after", m["rss_kib_after_big"])]
        xs = [end * (1.05 + 0.05 * i) for i in range(3)]
        memory.plot(xs, [p[1] / 1024 for p in points], marker="s", color="#d62728",
                    label="around one %d MiB C_Digest" % (m["big_digest_bytes"] >> 20))
        for x, (label, v) in zip(xs, points):
            memory.annotate(label, (x, v / 1024), textcoords="offset points", xytext=(0, 6),
                            ha="center", fontsize=8)
        memory.set_xlabel("small calls through the proxy")
        memory.set_ylabel("service resident, MiB")
        memory.legend(loc="upper left", fontsize=9)
        memory.grid(alpha=0.3)
    else:
        memory.text(0.5, 0.5, "memory not measured: %s" % m.get("failure", ""),
                    ha="center", transform=memory.transAxes)
        memory.set_axis_off()

    load = data["load"]
    fig.suptitle("PKCS#11 on SoftHSM2: direct, through this proxy, through p11-kit's RPC — "
                 "%d rounds on %d cores, load average %.1f→%.1f, cores %.0f%% busy"
                 % (data["rounds"], load["cores"], load["loadavg_start"][0],
                    load["loadavg_end"][0], load["busy_percent"]), fontsize=11)
    fig.savefig(target, dpi=100)


if __name__ == "__main__":
    if len(sys.argv) != 3:
        sys.exit("usage: chart.py <bench.json> <chart.png>")
    main(sys.argv[1], sys.argv[2])
