"""Finding saved sites again in a tree that may have changed since."""

from pathlib import Path

from .sites import library_files

# ---------------------------------------------------------------------------
# Finding saved sites again
# ---------------------------------------------------------------------------

def _neighbours(lines, idx):
    """Stripped text of the nearest non-blank line above and below idx."""
    def near(step):
        j = idx + step
        while 0 <= j < len(lines):
            if lines[j].strip():
                return lines[j].strip()
            j += step
        return ""
    return near(-1), near(1)


def read_lines(path):
    return path.read_text(encoding="utf-8", errors="surrogateescape").split("\n")


def locate(tree, site):
    """Where the site's line is now: (relative file, 1-based line) or None."""
    want = site["original"].strip()
    context = tuple(site.get("context", ("", "")))

    def best(rel, lines, old_line):
        hits = [i for i, l in enumerate(lines) if l.strip() == want]
        if not hits:
            return None
        def score(i):
            ctx = _neighbours(lines, i)
            same = sum(1 for a, b in zip(ctx, context) if a and a == b)
            return (-same, abs(i + 1 - old_line), i)
        return min(hits, key=score) + 1

    path = tree / site["file"]
    if path.is_file():
        lines = read_lines(path)
        n = site["line"]
        if 1 <= n <= len(lines) and lines[n - 1] == site["original"]:
            return site["file"], n
        hit = best(site["file"], lines, n)
        if hit:
            return site["file"], hit
    found = []
    for p in library_files(tree):
        rel = p.relative_to(tree).as_posix()
        if rel == site["file"]:
            continue
        lines = read_lines(p)
        hit = best(rel, lines, site["line"])
        if hit:
            ctx = _neighbours(lines, hit - 1)
            same = sum(1 for a, b in zip(ctx, context) if a and a == b)
            found.append((-same, p.name != Path(site["file"]).name, rel, hit))
    if found:
        found.sort()
        return found[0][2], found[0][3]
    return None
