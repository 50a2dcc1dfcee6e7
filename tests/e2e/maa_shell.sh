#!/bin/bash
# The test shell end to end: usbadapter-sim plays the sample test-shell session,
# whose records its host side decodes and checks (shell-expect), then hands the
# print channel to the host tool usbadapter-shell as a pseudo-terminal.
# usage: maa_shell.sh USBADAPTER-SIM USBADAPTER-SHELL
sim=$1
tool=$2
name=maa
. "$(dirname "$0")/common.sh"
samples=$(dirname "$0")/../../tools/sim/samples
# run_sample NAME OUT: a sample session; it must pass.
run_sample() {
    sim_bg "$2" --script "$samples/$1.sim"
    reap "$2"
}
# with_tool OUT ARGS...: the host tool with ARGS on a simulator's pseudo-terminal
# (tool output in OUT.tool); both must end with status 0.
with_tool() {
    local out=$1
    shift
    sim_bg "$out" -e "pty prn $dir/prn" -e "expect-jobs 0"
    until_link "$dir/prn" "pseudo-terminal"
    "$tool" "$@" "$dir/prn" >"$out.tool" 2>"$out.err"
    local status=$?
    cat "$out.tool" "$out.err"
    [ $status -eq 0 ] || fail "usbadapter-shell $*: exit status $status"
    reap "$out"
}

# The sample session: a path downloaded with its last letter wrong, corrected
# by an assignment through a pointer into the download buffer, then dumped; the
# symbol dump; after the stop the print reader has the channel back.
run_sample shell "$dir/out"
grep -q '"event":"shell-put","bytes":38,' "$dir/out/session.jsonl" || fail "no download in the journal"
[ "$(grep -c '"event":"shell-record"' "$dir/out/session.jsonl")" -eq 46 ] || fail "not 46 records in the journal"

# The host tool on the simulator's print channel: plain open/read/write.
with_tool "$dir/out2" -w 300 -e 'Dump_File("/halvard/sys/statusinfo/usb_speed.txt")' -e 'Dump_File("/nothing")'
printf '%s\n' "| HIGH" "= result 1: File Read Complete : /halvard/sys/statusinfo/usb_speed.txt" \
    "= result 0: File Open Error /nothing" | cmp -s "$dir/out2.tool" - || fail "usbadapter-shell printed something else"
[ ! -s "$dir/out2.err" ] || fail "usbadapter-shell complained"
grep -q '"event":"pty-end","to-device":' "$dir/out2/session.jsonl" || fail "no pty-end in the journal"

# An auto session with blank lines: the tool drops them (the device's run would
# end at the first) and says so; both dumps run after the stop, silently, as the
# library's log shows.
printf '%s\n' 'Dump_File("/halvard/sys/statusinfo/usb_speed.txt")' '' ' ' \
    'Dump_File("/halvard/sys/statusinfo/usb_speed.txt")' >"$dir/auto.txt"
USBADAPTER_LOG_LEVEL=INFO with_tool "$dir/out3" --auto -s "$dir/auto.txt"
[ ! -s "$dir/out3.tool" ] || fail "usbadapter-shell --auto printed records"
grep -qx "usbadapter-shell: 2 blank lines dropped from the auto script (the device's auto run would stop there)" \
    "$dir/out3.err" || fail "no note of the dropped blank lines"
dumps=$(grep -c "File Dump Start" "$dir/out3/usbadapter.log")
[ "$dumps" -eq 2 ] || fail "the auto run dumped $dumps times, not 2"

# A factory script with one test function of each family (simulated drivers,
# UI server and Java service); the host side decodes every record.
run_sample factory "$dir/out4"
grep -q '"method":"runUsbFunctionCall","arg":"Pattern_Print(1,2)"' "$dir/out4/journal.jsonl" ||
    fail "the forwarded family did not reach the Java service"
grep -q '"method":"maaEngMaaStrNormalTest","arg":"Get_TonerSensorStatus(1)"' "$dir/out4/journal.jsonl" ||
    fail "the engine interface did not reach the Java service"
grep -q '^echo start > .*/proc/cpufantest$' "$dir/out4/commands.log" || fail "the fan test's command was not recorded"

# The host tool lists the vocabulary on the simulator's print channel.
with_tool "$dir/out5" -w 300 -e 'MAA_SymbolDump()'
[ "$(grep -c '^|    ' "$dir/out5.tool")" -eq 38 ] || fail "the dump did not list 38 names"
grep -q "The Number Of Symbol : 38" "$dir/out5.tool" || fail "the dump did not count 38 names"
pass
