#!/usr/bin/env bash
# The installed package, end to end: installs the build into a fresh prefix, checks what
# landed where, builds the example host (examples/embed) against the prefix with
# find_package and with pkg-config alone and runs it, runs the installed soundmeter, and
# renders the manual page. Each failing check prints one line naming it.
#   tests/package/check-install.sh SOURCE_DIR BUILD_DIR SANITIZE CXX_COMPILER
# SANITIZE is the build's KORVO_SANITIZE (may be empty): the installed plug-in is
# instrumented with it, so the example is built with the same sanitizers and compiler.
set -uo pipefail

if [ $# -ne 4 ]; then
  echo "usage: $0 SOURCE_DIR BUILD_DIR SANITIZE CXX_COMPILER" >&2
  exit 2
fi
src=$1
build=$2
sanitize=$3
cxx=$4

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
trap 'exit 1' INT TERM
work=$(realpath "$work")  # paths are compared in their canonical form
prefix=$work/prefix
rooms=/dev/shm/korvo-$(id -u)

failures=0
fail() {
  echo "FAIL: $*"
  failures=$((failures + 1))
}
# Shows a step's output, for the failure line that follows.
show() { sed 's/^/    /' "$1"; }

flags=(-O1 -g -Werror)
if [ -n "$sanitize" ]; then
  flags+=("-fsanitize=$sanitize" -fno-omit-frame-pointer -fno-sanitize-recover=all)
  # The interface's type information stays inside the plug-in, out of reach of UBSan's
  # check of virtual calls (the soundmeter command is built the same way).
  if [[ $sanitize == *undefined* ]]; then flags+=(-fno-sanitize=vptr); fi
fi

# ---- install and layout ----------------------------------------------------------
if ! cmake --install "$build" --prefix "$prefix" > "$work/install.log" 2>&1; then
  show "$work/install.log"
  echo "FAIL: install: cmake --install $build --prefix $prefix failed"
  exit 1
fi
for file in lib/libkorvo_soundmeter.so lib/libkorvo_platform.so bin/soundmeter \
  include/korvo_soundmeter/SoundMeter_vir.h include/korvo_soundmeter/Export.h \
  include/korvo_soundmeter/system/audio.h include/korvo_soundmeter/SoundMeterConstants.h include/korvo_soundmeter/FrameRecord.h \
  lib/pkgconfig/korvo_soundmeter.pc \
  lib/cmake/korvo_soundmeter/korvo_soundmeterConfig.cmake \
  lib/cmake/korvo_soundmeter/korvo_soundmeterConfigVersion.cmake \
  share/doc/korvo_soundmeter/README.md share/man/man1/soundmeter.1; do
  [ -f "$prefix/$file" ] || fail "layout: $file not installed"
done
[ -x "$prefix/bin/soundmeter" ] || fail "layout: bin/soundmeter is not executable"

# RUNPATH and RPATH entries of an ELF file, one line.
search_path() { readelf -d "$1" 2>/dev/null | sed -n 's/.*(R\(UN\)\{0,1\}PATH).*\[\(.*\)\]/\2/p' | tr '\n' ' '; }
expect_runpath() {
  local got
  got=$(search_path "$prefix/$1")
  [ "$got" = "$2 " ] || fail "runpath: $1 has '${got% }', expected '$2'"
}
expect_runpath lib/libkorvo_soundmeter.so '$ORIGIN'
expect_runpath lib/libkorvo_platform.so '$ORIGIN'
expect_runpath bin/soundmeter '$ORIGIN/../lib'
while IFS= read -r -d '' file; do
  readelf -h "$file" > /dev/null 2>&1 || continue
  case $(search_path "$file") in
    *"$build"* | *"$src"*) fail "runpath: ${file#"$prefix"/} points into the build tree: $(search_path "$file")" ;;
  esac
done < <(find "$prefix" -type f -print0)

# ---- the example host --------------------------------------------------------------
plugin=$(realpath "$prefix/lib/libkorvo_soundmeter.so")

# Runs the example built at $2; $1 names the build in the failure lines.
run_example() {
  local name=$1 program=$2 log=$work/$1.log room
  if ! timeout 120 "$program" > "$log" 2>&1; then
    show "$log"
    fail "$name: the example's exchange failed"
    return
  fi
  grep -q "^embed: exchange complete" "$log" || { show "$log"; fail "$name: the example did not report the exchange"; }
  # The plug-in path it was built with is the installed one.
  local used
  used=$(sed -n 's/^embed: room [^,]*, plug-in //p' "$log")
  [ -n "$used" ] && [ "$(realpath -m "$used")" = "$plugin" ] ||
    fail "$name: the example loads '$used', not the installed plug-in $plugin"
  room=$(sed -n 's/^embed: room \([^,]*\),.*/\1/p' "$log")
  [ -z "$room" ] || [ ! -e "$rooms/$room" ] || fail "$name: the example left its room $rooms/$room behind"
}

