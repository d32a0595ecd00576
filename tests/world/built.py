"""Whether a program that nothing rebuilds by itself is still that of the sources."""

from pathlib import Path

CHECKOUT = Path(__file__).resolve().parents[2]


def outdated(program, checkout=CHECKOUT):
    """The newest of the daemon's source files when `program` is older than it, else None."""
    sources = [path for place in ("src", "platform") for path in (checkout / place).rglob("*")
               if path.is_file()]
    newest = max(sources, key=lambda path: path.stat().st_mtime_ns)
    if Path(program).stat().st_mtime_ns < newest.stat().st_mtime_ns:
        return newest.relative_to(checkout)
    return None
