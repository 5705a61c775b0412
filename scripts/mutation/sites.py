"""Reading C++ source and finding the sites of one-line faults in the library's folders."""

import re

LIB_DIRS = ("interface", "common", "meter", "capture", "analysis", "detection", "tone")
SUFFIXES = (".cpp", ".h")

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