# With find_package, in a build folder of its own.
if cmake -S "$src/examples/embed" -B "$work/embed-cmake" -DCMAKE_PREFIX_PATH="$prefix" \
  -DCMAKE_CXX_COMPILER="$cxx" -DCMAKE_CXX_FLAGS="${flags[*]}" > "$work/cmake.log" 2>&1 &&
  cmake --build "$work/embed-cmake" >> "$work/cmake.log" 2>&1; then
  # Loaded with dlopen after the fork only: the plug-in is not among the program's needs.
  if readelf -d "$work/embed-cmake/embed" | grep -q "NEEDED.*libkorvo_soundmeter"; then
    fail "find_package: the example links the plug-in at start-up"
  fi
  run_example find_package "$work/embed-cmake/embed"
else
  show "$work/cmake.log"
  fail "find_package: the example does not configure or build against $prefix"
fi

# With pkg-config alone, through the example's Makefile.
export PKG_CONFIG_PATH=$prefix/lib/pkgconfig
mkdir "$work/embed-pc"
if [ "$(realpath -m "$(pkg-config --variable=plugin korvo_soundmeter)")" != "$plugin" ]; then
  fail "pkg-config: the plugin variable is '$(pkg-config --variable=plugin korvo_soundmeter)', not $plugin"
fi
if make -s -C "$work/embed-pc" -f "$src/examples/embed/Makefile" CXX="$cxx" CXXFLAGS="${flags[*]}" \
  > "$work/pc.log" 2>&1; then
  run_example pkg-config "$work/embed-pc/embed"
else
  show "$work/pc.log"
  fail "pkg-config: the example does not build with pkg-config's flags"
fi

# ---- the installed command ---------------------------------------------------------
# The dynamic loader's own record of what it loaded shows where the plug-in and the
# stand-in came from, in the command and in the device processes the demo starts.
if ! env -u KORVO_PLUGIN LD_DEBUG=files LD_DEBUG_OUTPUT="$work/ld" timeout 120 \
  "$prefix/bin/soundmeter" -q demo --rounds 1 > "$work/demo.log" 2>&1; then
  show "$work/demo.log"
  fail "installed command: soundmeter demo --rounds 1 failed"
fi
loaded=$(cat "$work"/ld.* 2> /dev/null | sed -n 's/.*calling init: \(.*libkorvo_[a-z]*\.so\)$/\1/p' |
  xargs -r realpath -m | sort -u)
grep -qx "$prefix/lib/libkorvo_soundmeter.so" <<< "$loaded" ||
  fail "installed command: the plug-in was not loaded from $prefix/lib"
while IFS= read -r library; do
  [ -z "$library" ] || [ "$(dirname "$library")" = "$prefix/lib" ] ||
    fail "installed command: loaded $library instead of the installed one"
done <<< "$loaded"

# ---- the manual page ---------------------------------------------------------------
if MANWIDTH=80 man --warnings -l -P cat "$prefix/share/man/man1/soundmeter.1" > "$work/man.txt" 2> "$work/man.err"; then
  [ ! -s "$work/man.err" ] || { show "$work/man.err"; fail "manual page: man warns about the page"; }
  grep -q "soundmeter - " "$work/man.txt" || fail "manual page: no NAME line"
  commands=$("$prefix/bin/soundmeter" --help | awk '/^Subcommands:$/ {on = 1; next} on && /^  [^ ]/ {print $1; next} on {exit}')
  [ -n "$commands" ] || fail "manual page: soundmeter --help lists no subcommands"
  for command in $commands; do
    grep -q "^   soundmeter $command\b" "$work/man.txt" || fail "manual page: no section for soundmeter $command"
  done
else
  show "$work/man.err"
  fail "manual page: man -l cannot render share/man/man1/soundmeter.1"
fi

# ---- a moved prefix ----------------------------------------------------------------
# Both packages find the prefix from their own place: a moved tree still works.
moved=$work/moved
mv "$prefix" "$moved"
moved_plugin=$(realpath "$moved/lib/libkorvo_soundmeter.so")
got=$(PKG_CONFIG_PATH=$moved/lib/pkgconfig pkg-config --variable=plugin korvo_soundmeter)
[ "$(realpath -m "$got")" = "$moved_plugin" ] || fail "moved prefix: pkg-config gives '$got', not $moved_plugin"
# The example's cache still names the old package folder: forget it and look again.
if [ -d "$work/embed-cmake" ] && cmake -U korvo_soundmeter_DIR -DCMAKE_PREFIX_PATH="$moved" "$work/embed-cmake" > "$work/moved.log" 2>&1; then
  grep -rqF "KORVO_SOUNDMETER_PLUGIN=\\\"$moved_plugin\\\"" "$work/embed-cmake" ||
    fail "moved prefix: find_package does not give the moved plug-in's path"
else
  show "$work/moved.log" 2> /dev/null
  fail "moved prefix: find_package does not find the moved prefix"
fi

if [ "$failures" -ne 0 ]; then
  echo "$failures check(s) failed"
  exit 1
fi
echo "package checks passed"
