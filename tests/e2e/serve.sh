#!/bin/bash
# Serve mode: the print channel's path survives 100 host open/close cycles with
# a job in each, every job delivered byte-exact and in order; SIGTERM during a
# job ends the session cleanly with the job and the end in the journal.
# usage: serve.sh USBADAPTER-SIM
sim=$1
name=serve
. "$(dirname "$0")/common.sh"

# 100 jobs, one per open/close, back to back: UEL-framed, so each is a job of
# its own even when a re-open comes before the simulator has seen the close.
serve "$dir/a"
for i in $(seq 1 100); do
    printf '\033%%-12345X@PJL JOB NAME="%d"\r\n%0*d\033%%-12345X' "$i" "$i" "$i" >"$dir/want-$i.prn"
    cat "$dir/want-$i.prn" >"$dir/a/prn" || fail "cycle $i: cannot write $dir/a/prn"
done
until_lines 100 '"event":"job-end"' "$dir/a/journal.jsonl"
stop "$dir/a"
[ ! -e "$dir/a/prn" ] || fail "the print path outlived the session"
for i in $(seq 1 100); do
    cmp -s "$dir/want-$i.prn" "$dir/a/$(printf 'job-%03d.prn' "$i")" || fail "job $i differs from cycle $i"
done
[ "$(grep -c '"event":"job-end"' "$dir/a/journal.jsonl")" -eq 100 ] || fail "not 100 jobs"

# Unframed jobs (no ESC: no command selector inside) with a pause between
# them: each close ends its job.
serve "$dir/b"
for i in 1 2 3; do
    head -c $((i * 70000)) /dev/urandom | tr -d '\033' >"$dir/raw-$i"
    cat "$dir/raw-$i" >"$dir/b/prn"
    until_lines "$i" '"event":"job-end"' "$dir/b/journal.jsonl"
done
# A host that stops in the middle of a job, then SIGTERM.
head -c 5000 /dev/urandom | tr -d '\033' >"$dir/raw-4"
exec 3>"$dir/b/prn"
cat "$dir/raw-4" >&3
until_lines 1 '"event":"job-start","job":4' "$dir/b/journal.jsonl"
root=$(sed -n 's/.*"event":"start","root":"\([^"]*\)".*/\1/p' "$dir/b/session.jsonl")
stop "$dir/b"
exec 3>&-
for i in 1 2 3 4; do
    cmp -s "$dir/raw-$i" "$dir/b/$(printf 'job-%03d.prn' "$i")" || fail "unframed job $i differs"
done
tail -n 1 "$dir/b/session.jsonl" | grep -q '"event":"end","status":"passed","exit":0,"jobs":4,"open-jobs":0' ||
    fail "the journal does not end with the session's end: $(tail -n 1 "$dir/b/session.jsonl")"
grep -q '"event":"serve-stop","signal":15' "$dir/b/session.jsonl" || fail "no serve-stop in the journal"
[ -n "$root" ] && [ ! -e "$root" ] || fail "the temporary root $root is still there"
grep -q "^job 4: $(wc -c <"$dir/raw-4") bytes" "$dir/b.txt" || fail "no line for job 4: $(cat "$dir/b.txt")"
pass
