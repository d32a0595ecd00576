"""The figures as Markdown, and the plot."""

from statistics import median

_WIDTH, _HEIGHT, _LEFT, _TOP, _PLOT = 760, 330, 60, 40, 280
_COLOURS = {"steady": "#1f5fa8", "prompt": "#c8501e"}


def spread(values, digits=3):
    """Minimum, median and maximum as a text."""
    return " / ".join(f"{value:.{digits}f}" for value in (min(values), median(values), max(values)))


def table(heads, rows):
    """A Markdown table; all columns but the first two are numbers."""
    texts = [heads, *([str(cell) for cell in row] for row in rows)]
    widths = [max(len(row[column]) for row in texts) for column in range(len(heads))]

    def line(cells):
        return "| " + " | ".join(cell.ljust(width) if column < 2 else cell.rjust(width)
                                 for column, (cell, width) in enumerate(zip(cells, widths, strict=True))) + " |"
    rule = "|" + "|".join("-" * (width + 1) + (":" if column > 1 else "-")
                          for column, width in enumerate(widths)) + "|"
    return "\n".join([line(texts[0]), rule, *map(line, texts[1:])]) + "\n"


def _series(points, x_of, y_of, colour):
    places = [(x_of(x), y_of(y)) for x, y in sorted(points)]
    line = " ".join(f"{x:.1f},{y:.1f}" for x, y in places)
    dots = "".join(f'<circle cx="{x:.1f}" cy="{y:.1f}" r="3" fill="{colour}"/>' for x, y in places)
    return f'<polyline points="{line}" fill="none" stroke="{colour}" stroke-width="2"/>{dots}'


def _chart(left, title, unit, series):
    """One chart: {name: [(disks, value)]}."""
    largest = max((y for points in series.values() for _, y in points), default=1) or 1
    bottom = _TOP + _PLOT - 60

    def x_of(disks):
        return left + _PLOT * disks / 16

    def y_of(value):
        return bottom - (bottom - _TOP) * value / largest
    parts = [f'<text x="{left}" y="{_TOP - 16}" font-weight="bold">{title}</text>',
             f'<path d="M{left},{_TOP} V{bottom} H{left + _PLOT}" fill="none" stroke="#888"/>']
    parts += [f'<text x="{x_of(tick):.0f}" y="{bottom + 16}" text-anchor="middle">{tick}</text>'
              for tick in (0, 1, 4, 16)]
    parts += [f'<text x="{left - 6}" y="{y_of(value) + 4:.0f}" text-anchor="end">{value:.3g}</text>'
              for value in (0, largest / 2, largest)]
    parts.append(f'<text x="{left + _PLOT / 2}" y="{bottom + 34}" text-anchor="middle">disks; {unit}</text>')
    for number, (name, points) in enumerate(series.items()):
        colour = _COLOURS.get(name, "#444")
        parts.append(_series(points, x_of, y_of, colour))
        parts.append(f'<text x="{left + 10 + 70 * number}" y="{bottom + 52}" fill="{colour}">{name}</text>')
    return "".join(parts)


def plot(plugs, idles):
    """SVG text of both charts; each {name: [(disks, value)]}."""
    return (f'<svg xmlns="http://www.w3.org/2000/svg" width="{_WIDTH}" height="{_HEIGHT}" '
            'font-family="sans-serif" font-size="12"><rect width="100%" height="100%" fill="white"/>'
            + _chart(_LEFT, "Plug to published", "seconds", plugs)
            + _chart(_LEFT + _PLOT + 90, "Idle: own processor time", "ms a cycle", idles) + "</svg>\n")
