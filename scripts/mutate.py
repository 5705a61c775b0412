#!/usr/bin/env python3
"""Mutation testing of the plug-in library.

Makes one-line faults in the library's own folders (interface/ meter/ capture/
analysis/ detection/ tone/, files *.cpp and *.h), rebuilds, runs the test suite
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
import contextlib
import fcntl
import json
import os
import random
import re
import shutil
import signal
import subprocess
import sys
import time
from pathlib import Path

LIB_DIRS = ("interface", "meter", "capture", "analysis", "detection", "tone")
SUFFIXES = (".cpp", ".h")

CTEST_TIMEOUT = 90  # per test (tests with their own TIMEOUT property keep it)
SUITE_LIMIT = 30 * 60  # whole ctest run, a guard against a hang outside ctest's control
BUILD_LIMIT = 60 * 60

KEYWORDS = {
    "return", "delete", "new", "throw", "if", "else", "while", "for", "do", "switch",
    "case", "default", "goto", "break", "continue", "sizeof", "alignof", "static_assert",
    "typedef", "using", "decltype", "alignas", "co_return", "co_await", "co_yield",
    "template", "typename", "class", "struct", "union", "enum", "namespace", "operator",
    "const", "static", "constexpr", "inline", "virtual", "explicit", "friend", "extern",
    "auto", "void", "int", "unsigned", "signed", "long", "short", "char", "bool", "float",
    "double", "public", "private", "protected", "try", "catch", "noexcept",
}

CMP_FLIP = {"<": ">=", ">=": "<", ">": "<=", "<=": ">", "==": "!=", "!=": "=="}
LOGIC_FLIP = {"&&": "||", "||": "&&"}
OPS3 = ("<=>", "<<=", ">>=", "->*", "...")
OPS2 = ("<<", ">>", "<=", ">=", "==", "!=", "->", "&&", "||", "::", "++", "--",
        "+=", "-=", "*=", "/=", "%=", "&=", "|=", "^=")


# ---------------------------------------------------------------------------
# Reading C++ source: which characters are code
# ---------------------------------------------------------------------------

def mask_source(text):
    """Returns text with comments and the insides of string and character
    literals replaced by spaces (quotes kept), same length and line breaks."""
    out = list(text)
    n = len(text)
    i = 0

    def blank(a, b):
        for k in range(a, b):
            if out[k] != "\n":
                out[k] = " "

    while i < n:
        c = text[i]
        if c == "/" and text.startswith("//", i):
            j = text.find("\n", i)
            j = n if j < 0 else j
            # a line comment ending in a backslash goes on; rare enough to ignore
            blank(i, j)
            i = j
        elif c == "/" and text.startswith("/*", i):
            j = text.find("*/", i + 2)
            j = n if j < 0 else j + 2
            blank(i, j)
            i = j
        elif c == '"':
            # raw string?  R"delim( ... )delim"  (prefixes R, u8R, uR, UR, LR)
            k = i - 1
            while k >= 0 and (text[k].isalnum() or text[k] == "_"):
                k -= 1
            prefix = text[k + 1:i]
            if prefix in ("R", "u8R", "uR", "UR", "LR"):
                open_paren = text.find("(", i)
                delim = text[i + 1:open_paren]
                end = text.find(")" + delim + '"', open_paren)
                end = n if end < 0 else end + len(delim) + 2
                blank(i + 1, end - 1)
                i = end
                continue
            j = i + 1
            while j < n and text[j] != '"' and text[j] != "\n":
                j += 2 if text[j] == "\\" else 1
            blank(i + 1, min(j, n))
            i = j + 1
        elif c == "'":
            # a digit separator (1'000) or a character literal
            k = i - 1
            while k >= 0 and (text[k].isalnum() or text[k] in "_.'"):
                k -= 1
            token = text[k + 1:i]
            if token and token[0].isdigit():
                i += 1
                continue
            j = i + 1
            while j < n and text[j] != "'" and text[j] != "\n":
                j += 2 if text[j] == "\\" else 1
            blank(i + 1, min(j, n))
            i = j + 1
        else:
            i += 1
    return "".join(out)


def skipped_lines(masked_lines):
    """Indexes of preprocessor lines (with their continuations) and of lines
    that belong to a static_assert."""
    skip = set()
    continued = False
    in_assert = False
    depth = 0
    for idx, m in enumerate(masked_lines):
        s = m.strip()
        if continued or s.startswith("#"):
            skip.add(idx)
            continued = m.rstrip().endswith("\\")
            continue
        if not in_assert:
            pos = _find_word(m, "static_assert")
            if pos < 0:
                continue
            in_assert, depth, start = True, 0, pos
        else:
            start = 0
        skip.add(idx)
        for ch in m[start:]:
            if ch == "(":
                depth += 1
            elif ch == ")":
                depth -= 1
            elif ch == ";" and depth <= 0:
                in_assert = False
                break
    return skip


def _find_word(s, word):
    m = re.search(r"(?<![\w])" + re.escape(word) + r"(?![\w])", s)
    return m.start() if m else -1


def code_scopes(masked_lines, skip):
    """For every line, whether its start lies inside executable code (a function
    body or a block within one) rather than at namespace or class level."""
    stack = []  # "code", "scope" (namespace/class/enum) or "data" (initializer)
    prefix = []  # code since the last ; { } at paren depth 0
    parens = 0
    inside = []
    for idx, m in enumerate(masked_lines):
        inside.append(bool(stack) and stack[-1] == "code")
        if idx in skip:
            continue
        for ch in m:
            if ch == "{":
                p = "".join(prefix).strip()
                if stack and stack[-1] == "code":
                    kind = "code"
                elif re.match(r"extern\b", p) and '"' in p:
                    kind = "scope"
                elif re.search(r"\b(class|struct|union|enum|namespace)\b", p) and "(" not in p:
                    kind = "scope"
                elif "(" in p or p == "":
                    kind = "code"
                else:
                    kind = "data"
                stack.append(kind)
                prefix, parens = [], 0
            elif ch == "}":
                if stack:
                    stack.pop()
                prefix, parens = [], 0
            elif ch == ";" and parens <= 0:
                prefix, parens = [], 0
            else:
                if ch == "(":
                    parens += 1
                elif ch == ")":
                    parens -= 1
                prefix.append(ch)
        prefix.append(" ")
    return inside


def tokens(m):
    """Operator and word tokens of a masked line: list of (column, text)."""
    out = []
    i, n = 0, len(m)
    while i < n:
        c = m[i]
        if c.isspace():
            i += 1
            continue
        if c.isalnum() or c == "_":
            j = i + 1
            extra = ".'" if c.isdigit() else ""
            while j < n and (m[j].isalnum() or m[j] == "_" or m[j] in extra):
                j += 1
            out.append((i, m[i:j]))
            i = j
            continue
        for op in OPS3 + OPS2:
            if m.startswith(op, i):
                out.append((i, op))
                i += len(op)
                break
        else:
            out.append((i, c))
            i += 1
    return out


TEMPLATE_STOP = {";", "{", "}", "&&", "||", "?", "=", "==", "!=", "<=", ">=", "+", "-", "/",
                 "%", "|", "^", "!", "~", "<<", "+=", "-=", "return"}


def template_brackets(toks):
    """Positions (token indexes) of < and > that are template brackets."""
    marked = set()
    for k, (col, t) in enumerate(toks):
        if t != "<" or k in marked:
            continue
        prev = toks[k - 1][1] if k > 0 else ""
        if not (prev == "template" or re.match(r"[A-Za-z_]\w*$", prev)):
            continue
        if prev in KEYWORDS - {"template"} and prev != "operator":
            continue
        depth, paren = 0, 0
        found = None
        for j in range(k, len(toks)):
            tt = toks[j][1]
            if tt == "<":
                depth += 1
            elif tt == ">":
                depth -= 1
            elif tt == ">>":
                depth -= 2
            elif tt == "(":
                paren += 1
            elif tt == ")":
                paren -= 1
                if paren < 0:
                    break
            elif tt in TEMPLATE_STOP:
                break
            if depth <= 0:
                found = j
                break
        if found is None:
            continue
        nxt = toks[found + 1][1] if found + 1 < len(toks) else ""
        if nxt and not (re.match(r"[A-Za-z_]\w*$", nxt) or nxt in ("(", "{", ")", ",", ";", "::", ">", ">>", "&", "*", "&&", "...", "[", "=")):
            continue
        for j in range(k, found + 1):
            if toks[j][1] in ("<", ">"):
                marked.add(j)
    return marked


# A preprocessing number (covers 1.5e-3, 0x1p4, 10ms), then whether it is an integer.
PP_NUMBER_RE = re.compile(r"(?<![\w.'])\.?[0-9](?:[eEpP][+-]|[\w.'])*")
INT_RE = re.compile(
    r"(0[xX][0-9a-fA-F]+(?:'[0-9a-fA-F]+)*|0[bB][01]+(?:'[01]+)*|[0-9]+(?:'[0-9]+)*)"
    r"([uU](?:ll|LL|l|L)?|(?:ll|LL|l|L)[uU]?)?")


def bump_literal(lit):
    body = lit.replace("'", "")
    if body[:2] in ("0x", "0X"):
        digits = body[2:]
        value = int(digits, 16) + 1
        new = format(value, "X" if any(ch in "ABCDEF" for ch in digits) else "x")
        return body[:2] + new.zfill(len(digits))
    if body[:2] in ("0b", "0B"):
        return body[:2] + format(int(body[2:], 2) + 1, "b")
    if len(body) > 1 and body[0] == "0":
        return "0" + format(int(body, 8) + 1, "o")
    return str(int(body) + 1)


def line_sites(orig, m):
    """Expression-level sites of one line: list of (column, operator, mutated line)."""
    sites = []
    toks = tokens(m)
    tmpl = template_brackets(toks)
    for k, (col, t) in enumerate(toks):
        before = m[:col].rstrip()
        if t in CMP_FLIP:
            if before.endswith("operator"):
                continue
            if t in ("<", ">"):
                if k in tmpl:
                    continue
                end = col + len(t)
                if col == 0 or not m[col - 1].isspace() or end >= len(m) or not m[end].isspace():
                    continue
            new = CMP_FLIP[t]
            sites.append((col, "cmp %s -> %s" % (t, new), orig[:col] + new + orig[col + len(t):]))
        elif t in LOGIC_FLIP:
            if before.endswith("operator"):
                continue
            end = col + 2
            if col == 0 or not m[col - 1].isspace() or end >= len(m) or not m[end].isspace():
                continue  # T&& x, auto&& are references
            new = LOGIC_FLIP[t]
            sites.append((col, "logic %s -> %s" % (t, new), orig[:col] + new + orig[end:]))
    for pp in PP_NUMBER_RE.finditer(m):
        mm = INT_RE.fullmatch(pp.group())
        if not mm:
            continue  # floating or user-defined literal
        lit = mm.group(1)
        new = bump_literal(lit)
        col = pp.start()
        sites.append((col, "const %s -> %s" % (lit, new), orig[:col] + new + orig[col + len(lit):]))
    return sites


CALLEE_RE = re.compile(r"(::)?[A-Za-z_]\w*(::~?[A-Za-z_]\w*)*")


def _balanced(s, i, open_ch, close_ch):
    """Index just past the bracket that closes s[i] (== open_ch), or -1."""
    depth = 0
    for j in range(i, len(s)):
        if s[j] == open_ch:
            depth += 1
        elif s[j] == close_ch:
            depth -= 1
            if depth == 0:
                return j + 1
    return -1


def is_call_statement(s):
    """Whether the stripped, masked statement s is exactly one call expression
    followed by ';' (a.b(c)->d(e); ns::f<T>(x); LOG(...);)."""
    mm = CALLEE_RE.match(s)
    if not mm:
        return False
    first = re.match(r"(::)?([A-Za-z_]\w*)", s).group(2)
    if first in KEYWORDS:
        return False
    i = mm.end()
    last_was_call = False
    calls = 0
    while i < len(s):
        c = s[i]
        if c == "<" and not last_was_call and s[i - 1] != " ":
            j = _balanced(s, i, "<", ">")
            if j < 0 or not re.fullmatch(r"<[\w:,\s*&<>]*>", s[i:j]):
                return False
            i, last_was_call = j, False
        elif c == "(":
            j = _balanced(s, i, "(", ")")
            if j < 0:
                return False
            i, last_was_call = j, True
            calls += 1
        elif c == "[":
            j = _balanced(s, i, "[", "]")
            if j < 0:
                return False
            i, last_was_call = j, False
        elif s.startswith(".", i) or s.startswith("->", i):
            i += 1 if c == "." else 2
            while i < len(s) and s[i] == " ":
                i += 1
            w = re.match(r"~?[A-Za-z_]\w*(::~?[A-Za-z_]\w*)*", s[i:])
            if not w:
                return False
            i, last_was_call = i + w.end(), False
        elif c == " ":
            i += 1
        elif c == ";":
            return last_was_call and calls > 0 and s[i + 1:].strip() == ""
        else:
            return False
    return False


LABEL_RE = re.compile(r"(case\b.*|default|public|private|protected|[A-Za-z_]\w*)\s*:$")


def statement_start(masked_lines, idx, skip):
    """Whether line idx starts a statement: the previous code line ended one."""
    j = idx - 1
    while j >= 0:
        if j in skip:
            return True
        s = masked_lines[j].strip()
        if s:
            break
        j -= 1
    if j < 0:
        return True
    if s[-1] in ";{}":
        return not re.search(r"\belse\s*$", s)
    if s.endswith(":") and not s.endswith("::"):
        return bool(LABEL_RE.match(s))
    return False


def file_sites(path, rel):
    """All candidate sites of one file as dicts."""
    text = path.read_text(encoding="utf-8", errors="surrogateescape")
    lines = text.split("\n")
    masked = mask_source(text).split("\n")
    skip = skipped_lines(masked)
    inside = code_scopes(masked, skip)
    out = []
    for idx, (orig, m) in enumerate(zip(lines, masked)):
        if idx in skip or not m.strip():
            continue
        for col, op, new in line_sites(orig, m):
            out.append({"file": rel, "line": idx + 1, "col": col, "op": op,
                        "original": orig, "mutated": new})
        s = m.strip()
        if (inside[idx] and s.endswith(";") and is_call_statement(s)
                and statement_start(masked, idx, skip)):
            col = len(m) - len(m.lstrip())
            out.append({"file": rel, "line": idx + 1, "col": col, "op": "del call",
                        "original": orig, "mutated": ""})
    return out


def library_files(tree):
    files = []
    for d in LIB_DIRS:
        base = tree / d
        if base.is_dir():
            files += [p for p in base.rglob("*") if p.is_file() and p.suffix in SUFFIXES]
    return sorted(files, key=lambda p: p.relative_to(tree).as_posix())


def all_sites(tree):
    sites = []
    for p in library_files(tree):
        sites += file_sites(p, p.relative_to(tree).as_posix())
    sites.sort(key=lambda s: (s["file"], s["line"], s["col"], s["op"]))
    return sites


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

    tree = (args.tree or Path(__file__).resolve().parent.parent).resolve()
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


if __name__ == "__main__":
    sys.exit(main())
