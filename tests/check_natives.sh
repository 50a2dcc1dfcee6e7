#!/bin/sh
# Fails when a native method declared in a Java class is not exported by
# libusbadapter.so under its JNI name (so Java would throw UnsatisfiedLinkError).
# usage: check_natives.sh NM LIBRARY JAVA_SOURCE_ROOT
nm_tool=$1 lib=$2 root=$3
syms=$("$nm_tool" -D --defined-only "$lib" | awk '{print $NF}') || exit 1
missing=0 count=0
for f in $(find "$root" -name '*.java'); do
  cls=$(printf '%s' "${f#$root/}" | sed 's/\.java$//; s|/|_|g')
  for m in $(sed -n 's/.*[[:space:]]native[[:space:]].*[[:space:]]\([A-Za-z0-9]*\)(.*/\1/p' "$f"); do
    count=$((count + 1))
    sym="Java_${cls}_${m}"
    if ! printf '%s\n' "$syms" | grep -qx "$sym"; then
      echo "not exported: $sym"; missing=1
    fi
  done
done
[ "$count" -gt 0 ] || { echo "no native methods found under $root"; exit 1; }
echo "$count native methods checked"
exit $missing
