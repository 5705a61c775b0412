"""Mutation testing of the plug-in library.

Makes one-line faults in the library's own folders (interface/ common/ meter/
capture/ analysis/ detection/ tone/, files *.cpp and *.h), rebuilds, runs the test suite
and reports each mutant as killed, survived or stillborn (did not build).

Operators (one change on one line per mutant):
  cmp    flipped comparison: < <-> >=, > <-> <=, == <-> !=
  const  integer literal n -> n+1 (decimal, hex, octal, binary; suffix kept)
  logic  && -> || and || -> &&
  del    a whole single-line call statement removed (foo(x); obj->bar(); LOG(...);)
Comments, string and character literals, preprocessor lines and static_assert
are never mutated.

Usage:
  scripts/mutate.py --seed S --count N [--tree DIR] [--build DIR]
                    [--save SITES.json] [--report FILE]
      pick N sites at random (random.Random(S).sample over the sorted
      candidate sites) and run them
  scripts/mutate.py --sites SITES.json [--tree DIR] [--build DIR] [--report FILE]
      replay saved sites; each one is found at its file:line if the line text
      is unchanged, else by its text in the same file (the copy whose
      neighbouring lines match best, then the nearest), else by its text
      anywhere in the library folders; otherwise it is reported as "gone"
  scripts/mutate.py --list [--tree DIR]
      print every candidate site and exit (nothing is built)

--tree defaults to the repository holding this script, --build to
TREE/build-mutation. The build directory is configured once (RelWithDebInfo,
no benchmarks, warnings not errors). The unmutated suite must pass first; a
failing or flaky baseline stops the run. Every mutated file is restored (also
on SIGINT/SIGTERM; a copy of the original waits in BUILD/mutation-backup/ and
is put back by the next run if this one was killed outright). The tests run in
a private /tmp and /dev/shm (a mount namespace) when the system allows it, so
nothing they leave behind survives them.
"""

import argparse
import fcntl
import json
import random
import signal
import sys
import time
from pathlib import Path

from .locate import _neighbours, locate, read_lines
from .mutants import Backup, baseline, run_mutant, short_change
from .processes import Interrupted, Runner, _on_signal, private_tmp_works
from .sites import all_sites


