#!/bin/sh
# The test shell end to end: usbadapter-sim plays the sample test-shell session,
# whose records its host side decodes and checks (shell-expect), then hands the
# print channel to the host tool usbadapter-shell as a pseudo-terminal.
# usage: maa_shell.sh USBADAPTER-SIM USBADAPTER-SHELL
set -u
sim=$1
tool=$2
dir=$(mktemp -d /tmp/usbadapter-e2e-maa-XXXXXX)
fail() {
    echo "FAIL: $*"
    echo "(files kept in $dir)"
    exit 1
}
# Waits (bounded) for the simulator's pseudo-terminal link; $1 names the step.
await_pty() {
    i=0
    while [ ! -L "$dir/prn" ]; do
        i=$((i + 1))
        [ $i -lt 400 ] || fail "the simulator made no pseudo-terminal${1:+ ($1)}"
        sleep 0.05
    done
}

# The sample session: a path downloaded with its last letter wrong, corrected
# by an assignment through a pointer into the download buffer, then dumped; the
# symbol dump; after the stop the print reader has the channel back.
script=$(dirname "$0")/../../tools/sim/samples/shell.sim
"$sim" --out "$dir/out" --timeout 8000 --script "$script" >"$dir/sim.txt" 2>&1
status=$?
cat "$dir/sim.txt"
[ $status -eq 0 ] || fail "scripted session: exit status $status"
grep -q '"event":"shell-put","bytes":38,' "$dir/out/session.jsonl" || fail "no download in the journal"
[ "$(grep -c '"event":"shell-record"' "$dir/out/session.jsonl")" -eq 46 ] || fail "not 46 records in the journal"

# The host tool on the simulator's print channel: plain open/read/write.
"$sim" --out "$dir/out2" --timeout 8000 -e "pty prn $dir/prn" -e "expect-jobs 0" >"$dir/sim2.txt" 2>&1 &
pid=$!
await_pty
"$tool" -w 300 -e 'Dump_File("/halvard/sys/statusinfo/usb_speed.txt")' -e 'Dump_File("/nothing")' "$dir/prn" \
    >"$dir/tool.txt" 2>&1
status=$?
wait $pid
simStatus=$?
cat "$dir/tool.txt" "$dir/sim2.txt"
[ $status -eq 0 ] || fail "usbadapter-shell: exit status $status"
[ $simStatus -eq 0 ] || fail "simulator with the host tool: exit status $simStatus"
printf '%s\n' "| HIGH" "= result 1: File Read Complete : /halvard/sys/statusinfo/usb_speed.txt" \
    "= result 0: File Open Error /nothing" >"$dir/want.txt"
cmp -s "$dir/tool.txt" "$dir/want.txt" || fail "usbadapter-shell printed something else"
grep -q '"event":"pty-end","to-device":' "$dir/out2/session.jsonl" || fail "no pty-end in the journal"

# An auto session with blank lines: the tool drops them (the device's run would
# end at the first) and says so; both dumps run after the stop, silently, as the
# library's log shows.
printf '%s\n' 'Dump_File("/halvard/sys/statusinfo/usb_speed.txt")' '' ' ' \
    'Dump_File("/halvard/sys/statusinfo/usb_speed.txt")' >"$dir/auto.txt"
USBADAPTER_LOG_LEVEL=INFO "$sim" --out "$dir/out3" --timeout 8000 -e "pty prn $dir/prn" -e "expect-jobs 0" \
    >"$dir/sim3.txt" 2>&1 &
pid=$!
await_pty "auto session"
"$tool" --auto -s "$dir/auto.txt" "$dir/prn" >"$dir/auto-out.txt" 2>"$dir/auto-err.txt"
status=$?
wait $pid
simStatus=$?
cat "$dir/auto-out.txt" "$dir/auto-err.txt" "$dir/sim3.txt"
[ $status -eq 0 ] || fail "usbadapter-shell --auto: exit status $status"
[ $simStatus -eq 0 ] || fail "simulator with the auto session: exit status $simStatus"
[ ! -s "$dir/auto-out.txt" ] || fail "usbadapter-shell --auto printed records"
grep -qx "usbadapter-shell: 2 blank lines dropped from the auto script (the device's auto run would stop there)" \
    "$dir/auto-err.txt" || fail "no note of the dropped blank lines"
dumps=$(grep -c "File Dump Start" "$dir/out3/usbadapter.log")
[ "$dumps" -eq 2 ] || fail "the auto run dumped $dumps times, not 2"

# A factory script with one test function of each family (simulated drivers,
# UI server and Java service); the host side decodes every record.
factory=$(dirname "$0")/../../tools/sim/samples/factory.sim
"$sim" --out "$dir/out4" --timeout 8000 --script "$factory" >"$dir/sim4.txt" 2>&1
status=$?
cat "$dir/sim4.txt"
[ $status -eq 0 ] || fail "factory session: exit status $status"
grep -q '"method":"runUsbFunctionCall","arg":"Pattern_Print(1,2)"' "$dir/out4/journal.jsonl" ||
    fail "the forwarded family did not reach the Java service"
grep -q '"method":"maaEngMaaStrNormalTest","arg":"Get_TonerSensorStatus(1)"' "$dir/out4/journal.jsonl" ||
    fail "the engine interface did not reach the Java service"
grep -q '^echo start > .*/proc/cpufantest$' "$dir/out4/commands.log" || fail "the fan test's command was not recorded"

# The host tool lists the vocabulary on the simulator's print channel.
"$sim" --out "$dir/out5" --timeout 8000 -e "pty prn $dir/prn" -e "expect-jobs 0" >"$dir/sim5.txt" 2>&1 &
pid=$!
await_pty "symbol dump"
"$tool" -w 300 -e 'MAA_SymbolDump()' "$dir/prn" >"$dir/tool5.txt" 2>&1
status=$?
wait $pid
cat "$dir/tool5.txt"
[ $status -eq 0 ] || fail "usbadapter-shell (symbol dump): exit status $status"
[ "$(grep -c '^|    ' "$dir/tool5.txt")" -eq 38 ] || fail "the dump did not list 38 names"
grep -q "The Number Of Symbol : 38" "$dir/tool5.txt" || fail "the dump did not count 38 names"

rm -rf "$dir"
echo "PASS"
