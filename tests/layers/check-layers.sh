#!/usr/bin/env bash
# The host's layers, lowest first: a file includes only its own layer and those below it.
# The library's folders never include the host, and hearing (the pure decoding core)
# reaches nothing but the interface's constants.
set -u
cd "$1" || exit 2
layers=(base hearing output core picture commands)
rank() { local i; for i in "${!layers[@]}"; do [ "${layers[$i]}" = "$1" ] && echo "$i" && return; done; echo 99; }
bad=0
for dir in "${layers[@]}"; do
  own=$(rank "$dir")
  while IFS= read -r hit; do
    file=${hit%%:*}
    used=$(sed -E 's|.*#include "host/([a-z]+)/.*|\1|' <<<"$hit")
    if [ "$(rank "$used")" -gt "$own" ]; then
      echo "FAIL: $file includes host/$used (above $dir)"
      bad=1
    fi
  done < <(grep -rn '#include "host/[a-z]*/' "host/$dir" || true)
done
for lib in interface meter capture analysis detection tone platform; do
  if grep -rln '#include "host/' "$lib" >/dev/null 2>&1; then
    echo "FAIL: $lib includes the host"
    bad=1
  fi
done
if grep -rhn '#include' host/hearing | grep -vE '#include (<|"host/hearing/|"interface/SoundMeterConstants.h"|"interface/SoundMeter_vir.h")' ; then
  echo "FAIL: the hearing core includes more than the interface"
  bad=1
fi
[ $bad -eq 0 ] && echo "layers: every include points down"
exit $bad
