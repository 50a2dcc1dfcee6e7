#!/bin/sh
# Fails when libusbadapter.so defines a dynamic symbol outside its ABI: the JNI
# entries and the entries other platform components call.
# usage: check_exports.sh NM LIBRARY
nm_tool=$1 lib=$2
syms=$("$nm_tool" -D --defined-only "$lib" | awk '{print $NF}') || exit 1
[ -n "$syms" ] || { echo "no exported symbols in $lib"; exit 1; }
extra=$(printf '%s\n' "$syms" | grep -vE '^(Java_com_tarnwel_vbk_[A-Za-z0-9_]+|JNI_OnLoad|MAA_CompEntry|USB_SetSerialNumber|USB_SetSnNoPowerOff|WriteSerialString|MAAMfpDevSetDesc)$')
if [ -n "$extra" ]; then
  echo "unexpected exports:"; printf '  %s\n' $extra; exit 1
fi
printf '%s\n' "$syms"
