#!/usr/bin/env bash
# Builds the library, the simulator and the host tool usbadapter-shell, then
# plays a host session: the library inside a JVM with the reference print
# service, on virtual devices.
#   scripts/run.sh                 the sample session (tools/sim/samples/session.sim)
#   scripts/run.sh ARGS...         usbadapter-sim with these arguments (files, -s, -e, ...)
#   scripts/run.sh serve           the simulated printer for host software, until Ctrl-C
set -euo pipefail
cd "$(dirname "$0")/.."
cmake --preset default >/dev/null
cmake --build --preset default --target usbadapter usbadapter-sim usbadapter-shell >/dev/null
echo "== exported entries of libusbadapter.so"
nm -D --defined-only build/default/src/libusbadapter.so | awk '{print "  " $3}'
out=build/default/sim-out
args=("$@")
((${#args[@]})) || args=(--script tools/sim/samples/session.sim)
echo "== usbadapter-sim ${args[*]}"
status=0
if [ "${args[0]}" = serve ]; then
  build/default/tools/sim/usbadapter-sim serve --out "$out" "${args[@]:1}" || status=$?
else
  build/default/tools/sim/usbadapter-sim --out "$out" "${args[@]}" || status=$?
fi
echo "== session journal ($out/session.jsonl)"
cat "$out/session.jsonl"
[ "${args[0]}" = serve ] ||
  echo "== for host software (CUPS, usbadapter-shell): scripts/run.sh serve  (print channel at $out/prn)"
exit "$status"
