"""Draws how cost grows."""

import matplotlib

matplotlib.use("svg")
matplotlib.rcParams["svg.hashsalt"] = "marubackup"

from matplotlib import pyplot  # noqa: E402 (the back end is chosen before)
from matplotlib.ticker import StrMethodFormatter  # noqa: E402


def draw_panel(axes, what, panel):
    for name, points in panel["points"].items():
        axes.plot(panel["places"], [point / 1000 for point in points], marker="o", label=name)
    axes.set_xscale("log")
    axes.xaxis.set_major_formatter(StrMethodFormatter("{x:,.0f}"))
    axes.set_ylim(bottom=0)
    axes.set_xlabel(what)
    axes.grid(alpha=0.3)
    axes.legend(fontsize="small")


def draw_curves(panels, path):
    figure, axes = pyplot.subplots(1, len(panels), figsize=(5 * len(panels), 4))
    for one, (what, panel) in zip(axes, panels.items()):
        draw_panel(one, what, panel)
    axes[0].set_ylabel("microseconds a request")
    figure.tight_layout()
    figure.savefig(path, format="svg", metadata={"Date": None})
