"""Making one fault, running the suite against it, and the unmutated baseline."""

import json
import re
import shutil
import signal
import sys
import time
from pathlib import Path

from .processes import BUILD_LIMIT, SUITE_LIMIT, failed_tests, tail

# ---------------------------------------------------------------------------
# Mutants
# ---------------------------------------------------------------------------

class Backup:
    """Keeps the original of the mutated file in the build directory, so a run
    killed outright is repaired by the next one."""

    def __init__(self, tree, build):
        self.tree = tree
        self.dir = build / "mutation-backup"
        self.index = self.dir / "file.json"

    def recover(self):
        if not self.index.is_file():
            return
        info = json.loads(self.index.read_text())
        target = Path(info["path"])
        data = (self.dir / "original").read_bytes()
        if target.exists() and target.read_bytes() != data:
            target.write_bytes(data)
            print("mutate: restored %s left mutated by an earlier run" % target)
        self.clear()

    def save(self, path, data):
        self.dir.mkdir(parents=True, exist_ok=True)
        (self.dir / "original").write_bytes(data)
        self.index.write_text(json.dumps({"path": str(path)}))

    def clear(self):
        shutil.rmtree(self.dir, ignore_errors=True)


def apply_site(tree, site, rel, lineno):
    """Mutated content of the file holding the site, as bytes, plus the line
    as written."""
    path = tree / rel
    data = path.read_bytes()
    lines = data.decode("utf-8", "surrogateescape").split("\n")
    current = lines[lineno - 1]
    if current == site["original"]:
        new = site["mutated"]
    elif site["mutated"] == "":
        new = ""
    else:
        indent = current[:len(current) - len(current.lstrip())]
        new = indent + site["mutated"].strip()
    lines[lineno - 1] = new
    return path, data, "\n".join(lines).encode("utf-8", "surrogateescape")


def short_change(site):
    """The changed part of the line, with a little context."""
    a, b = site["original"].strip(), site["mutated"].strip()
    if not b:
        return "%s  ->  (deleted)" % clip(a, 70)
    p = 0
    while p < min(len(a), len(b)) and a[p] == b[p]:
        p += 1
    q = 0
    while q < min(len(a), len(b)) - p and a[-1 - q] == b[-1 - q]:
        q += 1
    lo = max(0, p - 25)

    def window(s):
        hi = min(len(s), len(s) - q + 25)
        return ("..." if lo > 0 else "") + s[lo:hi] + ("..." if hi < len(s) else "")
    return "%s  ->  %s" % (window(a), window(b))


def clip(s, n):
    return s if len(s) <= n else s[:n - 3] + "..."


def build_failure_is_crash(out):
    """The build stopped only because a test program failed while its tests
    were listed (it crashed or hung at start): the mutant built."""
    if re.search(r"error:|undefined reference|multiple definition|ld returned", out):
        return False
    return "Error running test executable" in out or "Process terminated due to timeout" in out


def run_mutant(runner, backup, site, rel, lineno):
    path, original, mutated = apply_site(runner.tree, site, rel, lineno)
    backup.save(path, original)
    try:
        path.write_bytes(mutated)
        rc, out = runner.build_all()
        if rc != 0:
            if rc is not None and build_failure_is_crash(out):
                return "killed", "test program failed at listing"
            if rc is None:
                return "stillborn", "build overran %d s" % BUILD_LIMIT
            first = re.search(r"^.*(?:error:|undefined reference).*$", out, re.M)
            if not first:
                return "stillborn", ""
            return "stillborn", clip(first.group().strip().replace(str(runner.tree) + "/", ""), 110)
        rc, out = runner.ctest("--stop-on-failure")
        if rc == 0:
            return "survived", ""
        failed = failed_tests(out)
        if rc is None:
            return "killed", "suite overran %d s" % SUITE_LIMIT
        if failed:
            name, why = failed[0]
            return "killed", "%s (%s)" % (name, why.strip())
        return "killed", "ctest exit %d" % rc
    finally:
        old = signal.pthread_sigmask(signal.SIG_BLOCK, {signal.SIGINT, signal.SIGTERM})
        try:
            path.write_bytes(original)
            if path.read_bytes() != original:
                raise SystemExit("mutate: could not restore %s" % path)
            backup.clear()
        finally:
            signal.pthread_sigmask(signal.SIG_SETMASK, old)


def baseline(runner, out):
    t0 = time.time()
    out.line("baseline: building %s" % runner.build)
    rc, text = runner.build_all()
    if rc != 0:
        tail(text, out)
        out.line("baseline: the unmutated tree does not build; stopping")
        sys.exit(2)
    out.line("baseline: running the suite")
    rc, text = runner.ctest()
    if rc == 0:
        m = re.search(r"tests passed, 0 tests failed out of (\d+)", text)
        out.line("baseline: green, %s tests (%.0f s)" % (m.group(1) if m else "all", time.time() - t0))
        return
    tail(text, out)
    failed = [n for n, _ in failed_tests(text)]
    if rc is None or not failed:
        out.line("baseline: the suite did not complete; stopping")
        sys.exit(2)
    flaky = []
    for _ in range(2):
        rc2, out2 = runner.ctest("--rerun-failed")
        still = {n for n, _ in failed_tests(out2)} if rc2 != 0 else set()
        flaky = [n for n in failed if n not in still]
        if flaky:
            break
    if flaky:
        out.line("baseline: flaky tests (failed, then passed unchanged): " + ", ".join(flaky))
    steady = [n for n in failed if n not in flaky]
    if steady:
        out.line("baseline: failing tests: " + ", ".join(steady))
    out.line("baseline: the unmutated suite is not green; stopping")
    sys.exit(2)
