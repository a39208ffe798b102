"""What was measured: figures, the ratios of pairs among them, and how a cost grows."""

import dataclasses
import statistics


@dataclasses.dataclass
class Figure:
    """One line of the page. `most` is what `value` may be at most, None when nothing is asked of it."""
    group: str
    what: str
    value: float
    most: float | None = None
    unit: str = ""
    least: float | None = None
    detail: str = ""  # what it was computed of, and how it varied

    def allows(self, value):
        return (self.most is None or value <= self.most) and (self.least is None or value >= self.least)

    @property
    def holds(self):
        return self.allows(self.value)

    @property
    def text(self):
        """The value with its unit. One that misses its limit has as many digits as show that it does."""
        digits = 3
        while not self.holds and self.allows(float(number(self.value, digits).replace(",", ""))):
            digits += 1
        return f"{number(self.value, digits)} {self.unit}".rstrip()

    @property
    def measured(self):
        return self.text + ("" if self.holds else " **missed**")

    @property
    def limit(self):
        if self.most is not None:
            return f"at most {number(self.most)}"
        return f"at least {number(self.least)}" if self.least is not None else ""


@dataclasses.dataclass
class Growth:
    """How a cost grows: for each size a cost of ours, and of the peer when there is one."""
    name: str
    title: str
    size: str
    cost: str
    points: list  # of (size, ours) or (size, ours, peer's)
    peer: str = ""


@dataclasses.dataclass
class Table:
    """A section of the page: a text, and rows of cells."""
    title: str
    head: list
    rows: list
    text: str = ""


def number(value, digits=3):
    if value >= 1000:
        return f"{value:,.{digits - 3}f}"
    return f"{value:.{digits}g}"


def ratio(group, what, ours, theirs, most=None, unit="us"):
    """The median of what two costs have as their ratio in each round."""
    ratios = sorted(a / b for a, b in zip(ours, theirs))
    tenth = len(ratios) // 10
    return Figure(group, what, statistics.median(ratios), most, detail=(
        f"{number(statistics.median(ours))} and {number(statistics.median(theirs))} {unit}, medians of {len(ratios)} rounds; "
        f"80 % of the ratios are from {number(ratios[tenth])} to {number(ratios[-1 - tenth])}"))
