"""A row of the table of figures: from the line that a benchmark writes to what its ratio says."""
import math

FIELDS = 7
SENSES = {"at most", "at least", "times less", "none"}
TOLERANCE = 0.1  # of a target; machines and moments differ by as much
ITSELF = "the target"  # the yardstick of figures that have no other


class Unreadable(Exception):
    """What a benchmark said, or that it said nothing."""


def number(text):
    value = float(text)
    if not math.isfinite(value) or value < 0:
        raise ValueError(text)
    return value


def parse(line):
    """As a row has it from then on, the ratio is to be "at most" or "at least" the target, or to be nothing
    (""). It is None where there is none: no yardstick, or something where nothing is allowed."""
    try:
        name, value, unit, yardstick, yardstick_value, sense, target = line.split("\t")
        value, target = number(value), number(target)
        if not name or not unit or sense not in SENSES:
            raise ValueError(sense)
        if yardstick:
            yardstick_value = number(yardstick_value)
            ratio = yardstick_value / value if sense == "times less" else value / yardstick_value
        elif sense in {"at most", "at least"}:
            yardstick, yardstick_value, target = ITSELF, target, 1
            ratio = value / yardstick_value if yardstick_value > 0 else None if value > 0 else 0
        elif sense == "none":
            yardstick_value = ratio = None
        else:
            raise ValueError(sense)
    except (ValueError, ZeroDivisionError) as reason:
        raise Unreadable(f"a row that is not one: {line!r}") from reason
    sense = {"times less": "at least", "none": ""}.get(sense, sense)
    return {"name": name, "value": value, "unit": unit, "yardstick": yardstick, "yardstick_value": yardstick_value,
            "ratio": ratio if ratio is None else float(f"{ratio:.6g}"), "sense": sense, "target": target if sense else None}


def parse_all(text):
    rows = [parse(line) for line in text.splitlines()]
    if not rows:
        raise Unreadable("no row for the table")
    names = [row["name"] for row in rows]
    if twice := {name for name in names if names.count(name) > 1}:
        raise Unreadable(f"two rows of one name: {', '.join(sorted(twice))}")
    return rows


def missed_by(row):
    """The share of its target by which a ratio misses it; 0 if it does not."""
    if not row["sense"]:
        return 0
    if row["ratio"] is None:
        return math.inf
    beyond = row["ratio"] / row["target"] - 1
    return max(0, beyond if row["sense"] == "at most" else -beyond)


def is_missed(row):
    return missed_by(row) > TOLERANCE + 1e-9


def shown(value):
    """With three digits, or all before the point."""
    return f"{value:,.0f}" if value >= 1000 else f"{value:.3g}"


def shown_ratio(row):
    if row["ratio"] is not None:
        return shown(row["ratio"])
    return "∞" if row["sense"] else ""


def shown_target(row):
    if not row["sense"]:
        return ""
    if row["yardstick"] == ITSELF:
        return f"{row['sense']} {shown(row['yardstick_value'])} {row['unit']}"
    return f"{row['sense']} {shown(row['target'])}"


def verdict(row):
    missed = missed_by(row)
    if missed == 0:
        return "met" if row["sense"] else ""
    if missed == math.inf:
        return "**missed**"
    percent = f"missed by {missed * 100:.{0 if missed > 0.0995 else 1}f} %"
    return f"**{percent}**" if is_missed(row) else percent


def summary(row):
    found = f"{shown(row['value'])} {row['unit']}" if row["yardstick"] == ITSELF else shown_ratio(row)
    return f"{row['name']}: {found}, to be {shown_target(row)}: {verdict(row).strip('*')}"
