"""Running builds and test suites: process groups, signals, a private /tmp."""

import contextlib
import os
import re
import shutil
import signal
import subprocess
import sys
import time
from pathlib import Path

CTEST_TIMEOUT = 90  # per test (tests with their own TIMEOUT property keep it)
SUITE_LIMIT = 30 * 60  # whole ctest run, a guard against a hang outside ctest's control
BUILD_LIMIT = 60 * 60

# ---------------------------------------------------------------------------
# Running things
# ---------------------------------------------------------------------------

class Interrupted(Exception):
    pass


_current_child = None


def _on_signal(signum, frame):
    _kill_child()
    raise Interrupted(signal.Signals(signum).name)


def _kill_child():
    p = _current_child
    if p is None or p.poll() is not None:
        return
    for sig in (signal.SIGTERM, signal.SIGKILL):
        try:
            os.killpg(p.pid, sig)
        except ProcessLookupError:
            return
        try:
            p.wait(timeout=5)
            return
        except subprocess.TimeoutExpired:
            pass


def run(cmd, limit, cwd=None):
    """Runs cmd in its own process group, output captured.
    Returns (exit code or None on overrun, combined output)."""
    global _current_child
    p = subprocess.Popen(cmd, cwd=cwd, stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
                         stdin=subprocess.DEVNULL, start_new_session=True)
    _current_child = p
    try:
        out, _ = p.communicate(timeout=limit)
        return p.returncode, out.decode("utf-8", "replace")
    except subprocess.TimeoutExpired:
        _kill_child()
        out, _ = p.communicate()
        return None, out.decode("utf-8", "replace")
    finally:
        if p.poll() is None:
            _kill_child()
        _current_child = None


PRIVATE_TMP = ("mount -t tmpfs -o mode=1777 tmpfs /tmp && "
               "mount -t tmpfs -o mode=1777 tmpfs /dev/shm && exec \"$@\"")


def private_tmp_works():
    if not shutil.which("unshare"):
        return False
    try:
        r = subprocess.run(["unshare", "--mount", "--propagation", "private", "sh", "-c",
                            PRIVATE_TMP, "sh", "true"],
                           stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, timeout=30)
        return r.returncode == 0
    except (OSError, subprocess.TimeoutExpired):
        return False


def _snapshot():
    names = set()
    for d in ("/tmp", "/dev/shm"):
        with contextlib.suppress(OSError):
            names |= {os.path.join(d, n) for n in os.listdir(d)}
    return names


def _live_pids():
    return {int(n) for n in os.listdir("/proc") if n.isdigit()}


def clean_leftovers(before, since):
    """Without a private /tmp: removes what the tests left there: new entries
    naming the project, changed after `since`, whose embedded pids are dead."""
    live = {str(p) for p in _live_pids()}
    for path in sorted(_snapshot() - before):
        name = os.path.basename(path)
        if "korvo" not in name:
            continue
        with contextlib.suppress(OSError):
            if os.lstat(path).st_mtime < since:
                continue
            if set(re.findall(r"\d+", name)) & live:
                continue
            if os.path.isdir(path) and not os.path.islink(path):
                shutil.rmtree(path)
            else:
                os.unlink(path)


class Runner:
    def __init__(self, tree, build, private):
        self.tree = tree
        self.build = build
        self.private = private

    def configure(self):
        cache = self.build / "CMakeCache.txt"
        if cache.is_file():
            text = cache.read_text(errors="replace")
            home = re.search(r"^CMAKE_HOME_DIRECTORY:INTERNAL=(.*)$", text, re.M)
            if home and Path(home.group(1)).resolve() != self.tree.resolve():
                sys.exit("mutate: %s is configured for %s, not %s"
                         % (self.build, home.group(1), self.tree))
            if not re.search(r"^KORVO_WERROR:BOOL=ON$", text, re.M):
                return
        rc, out = run(["cmake", "-S", str(self.tree), "-B", str(self.build),
                       "-DCMAKE_BUILD_TYPE=RelWithDebInfo", "-DKORVO_BUILD_BENCH=OFF",
                       "-DKORVO_WERROR=OFF"], BUILD_LIMIT)
        if rc != 0:
            tail(out)
            sys.exit("mutate: configuring %s failed" % self.build)

    def build_all(self):
        return run(["cmake", "--build", str(self.build), "-j2"], BUILD_LIMIT)

    def ctest(self, *extra):
        cmd = ["ctest", "--test-dir", str(self.build), "-j2", "--timeout", str(CTEST_TIMEOUT)]
        cmd += list(extra)
        if self.private:
            cmd = ["unshare", "--mount", "--propagation", "private", "sh", "-c",
                   PRIVATE_TMP, "sh"] + cmd
            return run(cmd, SUITE_LIMIT)
        before, since = _snapshot(), time.time()
        try:
            return run(cmd, SUITE_LIMIT)
        finally:
            clean_leftovers(before, since)


FAILED_RE = re.compile(r"^\s*\d+\s*-\s*(\S+)\s*\(([^)]*)\)", re.M)


def failed_tests(out):
    tail_part = out.split("The following tests FAILED:", 1)
    if len(tail_part) < 2:
        return []
    return FAILED_RE.findall(tail_part[1])


def tail(text, out=None, n=30):
    for line in text.rstrip().splitlines()[-n:]:
        (out.line if out else print)("    " + line)
