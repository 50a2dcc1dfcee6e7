#!/usr/bin/env bash
# Builds the library and plays a session on the virtual devices.
set -euo pipefail
cd "$(dirname "$0")/.."
cmake --preset default >/dev/null
cmake --build --preset default --target usbadapter usbadapter-bridge-demo >/dev/null
echo "== exported entries of libusbadapter.so"
nm -D --defined-only build/default/src/libusbadapter.so | awk '{print "  " $3}'
echo "== bridge session on the virtual devices"
USBADAPTER_LOG_LEVEL=${USBADAPTER_LOG_LEVEL:-OFF} build/default/tools/sim/usbadapter-bridge-demo
