#!/bin/sh
# Writes the part of soundmeter's manual page that help2man cannot see: help2man reads
# only the top-level --help, so this puts each subcommand's own --help into a help2man
# include file, one section per subcommand.
#   scripts/man-commands.sh PROGRAM OUTPUT
# The subcommands are the ones the top-level --help lists, so a new subcommand gets its
# section without a change here. Options and the footer that every subcommand repeats
# from the top level are left out: the page shows them once, under OPTIONS.
set -eu

if [ $# -ne 2 ]; then
  echo "usage: $0 PROGRAM OUTPUT" >&2
  exit 2
fi
program=$1
output=$2

top=$("$program" --help) || {
  echo "$0: $program --help failed" >&2
  exit 1
}
commands=$(printf '%s\n' "$top" | awk '
  /^Subcommands:$/ { on = 1; next }
  on && /^  [^ ]/ { print $1; next }
  on { exit }')
if [ -z "$commands" ]; then
  echo "$0: $program --help lists no subcommands" >&2
  exit 1
fi

# CLI11's help: a description, "Usage: ...", then groups ("Options:") of entries: a name
# indented by two spaces, its text after a gap of two or more spaces or on indented lines
# below; text after the last group is the footer.
parse='
function roff(s) {
  gsub(/\\/, "\\\\e", s)
  gsub(/-/, "\\\\-", s)
  if (s ~ /^[.'\'']/) s = "\\&" s
  return s
}
function trim(s) { sub(/^ +/, "", s); sub(/ +$/, "", s); return s }
# Splits the pending entry into name and text, and keeps or writes it.
function flush(   n, line, name, text, first, flags, rest, m, i, out) {
  if (entry == "") return
  n = split(entry, line, "\n")
  line[1] = substr(line[1], 3)
  text = ""
  if (match(line[1], /   */)) {
    name = substr(line[1], 1, RSTART - 1)
    text = trim(substr(line[1], RSTART))
  } else {
    name = line[1]
  }
  for (i = 2; i <= n; ++i) text = text (text == "" ? "" : "\n") trim(line[i])
  entry = ""
  if (collect) { known[name SUBSEP text] = 1; return }
  if ((name SUBSEP text) in known) return
  # The flags in bold, what they take in roman.
  first = name; rest = ""
  if (match(name, / /)) { first = substr(name, 1, RSTART - 1); rest = substr(name, RSTART) }
  m = split(first, flags, ",")
  out = ""
  for (i = 1; i <= m; ++i) out = out (i > 1 ? ", " : "") "\\fB" roff(flags[i]) "\\fR"
  print ".TP"
  print out roff(rest)
  m = split(text, line, "\n")
  for (i = 1; i <= m; ++i) print roff(line[i])
}
BEGIN {
  collect = 1
  n = split(ENVIRON["KORVO_TOP_HELP"], top, "\n")
  for (t = 1; t <= n; ++t) {
    s = top[t]
    if (s ~ /^  [^ ]/) { flush(); entry = s; continue }
    if (s ~ /^   / && entry != "") { entry = entry "\n" s; continue }
    flush()
    if (s != "") known[s] = 1
  }
  flush()
  collect = 0
  state = "description"
}
/^Usage: / {
  usage = roff(substr($0, 8))
  gsub(/"/, "\\\\(dq", usage)
  print ".SS \"" usage "\""
  if (description != "") print description
  state = "groups"
  next
}
state == "description" { description = description (description == "" ? "" : "\n") roff($0); next }
/^  [^ ]/ { flush(); entry = $0; paragraph = 0; next }
/^   / && entry != "" { entry = entry "\n" $0; next }
{ flush() }
/^[A-Z][A-Za-z ]*:$/ || /^$/ || ($0 in known) { paragraph = 0; next }
# Text of its own after the groups: a footer the top level does not have.
{
  if (!paragraph) print ".PP"
  paragraph = 1
  print roff($0)
}
END { flush() }
'

# The section, on standard output.
write_commands() {
  echo "[COMMANDS]"
  echo "Every command takes the options above as well, and"
  echo ".B \"soundmeter COMMAND \\-\\-help\""
  echo "prints its own part of this page."
  for command in $commands; do
    help=$("$program" "$command" --help) || {
      echo "$0: $program $command --help failed" >&2
      return 1
    }
    printf '%s\n' "$help" | KORVO_TOP_HELP="$top" awk "$parse" || return 1
  done
}

# Written aside and moved into place, so that a failed run leaves no half a section.
tmp="$output.tmp"
if ! write_commands > "$tmp"; then
  rm -f "$tmp"
  exit 1
fi
mv "$tmp" "$output"
