#!/bin/sh
# Installs a build into a staging prefix, checks the installed library (SONAME,
# unversioned name for Java, exports) and builds the consumer against the
# staged package alone. Host builds run it (a real call into the library);
# cross builds check its machine and, given an emulator, let the loader bind it.
# usage: check_install.sh BUILD STAGE CONSUMER NM CHECK_EXPORTS VERSION
#        WINDOW_DATA_SIZE DEV_ID_MAX_SIZE GENERATOR HAS_JAR [TOOLCHAIN MACHINE [EMULATOR...]]
set -eu
build=$1 stage=$2 consumer=$3 nm_tool=$4 check_exports=$5 version=$6 window=$7 devid=$8 generator=$9
has_jar=${10}
shift 10
toolchain=${1:-} machine=${2:-}
[ $# -ge 2 ] && shift 2 || shift $#
emulator=$*  # word-split when run: no blanks in its arguments
fail() { echo "FAIL: $*" >&2; exit 1; }

rm -rf "$stage"
prefix=$stage/usr
cmake --install "$build" --prefix "$prefix" >"$stage.install.log" 2>&1 || { cat "$stage.install.log"; fail "install"; }

lib=$(find "$prefix" -name "libusbadapter.so.$version" -type f)
[ -n "$lib" ] || fail "no libusbadapter.so.$version under $prefix"
libdir=$(dirname "$lib")
soname=$(readelf -d "$lib" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')
[ "$soname" = "libusbadapter.so.${version%%.*}" ] || fail "SONAME '$soname'"
[ "$(readlink -f "$libdir/libusbadapter.so")" = "$(readlink -f "$lib")" ] || fail "no libusbadapter.so for System.loadLibrary"
sh "$check_exports" "$nm_tool" "$lib" >/dev/null || { sh "$check_exports" "$nm_tool" "$lib"; fail "exports"; }

set -- -DCMAKE_BUILD_TYPE=Release -DEXPECT_VERSION="$version" \
  -DEXPECT_WINDOW_DATA_SIZE="$window" -DEXPECT_DEV_ID_MAX_SIZE="$devid" -DEXPECT_JAR="$has_jar"
if [ -n "$toolchain" ]; then
  # A cross tool chain re-roots search prefixes into its sysroot: name the package directly.
  set -- "$@" -DCMAKE_TOOLCHAIN_FILE="$toolchain" -Dusbadapter_DIR="$libdir/cmake/usbadapter"
else
  set -- "$@" -DCMAKE_PREFIX_PATH="$prefix"
fi
cmake -S "$consumer" -B "$stage/consumer" -G "$generator" "$@" >"$stage.consumer.log" 2>&1 &&
  cmake --build "$stage/consumer" >>"$stage.consumer.log" 2>&1 || { cat "$stage.consumer.log"; fail "consumer build"; }
exe=$stage/consumer/consumer

machine_of() { readelf -h "$1" | sed -n 's/^ *Machine: *//p'; }
[ "$(machine_of "$exe")" = "$(machine_of "$lib")" ] || fail "consumer is $(machine_of "$exe"), library $(machine_of "$lib")"

if [ -z "$toolchain" ]; then
  root=$stage/root
  mkdir -p "$root/halvard/sys/statusinfo"
  USBADAPTER_ROOT=$root USBADAPTER_LOG_LEVEL=OFF "$exe" write-serial SN42xyz || fail "consumer run"
  report=$root/halvard/sys/statusinfo/usb_version.txt
  [ -f "$report" ] || fail "no report file written"
  case $(cat "$report") in "SN42	"?*) ;; *) fail "report file: '$(cat "$report")'" ;; esac
else
  [ "$(machine_of "$exe")" = "$machine" ] || fail "consumer is $(machine_of "$exe"), not $machine"
  if [ -n "$emulator" ]; then $emulator "$exe" resolve || fail "consumer under $emulator"; fi
fi
echo "installed $lib ($soname); consumer $(machine_of "$exe") ok"