class Output:
    def __init__(self, report):
        self.file = open(report, "w", encoding="utf-8") if report else None

    def line(self, text=""):
        print(text, flush=True)
        if self.file:
            self.file.write(text + "\n")
            self.file.flush()

    def close(self):
        if self.file:
            self.file.close()


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--seed", type=int, help="seed of the random choice of sites")
    ap.add_argument("--count", type=int, help="number of sites to pick")
    ap.add_argument("--sites", type=Path, help="replay the sites saved in this JSON file")
    ap.add_argument("--tree", type=Path, help="source tree to mutate (default: this repository)")
    ap.add_argument("--build", type=Path, help="build directory (default: TREE/build-mutation)")
    ap.add_argument("--save", type=Path, help="write the sites to run to this JSON file")
    ap.add_argument("--report", type=Path, help="also write the results to this file")
    ap.add_argument("--list", action="store_true", help="print every candidate site and exit")
    ap.add_argument("--no-private-tmp", action="store_true",
                    help="run the tests in the ordinary /tmp and /dev/shm")
    args = ap.parse_args()

    tree = (args.tree or Path(__file__).resolve().parent.parent.parent).resolve()
    if not all((tree / d).is_dir() for d in ("interface", "tests")):
        ap.error("%s does not look like the project's source tree" % tree)
    build = (args.build or tree / "build-mutation").resolve()

    if args.list:
        sites = all_sites(tree)
        for s in sites:
            print("%s:%d:%d  %-22s %s" % (s["file"], s["line"], s["col"] + 1, s["op"],
                                           short_change(s)))
        counts = {}
        for s in sites:
            counts[s["op"].split()[0]] = counts.get(s["op"].split()[0], 0) + 1
        print("%d sites: %s" % (len(sites), ", ".join("%s %d" % kv for kv in sorted(counts.items()))))
        return 0

    if not args.sites and (args.seed is None or args.count is None):
        ap.error("give --seed and --count, or --sites")
    if args.sites and (args.seed is not None or args.count is not None):
        ap.error("--sites replays saved sites; it takes no --seed or --count")

    build.mkdir(parents=True, exist_ok=True)
    lock = open(build / ".mutate.lock", "w")
    try:
        fcntl.flock(lock, fcntl.LOCK_EX | fcntl.LOCK_NB)
    except OSError:
        sys.exit("mutate: another run is using %s" % build)
    backup = Backup(tree, build)
    backup.recover()

    if args.sites:
        saved = json.loads(args.sites.read_text())
        sites = saved["sites"]
        header = "replaying %d sites from %s" % (len(sites), args.sites)
    else:
        candidates = all_sites(tree)
        if args.count > len(candidates):
            ap.error("only %d candidate sites" % len(candidates))
        sites = random.Random(args.seed).sample(candidates, args.count)
        for s in sites:
            lines = read_lines(tree / s["file"])
            s["context"] = list(_neighbours(lines, s["line"] - 1))
        header = "seed %d: %d of %d candidate sites" % (args.seed, len(sites), len(candidates))
        saved = {"seed": args.seed, "count": args.count, "candidates": len(candidates)}

    placed = [locate(tree, s) for s in sites]  # where each site is in this tree

    if args.save:
        keys = ("file", "line", "col", "op", "original", "mutated", "context")
        out_sites = [{k: s[k] for k in keys if k in s} for s in sites]
        args.save.parent.mkdir(parents=True, exist_ok=True)
        meta = {k: v for k, v in saved.items() if k != "sites"}
        meta["tree"] = str(tree)
        meta["sites"] = out_sites
        args.save.write_text(json.dumps(meta, indent=1) + "\n")

    for sig in (signal.SIGINT, signal.SIGTERM):
        signal.signal(sig, _on_signal)

    private = not args.no_private_tmp and private_tmp_works()
    runner = Runner(tree, build, private)
    out = Output(args.report)
    started = time.time()
    results = []
    try:
        out.line("mutate: tree %s, build %s" % (tree, build))
        out.line("mutate: " + header)
        if not private:
            out.line("mutate: tests run in the ordinary /tmp and /dev/shm")
        runner.configure()
        baseline(runner, out)
        width = len(str(len(sites)))
        for i, (s, where) in enumerate(zip(sites, placed), 1):
            t0 = time.time()
            if where is None:
                status, note, loc = "gone", "", "%s:%d" % (s["file"], s["line"])
            else:
                rel, lineno = where
                loc = "%s:%d" % (rel, lineno)
                if (rel, lineno) != (s["file"], s["line"]):
                    note = "(was %s:%d)" % (s["file"], s["line"])
                else:
                    note = ""
                status, why = run_mutant(runner, backup, s, rel, lineno)
                note = " ".join(x for x in (note, why) if x)
            results.append((s, status, loc))
            out.line("[%*d/%d] %-9s %s  %s  %s  [%.0f s]%s"
                     % (width, i, len(sites), status.upper(), loc, s["op"], short_change(s),
                        time.time() - t0, "  " + note if note else ""))
    except Interrupted as e:
        out.line("mutate: interrupted (%s); the tree is restored" % e)
        out.close()
        return 130
    finally:
        lock.close()

    n = len(sites)
    count = {k: sum(1 for _, st, _ in results if st == k)
             for k in ("killed", "survived", "stillborn", "gone")}
    out.line()
    for kind in ("survived", "stillborn", "gone"):
        rows = [(s, loc) for s, st, loc in results if st == kind]
        if rows:
            out.line("%s:" % kind)
            for s, loc in rows:
                out.line("  %s  %s  %s" % (loc, s["op"], short_change(s)))
    live = count["killed"] + count["survived"]
    out.line("killed %d, survived %d, stillborn %d, gone %d of %d"
             % (count["killed"], count["survived"], count["stillborn"], count["gone"], n))
    out.line("score: %d/%d killed of the mutants that built = %.1f%%  (wall time %.0f min)"
             % (count["killed"], live, 100.0 * count["killed"] / live if live else 0.0,
                (time.time() - started) / 60))
    out.close()
    return 0

